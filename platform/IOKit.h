// The hardware registry: entries for network interfaces and serial ports, their properties and their parents.
//
// Handles are small integers with a reference count of their own; IOObjectRelease drops one reference. An
// iterator and the entries taken from it are a snapshot of the hardware at the moment the iterator was made.
#pragma once

#include "platform/CoreFoundation.h"

using kern_return_t = int;
using mach_port_t = unsigned int;
using io_object_t = mach_port_t;
using io_registry_entry_t = io_object_t;
using io_iterator_t = io_object_t;
using io_service_t = io_object_t;
using io_name_t = char[128];
using IOOptionBits = UInt32;

inline constexpr kern_return_t KERN_SUCCESS = 0;
inline constexpr mach_port_t MACH_PORT_NULL = 0;
inline constexpr io_object_t IO_OBJECT_NULL = 0;
inline constexpr kern_return_t kIOReturnError = static_cast<kern_return_t>(0xE00002BC);
inline constexpr kern_return_t kIOReturnNoMemory = static_cast<kern_return_t>(0xE00002BD);
inline constexpr kern_return_t kIOReturnBadArgument = static_cast<kern_return_t>(0xE00002C2);
// There is no such parent.
inline constexpr kern_return_t kIOReturnNoDevice = static_cast<kern_return_t>(0xE00002C0);

inline constexpr const char* kIOServicePlane = "IOService";

// The handle through which the registry is asked, to be released with IOObjectRelease.
kern_return_t IOMasterPort(mach_port_t bootstrapPort, mach_port_t* masterPort);
// A dictionary that matches every entry of a class; null without memory.
CFMutableDictionaryRef IOServiceMatching(const char* className);
// Consumes one reference of the matching dictionary, on failure too. Matches by class, or by the pair
// "IOProviderClass" and "IOSerialBSDClientType". Entries come in a stable order.
kern_return_t IOServiceGetMatchingServices(mach_port_t masterPort, CFDictionaryRef matching,
                                           io_iterator_t* iterator);
// The next entry, which the caller releases, or 0 at the end.
io_object_t IOIteratorNext(io_iterator_t iterator);
// One property as a value of the caller's, or null.
CFTypeRef IORegistryEntryCreateCFProperty(io_registry_entry_t entry, CFStringRef key,
                                          CFAllocatorRef allocator, IOOptionBits options);
// All properties as a dictionary of the caller's; null on failure.
kern_return_t IORegistryEntryCreateCFProperties(io_registry_entry_t entry, CFMutableDictionaryRef* properties,
                                                CFAllocatorRef allocator, IOOptionBits options);
// The parent, which the caller releases. plane is kIOServicePlane. The output is 0 on failure.
kern_return_t IORegistryEntryGetParentEntry(io_registry_entry_t entry, const char* plane,
                                            io_registry_entry_t* parent);
// Whether the entry is of the class or of a subclass of it.
Boolean IOObjectConformsTo(io_object_t object, const char* className);
kern_return_t IOObjectRelease(io_object_t object);
