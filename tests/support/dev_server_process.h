// A development server in a process of its own. A test that forks has to be without threads: a
// child process starts with the locks that other threads held at that moment, and waits for them
// for ever.

#ifndef ZELO_TESTS_DEV_SERVER_PROCESS_H
#define ZELO_TESTS_DEV_SERVER_PROCESS_H

#include <json/value.h>
#include <sys/types.h>

#include <string>

#include "dev_server.h"

// The server's operations, with the same meaning; what fails where the server would not is a
// failure of the test.
class DevServerProcess {
  public:
    explicit DevServerProcess(const devserver::Options &options) : m_options(options) {}
    ~DevServerProcess();
    DevServerProcess(const DevServerProcess &) = delete;
    DevServerProcess &operator=(const DevServerProcess &) = delete;

    void Start();
    int HttpPort() const { return m_ports.http; }
    int HttpsPort() const { return m_ports.https; }
    const std::string &CaPem() const { return m_strCaPem; }

    void AnswerNext(const std::string &strApi, const devserver::NextAnswer &answer) const;
    void ForgetAnswers() const { Ask("DELETE", "/dev/next"); }
    Json::Value Requests() const { return Ask("GET", "/dev/requests"); }
    void ForgetRequests() const { Ask("DELETE", "/dev/requests"); }
    Json::Value Clients() const { return Ask("GET", "/dev/clients"); }
    Json::Value Log() const { return Ask("GET", "/dev/log"); }

  private:
    struct Ports {
        int http = 0;
        int https = 0;
    };
    [[noreturn]] void Serve(int fd) const;
    Json::Value Ask(const std::string &strMethod, const std::string &strPath,
                    const std::string &strBody = {}) const;

    devserver::Options m_options;
    pid_t m_pid = -1;
    Ports m_ports;
    std::string m_strCaPem;
};

#endif
