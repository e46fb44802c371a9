// Strings files: the translated texts of the appliance's interface, one file for each language.
//
// A strings file is text in UTF-8 with lines of these forms:
//     [section]
//     key="value"
//     # comment (the first character that is no blank is '#')
// or blank. Blanks at the ends of a line and around the "=" do not count. A key belongs to the
// section above it; the same key may stand in several sections, with a text of its own in each. In
// a value a backslash begins an escape: \n is a line feed, \t a tab, \r a carriage return, \" a
// quote and \\ a backslash; a backslash before any other character stands for that character. A
// line of any other form, such as one with a zero byte in its value, is passed over. When a
// section, or a key in it, stands in the file more than once, the first line that answers a
// question holds.
//
// A file may be replaced at any time: a read sees the old file or the new one.

#ifndef ZELO_PLATFORM_STRINGS_FILE_H
#define ZELO_PLATFORM_STRINGS_FILE_H

#include "api.h"

extern "C" {

// Reads the value of szKey in the section szSection of the file szPath into szValue, a buffer of
// cbValue bytes, as zero-terminated text. A value longer than cbValue - 1 bytes is cut to fit,
// never inside a UTF-8 character.
//
// Returns the length of the text, 0 or more, when the key was found; a negative value, with the
// buffer as it was and the last error set (last_error.h), otherwise: YLIBC_ERR_NOT_FOUND when the
// file, the section or the key is not there, YLIBC_ERR_FILE when the file cannot be read or has
// more in it than a port takes into memory (a section or line of 16 MiB fits),
// YLIBC_ERR_INVALID_ARGUMENT when an argument is unusable. Any thread may call it at any time.
ZELO_PLATFORM_API int YLIBCFileGetSectionValue(const char *szPath, const char *szSection,
                                               const char *szKey, char *szValue, int cbValue);
}

#endif
