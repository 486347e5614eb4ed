#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <array>
#include <functional>
#include <thread>

#include "linux/system/LinuxLogSink.h"
#include "tests/fakes/FakeLogSink.h"

namespace lumacast {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class LogSinkWorld {
public:
    virtual ~LogSinkWorld() = default;
    virtual LogSink& sink() = 0;
    /// The texts that arrived in the platform log since the last question, oldest first.
    virtual std::vector<std::string> logged() = 0;
    /// The same on standard output.
    virtual std::vector<std::string> printed() = 0;
};

class FakeLogSinkWorld final : public LogSinkWorld {
public:
    LogSink& sink() override { return sink_; }
    std::vector<std::string> logged() override { return sink_.logged(); }
    std::vector<std::string> printed() override { return sink_.printed(); }

private:
    FakeLogSink sink_;
};

class PortLogSinkWorld final : public LogSinkWorld {
public:
    LogSink& sink() override { return sink_; }
    std::vector<std::string> logged() override {
        std::vector<std::string> texts;
        for (const std::string& line : error_.lines()) texts.push_back(line.substr(line.find(' ') + 1));
        return texts;
    }
    std::vector<std::string> printed() override { return output_.lines(); }

private:
    struct Pipe {
        Pipe() {
            std::array<int, 2> ends{};
            EXPECT_EQ(::pipe2(ends.data(), O_CLOEXEC), 0);
            reading.reset(ends[0]);
            writing.reset(ends[1]);
            ::fcntl(reading.get(), F_SETFL, O_NONBLOCK);
        }
        std::vector<std::string> lines() const {
            std::vector<std::string> result;
            std::string line;
            for (char c = 0; ::read(reading.get(), &c, 1) == 1;) {
                if (c == '\n')
                    result.push_back(std::exchange(line, {}));
                else
                    line += c;
            }
            EXPECT_EQ(line, "") << "half a line";
            return result;
        }
        Fd reading, writing;
    };

    Pipe error_, output_;
    LinuxLogSink sink_{{error_.writing.get(), output_.writing.get(), "", ""}};
};

using Maker = std::function<std::unique_ptr<LogSinkWorld>()>;

class LogSinkContract : public ::testing::TestWithParam<Maker> {
protected:
    std::unique_ptr<LogSinkWorld> world_ = GetParam()();
    LogSink& sink_ = world_->sink();
};

TEST_P(LogSinkContract, LinesArriveInTheirOrder) {
    sink_.write(LogLevel::Default, "lumacastd Starting!");
    sink_.write(LogLevel::Error, "second");
    sink_.write(LogLevel::Debug, "third: 100%");
    sink_.write(LogLevel::Sample, "");
    EXPECT_THAT(world_->logged(), ElementsAre("lumacastd Starting!", "second", "third: 100%", ""));
    EXPECT_THAT(world_->printed(), IsEmpty());
}

TEST_P(LogSinkContract, PrintedLinesGoToStandardOutputOnly) {
    sink_.write(LogLevel::Print, "error = (null)");
    sink_.write(LogLevel::Default, "logged");
    EXPECT_THAT(world_->printed(), ElementsAre("error = (null)"));
    EXPECT_THAT(world_->logged(), ElementsAre("logged"));
}

TEST_P(LogSinkContract, ManyLanesWriteWholeLines) {
    std::vector<std::thread> lanes;
    for (int lane = 0; lane < 4; ++lane)
        lanes.emplace_back([this, lane] {
            for (int i = 0; i < 50; ++i)
                sink_.write(LogLevel::Default, "lane " + std::to_string(lane) + " line " + std::to_string(i));
        });
    for (std::thread& lane : lanes) lane.join();
    const auto lines = world_->logged();
    ASSERT_EQ(lines.size(), 200u);
    for (int lane = 0; lane < 4; ++lane)
        for (int i = 0; i < 50; ++i)
            EXPECT_EQ(std::count(lines.begin(), lines.end(),
                                 "lane " + std::to_string(lane) + " line " + std::to_string(i)), 1);
}

INSTANTIATE_TEST_SUITE_P(Fake, LogSinkContract,
                         ::testing::Values(Maker([] { return std::make_unique<FakeLogSinkWorld>(); })));
INSTANTIATE_TEST_SUITE_P(Port, LogSinkContract,
                         ::testing::Values(Maker([] { return std::make_unique<PortLogSinkWorld>(); })));

}  // namespace
}  // namespace lumacast
