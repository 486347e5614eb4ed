#pragma once
// What a private sound server plays, heard at its first output, and who plays it.

#include <map>
#include <mutex>
#include <string>
#include <vector>

#include "linux/audio/PulseConnection.h"
#include "tests/checkers/ToneChecker.h"
#include "tests/contract/HeardSound.h"

namespace lumacast::test {

/// Keeps all that comes out of "null0", and the properties of each stream that plays. Thread-safe.
class MonitorSound final {
public:
    static constexpr int kRate = 48000;

    explicit MonitorSound(const std::string& server)
        : connection_({.server = server, .applicationName = "ear"}), ear_(std::make_shared<Ear>()) {
        attached_ = connection_.attach(ear_);
    }
    ~MonitorSound() { connection_.end(); }

    /// Whether the server is heard, silence included.
    bool isListening() const {
        return attached_ && eventually([this] { return frames() > 0; });
    }
    std::size_t frames() const {
        const std::lock_guard lock(ear_->mutex);
        return ear_->samples.size();
    }
    /// The level of a tone in the loudest 50 ms since frame `from`, dB.
    double loudest(double frequency, std::size_t from = 0) const {
        const std::lock_guard lock(ear_->mutex);
        const std::size_t window = kRate / 20;
        double most = -200;
        for (std::size_t at = from; at + window <= ear_->samples.size(); at += window / 2)
            most = std::max(most, checkers::toneLevel(std::span(ear_->samples).subspan(at, window), kRate, frequency));
        return most;
    }
    /// For how long a tone was heard, to 50 ms.
    double secondsOf(double frequency) const {
        const std::lock_guard lock(ear_->mutex);
        const std::size_t window = kRate / 20;
        int windows = 0;
        for (std::size_t at = 0; at + window <= ear_->samples.size(); at += window)
            windows +=
                checkers::toneLevel(std::span(ear_->samples).subspan(at, window), kRate, frequency) > -20 ? 1 : 0;
        return windows * 0.05;
    }
    bool isSilent(std::size_t from = 0) const {
        const std::lock_guard lock(ear_->mutex);
        return std::all_of(ear_->samples.begin() + static_cast<std::ptrdiff_t>(std::min(from, ear_->samples.size())),
                           ear_->samples.end(), [](float sample) { return sample == 0; });
    }
    /// One property of every stream that has played so far, by the stream's number.
    std::map<std::uint32_t, std::string> streams(const std::string& property) const {
        const std::lock_guard lock(ear_->mutex);
        std::map<std::uint32_t, std::string> values;
        for (const auto& [index, properties] : ear_->streams) {
            const auto found = properties.find(property);
            values[index] = found == properties.end() ? "" : found->second;
        }
        return values;
    }

private:
    struct Ear final : sound::PulseUser {
        void serverCame(const sound::PulseServer& server) override {
            context = &server.context;
            const pa_sample_spec format{PA_SAMPLE_FLOAT32NE, kRate, 1};
            const pa_buffer_attr pieces{UINT32_MAX, UINT32_MAX, UINT32_MAX, UINT32_MAX, kRate / 50 * sizeof(float)};
            stream.reset(pa_stream_new(context, "ear", &format, nullptr));
            pa_stream_set_read_callback(
                stream.get(), [](pa_stream*, std::size_t, void* self) { static_cast<Ear*>(self)->hear(); }, this);
            pa_stream_connect_record(stream.get(), "null0.monitor", &pieces, PA_STREAM_ADJUST_LATENCY);
        }
        void serverWent() override { stream.reset(); }
        pa_subscription_mask_t interest() const override { return PA_SUBSCRIPTION_MASK_SINK_INPUT; }
        void serverChanged(pa_subscription_event_type_t event, std::uint32_t index) override {
            if ((event & PA_SUBSCRIPTION_EVENT_TYPE_MASK) != PA_SUBSCRIPTION_EVENT_NEW) return;
            const auto keep = [](pa_context*, const pa_sink_input_info* info, int, void* self) {
                if (info) static_cast<Ear*>(self)->note(*info);
            };
            if (auto* const question = pa_context_get_sink_input_info(context, index, keep, this))
                pa_operation_unref(question);
        }
        void note(const pa_sink_input_info& info) {
            const std::lock_guard lock(mutex);
            void* position = nullptr;
            while (const char* key = pa_proplist_iterate(info.proplist, &position))
                if (const char* value = pa_proplist_gets(info.proplist, key)) streams[info.index][key] = value;
        }
        void hear() {
            const void* bytes = nullptr;
            std::size_t length = 0;
            while (pa_stream_readable_size(stream.get()) > 0 && pa_stream_peek(stream.get(), &bytes, &length) >= 0 &&
                   length > 0) {
                const std::lock_guard lock(mutex);
                const auto* const first = static_cast<const float*>(bytes);
                if (first)
                    samples.insert(samples.end(), first, first + length / sizeof(float));
                else
                    samples.resize(samples.size() + length / sizeof(float));
                pa_stream_drop(stream.get());
            }
        }

        mutable std::mutex mutex;
        std::vector<float> samples;
        std::map<std::uint32_t, std::map<std::string, std::string>> streams;
        pa_context* context = nullptr;
        sound::StreamHandle stream;
    };

    sound::PulseConnection connection_;
    const std::shared_ptr<Ear> ear_;
    bool attached_ = false;
};

}  // namespace lumacast::test
