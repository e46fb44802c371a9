// Changing the account files: what the operations of user_group.h do under the system's lock.
//
// After a failure the files are as they were.

#ifndef ZELO_HOST_ACCOUNT_CHANGE_H
#define ZELO_HOST_ACCOUNT_CHANGE_H

#include <string>
#include <vector>

#include "files/directories.h"
#include "status.h"
#include "user_group.h"

namespace host {

// Creates a directory for one user alone, and those above it for everybody, where they are missing.
Status MakePrivateDirectory(const std::string &strPath, const Owner &owner);

// Stores a user: a new one when szCurrentName is null.
Status StoreUser(const char *szCurrentName, const ZELO_USER &user);

// Deletes the users, all of them or none, with the directories that go with them.
Status DeleteUsers(const std::vector<std::string> &names);

// The names of a list that ends with a null.
std::vector<std::string> ListNames(char **ppszList);

// Makes the wanted names the members of a group. Where pGot says which ones there were when the
// caller read them, it changes what differs between the two and leaves what others have changed
// since.
Status StoreMembers(const std::string &strGroup, const std::vector<std::string> *pGot,
                    const std::vector<std::string> &wanted);

}  // namespace host

#endif
