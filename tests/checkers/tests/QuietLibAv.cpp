// Doctored movies make the libraries complain at length; the tests judge what the checkers say.

#include <gtest/gtest.h>

#include "tests/checkers/LibAv.h"

namespace lumacast::checkers {
namespace {

class QuietLibAv final : public ::testing::Environment {
public:
    void SetUp() override { av_log_set_level(AV_LOG_QUIET); }
};

const ::testing::Environment* const kQuiet = ::testing::AddGlobalTestEnvironment(new QuietLibAv);

}  // namespace
}  // namespace lumacast::checkers
