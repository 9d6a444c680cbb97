// Property-list values, strings, URLs and the run loop.
//
// Every value is reference-counted. A function whose name contains Create or Copy hands its caller one
// reference, to be given back with CFRelease; a function whose name contains Get hands out a borrowed value
// that lives as long as the value it was taken from holds it. Containers retain what is put into them. Retain
// counts are atomic; everything else is for one thread at a time. Null means "no value" only where a
// function says so.
//
// Lack of memory ends the process: no operation of any face reports it or throws, and no list, copy or walk
// is cut short by it.
//
// Strings are UTF-8 inside. Lengths, indices and characters count UTF-16 code units. The system's text
// encoding is UTF-8, and bytes that are not well-formed UTF-8, or more than 2 GiB of them, make no string.
#pragma once

#ifdef __cplusplus
#include <cstddef>
#include <cstdint>
#else
#include <stddef.h>
#include <stdint.h>
#endif

#include "platform/Language.h"

LA_BEGIN_DECLARATIONS

typedef unsigned char Boolean;
typedef uint8_t UInt8;
typedef uint16_t UInt16;
typedef uint32_t UInt32;
typedef int16_t SInt16;
typedef int32_t SInt32;
typedef int16_t OSErr;
// 0 for success; every other value is a failure.
typedef int32_t OSStatus;
typedef uint32_t OSType;
// One UTF-16 code unit.
typedef uint16_t UniChar;

typedef long CFIndex;
typedef unsigned long CFTypeID;
typedef unsigned long CFOptionFlags;

typedef const void* CFTypeRef;
typedef CFTypeRef CFPropertyListRef;
typedef const struct OpaqueCFString* CFStringRef;
typedef struct OpaqueCFString* CFMutableStringRef;
typedef const struct OpaqueCFDictionary* CFDictionaryRef;
typedef struct OpaqueCFDictionary* CFMutableDictionaryRef;
typedef const struct OpaqueCFArray* CFArrayRef;
typedef struct OpaqueCFArray* CFMutableArrayRef;
typedef const struct OpaqueCFNumber* CFNumberRef;
typedef const struct OpaqueCFBoolean* CFBooleanRef;
typedef const struct OpaqueCFData* CFDataRef;
typedef const struct OpaqueCFDate* CFDateRef;
typedef const struct OpaqueCFURL* CFURLRef;
typedef struct OpaqueCFRunLoop* CFRunLoopRef;
typedef struct OpaqueCFRunLoopSource* CFRunLoopSourceRef;

// There is one allocator; null is its only value, and what every `allocator` argument takes.
typedef const struct OpaqueCFAllocator* CFAllocatorRef;
#ifdef __cplusplus
LA_CONSTANT(CFAllocatorRef, kCFAllocatorDefault, nullptr);
#else
#define kCFAllocatorDefault ((CFAllocatorRef)0)
#endif

