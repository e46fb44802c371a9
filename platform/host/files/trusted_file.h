// Opening files that nobody else has put there.
//
// In a shared folder (shared_folder.h) what stands at the path is opened only when it is our own
// (own_file.h); root removes what is another user's, which counts as not there. In any other folder
// links are followed and every regular file will do. Only the folder that a name stands in is
// looked at; those above it are the caller's choice.

#ifndef ZELO_HOST_TRUSTED_FILE_H
#define ZELO_HOST_TRUSTED_FILE_H

#include <sys/stat.h>

#include <string>

#include "descriptor.h"
#include "status.h"

namespace host {

// A file at the end of the links, if there are any.
struct FoundFile {
    std::string strPath;      // where it stands, or would stand
    bool blThere = false;     // whether there is a file
    Descriptor file;          // for reading; a caller who has read it may close it
    struct stat status = {};  // of that file
};

// Opens the file that szPath leads to. It never waits. That there is none is no failure; a missing
// folder counts as a missing file.
Status FindFile(const char *szPath, FoundFile &found);

// Reads the whole content, of at most 64 MiB.
Status ReadContent(const FoundFile &found, std::string &strContent);

}  // namespace host

#endif
