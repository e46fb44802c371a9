#include "command_line.h"

#include "help.h"
#include "suggestion.h"

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

std::string UsageMessage(const CLI::App *pApp, const CLI::Error &error) {
    const std::string strUnknown = suggestion::UnknownWord(*pApp);
    const std::string strWhat = strUnknown.empty() ? error.what() : strUnknown;
    return "qrm-devserver: " + strWhat + (strWhat.back() == '?' ? " " : "; ") +
           "'qrm-devserver --help' shows the options\n";
}

}  // namespace

void AddCommandLine(CLI::App &app, Options &options, Files &files) {
    app.description(std::string(kSummary) + "\n" + kText);
    app.footer(kExamples);
    app.formatter(std::make_shared<help::Formatter>());
    app.failure_message(UsageMessage);
    app.set_version_flag("--version", "qrm-devserver " ZELO_VERSION, "Show the version");
    app.add_option("--token-file", files.token, "File with the access token")
        ->type_name("FILE")
        ->required();
    app.add_option("--http-port", options.http_port, "Port for HTTP, 0 for a free one")
        ->type_name("N")
        ->check(CLI::Range(0, 65535))
        ->capture_default_str();
    app.add_option("--https-port", options.https_port, "Port for HTTPS, 0 for a free one")
        ->type_name("N")
        ->check(CLI::Range(0, 65535))
        ->capture_default_str();
    app.add_option("--ports-file", files.ports, "File to write the ports to, as JSON")
        ->type_name("FILE");
    app.add_option("--ca-file", files.ca, "File to write the authority's certificate to, as PEM")
        ->type_name("FILE");
    app.add_option("--host", options.host, "Loopback address to listen on")
        ->type_name("ADDRESS")
        ->capture_default_str()
        ->check([](const std::string &strHost) {
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
