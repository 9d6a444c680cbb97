// Folders and their items, download, opening a URL, the system's version.
#pragma once

#include "platform/CoreFoundation.h"

LA_BEGIN_DECLARATIONS

LA_CONSTANT(OSErr, noErr, 0);
LA_CONSTANT(OSErr, paramErr, -50);
LA_CONSTANT(OSErr, memFullErr, -108);
LA_CONSTANT(OSErr, fnfErr, -43);  // no such folder or file
LA_CONSTANT(OSErr, ioErr, -36);
LA_CONSTANT(OSErr, permErr, -54);
LA_CONSTANT(OSErr, coreFoundationUnknownErr, -4960);

// --- System version ---

LA_CONSTANT(OSType, gestaltSystemVersion, 0x73797376);  // 'sysv'
LA_CONSTANT(OSErr, gestaltUndefSelectorErr, -5551);     // no such question, or no answer to it
// For gestaltSystemVersion a BCD number: 0x1020 is 10.2.0. The response is untouched on failure.
OSErr Gestalt(OSType selector, SInt32* response) LA_NOEXCEPT;

// --- Folders ---

// Names a file or folder for as long as the process lives.
typedef struct FSRef {
    UInt8 hidden[80];
} FSRef;

// A name as UTF-16 code units in host byte order.
typedef struct HFSUniStr255 {
    UInt16 length;
    UniChar unicode[255];
} HFSUniStr255;

LA_CONSTANT(SInt16, kUserDomain, -32763);
LA_CONSTANT(SInt16, kNetworkDomain, -32764);
LA_CONSTANT(SInt16, kLocalDomain, -32765);
LA_CONSTANT(SInt16, kSystemDomain, -32766);
#define kModemScriptsFolderType 0xC46D6F64U  // more than an int of C holds

// The folder of that kind in a domain. createFolder must be false. fnfErr when it does not exist, permErr
// when it may not be seen, ioErr when it cannot, paramErr for an unknown kind or domain; the reference is
// then untouched. The user
// is the one who runs the process, and the home is that of the password database.
OSErr FSFindFolder(SInt16 domain, OSType folderType, Boolean createFolder, FSRef* folder) LA_NOEXCEPT;

typedef struct OpaqueFSIterator* FSIterator;
LA_CONSTANT(UInt32, kFSIterateFlat, 0);
LA_CONSTANT(UInt32, kFSCatInfoNone, 0);
LA_CONSTANT(OSErr, errFSNoMoreItems, -1417);

// An iterator over the items directly in a folder, ended with FSCloseIterator; null on failure.
OSErr FSOpenIterator(const FSRef* folder, UInt32 flags, FSIterator* iterator) LA_NOEXCEPT;
// Up to maximumItems references and names, in no order. errFSNoMoreItems marks the last batch, which may hold
// items; what actualItems tells was delivered even when the status is another failure. A name that is not
// printable UTF-8 of at most 64 bytes is left out: it could not be named in a location. More than 4096
// items are ioErr. whichInfo is kFSCatInfoNone; containerChanged, catalogInfos and specs are null; refs and
// names may be.
OSErr FSGetCatalogInfoBulk(FSIterator iterator, UInt32 maximumItems, UInt32* actualItems,
                           Boolean* containerChanged, UInt32 whichInfo, void* catalogInfos, FSRef* refs,
                           void* specs, HFSUniStr255* names) LA_NOEXCEPT;
OSErr FSCloseIterator(FSIterator iterator) LA_NOEXCEPT;

typedef struct LSItemInfoRecord {
    UInt32 flags;
} LSItemInfoRecord;
LA_CONSTANT(UInt32, kLSRequestBasicFlagsOnly, 0x4);
LA_CONSTANT(UInt32, kLSItemInfoIsPlainFile, 0x1);
LA_CONSTANT(UInt32, kLSItemInfoIsContainer, 0x8);
LA_CONSTANT(UInt32, kLSItemInfoIsInvisible, 0x40);
// What the item is; links are followed, and a name that begins with a dot is invisible. An item that is gone
// since it was listed, and a link that leads nowhere, are neither a plain file nor a container, and no
// failure: neither of them may spoil the listing of the folder. permErr and ioErr when the item is there and
// cannot be looked at.
OSStatus LSCopyItemInfoForRef(const FSRef* item, UInt32 requestedInfo, LSItemInfoRecord* info) LA_NOEXCEPT;

// --- Download ---

// A growable buffer.
typedef struct HandleBlock* Handle;
// A buffer of that many zero bytes; null for a negative size. It lives until the process ends or
// DisposeHandle.
Handle NewHandle(long size) LA_NOEXCEPT;
void DisposeHandle(Handle handle) LA_NOEXCEPT;
long GetHandleSize(Handle handle) LA_NOEXCEPT;
const char* GetHandleData(Handle handle) LA_NOEXCEPT;

LA_CONSTANT(OSStatus, kURLInvalidURLError, -30773);  // or a host that is not a numeric address
LA_CONSTANT(OSStatus, kURLUnsupportedSchemeError, -30774);
LA_CONSTANT(OSStatus, kURLUnreachableError, -30790);      // refused, no route, no network
LA_CONSTANT(OSStatus, kURLTimedOutError, -30791);         // the server was silent, or the answer too slow
LA_CONSTANT(OSStatus, kURLConnectionLostError, -30792);   // broken off before the answer was complete
LA_CONSTANT(OSStatus, kURLMalformedAnswerError, -30793);  // what came is not HTTP
LA_CONSTANT(OSStatus, kURLAnswerTooLargeError, -30794);
LA_CONSTANT(OSStatus, kURLClientError, -30795);  // the HTTP client library is missing or does not work
// Fetches an http URL into the buffer, replacing what it holds. No proxy, no redirects, and never longer or
// larger than the bounds of platform/services/Download.cpp. 0 for an answer of class 2xx; the HTTP status for
// every other answer (404, a redirect's 302), whatever its body; a negative value when there was no answer,
// or a 2xx did not arrive whole, with the reason in the log. Only a 2xx fills the buffer. destination,
// eventProc and context are null, flags is 0; else, and without a url or a buffer of NewHandle's, -50 with
// the buffer as it was.
OSStatus URLSimpleDownload(const char* url, const void* destination, Handle buffer, UInt32 flags,
                           const void* eventProc, void* context) LA_NOEXCEPT;

// --- Opening a URL ---

// Opens an http or https URL in the browser of the user who sits at the computer, as that user, and returns
// without waiting for it; asking the user's session about its display takes at most some 1.5 s. openedURL
// must be null. paramErr for that, for a null URL and for another scheme; fnfErr when nobody sits there, the
// password database does not know who, or there is no program that opens URLs; permErr when it is root, or
// another user's session; ioErr when the program cannot be started. The reason is in the log.
OSStatus LSOpenCFURLRef(CFURLRef url, CFURLRef* openedURL) LA_NOEXCEPT;

// --- System log ---

// Writes one line to the system log, as a warning of this system, without waiting: where nobody reads the log
// it is lost.
void SystemLog(const char* line) LA_NOEXCEPT;

LA_END_DECLARATIONS
