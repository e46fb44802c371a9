// Names in a shared folder: one that everybody can write to, such as "/tmp".
//
// Whoever comes first can put a file, a link or a folder at a name there that root's programs use.
// Root takes the name back, whatever locks are held on what stands there; it stays root's then,
// since others cannot remove what is root's. Nobody but root can, so for all others such a file is
// refused, with words that name its owner.

#ifndef ZELO_HOST_SHARED_FOLDER_H
#define ZELO_HOST_SHARED_FOLDER_H

#include <sys/stat.h>

#include <string>

#include "status.h"

namespace host {

// The folder of a path: "" or with a slash at its end.
std::string FolderOf(const std::string &strPath);

// Reads whether everybody can write to a folder, which is written as FolderOf does.
Status ReadShared(const std::string &strFolder, bool &blShared);

// Whether the caller is root and may take the name back from what stands there.
bool IsForeignToRoot(const std::string &strPath, const struct stat &there);

// For root: removes what another user has put at the path. What a program of root's has put there
// meanwhile stays.
void RemoveForeign(const std::string &strPath);

// Removes a file, a link or an empty folder. A folder that holds something stays.
void RemoveAny(const std::string &strPath);

// Whether what stands where a file of ours should is refused: because it is not our own, or because
// it is root's and the caller may not open it. `error` is that of opening it, 0 when it is open.
bool IsRefused(const struct stat &there, int error);

// Why what stands at the path, where a file of ours should, is refused.
Status Refusal(const std::string &strPath, const struct stat &there);

// A name beside the path that nobody uses; "" when the kernel has no random number.
std::string UnusedName(const std::string &strPath);

}  // namespace host

#endif
