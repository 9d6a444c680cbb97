// A location ID kept in a small text file, for the process of a later command.
//
// The files lie where anybody may write, so they are opened as a program that runs as root has to: no link is
// followed, nothing but a regular file with one name and of this process's own effective user counts, and a
// FIFO keeps nobody waiting. Anything else is a file that cannot be opened.
#pragma once

#include "platform/CoreFoundation.h"

// Replaces the file's content by the text, without a line break; a new file gets mode 0600. A file that
// cannot be opened is passed over.
void WriteSetIDFile(const char* path, const char* text);

// Reads one line of at most 1023 bytes, a line break at its end included, as an ID in the system's text
// encoding. False when the file cannot be opened; setID is then untouched. An empty file, or a line that is
// not text, gives null. The ID belongs to the caller.
bool CopySetIDFromFile(const char* path, CFStringRef* setID);
