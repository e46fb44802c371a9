#include "password_hash.h"

#include <crypt.h>

#include <cerrno>
#include <cstring>
#include <memory>

namespace host {
namespace {

// yescrypt, libcrypt's strongest method. It reads a password to its end; others stop after 72
// bytes.
constexpr const char *kMethod = "$y$";

struct WipeAndDelete {
    void operator()(crypt_data *pData) const {
        explicit_bzero(pData, sizeof(*pData));
        delete pData;
    }
};

}  // namespace

Status HashPassword(const char *szPassword, std::string &strHash) {
    char szSetting[CRYPT_GENSALT_OUTPUT_SIZE];
    const std::unique_ptr<crypt_data, WipeAndDelete> pData(new crypt_data());
    if (crypt_gensalt_rn(kMethod, 0, nullptr, 0, szSetting, sizeof(szSetting)) == nullptr) {
        return HOST_ERROR(
            YLIBC_ERR_NOT_FOUND,
            std::string("cannot hash passwords with yescrypt: ") + std::strerror(errno));
    }
    const char *const szHash = crypt_rn(szPassword, szSetting, pData.get(), sizeof(*pData));
    if (szHash == nullptr) {
        return HOST_ERROR(YLIBC_ERR_INVALID_ARGUMENT,
                          std::string("cannot hash the password: ") + std::strerror(errno));
    }
    strHash = szHash;
    return {};
}

}  // namespace host
