// Key-value files: the platform's configuration format.
//
// A line is one of
//     key=value
//     key="value"
//     # comment (the first character that is no blank is '#')
// or blank. Blanks around the key, around the "=" and after the value do not count. Inside double
// quotes a backslash takes the next character as it is, so a value may hold quotes and backslashes;
// without quotes the value runs to the end of the line. Lines of any other form are passed over,
// such as those without a key or with a zero byte. When a key stands in a file more than once, the
// first line with it holds.
//
// No operation answers from a former state of the file; any thread may call them at any time. A
// file is only ever replaced as a whole: a reader sees the old file or the new one, also when the
// writer dies half-way. Two writers at once are the callers' to keep apart (file_lock.h): each
// writes whole files, so the later one may undo the earlier one's change.
//
// A file may stand in a folder that everybody can write to, such as "/tmp": what is no regular file
// there, or belongs to somebody else (root excepted), or is a link or a second name of another file
// is refused (YLIBC_ERR_UNSAFE_FILE), and a change does not wait for the disk. Other users do not
// keep root from its file there: what one of them has put at the path is removed, by a look-up too,
// and counts as not there. In any other folder links are followed, a change through a link replaces
// the file that it leads to, and a change is durable when the operation returns.
//
// A failure sets the last error (last_error.h): YLIBC_ERR_NOT_FOUND where a file that has to be
// there is not, YLIBC_ERR_FILE where it cannot be read or written, which goes for a folder in its
// place too, YLIBC_ERR_INVALID_ARGUMENT for an argument. A look-up that finds no such key sets
// YLIBC_ERR_NOT_FOUND as well, though its result is 0.

#ifndef ZELO_PLATFORM_KEY_VALUE_FILE_H
#define ZELO_PLATFORM_KEY_VALUE_FILE_H

#include "api.h"
#include "text_containers.h"

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

// Writes the value of szKey into the file szPath; a file that is not there is created (mode 0644,
// whatever the process's umask). The line with the key (of several the first) gets the new value,
// and a new key becomes the last line; all other lines stay as they are, comments and order
// included, and the file keeps its mode and owner. A value that the file holds already is not
// written again.
//
// Returns 0 on success. Returns a negative value, with the file as it was, when it cannot be read
// or written, or (YLIBC_ERR_INVALID_ARGUMENT) when the format cannot hold the key or the value: a
// line feed or carriage return in either, a key that is empty, holds "=", begins with "#" or has
// blanks at its ends. When the change is there and only could not be made durable, the result is
// negative too.
//
// flags is reserved: callers pass 0, a port ignores it.
ZELO_PLATFORM_API int YLIBCFileSetKeyValue(const char *szPath, const char *szKey,
                                           const char *szValue, int flags);

// Removes every line with szKey from the file szPath, in the same way.
//
// Returns 0 or more on success; a key or a file that is not there counts as removed, and nothing is
// written then. Returns a negative value, with the file as it was, when it cannot be read or
// written.
ZELO_PLATFORM_API int YLIBCFileRemoveKey(const char *szPath, const char *szKey);

// Reads all pairs of the file szPath into the hash *ppHash, in the order of the file; of a key that
// stands there more than once the first value. Pairs that are in the hash already stay, and one
// whose key the file has too gets the file's value in its old place.
//
// Returns the number of keys read, 0 or more, or a negative value when the file cannot be read or
// is not there, or memory is short; the hash may then hold some of the pairs.
ZELO_PLATFORM_API int YLIBCFileGetPair(const char *szPath, YLIBSZHASH **ppHash);

// Writes the value of szKey into the platform's own configuration, "/etc/zeloinfo.conf", as
// YLIBCFileSetKeyValue does, and excludes other callers of this operation meanwhile. No other
// file than that one and its lock file comes into being.
//
// Returns 0 on success, a negative value otherwise.
ZELO_PLATFORM_API int YLIBCINFOSetKeyValue(const char *szKey, const char *szValue);
}

#endif
