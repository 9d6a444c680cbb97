// The hardware registry: entries for network interfaces and serial ports, their properties and their parents.
//
// Handles are small integers. Each one that is handed out is a reference of its own, to be given back with
// IOObjectRelease; a handle that is not one (0, or given back before) is kIOReturnBadArgument. An iterator
// and the entries taken from it are a snapshot of the hardware at the moment the iterator was made: a device
// that is pulled out meanwhile keeps its entry, and fails nobody.
//
// Entries and their properties (strings unless said otherwise; what is not known is left out):
// - "IOEthernetInterface", each network interface of Ethernet type with hardware behind it, wireless ones
//   included: "BSD Name" (the kernel's name, always there).
//   - Its parent, the controller: "IOMACAddress" (data, 6 bytes: the address that the card was made with, or
//     else the one in use), "IOClass" (the driver's name, with "AirPort" before it when the card is
//     wireless), "IOProviderClass" (always there: "IOPCIDevice", "IOUSBDevice", else "IOPlatformDevice").
//     - The controller's parent, the bus (both data, ASCII with a NUL at the end): "name" (always there; the
//       bus and the place on it), "AAPL,slot-name" (for PCI: "SLOT-" and the firmware's label for the slot or
//       the device, else the PCI address); "IOChildIndex" (number, from 0), when one card carries several
//       ports.
// - "IOSerialBSDClient", each serial port with hardware behind it, except one that serves as the system's
//   console: "IOTTYDevice" (the kernel's name), "IOTTYBaseName", "IOSerialBSDClientType", all always there.
//   The type is "IOModemSerialStream" for a USB modem (base name "usbmodem") and a Bluetooth serial port
//   (base name "Bluetooth-Modem"), else "IORS232SerialStream" with the kernel's name for a base name.
//   - Its parent, the device: "Product Name", from USB.
// The names and texts of devices and firmware are printable UTF-8 of at most 64 bytes: a device whose name is
// not has no entry, and what
// does not print of a product's text is a '?'.
#pragma once

#include "platform/CoreFoundation.h"

LA_BEGIN_DECLARATIONS

typedef int kern_return_t;
typedef unsigned int mach_port_t;
typedef mach_port_t io_object_t;
typedef io_object_t io_registry_entry_t;
typedef io_object_t io_iterator_t;
typedef io_object_t io_service_t;
typedef char io_name_t[128];
typedef UInt32 IOOptionBits;

LA_CONSTANT(kern_return_t, KERN_SUCCESS, 0);
LA_CONSTANT(mach_port_t, MACH_PORT_NULL, 0);
LA_CONSTANT(io_object_t, IO_OBJECT_NULL, 0);
LA_CONSTANT(kern_return_t, kIOReturnError, -0x1FFFFD44);        // 0xE00002BC
LA_CONSTANT(kern_return_t, kIOReturnBadArgument, -0x1FFFFD3E);  // 0xE00002C2
// There is no such parent.
LA_CONSTANT(kern_return_t, kIOReturnNoDevice, -0x1FFFFD40);  // 0xE00002C0

#define kIOServicePlane "IOService"

// The handle through which the registry is asked, to be released with IOObjectRelease.
kern_return_t IOMasterPort(mach_port_t bootstrapPort, mach_port_t* masterPort) LA_NOEXCEPT;
// A dictionary that matches every entry of a class ("IOProviderClass"); null unless the name is UTF-8.
CFMutableDictionaryRef IOServiceMatching(const char* className) LA_NOEXCEPT;
// Consumes one reference of the matching dictionary, on failure too. Matches the entries of the class under
// "IOProviderClass" whose properties equal whatever else the dictionary holds; nothing when there is no such
// class. They come in the order of the kernel's names, numbers in them by value. Hardware that cannot be
// listed whole, or of more than 4096 devices, is kIOReturnError. The output is untouched on failure.
kern_return_t IOServiceGetMatchingServices(mach_port_t masterPort, CFDictionaryRef matching,
                                           io_iterator_t* iterator) LA_NOEXCEPT;
// The next entry, which the caller releases, or 0 at the end.
io_object_t IOIteratorNext(io_iterator_t iterator) LA_NOEXCEPT;
// One property as a value of the caller's, or null.
CFTypeRef IORegistryEntryCreateCFProperty(io_registry_entry_t entry, CFStringRef key,
                                          CFAllocatorRef allocator, IOOptionBits options) LA_NOEXCEPT;
// All properties as a dictionary of the caller's; null on failure.
kern_return_t IORegistryEntryCreateCFProperties(io_registry_entry_t entry, CFMutableDictionaryRef* properties,
                                                CFAllocatorRef allocator, IOOptionBits options) LA_NOEXCEPT;
// The parent, which the caller releases. plane is kIOServicePlane. The output is 0 on failure.
kern_return_t IORegistryEntryGetParentEntry(io_registry_entry_t entry, const char* plane,
                                            io_registry_entry_t* parent) LA_NOEXCEPT;
// Whether the entry is of the class; no parent is of any.
Boolean IOObjectConformsTo(io_object_t object, const char* className) LA_NOEXCEPT;
kern_return_t IOObjectRelease(io_object_t object) LA_NOEXCEPT;

LA_END_DECLARATIONS
