// A folder of our own beside a file that is being made, so that the file can be renamed into place.

#ifndef QRMCTL_WORK_FOLDER_H
#define QRMCTL_WORK_FOLDER_H

#include <filesystem>
#include <string>

namespace qrmctl {

// Removed with what is left in it.
class WorkFolder {
  public:
    explicit WorkFolder(const std::filesystem::path &file);
    ~WorkFolder();
    WorkFolder(const WorkFolder &) = delete;
    WorkFolder &operator=(const WorkFolder &) = delete;

    bool IsUsable() const { return !m_strFolder.empty(); }
    std::string Path(const std::string &strName) const { return m_strFolder + '/' + strName; }
    const std::string &Folder() const { return m_strFolder; }

    // Why it is not usable, as errno says it.
    int Error() const { return m_error; }

  private:
    std::string m_strFolder;
    int m_error = 0;
};

}  // namespace qrmctl

#endif
