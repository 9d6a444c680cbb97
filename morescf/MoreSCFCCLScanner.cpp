#include "morescf/MoreSCFCCLScanner.h"

#include <cstdlib>

#include "morecfq/MoreCFQ.h"
#include "morescf/MoreSCFValues.h"
#include "platform/CoreServices.h"

namespace {

// In the order in which they are searched; 0 ends the list.
constexpr SInt16 kFolderDomains[] = {kUserDomain, kNetworkDomain, kLocalDomain, kSystemDomain, 0};

constexpr UInt32 kItemsPerBatch = 50;

constexpr CFStringCompareFlags kNameComparison =
    kCFCompareCaseInsensitive | kCFCompareLocalized | kCFCompareNumerically;

CFStringRef DefaultScriptName() {
    return CFSTR("Apple Internal 56K Modem (v.90)");
}

CFComparisonResult CompareNames(const void* lhs, const void* rhs, void* /*context*/) {
    return CFStringCompare(static_cast<CFStringRef>(lhs), static_cast<CFStringRef>(rhs), kNameComparison);
}

OSStatus AppendIfVisibleFile(const FSRef* item, const HFSUniStr255* itemName, CFMutableArrayRef result) {
    LSItemInfoRecord info = {};
    OSStatus err = LSCopyItemInfoForRef(item, kLSRequestBasicFlagsOnly, &info);
    if (err == 0 && (info.flags & kLSItemInfoIsPlainFile) != 0 &&
        (info.flags & kLSItemInfoIsInvisible) == 0) {
        CFStringRef name =
            CFStringCreateWithCharacters(kCFAllocatorDefault, itemName->unicode, itemName->length);
        if (name != nullptr) {
            CFArrayAppendValue(result, name);
        } else {
            err = coreFoundationUnknownErr;
        }
        CFQRelease(name);
    }
    return err;
}

OSStatus AddCCLsInFolderToArray(const FSRef* folder, CFMutableArrayRef result) {
    OSStatus err = 0;
    FSIterator iterator = nullptr;
    auto* refs = static_cast<FSRef*>(std::calloc(kItemsPerBatch, sizeof(FSRef)));
    auto* names = static_cast<HFSUniStr255*>(std::calloc(kItemsPerBatch, sizeof(HFSUniStr255)));
    if (refs == nullptr || names == nullptr) {
        err = memFullErr;
    }
    if (err == 0) {
        err = FSOpenIterator(folder, kFSIterateFlat, &iterator);
    }
    bool isLastBatch = false;
    while (err == 0 && !isLastBatch) {
        UInt32 count = 0;
        err = FSGetCatalogInfoBulk(iterator, kItemsPerBatch, &count, nullptr, kFSCatInfoNone, nullptr, refs,
                                   nullptr, names);
        if (err == errFSNoMoreItems) {
            isLastBatch = true;
            err = 0;
        }
        for (UInt32 i = 0; err == 0 && i < count; ++i) {
            err = AppendIfVisibleFile(&refs[i], &names[i], result);
        }
    }
    if (iterator != nullptr) {
        FSCloseIterator(iterator);
    }
    std::free(refs);
    std::free(names);
    return err;
}

// Keeps the first of equal names. They need not be neighbours: the sort takes names of different case for
// equal and leaves them in the order of the folders.
OSStatus RemoveDuplicates(CFMutableArrayRef names) {
    CFMutableDictionaryRef seen = nullptr;
    const OSStatus err = CFQDictionaryCreateMutable(&seen);
    CFIndex index = 0;
    while (err == 0 && index < CFArrayGetCount(names)) {
        CFTypeRef name = CFArrayGetValueAtIndex(names, index);
        if (CFDictionaryContainsKey(seen, name)) {
            CFArrayRemoveValueAtIndex(names, index);
        } else {
            CFDictionarySetValue(seen, name, name);
            ++index;
        }
    }
    CFQRelease(seen);
    return err;
}

}  // namespace

OSStatus MoreSCCreateCCLArray(CFArrayRef* result, CFIndex* indexOfDefaultCCL) {
    CFMutableArrayRef names = nullptr;
    OSStatus err = CFQArrayCreateMutable(&names);
    for (const SInt16* domain = kFolderDomains; err == 0 && *domain != 0; ++domain) {
        FSRef folder;
        if (FSFindFolder(*domain, kModemScriptsFolderType, false, &folder) == noErr) {
            err = AddCCLsInFolderToArray(&folder, names);
        }
    }
    if (err == 0) {
        CFArraySortValues(names, CFRangeMake(0, CFArrayGetCount(names)), CompareNames, nullptr);
        err = RemoveDuplicates(names);
    }
    if (err == 0 && indexOfDefaultCCL != nullptr) {
        const CFIndex count = CFArrayGetCount(names);
        const CFIndex index =
            CFArrayBSearchValues(names, CFRangeMake(0, count), DefaultScriptName(), CompareNames, nullptr);
        const bool isThere = index < count && CompareNames(CFArrayGetValueAtIndex(names, index),
                                                           DefaultScriptName(), nullptr) == kCFCompareEqualTo;
        *indexOfDefaultCCL = isThere ? index : 0;
    }
    HandOverOrNull<CFArrayRef>(err, names, result);
    return err;
}
