// Line files: text files of one record per line (LF), private to the user that keeps them, as
// the session files of the CGI programs. Files are opened without following a link in their
// last component and must be regular files of the caller's effective user (0x0300 otherwise);
// paths are absolute.
#pragma once
#include "platform_export.h"

QUIB_BEGIN_C

// Appends line and an LF to file, creating it (0600) when missing. A file whose last line
// lacks its LF gets one first, so the new line never joins a torn one. Appenders must be
// serialised by the caller (a critical section): a write that fails is cut back off the file,
// which must not take another appender's line with it. 0; -1 with 0x0D00 for a null file or
// line, or a line with CR or LF; the errno's code on failure.
QUIB_API int VLIBCFileAddLine(const char *file, const char *line);

// Finds the first line of file holding text (a byte substring) and copies it, without its line
// end, into buf (size bytes, terminated; buf may be null with size 0). Returns the line's
// number, from 1. -1 with 0x0900 when no line holds it or the file is missing, 0x0D00 for a
// null file, an empty text or one with CR or LF, 0xC300 when the line does not fit in buf
// (never truncated), the errno's code on failure. A line holding NUL never matches.
QUIB_API int VLIBCFileGetLine(const char *file, const char *text, char *buf, int size);

// rename(2): from takes the place of to in one step; links are neither followed nor refused
// (both names are replaced as they are). 0; -1 with the errno's code (0x0D00 for null).
QUIB_API int VLIBCSysRename(const char *from, const char *to);

QUIB_END_C
