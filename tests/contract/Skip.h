#pragma once
// A test that can't be run here says why, on the screen and in the report of the whole run.

#include <gtest/gtest.h>

#include <string>

#define LC_SKIP(why)                                               \
    do {                                                           \
        const std::string skipReason = (why);                      \
        ::testing::Test::RecordProperty("why_skipped", skipReason); \
        GTEST_SKIP() << skipReason;                                \
    } while (false)
