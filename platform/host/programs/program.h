// Running a program to its end: for every service of the host platform that starts one.

#ifndef ZELO_HOST_PROGRAM_H
#define ZELO_HOST_PROGRAM_H

#include <chrono>
#include <string>
#include <vector>

#include "status.h"

namespace host {

// Runs a program and waits for its end, at most for the limit and until the process's deadline.
// arguments[0] is its path; there is no shell and no search. Each "NAME=value" of the environment
// is added to the caller's environment or takes the place of its variable.
//
// The program has the caller's working directory, the null device as its standard streams and no
// other open files, no blocked or ignored signals, and a process group of its own. What it leaves
// running behind it runs on. The caller may have any number of threads, do with SIGCHLD and with
// its children what it wants, and have its standard streams closed; it is sent no signal. When it
// dies, the program and its time limit go on.
//
// `status` becomes the number by which shells name the end: the exit status, 128 plus the signal's
// number, 124 for a program that had to be ended with its whole group (YLIBC_ERR_EXEC_TIME or
// YLIBC_ERR_DEADLINE) and 126 for one that was not run (YLIBC_ERR_EXEC, or YLIBC_ERR_DEADLINE when
// the deadline was over). Any exit status is a success.
Status RunProgram(const std::vector<std::string> &arguments,
                  const std::vector<std::string> &environment, std::chrono::seconds limit,
                  int &status);

}  // namespace host

#endif
