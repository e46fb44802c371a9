// Running a program as its user does: arguments and standard input in; exit status, standard output
// and standard error out.

#ifndef ZELO_TESTS_RUN_PROGRAM_H
#define ZELO_TESTS_RUN_PROGRAM_H

#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <csignal>
#include <cstdio>
#include <functional>
#include <memory>
#include <string>
#include <thread>
#include <vector>

namespace run_program {

// Waits until it is so, for at most 60 s; returns whether it became so.
inline bool Until(const std::function<bool()> &isSo) {
    const auto end = std::chrono::steady_clock::now() + std::chrono::seconds(60);
    while (!isSo()) {
        if (std::chrono::steady_clock::now() > end) {
            return false;
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(1));
    }
    return true;
}

struct Outcome {
    int status;  // 127 when it cannot be run; of one that a signal ended, minus its number
    std::string strOut;
    std::string strErr;
};

// A running program. It does not outlive its scope, nor the test. Its standard streams are files,
// so it never waits for a reader.
class Program {
  public:
    // The command: the program's path, then its arguments.
    explicit Program(std::vector<std::string> command, const std::string &strInput = {}) {
        std::fputs(strInput.c_str(), m_streams[0].get());
        std::rewind(m_streams[0].get());
        std::vector<char *> arguments;
        arguments.reserve(command.size() + 1);
        for (std::string &strArgument : command) {
            arguments.push_back(strArgument.data());
        }
        arguments.push_back(nullptr);
        m_pid = fork();
        if (m_pid == 0) {
            for (int fd = 0; fd < 3; ++fd) {
                dup2(fileno(m_streams[fd].get()), fd);
            }
            prctl(PR_SET_PDEATHSIG, SIGKILL);
            execv(arguments[0], arguments.data());
            _exit(127);
        }
    }
    ~Program() {
        Signal(SIGKILL);
        Wait();
    }

    void Signal(int signal) const {
        if (m_pid > 0) {
            kill(m_pid, signal);
        }
    }
    // Waits for its end; one that does not come to it by itself is killed.
    Outcome Wait() {
        int status = 127 << 8;  // as of a program that cannot be run
        if (m_pid > 0 && !Until([&] { return waitpid(m_pid, &status, WNOHANG) == m_pid; })) {
            Signal(SIGKILL);
            waitpid(m_pid, &status, 0);
        }
        m_pid = -1;
        return {WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status),
                Read(m_streams[1].get()), Read(m_streams[2].get())};
    }

  private:
    static std::string Read(FILE *pFile) {
        std::rewind(pFile);
        std::string strText;
        for (int c = 0; (c = std::fgetc(pFile)) != EOF;) {
            strText += static_cast<char>(c);
        }
        return strText;
    }

    struct File : std::unique_ptr<FILE, int (*)(FILE *)> {
        File() : unique_ptr(std::tmpfile(), std::fclose) {}
    };
    File m_streams[3];
    pid_t m_pid = -1;
};

inline Outcome Run(std::vector<std::string> command, const std::string &strInput = {}) {
    return Program(std::move(command), strInput).Wait();
}

}  // namespace run_program

#endif
