// Taking secrets out of text that leaves the appliance.
//
// Two ways, and text that others have written goes through both: a known secret is found by its
// value, wherever and however it is written; an unknown one by the name that stands before it.

#ifndef QRMCTL_REDACTION_H
#define QRMCTL_REDACTION_H

#include <string>

#include "secret_search.h"

namespace qrmctl {

constexpr const char *kRedacted = "[redacted]";

class Redaction {
  public:
    // A secret of fewer than 4 bytes is left alone: it would be found everywhere.
    void Add(const std::string &strSecret);

    // Adds every access and csrf token of the credential store, of whatever application. False when
    // the store cannot be read.
    bool AddStored();

    // The text without the secrets: plain, with characters escaped (secret_search.h), in
    // hexadecimal, and in Base64 of either alphabet at whatever place of a longer text, also
    // wrapped over lines.
    std::string Redact(const std::string &strText) const;

  private:
    SecretSearch m_secrets;
    SecretSearch m_base64{true};  // what is the same wherever the secret begins
};

// Whether a key, a variable or a member of this name holds a secret.
bool IsSecretName(const std::string &strName);

// Each line without what follows the name of a secret. In a JSON object, the values of such members
// go, and their like in its strings; anywhere else the rest of the line. Names and passwords in
// URLs go too, and long words that look like tokens.
std::string MaskNamed(const std::string &strLines);

}  // namespace qrmctl

#endif
