// Files from the server and their digests, against the programs and bare loops that do the same.

#include <fcntl.h>
#include <unistd.h>

#include <cstring>
#include <fstream>
#include <memory>

#include "bare_exchange.h"
#include "child_process.h"
#include "generated_file.h"
#include "ratio_table.h"
#include "rows.h"
#include "zeloqrmclient.h"

namespace bench {
namespace {

constexpr const char *kApi = "ZELO.QRM.RPC.File";
constexpr const char *kPath = "/qrm/file";
constexpr const char *kName = "image";

// Where throughput is compared: what a disk does meanwhile, or the system to find the memory for a
// file, is neither side's doing.
constexpr const char *kNowhere = "/dev/null";

// A file, in memory.
constexpr const char *kFile = "/dev/shm/zelo-bench-file";
constexpr int kMiB = 1024 * 1024;
constexpr int kPairs = 11;

constexpr long kLibraryBuffer = 512 * 1024L;

bool RemoveFile() {
    return unlink(kFile) == 0;
}

bool Download(int mib, const char *szPath) {
    Json::Value params;
    params["name"] = kName;
    params["size"] = static_cast<Json::Int64>(mib) * kMiB;
    return ZELOQRMClientGetFile(szPath, kApi, 1, "get", params) == 0;
}

struct Target {
    ServerProcess server;
    std::string strUrl;
    std::string strBody;

    Target(int mib, const std::string &strProtocol)
        : strUrl(server.Url(strProtocol, kPath)),
          strBody(std::string(R"({"api":")") + kApi +
                  R"(","method":"get","version":1,"params":{"name":")" + kName + R"(","size":)" +
                  std::to_string(static_cast<long>(mib) * kMiB) + "}}") {
        server.Join(strProtocol);
    }

    bool DownloadBare() const { return DownloadThrough(CURL_MAX_WRITE_SIZE); }
    bool DownloadByTwin() const { return DownloadThrough(kLibraryBuffer); }

    bool DownloadThrough(long cbBuffer) const {
        const int fd = open(kNowhere, O_WRONLY | O_CLOEXEC);
        BareExchange bare;
        bare.Post(strUrl, strBody, kServerToken);
        bare.WriteTo(fd, cbBuffer);
        const bool blDone = bare.Perform();
        return close(fd) == 0 && blDone;
    }

    bool DownloadByProgram() const {
        const std::string strToken = std::string("Authorization: Bearer ") + kServerToken;
        return RunProgram({"curl", "--silent", "--fail", "--noproxy", "*", "--cacert", kAuthority,
                           "--header", strToken.c_str(), "--header",
                           "Content-Type: application/json", "--data", strBody.c_str(), "--output",
                           kNowhere, strUrl.c_str()});
    }
};

Pair DownloadPair(int mib, const std::string &strProtocol, bool (Target::*pfnPeer)() const) {
    const auto pTarget = std::make_shared<Target>(mib, strProtocol);
    return {{[pTarget, mib] { return Download(mib, kNowhere); }, nullptr},
            {[pTarget, pfnPeer] { return (*pTarget.*pfnPeer)(); }, nullptr}};
}

// The most memory that the process has had so far, in KiB.
double PeakMemory() {
    std::ifstream status("/proc/self/status");
    for (std::string strLine; std::getline(status, strLine);) {
        if (strLine.rfind("VmHWM:", 0) == 0) {
            return std::stod(strLine.substr(std::strlen("VmHWM:")));
        }
    }
    return -1;
}

Pair MemoryPair(int mib) {
    const auto pTarget = std::make_shared<Target>(mib, "https");
    const auto peakOf = [pTarget](int size_mib) {
        return [size_mib, pTarget] {
            return InChild([size_mib] { return Download(size_mib, kFile) ? PeakMemory() : -1; });
        };
    };
    return {{nullptr, RemoveFile, peakOf(mib)}, {nullptr, RemoveFile, peakOf(1)}};
}

Pair DigestPair(int mib) {
    const devserver::GeneratedFile content(kName, static_cast<std::uint64_t>(mib) * kMiB);
    std::ofstream file(kFile, std::ios::binary);
    for (std::uint64_t offset = 0; offset < content.Size(); offset += kMiB) {
        file << content.Read(offset, kMiB);
    }
    file.close();
    Require(file.good(), "cannot write the file to digest");
    const std::shared_ptr<void> pRemoval(nullptr, [](void *) { RemoveFile(); });
    const auto subject = [pRemoval] {
        char szDigest[33];
        return GetFileMd5String(kFile, szDigest, sizeof(szDigest)) == 0;
    };
    return {{subject, nullptr}, {[] { return RunProgram({"openssl", "md5", kFile}); }, nullptr}};
}

}  // namespace

void AddDownloadRows(int mib) {
    const std::string strSize = std::to_string(mib) + " MiB";
    for (const std::string strProtocol : {"http", "https"}) {
        std::string strName = "ZELOQRMClientGetFile, " + strSize;
        strName += ", " + strProtocol;
        strName += ", ";
        const auto add = [&](const char *szPeer, double goal, bool (Target::*pfnPeer)() const) {
            AddRow({strName + szPeer, szPeer, goal,
                    [=] { return DownloadPair(mib, strProtocol, pfnPeer); }, "", kPairs});
        };
        add("curl command", 1.00, &Target::DownloadByProgram);
        add("bare libcurl loop", 1.00, &Target::DownloadBare);
        if (strProtocol == "http") {
            // The same calls as the library's: what is left is the library's own and the noise.
            add("loop, same buffer", 1.05, &Target::DownloadByTwin);
        }
    }
    AddRow({"ZELOQRMClientGetFile, memory for " + strSize, "memory for 1 MiB", 1.05,
            [mib] { return MemoryPair(mib); }, "", kPairs});
    AddRow({"GetFileMd5String, " + strSize, "openssl md5", 1.00, [mib] { return DigestPair(mib); },
            "", kPairs});
}

}  // namespace bench
