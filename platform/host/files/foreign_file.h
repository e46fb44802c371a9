// Somebody else's files under names of ours, in folders that everybody can write to.
//
// Whoever comes first can put a file, a link or a folder at a name in "/tmp" that root's programs
// use. Root takes the name back; it stays root's then, since others cannot remove what is root's
// there. Nobody but root can, so for all others such a file is refused where it is opened.

#ifndef ZELO_HOST_FOREIGN_FILE_H
#define ZELO_HOST_FOREIGN_FILE_H

#include <string>

namespace host {

// As root, in a folder that everybody can write to: removes what another user has put at the path,
// whatever it is and whatever locks are held on it. Does nothing otherwise. The last error stays as
// it was.
void RemoveForeignFile(const std::string &strPath);

// To be called before a lock file is opened. As root, in a folder that everybody can write to,
// removes another user's file and creates root's (mode 0600). Returns whether opening may still
// create the file: not where it has just been made. The last error stays as it was.
bool PrepareLockFile(const char *szPath);

}  // namespace host

#endif
