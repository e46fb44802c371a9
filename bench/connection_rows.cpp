// The connection test, against the bare libcurl exchange that it comes down to.

#include <curl/curl.h>

#include <filesystem>
#include <fstream>
#include <memory>

#include "dev_server.h"
#include "json_text.h"
#include "ratio_table.h"
#include "rows.h"
#include "zeloqrmclient.h"

namespace bench {
namespace {

constexpr const char *kApi = "ZELO.QRM.RPC";
constexpr const char *kAuthorities = "/usr/zelo/etc/ssl/ca.d";
constexpr const char *kAuthority = "/usr/zelo/etc/ssl/ca.d/server.pem";

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

struct CleanupEasy {
    void operator()(CURL *pEasy) const { curl_easy_cleanup(pEasy); }
};
struct FreeList {
    void operator()(curl_slist *pList) const { curl_slist_free_all(pList); }
};

size_t TakeBody(char *pData, size_t size, size_t count, void *pContext) {
    static_cast<std::string *>(pContext)->append(pData, size * count);
    return size * count;
}

// One handle, set up once; its connection stays open between the exchanges.
class BareExchange {
  public:
    explicit BareExchange(int port)
        : m_pEasy(curl_easy_init()),
          m_pHeaders(curl_slist_append(nullptr, "Accept: application/json")) {
        const std::string strUrl =
            "https://localhost:" + std::to_string(port) + "/qrm/discover?api=" + kApi;
        curl_easy_setopt(m_pEasy.get(), CURLOPT_URL, strUrl.c_str());
        curl_easy_setopt(m_pEasy.get(), CURLOPT_PROXY, "");
        curl_easy_setopt(m_pEasy.get(), CURLOPT_NOSIGNAL, 1L);
        curl_easy_setopt(m_pEasy.get(), CURLOPT_HTTPHEADER, m_pHeaders.get());
        curl_easy_setopt(m_pEasy.get(), CURLOPT_HTTP_VERSION,
                         static_cast<long>(CURL_HTTP_VERSION_1_1));
        curl_easy_setopt(m_pEasy.get(), CURLOPT_SSLVERSION,
                         static_cast<long>(CURL_SSLVERSION_TLSv1_2));
        curl_easy_setopt(m_pEasy.get(), CURLOPT_SSL_VERIFYPEER, 1L);
        curl_easy_setopt(m_pEasy.get(), CURLOPT_SSL_VERIFYHOST, 2L);
        curl_easy_setopt(m_pEasy.get(), CURLOPT_CAINFO, kAuthority);
        curl_easy_setopt(m_pEasy.get(), CURLOPT_WRITEFUNCTION, TakeBody);
        curl_easy_setopt(m_pEasy.get(), CURLOPT_WRITEDATA, &m_strBody);
    }

    bool FindPath() {
        m_strBody.clear();
        long status = 0;
        if (curl_easy_perform(m_pEasy.get()) != CURLE_OK ||
            curl_easy_getinfo(m_pEasy.get(), CURLINFO_RESPONSE_CODE, &status) != CURLE_OK) {
            return false;
        }
        Json::Value envelope;
        return status == 200 && json_text::FromString(m_strBody, envelope) &&
               envelope["data"]["path"].asString() == "/qrm/rpc";
    }

  private:
    std::unique_ptr<CURL, CleanupEasy> m_pEasy;
    std::unique_ptr<curl_slist, FreeList> m_pHeaders;
    std::string m_strBody;
};

// One candidate, which answers.
Pair ConnectionTest() {
    const auto pServer = StartServer();
    const auto pBare = std::make_shared<BareExchange>(pServer->HttpsPort());
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
    return {{subject, nullptr}, {[pBare] { return pBare->FindPath(); }, nullptr}};
}

}  // namespace

void AddConnectionRows() {
    AddRow({"ZELOQRMClientTestConnect, kept-alive HTTPS", "bare libcurl exchange", 1.10,
            ConnectionTest, ""});
}

}  // namespace bench
