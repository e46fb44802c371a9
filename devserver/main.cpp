// The development QRM server as a program: listens, says where in the ports file, and serves until
// it is told to end (SIGINT or SIGTERM).

#include <fcntl.h>
#include <pthread.h>
#include <sys/file.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <iostream>

#include "command_line.h"
#include "console_page.h"
#include "dev_server.h"
#include "json.h"

namespace {

constexpr std::size_t kMaxToken = 4096;

using devserver::Files;

bool Complain(const std::string &strLine) {
    std::cerr << "qrm-devserver: " << strLine << std::endl;
    return false;
}

bool ReadToken(const std::string &strFile, std::string &strToken) {
    std::ifstream file(strFile, std::ios::binary);
    std::string strText(kMaxToken + 1, '\0');
    file.read(strText.data(), static_cast<std::streamsize>(strText.size()));
    if (!file.eof() && !file.good()) {
        return Complain("cannot read token file '" + strFile + "': name a file that can be read");
    }
    strText.resize(static_cast<std::size_t>(file.gcount()));
    for (char c : {'\n', '\r'}) {
        if (!strText.empty() && strText.back() == c) {
            strText.pop_back();
        }
    }
    if (strText.empty() || strText.size() >= kMaxToken ||
        strText.find_first_of(std::string("\n\0", 2)) != std::string::npos) {
        return Complain("cannot use token file '" + strFile +
                        "': it has to hold the access token as its one line of text");
    }
    strToken = strText;
    return true;
}

// A server that is killed leaves its ports file, and whoever waits for the next server's would read
// the old ports. The file of a server that runs is locked, and stays.
bool RemoveOldPorts(const std::string &strFile) {
    const int fd = open(strFile.c_str(), O_RDONLY | O_NONBLOCK | O_NOFOLLOW | O_CLOEXEC);
    const bool blInUse = fd >= 0 && flock(fd, LOCK_SH | LOCK_NB) != 0 && errno == EWOULDBLOCK;
    if (fd >= 0) {
        close(fd);
    }
    if (blInUse) {
        return Complain("cannot use ports file '" + strFile +
                        "': another server that runs has it; name another file");
    }
    return unlink(strFile.c_str()) == 0 || errno == ENOENT ||
           Complain("cannot remove old ports file '" + strFile + "': " + std::strerror(errno) +
                    "; remove it, or name another file");
}

enum class Lock { kNone, kUntilTheEnd };

// A reader sees the whole file or none; in its first moment it has another name. A lock lasts until
// the process ends.
bool WriteFile(const std::string &strFile, const std::string &strText, Lock lock) {
    std::string strTemporary = strFile + ".XXXXXX";
    const int fd = mkstemp(strTemporary.data());
    const bool blWritten = fd >= 0 && write(fd, strText.data(), strText.size()) ==
                                          static_cast<ssize_t>(strText.size());
    const bool blReady = fd >= 0 && (lock == Lock::kNone ? close(fd) : flock(fd, LOCK_EX)) == 0;
    if (blWritten && blReady && std::rename(strTemporary.c_str(), strFile.c_str()) == 0) {
        return true;
    }
    const int error = errno;
    if (fd >= 0) {
        unlink(strTemporary.c_str());
    }
    return Complain("cannot write '" + strFile + "': " + std::strerror(error) +
                    "; name a file in a directory that can be written");
}

bool Announce(const devserver::DevServer &server, const std::string &strHost, const Files &files) {
    Json::Value ports;
    std::string strPorts;
    ports["http_port"] = server.HttpPort();
    ports["https_port"] = server.HttpsPort();
    json::ToString(ports, strPorts);
    // Who waits for the ports file finds the authority's certificate in place.
    if ((!files.ca.empty() && !WriteFile(files.ca, server.CaPem(), Lock::kNone)) ||
        (!files.ports.empty() && !WriteFile(files.ports, strPorts + "\n", Lock::kUntilTheEnd))) {
        return false;
    }
    const bool blColons = strHost.find(':') != std::string::npos;
    const std::string strUrlHost = blColons ? "[" + strHost + "]" : strHost;
    std::cout << "qrm-devserver: http://" << strUrlHost << ":" << server.HttpPort() << " https://"
              << strUrlHost << ":" << server.HttpsPort()
              << "\nqrm-devserver: the console is http://" << strUrlHost << ":" << server.HttpPort()
              << devserver::kConsolePath << std::endl;
    return true;
}

int Serve(const devserver::Options &options, const Files &files) {
    // Blocked before the server's threads start, so that no thread but this one gets them.
    sigset_t ends;
    sigemptyset(&ends);
    sigaddset(&ends, SIGINT);
    sigaddset(&ends, SIGTERM);
    pthread_sigmask(SIG_BLOCK, &ends, nullptr);

    devserver::DevServer server(options);
    std::string strReason;
    if (!server.Start(strReason)) {
        Complain(strReason);
        return devserver::kFailed;
    }
    if (!Announce(server, options.host, files)) {
        return devserver::kFailed;
    }
    int signal = 0;
    sigwait(&ends, &signal);
    if (!files.ports.empty()) {
        unlink(files.ports.c_str());
    }
    return EXIT_SUCCESS;
}

// Help goes to standard output, wrong usage to standard error.
int TellUsage(const command::Stop &stop) {
    if (!stop.blWrong) {
        std::cout << stop.strText;
        return devserver::kDone;
    }
    Complain(stop.strText + (stop.strText.back() == '?' ? " " : "; ") +
             "'qrm-devserver --help' shows the options");
    return devserver::kUsage;
}

int Run(int argc, char **argv) {
    devserver::Options options;
    Files files;
    command::Program program("qrm-devserver", devserver::kSummary, devserver::kVersion);
    devserver::AddCommandLine(program.Root(), options, files);
    if (const auto stop = program.Read(argc, argv)) {
        return TellUsage(*stop);
    }
    if ((!files.ports.empty() && !RemoveOldPorts(files.ports)) ||
        !ReadToken(files.token, options.token)) {
        return devserver::kFailed;
    }
    return Serve(options, files);
}

}  // namespace

int main(int argc, char **argv) {
    try {
        return Run(argc, argv);
    } catch (const std::exception &error) {
        std::fprintf(stderr, "qrm-devserver: cannot go on: %s\n", error.what());
        return devserver::kFailed;
    }
}
