// The figures of a recording that runs, as the administrator sees them.

#include "tests/fakes/FakeUploader.h"
#include "tests/unit/daemon/DaemonWorld.h"

namespace lumacast {
namespace {

using std::chrono::seconds;

class RecordingCounters : public DaemonWorld {
protected:
    /// What `status` says of the recording under way.
    std::uint64_t figure(std::string_view name) {
        std::uint64_t result = UINT64_MAX;
        world_.scheduler.mainQueue().sync([&] {
            const Dictionary all = process_->manager().snapshot();
            const Value* const sessions = all.find("sessions");
            const Value* const current = sessions->as<Array>()->front().as<Dictionary>()->find("current");
            const Value* const value = current ? current->as<Dictionary>()->find(name) : nullptr;
            if (value && value->as<std::uint64_t>()) result = *value->as<std::uint64_t>();
        });
        return result;
    }
};

TEST_F(RecordingCounters, AreThatRecordingsThoughItsSourceIsOlder) {
    fakes_.displayCapture.setAutomatic(true);
    const auto client = makeRecording();
    const auto source = fakes_.displayCapture.lastSource();
    advance(seconds(2));
    fakes_.displayCapture.setPlanes(0);
    advance(seconds(1));
    fakes_.displayCapture.setPlanes(kManyPlanes);
    const auto first = source->counters();
    EXPECT_GT(first.delivered, 10u);
    EXPECT_GT(first.dropped, 10u);
    EXPECT_EQ(figure("framesDelivered"), first.delivered);
    EXPECT_EQ(figure("framesDropped"), first.dropped);
    client->ask(DaemonMessage::StopRecording);
    settle();
    client->start();
    settle();
    ASSERT_EQ(fakes_.displayCapture.lastSource(), source);
    EXPECT_LT(figure("framesDelivered"), first.delivered / 2);
    EXPECT_EQ(figure("framesDelivered"), source->counters().delivered - first.delivered);
    EXPECT_EQ(figure("framesDropped"), 0u);
    fakes_.displayCapture.setPlanes(0);
    advance(seconds(1));
    fakes_.displayCapture.setPlanes(kManyPlanes);
    EXPECT_GT(figure("framesDropped"), 10u);
    EXPECT_EQ(figure("framesDropped"), source->counters().dropped - first.dropped);
}

TEST_F(RecordingCounters, OfABroadcastSayWhatItsExtensionWasTooSlowFor) {
    const auto plan = std::make_shared<UploaderPlan>();
    fakes_.appExtensions.install(uploadExtension(plan, true));
    fakes_.displayCapture.setAutomatic(true);
    const auto client = makeConnected();
    client->ask(DaemonMessage::SetupBroadcast, {client->id.text(), "org.example.Uploader.setup", Data{}, Dictionary{}});
    settle();
    client->start({client->window}, {.broadcast = true});
    settle();
    advance(seconds(1));
    EXPECT_EQ(figure("framesLeftOut"), 0u);
    plan->completesPayloads = false;
    advance(seconds(1));
    const std::uint64_t leftOut = figure("framesLeftOut");
    EXPECT_GT(leftOut, 10u);
    EXPECT_EQ(figure("framesDelivered"), plan->samples(1) + leftOut);
}

}  // namespace
}  // namespace lumacast
