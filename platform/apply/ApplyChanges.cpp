// SCPreferencesApplyChanges.
#include <utility>

#include "platform/SystemConfiguration.h"
#include "platform/apply/Apply.h"
#include "platform/preferences/Session.h"
#include "platform/preferences/Status.h"
#include "platform/preferences/Store.h"

namespace {

constexpr int mostApplies = 5;

}  // namespace

Boolean SCPreferencesApplyChanges(SCPreferencesRef session) noexcept {
    using platform::Outcome;
    using platform::preferences::setStatus;
    using platform::values::Owned;
    auto* const self = platform::preferences::Session::from(session);
    if (self == nullptr) {
        return static_cast<Boolean>(setStatus(kSCStatusNoPrefsSession));
    }
    // Another process may have committed and applied while this one waited for its turn or worked. Whoever is
    // last to look sees the newest tree, so the machine never stays behind the store.
    Owned<CFDictionaryRef> replaced = self->takeReplaced();
    Owned<CFDictionaryRef> applied;
    int status = kSCStatusOK;
    for (int i = 0; i < mostApplies; ++i) {
        Owned<CFDictionaryRef> committed;
        const Outcome loaded = platform::preferences::loadCommittedTree(committed);
        if (!loaded.ok()) {
            return static_cast<Boolean>(setStatus(loaded, self->name()));
        }
        if (applied && CFEqual(applied.get(), committed.get()) != 0) {
            break;
        }
        // What failed, and why, went to the log from where it happened.
        status = platform::apply::applyTree(committed.get(), replaced.get()).status();
        applied = committed;
        replaced = std::move(committed);
    }
    return static_cast<Boolean>(setStatus(status));
}
