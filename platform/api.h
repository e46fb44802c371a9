// Linkage of the platform's operations.
//
// Every operation under platform/ that is a plain function has C linkage, so that a port may be
// written in C as well as in C++. ZELO_PLATFORM_API marks what a platform library has to export.

#ifndef ZELO_PLATFORM_API_H
#define ZELO_PLATFORM_API_H

// Exports an operation from the platform library.
#define ZELO_PLATFORM_API __attribute__((visibility("default")))

#endif
