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

#include <cstddef>
#include <cstdint>

using Boolean = unsigned char;
using UInt8 = std::uint8_t;
using UInt16 = std::uint16_t;
using UInt32 = std::uint32_t;
using SInt16 = std::int16_t;
using SInt32 = std::int32_t;
using OSErr = std::int16_t;
// 0 for success; every other value is a failure.
using OSStatus = std::int32_t;
using OSType = std::uint32_t;
// One UTF-16 code unit.
using UniChar = std::uint16_t;

using CFIndex = long;
using CFTypeID = unsigned long;
using CFOptionFlags = unsigned long;

struct OpaqueCFString;
struct OpaqueCFDictionary;
struct OpaqueCFArray;
struct OpaqueCFNumber;
struct OpaqueCFBoolean;
struct OpaqueCFData;
struct OpaqueCFDate;
struct OpaqueCFURL;
struct OpaqueCFAllocator;
struct OpaqueCFRunLoop;
struct OpaqueCFRunLoopSource;

using CFTypeRef = const void*;
using CFPropertyListRef = CFTypeRef;
using CFStringRef = const OpaqueCFString*;
using CFMutableStringRef = OpaqueCFString*;
using CFDictionaryRef = const OpaqueCFDictionary*;
using CFMutableDictionaryRef = OpaqueCFDictionary*;
using CFArrayRef = const OpaqueCFArray*;
using CFMutableArrayRef = OpaqueCFArray*;
using CFNumberRef = const OpaqueCFNumber*;
using CFBooleanRef = const OpaqueCFBoolean*;
using CFDataRef = const OpaqueCFData*;
using CFDateRef = const OpaqueCFDate*;
using CFURLRef = const OpaqueCFURL*;
using CFRunLoopRef = OpaqueCFRunLoop*;
using CFRunLoopSourceRef = OpaqueCFRunLoopSource*;

// There is one allocator; null is its only value, and what every `allocator` argument takes.
using CFAllocatorRef = const OpaqueCFAllocator*;
inline constexpr CFAllocatorRef kCFAllocatorDefault = nullptr;

enum CFComparisonResult : CFIndex {
    kCFCompareLessThan = -1,
    kCFCompareEqualTo = 0,
    kCFCompareGreaterThan = 1
};
using CFComparatorFunction = CFComparisonResult (*)(const void* lhs, const void* rhs, void* context);

inline constexpr CFIndex kCFNotFound = -1;

struct CFRange {
    CFIndex location;
    CFIndex length;
};
inline CFRange CFRangeMake(CFIndex location, CFIndex length) {
    return CFRange{location, length};
}

// --- Every value ---

// Takes one reference and returns the value. The value must not be null.
CFTypeRef CFRetain(CFTypeRef value) noexcept;
// Gives one reference back; the last one destroys the value. The value must not be null.
void CFRelease(CFTypeRef value) noexcept;
// The number of references held, for tests.
CFIndex CFGetRetainCount(CFTypeRef value) noexcept;
CFTypeID CFGetTypeID(CFTypeRef value) noexcept;
// Equality by content, through containers; values of different types are unequal, and so are a boolean and a
// number. The order of a dictionary's entries does not matter. A mutable value can equal an immutable one.
Boolean CFEqual(CFTypeRef lhs, CFTypeRef rhs) noexcept;
// One line of text that tells a person what the value is: a string as it stands, a number in decimal, "true"
// or "false", data as hexadecimal between angle brackets, a date in ISO 8601, containers as
// "{key = value; ...}" and "(a, b)"; line breaks inside are shown as spaces. Never null.
CFStringRef CFCopyDescription(CFTypeRef value) noexcept;

// --- Strings ---

using CFStringEncoding = UInt32;
inline constexpr CFStringEncoding kCFStringEncodingMacRoman = 0;
inline constexpr CFStringEncoding kCFStringEncodingASCII = 0x0600;
inline constexpr CFStringEncoding kCFStringEncodingUTF8 = 0x08000100;

using CFStringCompareFlags = CFOptionFlags;
inline constexpr CFStringCompareFlags kCFCompareCaseInsensitive = 0x01;
inline constexpr CFStringCompareFlags kCFCompareLocalized = 0x20;
inline constexpr CFStringCompareFlags kCFCompareNumerically = 0x40;

