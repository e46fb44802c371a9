// Child processes of a row: what is measured from a process's beginning, and a server that shares
// nothing with the process that it is measured from.

#ifndef ZELO_BENCH_CHILD_PROCESS_H
#define ZELO_BENCH_CHILD_PROCESS_H

#include <sys/types.h>

#include <functional>
#include <string>
#include <vector>

namespace bench {

// The access token that the server wants.
constexpr const char *kServerToken = "secret-0123456789";

// The method whose reply is always the same.
constexpr const char *kConstantApi = "ZELO.QRM.RPC";
constexpr const char *kConstantMethod = "info";

// Runs the body in a child process and returns its number; -1 when the child died.
double InChild(const std::function<double()> &body);

// Runs a program with its output going nowhere. True when it went well.
bool RunProgram(std::vector<const char *> arguments);

// A development server in a process of its own, trusted by the appliance until the next one. Ends
// with its owner.
class ServerProcess {
  public:
    ServerProcess();  // throws
    ~ServerProcess();
    ServerProcess(const ServerProcess &) = delete;
    ServerProcess &operator=(const ServerProcess &) = delete;

    int Port(const std::string &strProtocol) const {
        return strProtocol == "https" ? m_https : m_http;
    }
    std::string Url(const std::string &strProtocol, const std::string &strPath) const;

    // Makes it the server that the appliance has joined, with a credential and a session.
    void Join(const std::string &strProtocol) const;

  private:
    pid_t m_pid = -1;
    int m_http = 0;
    int m_https = 0;
};

}  // namespace bench

#endif
