// A simulation runs one task at a time, each on a thread of its own: on one processor the baton passes five times as
// fast.

#include <gtest/gtest.h>
#include <sched.h>

namespace lumacast {
namespace {

class OneProcessor final : public ::testing::Environment {
public:
    void SetUp() override {
        const int current = ::sched_getcpu();
        if (current < 0) return;
        cpu_set_t only;
        CPU_ZERO(&only);
        CPU_SET(current, &only);
        ::sched_setaffinity(0, sizeof only, &only);  // where that is not allowed it is only slower
    }
};

const ::testing::Environment* const kOneProcessor = ::testing::AddGlobalTestEnvironment(new OneProcessor);

}  // namespace
}  // namespace lumacast
