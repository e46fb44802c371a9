#include "child_process.h"

#include <fcntl.h>

#include <spawn.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <csignal>
#include <filesystem>
#include <fstream>
#include <limits>

#include "bare_exchange.h"
#include "dev_server.h"
#include "ratio_table.h"
#include "zeloqrmclient.h"

namespace bench {
namespace {

constexpr const char *kStore = "/usr/zelo/etc/credentials/credentials.db";

// A child that writes one value for its parent to read. It ends when its parent does.
template <typename Value>
class Child {
  public:
    explicit Child(const std::function<void(int fd)> &body) {
        std::array<int, 2> ends = {-1, -1};
        Require(pipe(ends.data()) == 0, "cannot make a pipe");
        m_pid = fork();
        if (m_pid == 0) {
            prctl(PR_SET_PDEATHSIG, SIGKILL);
            body(ends[1]);
            _exit(0);
        }
        close(ends[1]);
        m_blRead = m_pid > 0 && read(ends[0], &m_value, sizeof(m_value)) == sizeof(m_value);
        close(ends[0]);
    }
    bool Read(Value &value) const {
        value = m_blRead ? m_value : value;
        return m_blRead;
    }
    pid_t Pid() const { return m_pid; }

  private:
    pid_t m_pid = -1;
    bool m_blRead = false;
    Value m_value = {};
};

template <typename Value>
void Tell(int fd, const Value &value) {
    static_cast<void>(!write(fd, &value, sizeof(value)));
}

using Ports = std::array<int, 2>;

void Serve(int fd) {
    devserver::Options options;
    options.token = kServerToken;
    devserver::DevServer server(options);
    devserver::NextAnswer constant;
    constant.method = kConstantMethod;
    constant.body = R"({"success":true,"data":{"name":"qrm-devserver","clients":1}})";
    constant.times = std::numeric_limits<int>::max();
    server.AnswerNext(kConstantApi, constant);
    std::string strReason;
    if (server.Start(strReason)) {
        std::filesystem::create_directories(kAuthorities);
        std::ofstream(kAuthority) << server.CaPem();
        Tell(fd, Ports{server.HttpPort(), server.HttpsPort()});
        pause();
    }
}

}  // namespace

double InChild(const std::function<double()> &body) {
    const Child<double> child([&body](int fd) { Tell(fd, body()); });
    double number = -1;
    child.Read(number);
    waitpid(child.Pid(), nullptr, 0);
    return number;
}

bool RunProgram(std::vector<const char *> arguments) {
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, "/dev/null", O_WRONLY, 0);
    arguments.push_back(nullptr);
    pid_t pid = -1;
    const int error = posix_spawnp(&pid, arguments[0], &actions, nullptr,
                                   const_cast<char **>(arguments.data()), environ);
    posix_spawn_file_actions_destroy(&actions);
    int status = -1;
    return error == 0 && waitpid(pid, &status, 0) == pid && status == 0;
}

ServerProcess::ServerProcess() {
    const Child<Ports> child(Serve);
    m_pid = child.Pid();
    Ports ports = {};
    Require(child.Read(ports), "cannot start the development server");
    m_http = ports[0];
    m_https = ports[1];
}

ServerProcess::~ServerProcess() {
    kill(m_pid, SIGKILL);
    waitpid(m_pid, nullptr, 0);
}

std::string ServerProcess::Url(const std::string &strProtocol, const std::string &strPath) const {
    return strProtocol + "://localhost:" + std::to_string(Port(strProtocol)) + strPath;
}

void ServerProcess::Join(const std::string &strProtocol) const {
    Json::Value cred;
    cred["application"] = "ZELO.QRM";
    cred["host"] = "localhost";
    cred["protocol"] = strProtocol;
    cred["port"] = Port(strProtocol);
    cred["access_token"] = kServerToken;
    std::filesystem::remove(kStore);
    // In a child: this process may be about to show what a first call costs.
    const double result =
        InChild([&cred] { return ZELOQRMClientCreateServerCredential(cred) ? 0.0 : -1.0; });
    Require(result == 0, "cannot store the credential");
}

}  // namespace bench
