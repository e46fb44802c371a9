// Services: a type's services are the programs of the folder /usr/zelo/etc/service.d/TYPE, which
// are run with the argument "reload".

#include "service.h"

#include <chrono>
#include <new>
#include <string>

#include "program_folder.h"
#include "status.h"

namespace {

constexpr const char *kFile = "service";
constexpr const char *kServiceFolder = "/usr/zelo/etc/service.d/";
constexpr std::chrono::seconds kLimit(30);

}  // namespace

int YLIBServiceTypeReload(int type) {
    try {
        host::ProgramEnd first;
        if (!host::RunProgramFolder(kServiceFolder + std::to_string(type),
                                    {"service", "reload", {}, kLimit}, first)) {
            return -1;
        }
        const bool blDone = first.kind == host::ProgramEnd::Kind::kExited && first.value == 0;
        return blDone ? 0 : HOST_FAIL(host::LastErrorOf(first));
    } catch (const std::bad_alloc &) {
        return HOST_FAIL(YLIBC_ERR_OUT_OF_MEMORY);
    }
}
