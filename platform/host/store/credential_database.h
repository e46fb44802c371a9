// The credential store's database: one SQLite file, "/usr/zelo/etc/credentials/credentials.db".
//
// Every operation is one statement of it, with all that sqlite_database.h says about statements.

#ifndef ZELO_HOST_CREDENTIAL_DATABASE_H
#define ZELO_HOST_CREDENTIAL_DATABASE_H

#include <string>
#include <vector>

#include "credential_record.h"
#include "sqlite_database.h"

namespace host::credential_database {

using sqlite::Result;

Result ReadCredential(long id, ZELO_CRED &cred);

// The credential of the application with the lowest id, and how many the application has.
Result ReadFirst(const char *szApplication, ZELO_CRED &cred, int &count);

// All credentials in the order of their ids.
Result ReadAll(std::vector<ZELO_CRED> &creds);

Result FindId(const char *szApplication, long &id);

// Adds a record without an id, and sets the id; replaces a record with one.
Result WriteCredential(ZELO_CRED &cred);

// Removes the record; kDone also when it was not there.
Result RemoveCredential(long id);

// sqlite::Database::SetAsideIfDamaged, and the files that it has set aside, the oldest first; false
// when those cannot be found out.
int SetAsideIfDamaged(char *szPath, int cbPath);
bool ListSetAside(std::vector<std::string> &paths);

Result ReadSession(long id, ZELO_CRED_SESS &sess);
Result WriteSession(const ZELO_CRED_SESS &sess);
Result RemoveSession(long id);

}  // namespace host::credential_database

#endif
