// Every call by which a start gives a movie its index that an earlier run has left unfinished fails in turn, and the daemon is ended
// before and after each: the movie plays as it did, the others get theirs, and the next start has it whole.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/stat.h>

#include <filesystem>
#include <fstream>
#include <iterator>
#include <map>
#include <memory>

#include "tests/checkers/BoxChecker.h"
#include "tests/reliability/Scenario.h"

namespace lumacast::test {
namespace {

namespace fs = std::filesystem;

constexpr char kBad[] = "Bad.mp4";  ///< whose calls fail
constexpr char kOther[] = "Other.mp4";

struct timespec changeOf(const std::string& file) {
    struct stat status = {};
    EXPECT_EQ(::stat(file.c_str(), &status), 0) << file;
    return status.st_ctim;
}

bool isSame(const struct timespec& a, const struct timespec& b) { return a.tv_sec == b.tv_sec && a.tv_nsec == b.tv_nsec; }

bool isOrdinary(const std::string& movie) {
    const auto report = checkers::checkBoxes(movie);
    return report.findings.empty() && report.topLevel == std::vector<std::string>{"ftyp", "mdat", "moov"};
}

class RecoveryFaults : public ::testing::Test {
protected:
    /// Has a movie that a killed daemon has left.
    void SetUp() override {
        scenario_->startShipped();
        const auto application = world_.application({"--size", "320x180", "--fps", "15"});
        ASSERT_TRUE(application->waitForFrame(1));
        // A disk that does not say within 40 ms how much room it has refuses: on a busy machine one asks again.
        ASSERT_TRUE(waitUntil([&] { return application->ask("start").starts_with("started"); }, std::chrono::seconds(30)));
        ASSERT_TRUE(world_.waitForElapsed(2.5));
        EXPECT_EQ(world_.endDaemon(SIGKILL), -1);
        const std::string movie = world_.moviePath();
        std::ifstream file(movie, std::ios::binary);
        bytes_ = {std::istreambuf_iterator<char>(file), {}};
        ASSERT_FALSE(isOrdinary(movie));
        pictures_ = picturesOf(movie, true).size();
        ASSERT_GT(pictures_, 5u);
        fs::remove(movie);
    }

    /// Two of it, the bad one changed last, so that its turn is first; both of another day.
    void leaveMovies() const {
        for (const char* name : {kOther, kBad}) std::ofstream(pathOf(name), std::ios::binary | std::ios::trunc) << bytes_;
        const struct timespec times[] = {kDay, kDay};
        do {  // the file system's clock goes on
            ASSERT_EQ(::utimensat(AT_FDCWD, pathOf(kBad).c_str(), times, 0), 0);
        } while (isSame(changeOf(pathOf(kBad)), changeOf(pathOf(kOther))));
    }

    /// A start with this fault, until it has done what it can.
    void startWith(const std::optional<FaultPoint>& point, Fault fault) {
        for (const char* name : {"/calls", "/plan"}) fs::remove(scenario_->faultsFolder() + name);
        if (point)
            std::ofstream(scenario_->faultsFolder() + "/plan")
                << point->call << " " << point->target << " " << point->number << " " << nameOf(fault) << "\n";
        std::ofstream(scenario_->faultsFolder() + "/armed");
        std::vector<std::string> environment = world_.environment();
        environment.push_back("HOME=" + world_.path("home"));
        environment.push_back("LC_FAULTS=" + scenario_->faultsFolder());
        checkers::Child daemon({LC_FAULTY_DAEMON}, environment, world_.path("faulty.log"));
        if (point && isKill(fault)) {
            EXPECT_EQ(daemon.wait(), -1);
            return;
        }
        const bool isFull = point && fault == Fault::NoSpace;
        EXPECT_TRUE(waitUntil([&] { return (isFull && saysFailed()) || (isOrdinary(pathOf(kOther)) && (point || isOrdinary(pathOf(kBad)))); }))
            << "the other movie has no index";
        ASSERT_GT(daemon.pid(), 1);
        ::kill(daemon.pid(), SIGTERM);
        EXPECT_EQ(daemon.wait(), 0);
    }

    void inject(const FaultPoint& point, Fault fault) {
        SCOPED_TRACE(point.call + ", number " + std::to_string(point.number) + ", " + std::string(nameOf(fault)));
        leaveMovies();
        fs::remove(world_.path("faulty.log"));
        startWith(point, fault);
        bool isReached = false;
        for (const NotedCall& call : scenario_->calls()) isReached |= !call.fault.empty();
        EXPECT_TRUE(isReached);
        EXPECT_GE(picturesOf(pathOf(kBad), true).size(), pictures_);
        if (!isKill(fault)) {
            struct stat status = {};
            EXPECT_EQ(::stat(pathOf(kBad).c_str(), &status), 0);
            EXPECT_EQ(status.st_mtim.tv_sec, kDay.tv_sec) << "it ages from another day on";
        }
        scenario_->startShipped();
        EXPECT_TRUE(waitUntil([&] { return isOrdinary(pathOf(kBad)) && isOrdinary(pathOf(kOther)); })) << world_.daemonLog();
        EXPECT_EQ(world_.endDaemon(SIGTERM), 0);
        for (const char* name : {kBad, kOther}) EXPECT_GE(picturesOf(pathOf(name)).size(), pictures_) << name;
    }

    /// The calls that change the bad movie.
    std::vector<FaultPoint> points() {
        leaveMovies();
        startWith(std::nullopt, Fault::Short);
        std::map<std::string, std::size_t> counts;
        std::vector<FaultPoint> all;
        for (const NotedCall& call : scenario_->calls())
            if (call.target == targetOf(kBad) && call.call != "open") all.push_back({call.call, call.target, ++counts[call.call]});
        EXPECT_EQ(counts["writeAt"], 3u) << "the index, and the two steps of the switch to it";
        EXPECT_EQ(counts["syncData"], 2u);
        return all;
    }

private:
    std::string pathOf(const std::string& name) const { return scenario_->world().temporaryDirectory() + "/" + name; }
    bool saysFailed() const {
        std::ifstream file(world_.path("faulty.log"));
        const std::string text{std::istreambuf_iterator<char>(file), {}};
        return text.find("its index can't be written") != std::string::npos;
    }

    static constexpr struct timespec kDay{1'700'000'000, 0};
    const std::unique_ptr<Scenario> scenario_ = plainMovie();
    SavingWorld& world_ = scenario_->world();
    std::string bytes_;
    std::size_t pictures_ = 0;
};

// Where the disk can't keep one movie's bytes it may still keep the others'.
TEST_F(RecoveryFaults, OfOneMovieLeaveTheOthersTheirIndexAndTheNextStartHasItWhole) {
    for (const FaultPoint& point : points()) inject(point, Fault::InputOutput);
}

TEST_F(RecoveryFaults, OfEachKindLeaveTheMovieAsItPlayed) {
    const auto all = points();
    std::size_t number = 0;
    for (const FaultPoint& point : all)
        for (const Fault fault : faultsOf(point.call))
            if (fault != Fault::InputOutput && (longTests() || number++ % 5 == 0)) inject(point, fault);
}

}  // namespace
}  // namespace lumacast::test
