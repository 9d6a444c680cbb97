#include "platform/bus/Value.h"

#include <cerrno>
#include <string_view>

namespace platform::bus {
namespace {

constexpr std::size_t mostElements = 100'000;

int appendBasic(sd_bus_message* message, char type, const void* value) {
    return sd_bus_message_append_basic(message, type, value);
}

int appendText(sd_bus_message* message, const std::string& text) {
    return appendBasic(message, SD_BUS_TYPE_STRING, text.c_str());
}

template <class Elements, class Each>
int appendArray(sd_bus_message* message, const char* type, const Elements& elements, const Each& each) {
    int result = sd_bus_message_open_container(message, SD_BUS_TYPE_ARRAY, type);
    for (auto element = elements.begin(); result >= 0 && element != elements.end(); ++element) {
        result = each(*element);
    }
    return result < 0 ? result : sd_bus_message_close_container(message);
}

// An entry of a dictionary with keys of type s.
template <class Rest>
int appendEntry(sd_bus_message* message, const char* types, const std::string& key, const Rest& rest) {
    int result = sd_bus_message_open_container(message, SD_BUS_TYPE_DICT_ENTRY, types);
    if (result >= 0) {
        result = appendText(message, key);
    }
    if (result >= 0) {
        result = rest();
    }
    return result < 0 ? result : sd_bus_message_close_container(message);
}

// Writes the content of a variant; the overload is chosen by the value's type.
struct Appender {
    sd_bus_message* message;

