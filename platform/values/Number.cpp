// Numbers, booleans, data and dates.
#include <algorithm>
#include <charconv>
#include <cmath>
#include <cstdio>
#include <ctime>
#include <limits>

#include "platform/values/Scalars.h"
#include "platform/values/Values.h"

using namespace platform::values;

namespace {

constinit Immortal<OpaqueCFBoolean> trueValue(true);
constinit Immortal<OpaqueCFBoolean> falseValue(false);

// The nearest integer towards zero that the type holds, 0 for what is not a number; whether that is the very
// value.
bool integerFromReal(double real, std::int64_t& integer) {
    constexpr double beyond = 9223372036854775808.0;
    using Limits = std::numeric_limits<std::int64_t>;
    if (!(real >= -beyond && real < beyond)) {
        integer = std::isnan(real) ? 0 : real < 0 ? Limits::min() : Limits::max();
        return false;
    }
    integer = static_cast<std::int64_t>(real);
    return static_cast<double>(integer) == real;
}

}  // namespace

const CFBooleanRef kCFBooleanTrue = &trueValue.value;
const CFBooleanRef kCFBooleanFalse = &falseValue.value;

Owned<CFNumberRef> platform::values::makeNumber(std::int64_t value) {
    return Owned<CFNumberRef>::adopt(new OpaqueCFNumber(value));
}

Owned<CFNumberRef> platform::values::makeReal(double value) {
    return Owned<CFNumberRef>::adopt(new OpaqueCFNumber(value));
}

Owned<CFDateRef> platform::values::makeDate(std::int64_t seconds) {
    return Owned<CFDateRef>::adopt(new OpaqueCFDate(seconds));
}

std::optional<std::int64_t> platform::values::integerOf(CFNumberRef number) noexcept {
    return number->isReal ? std::nullopt : std::optional(number->integer);
}

std::string platform::values::realText(double value) {
    if (std::isnan(value)) {
        return "nan";
    }
    char buffer[32];
    const std::to_chars_result result = std::to_chars(std::begin(buffer), std::end(buffer), value);
    return {std::begin(buffer), result.ptr};
}

std::string platform::values::dateText(std::int64_t seconds) {
    const std::time_t moment = seconds;
    std::tm time{};
    gmtime_r(&moment, &time);
    char buffer[64];
    const int size =
        std::snprintf(buffer, sizeof buffer, "%04d-%02d-%02dT%02d:%02d:%02dZ", time.tm_year + 1900,
                      time.tm_mon + 1, time.tm_mday, time.tm_hour, time.tm_min, time.tm_sec);
    return {buffer, static_cast<std::size_t>(size)};
}

CFTypeID CFNumberGetTypeID() noexcept {
    return static_cast<CFTypeID>(Type::number);
}

CFNumberRef CFNumberCreate(CFAllocatorRef, CFNumberType type, const void* value) noexcept {
    switch (type) {
        case kCFNumberSInt32Type:
            return makeNumber(*static_cast<const SInt32*>(value)).take();
        case kCFNumberSInt64Type:
            return makeNumber(*static_cast<const std::int64_t*>(value)).take();
        default:
            return nullptr;
    }
}

Boolean CFNumberGetValue(CFNumberRef number, CFNumberType type, void* value) noexcept {
    std::int64_t integer = number->isReal ? 0 : number->integer;
    const bool exact = !number->isReal || integerFromReal(number->real, integer);
    if (type == kCFNumberSInt64Type) {
        *static_cast<std::int64_t*>(value) = integer;
        return static_cast<Boolean>(exact);
    }
    if (type != kCFNumberSInt32Type) {
        return 0;
    }
    using Limits = std::numeric_limits<SInt32>;
    const auto nearest = static_cast<SInt32>(std::clamp<std::int64_t>(integer, Limits::min(), Limits::max()));
    *static_cast<SInt32*>(value) = nearest;
    return static_cast<Boolean>(exact && nearest == integer);
}

Boolean CFNumberIsFloatType(CFNumberRef number) noexcept {
    return static_cast<Boolean>(number->isReal);
}

CFTypeID CFBooleanGetTypeID() noexcept {
    return static_cast<CFTypeID>(Type::boolean);
}

Boolean CFBooleanGetValue(CFBooleanRef boolean) noexcept {
    return static_cast<Boolean>(boolean->value);
}

CFTypeID CFDataGetTypeID() noexcept {
    return static_cast<CFTypeID>(Type::data);
}

CFDataRef CFDataCreate(CFAllocatorRef, const UInt8* bytes, CFIndex length) noexcept {
    return new OpaqueCFData(
        length > 0 ? std::string(reinterpret_cast<const char*>(bytes), static_cast<std::size_t>(length))
                   : std::string());
}

CFIndex CFDataGetLength(CFDataRef data) noexcept {
    return static_cast<CFIndex>(data->bytes.size());
}

const UInt8* CFDataGetBytePtr(CFDataRef data) noexcept {
    return reinterpret_cast<const UInt8*>(data->bytes.data());
}

CFTypeID CFDateGetTypeID() noexcept {
    return static_cast<CFTypeID>(Type::date);
}
