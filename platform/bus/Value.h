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
// Objects by path, each with its interfaces.
using Objects = std::map<std::string, Sections, std::less<>>;
using ByteArray = std::vector<std::uint8_t>;
using Texts = std::vector<std::string>;
using TextMap = std::map<std::string, std::string, std::less<>>;

// The D-Bus types in use, in order: b, i, u, x, t, s, ay, as, au, aay, a{ss}, aa{sv}. A single byte (y) is
// read as an u, a path (o) as a string, an array of paths as an array of strings.
struct Value {
    std::variant<bool, std::int32_t, std::uint32_t, std::int64_t, std::uint64_t, std::string, ByteArray,
                 Texts, std::vector<std::uint32_t>, std::vector<ByteArray>, TextMap, std::vector<Dictionary>>
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
using MessageRef = std::unique_ptr<sd_bus_message, MessageUnref>;

// Both return 0 or more, or a negative errno, as sd-bus does. Appending writes at the message's end; reading
// takes what comes next.

// A path of an object, as an argument.
struct Path {
    std::string text;
};

// Of text (s), a Path (o), a number (u), a Value (v), a Dictionary (a{sv}) or Sections (a{sa{sv}}).
template <class T>
int appendValue(sd_bus_message* message, const T& value);
inline int appendValue(sd_bus_message* message, const char* text) {
    return sd_bus_message_append(message, "s", text);
}
inline int appendValue(sd_bus_message* message, const Path& path) {
    return sd_bus_message_append(message, "o", path.text.c_str());
}

// Of text or a path, a Value, a Dictionary, Sections, Objects (a{oa{sa{sv}}}) or Texts (as or ao). Values of
// other types than the ones above are left out. More than a hundred thousand elements in one container are an
// error (-EMSGSIZE).
template <class T>
int readValue(sd_bus_message* message, T& value);

}  // namespace platform::bus
