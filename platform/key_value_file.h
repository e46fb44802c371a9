// Key-value files: the platform's configuration format.
//
// A line is one of
//     key=value
//     key="value"
//     # comment (the first character that is no blank is '#')
// or blank. Blanks around the key, around the "=" and after the value do not count. Inside double
// quotes a backslash takes the next character as it is, so a value may hold quotes and backslashes;
// without quotes the value runs to the end of the line. Lines of any other form are passed over.
// When a key stands in a file more than once, the first line with it holds.
//
// The operations open, read and close the file in each call; nothing is cached and any thread may
// call them at any time.

#ifndef ZELO_PLATFORM_KEY_VALUE_FILE_H
#define ZELO_PLATFORM_KEY_VALUE_FILE_H

#include "api.h"

extern "C" {

// Reads the value of szKey in the file szPath into szValue, a buffer of cbValue bytes.
//
// Returns the length of the text now in the buffer when the key was found with a value: greater
// than 0. A value longer than cbValue - 1 bytes is cut to that length. Returns 0 when the key is
// absent or its value is empty, and a negative value when the file cannot be read or an argument is
// unusable. On 0 and below the buffer holds the empty text (if there is a buffer).
//
// flags is reserved: callers pass 0, a port ignores it.
ZELO_PLATFORM_API int YLIBCFileGetKeyValue(const char *szPath, const char *szKey, char *szValue,
                                           int cbValue, int flags);

// Compares the value of szKey in the file szPath with szExpected, byte for byte and whole (no
// buffer's length limits it).
//
// Returns 1 when the key is there and holds exactly that text, 0 when it is absent or holds
// anything else, and a negative value when the file cannot be read or an argument is unusable.
//
// flags is reserved: callers pass 0, a port ignores it.
ZELO_PLATFORM_API int YLIBCFileCheckKeyValue(const char *szPath, const char *szKey,
                                             const char *szExpected, int flags);
}

#endif
