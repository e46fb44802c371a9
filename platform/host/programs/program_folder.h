// Folders of programs: plug-ins, notification hooks and services are run from them.

#ifndef ZELO_HOST_PROGRAM_FOLDER_H
#define ZELO_HOST_PROGRAM_FOLDER_H

#include <chrono>
#include <string>
#include <vector>

#include "program.h"

namespace host {

// Whether the programs of a folder below "/usr/zelo/etc" may be run. The folder and each one above
// it, up to
// "/usr/zelo/etc", must be a real folder that only root and the process's own user can change:
// whoever else can write to it can put a program of root's there. kRefused sets the last error and
// writes a log line.
enum class ProgramFolder { kUsable, kMissing, kRefused };
ProgramFolder CheckProgramFolder(const std::string &strFolder);

// What the programs of a folder are run with.
struct ProgramCall {
    const char *szKind;       // for log lines: "plug-in program"
    std::string strArgument;  // the one argument of each
    std::vector<std::string> environment;
    std::chrono::seconds limit;  // for each
};

// Runs all programs of the folder one after the other, in the byte order of their names, whatever
// the ones before have done. A program is a regular, executable file that only root and the
// process's own user can change; a name that begins with a dot does not count, and any other file
// is passed over with a log line. So is each program that fails.
//
// `first` becomes how the first failing program ended, kExited with 0 when none failed or the
// folder is missing. Returns false when the folder is refused or cannot be read, with the last
// error set.
bool RunProgramFolder(const std::string &strFolder, const ProgramCall &call, ProgramEnd &first);

// The last error of a program that did not end with status 0.
unsigned int LastErrorOf(const ProgramEnd &end);

}  // namespace host

#endif
