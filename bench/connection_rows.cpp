// The connection test, against the bare libcurl exchange that it comes down to.

#include <memory>

#include "bare_exchange.h"
#include "child_process.h"
#include "json.h"
#include "ratio_table.h"
#include "rows.h"
#include "zeloqrmclient.h"

namespace bench {
namespace {

constexpr const char *kApi = "ZELO.QRM.RPC";

// One candidate, which answers.
Pair ConnectionTest() {
    const auto pServer = std::make_shared<ServerProcess>();
    const auto pBare = std::make_shared<BareExchange>();
    pBare->Get(pServer->Url("https", std::string("/qrm/discover?api=") + kApi));
    Json::Value candidate;
    candidate["host"] = "localhost";
    candidate["http_port"] = 0;
    candidate["https_port"] = pServer->Port("https");
    Json::Value candidates;
    candidates.append(candidate);
    const auto subject = [pServer, candidates] {
        Json::Value out;
        return ZELOQRMClientTestConnect(candidates, kApi, out);
    };
    const auto peer = [pBare] {
        Json::Value envelope;
        return pBare->Perform(envelope) && envelope["data"]["path"].asString() == "/qrm/rpc";
    };
    return {{subject, nullptr}, {peer, nullptr}};
}

}  // namespace

void AddConnectionRows() {
    AddRow({"ZELOQRMClientTestConnect, kept-alive HTTPS", "bare libcurl exchange", 1.15,
            ConnectionTest, ""});
}

}  // namespace bench
