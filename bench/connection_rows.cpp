// The connection test, against the bare libcurl exchange that it comes down to.

#include <filesystem>
#include <fstream>
#include <memory>

#include "bare_exchange.h"
#include "dev_server.h"
#include "json_text.h"
#include "ratio_table.h"
#include "rows.h"
#include "zeloqrmclient.h"

namespace bench {
namespace {

constexpr const char *kApi = "ZELO.QRM.RPC";

std::shared_ptr<devserver::DevServer> StartServer() {
    auto pServer = std::make_shared<devserver::DevServer>(devserver::Options{});
    std::string strReason;
    Require(pServer->Start(strReason), strReason);
    std::filesystem::create_directories(kAuthorities);
    std::ofstream file(kAuthority);
    file << pServer->CaPem();
    file.close();
    Require(file.good(), "cannot write the authority's certificate");
    return pServer;
}

// One candidate, which answers.
Pair ConnectionTest() {
    const auto pServer = StartServer();
    const auto pBare = std::make_shared<BareExchange>();
    pBare->Get("https://localhost:" + std::to_string(pServer->HttpsPort()) +
               "/qrm/discover?api=" + kApi);
    Json::Value candidate;
    candidate["host"] = "localhost";
    candidate["http_port"] = 0;
    candidate["https_port"] = pServer->HttpsPort();
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
    AddRow({"ZELOQRMClientTestConnect, kept-alive HTTPS", "bare libcurl exchange", 1.10,
            ConnectionTest, ""});
}

}  // namespace bench
