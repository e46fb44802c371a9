// The JSON text of a value: to a string and back, to a file and back.

#ifndef ZELO_JSON_TEXT_H
#define ZELO_JSON_TEXT_H

#include <json/value.h>
#include <sys/stat.h>

#include "json.h"

namespace json_text {

using json::FromString;
using json::ToString;

// Reads and parses a file; returns whether it succeeded, with the value unchanged when not. Only a
// regular file of at most 64 MiB is read. *pStatus, when given, becomes the status of the very file
// that was opened.
bool FromFile(const char *szPath, Json::Value &value, struct stat *pStatus = nullptr);

// Writes the value's JSON text and a line feed to an open file in the place of its content,
// durably; returns whether it succeeded.
bool ToFile(const Json::Value &value, int fd);

}  // namespace json_text

#endif