#ifdef __cplusplus
enum CFComparisonResult : CFIndex {
#else
typedef CFIndex CFComparisonResult;
enum {
#endif
    kCFCompareLessThan = -1,
    kCFCompareEqualTo = 0,
    kCFCompareGreaterThan = 1
};
typedef CFComparisonResult (*CFComparatorFunction)(const void* lhs, const void* rhs, void* context);

LA_CONSTANT(CFIndex, kCFNotFound, -1);

typedef struct CFRange {
    CFIndex location;
    CFIndex length;
} CFRange;
static inline CFRange CFRangeMake(CFIndex location, CFIndex length) {
    const CFRange range = {location, length};
    return range;
}

// --- Every value ---

// Takes one reference and returns the value. The value must not be null.
CFTypeRef CFRetain(CFTypeRef value) LA_NOEXCEPT;
// Gives one reference back; the last one destroys the value. The value must not be null.
void CFRelease(CFTypeRef value) LA_NOEXCEPT;
// The number of references held, for tests.
CFIndex CFGetRetainCount(CFTypeRef value) LA_NOEXCEPT;
CFTypeID CFGetTypeID(CFTypeRef value) LA_NOEXCEPT;
// Equality by content, through containers; values of different types are unequal, and so are a boolean and a
// number. The order of a dictionary's entries does not matter. A mutable value can equal an immutable one.
Boolean CFEqual(CFTypeRef lhs, CFTypeRef rhs) LA_NOEXCEPT;
// One line of text that tells a person what the value is: a string as it stands, a number in decimal, "true"
// or "false", data as hexadecimal between angle brackets, a date in ISO 8601, containers as
// "{key = value; ...}" and "(a, b)"; line breaks inside are shown as spaces. Never null.
CFStringRef CFCopyDescription(CFTypeRef value) LA_NOEXCEPT;

// --- Strings ---

typedef UInt32 CFStringEncoding;
LA_CONSTANT(CFStringEncoding, kCFStringEncodingMacRoman, 0);
LA_CONSTANT(CFStringEncoding, kCFStringEncodingASCII, 0x0600);
LA_CONSTANT(CFStringEncoding, kCFStringEncodingUTF8, 0x08000100);

typedef CFOptionFlags CFStringCompareFlags;
LA_CONSTANT(CFStringCompareFlags, kCFCompareCaseInsensitive, 0x01);
LA_CONSTANT(CFStringCompareFlags, kCFCompareLocalized, 0x20);
LA_CONSTANT(CFStringCompareFlags, kCFCompareNumerically, 0x40);

CFTypeID CFStringGetTypeID(void) LA_NOEXCEPT;
// The encoding of the command line, of trace output and of text files: UTF-8.
CFStringEncoding CFStringGetSystemEncoding(void) LA_NOEXCEPT;
// Null when the bytes are not text in the encoding (ASCII: a byte above 0x7F; UTF-8: an ill-formed sequence).
CFStringRef CFStringCreateWithCString(CFAllocatorRef allocator, const char* text,
                                      CFStringEncoding encoding) LA_NOEXCEPT;
CFStringRef CFStringCreateWithBytes(CFAllocatorRef allocator, const UInt8* bytes, CFIndex count,
                                    CFStringEncoding encoding, Boolean isExternalRepresentation) LA_NOEXCEPT;
// Null when the units hold an unpaired surrogate.
CFStringRef CFStringCreateWithCharacters(CFAllocatorRef allocator, const UniChar* characters,
                                         CFIndex count) LA_NOEXCEPT;
// printf's conversions %d %i %u %ld %lu %s %c %x %% with flags, width and precision, and %@ for a value (a
// string as it stands, else its CFCopyDescription; a null one gives "(null)"). formatOptions is null. Null
// when the result is not text.
CFStringRef CFStringCreateWithFormat(CFAllocatorRef allocator, CFDictionaryRef formatOptions,
                                     CFStringRef format, ...) LA_NOEXCEPT;
CFStringRef CFStringCreateCopy(CFAllocatorRef allocator, CFStringRef string) LA_NOEXCEPT;
// maxLength is a hint and may be 0.
CFMutableStringRef CFStringCreateMutableCopy(CFAllocatorRef allocator, CFIndex maxLength,
                                             CFStringRef string) LA_NOEXCEPT;
// Null when the range leaves the string or cuts a character of two units.
CFStringRef CFStringCreateWithSubstring(CFAllocatorRef allocator, CFStringRef string,
                                        CFRange range) LA_NOEXCEPT;
// The pieces between the separators, empty ones included; a string without the separator is one piece.
CFArrayRef CFStringCreateArrayBySeparatingStrings(CFAllocatorRef allocator, CFStringRef string,
                                                  CFStringRef separator) LA_NOEXCEPT;
CFIndex CFStringGetLength(CFStringRef string) LA_NOEXCEPT;
// Copies the units of the range, in host byte order, into the buffer, which must have room for them.
void CFStringGetCharacters(CFStringRef string, CFRange range, UniChar* buffer) LA_NOEXCEPT;
// Copies the text and a final NUL. False, with the buffer's content undefined, when it does not fit in
// bufferSize bytes or the encoding cannot carry it; Mac OS Roman here carries no more than ASCII does.
Boolean CFStringGetCString(CFStringRef string, char* buffer, CFIndex bufferSize,
                           CFStringEncoding encoding) LA_NOEXCEPT;
// The string's own bytes, NUL-terminated, borrowed until it is changed or released; null when the encoding is
// neither UTF-8 nor, for a string of ASCII characters only, ASCII or Mac OS Roman.
const char* CFStringGetCStringPtr(CFStringRef string, CFStringEncoding encoding) LA_NOEXCEPT;
Boolean CFStringHasPrefix(CFStringRef string, CFStringRef prefix) LA_NOEXCEPT;
// Without kCFCompareLocalized a literal comparison by code point, whatever the other flags; with it one by
// the root collation, kCFCompareCaseInsensitive and kCFCompareNumerically as they say.
CFComparisonResult CFStringCompare(CFStringRef lhs, CFStringRef rhs, CFStringCompareFlags flags) LA_NOEXCEPT;
// The first occurrence, searched literally, or location kCFNotFound and length 0, as for an empty string.
// flags is 0.
CFRange CFStringFind(CFStringRef string, CFStringRef wanted, CFStringCompareFlags flags) LA_NOEXCEPT;
void CFStringReplace(CFMutableStringRef string, CFRange range, CFStringRef replacement) LA_NOEXCEPT;
// Lower case by the root locale. locale is null.
void CFStringLowercase(CFMutableStringRef string, const void* locale) LA_NOEXCEPT;

// A constant string, made once per place in the program and never destroyed. The text is a literal in UTF-8.
#ifdef __cplusplus
#define CFSTR(text)                                                           \
    ([]() noexcept -> CFStringRef {                                           \
        static const CFStringRef constant = CFStringMakeConstant("" text ""); \
        return constant;                                                      \
    }())
#else
// Two threads that come first together make two, and one of them stays.
#define CFSTR(text)                                                                \
    (__extension__({                                                               \
        static CFStringRef cfstrConstant;                                          \
        CFStringRef cfstrMade = __atomic_load_n(&cfstrConstant, __ATOMIC_ACQUIRE); \
        if (cfstrMade == NULL) {                                                   \
            cfstrMade = CFStringMakeConstant("" text "");                          \
            __atomic_store_n(&cfstrConstant, cfstrMade, __ATOMIC_RELEASE);         \
        }                                                                          \
        cfstrMade;                                                                 \
    }))
#endif
CFStringRef CFStringMakeConstant(const char* text) LA_NOEXCEPT;

// --- Numbers, booleans, data, dates ---

typedef CFIndex CFNumberType;
LA_CONSTANT(CFNumberType, kCFNumberSInt32Type, 3);
LA_CONSTANT(CFNumberType, kCFNumberSInt64Type, 4);
// The system's long integer: 32 bits, signed, whatever the machine's own long is.
LA_CONSTANT(CFNumberType, kCFNumberLongType, kCFNumberSInt32Type);

CFTypeID CFNumberGetTypeID(void) LA_NOEXCEPT;
CFNumberRef CFNumberCreate(CFAllocatorRef allocator, CFNumberType type, const void* value) LA_NOEXCEPT;
// False when the number cannot be given in the type without loss; the value is then the nearest one of the
// type on the way to zero.
Boolean CFNumberGetValue(CFNumberRef number, CFNumberType type, void* value) LA_NOEXCEPT;
// True for a number that holds a real.
Boolean CFNumberIsFloatType(CFNumberRef number) LA_NOEXCEPT;

extern const CFBooleanRef kCFBooleanTrue;
extern const CFBooleanRef kCFBooleanFalse;
CFTypeID CFBooleanGetTypeID(void) LA_NOEXCEPT;
Boolean CFBooleanGetValue(CFBooleanRef boolean) LA_NOEXCEPT;

CFTypeID CFDataGetTypeID(void) LA_NOEXCEPT;
CFDataRef CFDataCreate(CFAllocatorRef allocator, const UInt8* bytes, CFIndex length) LA_NOEXCEPT;
CFIndex CFDataGetLength(CFDataRef data) LA_NOEXCEPT;
const UInt8* CFDataGetBytePtr(CFDataRef data) LA_NOEXCEPT;

CFTypeID CFDateGetTypeID(void) LA_NOEXCEPT;

// --- Dictionaries and arrays ---

// How a container treats what it holds. The only callbacks are the ones below (retain, release, compare by
// content); for the values of a dictionary null means values that are not looked at, not even to retain
// them.
typedef struct CFDictionaryKeyCallBacks CFDictionaryKeyCallBacks;
typedef struct CFDictionaryValueCallBacks CFDictionaryValueCallBacks;
typedef struct CFArrayCallBacks CFArrayCallBacks;
extern const CFDictionaryKeyCallBacks kCFTypeDictionaryKeyCallBacks;
extern const CFDictionaryValueCallBacks kCFTypeDictionaryValueCallBacks;
extern const CFArrayCallBacks kCFTypeArrayCallBacks;

// A dictionary enumerates its entries in the order in which their keys were first added. Keys may be any
// values; they are found by content.
CFTypeID CFDictionaryGetTypeID(void) LA_NOEXCEPT;
// Of two equal keys the first one stays. Keys must not be null.
CFDictionaryRef CFDictionaryCreate(CFAllocatorRef allocator, const void** keys, const void** values,
                                   CFIndex count, const CFDictionaryKeyCallBacks* keyCallBacks,
                                   const CFDictionaryValueCallBacks* valueCallBacks) LA_NOEXCEPT;
// capacity is a hint and may be 0.
CFMutableDictionaryRef CFDictionaryCreateMutable(
    CFAllocatorRef allocator, CFIndex capacity, const CFDictionaryKeyCallBacks* keyCallBacks,
    const CFDictionaryValueCallBacks* valueCallBacks) LA_NOEXCEPT;
// One level deep: the copy holds the same values.
CFMutableDictionaryRef CFDictionaryCreateMutableCopy(CFAllocatorRef allocator, CFIndex capacity,
                                                     CFDictionaryRef dictionary) LA_NOEXCEPT;
CFIndex CFDictionaryGetCount(CFDictionaryRef dictionary) LA_NOEXCEPT;
const void* CFDictionaryGetValue(CFDictionaryRef dictionary, const void* key) LA_NOEXCEPT;
// value may be null; it is written only when the key is there.
Boolean CFDictionaryGetValueIfPresent(CFDictionaryRef dictionary, const void* key,
                                      const void** value) LA_NOEXCEPT;
Boolean CFDictionaryContainsKey(CFDictionaryRef dictionary, const void* key) LA_NOEXCEPT;
// Either buffer may be null; the others take one borrowed pointer an entry.
void CFDictionaryGetKeysAndValues(CFDictionaryRef dictionary, const void** keys,
                                  const void** values) LA_NOEXCEPT;
// Adds, or replaces in place. A key that is a mutable string is copied, here and wherever a dictionary gets a
// key, so that changing it later does not lose the entry; other keys are retained.
void CFDictionarySetValue(CFMutableDictionaryRef dictionary, const void* key, const void* value) LA_NOEXCEPT;
// Adds; an entry that is there stays as it is.
void CFDictionaryAddValue(CFMutableDictionaryRef dictionary, const void* key, const void* value) LA_NOEXCEPT;
void CFDictionaryRemoveValue(CFMutableDictionaryRef dictionary, const void* key) LA_NOEXCEPT;

CFTypeID CFArrayGetTypeID(void) LA_NOEXCEPT;
CFArrayRef CFArrayCreate(CFAllocatorRef allocator, const void** values, CFIndex count,
                         const CFArrayCallBacks* callBacks) LA_NOEXCEPT;
CFMutableArrayRef CFArrayCreateMutable(CFAllocatorRef allocator, CFIndex capacity,
                                       const CFArrayCallBacks* callBacks) LA_NOEXCEPT;
CFMutableArrayRef CFArrayCreateMutableCopy(CFAllocatorRef allocator, CFIndex capacity,
                                           CFArrayRef array) LA_NOEXCEPT;
CFIndex CFArrayGetCount(CFArrayRef array) LA_NOEXCEPT;
// The index must be inside the array.
const void* CFArrayGetValueAtIndex(CFArrayRef array, CFIndex index) LA_NOEXCEPT;
void CFArrayGetValues(CFArrayRef array, CFRange range, const void** values) LA_NOEXCEPT;
// The first position in the range of a value equal to this one, or kCFNotFound.
CFIndex CFArrayGetFirstIndexOfValue(CFArrayRef array, CFRange range, const void* value) LA_NOEXCEPT;
void CFArrayAppendValue(CFMutableArrayRef array, const void* value) LA_NOEXCEPT;
void CFArrayRemoveValueAtIndex(CFMutableArrayRef array, CFIndex index) LA_NOEXCEPT;
// Sorts the range; equal values keep their order.
void CFArraySortValues(CFMutableArrayRef array, CFRange range, CFComparatorFunction comparator,
                       void* context) LA_NOEXCEPT;
// Binary search in a sorted range: the index of an equal value, or of the first greater one (which may be the
// end of the range).
CFIndex CFArrayBSearchValues(CFArrayRef array, CFRange range, const void* value,
                             CFComparatorFunction comparator, void* context) LA_NOEXCEPT;

typedef CFOptionFlags CFPropertyListMutabilityOptions;
LA_CONSTANT(CFPropertyListMutabilityOptions, kCFPropertyListImmutable, 0);
LA_CONSTANT(CFPropertyListMutabilityOptions, kCFPropertyListMutableContainersAndLeaves, 2);
// A copy of the whole value, every container and leaf in it mutable (strings and containers) or immutable as
// asked. Null when the value is nested too deep or holds something that is not a property-list value.
CFPropertyListRef CFPropertyListCreateDeepCopy(CFAllocatorRef allocator, CFPropertyListRef value,
                                               CFPropertyListMutabilityOptions options) LA_NOEXCEPT;

// --- URLs ---

CFTypeID CFURLGetTypeID(void) LA_NOEXCEPT;
// Null when the text is not a URL (RFC 3986: a scheme, and no character that would have to be escaped). base
// is null.
CFURLRef CFURLCreateWithString(CFAllocatorRef allocator, CFStringRef text, CFURLRef base) LA_NOEXCEPT;
CFStringRef CFURLGetString(CFURLRef url) LA_NOEXCEPT;

// --- Run loop ---

typedef double CFTimeInterval;
extern const CFStringRef kCFRunLoopDefaultMode;
LA_CONSTANT(SInt32, kCFRunLoopRunFinished, 1);
LA_CONSTANT(SInt32, kCFRunLoopRunStopped, 2);
LA_CONSTANT(SInt32, kCFRunLoopRunTimedOut, 3);
LA_CONSTANT(SInt32, kCFRunLoopRunHandledSource, 4);

// The run loop of the calling thread; it lives as long as the thread. Only the default mode exists.
CFRunLoopRef CFRunLoopGetCurrent(void) LA_NOEXCEPT;
// The loop retains the source until it is removed. Adding a source twice, or removing one that is not there,
// does nothing.
void CFRunLoopAddSource(CFRunLoopRef loop, CFRunLoopSourceRef source, CFStringRef mode) LA_NOEXCEPT;
void CFRunLoopRemoveSource(CFRunLoopRef loop, CFRunLoopSourceRef source, CFStringRef mode) LA_NOEXCEPT;
// Runs the calling thread's loop until it is stopped or has no source left.
void CFRunLoopRun(void) LA_NOEXCEPT;
// The same for at most that many seconds (0: what is ready now), or until one source was handled when asked
// so.
SInt32 CFRunLoopRunInMode(CFStringRef mode, CFTimeInterval seconds,
                          Boolean returnAfterSourceHandled) LA_NOEXCEPT;
// Makes the innermost run of the loop that is under way return; it does nothing to a loop that does not run.
// Safe from another thread and from a signal handler.
void CFRunLoopStop(CFRunLoopRef loop) LA_NOEXCEPT;

LA_END_DECLARATIONS
