#include "platform/preferences/FirstRunTree.h"

#include <initializer_list>
#include <utility>

#include "platform/values/Values.h"

namespace platform::preferences {
namespace {

using Value = values::Owned<CFTypeRef>;

Value makeDictionary(std::initializer_list<std::pair<CFStringRef, Value>> entries) {
    CFMutableDictionaryRef const dictionary = CFDictionaryCreateMutable(
        kCFAllocatorDefault, 0, &kCFTypeDictionaryKeyCallBacks, &kCFTypeDictionaryValueCallBacks);
    for (const auto& [key, value] : entries) {
        CFDictionarySetValue(dictionary, key, value.get());
    }
    return Value::adopt(dictionary);
}

Value text(CFStringRef constant) {
    return Value::retained(constant);
}

Value number(std::int64_t value) {
    return Value::adopt(values::makeNumber(value).take());
}

Value arrayOf(const void* item) {
    return Value::adopt(CFArrayCreate(kCFAllocatorDefault, &item, 1, &kCFTypeArrayCallBacks));
}

}  // namespace

values::Owned<CFDictionaryRef> makeFirstRunTree() {
    const Value interface = makeDictionary({{CFSTR("DeviceName"), text(CFSTR("*"))},
                                            {CFSTR("Hardware"), text(CFSTR("System"))},
                                            {CFSTR("Type"), text(CFSTR("System"))}});
    const Value service = makeDictionary(
        {{CFSTR("UserDefinedName"), text(CFSTR("Managed by the system"))}, {CFSTR("Interface"), interface}});
    const Value link = makeDictionary({{CFSTR("__LINK__"), text(CFSTR("/NetworkServices/0"))}});
    const Value globals =
        makeDictionary({{CFSTR("IPv4"), makeDictionary({{CFSTR("PPPOverridePrimary"), number(0)},
                                                        {CFSTR("ServiceOrder"), arrayOf(CFSTR("0"))}})},
                        {CFSTR("NetInfo"), makeDictionary({})}});
    const Value network = makeDictionary(
        {{CFSTR("Global"), globals}, {CFSTR("Service"), makeDictionary({{CFSTR("0"), link}})}});
    const Value location =
        makeDictionary({{CFSTR("UserDefinedName"), text(CFSTR("Automatic"))}, {CFSTR("Network"), network}});
    const Value root = makeDictionary({{CFSTR("CurrentSet"), text(CFSTR("/Sets/0"))},
                                       {CFSTR("NetworkServices"), makeDictionary({{CFSTR("0"), service}})},
                                       {CFSTR("Sets"), makeDictionary({{CFSTR("0"), location}})}});
    return values::Owned<CFDictionaryRef>::adopt(
        static_cast<CFDictionaryRef>(values::frozen(root.get()).take()));
}

}  // namespace platform::preferences
