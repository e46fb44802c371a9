// Child processes of a test.

#ifndef ZELO_TESTS_CHILDREN_H
#define ZELO_TESTS_CHILDREN_H

#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <csignal>
#include <functional>
#include <vector>

namespace children {

// Starts a child process that runs the body and ends, with status 0 when the body returns true.
inline pid_t Start(const std::function<bool()> &body) {
    const pid_t pid = fork();
    if (pid == 0) {
        _exit(body() ? 0 : 1);
    }
    return pid;
}

// Waits for the end of a child. True when its body returned true.
inline bool Ended(pid_t pid) {
    int status = -1;
    waitpid(pid, &status, 0);
    return WIFEXITED(status) && WEXITSTATUS(status) == 0;
}

// Runs the body in a process of its own.
inline bool InOne(const std::function<bool()> &body) {
    return Ended(Start(body));
}

// Runs the body in so many processes at once, each with its number. True when it was in all.
inline bool InEach(int processes, const std::function<bool(int process)> &body) {
    std::vector<pid_t> pids(static_cast<std::size_t>(processes));
    for (int process = 0; process < processes; ++process) {
        pids[static_cast<std::size_t>(process)] = Start([&] { return body(process); });
    }
    return std::count_if(pids.begin(), pids.end(), Ended) == processes;
}

// False for one that had ended by itself.
inline bool Kill(pid_t pid) {
    kill(pid, SIGKILL);
    int status = 0;
    waitpid(pid, &status, 0);
    return WIFSIGNALED(status);
}

// With this one process tells another that it has come to a point.
class Signal {
  public:
    Signal() { m_blOpen = pipe(m_fds) == 0; }
    Signal(const Signal &) = delete;
    Signal &operator=(const Signal &) = delete;
    ~Signal() {
        close(m_fds[0]);
        close(m_fds[1]);
    }
    bool Give() const { return m_blOpen && write(m_fds[1], "\n", 1) == 1; }
    bool Await() const {
        char c = 0;
        return m_blOpen && read(m_fds[0], &c, 1) == 1;
    }
    // Becomes the standard input of a program that is executed next.
    bool BecomeInput() const { return dup2(m_fds[0], STDIN_FILENO) == STDIN_FILENO; }

  private:
    int m_fds[2] = {-1, -1};
    bool m_blOpen = false;
};

}  // namespace children

#endif
