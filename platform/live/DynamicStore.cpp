// The operations of SystemConfiguration.h on the live state.
#include <poll.h>
#include <regex.h>

#include <algorithm>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/SystemConfiguration.h"
#include "platform/base/Host.h"
#include "platform/live/ChangeWatch.h"
#include "platform/live/LiveView.h"
#include "platform/live/NetworkState.h"
#include "platform/preferences/Status.h"
#include "platform/values/RunLoop.h"
#include "platform/values/Values.h"

const CFStringRef kSCDynamicStoreDomainState = CFSTR("State:");
const CFStringRef kSCDynamicStoreDomainSetup = CFSTR("Setup:");
const CFStringRef kSCEntNetIPv4 = CFSTR("IPv4");

namespace {

using platform::Outcome;
using platform::live::ChangeWatch;
using platform::live::LiveView;
using platform::live::NetworkState;
using platform::live::Value;
using platform::preferences::setStatus;
using platform::values::as;
using platform::values::Object;
using platform::values::Owned;
using platform::values::textOf;

struct PatternFreer {
    void operator()(regex_t* compiled) const noexcept {
        ::regfree(compiled);
        delete compiled;
    }
};
// A POSIX extended regular expression that a whole key has to match; null for what is none.
using KeyPattern = std::unique_ptr<regex_t, PatternFreer>;

KeyPattern compile(const std::string& expression) {
    auto compiled = std::make_unique<regex_t>();
    const bool isGood = ::regcomp(compiled.get(), expression.c_str(), REG_EXTENDED) == 0;
    return KeyPattern(isGood ? compiled.release() : nullptr);
}

// Of the leftmost matches POSIX gives the longest, so a shorter one never hides a match of the whole.
bool matches(const KeyPattern& pattern, const std::string& key) {
    regmatch_t match{};
    return ::regexec(pattern.get(), key.c_str(), 1, &match, 0) == 0 && match.rm_so == 0 &&
           static_cast<std::size_t>(match.rm_eo) == key.size();
}

Owned<CFArrayRef> arrayOf(const std::vector<std::string>& texts) {
    CFMutableArrayRef const array = CFArrayCreateMutable(kCFAllocatorDefault, 0, &kCFTypeArrayCallBacks);
    for (const std::string& text : texts) {
        if (const Owned<CFStringRef> item = platform::values::makeString(text)) {
            CFArrayAppendValue(array, item.get());
        }
    }
    return Owned<CFArrayRef>::adopt(array);
}

// The strings of an array that may be null; nothing when it holds anything else.
std::optional<std::vector<std::string>> textsIn(CFArrayRef array) {
    std::vector<std::string> texts;
    if (array != nullptr) {
        if (as<CFArrayRef>(array) == nullptr) {
            return std::nullopt;
        }
        for (const CFTypeRef item : platform::values::itemsOf(array)) {
            const auto text = as<CFStringRef>(item);
            if (text == nullptr) {
                return std::nullopt;
            }
            texts.emplace_back(textOf(text));
        }
    }
    return texts;
}

class DynamicStore final : public Object {
  public:
    DynamicStore(std::string name, SCDynamicStoreCallBack callBack, const SCDynamicStoreContext* context)
        : Object(platform::values::Type::dynamicStore),
          name_(std::move(name)),
          callBack_(callBack),
          context_(context != nullptr ? *context : SCDynamicStoreContext{}) {
        if (context_.retain != nullptr && context_.info != nullptr) {
            context_.retain(context_.info);
        }
    }
    ~DynamicStore() override {
        if (context_.release != nullptr && context_.info != nullptr) {
            context_.release(context_.info);
        }
    }

    static DynamicStore* from(SCDynamicStoreRef reference) noexcept {
        auto* const object = static_cast<Object*>(static_cast<void*>(reference));
        return object != nullptr && object->type() == platform::values::Type::dynamicStore
                   ? static_cast<DynamicStore*>(object)
                   : nullptr;
    }
    [[nodiscard]] SCDynamicStoreRef reference() noexcept {
        return static_cast<SCDynamicStoreRef>(static_cast<void*>(static_cast<Object*>(this)));
    }

