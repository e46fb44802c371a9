#include "authority_folder.h"

#include <openssl/err.h>
#include <openssl/pem.h>

#include <algorithm>
#include <filesystem>
#include <new>
#include <system_error>

#include "certificate_facts.h"
#include "files/trusted_file.h"

namespace host {
namespace {

namespace fs = std::filesystem;

// Instead of OpenSSL's own, which asks at the terminal.
int NoPassword(char * /*szPassword*/, int /*cbPassword*/, int /*purpose*/, void * /*pContext*/) {
    return -1;
}

bool IsPemName(const fs::path &path) {
    return path.extension() == ".pem" || path.extension() == ".crt";
}

Status Unreadable(const std::string &strPath) {
    return HOST_ERROR(YLIBC_ERR_FILE, "cannot read certificates from '" + strPath +
                                          "', so that no server is trusted over https: mend or "
                                          "remove it");
}

Status ReadNames(std::vector<AuthorityFile> &files) {
    std::error_code error;
    fs::directory_iterator entries(kAuthorityFolder, error);
    if (error == std::errc::no_such_file_or_directory) {
        return {};
    }
    for (; !error && entries != fs::directory_iterator(); entries.increment(error)) {
        if (IsPemName(entries->path())) {
            files.push_back({entries->path().string(), {}});
        }
    }
    if (error) {
        return Unreadable(kAuthorityFolder);
    }
    std::sort(files.begin(), files.end(),
              [](const auto &one, const auto &other) { return one.strPath < other.strPath; });
    return {};
}

bool ReadFile(AuthorityFile &file) {
    FoundFile found;
    std::string strPem;
    return !FindFile(file.strPath.c_str(), found).Failed() && found.blThere &&
           !ReadContent(found, strPem).Failed() &&
           !ReadCertificates(strPem, file.certificates).Failed();
}

}  // namespace

Status ReadCertificates(const std::string &strPem, std::vector<Certificate> &certificates) {
    const Bio pPem(BIO_new_mem_buf(strPem.data(), static_cast<int>(strPem.size())));
    if (pPem == nullptr) {
        throw std::bad_alloc();
    }
    while (true) {
        Certificate pCertificate(PEM_read_bio_X509(pPem.get(), nullptr, NoPassword, nullptr));
        if (pCertificate == nullptr) {
            // The end of the text shows as a missing start line.
            const bool blEnd = ERR_GET_REASON(ERR_peek_last_error()) == PEM_R_NO_START_LINE;
            ERR_clear_error();
            return blEnd && !certificates.empty()
                       ? Status()
                       : HOST_ERROR(YLIBC_ERR_INVALID_ARGUMENT, "it is no certificate as PEM text");
        }
        certificates.push_back(std::move(pCertificate));
    }
}

Status ReadAuthorities(std::vector<AuthorityFile> &files) {
    HOST_TRY(ReadNames(files));
    for (AuthorityFile &file : files) {
        if (!ReadFile(file)) {
            return Unreadable(file.strPath);
        }
    }
    return {};
}

Status AddAuthorities(X509_STORE *pStore) {
    std::vector<AuthorityFile> files;
    HOST_TRY(ReadAuthorities(files));
    for (const AuthorityFile &file : files) {
        for (const Certificate &pCertificate : file.certificates) {
            if (X509_STORE_add_cert(pStore, pCertificate.get()) != 1) {
                throw std::bad_alloc();
            }
        }
    }
    return {};
}

}  // namespace host
