#include "linux/sounds/EventPlayer.h"

#include <algorithm>
#include <utility>

namespace lumacast::sound {

class EventPlayer::Stream final {
public:
    Stream(EventSound sound, PulseTimer& sweep) : sound_(std::move(sound)), sweep_(sweep) {}
    ~Stream() {
        drain_.reset();
        if (stream_) pa_stream_set_write_callback(stream_.get(), nullptr, nullptr);
    }
    Stream(const Stream&) = delete;
    Stream& operator=(const Stream&) = delete;

    void start(pa_context& context) {
        const PropertyListHandle properties(pa_proplist_new());
        pa_proplist_sets(properties.get(), PA_PROP_MEDIA_ROLE, "event");
        pa_proplist_sets(properties.get(), PA_PROP_EVENT_ID, sound_.name.c_str());
        const pa_sample_spec format{PA_SAMPLE_FLOAT32NE, EventSound::kRate, EventSound::kChannels};
        stream_.reset(pa_stream_new_with_proplist(&context, sound_.name.c_str(), &format, nullptr, properties.get()));
        if (!stream_) return end();
        pa_stream_set_state_callback(
            stream_.get(),
            [](pa_stream* stream, void* self) {
                if (!PA_STREAM_IS_GOOD(pa_stream_get_state(stream))) static_cast<Stream*>(self)->end();
            },
            this);
        pa_stream_set_write_callback(
            stream_.get(), [](pa_stream*, std::size_t room, void* self) { static_cast<Stream*>(self)->feed(room); },
            this);
        if (pa_stream_connect_playback(stream_.get(), nullptr, nullptr, PA_STREAM_NOFLAGS, nullptr, nullptr) < 0) end();
    }

    bool hasEnded() const { return ended_; }

private:
    void feed(std::size_t room) {
        const std::size_t all = sound_.samples.size() * sizeof(float);
        const std::size_t frame = sizeof(float) * EventSound::kChannels;
        const std::size_t bytes = std::min(room - room % frame, all - written_);
        const auto* const at = reinterpret_cast<const char*>(sound_.samples.data()) + written_;
        if (bytes > 0 && pa_stream_write(stream_.get(), at, bytes, nullptr, 0, PA_SEEK_RELATIVE) < 0) return end();
        written_ += bytes;
        if (written_ < all || drain_) return;
        pa_stream_set_write_callback(stream_.get(), nullptr, nullptr);
        drain_.reset(pa_stream_drain(
            stream_.get(), [](pa_stream*, int, void* self) { static_cast<Stream*>(self)->end(); }, this));
        if (!drain_) end();
    }

    void end() {
        ended_ = true;
        sweep_.start(std::chrono::milliseconds(0));
    }

    const EventSound sound_;
    PulseTimer& sweep_;
    StreamHandle stream_;
    OperationHandle drain_;
    std::size_t written_ = 0;
    bool ended_ = false;
};

EventPlayer::EventPlayer() = default;
EventPlayer::~EventPlayer() = default;

void EventPlayer::add(EventSound sound) {
    if (context_)
        start(std::move(sound));
    else
        waiting_.push_back(std::move(sound));
}

void EventPlayer::start(EventSound sound) {
    playing_.push_back(std::make_unique<Stream>(std::move(sound), *sweep_));
    playing_.back()->start(*context_);
}

void EventPlayer::serverCame(const PulseServer& server) {
    context_ = &server.context;
    sweep_ = std::make_unique<PulseTimer>(
        server.loop, [this] { std::erase_if(playing_, [](const auto& stream) { return stream->hasEnded(); }); });
    for (EventSound& sound : std::exchange(waiting_, {})) start(std::move(sound));
}

void EventPlayer::serverWent() {
    playing_.clear();
    sweep_.reset();
    context_ = nullptr;
}

}  // namespace lumacast::sound
