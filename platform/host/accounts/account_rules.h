// What the account files may hold, and what it means.

#ifndef ZELO_HOST_ACCOUNT_RULES_H
#define ZELO_HOST_ACCOUNT_RULES_H

#include <string>

#include "account_files.h"
#include "user_group.h"

namespace host {

// Whether the record's fields can be written as they are.
Status CheckStorable(const ZELO_USER &user);

// Whether a new user, or one that is there, may become like this beside the others.
Status CheckMayStore(const ZELO_USER &user, bool blNew, const PasswdFile &passwd,
                     const GroupFile &groups);

// How many users may be added to these.
Status CountRemaining(const PasswdFile &passwd, int &remaining);

// What the password field of a user holds: a hash, or a text that no password matches.
std::string StoredPassword(const PasswdFile &passwd, const ShadowFile &shadow,
                           const std::string &strName);

// Whether somebody can sign in with what a password field holds. "!" in front of a hash locks it,
// "*" stands for no hash; an empty field asks for no password.
bool LetsIn(const std::string &strPassword);

// The password field for a user who is to be let in or not. It is never empty: that would let
// everybody in.
std::string PasswordField(const std::string &strPassword, bool blEnabled);

// The path at which a user's preference directory stands; "" for a name that would lead elsewhere.
std::string PreferencePath(const std::string &strName);

}  // namespace host

#endif
