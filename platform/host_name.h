// The appliance's host name.

#ifndef ZELO_PLATFORM_HOST_NAME_H
#define ZELO_PLATFORM_HOST_NAME_H

#include "api.h"

// The size of the buffer that ZELOLnxGetHostname fills.
#define ZELO_LNX_HOSTNAME_SIZE 64

extern "C" {

// Reads the host name into szHostName, a buffer of ZELO_LNX_HOSTNAME_SIZE bytes, as zero-terminated
// text. A host name may have 64 characters, one more than fit: it is cut to 63, and nothing is ever
// written past the buffer.
//
// Returns 0 or more on success, a negative value on failure, with the buffer as it was. Any thread
// may call it at any time.
ZELO_PLATFORM_API int ZELOLnxGetHostname(char *szHostName);
}

#endif
