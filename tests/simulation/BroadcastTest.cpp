// Broadcasts against extensions that are slow, die, answer twice or never, with set-ups that race with starts and stops of
// two applications, in every interleaving that a seed gives. LC_SEED=n replays one seed; LC_SEEDS=n runs so many.

#include <gtest/gtest.h>

#include <algorithm>
#include <map>
#include <set>

#include "broadcast/ConfigurationArchive.h"
#include "broadcast/PayloadKeys.h"
#include "tests/fakes/FakeUploader.h"
#include "tests/simulation/Seeds.h"
#include "tests/simulation/SimulatedApplication.h"
#include "tests/simulation/SimulatedDaemon.h"
#include "tests/simulation/Stillness.h"

namespace lumacast {
namespace {

using std::chrono::milliseconds;
using std::chrono::seconds;

/// What the seeds did all together: a run that goes nowhere proves nothing.
struct Tally {
    int begun = 0, clips = 0, frames = 0, crashes = 0, finished = 0, forsaken = 0;
    std::map<std::int64_t, int> refused, told;
};

class Studio {
public:
    Studio(std::uint64_t seed, Tally& tally) : daemon_(seed), random_(daemon_.world.scheduler.fork()), tally_(tally) {
        for (const bool takesSamples : {false, true}) {
            auto installed = uploadExtension(plan_, takesSamples,
                                             takesSamples ? "org.example.Live.upload" : "org.example.Clips.upload");
            installed.program = [this] {
                misbehave();
                return std::make_shared<FakeUploader>(plan_);
            };
            fakes().appExtensions.install(std::move(installed));
        }
        for (const auto& [name, pid, window] : {std::tuple{"Alpha", 500, 7u}, {"Beta", 600, 8u}})
            applications_.push_back(std::make_unique<SimulatedApplication>(
                fakes(), BundleIdentifier(std::string("org.example.") + name), name, ProcessID{pid}, ContextID{window}));
        if (!isSound_) fakes().faults.failAtRandom(random_.next(), 1, 60);
    }

    void run() {
        for (const auto& application : applications_) application->connect();
        const std::uint64_t steps = 8 + random_.below(40);
        for (std::uint64_t i = 0; i < steps && !::testing::Test::HasFailure(); ++i) {
            random_.below(4) == 0 ? disturb() : act(*applications_[random_.below(2)]);
            goOn();
        }
        end();
    }

private:
    FakePlatform& fakes() { return daemon_.world.fakes; }
    bool oneIn(std::uint64_t n) { return random_.below(n) == 0; }

    /// How the next process of an extension behaves.
    void misbehave() {
        if (behaves_) {
            UploaderPlan good;
            good.payloads = std::move(plan_->payloads);
            good.uncompleted = std::move(plan_->uncompleted);  // whoever asked waits on
            good.requests = std::move(plan_->requests);
            *plan_ = std::move(good);
            return;
        }
        plan_->pings = oneIn(5) ? 0 : oneIn(5) ? 2 : 1;
        plan_->answersEndpoint = !oneIn(6);
        plan_->connects = !oneIn(8);
        plan_->diesBeforePing = oneIn(8);
        plan_->completesPayloads = !oneIn(5);
        plan_->completesRequests = !oneIn(5);
        plan_->keepsPlanes = oneIn(6);
        plan_->returned.clear();
        if (oneIn(3))
            plan_->returned.push_back(
                {"LCBroadcastExtensionKeyBroadcastConfiguration",
                 {ItemProvider{std::string(kGenericDataType),
                               oneIn(2) ? Value(Data{1, 2}) : Value(*archiveOf(fakes().keyedArchive, {1.0, {}})), {}}}});
        if (oneIn(3))
            plan_->returned.push_back({"LCBroadcastExtensionKeyExtensionServiceInfo",
                                       {ItemProvider{std::string(kGenericDataType), Dictionary{{"viewers", 1}}, {}}}});
    }

