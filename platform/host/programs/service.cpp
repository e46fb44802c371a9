// Services: a type's services are the programs of the folder /usr/zelo/etc/service.d/TYPE, which
// are run with the argument "reload".

#include "service.h"

#include <chrono>
#include <string>

#include "program_folder.h"
#include "status.h"

namespace {

constexpr const char *kServiceFolder = "/usr/zelo/etc/service.d/";
constexpr std::chrono::seconds kLimit(30);

}  // namespace

int YLIBServiceTypeReload(int type) {
    return HOST_OPERATION([&] {
        int status = 0;
        return host::RunProgramFolder(kServiceFolder + std::to_string(type),
                                      {"service", "reload", {}, kLimit}, status);
    });
}
