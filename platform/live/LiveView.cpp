#include "platform/live/LiveView.h"

#include <arpa/inet.h>

#include <algorithm>
#include <optional>
#include <utility>

#include "platform/base/DeviceText.h"
#include "platform/preferences/Store.h"
#include "platform/values/Fields.h"
#include "platform/values/Values.h"

namespace platform::live {
namespace {

using values::as;
using values::entriesOf;
using values::textOf;
using values::valueIn;

constexpr std::string_view globalPrefix = "Setup:/Network/Global/";
constexpr std::string_view servicePrefix = "Setup:/Network/Service/";
constexpr std::string_view globalIPv4Key = "State:/Network/Global/IPv4";

constexpr auto dictionaryIn = values::valueIn<CFDictionaryRef>;

bool isActive(CFDictionaryRef dictionary) {
    return CFDictionaryContainsKey(dictionary, CFSTR("__INACTIVE__")) == 0;
}

CFDictionaryRef entityIn(CFDictionaryRef container, std::string_view protocol) {
    const values::Owned<CFStringRef> key = values::makeString(protocol);
    CFDictionaryRef const entity = key ? dictionaryIn(container, key.get()) : nullptr;
    return entity != nullptr && isActive(entity) ? entity : nullptr;
}

void addEntityKeys(const std::string& prefix, CFDictionaryRef container, std::vector<std::string>& keys) {
    for (const values::Entry& entry : entriesOf(container)) {
        const auto entity = as<CFDictionaryRef>(entry.value);
        if (entity != nullptr && isActive(entity)) {
            keys.push_back(prefix + std::string(textOf(as<CFStringRef>(entry.key))));
        }
    }
}

std::string dottedQuad(const in_addr& address) {
    char text[INET_ADDRSTRLEN] = {};
    return ::inet_ntop(AF_INET, &address, text, sizeof text) != nullptr ? text : "";
}

}  // namespace

LiveView::LiveView(NetworkState& state) : state_(&state) {
    values::Owned<CFDictionaryRef> root;
    loaded_ = preferences::loadCommittedTree(root);
    tree_ = preferences::Tree(std::move(root));
}

CFDictionaryRef LiveView::dictionaryAt(CFStringRef path) const {
    CFPropertyListRef value = nullptr;
    const bool isThere = path != nullptr && tree_.find(textOf(path), value) == kSCStatusOK;
    return isThere ? as<CFDictionaryRef>(value) : nullptr;
}

CFDictionaryRef LiveView::network() const {
    const auto path = valueIn<CFStringRef>(tree_.root().get(), CFSTR("CurrentSet"));
    return dictionaryIn(dictionaryAt(path), CFSTR("Network"));
}

CFDictionaryRef LiveView::serviceBehind(CFTypeRef link) const {
    const auto path = valueIn<CFStringRef>(as<CFDictionaryRef>(link), CFSTR("__LINK__"));
    CFDictionaryRef const content = dictionaryAt(path);
    return content != nullptr && isActive(content) ? content : nullptr;
}

std::vector<LiveView::Service> LiveView::services() const {
    std::vector<Service> services;
    if (CFDictionaryRef const links = dictionaryIn(network(), CFSTR("Service"))) {
        for (const values::Entry& entry : entriesOf(links)) {
            if (CFDictionaryRef const content = serviceBehind(entry.value)) {
                services.push_back({std::string(textOf(as<CFStringRef>(entry.key))), content});
            }
        }
    }
    return services;
}

std::optional<std::string> LiveView::serviceNaming(const std::string& interface) const {
    // Several may name it, with different settings: the first in the order is the one that counts.
    std::vector<std::string> found;
    for (const Service& service : services()) {
        const auto name = valueIn<CFStringRef>(entityIn(service.content, "Interface"), CFSTR("DeviceName"));
        if (name != nullptr && textOf(name) == interface) {
            found.push_back(service.id);
        }
    }
    CFDictionaryRef const global = dictionaryIn(dictionaryIn(network(), CFSTR("Global")), CFSTR("IPv4"));
    if (const auto order = valueIn<CFArrayRef>(global, CFSTR("ServiceOrder"))) {
        for (const CFTypeRef id : values::itemsOf(order)) {
            const auto text = as<CFStringRef>(id);
            if (text != nullptr && std::ranges::count(found, textOf(text)) != 0) {
                return std::string(textOf(text));
            }
        }
    }
    return found.empty() ? std::nullopt : std::optional(found.front());
}

Outcome LiveView::globalIPv4(Value& value) const {
    std::optional<PrimaryRoute> route;
    RETURN_IF_FAILED(state_->primaryRoute(route));
    if (!route) {
        return {};
    }
    values::FieldWriter fields;
    fields("PrimaryInterface", deviceText(route->interface));
    if (route->router) {
        fields("Router", dottedQuad(*route->router));
    }
    fields("PrimaryService", serviceNaming(route->interface));
    value = Value::adopt(fields.take().take());
    return {};
}

Outcome LiveView::value(std::string_view key, Value& value) const {
    value = {};
    if (key == globalIPv4Key) {
        return globalIPv4(value);
    }
    if (key.starts_with(globalPrefix)) {
        key.remove_prefix(globalPrefix.size());
        value = Value::retained(entityIn(dictionaryIn(network(), CFSTR("Global")), key));
        return loaded_;
    }
    if (key.starts_with(servicePrefix)) {
        key.remove_prefix(servicePrefix.size());
        const std::size_t slash = key.find('/');
        const values::Owned<CFStringRef> id = values::makeString(key.substr(0, slash));
        CFDictionaryRef const links = dictionaryIn(network(), CFSTR("Service"));
        if (slash != std::string_view::npos && id && links != nullptr) {
            value = Value::retained(
                entityIn(serviceBehind(CFDictionaryGetValue(links, id.get())), key.substr(slash + 1)));
        }
        return loaded_;
    }
    return {};
}

Outcome LiveView::keys(std::vector<std::string>& keys) const {
    keys.clear();
    std::optional<PrimaryRoute> route;
    RETURN_IF_FAILED(loaded_);
    RETURN_IF_FAILED(state_->primaryRoute(route));
    if (route) {
        keys.emplace_back(globalIPv4Key);
    }
    if (CFDictionaryRef const globals = dictionaryIn(network(), CFSTR("Global"))) {
        addEntityKeys(std::string(globalPrefix), globals, keys);
    }
    for (const Service& service : services()) {
        addEntityKeys(std::string(servicePrefix) + service.id + "/", service.content, keys);
    }
    std::ranges::sort(keys);
    return {};
}

}  // namespace platform::live
