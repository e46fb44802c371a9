// The host name, as the system has it.

#include "host_name.h"

#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstring>

#include "fixed_text.h"
#include "status.h"

int ZELOLnxGetHostname(char *szHostName) {
    int cb = 0;
    return HOST_OPERATION(-1, cb, [&]() -> host::Status {
        HOST_REQUIRE(szHostName != nullptr);
        char szWhole[HOST_NAME_MAX + 1] = {};
        if (gethostname(szWhole, sizeof(szWhole)) != 0) {
            return HOST_ERROR(YLIBC_ERR_NOT_FOUND,
                              std::string("the system has no host name: ") + std::strerror(errno));
        }
        cb = CopyToFit(szHostName, ZELO_LNX_HOSTNAME_SIZE, szWhole);
        return {};
    });
}
