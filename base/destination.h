// The way to a file that is about to be written, with every link on it looked at.
//
// In a folder that everybody can write to, a link may be a trap that leads to a file of the
// writer's. There a link is followed only when it belongs to the caller or to the folder's owner,
// whatever the kernel's own setting for such folders is. In any other folder every link is
// followed.

#ifndef ZELO_DESTINATION_H
#define ZELO_DESTINATION_H

#include <cstdio>
#include <string>

#include "descriptor.h"

namespace destination {

// What the path leads to. The descriptors hold it (O_PATH): the names may lead elsewhere meanwhile.
struct Place {
    Descriptor folder;  // of the file at the end of all links
    std::string strName;
    Descriptor file;        // not open: nothing stands there
    bool blShared = false;  // everybody can write to the folder
    bool blFixed = true;    // nobody but the owners on the way can make the path lead elsewhere
    bool blOwn = true;      // nobody but root and the caller can
};

enum class Result { kFound, kForeignLink, kFailed };

// Goes the way. On kForeignLink and kFailed `place` is of no use; errno says why it failed.
Result Find(const std::string &strPath, Place &place);

// The path by which what is held can be opened, wherever its names lead by then.
std::string PathOf(const Descriptor &held);

// Opens the file at the path, created or emptied (fopen64, mode "w"), as Find goes the way. Null
// when that fails.
std::FILE *OpenToWrite(const std::string &strPath);

}  // namespace destination

#endif
