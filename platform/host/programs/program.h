// Running a program to its end: for every service of the host platform that starts one.

#ifndef ZELO_HOST_PROGRAM_H
#define ZELO_HOST_PROGRAM_H

#include <chrono>
#include <string>
#include <vector>

namespace host {

struct ProgramEnd {
    enum class Kind {
        kNotRun,  // it could not be started (value: the errno of that), or its end is not known (0)
        kTimedOut,   // it ran for too long and was ended with its whole process group
        kExited,     // value: its exit status, 0 to 255
        kSignalled,  // value: the signal that ended it
    };
    Kind kind = Kind::kNotRun;
    int value = 0;
};

// Runs a program and waits for its end, at most for the limit. arguments[0] is its path; there is
// no shell and no search. Each "NAME=value" of the environment is added to the caller's environment
// or takes the place of its variable.
//
// The program has the caller's working directory, the null device as its standard streams and no
// other open files, no blocked or ignored signals, and a process group of its own. What it leaves
// running behind it runs on. The caller may have any number of threads, do with SIGCHLD and with
// its children what it wants, and have its standard streams closed; it is sent no signal. When it
// dies, the program and its time limit go on.
//
// Throws std::bad_alloc, and nothing else, before anything is started. The last error is not set.
ProgramEnd RunProgram(const std::vector<std::string> &arguments,
                      const std::vector<std::string> &environment, std::chrono::milliseconds limit);

}  // namespace host

#endif
