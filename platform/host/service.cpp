// Services: a type's services are the programs of the folder /usr/zelo/etc/service.d/TYPE. Each is
// run with the argument "reload", one after the other in the order of their names.

#include "../service.h"

#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <filesystem>
#include <new>
#include <string>
#include <system_error>
#include <vector>

#include "last_error.h"
#include "program.h"

namespace {

namespace fs = std::filesystem;

constexpr const char *kFile = "service";
constexpr const char *kServiceFolder = "/usr/zelo/etc/service.d";
constexpr std::chrono::seconds kLimit(30);

bool IsService(const fs::path &path) {
    std::error_code error;
    return path.filename().string().front() != '.' && fs::is_regular_file(path, error) &&
           access(path.c_str(), X_OK) == 0;
}

// A folder that is not there has no services.
int ListServices(const fs::path &folder, std::vector<std::string> &services) {
    std::error_code error;
    fs::directory_iterator entry(folder, error);
    for (; !error && entry != fs::directory_iterator(); entry.increment(error)) {
        if (IsService(entry->path())) {
            services.push_back(entry->path());
        }
    }
    if (error && error != std::errc::no_such_file_or_directory) {
        return HOST_FAIL(YLIBC_ERR_FILE);
    }
    std::sort(services.begin(), services.end());
    return 0;
}

int Reload(const std::string &strService) {
    const host::ProgramEnd end = host::RunProgram({strService, "reload"}, {}, kLimit);
    if (end.kind == host::ProgramEnd::Kind::kTimedOut) {
        return HOST_FAIL(YLIBC_ERR_EXEC_TIME);
    }
    const bool blDone = end.kind == host::ProgramEnd::Kind::kExited && end.value == 0;
    return blDone ? 0 : HOST_FAIL(YLIBC_ERR_EXEC);
}

}  // namespace

int YLIBServiceTypeReload(int type) {
    try {
        std::vector<std::string> services;
        int result = ListServices(fs::path(kServiceFolder) / std::to_string(type), services);
        for (const std::string &strService : services) {
            result = std::min(result, Reload(strService));
        }
        return result;
    } catch (const std::bad_alloc &) {
        return HOST_FAIL(YLIBC_ERR_OUT_OF_MEMORY);
    }
}
