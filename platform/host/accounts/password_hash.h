// Hashes of passwords, in the form in which the account files hold them.

#ifndef ZELO_HOST_PASSWORD_HASH_H
#define ZELO_HOST_PASSWORD_HASH_H

#include <string>

#include "status.h"

namespace host {

// Hashes a password whole, with a salt of its own. Fails when it is too long (more than 511 bytes)
// or the method is not to be had.
Status HashPassword(const char *szPassword, std::string &strHash);

}  // namespace host

#endif
