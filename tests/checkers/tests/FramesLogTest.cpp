#include "tests/checkers/FramesLog.h"

#include <gtest/gtest.h>

#include "tests/checkers/tests/FileBytes.h"
#include "tests/contract/ScratchDirectory.h"

namespace lumacast::checkers {
namespace {

using namespace std::chrono_literals;

class FramesLogTest : public ::testing::Test {
protected:
    std::optional<FramesLog> read(const std::string& text) {
        const std::string path = folder_.path("frames.txt");
        writeBytes(path, {text.begin(), text.end()});
        error_.clear();
        return readFramesLog(path, error_);
    }
    ScratchDirectory folder_;
    std::string error_;
};

TEST_F(FramesLogTest, ReadsLinesWithTwoAndThreeWords) {
    const auto log = read("1 5000 4000\n2 9000\n3 9500 9400 mark\n");
    ASSERT_TRUE(log) << error_;
    EXPECT_EQ(log->size(), 3U);
    EXPECT_EQ(log->at(1).shown, 5000ns);
    EXPECT_EQ(log->at(1).sent, 4000ns);
    EXPECT_EQ(log->at(2).sent, 9000ns);
    EXPECT_FALSE(log->at(1).isMarked);
    EXPECT_TRUE(log->at(3).isMarked);
}

TEST_F(FramesLogTest, LeavesOutALineThatIsStillBeingWritten) {
    EXPECT_EQ(read("1 5000 4000\n2 90")->size(), 1U);
    EXPECT_EQ(read("")->size(), 0U);
}

TEST_F(FramesLogTest, RefusesLinesOfAnotherForm) {
    for (const char* text : {"x\n", "1\n", "1 2 x\n", "1 5 4 3\n", "1 5 4 mark x\n", "1 5 4 x\n", "1 4 5\n", "\n"}) {
        EXPECT_FALSE(read(text)) << text;
        EXPECT_NE(error_, "");
    }
    EXPECT_FALSE(readFramesLog(folder_.path("none"), error_));
}

}  // namespace
}  // namespace lumacast::checkers
