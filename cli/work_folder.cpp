#include "work_folder.h"

#include <cerrno>
#include <cstdlib>
#include <system_error>

namespace qrmctl {

WorkFolder::WorkFolder(const std::filesystem::path &file)
    : m_strFolder(file.parent_path() / ('.' + file.filename().string() + ".XXXXXX")) {
    if (mkdtemp(m_strFolder.data()) == nullptr) {
        m_error = errno;
        m_strFolder.clear();
    }
}

WorkFolder::~WorkFolder() {
    std::error_code ignored;
    if (!m_strFolder.empty()) {
        std::filesystem::remove_all(m_strFolder, ignored);
    }
}

}  // namespace qrmctl
