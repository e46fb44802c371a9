#include "program_folder.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <filesystem>
#include <string_view>
#include <utility>

#include "printable.h"
#include "status.h"

namespace host {
namespace {

constexpr const char *kFile = "program_folder";
constexpr std::string_view kTopFolder = "/usr/zelo/etc";

bool OthersCanChange(const struct stat &status) {
    return (status.st_uid != 0 && status.st_uid != geteuid()) ||
           (status.st_mode & (S_IWGRP | S_IWOTH)) != 0;
}

ProgramFolder Refuse(const std::string &strFolder, const char *szReason, unsigned int code,
                     int line) {
    syslog(LOG_ERR, "%s:%d nothing in the folder '%s' is run: %s", kFile, line,
           printable::Line(strFolder).c_str(), szReason);
    Fail(code, kFile, line);
    return ProgramFolder::kRefused;
}

// Why the file is no program to run; null when it is one.
const char *WhyNoProgram(const char *szPath) {
    struct stat status = {};
    if (lstat(szPath, &status) != 0) {
        return std::strerror(errno);
    }
    if (!S_ISREG(status.st_mode)) {
        return "it is no regular file";
    }
    if (OthersCanChange(status)) {
        return "it can be changed by others than root";
    }
    return faccessat(AT_FDCWD, szPath, X_OK, AT_EACCESS) == 0 ? nullptr : "it is not executable";
}

// The paths of the programs in the order of their names.
bool ListPrograms(const std::string &strFolder, std::vector<std::string> &programs) {
    std::error_code error;
    std::filesystem::directory_iterator entry(strFolder, error);
    for (; !error && entry != std::filesystem::directory_iterator(); entry.increment(error)) {
        std::string strPath = entry->path().string();
        if (entry->path().filename().string().front() == '.') {
            continue;
        }
        if (const char *const szReason = WhyNoProgram(strPath.c_str()); szReason != nullptr) {
            syslog(LOG_WARNING, "%s:%d '%s' is not run: %s", kFile, __LINE__,
                   printable::Line(strPath).c_str(), szReason);
            continue;
        }
        programs.push_back(std::move(strPath));
    }
    if (error) {
        Refuse(strFolder, std::strerror(error.value()), YLIBC_ERR_FILE, __LINE__);
        return false;
    }
    std::sort(programs.begin(), programs.end());
    return true;
}

std::string Describe(const ProgramEnd &end, std::chrono::seconds limit) {
    switch (end.kind) {
        case ProgramEnd::Kind::kNotRun:
            return end.value == 0 ? "its end is not known"
                                  : std::string("it could not be run: ") + std::strerror(end.value);
        case ProgramEnd::Kind::kTimedOut:
            return "it took longer than " + std::to_string(limit.count()) + " s and was ended";
        case ProgramEnd::Kind::kSignalled:
            return "signal " + std::to_string(end.value) + " ended it";
        default:
            return "exit status " + std::to_string(end.value);
    }
}

bool Succeeded(const ProgramEnd &end) {
    return end.kind == ProgramEnd::Kind::kExited && end.value == 0;
}

}  // namespace

ProgramFolder CheckProgramFolder(const std::string &strFolder) {
    for (std::size_t end = kTopFolder.size();; end = strFolder.find('/', end + 1)) {
        const std::string strPart = strFolder.substr(0, end);
        struct stat status = {};
        if (lstat(strPart.c_str(), &status) != 0) {
            return errno == ENOENT
                       ? ProgramFolder::kMissing
                       : Refuse(strPart, std::strerror(errno), YLIBC_ERR_FILE, __LINE__);
        }
        if (!S_ISDIR(status.st_mode)) {
            return Refuse(strPart, "it is no folder", YLIBC_ERR_UNSAFE_FILE, __LINE__);
        }
        if (OthersCanChange(status)) {
            return Refuse(strPart, "it can be changed by others than root", YLIBC_ERR_UNSAFE_FILE,
                          __LINE__);
        }
        if (end == std::string::npos) {
            return ProgramFolder::kUsable;
        }
    }
}

bool RunProgramFolder(const std::string &strFolder, const ProgramCall &call, ProgramEnd &first) {
    first = {ProgramEnd::Kind::kExited, 0};
    const ProgramFolder folder = CheckProgramFolder(strFolder);
    std::vector<std::string> programs;
    if (folder == ProgramFolder::kUsable && !ListPrograms(strFolder, programs)) {
        return false;
    }
    for (const std::string &strProgram : programs) {
        const ProgramEnd end =
            RunProgram({strProgram, call.strArgument}, call.environment, call.limit);
        if (Succeeded(end)) {
            continue;
        }
        syslog(LOG_ERR, "%s:%d %s '%s' failed for '%s': %s", kFile, __LINE__, call.szKind,
               printable::Line(strProgram).c_str(), printable::Line(call.strArgument).c_str(),
               Describe(end, call.limit).c_str());
        first = Succeeded(first) ? end : first;
    }
    return folder != ProgramFolder::kRefused;
}

unsigned int LastErrorOf(const ProgramEnd &end) {
    switch (end.kind) {
        case ProgramEnd::Kind::kNotRun:
            return YLIBC_ERR_EXEC;
        case ProgramEnd::Kind::kTimedOut:
            return YLIBC_ERR_EXEC_TIME;
        default:
            return YLIBC_ERR_EXEC_STATUS;
    }
}

}  // namespace host
