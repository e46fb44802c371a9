#include "command_line.h"

namespace devserver {
namespace {

constexpr const char *kText =
    "The server speaks the wire protocol over HTTP and HTTPS, shows what it was asked, and answers "
    "with faults when it is told to, at the endpoints below /dev/. Everything is kept in memory. "
    "It "
    "says where it listens and serves until SIGINT or SIGTERM.";
constexpr const char *kExamples =
    "printf 'secret\\n' > token\n"
    "qrm-devserver --token-file token --https-port 8443 \\\n"
    "    --ports-file ports.json --ca-file ca.pem";

}  // namespace

void AddCommandLine(command::CommandHandle program, Options &options, Files &files) {
    program.Explain(kText, kExamples);
    program.Text("--token-file", files.token, "File with the access token")
        .ValueName("FILE")
        .Required();
    program.Number("--http-port", options.http_port, "Port for HTTP, 0 for a free one")
        .ValueName("N")
        .Between(0, 65535)
        .ShowsDefault();
    program.Number("--https-port", options.https_port, "Port for HTTPS, 0 for a free one")
        .ValueName("N")
        .Between(0, 65535)
        .ShowsDefault();
    program.Text("--ports-file", files.ports, "File to write the ports to, as JSON")
        .ValueName("FILE");
    program.Text("--ca-file", files.ca, "File to write the authority's certificate to, as PEM")
        .ValueName("FILE");
    program.Text("--host", options.host, "Loopback address to listen on")
        .ValueName("ADDRESS")
        .ShowsDefault()
        .Checked([](const std::string &strHost) {
            return IsLoopback(strHost)
                       ? std::string()
                       : "'" + strHost + "' is no loopback address; name 127.0.0.1 or ::1";
        });
}

const std::vector<option_table::ExitStatus> &ExitStatuses() {
    static const std::vector<option_table::ExitStatus> statuses = {
        {kDone, nullptr, "Ended by SIGINT or SIGTERM."},
        {kFailed, nullptr, "A port or a file cannot be used; standard error says which."},
        {kUsage, nullptr, "Wrong usage; standard error says which word."},
    };
    return statuses;
}

}  // namespace devserver
