// The appliance's own certificate authorities: every PEM file (*.pem, *.crt) of the folder
// "/usr/zelo/etc/ssl/ca.d/". They are trusted besides the system's.

#ifndef ZELO_HOST_APPLIANCE_CA_H
#define ZELO_HOST_APPLIANCE_CA_H

#include <openssl/x509.h>

namespace host {

// Adds the folder's certificates to the store. A folder that is not there holds none. Returns
// false, with a log line that names the file, when a file cannot be read as certificates: trusting
// less than the operator meant is an error too.
bool AddApplianceCa(X509_STORE *pStore);

}  // namespace host

#endif
