// Linkage of the platform's operations.
//
// Every operation under platform/ that is a plain function has C linkage. The headers are C++ all
// the same, and web_api_request.h has classes, std::string and Json::Value in its operations: at
// least the part of a port that includes them is C++, built with the compiler and the JsonCpp of
// the library. ZELO_PLATFORM_API marks what a platform library has to export.
//
// The library refers to these symbols with the version ZELOHOST_1. A port gives them that version,
// by a version script as platform/host/zelohost.map; otherwise the dynamic linker warns of it, or
// refuses the port when it has versions of its own.

#ifndef ZELO_PLATFORM_API_H
#define ZELO_PLATFORM_API_H

// Exports an operation from the platform library.
#define ZELO_PLATFORM_API __attribute__((visibility("default")))

#endif
