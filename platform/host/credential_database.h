// The credential store's database: one SQLite file, "/usr/zelo/etc/credentials/credentials.db".
//
// Every operation is one statement and thereby one transaction, durable when it returns. The
// process keeps one connection, which its threads take in turn. Reading never creates or changes
// the file: a store that does not exist yet has no records. A file that is damaged or of another
// format is left as it is; each operation on it fails with a log line.

#ifndef ZELO_HOST_CREDENTIAL_DATABASE_H
#define ZELO_HOST_CREDENTIAL_DATABASE_H

#include <vector>

#include "credential_record.h"

namespace host::credential_database {

enum class Result { kDone, kAbsent, kFailed };  // kFailed and kAbsent set the last error

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

Result ReadSession(long id, ZELO_CRED_SESS &sess);
Result WriteSession(const ZELO_CRED_SESS &sess);
Result RemoveSession(long id);

}  // namespace host::credential_database

#endif
