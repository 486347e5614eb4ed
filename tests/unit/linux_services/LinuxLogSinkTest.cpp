#include "linux/system/LinuxLogSink.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <array>

#include "tests/contract/ScratchDirectory.h"

namespace lumacast {
namespace {

using testing::HasSubstr;

struct Pipe {
    Pipe() {
        std::array<int, 2> ends{};
        EXPECT_EQ(::pipe2(ends.data(), O_CLOEXEC), 0);
        reading.reset(ends[0]);
        writing.reset(ends[1]);
        ::fcntl(reading.get(), F_SETFL, O_NONBLOCK);
    }
    std::string read() const {
        std::string text;
        std::array<char, 4096> buffer;
        for (ssize_t count = 0; (count = ::read(reading.get(), buffer.data(), buffer.size())) > 0;)
            text.append(buffer.data(), static_cast<std::size_t>(count));
        return text;
    }
    Fd reading, writing;
};

LogSinkTargets targets(int error, int output = -1) { return {error, output, "", ""}; }

TEST(LinuxLogSink, ALineSaysItsLevel) {
    Pipe pipe;
    LinuxLogSink sink(targets(pipe.writing.get()));
    sink.write(LogLevel::Default, "a");
    sink.write(LogLevel::Error, "b");
    sink.write(LogLevel::Debug, "c");
    sink.write(LogLevel::Sample, "d");
    EXPECT_EQ(pipe.read(), "info a\nerror b\ndebug c\nsample d\n");
}

TEST(LinuxLogSink, NoTextCanPretendToBeAnotherLine) {
    Pipe pipe;
    LinuxLogSink sink(targets(pipe.writing.get()));
    sink.write(LogLevel::Default, "name\nerror forged\r\x1b[2J\x7f\ttab \xC3\xA9");
    EXPECT_EQ(pipe.read(), "info name error forged  [2J \ttab \xC3\xA9\n");
}

TEST(LinuxLogSink, ALongLineIsCutBetweenCharacters) {
    Pipe pipe;
    LinuxLogSink sink(targets(pipe.writing.get()));
    sink.write(LogLevel::Default, std::string(3999, 'x') + "\xE2\x82\xAC" + "tail");
    EXPECT_EQ(pipe.read(), "info " + std::string(3999, 'x') + "\n");
    sink.write(LogLevel::Default, std::string(4000, 'x'));
    EXPECT_EQ(pipe.read(), "info " + std::string(4000, 'x') + "\n");
}

TEST(LinuxLogSink, AReaderThatDoesNotReadHoldsNobodyUp) {
    Pipe pipe;
    LinuxLogSink sink(targets(pipe.writing.get()));
    const std::string text(1000, 'x'), other(1000, 'y');
    for (int i = 0; i < 1000; ++i) sink.write(LogLevel::Default, i % 2 == 0 ? text : other);
    const std::uint64_t dropped = sink.droppedLines();
    EXPECT_GT(dropped, 800u);
    const std::string first = pipe.read();
    EXPECT_EQ(first.size(), (1000 - dropped) * (text.size() + 6)) << "whole lines and nothing else";
    EXPECT_EQ(first.substr(0, 6), "info x");
    EXPECT_EQ(first.back(), '\n');
    sink.write(LogLevel::Default, "again");
    EXPECT_EQ(pipe.read(), "error " + std::to_string(dropped) + " log lines dropped\ninfo again\n");
    EXPECT_EQ(::fcntl(pipe.writing.get(), F_GETFL) & O_NONBLOCK, 0) << "the stream is somebody else's too";
}

TEST(LinuxLogSink, AReaderThatWentDoesNotEndTheProcess) {
    Pipe pipe;
    LinuxLogSink sink(targets(pipe.writing.get()));
    pipe.reading.reset();
    sink.write(LogLevel::Error, "nobody hears");
    EXPECT_EQ(sink.droppedLines(), 1u);
    sigset_t pending;
    ::sigpending(&pending);
    EXPECT_FALSE(sigismember(&pending, SIGPIPE));
}

TEST(LinuxLogSink, AFileAndASocketAreWrittenToToo) {
    ScratchDirectory scratch;
    const Fd file(::open(scratch.path("log").c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600));
    std::array<int, 2> ends{};
    ASSERT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends.data()), 0);
    const Fd near(ends[0]), far(ends[1]);
    LinuxLogSink sink(targets(file.get(), near.get()));
    sink.write(LogLevel::Default, "to the file");
    sink.write(LogLevel::Print, "to the socket");
    EXPECT_EQ(ScratchDirectory::read(scratch.path("log")), "info to the file\n");
    std::array<char, 100> buffer;
    const ssize_t count = ::recv(far.get(), buffer.data(), buffer.size(), MSG_DONTWAIT);
    ASSERT_GT(count, 0);
    EXPECT_EQ(std::string(buffer.data(), static_cast<std::size_t>(count)), "to the socket\n");
}

