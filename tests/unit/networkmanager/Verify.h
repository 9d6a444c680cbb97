// NetworkManager's own library as the judge of profiles.
#pragma once

#include <string>

#include "platform/bus/Value.h"

namespace testing_support {

// What is wrong with the profile or its secrets; empty when nothing is.
[[nodiscard]] std::string verifyProfile(const platform::bus::Sections& profile);

}  // namespace testing_support