    void act(SimulatedApplication& application) {
        if (!application.isAlive()) {
            application.startAgain(ProcessID{static_cast<std::int32_t>(1000 + ++incarnation_)});
            application.connect();
            return;
        }
        const std::string point = oneIn(2) ? "org.example.Live.x" : oneIn(6) ? "org.example.Missing.x" : "org.example.Clips.x";
        switch (random_.below(13)) {
            case 0:
            case 1:
            case 2:
                application.ask(DaemonMessage::SetupBroadcast,
                                {application.identifier.text(), point, *archiveOf(fakes().keyedArchive, {1.0, {}}),
                                 oneIn(4) ? Value() : Value(Dictionary{{"title", "x"}})});
                break;
            case 3:
            case 4:
            case 5:
            case 6: application.start({application.window}, {.broadcast = true}); break;
            case 7: application.start({application.window}, {.capture = oneIn(2)}); break;
            case 8:
            case 9: application.ask(DaemonMessage::StopRecording); break;
            case 10: application.tell(DaemonMessage::PauseRecording); break;
            case 11: application.ask(DaemonMessage::GetSystemBroadcastExtensionInfo); break;
            case 12: connectAnew(application); break;
        }
    }

    /// Over the old connection, whose starts nobody waits for any more.
    void connectAnew(SimulatedApplication& application) {
        tally_.forsaken += waitingStarts() > 0 ? 1 : 0;
        application.connect();
    }
    std::ptrdiff_t waitingStarts() const {
        const auto blocked = daemon_.world.scheduler.blockedTasks();
        return std::count_if(blocked.begin(), blocked.end(), [](const SimBlockedTask& task) {
            return task.lane == "com.orvane.lumacastd.BroadcastStart";
        });
    }

    void disturb() {
        const auto extensions = fakes().appExtensions.extensions();
        switch (random_.below(6)) {
            case 0:
                if (!extensions.empty()) {
                    extensions[random_.below(extensions.size())]->crash();
                    ++tally_.crashes;
                }
                break;
            case 1: plan_->tell(BroadcastDaemonMessage::Ping); break;
            case 2: plan_->tell(BroadcastDaemonMessage::FinishBroadcastWithError, {Value(Error("org.example", 7))}); break;
            case 3: completeLate(); break;
            case 4: applications_[random_.below(2)]->die(); break;
            case 5: plan_->tell(BroadcastDaemonMessage::UpdateServiceInfo, {Dictionary{{"viewers", 3}}}); break;
        }
    }
    /// What was left uncompleted is completed now, perhaps twice.
    void completeLate() {
        auto payloads = std::move(plan_->uncompleted);
        plan_->uncompleted.clear();
        const int times = oneIn(3) ? 2 : 1;
        for (int i = 0; i < times; ++i) {
            for (const auto& complete : payloads) complete();
            for (const auto& [weak, request] : plan_->uncompletedRequests)
                if (const auto extension = weak.lock()) extension->complete(request, plan_->returned);
        }
        plan_->uncompletedRequests.clear();
    }
    void goOn() {
        switch (random_.below(3)) {
            case 0:
                for (std::uint64_t i = random_.below(60); i > 0; --i)
                    if (!daemon_.world.scheduler.step()) break;
                break;
            case 1: daemon_.world.scheduler.runUntilIdle(); break;
            case 2: daemon_.world.scheduler.advance(milliseconds(random_.below(1500))); break;
        }
        if (const auto tap = fakes().audioInputQueues.lastQueue())
            tap->deliver(Data(1764, 1), static_cast<std::uint64_t>(daemon_.world.scheduler.now().nanoseconds));
    }

    /// Of a living client every start is answered, but for the newest, whose extension may never come.
    static void expectStartsAnswered(const SimulatedApplication& application) {
        if (!application.isAlive()) return;
        const auto& all = application.asked();
        bool isNewest = true;
        for (std::size_t i = all.size(); i > application.firstOfConnection(); --i) {
            if (all[i - 1]->message != DaemonMessage::StartRecording) continue;
            if (std::exchange(isNewest, false)) continue;
            EXPECT_EQ(all[i - 1]->answers, 1) << application.identifier.text() << ": request " << i;
        }
    }

