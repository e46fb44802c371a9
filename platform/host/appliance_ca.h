// The appliance's own certificate authorities: every PEM file (*.pem, *.crt) of the folder
// "/usr/zelo/etc/ssl/ca.d/". They are trusted besides the system's.

#ifndef ZELO_HOST_APPLIANCE_CA_H
#define ZELO_HOST_APPLIANCE_CA_H

#include <openssl/x509.h>
#include <sys/stat.h>
#include <sys/types.h>

#include <ctime>
#include <string>
#include <utility>
#include <vector>

namespace host {

// Adds the folder's certificates to the store. A folder that is not there holds none. Returns
// false, with a log line that names the file, when a file cannot be read as certificates: trusting
// less than the operator meant is an error too.
bool AddApplianceCa(X509_STORE *pStore);

// One state of the folder. It ends when a file comes, goes, is replaced or written to.
class CaState {
  public:
    // The state that the folder is in now.
    static CaState Now();

    // Whether the folder is still in this state.
    bool Holds() const;

  private:
    struct Version {
        dev_t device = 0;
        ino_t inode = 0;
        off_t size = 0;
        timespec changed = {};

        bool operator==(const Version &other) const;
    };
    static Version Look(const std::string &strPath);
    void Add(const std::string &strPath) { m_entries.emplace_back(strPath, Look(strPath)); }

    // The folder and its files.
    std::vector<std::pair<std::string, Version>> m_entries;
};

}  // namespace host

#endif
