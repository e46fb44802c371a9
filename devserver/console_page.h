// The console: a page for people that shows who joined and what was logged. It is drawn in the
// browser, from GET /dev/clients and GET /dev/log.

#ifndef ZELO_DEV_CONSOLE_PAGE_H
#define ZELO_DEV_CONSOLE_PAGE_H

#include <optional>
#include <string>

#include "reply.h"

namespace devserver {

constexpr const char *kConsolePath = "/dev/console";

// The file of the console that stands at the path, if one does. Its headers keep a browser from
// running or loading anything but the console's own files.
std::optional<Reply> ConsoleFile(const std::string &strPath);

}  // namespace devserver

#endif