    [[nodiscard]] const std::string& name() const noexcept { return name_; }
    [[nodiscard]] NetworkState& state() const noexcept { return *state_; }

    Outcome openWatch() {
        if (watch_) {
            return {};
        }
        auto watch = std::make_unique<ChangeWatch>();
        RETURN_IF_FAILED(watch->open(*state_, platform::currentHost().preferencesDirectory));
        watch_ = std::move(watch);
        return {};
    }

    // The watch must be open.
    Outcome setWatched(std::vector<std::string> keys, std::vector<KeyPattern> patterns) {
        std::map<std::string, Value> values;
        RETURN_IF_FAILED(look(keys, patterns, values));
        watchedKeys_ = std::move(keys);
        patterns_ = std::move(patterns);
        seen_ = std::move(values);
        return {};
    }

    [[nodiscard]] int descriptor() const noexcept { return watch_->descriptor(); }

    // There is news: calls the client with the keys whose values are no longer what they were.
    void wake() {
        if (!watch_->take()) {
            return;
        }
        std::map<std::string, Value> values;
        const Outcome done = look(watchedKeys_, patterns_, values);
        if (!done.ok()) {
            setStatus(done, name_);
            watch_->retryLater();
            return;
        }
        const std::vector<std::string> changed = differences(seen_, values);
        seen_ = std::move(values);
        if (!changed.empty() && callBack_ != nullptr) {
            const Owned<CFArrayRef> keys = arrayOf(changed);
            callBack_(reference(), keys.get(), context_.info);
        }
    }

  private:
    // What is at the keys and at those that match a pattern; a key without a value is not in it.
    Outcome look(std::vector<std::string> keys, const std::vector<KeyPattern>& patterns,
                 std::map<std::string, Value>& values) const {
        const LiveView view(*state_);
        std::vector<std::string> all;
        if (!patterns.empty()) {
            RETURN_IF_FAILED(view.keys(all));
        }
        std::ranges::copy_if(all, std::back_inserter(keys), [&](const std::string& key) {
            return std::ranges::any_of(patterns, [&](const KeyPattern& each) { return matches(each, key); });
        });
        for (const std::string& key : keys) {
            Value value;
            RETURN_IF_FAILED(view.value(key, value));
            if (value) {
                values[key] = std::move(value);
            }
        }
        return {};
    }

    static std::vector<std::string> differences(const std::map<std::string, Value>& before,
                                                const std::map<std::string, Value>& now) {
        std::vector<std::string> changed;
        for (const auto& [key, value] : before) {
            const auto found = now.find(key);
            if (found == now.end() || CFEqual(found->second.get(), value.get()) == 0) {
                changed.push_back(key);
            }
        }
        for (const auto& [key, value] : now) {
            if (before.find(key) == before.end()) {
                changed.push_back(key);
            }
        }
        return changed;
    }

    const std::string name_;
    const SCDynamicStoreCallBack callBack_;
    const SCDynamicStoreContext context_;
    const std::shared_ptr<NetworkState> state_ = platform::live::currentNetworkState();
    std::unique_ptr<ChangeWatch> watch_;
    std::vector<std::string> watchedKeys_;
    std::vector<KeyPattern> patterns_;
    std::map<std::string, Value> seen_;
};

CFStringRef createKey(CFStringRef domain, std::string_view middle, CFStringRef id, CFStringRef entity) {
    if (as<CFStringRef>(domain) == nullptr) {
        setStatus(kSCStatusInvalidArgument);
        return nullptr;
    }
    std::string key = std::string(textOf(domain)) + std::string(middle);
    for (CFStringRef const part : {id, entity}) {
        if (part != nullptr) {
            key += "/" + std::string(textOf(part));
        }
    }
    setStatus(kSCStatusOK);
    return platform::values::makeString(key).take();
}

}  // namespace

