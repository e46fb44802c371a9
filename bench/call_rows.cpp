// Web API calls, against the bare libcurl exchanges that they come down to.

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

void PrepareCall(BareExchange &bare, const std::string &strUrl) {
    bare.Post(strUrl, R"({"api":"ZELO.QRM.RPC","method":"info","params":{},"version":1})",
              kServerToken);
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
}

}  // namespace bench
