// Input files of the commands: checked before anything is done with them.

#ifndef QRMCTL_INPUT_FILE_H
#define QRMCTL_INPUT_FILE_H

#include <json/value.h>

#include <cstddef>
#include <string>

namespace qrmctl {

// A longer text would come back from the credential store cut.
constexpr std::size_t kMaxStoredText = 1023;

// Each returns whether the input can be used; if not, strError says in one line what is wrong with
// which file. "-" is standard input; how the user writes that is szStandardInput. szWhat names the
// input in messages, such as "candidate list". Nothing may follow the JSON value.
bool ReadJsonFile(const char *szWhat, const std::string &strFile, Json::Value &value,
                  std::string &strError, const char *szStandardInput = "-");

// The parameters of a call, an object: JSON text, or @FILE; null for an empty text.
bool ReadParams(const std::string &strText, Json::Value &params, std::string &strError);

// The access token: the one line of a file.
bool ReadTokenFile(const std::string &strFile, std::string &strToken, std::string &strError);

}  // namespace qrmctl

#endif