    /// Whoever waits for an extension is a start of a connection that is still there.
    void expectNoForsakenWaits() {
        int open = 0;
        for (const auto& application : applications_) {
            const auto& all = application->asked();
            bool isOpen = false;
            for (std::size_t i = application->firstOfConnection(); i < all.size(); ++i)
                if (all[i]->message == DaemonMessage::StartRecording) isOpen |= all[i]->answers == 0;
            open += isOpen && application->isAlive() ? 1 : 0;
        }
        EXPECT_LE(waitingStarts(), open) << "a start waits that nobody is there for any more";
    }

    void end() {
        fakes().faults.clear();
        completeLate();
        daemon_.world.scheduler.advance(seconds(1));
        daemon_.world.scheduler.advance(seconds(30));  // extensions that hang are given up
        expectNoForsakenWaits();
        for (const auto& application : applications_) {
            if (isSound_) expectStartsAnswered(*application);
            for (const auto& asked : application->asked()) {
                EXPECT_LE(asked->answers, 1);
                if (asked->message != DaemonMessage::StartRecording || asked->answers == 0) continue;
                if (const Error* error = asked->values.at(0).asError())
                    ++tally_.refused[error->code()];
                else
                    ++tally_.begun;
            }
            for (const auto& told : application->told())
                if (told.message == ClientMessage::StopRecordingWithError && told.arguments[0].asError())
                    ++tally_.told[told.arguments[0].asError()->code()];
            application->die();
        }
        daemon_.world.scheduler.advance(seconds(30));
        completeLate();
        daemon_.world.scheduler.advance(seconds(1));
        EXPECT_EQ(fakes().keepAlive.open(), 0) << "a transaction stays open";
        EXPECT_EQ(daemon_.sessionCount(), 0u);
        for (const auto& extension : fakes().appExtensions.extensions())
            EXPECT_FALSE(extension->isRunning() && extension->begun().back().items.size() == 1)
                << "an extension of samples runs on";
        if (::testing::Test::HasFailure())
            for (const auto& line : fakes().logSink.logged()) std::printf("%s\n", line.c_str());
        tally_.clips += static_cast<int>(plan_->requests.size());
        tally_.frames += static_cast<int>(plan_->samples(1));
        for (const std::int64_t action : plan_->actions()) tally_.finished += action == 4;
        expectStillness(daemon_, !isSound_);
        if (oneIn(6)) broadcastOnceMore(oneIn(2));
        recordOnceMore();
    }

    /// An extension that does what it should is given every frame, and each clip in its turn; also when the one before
    /// it never took note of its end, and dies.
    void broadcastOnceMore(bool samples) {
        behaves_ = true;
        SimulatedApplication host(fakes(), BundleIdentifier("org.example.Host"), "Host", ProcessID{samples ? 901 : 902},
                                  ContextID{12});
        host.connect();
        std::vector<std::shared_ptr<FakeAppExtension>> older;
        if (samples && oneIn(2)) {
            ASSERT_NO_FATAL_FAILURE(beginBroadcast(host, samples));
            plan_->completesPayloads = false;
            host.ask(DaemonMessage::StopRecording);
            daemon_.world.scheduler.advance(milliseconds(100));
            older = fakes().appExtensions.extensions();
        }
        const std::size_t framesBefore = plan_->samples(1), clipsBefore = plan_->requests.size();
        ASSERT_NO_FATAL_FAILURE(beginBroadcast(host, samples));
        if (oneIn(2))
            for (const auto& extension : std::exchange(older, {})) extension->crash();
        play();
        const auto stop = host.ask(DaemonMessage::StopRecording);
        daemon_.world.scheduler.advance(seconds(1));
        EXPECT_EQ(stop->answers, 1);
        if (samples) {
            EXPECT_GE(plan_->samples(1) - framesBefore, 60u) << "of 87";
        } else {
            judgeClips({plan_->requests.begin() + static_cast<std::ptrdiff_t>(clipsBefore), plan_->requests.end()});
        }
        if (!older.empty()) daemon_.world.scheduler.advance(seconds(15));
        for (const auto& extension : older) EXPECT_FALSE(extension->isRunning()) << "an extension that hangs runs on";
        host.die();
        daemon_.world.scheduler.advance(seconds(1));
        for (const std::string& path : fakes().fileSystem.files())
            EXPECT_EQ(path.find("LCMovie_org.example.Host"), std::string::npos) << path << " is left of a broadcast";
        expectStillness(daemon_, !isSound_);
    }

