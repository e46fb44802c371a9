// Last error: why the calling thread's latest failing platform operation failed.
//
// One triple (code, source file, line) per thread. An operation that fails sets it before it
// returns; an operation that succeeds leaves it as it was, so it is only worth reading right after
// a failure. A new thread starts with code 0, file "" and line 0.

#ifndef ZELO_PLATFORM_LAST_ERROR_H
#define ZELO_PLATFORM_LAST_ERROR_H

#include "api.h"

// The codes that operations set. They are shown to people as four hexadecimal digits and are part
// of log lines, so a port keeps the numbers.
enum YLIBC_ERROR {
    YLIBC_ERR_NONE = 0x0000,
    YLIBC_ERR_OUT_OF_MEMORY = 0x0200,
    YLIBC_ERR_NOT_FOUND = 0x0300,      // the record, key or file asked for is not there
    YLIBC_ERR_EXISTS = 0x0301,         // what was to be new, or nobody else's, is there already
    YLIBC_ERR_LIMIT = 0x0302,          // no more of it may be added
    YLIBC_ERR_FILE = 0x0400,           // a file or directory could not be opened, read or written
    YLIBC_ERR_BUSY = 0x0401,           // a lock was held elsewhere for too long
    YLIBC_ERR_UNSAFE_FILE = 0x0402,    // a link, or somebody else's file, stands where ours should
    YLIBC_ERR_DEADLINE = 0x0403,       // the process's deadline ended a wait (diagnosis.h)
    YLIBC_ERR_STORE = 0x0500,          // a database refused an operation
    YLIBC_ERR_STORE_BUSY = 0x0501,     // another process kept the database locked for too long
    YLIBC_ERR_STORE_DAMAGED = 0x0502,  // the database file is damaged or of another format
    YLIBC_ERR_NETWORK = 0x0600,        // no exchange with the server was possible
    YLIBC_ERR_REPLY = 0x0601,          // the server answered, but not what was asked for
    YLIBC_ERR_UNCHANGED = 0x0602,      // the server has nothing newer than the caller's copy
    YLIBC_ERR_EXEC = 0x0700,           // a program could not be run
    YLIBC_ERR_EXEC_TIME = 0x0701,      // a program ran for too long and was ended
    YLIBC_ERR_EXEC_STATUS = 0x0702,    // a program that had to succeed ended in another way
    YLIBC_ERR_INVALID_ARGUMENT = 0x0D00  // a null or unusable argument
};

extern "C" {

// The code of the calling thread's last failure, one of YLIBC_ERROR.
ZELO_PLATFORM_API unsigned int YLIBCErrGet(void);

// The source file in which that failure was noticed, without directory or suffix. Never null; the
// text lives as long as the platform library is loaded.
ZELO_PLATFORM_API const char *YLIBCErrorGetFile(void);

// The line in that file.
ZELO_PLATFORM_API int YLIBCErrorGetLine(void);

// Sets the triple. szFile is kept as a pointer, not copied: pass a text with static storage (a
// literal); null counts as "".
ZELO_PLATFORM_API void YLIBCErrSetEx(unsigned int code, const char *szFile, int line);
}

#endif
