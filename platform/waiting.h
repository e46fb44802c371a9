// What the process waits for. It may be asked in any thread, and waits for no other.

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
}

#endif
