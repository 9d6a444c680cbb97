// Watches the primary IPv4 state of the network, traces what changed and keeps a flag that tells whether
// there is one. A module of its own: no command of the tool starts it.
#pragma once

#include "platform/SystemConfiguration.h"

// Whether the last change notice found every watched key with a value. False at first.
extern bool gIsNetworkReady;

// Starts watching "State:/Network/Global/IPv4" on the calling thread's run loop, which the caller has to run.
// A failure is reported in two lines on standard error and leaves no new session that works. Called again it
// makes a session of its own beside the one before, which goes on and is handed to the callback as its info.
void watchForNetworkChanges();

// Takes the source off the calling thread's run loop and stops that loop. Session and source stay held.
void stopWatchingForNetworkChanges();

// The callback of the session: traces each changed key and its dictionary. A key without a dictionary makes
// this and every later key of the same call report that the network is not ready.
void networkChanged(SCDynamicStoreRef store, CFArrayRef changedKeys, void* info);

// Sets gIsNetworkReady and traces it.
void setNetworkReady(bool ready);
