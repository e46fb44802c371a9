// Opening files that nobody else has put there.
//
// In a shared folder, one that everybody can write to, any name may be a trap: a link to a file of
// ours, a second name of it, a FIFO that makes a reader wait, a file that its owner goes on
// changing. What stands there is opened only when it is a regular file of the caller's own, or
// root's, with no other name; the kernel's settings that guard such folders are not counted on. In
// any other folder links are followed and every regular file will do. Which folder a path names is
// the caller's word.

#ifndef ZELO_HOST_TRUSTED_FILE_H
#define ZELO_HOST_TRUSTED_FILE_H

#include <sys/stat.h>

#include <string>

#include "descriptor.h"

namespace host {

// A file at the end of the links, if there are any.
struct FoundFile {
    std::string strFolder;  // "" or with a slash at its end
    std::string strName;
    bool blThere = false;     // whether there is a file
    Descriptor file;          // for reading; a caller who has read it may close it
    struct stat status = {};  // of that file

    std::string Path() const { return strFolder + strName; }
};

enum class Find { kFile, kNoFile, kFailed };

// Opens the file that szPath leads to. It never waits. On kNoFile `found` says where the file would
// stand, and no error is set; a missing folder counts as a missing file.
Find FindFile(const char *szPath, FoundFile &found);

// Reads the whole content. False, with the error set, when that fails or the file is larger than
// 64 MiB.
bool ReadContent(const FoundFile &found, std::string &strContent);

// What may be opened in a shared folder. A file that lost its name meanwhile may.
bool IsOwnFile(const struct stat &status);

// Reads whether everybody can write to a folder, which is written as in FoundFile. False, with the
// error set, when its status cannot be read.
bool ReadShared(const std::string &strFolder, bool &blShared);

}  // namespace host

#endif
