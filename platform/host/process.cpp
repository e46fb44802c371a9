// Processes: a program without a shell, and a look at a process.

#include "../process.h"

#include <poll.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <charconv>
#include <chrono>
#include <csignal>
#include <new>
#include <string>
#include <system_error>
#include <vector>

#include "key_value_lookup.h"
#include "last_error.h"
#include "program.h"

namespace {

constexpr const char *kFile = "process";
constexpr int kDefaultLimit_s = 60;
constexpr int kSignalledBase = 128;

// A key that is not there is no failure of the caller's operation: the last error stays as it was.
bool FindSetting(const char *szKey, std::string &strValue) {
    const unsigned int code = YLIBCErrGet();
    const char *const szErrorFile = YLIBCErrorGetFile();
    const int line = YLIBCErrorGetLine();
    const bool blFound =
        host::LookUpKey(host::kConfigFile, szKey, strValue) == host::LookUp::kFound;
    YLIBCErrSetEx(code, szErrorFile, line);
    return blFound;
}

std::chrono::seconds Limit() {
    std::string strLimit;
    int limit_s = 0;
    if (!FindSetting("exec_timeout", strLimit)) {
        return std::chrono::seconds(kDefaultLimit_s);
    }
    const char *const szEnd = strLimit.data() + strLimit.size();
    const std::from_chars_result read = std::from_chars(strLimit.data(), szEnd, limit_s);
    const bool blValid = read.ec == std::errc() && read.ptr == szEnd && limit_s > 0;
    return std::chrono::seconds(blValid ? limit_s : kDefaultLimit_s);
}

}  // namespace

int YLIBCExec(const char *szProgram, const char *szArgument1, const char *szArgument2,
              const char *szArgument3, const char *szArgument4) {
    if (szProgram == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    try {
        std::vector<std::string> arguments = {szProgram};
        for (const char *szArgument : {szArgument1, szArgument2, szArgument3, szArgument4}) {
            if (szArgument == nullptr) {
                break;
            }
            arguments.emplace_back(szArgument);
        }
        const host::ProgramEnd end = host::RunProgram(arguments, {}, Limit());
        switch (end.kind) {
            case host::ProgramEnd::Kind::kExited:
                return end.value;
            case host::ProgramEnd::Kind::kSignalled:
                return kSignalledBase + end.value;
            case host::ProgramEnd::Kind::kTimedOut:
                return HOST_FAIL(YLIBC_ERR_EXEC_TIME);
            default:
                return HOST_FAIL(YLIBC_ERR_EXEC);
        }
    } catch (const std::bad_alloc &) {
        return HOST_FAIL(YLIBC_ERR_OUT_OF_MEMORY);
    }
}

int YLIBCProcAlive(int pid) {
    if (pid <= 0) {
        return 0;
    }
    // Needs no right over the process, and costs no more than signal 0 when there is none.
    const int fd = static_cast<int>(syscall(SYS_pidfd_open, pid, 0));
    if (fd >= 0) {
        pollfd end = {fd, POLLIN, 0};
        const bool blEnded = poll(&end, 1, 0) == 1;
        close(fd);
        return blEnded ? 0 : 1;
    }
    // EINVAL, on newer systems ENOENT: the id belongs to a thread.
    if (errno == ESRCH || errno == EINVAL || errno == ENOENT) {
        return 0;
    }
    return kill(pid, 0) == 0 || errno == EPERM ? 1 : 0;
}
