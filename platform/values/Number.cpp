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

CFNumberRef CFNumberCreate(CFAllocatorRef, CFNumberType, const void* value) noexcept {
    return makeNumber(*static_cast<const SInt32*>(value)).take();
}

Boolean CFNumberGetValue(CFNumberRef number, CFNumberType, void* value) noexcept {
    using Limits = std::numeric_limits<SInt32>;
    auto& nearest = *static_cast<SInt32*>(value);
    if (!number->isReal) {
        nearest =
            static_cast<SInt32>(std::clamp<std::int64_t>(number->integer, Limits::min(), Limits::max()));
        return static_cast<Boolean>(nearest == number->integer);
    }
    nearest = std::isnan(number->real)
                  ? 0
                  : static_cast<SInt32>(std::clamp<double>(number->real, Limits::min(), Limits::max()));
    return static_cast<Boolean>(nearest == number->real);
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
