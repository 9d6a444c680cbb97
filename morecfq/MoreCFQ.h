// Small helpers over property-list values: retain and release that take null, creation with a status, access
// to nested dictionaries by path, and walks over a whole value.
//
// Every operation that can fail returns a status, 0 for success. An output is written only where its
// operation says so. A function named Create hands its caller one reference, to be given back with
// CFQRelease; one named Get hands out a borrowed value that lives as long as its container holds it.
// Arguments must not be null except where null is mentioned. No state is kept between calls.
//
// Statuses: -50 (arrays of different length, an empty path), -108 (no memory for a temporary buffer), -4960
// (the platform refused to make a value), and the two below.
#pragma once

#include "platform/CoreFoundation.h"

LA_BEGIN_DECLARATIONS

// A key on the path is absent; when removing, also the last one.
LA_CONSTANT(OSStatus, kCFQPathKeyMissingErr, 5400);
// A value on the path, before its last key, is null or no dictionary.
LA_CONSTANT(OSStatus, kCFQPathNotDictionaryErr, 5401);

// --- Retain and release ---

// Takes one reference and returns the value; null is returned as it is.
CFTypeRef CFQRetain(CFTypeRef value);
// Gives one reference back; null is ignored, so that clean-up needs no questions.
void CFQRelease(CFTypeRef value);

// --- Creation ---

// An empty mutable dictionary (array) without a limit, which retains what is put into it. The output is null
// on failure.
OSStatus CFQDictionaryCreateMutable(CFMutableDictionaryRef* result);
OSStatus CFQArrayCreateMutable(CFMutableArrayRef* result);

// The dictionary's keys (values) as a new immutable array in the order in which the dictionary enumerates
// them, so that the two arrays of one dictionary correspond. On -108 the output is untouched, on -4960 null.
OSStatus CFQArrayCreateWithDictionaryKeys(CFDictionaryRef dict, CFArrayRef* result);
OSStatus CFQArrayCreateWithDictionaryValues(CFDictionaryRef dict, CFArrayRef* result);

// A new immutable dictionary of keys[i] with values[i]; of two equal keys the first one counts. On -50 and
// -108 the output is untouched, on -4960 null.
OSStatus CFQDictionaryCreateWithArrayOfKeysAndValues(CFArrayRef keys, CFArrayRef values,
                                                     CFDictionaryRef* result);

// Stores a signed 32-bit number under the key, in place of whatever is there. On failure the dictionary is
// unchanged.
OSStatus CFQDictionarySetNumber(CFMutableDictionaryRef dict, const void* key, SInt32 value);

// --- Access by path ---
//
// A path is a list of keys, at least one, each taken as it is: the first is looked up in the dictionary
// given, each further one in what the key before it led to. It is a plain vector with a count, or (PathArray)
// an array value. An array without keys is -50; a vector without keys is a caller error and is not checked.

// The value that the last key leads to, of whatever kind, borrowed; untouched on failure.
OSStatus CFQDictionaryGetValueAtPath(CFDictionaryRef dict, const CFTypeRef* path, CFIndex count,
                                     CFTypeRef* result);
OSStatus CFQDictionaryGetValueAtPathArray(CFDictionaryRef dict, CFArrayRef path, CFTypeRef* result);

// Adds the value under the last key, or replaces what is there. Missing dictionaries on the way are not made.
//
// Every dictionary on the way, mutable or not, is replaced in its parent by a mutable copy of its own:
// whoever holds one of them from before keeps it as it was. The copies that were made before a failure stay
// in place; they hold what they replaced.
OSStatus CFQDictionarySetValueAtPath(CFMutableDictionaryRef dict, const CFTypeRef* path, CFIndex count,
                                     CFTypeRef value);
OSStatus CFQDictionarySetValueAtPathArray(CFMutableDictionaryRef dict, CFArrayRef path, CFTypeRef value);

// Removes the last key with its value; replaces the dictionaries on the way just so.
OSStatus CFQDictionaryRemoveValueAtPath(CFMutableDictionaryRef dict, const CFTypeRef* path, CFIndex count);
OSStatus CFQDictionaryRemoveValueAtPathArray(CFMutableDictionaryRef dict, CFArrayRef path);

// --- Walks ---

typedef void (*CFQPropertyListDeepApplierFunction)(CFPropertyListRef node, void* context);
// key is a dictionary's key or, for an array, a number that holds the index; it may not outlive the call.
typedef void (*CFQPropertyListShallowApplierFunction)(CFTypeRef key, CFPropertyListRef node, void* context);

// Calls func with the node itself, then with everything inside, each container before its content: a
// dictionary's values in its order (never its keys), an array's elements by index. func may change the
// container: a dictionary's keys are those that were there when the walk reached it, each value is the one
// that is there when its turn comes, and the walk holds on to what func is called with. Nothing is left out
// for lack of memory, which ends the process (CoreFoundation.h).
void CFQPropertyListDeepApplyFunction(CFPropertyListRef propList, CFQPropertyListDeepApplierFunction func,
                                      void* context);
// The same one level deep and without the node itself; func is not called for a leaf.
void CFQPropertyListShallowApplyFunction(CFPropertyListRef propList,
                                         CFQPropertyListShallowApplierFunction func, void* context);
// Whether the node is neither a dictionary nor an array. An empty container is no leaf.
Boolean CFQPropertyListIsLeaf(CFPropertyListRef node);

LA_END_DECLARATIONS
