// How an operation goes through its steps, with one status and one way out.
#pragma once

#include "morescf/MoreSCF.h"
#include "platform/CoreFoundation.h"

// The first step of most operations. MoreSCClose matches it, after a failure too.
inline OSStatus OpenSession() {
    return MoreSCOpen(false, false);
}

// Takes the steps in turn until one fails: the status of that one, or 0.
template <class... Steps>
OSStatus InTurn(Steps... steps) {
    OSStatus err = 0;
    static_cast<void>((((err = steps()) == 0) && ...));
    return err;
}

// Takes the step for each item, of a type that the caller vouches for, until one fails: the status of that
// one.
template <class Item, class Step>
OSStatus ForEach(CFArrayRef list, Step step) {
    OSStatus err = 0;
    const CFIndex count = CFArrayGetCount(list);
    for (CFIndex i = 0; err == 0 && i < count; ++i) {
        err = step(static_cast<Item>(CFArrayGetValueAtIndex(list, i)));
    }
    return err;
}
