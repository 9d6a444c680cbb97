// A test that cannot run here says so; with LA_FORBID_SKIPS in the environment it fails instead.
#pragma once

#include <gtest/gtest.h>

#include <cstdlib>

#define LA_SKIP(reason)                                                   \
    do {                                                                  \
        if (std::getenv("LA_FORBID_SKIPS") != nullptr) {                  \
            FAIL() << "skips are forbidden, and this one is: " << reason; \
        }                                                                 \
        GTEST_SKIP() << reason;                                           \
    } while (false)
