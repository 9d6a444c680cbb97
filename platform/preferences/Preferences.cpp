// The operations of SystemConfiguration.h on the preferences store.
#include <chrono>
#include <string>
#include <type_traits>

#include "platform/SystemConfiguration.h"
#include "platform/preferences/Session.h"
#include "platform/preferences/Status.h"
#include "platform/values/Values.h"

namespace {

using platform::preferences::Session;
using platform::preferences::setStatus;
using platform::values::as;
using platform::values::Owned;
using platform::values::textOf;

// What an operation on the session comes to; 3001 without one.
template <class Operation>
Boolean onSession(SCPreferencesRef reference, Operation operation) {
    Session* const session = Session::from(reference);
    if (session == nullptr) {
        return static_cast<Boolean>(setStatus(kSCStatusNoPrefsSession));
    }
    if constexpr (std::is_same_v<decltype(operation(*session)), int>) {
        return static_cast<Boolean>(setStatus(operation(*session)));
    } else {
        return static_cast<Boolean>(setStatus(operation(*session), session->name()));
    }
}

bool isPath(CFStringRef path) {
    return as<CFStringRef>(path) != nullptr;
}

// The dictionary at the path, or null with the status set.
CFDictionaryRef dictionaryAt(SCPreferencesRef reference, CFStringRef path) {
    Session* const session = Session::from(reference);
    if (session == nullptr || !isPath(path)) {
        setStatus(session == nullptr ? kSCStatusNoPrefsSession : kSCStatusInvalidArgument);
        return nullptr;
    }
    CFPropertyListRef value = nullptr;
    int status = session->tree().find(textOf(path), value);
    const auto dictionary = as<CFDictionaryRef>(value);
    // There, but nothing that a path may end in: not taken for absent, or a caller would put something else
    // in its place.
    if (status == kSCStatusOK && dictionary == nullptr) {
        status = kSCStatusFailed;
    }
    setStatus(status);
    return dictionary;
}

}  // namespace

SCPreferencesRef SCPreferencesCreate(CFAllocatorRef /*allocator*/, CFStringRef name,
                                     CFStringRef prefsID) noexcept {
    // An ID would name another store than the one that there is.
    if (as<CFStringRef>(name) == nullptr || prefsID != nullptr) {
        setStatus(kSCStatusInvalidArgument);
        return nullptr;
    }
    const std::string client(textOf(name));
    Owned<SCPreferencesRef> session;
    setStatus(Session::open(client, session), client);
    return session.take();
}

Boolean SCPreferencesLock(SCPreferencesRef session, Boolean wait) noexcept {
    return onSession(session, [wait](Session& self) {
        return self.lock(wait != 0 ? platform::preferences::lockWait : std::chrono::seconds(0));
    });
}

Boolean SCPreferencesUnlock(SCPreferencesRef session) noexcept {
    return onSession(session, [](Session& self) { return self.unlock(); });
}

CFPropertyListRef SCPreferencesGetValue(SCPreferencesRef session, CFStringRef key) noexcept {
    Session* const self = Session::from(session);
    if (self == nullptr || as<CFStringRef>(key) == nullptr) {
        setStatus(self == nullptr ? kSCStatusNoPrefsSession : kSCStatusInvalidArgument);
        return nullptr;
    }
    const CFPropertyListRef value = self->tree().topValue(key);
    setStatus(value != nullptr ? kSCStatusOK : kSCStatusNoKey);
    return value;
}

Boolean SCPreferencesSetValue(SCPreferencesRef session, CFStringRef key, CFPropertyListRef value) noexcept {
    const bool valid = as<CFStringRef>(key) != nullptr && value != nullptr;
    return onSession(session, [&](Session& self) {
        return valid ? self.tree().setTopValue(key, value) : kSCStatusInvalidArgument;
    });
}

CFDictionaryRef SCPreferencesPathGetValue(SCPreferencesRef session, CFStringRef path) noexcept {
    return dictionaryAt(session, path);
}

Boolean SCPreferencesPathSetValue(SCPreferencesRef session, CFStringRef path,
                                  CFDictionaryRef value) noexcept {
    const bool valid = isPath(path) && as<CFDictionaryRef>(value) != nullptr;
    return onSession(session, [&](Session& self) {
        return valid ? self.tree().set(textOf(path), value) : kSCStatusInvalidArgument;
    });
}

CFStringRef SCPreferencesPathGetLink(SCPreferencesRef session, CFStringRef path) noexcept {
    CFDictionaryRef const dictionary = dictionaryAt(session, path);
    if (dictionary == nullptr) {
        return nullptr;
    }
    const CFTypeRef link = CFDictionaryGetValue(dictionary, CFSTR("__LINK__"));
    const auto target = as<CFStringRef>(link);
    setStatus(target != nullptr ? kSCStatusOK : link == nullptr ? kSCStatusNoKey : kSCStatusFailed);
    return target;
}

Boolean SCPreferencesPathRemoveValue(SCPreferencesRef session, CFStringRef path) noexcept {
    return onSession(session, [path](Session& self) {
        return isPath(path) ? self.tree().remove(textOf(path)) : kSCStatusInvalidArgument;
    });
}

Boolean SCPreferencesCommitChanges(SCPreferencesRef session) noexcept {
    return onSession(session, [](Session& self) { return self.commit(); });
}
