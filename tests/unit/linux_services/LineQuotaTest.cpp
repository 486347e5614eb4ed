#include "linux/system/LineQuota.h"

#include <fcntl.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <string>

#include "linux/system/LinuxLogSink.h"
#include "tests/contract/ScratchDirectory.h"

namespace lumacast {
namespace {

using namespace std::chrono_literals;

constexpr int kBurst = static_cast<int>(LineQuota::kBurst), kPerSecond = static_cast<int>(LineQuota::kPerSecond);

/// A sink into a file, with a clock of the test's own.
class LogFlood : public ::testing::Test {
protected:
    void write(int lines, LogLevel level = LogLevel::Error) {
        for (int at = 0; at < lines; ++at) sink_.write(level, "line " + std::to_string(number_++));
    }
    std::string log() const { return ScratchDirectory::read(scratch_.path("log")); }
    int lines() const {
        const std::string text = log();
        return static_cast<int>(std::count(text.begin(), text.end(), '\n'));
    }

    const ScratchDirectory scratch_;
    const Fd file_{::open(scratch_.path("log").c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600)};
    std::chrono::steady_clock::time_point now_{1h};
    int number_ = 0;
    LinuxLogSink sink_{{.standardError = file_.get(),
                        .standardOutput = file_.get(),
                        .journalStream = "",
                        .journalSocket = "",
                        .now = [this] { return now_; }}};
};

TEST_F(LogFlood, IsCutAndWhatWasDroppedIsCounted) {
    write(kBurst + 300);
    EXPECT_EQ(lines(), kBurst);
    EXPECT_EQ(sink_.droppedLines(), 300u);
    now_ += 1s;
    sink_.write(LogLevel::Default, "the next one");
    EXPECT_NE(log().find("error 300 log lines dropped\ninfo the next one\n"), std::string::npos);
}

TEST_F(LogFlood, ThatGoesOnGetsAFewLinesASecond) {
    write(kBurst);
    for (int second = 0; second < 10; ++second) {
        now_ += 1s;
        write(1000);
    }
    // The lines, and before the first of each second how many were dropped.
    EXPECT_EQ(lines(), kBurst + 10 * kPerSecond + 9);
}

TEST_F(LogFlood, ThatIsOverLeavesRoomForAnother) {
    write(kBurst + 1);
    now_ += 1h;
    write(kBurst);
    EXPECT_EQ(sink_.droppedLines(), 1u);
}

TEST_F(LogFlood, OfLinesThatSomebodyAskedForIsWritten) {
    write(kBurst, LogLevel::Sample);
    write(kBurst, LogLevel::Debug);
    write(kBurst, LogLevel::Print);
    EXPECT_EQ(sink_.droppedLines(), 0u);
}

}  // namespace
}  // namespace lumacast
