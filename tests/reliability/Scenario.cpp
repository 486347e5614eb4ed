#include "tests/reliability/Scenario.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <sstream>

#include "tests/checkers/BoxChecker.h"
#include "tests/system/RawClient.h"

namespace lumacast::test {

namespace fs = std::filesystem;
using std::chrono::nanoseconds;

namespace {

/// No movie is longer, whoever stalls.
constexpr std::chrono::seconds kAnswers{20};
/// What a recording may lose at its end: the second that is promised, and what a machine that stands still adds.
constexpr std::chrono::milliseconds kMostLost{2500};

std::string asText(const std::optional<Error>& error) {
    return error ? "error " + std::to_string(error->code()) : "ok";
}

/// "error -5805 ..." without its words.
std::string answerOf(const std::string& line, const std::string& good) {
    if (line.empty()) return "no answer";
    if (line.starts_with(good)) return "ok";
    std::istringstream words(line);
    std::string first, code;
    words >> first >> code;
    return first + " " + code;
}

std::vector<std::string> moviesIn(const fs::path& folder) {
    std::vector<std::string> movies;
    std::error_code gone;
    for (const auto& entry : fs::directory_iterator(folder, gone))
        if (entry.path().extension() == ".mp4") movies.push_back(entry.path().string());
    std::sort(movies.begin(), movies.end());
    return movies;
}

/// What is wrong with a movie of the scene that may end anywhere: it has to be decoded without complaint, its numbers rise.
std::vector<std::string> judgeScene(const std::string& movie, std::vector<std::uint32_t>& numbers) {
    std::vector<std::string> wrong;
    checkers::MovieReader reader(movie);
    std::vector<checkers::NumberedPicture> pictures;
    if (!reader.error().empty()) return {movie + ": " + reader.error()};
    if (!checkers::readFrameNumbers(reader, pictures)) wrong.push_back(movie + ": " + reader.error());
    for (const auto& picture : pictures) {
        if (!picture.number) {
            wrong.push_back(movie + ": a picture without its number");
        } else {
            if (!numbers.empty() && *picture.number < numbers.back()) wrong.push_back(movie + ": numbers fall");
            numbers.push_back(*picture.number);
        }
    }
    return wrong;
}

/// What is wrong with a movie that was recorded to its end: it has its index, and nothing is left of its fragments.
void judgeFinished(const std::string& movie, std::vector<std::string>& wrong) {
    const auto report = checkers::checkBoxes(movie);
    if (report.topLevel != std::vector<std::string>{"ftyp", "mdat", "moov"})
        wrong.push_back(movie + ": it was not finished");
    else
        for (const auto& finding : report.findings) wrong.push_back(movie + ": " + finding);
}

/// A desktop that does not say within 100 ms who is in front, or a disk how much room it has within 40, refuses a start: on a busy
/// machine one asks again. A daemon that can't record any more never can.
std::vector<std::string> untilGood(const std::function<std::vector<std::string>()>& attempt) {
    constexpr int kAttempts = 6;
    const auto until = std::chrono::steady_clock::now() + std::chrono::seconds(30);
    std::vector<std::string> wrong;
    for (int i = 0; i < kAttempts || std::chrono::steady_clock::now() < until; ++i) {
        wrong = attempt();
        if (wrong.empty()) break;
    }
    return wrong;
}

/// A file of nothing, or of less than a header: what is there before the first fragment.
bool isBeforeFirstFragment(const std::string& movie) {
    std::error_code gone;
    const auto size = fs::file_size(movie, gone);
    return gone || size <= 48;
}

}  // namespace

Scenario::Scenario() { fs::create_directory(faultsFolder()); }

std::vector<std::string> Scenario::daemonVariables() const {
    return {"HOME=" + world_.path("home"), "XDG_VIDEOS_DIR=" + world_.path("videos")};
}

void Scenario::startFaulty(const std::optional<FaultPoint>& point, std::optional<Fault> fault) {
    disarm();
    for (const char* name : {"/calls", "/plan"}) fs::remove(faultsFolder() + name);
    if (point)
        std::ofstream(faultsFolder() + "/plan")
            << point->call << " " << point->target << " " << point->number << " " << nameOf(*fault) << "\n";
    auto variables = daemonVariables();
    variables.push_back("LC_FAULTS=" + faultsFolder());
    world_.startDaemonBy({LC_FAULTY_DAEMON}, variables);
    wantsFaults_ = true;
}

void Scenario::startTraced(const std::string& trace, const std::string& systemCalls) {
    fs::remove(faultsFolder() + "/calls");
    wantsFaults_ = staysArmed_ = true;
    arm();
    auto variables = daemonVariables();
    variables.push_back("LC_FAULTS=" + faultsFolder());
    // As a grandchild: the child is the daemon.
    world_.startDaemonBy({"strace", "-D", "-f", "--seccomp-bpf", "-yy", "-s", "0", "-o", trace, "-e", "trace=" + systemCalls, LC_FAULTY_DAEMON},
                         variables);
}

void Scenario::startShipped() { world_.startDaemonBy({LC_DAEMON}, daemonVariables()); }

void Scenario::arm() const {
    if (wantsFaults_) std::ofstream(faultsFolder() + "/armed");
}

void Scenario::disarm() {
    if (staysArmed_) return;
    fs::remove(faultsFolder() + "/armed");
    wantsFaults_ = false;
}

std::vector<NotedCall> Scenario::calls() const {
    std::vector<NotedCall> all;
    std::ifstream file(faultsFolder() + "/calls");
    for (std::string line; std::getline(file, line);) {
        std::istringstream words(line);
        std::int64_t time = 0;
        std::string result, error;
        NotedCall call;
        words >> time >> call.call >> call.target >> result >> error >> call.fault;
        call.time = nanoseconds(time);
        all.push_back(std::move(call));
    }
    return all;
}

bool Scenario::daemonLives() {
    std::ifstream file("/proc/" + std::to_string(world_.daemon().pid()) + "/stat");
    std::string number, name, state;
    file >> number >> name >> state;
    return !state.empty() && state != "Z";
}

std::vector<std::string> Scenario::judgeNext() {
    return untilGood([&] {
        clear();
        return judgeWhole(record());
    });
}

void Scenario::clear() {
    for (const std::string& movie : moviesIn(world_.temporaryDirectory())) fs::remove(movie);
}

namespace {

/// The self-recording application and what comes of its window.
class WindowScenario : public Scenario {
public:
    Heard record() override {
        return record(startCommand(), stopCommand(), frames());
    }
    std::vector<std::string> judgeNext() override {
        constexpr std::uint32_t kNextFrames = 12;
        return untilGood([&] {
            clear();
            const Heard heard = record("start", "stop", kNextFrames);
            return judgeMade(heard, moviesIn(world_.temporaryDirectory()));
        });
    }
    std::vector<std::string> judgeWhole(const Heard& heard) override { return judgeMade(heard, movies()); }

private:
    Heard record(const std::string& startCommand, const std::string& stopCommand, std::uint32_t frames) {
        Heard heard;
        app_.reset();  // the next one writes the same log
        app_ = world_.application({"--size", "320x180", "--fps", "15"});
        EXPECT_TRUE(app_->waitForFrame(2));
        arm();
        heard.start = answerOf(app_->ask(startCommand), "started frame");
        started_ = app_->askForFrame("frame");
        if (heard.start == "ok") {
            const auto until = started_ + frames;
            waitUntil([&] { return app_->askForFrame("frame") >= until || !daemonLives(); }, kAnswers);
            stopped_ = app_->askForFrame("frame");
            heard.isDisconnected = app_->wasTold("event disconnected");
            const std::string answer = app_->ask(stopCommand);
            heard.stop = answerOf(answer, "stopped frame");
            const auto at = answer.find(" /");
            if (heard.stop == "ok" && at != std::string::npos) heard.movie = answer.substr(at + 1);
        }
        disarm();
        settle(heard);
        return heard;
    }

public:
    std::vector<std::string> judgeAfterFault(const Heard& heard, std::optional<nanoseconds> ended) override {
        std::vector<std::string> wrong;
        std::vector<std::uint32_t> all;
        for (const std::string& movie : ended ? moviesIn(world_.temporaryDirectory()) : movies()) {
            if (isBeforeFirstFragment(movie)) continue;
            std::vector<std::uint32_t> numbers;
            for (auto& finding : judgeScene(movie, numbers)) wrong.push_back(std::move(finding));
            all.insert(all.end(), numbers.begin(), numbers.end());
        }
        if (ended && heard.start == "ok") {
            // What the application had shown a while before the end is there.
            const auto drawn = app_->framesLog();
            for (const auto& [number, times] : drawn)
                if (number > started_ + 1 && number <= stopped_ && times.shown + kMostLost < *ended &&
                    isKept(number, drawn) && std::find(all.begin(), all.end(), number) == all.end())
                    ++missing_;
            if (missing_ > allowedMissing()) wrong.push_back(std::to_string(missing_) + " frames of long before the end are lost");
            missing_ = 0;
        }
        return wrong;
    }

private:
    static std::vector<std::string> judgeMade(const Heard& heard, const std::vector<std::string>& made) {
        constexpr std::size_t kLeast = 4;  // on a machine that stands still now and then
        std::vector<std::string> wrong;
        if (heard.start != "ok" || heard.stop != "ok")
            wrong.push_back("a recording without fault: start " + heard.start + ", stop " + heard.stop);
        if (made.empty()) wrong.push_back("a recording without fault left no movie");
        std::size_t pictures = 0;
        for (const std::string& movie : made) {
            std::vector<std::uint32_t> numbers;
            for (auto& finding : judgeScene(movie, numbers)) wrong.push_back(std::move(finding));
            judgeFinished(movie, wrong);
            pictures += numbers.size();
        }
        if (pictures < kLeast) wrong.push_back("a recording without fault has " + std::to_string(pictures) + " pictures only");
        return wrong;
    }

protected:
    virtual std::string startCommand() const { return "start"; }
    virtual std::string stopCommand() const { return "stop"; }
    virtual std::uint32_t frames() const { return 20; }
    /// After the daemon's end only its own are judged: an extension ends with it, in the middle of a copy perhaps.
    virtual std::vector<std::string> movies() const { return moviesIn(world_.temporaryDirectory()); }
    virtual bool isKept(std::uint32_t, const checkers::FramesLog&) const { return true; }
    virtual std::size_t allowedMissing() const { return 3; }
    virtual void settle(const Heard&) {}
    std::unique_ptr<Application> app_;
    std::uint32_t started_ = 0, stopped_ = 0;
    std::size_t missing_ = 0;
};

class Plain final : public WindowScenario {
    std::string name() const override { return "plain"; }
};

class Trimmed final : public WindowScenario {
    std::string name() const override { return "trimmed"; }
    std::string stopCommand() const override { return "clip 1 1"; }
    std::uint32_t frames() const override { return 48; }
};

class Clips final : public WindowScenario {
public:
    Clips() : folder_(world_.installExtension(kKeeper, LC_MINIMAL_EXTENSION, false)) {}
    std::string name() const override { return "clips"; }
    void clear() override {
        Scenario::clear();
        for (const std::string& movie : moviesIn(folder_)) fs::remove(movie);
    }

private:
    static constexpr char kKeeper[] = "org.lumacast.ClipKeeper";
    std::string startCommand() const override {
        return "broadcast org.lumacast.SelfRecorder " + std::string(kKeeper) + " directory=" + folder_;
    }
    std::uint32_t frames() const override { return 95; }  // past the first cut
    std::vector<std::string> movies() const override {
        auto all = moviesIn(folder_);
        const auto temporary = moviesIn(world_.temporaryDirectory());
        all.insert(all.end(), temporary.begin(), temporary.end());
        return all;
    }
    /// A clip that its extension has been given and has not kept is gone for good: a broadcast is live.
    bool isKept(std::uint32_t, const checkers::FramesLog&) const override { return false; }
    bool isSettled() const override { return moviesIn(world_.temporaryDirectory()).empty(); }
    /// The last clip is handed over after the answer.
    void settle(const Heard& heard) override {
        if (heard.stop == "ok") waitUntil([&] { return isSettled() || !daemonLives(); }, std::chrono::seconds(5));
    }
    const std::string folder_;
};

/// This process as an application that may record the display.
class Display final : public Scenario {
public:
    Display() {
        const std::string folder = world_.path("system/lumacast/entitlements.d");
        fs::create_directories(folder);
        std::ofstream(folder + "/tests.conf") << "[org.lumacast.Tests]\ncom.orvane.private.luma-cast=true\n";
        world_.addVariable("XDG_CONFIG_DIRS=" + world_.path("system"));
    }
    std::string name() const override { return "display"; }
    Heard record() override {
        client::Recorder recorder(client::Events{}, world_.path("run/lumacast"));
        Heard heard;
        app_.reset();  // a tool is in front as long as no window is
        client::StartOptions options;
        options.size = {320, 200};
        options.systemRecording = true;
        (void)recorder.stateAndWait(kAnswers);
        arm();
        heard.start = asText(recorder.startAndWait(options, kAnswers).error);
        if (heard.start == "ok") {
            app_ = world_.application({"--size", "320x180", "--fps", "15"});
            EXPECT_TRUE(app_->waitForFrame(15));
            const auto answer = recorder.stopAndWait(kAnswers);
            heard.stop = asText(answer.error);
            if (answer.movie) heard.movie = answer.movie->path();
        }
        disarm();
        return heard;
    }
    std::vector<std::string> judgeAfterFault(const Heard&, std::optional<nanoseconds>) override {
        std::vector<std::string> wrong;
        for (const std::string& movie : movies()) {
            if (isBeforeFirstFragment(movie)) continue;
            std::size_t pictures = 0;
            checkers::MovieReader reader(movie);
            if (!reader.readPictures([&](const auto&) { ++pictures; })) wrong.push_back(movie + ": " + reader.error());
        }
        return wrong;
    }
    std::vector<std::string> judgeWhole(const Heard& heard) override {
        std::vector<std::string> wrong = judgeAfterFault(heard, std::nullopt);
        if (heard.start != "ok" || heard.stop != "ok")
            wrong.push_back("a recording without fault: start " + heard.start + ", stop " + heard.stop);
        if (movies().empty()) wrong.push_back("a recording without fault left no movie");
        for (const std::string& movie : movies()) judgeFinished(movie, wrong);
        return wrong;
    }
    void clear() override {
        Scenario::clear();
        for (const std::string& movie : world_.library()) fs::remove(movie);
    }

private:
    std::vector<std::string> movies() const {
        auto all = moviesIn(world_.temporaryDirectory());
        const auto saved = world_.library();
        all.insert(all.end(), saved.begin(), saved.end());
        return all;
    }
    std::unique_ptr<Application> app_;
};

class Mixed final : public Scenario {
public:
    std::string name() const override { return "mixed"; }
    bool isSettled() const override { return !fs::exists(movie_); }
    Heard record() override {
        movie_ = world_.makeMovie("two.mp4", {440, 880});
        client::Recorder recorder(client::Events{}, world_.path("run/lumacast"));
        Heard heard;
        (void)recorder.stateAndWait(kAnswers);
        arm();
        heard.start = "ok";
        heard.stop = asText(recorder.saveAndWait(URL::file(movie_), std::chrono::seconds(120)));
        disarm();
        return heard;
    }
    std::vector<std::string> judgeAfterFault(const Heard& heard, std::optional<nanoseconds> ended) override {
        std::vector<std::string> wrong;
        bool isSafe = false;
        for (const std::string& movie : world_.library()) {
            if (fs::path(movie).filename().string().starts_with(".")) continue;  // no movie yet
            for (auto& finding : judgeAll(movie)) wrong.push_back(std::move(finding));
            isSafe = true;
        }
        // A save that fails removes the movie, so prescribed, a moment before or after its answer; one that is cut off by the
        // daemon's end must not.
        if (fs::exists(movie_)) {
            auto found = judgeAll(movie_);
            if (ended || fs::exists(movie_)) {
                std::move(found.begin(), found.end(), std::back_inserter(wrong));
                isSafe = true;
            }
        }
        if (ended && !isSafe) wrong.push_back("the movie is lost");
        if (heard.stop == "ok" && world_.library().empty()) wrong.push_back("saved, it says, and it is not there");
        for (const std::string& movie : moviesIn(world_.temporaryDirectory())) {
            if (isBeforeFirstFragment(movie)) continue;  // or gone: a start removes a copy that was cut off
            checkers::MovieReader reader(movie);
            const bool plays = reader.readPictures([](const auto&) {});
            if (!plays && !ended && fs::exists(movie)) wrong.push_back(movie + ": " + reader.error());
        }
        return wrong;
    }
    std::vector<std::string> judgeWhole(const Heard& heard) override {
        if (heard.stop != "ok") return {"a save without fault: " + heard.stop};
        auto wrong = judgeAfterFault(heard, std::nullopt);
        for (const std::string& movie : world_.library()) judgeFinished(movie, wrong);
        return wrong;
    }
    void clear() override {
        Scenario::clear();
        for (const std::string& movie : world_.library()) fs::remove(movie);
        std::error_code gone;
        fs::remove(movie_, gone);
    }

private:
    /// All frames, in order.
    std::vector<std::string> judgeAll(const std::string& movie) {
        std::vector<std::uint32_t> numbers;
        auto wrong = judgeScene(movie, numbers);
        if (numbers.size() != SavingWorld::kFrames)
            wrong.push_back(movie + ": " + std::to_string(numbers.size()) + " pictures");
        return wrong;
    }
    std::string movie_;
};

}  // namespace

std::unique_ptr<Scenario> plainMovie() { return std::make_unique<Plain>(); }
std::unique_ptr<Scenario> trimmedMovie() { return std::make_unique<Trimmed>(); }
std::unique_ptr<Scenario> clipMovies() { return std::make_unique<Clips>(); }
std::unique_ptr<Scenario> displayMovie() { return std::make_unique<Display>(); }
std::unique_ptr<Scenario> mixedMovie() { return std::make_unique<Mixed>(); }

}  // namespace lumacast::test
