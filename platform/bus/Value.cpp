#include "platform/bus/Value.h"

#include <algorithm>
#include <cerrno>
#include <string_view>
#include <type_traits>
#include <utility>

namespace platform::bus {
namespace {

constexpr std::size_t mostElements = 100'000;

// The codes of the types that are no containers.
template <class T>
constexpr char codeOf = '\0';
template <>
constexpr char codeOf<bool> = SD_BUS_TYPE_BOOLEAN;
template <>
constexpr char codeOf<std::uint8_t> = SD_BUS_TYPE_BYTE;
template <>
constexpr char codeOf<std::int32_t> = SD_BUS_TYPE_INT32;
template <>
constexpr char codeOf<std::uint32_t> = SD_BUS_TYPE_UINT32;
template <>
constexpr char codeOf<std::int64_t> = SD_BUS_TYPE_INT64;
template <>
constexpr char codeOf<std::uint64_t> = SD_BUS_TYPE_UINT64;
template <>
constexpr char codeOf<std::string> = SD_BUS_TYPE_STRING;
template <>
constexpr char codeOf<Value> = SD_BUS_TYPE_VARIANT;

// A vector is an array, a map is one of entries.
template <class T>
concept Array = codeOf<T>
== '\0' && requires {
    typename T::value_type;
};
template <class T>
concept Map = Array<T> && requires {
    typename T::mapped_type;
};
template <class T>
concept Entry = requires {
    typename T::second_type;
};

template <class T>
std::string signatureOf() {
    if constexpr (Array<T>) {
        return "a" + signatureOf<typename T::value_type>();
    } else if constexpr (Entry<T>) {
        return "{s" + signatureOf<typename T::second_type>() + "}";
    } else {
        return std::string(1, codeOf<T>);
    }
}

template <class T>
int append(sd_bus_message* message, const T& value);

// Writes what a container holds between its beginning and its end.
template <class Fill>
int appendContainer(sd_bus_message* message, char type, const std::string& signature, const Fill& fill) {
    int result = sd_bus_message_open_container(message, type, signature.c_str());
    if (result >= 0) {
        result = fill();
    }
    return result < 0 ? result : sd_bus_message_close_container(message);
}

template <class T>
int appendContent(sd_bus_message* message, const T& value) {
    return appendContainer(message, SD_BUS_TYPE_VARIANT, signatureOf<T>(),
                           [&] { return append(message, value); });
}

template <class T>
int append(sd_bus_message* message, const T& value) {
    if constexpr (Array<T>) {
        return appendContainer(message, SD_BUS_TYPE_ARRAY, signatureOf<typename T::value_type>(), [&] {
            int result = 0;
            for (auto each = value.begin(); result >= 0 && each != value.end(); ++each) {
                result = append(message, *each);
            }
            return result;
        });
    } else if constexpr (Entry<T>) {
        const std::string types = "s" + signatureOf<typename T::second_type>();
        return appendContainer(message, SD_BUS_TYPE_DICT_ENTRY, types, [&] {
            const int result = append(message, value.first);
            return result < 0 ? result : append(message, value.second);
        });
    } else if constexpr (std::is_same_v<T, Value>) {
        return std::visit([message](const auto& content) { return appendContent(message, content); },
                          value.content);
    } else if constexpr (std::is_same_v<T, std::string>) {
        return sd_bus_message_append_basic(message, codeOf<T>, value.c_str());
    } else if constexpr (std::is_same_v<T, bool>) {
        const int flag = value ? 1 : 0;
        return sd_bus_message_append_basic(message, codeOf<T>, &flag);
    } else {
        return sd_bus_message_append_basic(message, codeOf<T>, &value);
    }
}

// Gives more than 0 when there is a value, and 0 for one of another type, which is skipped.
template <class T>
int read(sd_bus_message* message, T& value);

template <class... Types>
int readContent(sd_bus_message* message, const std::string& signature, std::variant<Types...>& content) {
    std::string known = signature == "y" ? "u" : signature;
    std::ranges::replace(known, 'o', 's');
    int result = 0;
    const bool isKnown = ((known == signatureOf<Types>() &&
                           ((result = read(message, content.template emplace<Types>())), true)) ||
                          ...);
    if (!isKnown) {
        result = sd_bus_message_skip(message, signature.c_str());
        return std::min(result, 0);
    }
    return result;
}

int readVariant(sd_bus_message* message, Value& value) {
    char type = 0;
    const char* content = nullptr;
    int result = sd_bus_message_peek_type(message, &type, &content);
    if (result >= 0) {
        const std::string signature = content == nullptr ? "" : content;
        result = sd_bus_message_enter_container(message, SD_BUS_TYPE_VARIANT, signature.c_str());
        if (result >= 0) {
            result = readContent(message, signature, value.content);
        }
    }
    const int left = result < 0 ? result : sd_bus_message_exit_container(message);
    return left < 0 ? left : result;
}

template <class T>
int readElement(sd_bus_message* message, T& array) {
    if constexpr (Map<T>) {
        std::string key;
        typename T::mapped_type element{};
        int result = sd_bus_message_enter_container(message, SD_BUS_TYPE_DICT_ENTRY, nullptr);
        result = result < 0 ? result : read(message, key);
        result = result < 0 ? result : read(message, element);
        if (result > 0) {
            array.insert_or_assign(key, std::move(element));
        }
        return result < 0 ? result : sd_bus_message_exit_container(message);
    } else {
        return read(message, array.emplace_back());
    }
}

template <class T>
int read(sd_bus_message* message, T& value) {
    char type = 0;
    int result = sd_bus_message_peek_type(message, &type, nullptr);
    if (result < 0) {
        return result;
    }
    if constexpr (Array<T>) {
        std::size_t count = 0;
        result = sd_bus_message_enter_container(message, SD_BUS_TYPE_ARRAY, nullptr);
        while (result >= 0 && (result = sd_bus_message_at_end(message, 0)) == 0) {
            result = ++count > mostElements ? -EMSGSIZE : readElement(message, value);
        }
        return result < 0 ? result : sd_bus_message_exit_container(message);
    } else if constexpr (std::is_same_v<T, Value>) {
        return readVariant(message, value);
    } else if constexpr (std::is_same_v<T, std::string>) {
        const char* text = nullptr;
        const bool isPath = type == SD_BUS_TYPE_OBJECT_PATH;
        result = sd_bus_message_read_basic(message, isPath ? type : codeOf<T>, &text);
        value = result > 0 ? text : "";
    } else if constexpr (std::is_same_v<T, bool>) {
        int flag = 0;
        result = sd_bus_message_read_basic(message, codeOf<T>, &flag);
        value = flag != 0;
    } else if (type == SD_BUS_TYPE_BYTE) {
        std::uint8_t byte = 0;
        result = sd_bus_message_read_basic(message, type, &byte);
        value = byte;
    } else {
        result = sd_bus_message_read_basic(message, codeOf<T>, &value);
    }
    return result;
}

}  // namespace

template <class T>
int appendValue(sd_bus_message* message, const T& value) {
    return append(message, value);
}
template int appendValue(sd_bus_message* message, const std::string& value);
template int appendValue(sd_bus_message* message, const std::uint32_t& value);
template int appendValue(sd_bus_message* message, const Value& value);
template int appendValue(sd_bus_message* message, const Dictionary& value);
template int appendValue(sd_bus_message* message, const Sections& value);

template <class T>
int readValue(sd_bus_message* message, T& value) {
    return read(message, value);
}
template int readValue(sd_bus_message* message, std::string& value);
template int readValue(sd_bus_message* message, Value& value);
template int readValue(sd_bus_message* message, Dictionary& value);
template int readValue(sd_bus_message* message, Sections& value);
template int readValue(sd_bus_message* message, Objects& value);
template int readValue(sd_bus_message* message, Texts& value);

}  // namespace platform::bus
