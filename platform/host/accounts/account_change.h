// Changing the account files: what the operations of user_group.h do under the system's lock.
//
// Where a function can fail it returns false with the error set; the files are then as they were.

#ifndef ZELO_HOST_ACCOUNT_CHANGE_H
#define ZELO_HOST_ACCOUNT_CHANGE_H

#include <string>
#include <vector>

#include "account_files.h"
#include "user_group.h"

namespace host {

// The files that say which users there are. To look something up needs no lock.
struct UserFiles {
    PasswdFile passwd;
    ShadowFile shadow;

    bool Read() { return passwd.Read() && shadow.Read(); }

    // What the password field of a user holds: a hash, or a text that no password matches.
    std::string StoredPassword(const std::string &strName) const;
};

// Whether somebody can sign in with what a password field holds. "!" in front of a hash locks it,
// "*" stands for no hash; an empty field asks for no password.
bool LetsIn(const std::string &strPassword);

// How many users may be added to these.
bool CountRemaining(const PasswdFile &passwd, int &remaining);

// The path at which a user's preference directory stands. A name that would lead elsewhere has
// none.
bool PreferencePath(const std::string &strName, std::string &strPath);

// Stores a user: a new one when szCurrentName is null.
bool StoreUser(const char *szCurrentName, const ZELO_USER &user);

// Deletes the users, all of them or none, with the directories that go with them.
bool DeleteUsers(const std::vector<std::string> &names);

// The names of a list that ends with a null.
std::vector<std::string> ListNames(char **ppszList);

// Makes the wanted names the members of a group. Where pGot says which ones there were when the
// caller read them, it changes what differs between the two and leaves what others have changed
// since.
bool StoreMembers(const std::string &strGroup, const std::vector<std::string> *pGot,
                  const std::vector<std::string> &wanted);

}  // namespace host

#endif
