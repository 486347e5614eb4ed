// Lent memory is mapped once for as long as it comes again, and let go of when it does not.

#include "linux/ipc/PlaneMappings.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <fstream>
#include <string>
#include <vector>

#include "linux/ipc/Fd.h"

namespace lumacast::test {
namespace {

constexpr std::size_t kBytes = 64 * 1024;

/// Memory of a lender's, whose name shows in the process's list of mappings.
class Lent final {
public:
    explicit Lent(std::uint8_t first) : descriptor_(::memfd_create("lent-plane", MFD_CLOEXEC)) {
        EXPECT_EQ(::ftruncate(descriptor_.get(), kBytes), 0);
        write(first);
    }
    void write(std::uint8_t first) const { EXPECT_EQ(::pwrite(descriptor_.get(), &first, 1, 0), 1); }
    /// As each message brings one.
    Fd anotherDescriptor() const { return Fd(::fcntl(descriptor_.get(), F_DUPFD_CLOEXEC, 0)); }
    PlaneMappings::Identity identity() const {
        struct stat status {};
        EXPECT_EQ(::fstat(descriptor_.get(), &status), 0);
        return {status.st_dev, status.st_ino};
    }

private:
    const Fd descriptor_;
};

std::shared_ptr<const PlaneMapping> receive(PlaneMappings& mappings, const Lent& lent, std::size_t bytes = kBytes) {
    const Fd descriptor = lent.anotherDescriptor();
    return mappings.of(lent.identity(), descriptor.get(), bytes);
}

int mappedPlanes() {
    std::ifstream maps("/proc/self/maps");
    int count = 0;
    for (std::string line; std::getline(maps, line);) count += line.find("memfd:lent-plane") != std::string::npos;
    return count;
}

TEST(PlaneMappings, MemoryThatComesAgainIsMappedOnceAndShowsWhatIsInItNow) {
    PlaneMappings mappings;
    const Lent one(1), other(2);
    const auto first = receive(mappings, one);
    ASSERT_TRUE(first);
    EXPECT_EQ(first->bytes()[0], 1);
    const auto second = receive(mappings, other);
    EXPECT_EQ(second->bytes()[0], 2);
    one.write(7);
    const auto again = receive(mappings, one);
    EXPECT_EQ(again, first);
    EXPECT_EQ(again->bytes()[0], 7);
    EXPECT_EQ(mappedPlanes(), 2);
}

TEST(PlaneMappings, OnlyTheLastAreKeptAndWhatIsHeldStays) {
    const Lent held(9);
    std::shared_ptr<const PlaneMapping> mapping;
    {
        PlaneMappings mappings;
        mapping = receive(mappings, held);
        for (std::uint8_t number = 0; number < 20; ++number) {
            const Lent lent(number);
            EXPECT_EQ(receive(mappings, lent)->bytes()[0], number) << "never another's memory";
        }
        EXPECT_EQ(mappedPlanes(), static_cast<int>(PlaneMappings::kKept) + 1);
    }
    EXPECT_EQ(mappedPlanes(), 1);
    EXPECT_EQ(mapping->bytes()[0], 9);
    mapping.reset();
    EXPECT_EQ(mappedPlanes(), 0);
}

TEST(PlaneMappings, OneThatIsUsedAgainStaysLonger) {
    PlaneMappings mappings;
    const Lent often(1);
    const std::weak_ptr<const PlaneMapping> first = receive(mappings, often);
    for (std::uint8_t number = 0; number < 20; ++number) {
        (void)receive(mappings, Lent(number));
        EXPECT_EQ(receive(mappings, often), first.lock());
        EXPECT_FALSE(first.expired());
    }
}

TEST(PlaneMappings, AnotherSizeOfTheSameMemoryIsAnotherMapping) {
    PlaneMappings mappings;
    const Lent one(1);
    EXPECT_EQ(receive(mappings, one, 4096)->bytes().size(), 4096u);
    EXPECT_EQ(receive(mappings, one)->bytes().size(), kBytes);
}

TEST(PlaneMappings, WhatCantBeMappedIsNull) {
    PlaneMappings mappings;
    EXPECT_FALSE(mappings.of({1, 2}, -1, kBytes));
    EXPECT_FALSE(mappings.of({1, 2}, -1, kBytes)) << "and is not kept";
}

}  // namespace
}  // namespace lumacast::test
