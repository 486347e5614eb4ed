// Streams that are let go of before the sound server has made them.

#include <gtest/gtest.h>

#include <chrono>
#include <functional>
#include <future>
#include <memory>

#include "linux/audio/PulseConnection.h"
#include "linux/audio/PulseHandles.h"
#include "tests/sound/PrivateSoundServer.h"

namespace lumacast {
namespace {

/// How many streams record from the server, and play to it, asked once all that was sent before has been answered.
/// A server may take a moment longer to let go of one.
struct Counts {
    int recording = 0, playing = 0;
};

/// Lets go of a stream in the same moment in which it asked for it, and counts what the server has afterwards.
class Hasty final : public sound::PulseUser {
public:
    void serverCame(const sound::PulseServer& server) override {
        context_ = &server.context;
        const pa_sample_spec format{PA_SAMPLE_FLOAT32NE, 48000, 1};
        sound::StreamHandle ear(pa_stream_new(context_, "ear", &format, nullptr));
        ASSERT_EQ(pa_stream_connect_record(ear.get(), "null0.monitor", nullptr, PA_STREAM_NOFLAGS), 0);
        sound::StreamHandle mouth(pa_stream_new(context_, "mouth", &format, nullptr));
        ASSERT_EQ(pa_stream_connect_playback(mouth.get(), "null0", nullptr, PA_STREAM_NOFLAGS, nullptr, nullptr), 0);
        stateWhenLeft_ = pa_stream_get_state(ear.get());
        ear.reset();
        mouth.reset();
        // The server answers in order: these come after the streams were made, and after what their making brought about.
        ask([this] { ask([this] { count(); }); });
    }
    void serverWent() override {}
    pa_subscription_mask_t interest() const override { return PA_SUBSCRIPTION_MASK_NULL; }
    void serverChanged(pa_subscription_event_type_t, std::uint32_t) override {}

    std::future<Counts> counted() { return counted_.get_future(); }
    pa_stream_state_t stateWhenLeft() const { return stateWhenLeft_; }

private:
    void ask(std::function<void()> then) {
        then_ = std::move(then);
        const auto came = [](pa_context*, const pa_server_info*, void* self) {
            const auto next = std::move(static_cast<Hasty*>(self)->then_);
            next();
        };
        if (auto* const question = pa_context_get_server_info(context_, came, this)) pa_operation_unref(question);
    }

    void count() {
        const auto recording = [](pa_context*, const pa_source_output_info* info, int, void* self) {
            if (info) ++static_cast<Hasty*>(self)->counts_.recording;
        };
        const auto playing = [](pa_context*, const pa_sink_input_info* info, int end, void* self) {
            auto& hasty = *static_cast<Hasty*>(self);
            if (info) ++hasty.counts_.playing;
            if (end == 0) return;
            const bool isLate = std::chrono::steady_clock::now() > hasty.bound_;
            if (!isLate && hasty.counts_.recording + hasty.counts_.playing > 0) return hasty.countAgain();
            hasty.counted_.set_value(hasty.counts_);
        };
        if (auto* const question = pa_context_get_source_output_info_list(context_, recording, this))
            pa_operation_unref(question);
        if (auto* const question = pa_context_get_sink_input_info_list(context_, playing, this))
            pa_operation_unref(question);
    }

    void countAgain() {
        counts_ = {};
        ask([this] { count(); });
    }

    const std::chrono::steady_clock::time_point bound_ = std::chrono::steady_clock::now() + std::chrono::seconds(20);
    pa_context* context_ = nullptr;
    std::function<void()> then_;
    Counts counts_;
    std::promise<Counts> counted_;
    pa_stream_state_t stateWhenLeft_ = PA_STREAM_UNCONNECTED;
};

template <typename Server>
class PulseHandlesTest : public ::testing::Test {};
using Servers = ::testing::Types<test::PrivateSoundServer, test::PrivatePipeWire>;
TYPED_TEST_SUITE(PulseHandlesTest, Servers);

TYPED_TEST(PulseHandlesTest, AStreamThatIsLetGoOfBeforeItIsMadeDoesNotStayAtTheServer) {
    TypeParam server;
    const auto hasty = std::make_shared<Hasty>();
    auto counted = hasty->counted();
    sound::PulseConnection connection({.server = server.address(), .applicationName = "hasty"});
    ASSERT_TRUE(connection.attach(hasty));
    ASSERT_EQ(counted.wait_for(std::chrono::seconds(30)), std::future_status::ready);
    connection.end();
    const Counts counts = counted.get();
    EXPECT_EQ(hasty->stateWhenLeft(), PA_STREAM_CREATING);
    EXPECT_EQ(counts.recording, 0);
    EXPECT_EQ(counts.playing, 0);
}

}  // namespace
}  // namespace lumacast
