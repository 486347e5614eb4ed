// lumacastctl save: the daemon takes the movie, tells how far it is, and says where it is in the end.

#include "client/lumacastctl/save/Save.h"

#include <fcntl.h>
#include <signal.h>
#include <stdlib.h>
#include <unistd.h>

#include <future>
#include <mutex>

#include "client/lumacastctl/save/SaveCommand.h"
#include "tests/unit/lumacastctl/FindingMatchers.h"
#include "tests/unit/lumacastctl/Snapshots.h"
#include "tests/unit/lumacastctl/StandInDaemon.h"
#include "tests/unit/lumacastctl/ToolFixture.h"

namespace lumacast::ctl {
namespace {

using ::testing::HasSubstr;
using ::testing::Not;

TEST(FileURL, EncodesWhatIsNoPlainLetter) {
    EXPECT_EQ(fileURL("/a/B-9._~"), "file:///a/B-9._~");
    EXPECT_EQ(fileURL("/a b%\n\"?#"), "file:///a%20b%25%0A%22%3F%23");
    EXPECT_EQ(fileURL("/\xc3\xbc\xff"), "file:///%C3%BC%FF");
}

TEST(SaveNumber, IsReadOrTheReasonIs) {
    EXPECT_EQ(std::get<0>(readSaveNumber("{\"save\":7}")), 7u);
    EXPECT_EQ(std::get<1>(readSaveNumber("{\"error\":\"no\"}")), "no");
    for (const char* strange : {"", "[]", "{}", "{\"save\":-1}", "{\"save\":\"7\"}", "{\"save\""})
        EXPECT_THAT(std::get<1>(readSaveNumber(strange)), HasSubstr("can't be understood")) << strange;
}

TEST(SaveProgress, IsThatOfTheSaveWithTheNumber) {
    const std::string answer = "[{\"number\":1,\"state\":\"saved\",\"progress\":1,\"savedAs\":\"/v/a.mp4\"},"
                               "{\"number\":2,\"state\":\"mixing\",\"progress\":0.25},"
                               "{\"number\":3,\"state\":\"failed\",\"progress\":7,\"error\":\"full\"},"
                               "{\"number\":4,\"state\":\"adding\"},{\"number\":5,\"state\":\"saved\"},"
                               "{\"number\":6,\"state\":\"new\"},{\"number\":7}]";
    const auto progress = [&](std::uint64_t number) { return std::get<0>(readSaveProgress(answer, number)); };
    EXPECT_EQ(progress(1).state, SaveState::Saved);
    EXPECT_EQ(progress(1).savedAs, "/v/a.mp4");
    EXPECT_EQ(progress(2).state, SaveState::Mixing);
    EXPECT_DOUBLE_EQ(progress(2).part, 0.25);
    EXPECT_EQ(progress(3).error, "full");
    EXPECT_DOUBLE_EQ(progress(3).part, 1);
    EXPECT_EQ(progress(4).state, SaveState::Adding);
    for (const std::uint64_t strange : {5, 6, 7})
        EXPECT_THAT(std::get<2>(readSaveProgress(answer, strange)), HasSubstr("can't be understood")) << strange;
    EXPECT_THAT(std::get<2>(readSaveProgress(answer, 8)), HasSubstr("knows nothing of this save"));
    EXPECT_TRUE(std::holds_alternative<SaveUnseen>(readSaveProgress("{\"error\":\"the daemon is busy\"}", 1)));
}

TEST(SaveProgress, IsShownAsABar) {
    SaveProgress progress;
    EXPECT_EQ(progressBar(progress), "mixing   [                              ]   0 %");
    progress.part = 0.5;
    EXPECT_EQ(progressBar(progress), "mixing   [###############               ]  50 %");
    progress.state = SaveState::Adding;
    EXPECT_EQ(progressBar(progress), "copying  [##############################] 100 %");
}

/// A daemon that saves as the test says.
class Save : public Tool {
protected:
    Save() { movie_ = scratch_.write("movies/my movie.mp4", "movie"); }

