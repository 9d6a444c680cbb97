// A location ID kept in a small text file, for the process of a later command.
//
// The files lie where anybody may write, so they are handled as a program that runs as root has to: a file
// that is read is a regular one with one name, this process's own effective user's, and writable by nobody
// else; no link is followed, and a FIFO keeps nobody waiting. Anything else is a file that cannot be opened.
#pragma once

#include "platform/CoreFoundation.h"

// Puts a new file with the text, without a line break and with mode 0600, in the place of whatever stands
// there: another user's file or a link is replaced, not written to, and a directory gets another name. When
// that fails the old content stays and the system log says why.
void WriteSetIDFile(const char* path, const char* text);

// Reads one line of at most 1023 bytes, a line break at its end included, as an ID in the system's text
// encoding. False when the file cannot be opened; setID is then untouched. An empty file, or a line that is
// not text, gives null. The ID belongs to the caller.
bool CopySetIDFromFile(const char* path, CFStringRef* setID);