SCDynamicStoreRef SCDynamicStoreCreate(CFAllocatorRef /*allocator*/, CFStringRef name,
                                       SCDynamicStoreCallBack callBack,
                                       SCDynamicStoreContext* context) noexcept {
    std::string client(as<CFStringRef>(name) != nullptr ? textOf(name) : "live state");
    DynamicStore* const store = new DynamicStore(std::move(client), callBack, context);
    setStatus(kSCStatusOK);
    return store->reference();
}

CFStringRef SCDynamicStoreKeyCreateNetworkGlobalEntity(CFAllocatorRef /*allocator*/, CFStringRef domain,
                                                       CFStringRef entity) noexcept {
    return createKey(domain, "/Network/Global", nullptr, entity);
}

CFStringRef SCDynamicStoreKeyCreateNetworkServiceEntity(CFAllocatorRef /*allocator*/, CFStringRef domain,
                                                        CFStringRef serviceID, CFStringRef entity) noexcept {
    return createKey(domain, "/Network/Service", serviceID, entity);
}

CFArrayRef SCDynamicStoreCopyKeyList(SCDynamicStoreRef store, CFStringRef pattern) noexcept {
    const DynamicStore* const self = DynamicStore::from(store);
    if (self == nullptr || as<CFStringRef>(pattern) == nullptr) {
        setStatus(self == nullptr ? kSCStatusNoStoreSession : kSCStatusInvalidArgument);
        return nullptr;
    }
    const KeyPattern compiled = compile(std::string(textOf(pattern)));
    if (!compiled) {
        setStatus(kSCStatusInvalidArgument);
        return nullptr;
    }
    std::vector<std::string> keys;
    if (!setStatus(LiveView(self->state()).keys(keys), self->name())) {
        return nullptr;
    }
    std::erase_if(keys, [&compiled](const std::string& key) { return !matches(compiled, key); });
    return arrayOf(keys).take();
}

CFPropertyListRef SCDynamicStoreCopyValue(SCDynamicStoreRef store, CFStringRef key) noexcept {
    const DynamicStore* const self = DynamicStore::from(store);
    if (self == nullptr || as<CFStringRef>(key) == nullptr) {
        setStatus(self == nullptr ? kSCStatusNoStoreSession : kSCStatusInvalidArgument);
        return nullptr;
    }
    Value value;
    if (setStatus(LiveView(self->state()).value(textOf(key), value), self->name()) && !value) {
        setStatus(kSCStatusNoKey);
    }
    return value.take();
}

Boolean SCDynamicStoreSetNotificationKeys(SCDynamicStoreRef store, CFArrayRef keys,
                                          CFArrayRef patterns) noexcept {
    DynamicStore* const self = DynamicStore::from(store);
    if (self == nullptr) {
        return static_cast<Boolean>(setStatus(kSCStatusNoStoreSession));
    }
    std::optional<std::vector<std::string>> keyTexts = textsIn(keys);
    const std::optional<std::vector<std::string>> patternTexts = textsIn(patterns);
    std::vector<KeyPattern> compiled;
    for (const std::string& text : patternTexts.value_or(std::vector<std::string>())) {
        compiled.push_back(compile(text));
    }
    if (!keyTexts || !patternTexts || std::count(compiled.begin(), compiled.end(), nullptr) != 0) {
        return static_cast<Boolean>(setStatus(kSCStatusInvalidArgument));
    }
    return static_cast<Boolean>(
        setStatus(self->openWatch(), self->name()) &&
        setStatus(self->setWatched(std::move(*keyTexts), std::move(compiled)), self->name()));
}

CFRunLoopSourceRef SCDynamicStoreCreateRunLoopSource(CFAllocatorRef /*allocator*/, SCDynamicStoreRef store,
                                                     CFIndex /*order*/) noexcept {
    DynamicStore* const self = DynamicStore::from(store);
    if (self == nullptr) {
        setStatus(kSCStatusNoStoreSession);
        return nullptr;
    }
    if (!setStatus(self->openWatch(), self->name())) {
        return nullptr;
    }
    const auto held = Owned<SCDynamicStoreRef>::retained(store);
    return platform::values::makeRunLoopSource(self->descriptor(), POLLIN,
                                               [held](short) { DynamicStore::from(held.get())->wake(); })
        .take();
}
