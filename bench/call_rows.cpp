// Web API calls, against the bare libcurl exchanges that they come down to.

#include <fstream>
#include <memory>

#include "bare_exchange.h"
#include "child_process.h"
#include "json.h"
#include "ratio_table.h"
#include "rows.h"
#include "zeloqrmclient.h"

namespace bench {
namespace {

constexpr const char *kHttps = "https";

bool Call(bool blUseCache) {
    Json::Value reply;
    return ZELOQRMClientSendWebapi(reply, kConstantApi, 1, kConstantMethod, Json::objectValue,
                                   blUseCache) == 0 &&
           json::IsTrue(json::Member(reply, "success"));
}

constexpr const char *kAllAuthorities = "/tmp/zelo-bench-authorities.pem";
constexpr const char *kBody = R"({"api":"ZELO.QRM.RPC","method":"info","params":{},"version":1})";

void PrepareCall(BareExchange &bare, const std::string &strUrl) {
    bare.Post(strUrl, kBody, kServerToken);
}

Pair WarmPair(bool blUseCache) {
    const auto pServer = std::make_shared<ServerProcess>();
    pServer->Join(kHttps);
    Require(Call(false), "cannot call the server");
    const auto pBare = std::make_shared<BareExchange>();
    PrepareCall(*pBare, pServer->Url(kHttps, "/qrm/rpc"));
    const auto peer = [pBare] {
        Json::Value reply;
        return pBare->Perform(reply);
    };
    return {{[pServer, blUseCache] { return Call(blUseCache); }, nullptr}, {peer, nullptr}};
}

// Discovery and call over one connection.
bool CallFromTheBeginning(const ServerProcess &server) {
    BareExchange bare;
    Json::Value reply;
    bare.Get(server.Url(kHttps, std::string("/qrm/discover?api=") + kConstantApi));
    if (!bare.Perform(reply)) {
        return false;
    }
    const char *szPath = json::Text(json::Member(json::Member(reply, "data"), "path"));
    PrepareCall(bare, server.Url(kHttps, szPath == nullptr ? "" : szPath));
    return bare.Perform(reply);
}

Pair ColdPair() {
    const auto pServer = std::make_shared<ServerProcess>();
    pServer->Join(kHttps);
    const auto subject = [pServer] {
        return InChild([] { return Seconds([] { return Call(true); }); });
    };
    const auto peer = [pServer] {
        return InChild([&] { return Seconds([&] { return CallFromTheBeginning(*pServer); }); });
    };
    return {{nullptr, nullptr, subject}, {nullptr, nullptr, peer}};
}

// The authorities that the library trusts, in one file: the command takes no two.
void WriteAuthorities() {
    std::ofstream all(kAllAuthorities);
    for (const char *szPath : {"/etc/ssl/certs/ca-certificates.crt", kAuthority}) {
        all << std::ifstream(szPath).rdbuf();
    }
    Require(all.flush().good(), "cannot write the authorities");
}

// Both as programs, each from its start to its end.
Pair ProgramPair() {
    const auto pServer = std::make_shared<ServerProcess>();
    pServer->Join(kHttps);
    WriteAuthorities();
    const auto subject = [pServer] {
        return RunProgram({QRMCTL, "call", kConstantApi, kConstantMethod});
    };
    const auto peer = [pServer] {
        const std::string strToken = std::string("Authorization: Bearer ") + kServerToken;
        const std::string strUrl = pServer->Url(kHttps, "/qrm/rpc");
        return RunProgram({"curl", "--silent", "--fail", "--noproxy", "*", "--cacert",
                           kAllAuthorities, "--header", strToken.c_str(), "--header",
                           "Content-Type: application/json", "--data", kBody, strUrl.c_str()});
    };
    return {{subject, nullptr}, {peer, nullptr}};
}

}  // namespace

void AddColdCallRow() {
    AddRow({"ZELOQRMClientSendWebapi, first in a process", "fresh bare libcurl handle", 1.10,
            ColdPair, "", 100});
}

void AddCallRows() {
    AddRow({"ZELOQRMClientSendWebapi, warm", "bare libcurl exchange", 1.25,
            [] { return WarmPair(true); }, ""});
    AddRow({"ZELOQRMClientSendWebapi, useCache false", "bare libcurl exchange", 1.60,
            [] { return WarmPair(false); }, ""});
    AddRow({"qrmctl call, as a process", "curl command", 1.5, ProgramPair, "", 41});
}

}  // namespace bench