    /// Each question for the saves gets the next of these; the last one stays.
    void startDaemon(std::vector<Dictionary> steps, Dictionary taken = {{"save", 3}}) {
        steps_ = std::move(steps);
        daemon_.emplace(
            runtimeDirectory(),
            [this] {
                if (busyUntil_.valid()) busyUntil_.get();
                const std::lock_guard lock(mutex_);
                ++asked_;
                if (steps_.size() > 1 && asked_ > 1) steps_.erase(steps_.begin());
                Array saves{Dictionary{{"number", 2}, {"state", "failed"}, {"error", "another one"}}};
                if (!steps_.empty()) saves.emplace_back(steps_.front());
                return Dictionary{{"saves", std::move(saves)}};
            },
            StandInDaemon::Lane::Runs,
            std::map<std::string, AdminCommand>{
                {"save", [this, taken](const std::vector<std::string>& arguments, const AdminAnswer& answer) {
                     const std::lock_guard lock(mutex_);
                     arguments_ = arguments;
                     answer(taken);
                 }}});
    }
    static Dictionary step(const char* state, double progress) {
        return {{"number", 3}, {"movie", "/m"}, {"state", state}, {"progress", progress}};
    }
    static Dictionary savedAs(const std::string& path) {
        Dictionary entry = step("saved", 1);
        entry.set("savedAs", path);
        return entry;
    }
    std::vector<std::string> arguments() {
        const std::lock_guard lock(mutex_);
        return arguments_;
    }
    std::string complaints() const { return ScratchDirectory::read(scratch_.path("complaints")); }