    void beginBroadcast(SimulatedApplication& host, bool samples) {
        const auto setUp = host.ask(DaemonMessage::SetupBroadcast,
                                    {host.identifier.text(), samples ? "org.example.Live.x" : "org.example.Clips.x",
                                     *archiveOf(fakes().keyedArchive, {1.0, {}}), Value()});
        daemon_.world.scheduler.advance(milliseconds(100));
        ASSERT_EQ(setUp->answers, 1);
        const auto start = host.start({host.window}, {.broadcast = true});
        daemon_.world.scheduler.advance(milliseconds(500));
        ASSERT_EQ(start->answers, 1);
        ASSERT_TRUE(start->values.at(0).isNull()) << describe(start->values.at(0));
    }

    /// The host plays for a while.
    void play() {
        for (int i = 0; i < 120; ++i) {
            daemon_.world.scheduler.advance(milliseconds(20));
            if (const auto tap = fakes().audioInputQueues.lastQueue())
                tap->deliver(Data(1764, 1), static_cast<std::uint64_t>(daemon_.world.scheduler.now().nanoseconds));
        }
    }

    /// A clip a second, numbered from 1 on.
    static void judgeClips(const std::vector<std::vector<ExtensionItem>>& requests) {
        int number = 0;
        for (const auto& items : requests) {
            for (const ExtensionItem& item : items) {
                if (item.attributedTitle != kItemMovieClipURL) continue;
                std::string text;
                item.attachments.front().loadItem([&](const Value& loaded, const std::optional<Error>&) {
                    if (const auto* url = loaded.as<std::string>()) text = *url;
                });
                EXPECT_TRUE(text.ends_with("_" + std::to_string(++number) + ".mp4")) << number << " is " << text;
            }
        }
        EXPECT_GE(number, 2);
    }

    /// The daemon records as if nothing had been.
    void recordOnceMore() {
        SimulatedApplication last(fakes(), BundleIdentifier("org.example.Last"), "Last", ProcessID{900}, ContextID{11});
        last.connect();
        const auto start = last.start();
        daemon_.world.scheduler.advance(milliseconds(500));
        ASSERT_EQ(start->answers, 1);
        EXPECT_FALSE(start->values.at(0).asError());
        const auto stop = last.ask(DaemonMessage::StopRecording);
        daemon_.world.scheduler.advance(milliseconds(500));
        ASSERT_EQ(stop->answers, 1);
        EXPECT_TRUE(stop->values.at(0).as<URL>());
    }

    const std::shared_ptr<UploaderPlan> plan_ = std::make_shared<UploaderPlan>();
    SimulatedDaemon daemon_;
    SimRandom random_;
    Tally& tally_;
    std::vector<std::unique_ptr<SimulatedApplication>> applications_;
    const bool isSound_ = random_.below(3) != 0;  ///< nothing of the platform fails: an answer may get lost there, too
    bool behaves_ = false;  ///< the extensions, from now on
    int incarnation_ = 0;
};

TEST(SimulatedBroadcasts, LetExtensionsDoWhatTheyLikeInAnyOfManySeeds) {
    const Seeds seeds(1000);
    Tally tally;
    for (std::uint64_t seed = seeds.first; seed <= seeds.last; ++seed) {
        Seeds::begin(seed);
        SCOPED_TRACE("seed " + std::to_string(seed));
        Studio(seed, tally).run();
        if (HasFailure()) return;
    }
    if (!seeds.areAllOrdinary()) return;
    EXPECT_GT(tally.begun, 100);
    EXPECT_GT(tally.clips, 50);
    EXPECT_GT(tally.frames, 500);
    EXPECT_GT(tally.crashes, 50);
    EXPECT_GT(tally.finished, 20);
    EXPECT_GT(tally.forsaken, 5);
    EXPECT_GT(tally.refused[-5808], 50);
    EXPECT_GT(tally.refused[-5803], 5);
    EXPECT_GT(tally.told[-5808], 10);
    EXPECT_GT(tally.told[-5806], 20);
}

}  // namespace
}  // namespace lumacast
