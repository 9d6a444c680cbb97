// The values that a D-Bus message carries, apart from any bus.
#pragma once

#include <systemd/sd-bus.h>

#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <variant>
#include <vector>

namespace platform::bus {

struct Value;
using Dictionary = std::map<std::string, Value, std::less<>>;
// A profile: its sections by name.
using Sections = std::map<std::string, Dictionary, std::less<>>;
using Bytes = std::vector<std::uint8_t>;
using Texts = std::vector<std::string>;
using TextMap = std::map<std::string, std::string, std::less<>>;

// The D-Bus types in use, in order: b, i, u, x, t, s, ay, as, au, a{ss}, aa{sv}. A single byte (y) is read as
// an u, a path (o) as a string, an array of paths as an array of strings.
struct Value {
    std::variant<bool, std::int32_t, std::uint32_t, std::int64_t, std::uint64_t, std::string, Bytes, Texts,
                 std::vector<std::uint32_t>, TextMap, std::vector<Dictionary>>
        content;
    bool operator==(const Value&) const = default;
};

// The value under a key when it has the type asked for; else nothing.
template <class T>
[[nodiscard]] std::optional<T> valueOf(const Dictionary& dictionary, std::string_view key) {
    const auto found = dictionary.find(key);
    const T* const value = found == dictionary.end() ? nullptr : std::get_if<T>(&found->second.content);
    return value == nullptr ? std::nullopt : std::optional<T>(*value);
}

struct MessageUnref {
    void operator()(sd_bus_message* message) const noexcept { sd_bus_message_unref(message); }
};
using Message = std::unique_ptr<sd_bus_message, MessageUnref>;

// Each of these returns 0 or more, or a negative errno, as sd-bus does. Appending writes at the message's
// end; reading takes what comes next.
int appendVariant(sd_bus_message* message, const Value& value);
int appendDictionary(sd_bus_message* message, const Dictionary& dictionary);  // a{sv}
int appendSections(sd_bus_message* message, const Sections& sections);        // a{sa{sv}}

// Values of other types than the ones above are left out. More than a hundred thousand elements in one
// container are an error (-EMSGSIZE).
int readVariant(sd_bus_message* message, std::optional<Value>& value);
int readDictionary(sd_bus_message* message, Dictionary& dictionary);
int readSections(sd_bus_message* message, Sections& sections);
int readTexts(sd_bus_message* message, Texts& texts);  // as or ao

}  // namespace platform::bus
