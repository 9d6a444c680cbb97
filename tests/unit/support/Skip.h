// A test that cannot run here says so; with LA_FORBID_SKIPS=1 in the environment it fails instead.
#pragma once

#include <gtest/gtest.h>

#include <cstdlib>
#include <string_view>

#define LA_SKIP(reason)                                                   \
    do {                                                                  \
        if (const char* rule = std::getenv("LA_FORBID_SKIPS");            \
            rule != nullptr && std::string_view(rule) == "1") {           \
            FAIL() << "skips are forbidden, and this one is: " << reason; \
        }                                                                 \
        GTEST_SKIP() << reason;                                           \
    } while (false)
