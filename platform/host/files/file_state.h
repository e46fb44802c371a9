// The state of a file, by which a process knows that what it has read of it still holds.

#ifndef ZELO_HOST_FILE_STATE_H
#define ZELO_HOST_FILE_STATE_H

#include <sys/stat.h>

namespace host {

bool IsSameFile(const struct stat &a, const struct stat &b);

// Whether it is the same file with the same times and size.
bool IsUnchanged(const struct stat &a, const struct stat &b);

// Whether each change from now on will show in the file's state: a file that has just been changed
// can be changed again within the same step of time. What is read after this call holds for as long
// as the state is unchanged.
bool IsSettled(const struct stat &state);

}  // namespace host

#endif
