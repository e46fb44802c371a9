#include "certificate_authorities.h"

#include <openssl/x509v3.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <cstring>

#include "authority_folder.h"
#include "certificate_facts.h"
#include "file_system.h"
#include "files/file_replacement.h"
#include "fork_guard.h"
#include "printable.h"

namespace host {
namespace {

struct Authority {
    ZELO::ServerCertificate facts;
    std::string strPem;
    std::string strPath;
};
using Authorities = std::vector<Authority>;

Authority Describe(X509 *pCertificate, const std::string &strPath) {
    return {ReadCertificate(pCertificate), PemOf(pCertificate), strPath};
}

Status List(Authorities &authorities) {
    const InsideLibcurl inside;
    std::vector<AuthorityFile> files;
    HOST_TRY(ReadAuthorities(files));
    for (const AuthorityFile &file : files) {
        for (const Certificate &pCertificate : file.certificates) {
            authorities.push_back(Describe(pCertificate.get(), file.strPath));
        }
    }
    return {};
}

Status RequireAuthority(X509 *pCertificate, const std::string &strSubject) {
    const std::string strWho = "'" + printable::Line(strSubject) + "' ";
    if (X509_check_ca(pCertificate) == 0) {
        return HOST_ERROR(YLIBC_ERR_INVALID_ARGUMENT, strWho + "is no certificate authority");
    }
    if (X509_cmp_current_time(X509_get0_notBefore(pCertificate)) > 0) {
        return HOST_ERROR(YLIBC_ERR_INVALID_ARGUMENT,
                          strWho + "is not valid yet: check this appliance's clock");
    }
    if (X509_cmp_current_time(X509_get0_notAfter(pCertificate)) < 0) {
        return HOST_ERROR(YLIBC_ERR_INVALID_ARGUMENT,
                          strWho + "has expired: check this appliance's clock");
    }
    return {};
}

Status ReadNew(const char *szPem, Authorities &authorities) {
    const InsideLibcurl inside;
    std::vector<Certificate> certificates;
    HOST_TRY(ReadCertificates(szPem, certificates));
    for (const Certificate &pCertificate : certificates) {
        Authority authority = Describe(pCertificate.get(), "");
        HOST_TRY(RequireAuthority(pCertificate.get(), authority.facts.strSubject));
        authority.strPath =
            std::string(kAuthorityFolder) + '/' + authority.facts.strFingerprint + ".pem";
        authorities.push_back(std::move(authority));
    }
    return {};
}

Status Write(const std::string &strPath, const std::string &strPem) {
    FoundFile found;
    HOST_TRY(FindFile(strPath.c_str(), found));
    return ReplaceFile(found, strPem);
}

bool IsThere(const Authorities &authorities, const std::string &strFingerprint) {
    return std::any_of(authorities.begin(), authorities.end(), [&](const Authority &authority) {
        return authority.facts.strFingerprint == strFingerprint;
    });
}

Status Add(const char *szPem) {
    Authorities added;
    Authorities there;
    HOST_TRY(ReadNew(szPem, added));
    HOST_TRY(List(there));
    if (ZELOFSMkdirP(kAuthorityFolder, 0, 1, 0, 0, 0755) < 0) {
        return HOST_ERROR(YLIBCErrGet(), std::string("cannot make '") + kAuthorityFolder + "'");
    }
    for (const Authority &authority : added) {
        if (!IsThere(there, authority.facts.strFingerprint)) {
            HOST_TRY(Write(authority.strPath, authority.strPem));
        }
    }
    return {};
}

// As ReadCertificate writes it: lower-case digits without colons.
std::string Plain(const char *szFingerprint) {
    std::string strPlain;
    for (const char *sz = szFingerprint; *sz != '\0'; ++sz) {
        if (*sz != ':') {
            strPlain += static_cast<char>(std::tolower(static_cast<unsigned char>(*sz)));
        }
    }
    return strPlain;
}

// Writes the file without the certificate, or removes it when it holds no other.
Status RemoveFrom(const std::string &strPath, const std::string &strFingerprint,
                  const Authorities &authorities) {
    std::string strRest;
    for (const Authority &authority : authorities) {
        if (authority.strPath == strPath && authority.facts.strFingerprint != strFingerprint) {
            strRest += authority.strPem;
        }
    }
    if (!strRest.empty()) {
        return Write(strPath, strRest);
    }
    return unlink(strPath.c_str()) == 0
               ? Status()
               : HOST_ERROR(YLIBC_ERR_FILE,
                            "cannot remove '" + strPath + "': " + std::strerror(errno));
}

Status Remove(const char *szFingerprint) {
    const std::string strFingerprint = Plain(szFingerprint);
    Authorities authorities;
    HOST_TRY(List(authorities));
    if (!IsThere(authorities, strFingerprint)) {
        return HOST_ERROR(YLIBC_ERR_NOT_FOUND, "there is no authority with the fingerprint '" +
                                                   printable::Line(szFingerprint) + "' in '" +
                                                   kAuthorityFolder + "'");
    }
    std::string strLast;
    for (const Authority &authority : authorities) {
        if (authority.facts.strFingerprint == strFingerprint && authority.strPath != strLast) {
            strLast = authority.strPath;
            HOST_TRY(RemoveFrom(strLast, strFingerprint, authorities));
        }
    }
    return {};
}

}  // namespace
}  // namespace host

int ZELOCertAuthorityAdd(const char *szPem) {
    return HOST_OPERATION([&]() -> host::Status {
        HOST_REQUIRE(szPem != nullptr);
        return host::Add(szPem);
    });
}

int ZELOCertAuthorityList(ZELO_CERT_AUTHORITY_READER pfnRead, void *pContext) {
    return HOST_OPERATION([&]() -> host::Status {
        HOST_REQUIRE(pfnRead != nullptr);
        host::Authorities authorities;
        HOST_TRY(host::List(authorities));
        for (const host::Authority &authority : authorities) {
            const ZELO::ServerCertificate &facts = authority.facts;
            const ZELO_CERT_AUTHORITY record = {facts.strFingerprint.c_str(),
                                                facts.strSubject.c_str(),
                                                facts.notBefore,
                                                facts.notAfter,
                                                authority.strPath.c_str(),
                                                authority.strPem.c_str()};
            pfnRead(pContext, &record);
        }
        return {};
    });
}

int ZELOCertAuthorityRemove(const char *szFingerprint) {
    return HOST_OPERATION([&]() -> host::Status {
        HOST_REQUIRE(szFingerprint != nullptr);
        return host::Remove(szFingerprint);
    });
}
