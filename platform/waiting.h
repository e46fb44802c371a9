// What the process waits for, and giving up on it: for a program that ends itself at a deadline,
// and is to tell what kept it. Both may be called in any thread, and wait for no other.

#ifndef ZELO_PLATFORM_WAITING_H
#define ZELO_PLATFORM_WAITING_H

#include "api.h"

extern "C" {

// Writes what an operation of the platform waits for at this moment in this process, such as
// "running '/usr/zelo/etc/rc.d/S99zelocache.sh status'", into the buffer of cb bytes, cut to fit
// and zero-terminated; of several, what has been waited for longest. It names a program, a lock
// file, a store or a server with its port, and holds nothing secret. Returns the text's length, 0
// when nothing is waited for; -1 for a null buffer or one without room
// (YLIBC_ERR_INVALID_ARGUMENT).
ZELO_PLATFORM_API int ZELOWaitingFor(char *sz, int cb);

// Ends the programs that operations of the platform run at this moment in this process, each with
// its process group; other children of the process are left alone. The operations that run them do
// not return any more, and none runs another program: the caller is about to end the process.
// It comes back when the programs have ended, after half a second at most.
ZELO_PLATFORM_API void ZELOWaitingGiveUp();
}

#endif