CFTypeID CFStringGetTypeID() noexcept;
// The encoding of the command line, of trace output and of text files: UTF-8.
CFStringEncoding CFStringGetSystemEncoding() noexcept;
// Null when the bytes are not text in the encoding (ASCII: a byte above 0x7F; UTF-8: an ill-formed sequence).
CFStringRef CFStringCreateWithCString(CFAllocatorRef allocator, const char* text,
                                      CFStringEncoding encoding) noexcept;
CFStringRef CFStringCreateWithBytes(CFAllocatorRef allocator, const UInt8* bytes, CFIndex count,
                                    CFStringEncoding encoding, Boolean isExternalRepresentation) noexcept;
// Null when the units hold an unpaired surrogate.
CFStringRef CFStringCreateWithCharacters(CFAllocatorRef allocator, const UniChar* characters,
                                         CFIndex count) noexcept;
// printf's conversions %d %i %u %ld %lu %s %c %x %% with flags, width and precision, and %@ for a value (its
// CFCopyDescription; a null one gives "(null)"). formatOptions is null. Null when the result is not text.
CFStringRef CFStringCreateWithFormat(CFAllocatorRef allocator, CFDictionaryRef formatOptions,
                                     CFStringRef format, ...) noexcept;
CFStringRef CFStringCreateCopy(CFAllocatorRef allocator, CFStringRef string) noexcept;
// maxLength is a hint and may be 0.
CFMutableStringRef CFStringCreateMutableCopy(CFAllocatorRef allocator, CFIndex maxLength,
                                             CFStringRef string) noexcept;
// Null when the range leaves the string or cuts a character of two units.
CFStringRef CFStringCreateWithSubstring(CFAllocatorRef allocator, CFStringRef string, CFRange range) noexcept;
// The pieces of the string between the separators, empty ones included; a string without the separator is one
// piece.
CFArrayRef CFStringCreateArrayBySeparatingStrings(CFAllocatorRef allocator, CFStringRef string,
                                                  CFStringRef separator) noexcept;
CFIndex CFStringGetLength(CFStringRef string) noexcept;
// Copies the units of the range, in host byte order, into the buffer, which must have room for them.
void CFStringGetCharacters(CFStringRef string, CFRange range, UniChar* buffer) noexcept;
// Copies the text and a final NUL. False, with the buffer's content undefined, when it does not fit in
// bufferSize bytes or the encoding cannot carry it.
Boolean CFStringGetCString(CFStringRef string, char* buffer, CFIndex bufferSize,
                           CFStringEncoding encoding) noexcept;
// The string's own bytes, NUL-terminated, borrowed until it is changed or released; null when the encoding is
// neither UTF-8 nor, for a string of ASCII characters only, ASCII or Mac OS Roman.
const char* CFStringGetCStringPtr(CFStringRef string, CFStringEncoding encoding) noexcept;
Boolean CFStringHasPrefix(CFStringRef string, CFStringRef prefix) noexcept;
// Without flags a literal comparison by code point. kCFCompareLocalized compares by the root collation, with
// kCFCompareCaseInsensitive and kCFCompareNumerically as they say; the two also work without it.
CFComparisonResult CFStringCompare(CFStringRef lhs, CFStringRef rhs, CFStringCompareFlags flags) noexcept;
// The first occurrence, searched literally, or location kCFNotFound and length 0, as for an empty string.
// flags is 0.
CFRange CFStringFind(CFStringRef string, CFStringRef wanted, CFStringCompareFlags flags) noexcept;
void CFStringReplace(CFMutableStringRef string, CFRange range, CFStringRef replacement) noexcept;
// Lower case by the root locale. locale is null.
void CFStringLowercase(CFMutableStringRef string, const void* locale) noexcept;

// A constant string, made once per place in the program and never destroyed. The text is a literal in UTF-8.
#define CFSTR(text)                                                           \
    ([]() noexcept -> CFStringRef {                                           \
        static const CFStringRef constant = CFStringMakeConstant("" text ""); \
        return constant;                                                      \
    }())
CFStringRef CFStringMakeConstant(const char* text) noexcept;

// --- Numbers, booleans, data, dates ---

