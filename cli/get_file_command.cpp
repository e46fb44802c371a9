// qrmctl get-file: fetches a file beside its destination and puts it there when it is whole.

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <memory>

#include "commands.h"
#include "deadline.h"
#include "destination.h"
#include "file_system.h"
#include "input_file.h"
#include "joined_server.h"
#include "last_error.h"
#include "progress.h"
#include "server_request.h"
#include "web_api_request.h"
#include "work_folder.h"
#include "zeloqrmclient.h"

namespace qrmctl {
namespace {

namespace fs = std::filesystem;

struct Options {
    std::string strPath;
    ApiCall call;
    bool blInPlace = false;
};

// --- The transfer -------------------------------------------------------------------------------

bool Observe(void *pContext, long long cbWritten, long long cbExpected) {
    static_cast<Progress *>(pContext)->Update(cbWritten, cbExpected);
    return !InterruptGuard::IsInterrupted();
}

enum class Outcome { kFetched, kUnchanged, kFailed };

Outcome Fetch(const std::string &strPath, const ApiCall &call, Json::Value &params,
              Progress &progress) {
    ZELO::CredRequestUtil::SetProgressObserver(Observe, &progress);
    YLIBCErrSetEx(YLIBC_ERR_NONE, "", 0);
    const int result =
        ZELOQRMClientGetFile(strPath, call.strApi, call.version, call.strMethod, params);
    ZELO::CredRequestUtil::SetProgressObserver(nullptr, nullptr);
    progress.Clear();
    if (result != 0) {
        return Outcome::kFailed;
    }
    return YLIBCErrGet() == YLIBC_ERR_UNCHANGED ? Outcome::kUnchanged : Outcome::kFetched;
}

// Of the file that is there; where none is, as at a pipe, of what was written.
Json::Int64 SizeOf(const std::string &strPath, const Progress &progress) {
    struct stat status = {};
    const bool blFile = stat(strPath.c_str(), &status) == 0 && S_ISREG(status.st_mode);
    return blFile ? status.st_size : progress.Bytes();
}

ExitCode Tell(Outcome outcome, const std::string &strPath, const Progress &progress,
              Report &report) {
    if (outcome == Outcome::kFailed) {
        return InterruptGuard::IsInterrupted()
                   ? report.Fail(ErrorId::kInterrupted, "interrupted")
                   : FailRequest(ErrorId::kFetchFailed,
                                 "the file could not be fetched from the server",
                                 ": can this appliance reach it ('qrmctl doctor' says), does it "
                                 "have the file, and is there room for it? -v shows the reason",
                                 report);
    }
    report.Fact("path", strPath);
    report.Fact("unchanged", outcome == Outcome::kUnchanged);
    report.Fact("bytes", SizeOf(strPath, progress));
    return report.Done();
}

// --- Beside the destination ---------------------------------------------------------------------

// False, with the error, when somebody else's link would choose where the file goes.
bool IsWayOurs(const std::string &strPath, std::string &strError) {
    destination::Place place;
    if (destination::Find(strPath, place) != destination::Result::kForeignLink) {
        return true;
    }
    strError = "'" + strPath +
               "' leads through another user's link in a directory that everybody can write to: "
               "name another path, or remove the link";
    return false;
}

bool PrepareFolder(const std::string &strPath, std::string &strError) {
    std::error_code error;
    const fs::path path = strPath;
    if (strPath.empty()) {
        strError = "the path is empty: name the file";
        return false;
    }
    if (!path.has_filename() || fs::is_directory(path, error)) {
        strError = "'" + strPath + "' is a directory: name the file in it";
        return false;
    }
    if (!IsWayOurs(strPath, strError)) {
        return false;
    }
    constexpr int kOwner = 1024;
    constexpr int kGroup = 100;
    const std::string strFolder = path.has_parent_path() ? path.parent_path().string() : ".";
    if (ZELOFSMkdirP(strFolder.c_str(), 0, 1, kOwner, kGroup, 0755) < 0) {
        strError =
            "cannot create the directory of '" + strPath + "': name a path that can be written";
        return false;
    }
    return true;
}

// Through links to the file itself, so that a link stays one; absolute, so that it has a folder.
bool ResolveDestination(const std::string &strPath, fs::path &file, std::string &strError) {
    if (!PrepareFolder(strPath, strError)) {
        return false;
    }
    destination::Place place;
    if (destination::Find(strPath, place) != destination::Result::kFound) {
        strError = "cannot reach '" + strPath + "': " + std::strerror(errno);
        return false;
    }
    struct stat status = {};
    if (fstat(place.file.Get(), &status) == 0 && !S_ISREG(status.st_mode)) {
        strError = "'" + strPath + "' is there and no ordinary file: name another path";
        return false;
    }
    std::error_code error;
    file = fs::read_symlink(destination::PathOf(place.folder), error) / place.strName;
    if (error) {
        strError = "cannot find the directory of '" + strPath + "': " + error.message();
    }
    return !error;
}

// Gives the new file the mode and owner of the old one, as far as that is allowed, and puts it in
// the old one's place.
bool PutInPlace(const std::string &strFile, const fs::path &place) {
    const int fd = open(strFile.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW);
    if (fd < 0) {
        return false;
    }
    struct stat old = {};
    if (lstat(place.c_str(), &old) == 0 && S_ISREG(old.st_mode)) {
        static_cast<void>(fchown(fd, old.st_uid, old.st_gid) == 0);
        static_cast<void>(fchmod(fd, old.st_mode & 07777) == 0);
    }
    const bool blDurable = fsync(fd) == 0;
    close(fd);
    return blDurable && std::rename(strFile.c_str(), place.c_str()) == 0;
}

std::string FetchStage(const ApiCall &call, const JoinedServer &server) {
    return "fetching the file from " + call.strApi + ' ' + call.strMethod + " at " +
           server.Address();
}

ExitCode GetBeside(const Options &options, const JoinedServer &server, Json::Value &params,
                   Report &report) {
    Report::Remedy("'" + options.strPath + "' is as it was; give it more time with --deadline");
    Report::Stage("preparing the place beside '" + options.strPath + "'");
    fs::path file;
    std::string strError;
    if (!ResolveDestination(options.strPath, file, strError)) {
        return report.Fail(ErrorId::kBadDestination, strError);
    }
    char szMd5[33] = {};
    if (GetFileMd5String(file.c_str(), szMd5, sizeof(szMd5)) == 0) {
        params["md5"] = szMd5;
    }
    const InterruptGuard guard;
    const WorkFolder workplace(file);
    if (!workplace.IsUsable()) {
        return report.Fail(ErrorId::kBadDestination, "cannot write beside '" + options.strPath +
                                                         "': " + std::strerror(workplace.Error()));
    }
    Report::Stage(FetchStage(options.call, server));
    Progress progress(!report.IsJson());
    const Outcome outcome = Fetch(workplace.Path("file"), options.call, params, progress);
    Report::Stage("putting the file in place");
    if (outcome == Outcome::kFetched && !PutInPlace(workplace.Path("file"), file)) {
        return report.Fail(ErrorId::kNotReplaced, "cannot replace '" + options.strPath + "': " +
                                                      std::strerror(errno) + "; it is as it was");
    }
    return Tell(outcome, options.strPath, progress, report);
}

ExitCode GetFile(const Options &options, Report &report) {
    Json::Value params;
    std::string strError;
    Report::Stage("reading the parameters");
    if (!ReadParams(options.call.strParams, params, strError)) {
        return report.Fail(ErrorId::kBadInput, strError);
    }
    ExitCode code = kFailed;
    const std::optional<JoinedServer> server = RequireJoinedServer(report, code);
    if (!server) {
        return code;
    }
    if (!options.blInPlace) {
        return GetBeside(options, *server, params, report);
    }
    if (!IsWayOurs(options.strPath, strError)) {
        return report.Fail(ErrorId::kBadDestination, strError);
    }
    Report::Stage(FetchStage(options.call, *server));
    Report::Remedy("'" + options.strPath + "' holds what had arrived; fetch it again");
    Progress progress(!report.IsJson());
    const InterruptGuard guard;
    const Outcome outcome = Fetch(options.strPath, options.call, params, progress);
    if (outcome == Outcome::kUnchanged) {
        report.Warn("the copy at '" + options.strPath + "' was current, and is empty now");
    }
    return Tell(outcome, options.strPath, progress, report);
}

}  // namespace

void AddGetFile(CommandHandle program, Action &action) {
    const CommandHandle command = program.Add("get-file", "Fetch a file from the joined server");
    const auto pOptions = std::make_shared<Options>();
    command.Text("PATH", pOptions->strPath, "Where to put the file").ValueName("FILE").Required();
    AddApiCall(command, pOptions->call);
    command.Flag("--in-place", pOptions->blInPlace, "Write to PATH itself, which is emptied first");
    command.RunsWhenChosen([pOptions, &action] {
        action = [pOptions](Report &report) { return GetFile(*pOptions, report); };
    });
}

}  // namespace qrmctl
