// Which programs may be run, and running a folder of them: plug-ins, notification hooks, services.
//
// A program that others than root and the process's own user can write to, or that stands in a
// folder that they can write to, is refused everywhere: whoever can write there can have anything
// run as root.

#ifndef ZELO_HOST_PROGRAM_FOLDER_H
#define ZELO_HOST_PROGRAM_FOLDER_H

#include <chrono>
#include <string>
#include <vector>

#include "status.h"

namespace host {

// Looks at a single program, the file at the end of all links: the folder that it stands in, and
// each link on the way, count as well. YLIBC_ERR_EXEC when there is none, YLIBC_ERR_UNSAFE_FILE
// when others can change it.
Status CheckProgram(const std::string &strPath);

// Looks at a folder of programs below "/usr/zelo/etc". It and each one above it, up to
// "/usr/zelo/etc", must be a real folder. blThere becomes whether it is there; a missing one is no
// failure. A failure is to be logged.
Status CheckProgramFolder(const std::string &strFolder, bool &blThere);

// What the programs of a folder are run with.
struct ProgramCall {
    const char *szKind;       // for log lines: "plug-in program"
    std::string strArgument;  // the one argument of each
    std::vector<std::string> environment;
    std::chrono::seconds limit;  // for each
};

// Runs all programs of the folder, if it is there, one after the other, in the byte order of their
// names, whatever the ones before have done. A program is a regular, executable file that nobody
// else can change; a name that begins with a dot does not count, and any other file is passed over
// with a log line.
//
// A program has to end with status 0. Each that does not is worth a log line; the first of them is
// the result (YLIBC_ERR_EXEC_STATUS, or as RunProgram failed), and `status` its number as
// RunProgram gives it. `status` stays as it was when none fails, or the folder cannot be used.
Status RunProgramFolder(const std::string &strFolder, const ProgramCall &call, int &status);

}  // namespace host

#endif
