// Processes: a program without a shell, and a look at a process.

#include "process.h"

#include <poll.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <csignal>
#include <string>
#include <vector>

#include "files/time_limit.h"
#include "program.h"
#include "program_folder.h"
#include "status.h"

namespace {

constexpr const char *kLimitKey = "exec_timeout";
constexpr std::chrono::seconds kDefaultLimit(60);

}  // namespace

int YLIBCExec(const char *szProgram, const char *szArgument1, const char *szArgument2,
              const char *szArgument3, const char *szArgument4) {
    int status = 0;
    return HOST_OPERATION(-1, status, [&]() -> host::Status {
        HOST_REQUIRE(szProgram != nullptr);
        std::vector<std::string> arguments = {szProgram};
        for (const char *szArgument : {szArgument1, szArgument2, szArgument3, szArgument4}) {
            if (szArgument == nullptr) {
                break;
            }
            arguments.emplace_back(szArgument);
        }
        HOST_TRY(host::CheckProgram(szProgram));
        return host::RunProgram(arguments, {}, host::TimeLimit(kLimitKey, kDefaultLimit), status);
    });
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
