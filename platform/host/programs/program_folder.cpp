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

#include "destination.h"
#include "own_file.h"
#include "program.h"
#include "system_log.h"

namespace host {
namespace {

constexpr std::string_view kTopFolder = "/usr/zelo/etc";
constexpr const char *kChangeable = "it can be changed by others than root";

bool OthersCanChange(const struct stat &status) {
    return !own_file::IsRootOrCaller(status.st_uid) || (status.st_mode & (S_IWGRP | S_IWOTH)) != 0;
}

Status Refusal(unsigned int code, const std::string &strFolder, const char *szReason) {
    return HOST_ERROR(code, "nothing in the folder '" + strFolder + "' is run: " + szReason)
        .Logged(LOG_ERR);
}

// Why the file in a folder is no program to run; null when it is one.
const char *WhyNoProgram(const char *szPath) {
    struct stat status = {};
    if (lstat(szPath, &status) != 0) {
        return std::strerror(errno);
    }
    if (!S_ISREG(status.st_mode)) {
        return "it is no regular file";
    }
    if (OthersCanChange(status)) {
        return kChangeable;
    }
    return faccessat(AT_FDCWD, szPath, X_OK, AT_EACCESS) == 0 ? nullptr : "it is not executable";
}

// The paths of the programs in the order of their names.
Status ListPrograms(const std::string &strFolder, std::vector<std::string> &programs) {
    std::error_code error;
    std::filesystem::directory_iterator entry(strFolder, error);
    for (; !error && entry != std::filesystem::directory_iterator(); entry.increment(error)) {
        std::string strPath = entry->path().string();
        if (entry->path().filename().string().front() == '.') {
            continue;
        }
        if (const char *const szReason = WhyNoProgram(strPath.c_str()); szReason != nullptr) {
            system_log::Write(LOG_WARNING, ZELO_SOURCE_STEM, __LINE__,
                              '\'' + strPath + "' is not run: " + szReason);
            continue;
        }
        programs.push_back(std::move(strPath));
    }
    if (error) {
        return Refusal(YLIBC_ERR_FILE, strFolder, std::strerror(error.value()));
    }
    std::sort(programs.begin(), programs.end());
    return {};
}

Status RunToSuccess(const std::string &strProgram, const ProgramCall &call, int &status) {
    Status end = RunProgram({strProgram, call.strArgument}, call.environment, call.limit, status);
    if (!end.Failed() && status == 0) {
        return {};
    }
    if (!end.Failed()) {
        end = HOST_ERROR(YLIBC_ERR_EXEC_STATUS, "exit status " + std::to_string(status));
    }
    return HOST_ERROR(end.Code(), std::string(call.szKind) + " '" + strProgram + "' failed for '" +
                                      call.strArgument + "': " + end.Words())
        .Logged(LOG_ERR);
}

}  // namespace

Status CheckProgram(const std::string &strPath) {
    destination::Place place;
    struct stat folder = {};
    struct stat file = {};
    const destination::Result found = destination::Find(strPath, place);
    const bool blThere = found == destination::Result::kFound && place.file.IsOpen() &&
                         fstat(place.folder.Get(), &folder) == 0 &&
                         fstat(place.file.Get(), &file) == 0;
    if (!blThere && found != destination::Result::kForeignLink) {
        return HOST_ERROR(YLIBC_ERR_EXEC, "cannot run '" + strPath + "': " + std::strerror(errno));
    }
    if (blThere && !S_ISREG(file.st_mode)) {
        return HOST_ERROR(YLIBC_ERR_EXEC, "cannot run '" + strPath + "': it is no regular file");
    }
    if (!blThere || !place.blOwn || OthersCanChange(folder) || OthersCanChange(file)) {
        return HOST_ERROR(YLIBC_ERR_UNSAFE_FILE, "'" + strPath + "' is not run: " + kChangeable);
    }
    return {};
}

Status CheckProgramFolder(const std::string &strFolder, bool &blThere) {
    blThere = false;
    for (std::size_t end = kTopFolder.size();; end = strFolder.find('/', end + 1)) {
        const std::string strPart = strFolder.substr(0, end);
        struct stat status = {};
        if (lstat(strPart.c_str(), &status) != 0) {
            return errno == ENOENT ? Status()
                                   : Refusal(YLIBC_ERR_FILE, strPart, std::strerror(errno));
        }
        if (!S_ISDIR(status.st_mode)) {
            return Refusal(YLIBC_ERR_UNSAFE_FILE, strPart, "it is no folder");
        }
        if (OthersCanChange(status)) {
            return Refusal(YLIBC_ERR_UNSAFE_FILE, strPart, kChangeable);
        }
        if (end == std::string::npos) {
            blThere = true;
            return {};
        }
    }
}

Status RunProgramFolder(const std::string &strFolder, const ProgramCall &call, int &status) {
    bool blThere = false;
    HOST_TRY(CheckProgramFolder(strFolder, blThere));
    std::vector<std::string> programs;
    if (blThere) {
        HOST_TRY(ListPrograms(strFolder, programs));
    }
    Status first;
    for (const std::string &strProgram : programs) {
        int ended = 0;
        Status end = RunToSuccess(strProgram, call, ended);
        end.Log();
        if (end.Failed() && !first.Failed()) {
            first = std::move(end);
            status = ended;
        }
    }
    return first;
}

}  // namespace host
