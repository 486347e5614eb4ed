// libav says what it does; here only what fails is of interest.

#include <gtest/gtest.h>

extern "C" {
#include <libavutil/log.h>
}

namespace {

class Quiet final : public ::testing::Environment {
public:
    void SetUp() override { av_log_set_level(AV_LOG_FATAL); }
};

const auto* const quiet = ::testing::AddGlobalTestEnvironment(new Quiet);

}  // namespace
