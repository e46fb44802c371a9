// qrmctl support: one archive with what helps to find out what is wrong, and no secret in it.

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <memory>

#include "commands.h"
#include "process.h"
#include "support_files.h"
#include "work_folder.h"

namespace qrmctl {
namespace {

namespace fs = std::filesystem;

constexpr const char *kTar = "/bin/tar";
constexpr const char *kFolder = "qrmctl-support";

bool WriteFiles(const std::string &strFolder) {
    if (mkdir(strFolder.c_str(), 0700) != 0) {
        return false;
    }
    for (const SupportFile &file : CollectSupportFiles()) {
        std::ofstream stream(strFolder + '/' + file.strName, std::ios::binary);
        stream << file.strText;
        stream.close();
        if (!stream) {
            return false;
        }
    }
    return true;
}

// Durable before it gets its name.
bool Flush(const std::string &strFile) {
    const int fd = open(strFile.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW);
    const bool blFlushed = fd >= 0 && fchmod(fd, 0600) == 0 && fsync(fd) == 0;
    if (fd >= 0) {
        close(fd);
    }
    return blFlushed;
}

// Without force, a file that has come meanwhile stays. Not every file system can rename so; those
// that cannot have links.
bool PutInPlace(const std::string &strFile, const fs::path &archive, bool blForce) {
    if (blForce) {
        return std::rename(strFile.c_str(), archive.c_str()) == 0;
    }
    return renameat2(AT_FDCWD, strFile.c_str(), AT_FDCWD, archive.c_str(), RENAME_NOREPLACE) == 0 ||
           (errno == EINVAL && link(strFile.c_str(), archive.c_str()) == 0);
}

ExitCode FailFor(const std::string &strFile, const std::string &strReason, Report &report) {
    return report.Fail(ErrorId::kArchiveNotWritten,
                       "cannot write the archive '" + strFile + "': " + strReason);
}

ExitCode Support(const std::string &strFile, bool blForce, Report &report) {
    std::error_code error;
    const fs::path archive = fs::absolute(strFile, error);
    if (error || !archive.has_filename() || fs::is_directory(archive, error)) {
        return FailFor(strFile, "it is no name of a file: name the file in its directory", report);
    }
    const char *szExists = "there is such a file: name another one, or replace it with --force";
    if (!blForce && fs::symlink_status(archive, error).type() != fs::file_type::not_found) {
        return FailFor(strFile, szExists, report);
    }
    // What is put together is nobody else's either.
    umask(077);
    const WorkFolder beside(archive);
    if (!beside.IsUsable()) {
        return FailFor(strFile, std::strerror(beside.Error()), report);
    }
    Report::Stage("collecting what goes into the archive");
    if (!WriteFiles(beside.Path(kFolder))) {
        return FailFor(strFile, "no room beside it, or another fault of the disk", report);
    }
    Report::Stage("writing the archive");
    const std::string strMade = beside.Path("archive");
    const std::string strFrom = "--directory=" + beside.Folder();
    if (YLIBCExec(kTar, "-czf", strMade.c_str(), strFrom.c_str(), kFolder) != 0 ||
        !Flush(strMade)) {
        return FailFor(strFile, "tar has failed: is there room, and are tar and gzip installed?",
                       report);
    }
    if (!PutInPlace(strMade, archive, blForce)) {
        return FailFor(strFile, errno == EEXIST ? szExists : std::strerror(errno), report);
    }
    report.Fact("path", strFile);
    report.Say("Look the archive through before you pass it on: README.txt in it says what it is.");
    return report.Done();
}

}  // namespace

void AddSupport(CommandHandle program, Action &action) {
    const CommandHandle command =
        program.Add("support", "Write an archive for support, without any secret");
    const auto pFile = std::make_shared<std::string>();
    const auto pForce = std::make_shared<bool>(false);
    command.Text("FILE", *pFile, "The archive").ValueName("FILE").Required();
    command.Flag("--force", *pForce, "Replace a file that is there");
    command.RunsWhenChosen([pFile, pForce, &action] {
        action = [pFile, pForce](Report &report) { return Support(*pFile, *pForce, report); };
    });
}

}  // namespace qrmctl
