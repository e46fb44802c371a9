#include "dev_server_process.h"

#include <gtest/gtest.h>
#include <httplib.h>
#include <json/writer.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>

#include "json.h"

DevServerProcess::~DevServerProcess() {
    if (m_pid > 0) {
        kill(m_pid, SIGKILL);
        waitpid(m_pid, nullptr, 0);
    }
}

// In the child process: says the ports and the authority's certificate, or why there are none.
void DevServerProcess::Serve(int fd) const {
    prctl(PR_SET_PDEATHSIG, SIGKILL);
    devserver::DevServer server(m_options);
    std::string strText;
    const bool blStarted = server.Start(strText);
    if (blStarted) {
        strText = server.CaPem();
    }
    const Ports ports{server.HttpPort(), server.HttpsPort()};
    if (write(fd, &blStarted, sizeof(blStarted)) < 0 || write(fd, &ports, sizeof(ports)) < 0 ||
        write(fd, strText.data(), strText.size()) < 0) {
        _exit(1);
    }
    close(fd);
    for (;;) {
        pause();
    }
}

void DevServerProcess::Start() {
    int fds[2] = {-1, -1};
    ASSERT_TRUE(pipe2(fds, O_CLOEXEC) == 0 && (m_pid = fork()) >= 0);
    if (m_pid == 0) {
        close(fds[0]);
        Serve(fds[1]);
    }
    close(fds[1]);
    bool blStarted = false;
    char sz[4096];
    ssize_t cb = read(fds[0], &blStarted, sizeof(blStarted));
    cb = read(fds[0], &m_ports, sizeof(m_ports));
    while ((cb = read(fds[0], sz, sizeof(sz))) > 0) {
        m_strCaPem.append(sz, static_cast<std::size_t>(cb));
    }
    close(fds[0]);
    ASSERT_TRUE(blStarted) << m_strCaPem;
}

Json::Value DevServerProcess::Ask(const std::string &strMethod, const std::string &strPath,
                                  const std::string &strBody) const {
    httplib::Client client("127.0.0.1", m_ports.http);
    client.set_read_timeout(60);  // a busy machine may keep the server from answering
    httplib::Request request;
    request.method = strMethod;
    request.path = strPath;
    request.body = strBody;
    Json::Value reply;
    const httplib::Result result = client.send(request);
    EXPECT_TRUE(result && result->status == 200 && json::FromString(result->body, reply))
        << strMethod << ' ' << strPath << ": " << (result ? result->body : "no reply");
    return reply;
}

void DevServerProcess::AnswerNext(const std::string &strApi,
                                  const devserver::NextAnswer &answer) const {
    Json::Value next;
    next["api"] = strApi;
    next["method"] = answer.method;
    next["delay_ms"] = answer.delay_ms;
    next["bytes_per_s"] = answer.bytes_per_s;
    next["endless"] = answer.endless;
    next["no_length"] = answer.no_length;
    next["no_reply"] = answer.no_reply;
    next["closes"] = answer.closes;
    next["times"] = answer.times;
    next["headers"] = Json::objectValue;
    for (const auto &[strName, strValue] : answer.headers) {
        next["headers"][strName] = strValue;
    }
    const auto set = [&next](const char *szName, const auto &value) {
        if (value) {
            next[szName] = *value;
        }
    };
    set("status", answer.status);
    set("body", answer.body);
    set("error_code", answer.error_code);
    set("cut_after", answer.cut_after);
    Json::StreamWriterBuilder builder;
    builder["emitUTF8"] = true;  // a body may be no text at all
    Ask("POST", "/dev/next", Json::writeString(builder, next));
}
