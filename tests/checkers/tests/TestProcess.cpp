// Doctored movies make the libraries complain at length; the tests judge what the checkers say. A child that ends while
// it is written to fails its test and doesn't end the others.

#include <gtest/gtest.h>
#include <signal.h>

#include "tests/checkers/LibAv.h"

namespace lumacast::checkers {
namespace {

class TestProcess final : public ::testing::Environment {
public:
    void SetUp() override {
        av_log_set_level(AV_LOG_QUIET);
        ::signal(SIGPIPE, SIG_IGN);
    }
};

const ::testing::Environment* const kTestProcess = ::testing::AddGlobalTestEnvironment(new TestProcess);

}  // namespace
}  // namespace lumacast::checkers
