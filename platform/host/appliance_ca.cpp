#include "appliance_ca.h"

#include <openssl/bio.h>
#include <openssl/err.h>
#include <openssl/pem.h>
#include <sys/stat.h>
#include <syslog.h>

#include <algorithm>
#include <filesystem>
#include <memory>
#include <new>
#include <string>
#include <system_error>

namespace host {
namespace {

namespace fs = std::filesystem;

constexpr const char *kFile = "appliance_ca";
constexpr const char *kFolder = "/usr/zelo/etc/ssl/ca.d";

struct FreeBio {
    void operator()(BIO *pBio) const { BIO_free(pBio); }
};
struct FreeCertificate {
    void operator()(X509 *pCertificate) const { X509_free(pCertificate); }
};

struct FreeStore {
    void operator()(X509_STORE *pStore) const { X509_STORE_free(pStore); }
};

bool IsPemName(const fs::path &path) {
    return path.extension() == ".pem" || path.extension() == ".crt";
}

// True when the file holds at least one certificate and nothing broken.
bool AddFile(X509_STORE *pStore, const std::string &strPath) {
    const std::unique_ptr<BIO, FreeBio> pFile(BIO_new_file(strPath.c_str(), "r"));
    if (pFile == nullptr) {
        return false;
    }
    int count = 0;
    while (true) {
        const std::unique_ptr<X509, FreeCertificate> pCertificate(
            PEM_read_bio_X509(pFile.get(), nullptr, nullptr, nullptr));
        if (pCertificate == nullptr) {
            // The end of the file shows as a missing start line.
            return count > 0 && ERR_GET_REASON(ERR_peek_last_error()) == PEM_R_NO_START_LINE;
        }
        if (X509_STORE_add_cert(pStore, pCertificate.get()) != 1) {
            return false;
        }
        ++count;
    }
}

// Adds every file of the folder. Returns what cannot be read, empty when there is nothing.
std::string AddFolder(X509_STORE *pStore) {
    std::error_code error;
    fs::directory_iterator entries(kFolder, error);
    if (error == std::errc::no_such_file_or_directory) {
        return {};
    }
    bool blAll = !error;
    std::string strPath = kFolder;
    for (; blAll && entries != fs::directory_iterator(); entries.increment(error)) {
        if (IsPemName(entries->path())) {
            strPath = entries->path().string();
            blAll = AddFile(pStore, strPath);
        }
        blAll = blAll && !error;
    }
    ERR_clear_error();
    return blAll ? std::string() : strPath;
}

}  // namespace

bool AddApplianceCa(X509_STORE *pStore) {
    const std::string strUnreadable = AddFolder(pStore);
    if (!strUnreadable.empty()) {
        syslog(LOG_ERR, "%s:%d cannot read certificates from '%s': mend or remove it", kFile,
               __LINE__, strUnreadable.c_str());
    }
    return strUnreadable.empty();
}

std::string UnreadableCa() {
    const std::unique_ptr<X509_STORE, FreeStore> pStore(X509_STORE_new());
    if (pStore == nullptr) {
        throw std::bad_alloc();
    }
    return AddFolder(pStore.get());
}

CaState CaState::Now() {
    CaState state;
    // The folder first: what comes while it is read makes another state later.
    state.Add(kFolder);
    std::error_code error;
    fs::directory_iterator entries(kFolder, error);
    for (; !error && entries != fs::directory_iterator(); entries.increment(error)) {
        if (IsPemName(entries->path())) {
            state.Add(entries->path().string());
        }
    }
    return state;
}

bool CaState::Holds() const {
    return std::all_of(m_entries.begin(), m_entries.end(),
                       [](const auto &entry) { return Look(entry.first) == entry.second; });
}

bool CaState::Version::operator==(const Version &other) const {
    return device == other.device && inode == other.inode && size == other.size &&
           changed.tv_sec == other.changed.tv_sec && changed.tv_nsec == other.changed.tv_nsec;
}

CaState::Version CaState::Look(const std::string &strPath) {
    struct stat status = {};
    // What is not there looks the same each time.
    if (stat(strPath.c_str(), &status) != 0) {
        status = {};
    }
    return {status.st_dev, status.st_ino, status.st_size, status.st_ctim};
}

}  // namespace host
