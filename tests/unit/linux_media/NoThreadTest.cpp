// A system that has no thread left: what needs one fails, and nothing is thrown.

#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <exception>
#include <filesystem>
#include <functional>
#include <optional>
#include <string>
#include <system_error>
#include <thread>

#include "linux/media/LinuxMovieExporters.h"
#include "tests/unit/linux_media/RecordedMovie.h"

namespace lumacast::testing {
namespace {

/// While it lives this process gets no thread. The administrator always gets one, so becomes somebody else meanwhile.
class NoThreadsLeft final {
public:
    NoThreadsLeft() {
        const bool isAdministrator = ::geteuid() == 0;
        becameAnother_ = isAdministrator && ::setresuid(kNobodysNumber, kNobodysNumber, 0) == 0;
        if (isAdministrator && !becameAnother_) return;
        if (::getrlimit(RLIMIT_NPROC, &before_) != 0) return;
        const rlimit none{0, before_.rlim_max};
        holds_ = ::setrlimit(RLIMIT_NPROC, &none) == 0;
    }
    NoThreadsLeft(const NoThreadsLeft&) = delete;
    NoThreadsLeft& operator=(const NoThreadsLeft&) = delete;
    ~NoThreadsLeft() {
        (void)!::setrlimit(RLIMIT_NPROC, &before_);
        if (becameAnother_) (void)!::setresuid(0, 0, 0);
    }
    /// Tried, so that a system where this has no effect is seen.
    bool holds() const {
        if (!holds_) return false;
        try {
            std::thread([] {}).join();
        } catch (const std::system_error&) {
            return true;
        }
        return false;
    }

private:
    static constexpr uid_t kNobodysNumber = 64'321;
    rlimit before_{0, 0};
    bool holds_ = false, becameAnother_ = false;
};

/// What `work`, done in a process of its own, answered; how that process died otherwise.
std::string inAChild(const std::function<std::string()>& work) {
    int ends[2];
    if (::pipe(ends) != 0) return "no pipe";
    const pid_t child = ::fork();
    if (child < 0) return "no child";
    if (child == 0) {
        std::string answer;
        try {
            answer = work();
        } catch (const std::exception& thrown) {
            answer = std::string("threw: ") + thrown.what();
        }
        (void)!::write(ends[1], answer.data(), answer.size());
        ::_exit(0);
    }
    ::close(ends[1]);
    std::string answer;
    char part[256];
    for (ssize_t count; (count = ::read(ends[0], part, sizeof part)) > 0;)
        answer.append(part, static_cast<std::size_t>(count));
    ::close(ends[0]);
    int status = 0;
    ::waitpid(child, &status, 0);
    return WIFSIGNALED(status) ? "died of signal " + std::to_string(WTERMSIG(status)) : answer;
}

std::string nameOf(const std::optional<Error>& error) {
    if (!error) return "no error";
    if (error->domain() != kSystemErrorDomain) return "a foreign error";
    return error->code() == EAGAIN ? "EAGAIN" : std::to_string(error->code());
}

/// "told" when `happening` came, on another thread than this one.
std::string toldBy(Happening& happening) {
    if (!happening.waitFor()) return "never told";
    return happening.thread() == std::this_thread::get_id() ? "told inline" : "told";
}

class NoThread : public ::testing::Test {
protected:
    void SetUp() override { ASSERT_EQ(::chmod(directory_.path("").c_str(), 0777), 0); }  // for the child
    ScratchDirectory directory_;
};

TEST_F(NoThread, AWriterCannotBeMade) {
    EXPECT_EQ(inAChild([&] {
                  HandClock clock;
                  LinuxContainerWriters writers(clock);
                  const NoThreadsLeft none;
                  if (!none.holds()) return std::string("threads are left");
                  const auto made = writers.make(URL::file(directory_.path("movie.mp4")), ContainerType::Mpeg4);
                  const auto* const error = std::get_if<Error>(&made);
                  return error ? nameOf(*error) : std::string("made");
              }),
              "EAGAIN");
}

TEST_F(NoThread, WritingDoesNotStartAndTheMovieFails) {
    EXPECT_EQ(inAChild([&] {
                  RecordedMovie movie;
                  const NoThreadsLeft none;
                  if (!none.holds()) return std::string("threads are left");
                  std::string answer = movie.writer->startWriting() ? "started, " : "not started, ";
                  answer += movie.writer->status() == ContainerStatus::Failed ? "failed, " : "not failed, ";
                  answer += nameOf(movie.writer->error());
                  answer += movie.writer->startWriting() ? ", started" : ", not started";
                  Happening done;
                  movie.writer->finishWriting([&] { done.happen(); });
                  return answer + ", " + toldBy(done);
              }),
              "not started, failed, EAGAIN, not started, told");
}

TEST_F(NoThread, FinishingIsStillTold) {
    EXPECT_EQ(inAChild([&] {
                  RecordedMovie unused, finished;
                  finished.start();
                  finished.appendGrey(100, 0);
                  finished.finish();
                  const NoThreadsLeft none;
                  if (!none.holds()) return std::string("threads are left");
                  Happening first, second;
                  unused.writer->finishWriting([&] { first.happen(); });
                  finished.writer->finishWriting([&] { second.happen(); });
                  return toldBy(first) + ", " + toldBy(second);
              }),
              "told, told");
}

TEST_F(NoThread, AnExportFails) {
    EXPECT_EQ(inAChild([&] {
                  RecordedMovie movie;
                  movie.start();
                  movie.appendGrey(100, 0);
                  movie.finish();
                  LinuxMovieExporters exporters;
                  const NoThreadsLeft none;
                  if (!none.holds()) return std::string("threads are left");
                  const std::string copy = directory_.path("copy.mp4");
                  const auto exporter = exporters.makeExporter(exporters.openMovie(URL::file(movie.path())),
                                                               ExportPreset::PassThrough, URL::file(copy));
                  Happening done;
                  std::string answer;
                  exporter->exportAsynchronously([&](ExportStatus status, std::optional<Error> error) {
                      answer = (status == ExportStatus::Failed ? "failed, " : "not failed, ") + nameOf(error);
                      done.happen();
                  });
                  const std::string told = toldBy(done);
                  return answer + ", " + told + (std::filesystem::exists(copy) ? ", a file" : ", no file");
              }),
              "failed, EAGAIN, told, no file");
}

}  // namespace
}  // namespace lumacast::testing