using CFNumberType = CFIndex;
inline constexpr CFNumberType kCFNumberSInt32Type = 3;
inline constexpr CFNumberType kCFNumberSInt64Type = 4;
inline constexpr CFNumberType kCFNumberFloat64Type = 6;
// The system's long integer: 32 bits, signed, whatever the machine's own long is.
inline constexpr CFNumberType kCFNumberLongType = kCFNumberSInt32Type;

CFTypeID CFNumberGetTypeID() noexcept;
CFNumberRef CFNumberCreate(CFAllocatorRef allocator, CFNumberType type, const void* value) noexcept;
// False when the number cannot be given in the type without loss; the value is then the nearest one of the
// type on the way to zero.
Boolean CFNumberGetValue(CFNumberRef number, CFNumberType type, void* value) noexcept;
// True for a number that holds a real.
Boolean CFNumberIsFloatType(CFNumberRef number) noexcept;

extern const CFBooleanRef kCFBooleanTrue;
extern const CFBooleanRef kCFBooleanFalse;
CFTypeID CFBooleanGetTypeID() noexcept;
Boolean CFBooleanGetValue(CFBooleanRef boolean) noexcept;

CFTypeID CFDataGetTypeID() noexcept;
CFDataRef CFDataCreate(CFAllocatorRef allocator, const UInt8* bytes, CFIndex length) noexcept;
CFIndex CFDataGetLength(CFDataRef data) noexcept;
const UInt8* CFDataGetBytePtr(CFDataRef data) noexcept;

CFTypeID CFDateGetTypeID() noexcept;

// --- Dictionaries and arrays ---

// How a container treats what it holds. The only callbacks are the ones below (retain, release, compare by
// content); for the values of a dictionary null means values that are not looked at, not even to retain
// them.
struct CFDictionaryKeyCallBacks;
struct CFDictionaryValueCallBacks;
struct CFArrayCallBacks;
extern const CFDictionaryKeyCallBacks kCFTypeDictionaryKeyCallBacks;
extern const CFDictionaryValueCallBacks kCFTypeDictionaryValueCallBacks;
extern const CFArrayCallBacks kCFTypeArrayCallBacks;

// A dictionary enumerates its entries in the order in which their keys were first added. Keys may be any
// values; they are found by content. Copies cost nothing until one of the two is changed.
CFTypeID CFDictionaryGetTypeID() noexcept;
// Of two equal keys the first one stays. Keys must not be null.
CFDictionaryRef CFDictionaryCreate(CFAllocatorRef allocator, const void** keys, const void** values,
                                   CFIndex count, const CFDictionaryKeyCallBacks* keyCallBacks,
                                   const CFDictionaryValueCallBacks* valueCallBacks) noexcept;
// capacity is a hint and may be 0.
CFMutableDictionaryRef CFDictionaryCreateMutable(CFAllocatorRef allocator, CFIndex capacity,
                                                 const CFDictionaryKeyCallBacks* keyCallBacks,
                                                 const CFDictionaryValueCallBacks* valueCallBacks) noexcept;
// One level deep: the copy holds the same values.
CFMutableDictionaryRef CFDictionaryCreateMutableCopy(CFAllocatorRef allocator, CFIndex capacity,
                                                     CFDictionaryRef dictionary) noexcept;
CFIndex CFDictionaryGetCount(CFDictionaryRef dictionary) noexcept;
const void* CFDictionaryGetValue(CFDictionaryRef dictionary, const void* key) noexcept;
// value may be null; it is written only when the key is there.
Boolean CFDictionaryGetValueIfPresent(CFDictionaryRef dictionary, const void* key,
                                      const void** value) noexcept;
Boolean CFDictionaryContainsKey(CFDictionaryRef dictionary, const void* key) noexcept;
// Either buffer may be null; the others take one borrowed pointer an entry.
void CFDictionaryGetKeysAndValues(CFDictionaryRef dictionary, const void** keys,
                                  const void** values) noexcept;
// Adds, or replaces in place. A key that is a mutable string is copied, here and wherever a dictionary gets a
// key, so that changing it later does not lose the entry; other keys are retained.
void CFDictionarySetValue(CFMutableDictionaryRef dictionary, const void* key, const void* value) noexcept;
// Adds; an entry that is there stays as it is.
void CFDictionaryAddValue(CFMutableDictionaryRef dictionary, const void* key, const void* value) noexcept;
void CFDictionaryRemoveValue(CFMutableDictionaryRef dictionary, const void* key) noexcept;

