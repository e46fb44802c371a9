#include "password_hash.h"

#include <crypt.h>

#include <cstring>
#include <memory>

#include "status.h"

namespace host {
namespace {

constexpr const char *kFile = "password_hash";

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

bool HashPassword(const char *szPassword, std::string &strHash) {
    char szSetting[CRYPT_GENSALT_OUTPUT_SIZE];
    const std::unique_ptr<crypt_data, WipeAndDelete> pData(new crypt_data());
    if (crypt_gensalt_rn(kMethod, 0, nullptr, 0, szSetting, sizeof(szSetting)) == nullptr) {
        HOST_FAIL(YLIBC_ERR_NOT_FOUND);
        return false;
    }
    const char *const szHash = crypt_rn(szPassword, szSetting, pData.get(), sizeof(*pData));
    if (szHash == nullptr) {
        HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
        return false;
    }
    strHash = szHash;
    return true;
}

}  // namespace host