TEST(LinuxLogSink, AClosedStreamDropsEverything) {
    LinuxLogSink sink(targets(-1, -1));
    sink.write(LogLevel::Default, "a");
    sink.write(LogLevel::Print, "b");
    EXPECT_EQ(sink.droppedLines(), 2u);
}

struct Journal {
    Journal() : socket(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0)) {
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        const std::string path = scratch.path("journal");
        std::copy(path.begin(), path.end(), address.sun_path);
        EXPECT_EQ(::bind(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    }
    std::string receive() const {
        std::array<char, 8192> buffer;
        const ssize_t count = ::recv(socket.get(), buffer.data(), buffer.size(), 0);
        return count > 0 ? std::string(buffer.data(), static_cast<std::size_t>(count)) : "(nothing)";
    }
    ScratchDirectory scratch;
    Fd socket;
};

std::string streamName(int number) {
    struct stat status = {};
    EXPECT_EQ(::fstat(number, &status), 0);
    return std::to_string(status.st_dev) + ":" + std::to_string(status.st_ino);
}

TEST(LinuxLogSink, TheJournalGetsPriorityAndMessage) {
    Journal journal;
    Pipe pipe;
    LinuxLogSink sink({pipe.writing.get(), -1, streamName(pipe.writing.get()), journal.scratch.path("journal")});
    sink.write(LogLevel::Error, "oh\nno");
    EXPECT_EQ(journal.receive(), "PRIORITY=3\nSYSLOG_IDENTIFIER=lumacastd\nMESSAGE=oh no\n");
    sink.write(LogLevel::Default, "well");
    EXPECT_THAT(journal.receive(), HasSubstr("PRIORITY=6\n"));
    sink.write(LogLevel::Sample, "much");
    EXPECT_THAT(journal.receive(), HasSubstr("PRIORITY=7\n"));
    EXPECT_EQ(pipe.read(), "");
}

TEST(LinuxLogSink, AnotherProcessesJournalStreamIsNotOurs) {
    Journal journal;
    Pipe pipe;
    LinuxLogSink sink({pipe.writing.get(), -1, "1:1", journal.scratch.path("journal")});
    sink.write(LogLevel::Error, "here");
    EXPECT_EQ(pipe.read(), "error here\n");
    EXPECT_EQ(journal.receive(), "(nothing)");
}

TEST(LinuxLogSink, AJournalThatIsFullHoldsNobodyUp) {
    Journal journal;
    Pipe pipe;
    LinuxLogSink sink({pipe.writing.get(), -1, streamName(pipe.writing.get()), journal.scratch.path("journal")});
    for (int i = 0; i < 5000; ++i) sink.write(LogLevel::Default, "line " + std::to_string(i));
    EXPECT_GT(sink.droppedLines(), 0u);
}

}  // namespace
}  // namespace lumacast