    std::string movie_;
    std::mutex mutex_;
    std::future<void> busyUntil_;  ///< what the daemon's lane waits for, once
    int asked_ = 0;
    std::vector<Dictionary> steps_;
    std::vector<std::string> arguments_;
    std::optional<StandInDaemon> daemon_;
};

TEST_F(Save, PrintsWhereTheCopyIsAndHowFarItWas) {
    startDaemon({step("mixing", 0), step("mixing", 0.02), step("mixing", 0.55), step("adding", 1),
                 savedAs("/home/u/Videos/Lumacast/Recording.mp4")});
    const Outcome result = run({"save", movie_});
    EXPECT_EQ(result.status, 0);
    EXPECT_EQ(result.out, "/home/u/Videos/Lumacast/Recording.mp4\n");
    EXPECT_EQ(result.complaints, "mixing: 0 %\nmixing: 50 %\ncopying to the library\n") << "no escape codes";
    EXPECT_EQ(arguments(), (std::vector<std::string>{"file://" + scratch_.path("movies/my%20movie.mp4")}));
}

TEST_F(Save, TakesANameFromTheFolderItIsCalledIn) {
    startDaemon({savedAs("/v/a.mp4")});
    const std::filesystem::path before = std::filesystem::current_path();
    std::filesystem::current_path(scratch_.path("movies"));
    const Outcome result = run({"save", "my movie.mp4"});
    EXPECT_EQ(run({"save", "../movies/./my movie.mp4"}).status, 0);
    std::filesystem::current_path(before);
    EXPECT_EQ(result.status, 0);
    EXPECT_EQ(arguments(), (std::vector<std::string>{"file://" + scratch_.path("movies/my%20movie.mp4")}));
}

TEST_F(Save, TakesTheLongestPathThereCanBe) {
    // Each component as long as it may be, of letters that are written as three.
    std::string name = "movies";
    while (scratch_.path(name).size() + 252 < 4090) name += "/" + std::string(250, '%');
    const std::string movie = scratch_.write(name + ".mp4", "movie");
    startDaemon({savedAs("/v/a.mp4")});
    EXPECT_EQ(run({"save", movie}).status, 0) << complaints();
    EXPECT_EQ(arguments(), (std::vector<std::string>{fileURL(movie)}));
}

TEST_F(Save, SaysWhyItFailed) {
    startDaemon({step("mixing", 0.3), {{"number", 3}, {"state", "failed"}, {"error", "No space left on device"}}});
    const Outcome result = run({"save", movie_});
    EXPECT_EQ(result.status, 4);
    EXPECT_EQ(result.out, "");
    EXPECT_THAT(result.complaints, HasSubstr("my movie.mp4 is not saved: No space left on device"));
}

TEST_F(Save, SaysWhyTheDaemonDoesNotTakeTheMovie) {
    startDaemon({}, {{"error", "it may not be read and removed"}});
    const Outcome result = run({"save", movie_});
    EXPECT_EQ(result.status, 4);
    EXPECT_THAT(result.complaints, HasSubstr("is not saved: it may not be read and removed"));
}

TEST_F(Save, DoesNotAskForAFileThatIsNotThere) {
    startDaemon({savedAs("/v/a.mp4")});
    const Outcome result = run({"save", scratch_.path("nothing.mp4")});
    EXPECT_EQ(result.status, 4);
    EXPECT_THAT(result.complaints, HasSubstr("nothing.mp4 is not saved: "));
    EXPECT_TRUE(arguments().empty());
}

TEST_F(Save, HasTheDaemonsOwnWordsAsJson) {
    startDaemon({step("mixing", 0.5), step("mixing", 0.5), savedAs("/v/a.mp4")});
    const Outcome result = run({"save", "--json", movie_});
    EXPECT_EQ(result.status, 0);
    EXPECT_EQ(result.complaints, "");
    EXPECT_EQ(result.out, jsonText(step("mixing", 0.5)) + "\n" + jsonText(savedAs("/v/a.mp4")) + "\n");
}

TEST_F(Save, IsLeftToTheDaemonByControlC) {
    for (const int signal : {SIGINT, SIGTERM}) {
        startDaemon({step("mixing", 0.5)});
        const pid_t tool = start({"save", movie_});
        ASSERT_TRUE(waitUntil([&] { return !complaints().empty(); }));
        ::kill(tool, signal);
        const Outcome result = finish(tool);
        EXPECT_EQ(result.status, 5);
        EXPECT_EQ(result.out, "");
        EXPECT_THAT(result.complaints, HasSubstr("the daemon goes on saving the movie"));
        daemon_.reset();
    }
}

TEST_F(Save, EndsWithStatusOneWhenTheDaemonGoesOrForgets) {
    startDaemon({step("mixing", 0.5)});
    const pid_t tool = start({"save", movie_});
    ASSERT_TRUE(waitUntil([&] { return !complaints().empty(); }));
    daemon_.reset();
    const Outcome gone = finish(tool);
    EXPECT_EQ(gone.status, 1);
    EXPECT_THAT(gone.complaints, HasSubstr("the daemon isn't running"));
    startDaemon({});
    const Outcome forgotten = run({"save", movie_});
    EXPECT_EQ(forgotten.status, 1);
    EXPECT_THAT(forgotten.complaints, HasSubstr("knows nothing of this save any more"));
    daemon_.reset();
    EXPECT_EQ(run({"save", movie_}).status, 1);
}

TEST_F(Save, AsksABusyDaemonAgain) {
    startDaemon({savedAs("/v/a.mp4")});
    std::promise<void> isFree;
    busyUntil_ = isFree.get_future();
    int rounds = 0;
    std::FILE* const output = std::fopen(scratch_.path("out").c_str(), "w");
    EXPECT_EQ(saveMovie(runtimeDirectory(), movie_, Form::Text, Screen::Plain, output, stderr, [] {},
                        [&] {
                            if (++rounds == 1) isFree.set_value();
                            return true;
                        }),
              0);
    std::fclose(output);
    EXPECT_GE(rounds, 1);
    EXPECT_EQ(ScratchDirectory::read(scratch_.path("out")), "/v/a.mp4\n");
}

TEST_F(Save, FailsWhenItsOutputCannotBeWritten) {
    startDaemon({savedAs("/v/a.mp4")});
    EXPECT_EQ(run({"save", movie_}, "/dev/full").status, 1);
}

TEST_F(Save, MovesABarOnATerminal) {
    startDaemon({step("mixing", 0), step("mixing", 0.5), step("adding", 1), savedAs("/v/a.mp4")});
    const std::string bars = scratch_.path("bars"), out = scratch_.path("out");
    std::FILE* const bar = std::fopen(bars.c_str(), "w");
    std::FILE* const output = std::fopen(out.c_str(), "w");
    int begun = 0;
    EXPECT_EQ(saveMovie(runtimeDirectory(), movie_, Form::Text, Screen::Terminal, output, bar, [&] { ++begun; },
                        [] { return true; }),
              0);
    std::fclose(bar);
    std::fclose(output);
    EXPECT_EQ(begun, 1);
    EXPECT_EQ(ScratchDirectory::read(bars), "\r\033[Kmixing   [                              ]   0 %\r"
                                            "\r\033[Kmixing   [###############               ]  50 %\r"
                                            "\r\033[Kcopying  [##############################] 100 %\r"
                                            "\r\033[K");
    EXPECT_EQ(ScratchDirectory::read(out), "/v/a.mp4\n");
}

/// A terminal of the test's own.
class Terminal final {
public:
    Terminal() : master_(::posix_openpt(O_RDWR | O_NOCTTY | O_NONBLOCK | O_CLOEXEC)) {
        EXPECT_EQ(::grantpt(master_), 0);
        EXPECT_EQ(::unlockpt(master_), 0);
        // Held, so that what was shown stays there to be read.
        slave_ = ::open(name().c_str(), O_RDWR | O_NOCTTY | O_CLOEXEC);
        EXPECT_GE(slave_, 0);
    }
    ~Terminal() {
        ::close(slave_);
        ::close(master_);
    }
    Terminal(const Terminal&) = delete;
    Terminal& operator=(const Terminal&) = delete;