    int operator()(bool value) const {
        const int flag = value ? 1 : 0;
        return appendBasic(message, SD_BUS_TYPE_BOOLEAN, &flag);
    }
    int operator()(std::int32_t value) const { return appendBasic(message, SD_BUS_TYPE_INT32, &value); }
    int operator()(std::uint32_t value) const { return appendBasic(message, SD_BUS_TYPE_UINT32, &value); }
    int operator()(std::int64_t value) const { return appendBasic(message, SD_BUS_TYPE_INT64, &value); }
    int operator()(std::uint64_t value) const { return appendBasic(message, SD_BUS_TYPE_UINT64, &value); }
    int operator()(const std::string& value) const { return appendText(message, value); }
    int operator()(const Bytes& value) const {
        return sd_bus_message_append_array(message, SD_BUS_TYPE_BYTE, value.data(), value.size());
    }
    int operator()(const std::vector<std::uint32_t>& value) const {
        return sd_bus_message_append_array(message, SD_BUS_TYPE_UINT32, value.data(),
                                           value.size() * sizeof(std::uint32_t));
    }
    int operator()(const Texts& value) const {
        return appendArray(message, "s", value,
                           [this](const std::string& text) { return appendText(message, text); });
    }
    int operator()(const TextMap& value) const {
        return appendArray(message, "{ss}", value, [this](const auto& entry) {
            return appendEntry(message, "ss", entry.first, [&] { return appendText(message, entry.second); });
        });
    }
    int operator()(const std::vector<Dictionary>& value) const {
        return appendArray(message, "a{sv}", value, [this](const Dictionary& dictionary) {
            return appendDictionary(message, dictionary);
        });
    }
};

const char* signatureOf(const Value& value) noexcept {
    // In the order of the variant's alternatives.
    static constexpr const char* signatures[] = {"b",  "i",  "u",  "x",     "t",     "s",
                                                 "ay", "as", "au", "a{ss}", "aa{sv}"};
    static_assert(std::size(signatures) == std::variant_size_v<decltype(Value::content)>);
    return signatures[value.content.index()];
}

// Calls each() until the container that was just entered is at its end.
template <class Each>
int readToEnd(sd_bus_message* message, const Each& each) {
    std::size_t count = 0;
    int atEnd = 0;
    while ((atEnd = sd_bus_message_at_end(message, 0)) == 0) {
        const int result = ++count > mostElements ? -EMSGSIZE : each();
        if (result < 0) {
            return result;
        }
    }
    return atEnd < 0 ? atEnd : sd_bus_message_exit_container(message);
}

template <class Each>
int readArray(sd_bus_message* message, const char* type, const Each& each) {
    const int result = sd_bus_message_enter_container(message, SD_BUS_TYPE_ARRAY, type);
    return result < 0 ? result : readToEnd(message, each);
}

int readText(sd_bus_message* message, char type, std::string& text) {
    const char* borrowed = nullptr;
    const int result = sd_bus_message_read_basic(message, type, &borrowed);
    if (result > 0) {
        text = borrowed;
    }
    return result;
}

template <class Rest>
int readEntry(sd_bus_message* message, const char* types, const Rest& rest) {
    int result = sd_bus_message_enter_container(message, SD_BUS_TYPE_DICT_ENTRY, types);
    std::string key;
    if (result >= 0) {
        result = readText(message, SD_BUS_TYPE_STRING, key);
    }
    if (result >= 0) {
        result = rest(key);
    }
    return result < 0 ? result : sd_bus_message_exit_container(message);
}

template <class T>
int readNumber(sd_bus_message* message, char type, std::optional<Value>& value) {
    T number{};
    const int result = sd_bus_message_read_basic(message, type, &number);
    if (result > 0) {
        value = Value{number};
    }
    return result;
}

template <class T>
int readNumbers(sd_bus_message* message, char type, std::optional<Value>& value) {
    const void* elements = nullptr;
    std::size_t size = 0;
    const int result = sd_bus_message_read_array(message, type, &elements, &size);
    if (result >= 0) {
        const auto* const first = static_cast<const T*>(elements);
        value = Value{std::vector<T>(first, first + size / sizeof(T))};
    }
    return result;
}

int readContent(sd_bus_message* message, std::string_view signature, std::optional<Value>& value) {
    if (signature == "b") {
        int flag = 0;
        const int result = sd_bus_message_read_basic(message, SD_BUS_TYPE_BOOLEAN, &flag);
        value = Value{flag != 0};
        return result;
    }
    if (signature == "y") {
        std::uint8_t byte = 0;
        const int result = sd_bus_message_read_basic(message, SD_BUS_TYPE_BYTE, &byte);
        value = Value{std::uint32_t{byte}};
        return result;
    }
    if (signature == "i") {
        return readNumber<std::int32_t>(message, SD_BUS_TYPE_INT32, value);
    }
    if (signature == "u") {
        return readNumber<std::uint32_t>(message, SD_BUS_TYPE_UINT32, value);
    }
    if (signature == "x") {
        return readNumber<std::int64_t>(message, SD_BUS_TYPE_INT64, value);
    }
    if (signature == "t") {
        return readNumber<std::uint64_t>(message, SD_BUS_TYPE_UINT64, value);
    }
    if (signature == "s" || signature == "o") {
        std::string text;
        const int result = readText(message, signature.front(), text);
        value = Value{std::move(text)};
        return result;
    }
    if (signature == "ay") {
        return readNumbers<std::uint8_t>(message, SD_BUS_TYPE_BYTE, value);
    }
    if (signature == "au") {
        return readNumbers<std::uint32_t>(message, SD_BUS_TYPE_UINT32, value);
    }
    if (signature == "as" || signature == "ao") {
        Texts texts;
        const int result = readTexts(message, texts);
        value = Value{std::move(texts)};
        return result;
    }
    if (signature == "a{ss}") {
        TextMap map;
        const int result = readArray(message, "{ss}", [message, &map] {
            return readEntry(message, "ss", [message, &map](const std::string& key) {
                return readText(message, SD_BUS_TYPE_STRING, map[key]);
            });
        });
        value = Value{std::move(map)};
        return result;
    }
    if (signature == "aa{sv}") {
        std::vector<Dictionary> dictionaries;
        const int result = readArray(message, "a{sv}", [message, &dictionaries] {
            return readDictionary(message, dictionaries.emplace_back());
        });
        value = Value{std::move(dictionaries)};
        return result;
    }
    return sd_bus_message_skip(message, std::string(signature).c_str());
}

}  // namespace

int appendVariant(sd_bus_message* message, const Value& value) {
    int result = sd_bus_message_open_container(message, SD_BUS_TYPE_VARIANT, signatureOf(value));
    if (result >= 0) {
        result = std::visit(Appender{message}, value.content);
    }
    return result < 0 ? result : sd_bus_message_close_container(message);
}

int appendDictionary(sd_bus_message* message, const Dictionary& dictionary) {
    return appendArray(message, "{sv}", dictionary, [message](const auto& entry) {
        return appendEntry(message, "sv", entry.first, [&] { return appendVariant(message, entry.second); });
    });
}

int appendSections(sd_bus_message* message, const Sections& sections) {
    return appendArray(message, "{sa{sv}}", sections, [message](const auto& section) {
        return appendEntry(message, "sa{sv}", section.first,
                           [&] { return appendDictionary(message, section.second); });
    });
}

int readVariant(sd_bus_message* message, std::optional<Value>& value) {
    char type = 0;
    const char* content = nullptr;
    value.reset();
    int result = sd_bus_message_peek_type(message, &type, &content);
    if (result >= 0 && type != SD_BUS_TYPE_VARIANT) {
        return -EBADMSG;
    }
    if (result >= 0) {
        result = sd_bus_message_enter_container(message, SD_BUS_TYPE_VARIANT, content);
    }
    if (result >= 0) {
        result = readContent(message, content, value);
    }
    return result < 0 ? result : sd_bus_message_exit_container(message);
}

int readDictionary(sd_bus_message* message, Dictionary& dictionary) {
    return readArray(message, "{sv}", [message, &dictionary] {
        return readEntry(message, "sv", [message, &dictionary](const std::string& key) {
            std::optional<Value> value;
            const int result = readVariant(message, value);
            if (result >= 0 && value) {
                dictionary.insert_or_assign(key, std::move(*value));
            }
            return result;
        });
    });
}

int readSections(sd_bus_message* message, Sections& sections) {
    return readArray(message, "{sa{sv}}", [message, &sections] {
        return readEntry(message, "sa{sv}", [message, &sections](const std::string& name) {
            return readDictionary(message, sections[name]);
        });
    });
}

int readTexts(sd_bus_message* message, Texts& texts) {
    char type = 0;
    const char* content = nullptr;
    const int result = sd_bus_message_peek_type(message, &type, &content);
    if (result < 0 || type != SD_BUS_TYPE_ARRAY) {
        return result < 0 ? result : -EBADMSG;
    }
    const std::string element = content;
    if (element != "s" && element != "o") {
        return -EBADMSG;
    }
    return readArray(message, element.c_str(), [message, &element, &texts] {
        return readText(message, element.front(), texts.emplace_back());
    });
}

}  // namespace platform::bus
