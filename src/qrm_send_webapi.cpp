// Requests to the joined server: a Web API call, and a file that is fetched.

#include <fcntl.h>
#include <openssl/evp.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdio>
#include <vector>

#include "appliance.h"
#include "connect_failed_marker.h"
#include "descriptor.h"
#include "destination.h"
#include "file_system.h"
#include "fixed_text.h"
#include "guard.h"
#include "json.h"
#include "json_text.h"
#include "log.h"
#include "platform_handles.h"
#include "terminated_text.h"
#include "zeloqrmclient.h"

namespace {

using json::Member;

constexpr long kDefaultRecord = -1;

// --- The request cache --------------------------------------------------------------------------

// Allocated when a call first needs them, then used again by every later call of the process and
// never released: a reload overwrites them in place. Without a lock: callers take turns.
ZELO_CRED *g_pCachedCred = nullptr;
ZELO_CRED_SESS *g_pCachedSess = nullptr;

bool ReloadCredential(long id) {
    if (g_pCachedCred == nullptr) {
        g_pCachedCred = ZELOCredAlloc();
    }
    if (g_pCachedCred == nullptr) {
        ZELO_LOG("Failed to alloc ZELO_CRED. [0x%04X %s:%d]", ZELO_LAST_ERROR);
        return false;
    }
    // The default record first: no field of an earlier load stays.
    if (ZELOCredLoad(kDefaultRecord, g_pCachedCred) < 0) {
        ZELO_LOG("Failed to load default ZELO_CRED. [0x%04X %s:%d]", ZELO_LAST_ERROR);
        return false;
    }
    if (ZELOCredLoad(id, g_pCachedCred) < 0) {
        ZELO_LOG("CredId [%ld] is invalid. [0x%04X %s:%d]", id, ZELO_LAST_ERROR);
        return false;
    }
    return true;
}

bool ReloadSession(long id) {
    if (g_pCachedSess == nullptr) {
        g_pCachedSess = ZELOCredSessAlloc();
    }
    if (g_pCachedSess == nullptr) {
        ZELO_LOG("Failed to alloc ZELO_CRED_SESS. [0x%04X %s:%d]", ZELO_LAST_ERROR);
        return false;
    }
    if (ZELOCredSessLoad(kDefaultRecord, g_pCachedSess) < 0) {
        ZELO_LOG("Failed to load default ZELO_CRED_SESS. [0x%04X %s:%d]", ZELO_LAST_ERROR);
        return false;
    }
    if (ZELOCredSessLoad(id, g_pCachedSess) < 0) {
        ZELO_LOG("CredId [%ld] is invalid. [0x%04X %s:%d]", id, ZELO_LAST_ERROR);
        return false;
    }
    return true;
}

bool Reload() {
    const long id = ZELOCredIDGetByApplication(appliance::kQrmServer);
    if (id < 0) {
        ZELO_LOG("QRM credential is not found. [0x%04X %s:%d]", ZELO_LAST_ERROR);
        return false;
    }
    return ReloadCredential(id) && ReloadSession(id);
}

// --- The failure path ---------------------------------------------------------------------------

constexpr const char *kConnectFailed = "QRMClientConnectFailed";

int Fail() {
    if (!connect_failed_marker::IsRecent()) {
        connect_failed_marker::Touch();
        SendNotification(kConnectFailed, nullptr);
    }
    return -1;
}

// --- Web API call -------------------------------------------------------------------------------

constexpr const char *kStatusKey = "status";

bool IsHttps(const std::string &strUrl) {
    return strUrl.compare(0, 5, "https") == 0;
}

// Asks that the parameters be protected where the transport does not protect them.
bool ProtectParams(ZELO::CredRequest *pRequest) {
    return IsHttps(pRequest->GetURL()) || pRequest->SetEncryptMode(ZELO::CRED_REQ_CRYPTO_PARAMS);
}

void SetStatus(const char *szStatus) {
    static_cast<void>(ZELOQRMClientSetInfo(kStatusKey, szStatus));
}

std::string TokenText(int (*pfnGet)(char *, int, const ZELO_CRED_SESS *)) {
    FixedText<1024> token;
    return pfnGet(token.Buffer(), FixedText<1024>::Size(), g_pCachedSess) == 0 ? token.sz() : "";
}

void LogReply(const std::string &api, const std::string &method, const std::string &strReply) {
    const std::string strSafe = qrm_log::SafeText(
        strReply,
        {TokenText(ZELOCredSessItemGetAccessToken), TokenText(ZELOCredSessItemGetCsrfToken)});
    ZELO_LOG("API:%s, method:%s, Response invalid: %s", api.c_str(), method.c_str(),
             strSafe.c_str());
}

const char *StatusOfFailure(const Json::Value &reply) {
    const int code = json::ErrorCode(reply);
    return code >= 105 && code <= 107 ? "no_permission" : "error";
}

bool Call(Json::Value &resp, const std::string &api, int ver, const std::string &method,
          const Json::Value &params, bool useCache, RequestHandle &pRequest) {
    const bool blCached = g_pCachedCred != nullptr && g_pCachedSess != nullptr;
    if (!(useCache && blCached) && !Reload()) {
        return false;
    }
    pRequest.reset(ZELO::CredRequest::CreateWebAPIRequest(g_pCachedCred, g_pCachedSess, api, ver,
                                                          method, params));
    if (pRequest == nullptr) {
        ZELO_LOG("Create CredRequest fail. api=%s, ver=%d, method=%s", api.c_str(), ver,
                 method.c_str());
        return false;
    }
    if (!ProtectParams(pRequest.get())) {
        ZELO_LOG("Failed to set encrypt mode for https.");
        return false;
    }
    if (!pRequest->Process(true, 0)) {
        ZELO_LOG("Process webapi fail. api=%s, ver=%d, method=%s", api.c_str(), ver,
                 method.c_str());
        return false;
    }

    const std::string strReply = pRequest->GetResponse();
    Json::Value reply(Json::objectValue);
    if (!json_text::FromString(strReply, reply)) {
        SetStatus("no_connection");
        LogReply(api, method, strReply);
        return false;
    }
    if (json::IsTrue(Member(reply, "success"))) {
        SetStatus("success");
    } else {
        LogReply(api, method, strReply);
        SetStatus(StatusOfFailure(reply));
    }
    resp.swap(reply);
    connect_failed_marker::Remove();
    return true;
}

// --- File download ------------------------------------------------------------------------------

constexpr int kOwner = 1024;
constexpr int kGroup = 100;
constexpr mode_t kFolderMode = 0755;

// 32 digits and the terminating zero.
using DigestText = FixedText<33>;

struct CloseFile {
    void operator()(std::FILE *pFile) const { static_cast<void>(std::fclose(pFile)); }
};
using FileHandle = std::unique_ptr<std::FILE, CloseFile>;

// A name alone stands in the current directory.
std::string FolderOf(const std::string &path) {
    const std::size_t end = path.find_last_of("/\\");
    if (end == std::string::npos) {
        return ".";
    }
    if (end == 0) {
        return path[0] == '/' ? "/" : ".";
    }
    return path.substr(0, end);
}

FileHandle OpenDestination(const std::string &path) {
    std::FILE *const pFile = destination::OpenToWrite(path);
    if (pFile != nullptr) {
        // The pieces that arrive are large: a buffer would only cut each into two writes.
        static_cast<void>(std::setvbuf(pFile, nullptr, _IONBF, 0));
    }
    return FileHandle(pFile);
}

int Fetch(std::FILE *pFile, const std::string &api, int ver, const std::string &method,
          const Json::Value &params) {
    const long id = ZELOCredIDGetByApplication(appliance::kQrmServer);
    if (id < 0) {
        return -1;
    }
    const RequestHandle pRequest(
        ZELO::CredRequest::CreateWebAPIRequest(id, api, ver, method, params));
    if (pRequest == nullptr || !ProtectParams(pRequest.get()) ||
        !pRequest->SetRespStream(pFile, nullptr)) {
        return -1;
    }
    if (pRequest->Process(true, 0)) {
        return 0;
    }
    return pRequest->GetError() == ZELO::CRED_REQ_ERR_UNCHANGED ? 0 : -1;
}

int GetFile(const std::string &path, const std::string &api, int ver, const std::string &method,
            Json::Value &params) {
    // Before the file at the path is emptied.
    if (!IsTerminatedText(path) || !(params.isObject() || params.isNull())) {
        return -1;
    }
    DigestText digest;
    if (GetFileMd5String(path.c_str(), digest.Buffer(), DigestText::Size()) == 0) {
        params["md5"] = digest.sz();
    }
    const std::string strFolder = FolderOf(path);
    if (ZELOFSMkdirP(strFolder.c_str(), 0, 1, kOwner, kGroup, kFolderMode) < 0) {
        ZELO_LOG("Failed to prepare path [%s] [0x%04X %s:%d]", strFolder.c_str(), ZELO_LAST_ERROR);
        return -1;
    }
    const FileHandle pFile = OpenDestination(path);
    return pFile == nullptr ? -1 : Fetch(pFile.get(), api, ver, method, params);
}

// --- Digest of a file ---------------------------------------------------------------------------

struct FreeDigest {
    void operator()(EVP_MD_CTX *pDigest) const { EVP_MD_CTX_free(pDigest); }
};

constexpr std::size_t kPieceSize = 256UL * 1024;

// The digest as 32 lower-case hexadecimal digits; empty when the file cannot be read.
std::string Md5Of(const char *szPath) {
    // A pipe or a device may never end: only a regular file has a digest.
    const Descriptor file(open(szPath, O_RDONLY | O_CLOEXEC | O_NONBLOCK));
    const std::unique_ptr<EVP_MD_CTX, FreeDigest> pDigest(EVP_MD_CTX_new());
    struct stat status = {};
    if (file.Get() < 0 || fstat(file.Get(), &status) != 0 || !S_ISREG(status.st_mode) ||
        pDigest == nullptr || EVP_DigestInit_ex(pDigest.get(), EVP_md5(), nullptr) != 1) {
        return {};
    }
    posix_fadvise(file.Get(), 0, 0, POSIX_FADV_SEQUENTIAL);
    std::vector<unsigned char> piece(kPieceSize);
    ssize_t cb = 0;
    while ((cb = read(file.Get(), piece.data(), piece.size())) != 0) {
        if (cb < 0 && errno == EINTR) {
            continue;
        }
        if (cb < 0 ||
            EVP_DigestUpdate(pDigest.get(), piece.data(), static_cast<std::size_t>(cb)) != 1) {
            return {};
        }
    }
    std::array<unsigned char, EVP_MAX_MD_SIZE> digest = {};
    unsigned int cbDigest = 0;
    if (EVP_DigestFinal_ex(pDigest.get(), digest.data(), &cbDigest) != 1) {
        return {};
    }
    constexpr const char *kHex = "0123456789abcdef";
    std::string strDigits;
    for (unsigned int i = 0; i < cbDigest; ++i) {
        strDigits += kHex[digest[i] >> 4U];
        strDigits += kHex[digest[i] & 15U];
    }
    return strDigits;
}

int GetMd5(const char *path, char *buffer, int size) {
    if (path == nullptr || buffer == nullptr || size <= 0) {
        return -1;
    }
    const std::string strDigits = Md5Of(path);
    if (strDigits.empty()) {
        return -1;
    }
    std::snprintf(buffer, static_cast<std::size_t>(size), "%s\n", strDigits.c_str());
    return 0;
}

}  // namespace

int ZELOQRMClientSendWebapi(Json::Value &resp, const std::string &api, int ver,
                            const std::string &method, const Json::Value &params, bool useCache) {
    RequestHandle pRequest;
    const bool blReplied =
        ZELO_GUARD(false, [&] { return Call(resp, api, ver, method, params, useCache, pRequest); });
    return blReplied ? 0 : ZELO_GUARD(-1, Fail);
}

int ZELOQRMClientGetFile(const std::string &path, const std::string &api, int ver,
                         const std::string &method, Json::Value &params) {
    return ZELO_GUARD(-1, [&] { return GetFile(path, api, ver, method, params); });
}

int GetFileMd5String(const char *path, char *buffer, int size) {
    return ZELO_GUARD(-1, [&] { return GetMd5(path, buffer, size); });
}
