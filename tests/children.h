// Child processes of a test.

#ifndef ZELO_TESTS_CHILDREN_H
#define ZELO_TESTS_CHILDREN_H

#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <functional>

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

inline void Kill(pid_t pid) {
    kill(pid, SIGKILL);
    waitpid(pid, nullptr, 0);
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
