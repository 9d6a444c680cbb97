// The keys of the tree, of its entities and of the port dictionary that more than one place uses.
#pragma once

#include "platform/CoreFoundation.h"

// Of the tree:
inline const CFStringRef kSetsKey = CFSTR("Sets");
inline const CFStringRef kNetworkServicesKey = CFSTR("NetworkServices");
inline const CFStringRef kCurrentSetKey = CFSTR("CurrentSet");
inline const CFStringRef kLinkKey = CFSTR("__LINK__");
inline const CFStringRef kInactiveKey = CFSTR("__INACTIVE__");
inline const CFStringRef kServiceOrderKey = CFSTR("ServiceOrder");

// The protocols, which are the keys of the entities; the last three are kinds of hardware as well.
inline const CFStringRef kInterfaceProtocol = CFSTR("Interface");
inline const CFStringRef kProxiesProtocol = CFSTR("Proxies");
inline const CFStringRef kAppleTalkProtocol = CFSTR("AppleTalk");
inline const CFStringRef kDNSProtocol = CFSTR("DNS");
inline const CFStringRef kIPv4Protocol = CFSTR("IPv4");
inline const CFStringRef kNetInfoProtocol = CFSTR("NetInfo");
inline const CFStringRef kPPPProtocol = CFSTR("PPP");
inline const CFStringRef kAirPortProtocol = CFSTR("AirPort");
inline const CFStringRef kEthernetProtocol = CFSTR("Ethernet");
inline const CFStringRef kModemProtocol = CFSTR("Modem");

// Of port dictionaries and of entities:
inline const CFStringRef kUserDefinedNameKey = CFSTR("UserDefinedName");
inline const CFStringRef kDeviceNameKey = CFSTR("DeviceName");
inline const CFStringRef kHardwareKey = CFSTR("Hardware");
inline const CFStringRef kHardwareVariantKey = CFSTR("HardwareVariant");
inline const CFStringRef kTypeKey = CFSTR("Type");
inline const CFStringRef kSubTypeKey = CFSTR("SubType");
inline const CFStringRef kMACAddressKey = CFSTR("MACAddress");
inline const CFStringRef kConfigMethodKey = CFSTR("ConfigMethod");
