// What the bus carries on one line, in the notation of trees; the type of a number stands behind it.
#pragma once

#include <string>
#include <type_traits>

#include "platform/bus/Value.h"

namespace testing_support {

template <class T>
std::string showValue(const T& value) {
    std::string text;
    if constexpr (std::is_same_v<T, platform::bus::Value>) {
        return std::visit([](const auto& content) { return showValue(content); }, value.content);
    } else if constexpr (std::is_same_v<T, std::string>) {
        return value;
    } else if constexpr (std::is_same_v<T, bool>) {
        return value ? "#true" : "#false";
    } else if constexpr (std::is_integral_v<T>) {
        return std::to_string(value) + (sizeof value == 8 ? "x" : std::is_signed_v<T> ? "i" : "u");
    } else if constexpr (std::is_same_v<T, platform::bus::ByteArray>) {
        return "<" + std::string(value.begin(), value.end()) + ">";
    } else if constexpr (requires { typename T::mapped_type; }) {
        for (const auto& [key, each] : value) {
            text += (text.empty() ? "" : "; ") + key + " = " + showValue(each);
        }
        return "{" + text + "}";
    } else {
        for (const auto& each : value) {
            text += (text.empty() ? "" : ", ") + showValue(each);
        }
        return "(" + text + ")";
    }
}

}  // namespace testing_support
