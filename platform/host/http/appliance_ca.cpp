#include "appliance_ca.h"

#include <fcntl.h>
#include <openssl/bio.h>
#include <openssl/err.h>
#include <openssl/pem.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <memory>
#include <new>
#include <string>
#include <system_error>
#include <utility>

#include "diagnosis.h"
#include "printable.h"
#include "status.h"

namespace host {
namespace {

namespace fs = std::filesystem;

constexpr const char *kFile = "appliance_ca";
constexpr const char *kFolder = "/usr/zelo/etc/ssl/ca.d";

struct FreeBio {
    void operator()(BIO *pBio) const { BIO_free(pBio); }
};
struct CloseFile {
    void operator()(std::FILE *pFile) const { static_cast<void>(std::fclose(pFile)); }
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

// A regular file; nobody is waited for who might write to a pipe.
std::unique_ptr<std::FILE, CloseFile> Open(const std::string &strPath) {
    const int fd = open(strPath.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY);
    struct stat status = {};
    std::unique_ptr<std::FILE, CloseFile> pFile(fd < 0 ? nullptr : fdopen(fd, "r"));
    if (pFile == nullptr && fd >= 0) {
        close(fd);
    }
    const bool blRegular = pFile != nullptr && fstat(fd, &status) == 0 && S_ISREG(status.st_mode);
    return blRegular ? std::move(pFile) : nullptr;
}

// Instead of OpenSSL's own, which asks at the terminal.
int NoPassword(char * /*szPassword*/, int /*cbPassword*/, int /*purpose*/, void * /*pContext*/) {
    return -1;
}

// True when the file holds at least one certificate and nothing broken.
bool AddFile(X509_STORE *pStore, const std::string &strPath) {
    const auto pStream = Open(strPath);
    const std::unique_ptr<BIO, FreeBio> pFile(
        pStream == nullptr ? nullptr : BIO_new_fp(pStream.get(), BIO_NOCLOSE));
    if (pFile == nullptr) {
        return false;
    }
    int count = 0;
    while (true) {
        const std::unique_ptr<X509, FreeCertificate> pCertificate(
            PEM_read_bio_X509(pFile.get(), nullptr, NoPassword, nullptr));
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

// Adds the folder's certificates; on failure strPath says what cannot be read.
bool AddFolder(X509_STORE *pStore, std::string &strPath) {
    std::error_code error;
    fs::directory_iterator entries(kFolder, error);
    if (error == std::errc::no_such_file_or_directory) {
        return true;
    }
    bool blAll = true;
    strPath = kFolder;
    for (; blAll && !error && entries != fs::directory_iterator(); entries.increment(error)) {
        if (IsPemName(entries->path())) {
            strPath = entries->path().string();
            blAll = AddFile(pStore, strPath);
        }
    }
    ERR_clear_error();
    // An error on the way leaves the iterator at its end.
    strPath = error ? kFolder : strPath;
    return blAll && !error;
}

}  // namespace

bool AddApplianceCa(X509_STORE *pStore) {
    std::string strPath;
    const bool blAll = AddFolder(pStore, strPath);
    if (!blAll) {
        syslog(LOG_ERR, "%s:%d cannot read certificates from '%s': mend or remove it", kFile,
               __LINE__, printable::Line(strPath).c_str());
    }
    return blAll;
}

}  // namespace host

int ZELODiagnosisAuthorities() {
    int count = 0;
    return HOST_OPERATION(-1, count, [&]() -> host::Status {
        const std::unique_ptr<X509_STORE, host::FreeStore> pStore(X509_STORE_new());
        std::string strPath;
        if (pStore == nullptr) {
            throw std::bad_alloc();
        }
        if (!host::AddFolder(pStore.get(), strPath)) {
            return HOST_ERROR(YLIBC_ERR_FILE, "cannot read certificates from '" + strPath + "'");
        }
        count = sk_X509_OBJECT_num(X509_STORE_get0_objects(pStore.get()));
        return {};
    });
}