    std::string name() const {
        char name[64] = "";
        EXPECT_EQ(::ptsname_r(master_, name, sizeof name), 0);
        return name;
    }
    /// All that was shown up to now.
    const std::string& shown() {
        char bytes[512];
        for (ssize_t count = 0; (count = ::read(master_, bytes, sizeof bytes)) > 0;)
            shown_.append(bytes, static_cast<std::size_t>(count));
        return shown_;
    }

private:
    const int master_;
    int slave_ = -1;
    std::string shown_;
};

TEST_F(Save, KnowsATerminalWhenItSeesOne) {
    startDaemon({step("mixing", 0.5), savedAs("/v/a.mp4")});
    Terminal terminal;
    const Outcome result = finish(start({"save", movie_}, {}, terminal.name()));
    EXPECT_EQ(result.status, 0);
    EXPECT_EQ(result.out, "/v/a.mp4\n");
    EXPECT_EQ(terminal.shown(), "\r\033[Kmixing   [###############               ]  50 %\r\r\033[K");
}

TEST_F(Save, LeavesTheBarOnTheTerminalWhenItIsLeft) {
    startDaemon({step("mixing", 0.5)});
    Terminal terminal;
    const pid_t tool = start({"save", movie_}, {}, terminal.name());
    ASSERT_TRUE(waitUntil([&] { return !terminal.shown().empty(); }));
    ::kill(tool, SIGINT);
    EXPECT_EQ(finish(tool).status, 5);
    EXPECT_THAT(terminal.shown(), HasSubstr(" 50 %\r\r\nlumacastctl: the daemon goes on"));
}

}  // namespace
}  // namespace lumacast::ctl
