// The command line of qrm-devserver. Its manual page and completions are made from the same table.

#ifndef DEVSERVER_COMMAND_LINE_H
#define DEVSERVER_COMMAND_LINE_H

#include <string>
#include <vector>

#include "command.h"
#include "dev_server.h"
#include "option_table.h"

namespace devserver {

constexpr const char *kSummary = "A QRM server for development, on loopback";
constexpr const char *kVersion = "qrm-devserver " ZELO_VERSION;

enum ExitCode { kDone = 0, kFailed = 1, kUsage = 2 };

struct Files {
    std::string token;
    std::string ports;
    std::string ca;
};

// Adds everything to the program. The options and files are set when the line is parsed; both have
// to outlive the program.
void AddCommandLine(command::CommandHandle program, Options &options, Files &files);

const std::vector<option_table::ExitStatus> &ExitStatuses();

}  // namespace devserver

#endif