CFTypeID CFArrayGetTypeID() noexcept;
CFArrayRef CFArrayCreate(CFAllocatorRef allocator, const void** values, CFIndex count,
                         const CFArrayCallBacks* callBacks) noexcept;
CFMutableArrayRef CFArrayCreateMutable(CFAllocatorRef allocator, CFIndex capacity,
                                       const CFArrayCallBacks* callBacks) noexcept;
CFMutableArrayRef CFArrayCreateMutableCopy(CFAllocatorRef allocator, CFIndex capacity,
                                           CFArrayRef array) noexcept;
CFIndex CFArrayGetCount(CFArrayRef array) noexcept;
// The index must be inside the array.
const void* CFArrayGetValueAtIndex(CFArrayRef array, CFIndex index) noexcept;
void CFArrayGetValues(CFArrayRef array, CFRange range, const void** values) noexcept;
// The first position in the range of a value equal to this one, or kCFNotFound.
CFIndex CFArrayGetFirstIndexOfValue(CFArrayRef array, CFRange range, const void* value) noexcept;
void CFArrayAppendValue(CFMutableArrayRef array, const void* value) noexcept;
void CFArrayRemoveValueAtIndex(CFMutableArrayRef array, CFIndex index) noexcept;
// Sorts the range; equal values keep their order.
void CFArraySortValues(CFMutableArrayRef array, CFRange range, CFComparatorFunction comparator,
                       void* context) noexcept;
// Binary search in a sorted range: the index of an equal value, or of the first greater one (which may be the
// end of the range).
CFIndex CFArrayBSearchValues(CFArrayRef array, CFRange range, const void* value,
                             CFComparatorFunction comparator, void* context) noexcept;

using CFPropertyListMutabilityOptions = CFOptionFlags;
inline constexpr CFPropertyListMutabilityOptions kCFPropertyListImmutable = 0;
inline constexpr CFPropertyListMutabilityOptions kCFPropertyListMutableContainersAndLeaves = 2;
// A copy of the whole value, every container and leaf in it mutable (strings and containers) or immutable as
// asked. Null when the value is nested too deep or holds something that is not a property-list value.
CFPropertyListRef CFPropertyListCreateDeepCopy(CFAllocatorRef allocator, CFPropertyListRef value,
                                               CFPropertyListMutabilityOptions options) noexcept;

// --- URLs ---

CFTypeID CFURLGetTypeID() noexcept;
// Null when the text is not a URL (RFC 3986: a scheme, and no character that would have to be escaped). base
// is null.
CFURLRef CFURLCreateWithString(CFAllocatorRef allocator, CFStringRef text, CFURLRef base) noexcept;
CFStringRef CFURLGetString(CFURLRef url) noexcept;

// --- Run loop ---

using CFTimeInterval = double;
extern const CFStringRef kCFRunLoopDefaultMode;
inline constexpr SInt32 kCFRunLoopRunFinished = 1;
inline constexpr SInt32 kCFRunLoopRunStopped = 2;
inline constexpr SInt32 kCFRunLoopRunTimedOut = 3;
inline constexpr SInt32 kCFRunLoopRunHandledSource = 4;

// The run loop of the calling thread; it lives as long as the thread. Only the default mode exists.
CFRunLoopRef CFRunLoopGetCurrent() noexcept;
// The loop retains the source until it is removed. Adding a source twice, or removing one that is not there,
// does nothing.
void CFRunLoopAddSource(CFRunLoopRef loop, CFRunLoopSourceRef source, CFStringRef mode) noexcept;
void CFRunLoopRemoveSource(CFRunLoopRef loop, CFRunLoopSourceRef source, CFStringRef mode) noexcept;
// Runs the calling thread's loop until it is stopped or has no source left.
void CFRunLoopRun() noexcept;
// The same for at most that many seconds (0: what is ready now), or until one source was handled when asked
// so.
SInt32 CFRunLoopRunInMode(CFStringRef mode, CFTimeInterval seconds,
                          Boolean returnAfterSourceHandled) noexcept;
// Makes the innermost run of the loop that is under way return; it does nothing to a loop that does not run.
// Safe from another thread and from a signal handler.
void CFRunLoopStop(CFRunLoopRef loop) noexcept;
