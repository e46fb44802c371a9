// Processes: running a program to its end, and asking whether a process is alive.
//
// A failure sets the last error (last_error.h); the operations may be called in any thread, at any
// time.

#ifndef ZELO_PLATFORM_PROCESS_H
#define ZELO_PLATFORM_PROCESS_H

#include "api.h"

extern "C" {

// Runs the program at the path szProgram with up to four arguments; the first null ends them. No
// shell is involved, no folder is searched, and an argument reaches the program as it is, be it
// empty. The program gets the caller's environment and working directory, no open files (its
// standard streams lead to the null device), no blocked or ignored signals, and a process group of
// its own. What it leaves running behind it runs on.
//
// A program that others than root and the caller can write to is refused (YLIBC_ERR_UNSAFE_FILE),
// and so is one that they can put another one in the place of: by a folder on the way to it, or by
// one that a link on that way stands in.
//
// The operation waits for the program's end. A program that runs for longer than the platform's
// limit, or past the process's deadline (diagnosis.h), is ended with its whole process group.
// Whatever the caller does with SIGCHLD, with other children of its own or with its standard
// streams changes nothing, and no ended child is left to it.
//
// Returns the program's exit status, 0 to 255, or 128 plus the signal's number for a program that a
// signal ended. Returns a negative value when the program could not be run (YLIBC_ERR_EXEC; a null
// path is YLIBC_ERR_INVALID_ARGUMENT) or had to be ended (YLIBC_ERR_EXEC_TIME, YLIBC_ERR_DEADLINE).
// Past the deadline no program is started.
ZELO_PLATFORM_API int YLIBCExec(const char *szProgram, const char *szArgument1,
                                const char *szArgument2, const char *szArgument3,
                                const char *szArgument4);

// Whether a process is alive: 1 when it is, also when it belongs to another user; 0 when there is
// none with this id, or it has ended and only waits for its parent to ask (a zombie). A process
// whose first thread has ended is alive while another runs. An id of 0 or below belongs to no
// process, and neither does the id of a thread that is not its process's first. Ids are used again
// by the system: a new process with an old id counts as alive.
ZELO_PLATFORM_API int YLIBCProcAlive(int pid);
}

#endif
