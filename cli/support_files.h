// What goes into a support archive, as texts from which the secrets are taken.

#ifndef QRMCTL_SUPPORT_FILES_H
#define QRMCTL_SUPPORT_FILES_H

#include <string>
#include <vector>

namespace qrmctl {

struct SupportFile {
    std::string strName;
    std::string strText;
};

// Looks at everything and changes nothing; the server is asked as by "qrmctl doctor".
std::vector<SupportFile> CollectSupportFiles();

}  // namespace qrmctl

#endif
