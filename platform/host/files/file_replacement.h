// Replacing a file as a whole.

#ifndef ZELO_HOST_FILE_REPLACEMENT_H
#define ZELO_HOST_FILE_REPLACEMENT_H

#include "trusted_file.h"

namespace host {

// Puts a file with this content in the place of the one that was found, with the same mode and
// owner, in one step; where there was none it creates one (mode 0644). The content goes to a
// temporary file beside it first. In a folder that is not shared the change is durable when this
// returns; what stands in a shared one, such as "/tmp", does not outlive a restart anyway, and the
// disks may sleep.
//
// After a failure the file is as it was, unless the change is there and only could not be made
// durable.
Status ReplaceFile(const FoundFile &found, const std::string &strContent);

}  // namespace host

#endif
