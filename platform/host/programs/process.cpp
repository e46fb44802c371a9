// Processes: a program without a shell, and a look at a process.

#include "process.h"

#include <poll.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <csignal>
#include <new>
#include <string>
#include <vector>

#include "files/time_limit.h"
#include "program.h"
#include "status.h"

namespace {

constexpr const char *kFile = "process";
constexpr const char *kLimitKey = "exec_timeout";
constexpr std::chrono::seconds kDefaultLimit(60);
constexpr int kSignalledBase = 128;

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
        const host::ProgramEnd end =
            host::RunProgram(arguments, {}, host::TimeLimit(kLimitKey, kDefaultLimit));
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
