// Enrolment: finding a connection at which a server answers, and joining that server.

#include <memory>
#include <new>
#include <string>
#include <vector>

#include "appliance.h"
#include "credential_store.h"
#include "guard.h"
#include "json.h"
#include "json_text.h"
#include "log.h"
#include "platform_handles.h"
#include "qrm_client_description.h"
#include "web_api_request.h"
#include "zeloqrmclient.h"

namespace {

using json::HasMember;
using json::Member;
using json::Text;

constexpr const char *kMethod = "join";
constexpr int kVersion = 1;

// --- Connection test ----------------------------------------------------------------------------

struct Candidate {
    const char *szHost = nullptr;
    const char *szSecureProtocol = nullptr;
    int httpPort = 0;
    int httpsPort = 0;
};

bool ReadCandidate(const Json::Value &value, Candidate &candidate) {
    candidate.szHost = Text(Member(value, "host"));
    if (candidate.szHost == nullptr ||
        !json::ReadInt(Member(value, "http_port"), candidate.httpPort) ||
        !json::ReadInt(Member(value, "https_port"), candidate.httpsPort)) {
        return false;
    }
    if (candidate.szHost[0] == '\0' || !ZELO::APIValidator::IsPort(candidate.httpPort) ||
        !ZELO::APIValidator::IsPort(candidate.httpsPort)) {
        return false;
    }
    candidate.szSecureProtocol = json::IsTrue(Member(value, "farlink_direct")) ? "fld" : "https";
    return true;
}

// One attempt; a port of 0 is one that the candidate does not offer.
bool Answers(ZELO_CRED *pCred, const char *szProtocol, const char *szHost, int port,
             const std::string &api, Json::Value &out) {
    if (port <= 0) {
        return false;
    }
    if (ZELOCredItemSetProtocol(pCred, szProtocol) != 0 ||
        ZELOCredItemSetHost(pCred, szHost) != 0 || ZELOCredItemSetPort(pCred, port) != 0) {
        return false;
    }
    if (ZELO::CredRequestUtil::GetWebAPIPath(pCred, api).empty()) {
        return false;
    }
    // All three members or, when memory is short, none.
    Json::Value filled = out;
    filled["protocol"] = szProtocol;
    filled["port"] = port;
    filled["host"] = szHost;
    out.swap(filled);
    return true;
}

bool TestConnect(const Json::Value &serverConn, const std::string &api, Json::Value &out) {
    if (serverConn.empty() || !serverConn.isArray() || api.empty()) {
        return false;
    }
    if (!out.isNull() && !out.isObject()) {
        return false;
    }
    const CredHandle pCred(ZELOCredAlloc());
    if (pCred == nullptr) {
        return false;
    }
    for (const Json::Value &value : serverConn) {
        Candidate candidate;
        if (!ReadCandidate(value, candidate)) {
            continue;
        }
        if (Answers(pCred.get(), candidate.szSecureProtocol, candidate.szHost, candidate.httpsPort,
                    api, out) ||
            Answers(pCred.get(), "http", candidate.szHost, candidate.httpPort, api, out)) {
            return true;
        }
    }
    return false;
}

// --- Join ---------------------------------------------------------------------------------------

bool HasJoinMembers(const Json::Value &joinInfo) {
    return HasMember(joinInfo, "sn") && HasMember(joinInfo, "access_token") &&
           HasMember(joinInfo, "server_host") && HasMember(joinInfo, "server_http_port") &&
           HasMember(joinInfo, "server_https_port");
}

// The caller's other ways to the server first, the explicit address last.
Json::Value BuildCandidates(const Json::Value &joinInfo) {
    Json::Value candidates(Json::arrayValue);
    if (Member(joinInfo, "server_conn").isArray()) {
        candidates = Member(joinInfo, "server_conn");
    }
    Json::Value last(Json::objectValue);
    last["host"] = Member(joinInfo, "server_host");
    last["http_port"] = Member(joinInfo, "server_http_port");
    last["https_port"] = Member(joinInfo, "server_https_port");
    candidates.append(std::move(last));
    return candidates;
}

bool Connect(const Json::Value &candidates, ZELO_CRED *pCred, ZELO::CredRequest *pRequest) {
    Json::Value connection(Json::objectValue);
    if (!ZELOQRMClientTestConnect(candidates, appliance::kQrmApi, connection)) {
        return false;
    }
    return ZELOCredItemSetProtocol(pCred, connection["protocol"].asCString()) >= 0 &&
           ZELOCredItemSetHost(pCred, connection["host"].asCString()) >= 0 &&
           ZELOCredItemSetPort(pCred, connection["port"].asInt()) >= 0 &&
           ZELO::CredRequestUtil::SetWebAPIURL(pCred, appliance::kQrmApi, kVersion, kMethod,
                                               pRequest);
}

bool SaveServer(ZELO_CRED *pCred) {
    return ZELOCredItemSetApplication(pCred, appliance::kQrmServer) >= 0 &&
           ZELOCredItemSetOwner(pCred, appliance::kCredentialOwner) >= 0 &&
           ZELOCredSave(pCred) >= 0;
}

bool DescribePorts(const Json::Value &joinInfo, Json::Value &description) {
    long port = 0;
    if (HasMember(joinInfo, "http_port")) {
        description["http_port"] = Member(joinInfo, "http_port");
    } else if (client_description::ReadAdminPort(port)) {
        description["http_port"] = static_cast<Json::Int64>(port);
    } else {
        return false;
    }

    if (HasMember(joinInfo, "https_port")) {
        description["https_port"] = Member(joinInfo, "https_port");
    } else if (!client_description::IsHttpsServed()) {
        description["https_port"] = 0;
    } else if (client_description::ReadSecureAdminPort(port)) {
        description["https_port"] = static_cast<Json::Int64>(port);
    } else {
        return false;
    }
    return true;
}

bool Describe(const Json::Value &joinInfo, Json::Value &description) {
    if (HasMember(joinInfo, "id")) {
        description["id"] = Member(joinInfo, "id");
    }
    description["sn"] = Member(joinInfo, "sn");

    std::string strHostName;
    if (!client_description::ReadHostName(strHostName)) {
        ZELO_LOG("get hostname fail");
        return false;
    }
    description["name"] = strHostName;
    description["host"] =
        HasMember(joinInfo, "host") ? Member(joinInfo, "host") : Json::Value(strHostName);

    std::string strModel;
    if (!client_description::ReadModel(strModel)) {
        return false;
    }
    description["model"] = strModel;
    if (!client_description::ReadVersion(description) || !DescribePorts(joinInfo, description)) {
        return false;
    }
    description["access_token"] = Member(joinInfo, "access_token");
    return true;
}

bool IsAccepted(const std::string &strReply) {
    Json::Value reply;
    return json_text::FromString(strReply, reply) && json::IsTrue(Member(reply, "success"));
}

// The texts that make up a token, which may be of any type.
void CollectTexts(const Json::Value &value, std::vector<std::string> &texts) {
    if (value.isString()) {
        texts.push_back(value.asString());
    } else if (value.isArray() || value.isObject()) {
        for (const Json::Value &element : value) {
            CollectTexts(element, texts);
        }
    } else if (!value.isNull()) {
        texts.push_back(json::ToLogText(value));
    }
}

int SendJoin(const Json::Value &joinInfo, ZELO::CredRequest *pRequest) {
    Json::Value description(Json::objectValue);
    if (!Describe(joinInfo, description)) {
        return -1;
    }
    pRequest->AddPostParam(description);
    pRequest->SetEncryptMode(ZELO::CRED_REQ_CRYPTO_PARAMS);
    if (!pRequest->Process(true, 0)) {
        return -1;
    }
    if (!IsAccepted(pRequest->GetResponse())) {
        std::vector<std::string> secrets;
        CollectTexts(Member(joinInfo, "access_token"), secrets);
        const std::string strReply = qrm_log::SafeText(pRequest->GetResponse(), secrets);
        ZELO_LOG("send create client fail: %s", strReply.c_str());
        return -1;
    }
    return 0;
}

int Join(const Json::Value &joinInfo) {
    if (!HasJoinMembers(joinInfo)) {
        return -1;
    }
    const Json::Value candidates = BuildCandidates(joinInfo);
    const CredHandle pCred(ZELOCredAlloc());
    if (pCred == nullptr) {
        return -1;
    }
    const std::unique_ptr<ZELO::CredRequest> pRequest(new (std::nothrow) ZELO::CredRequest());
    if (pRequest == nullptr) {
        ZELO_LOG("create cred request fail");
        return -1;
    }
    if (!Connect(candidates, pCred.get(), pRequest.get())) {
        ZELO_LOG("Cannot find available Connection[%s]", json::ToLogText(candidates).c_str());
        return -1;
    }
    if (!SaveServer(pCred.get())) {
        ZELO_LOG("Cannot save server credential");
        return -1;
    }
    return SendJoin(joinInfo, pRequest.get());
}

}  // namespace

bool ZELOQRMClientTestConnect(const Json::Value &serverConn, const std::string &api,
                              Json::Value &out) {
    return ZELO_GUARD(false, [&] { return TestConnect(serverConn, api, out); });
}

int ZELOQRMClientSendCreateClient(const Json::Value &joinInfo) {
    return ZELO_GUARD(-1, [&] { return Join(joinInfo); });
}
