// The host name, as the system has it.

#include "host_name.h"

#include <unistd.h>

#include <climits>
#include <new>

#include "fixed_text.h"
#include "status.h"

namespace {

constexpr const char *kFile = "host_name";

}  // namespace

int ZELOLnxGetHostname(char *szHostName) {
    if (szHostName == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    char szWhole[HOST_NAME_MAX + 1] = {};
    if (gethostname(szWhole, sizeof(szWhole)) != 0) {
        return HOST_FAIL(YLIBC_ERR_NOT_FOUND);
    }
    try {
        return CopyToFit(szHostName, ZELO_LNX_HOSTNAME_SIZE, szWhole);
    } catch (const std::bad_alloc &) {
        return HOST_FAIL(YLIBC_ERR_OUT_OF_MEMORY);
    }
}
