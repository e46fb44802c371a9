// The peer of what goes over the wire: a bare libcurl handle that is set up once and verifies the
// server as the library does. Its connection stays open between the exchanges.

#ifndef ZELO_BENCH_BARE_EXCHANGE_H
#define ZELO_BENCH_BARE_EXCHANGE_H

#include <curl/curl.h>
#include <json/value.h>

#include <memory>
#include <string>

namespace bench {

// The appliance's folder of authorities, and the development server's file there.
constexpr const char *kAuthorities = "/usr/zelo/etc/ssl/ca.d";
constexpr const char *kAuthority = "/usr/zelo/etc/ssl/ca.d/server.pem";

class BareExchange {
  public:
    BareExchange();

    // What the exchanges from now on send: a GET, or a POST of the body, with the access token.
    void Get(const std::string &strUrl);
    void Post(const std::string &strUrl, const std::string &strBody, const std::string &strToken);

    // The reply goes into the open file from now on, received through a buffer of this size.
    void WriteTo(int fd, long cbBuffer);

    // Sends, and receives a reply with status 200.
    bool Perform();

    // Perform, and a reply that is JSON and reports a success.
    bool Perform(Json::Value &envelope);

  private:
    struct Cleanup {
        void operator()(CURL *pEasy) const { curl_easy_cleanup(pEasy); }
        void operator()(curl_slist *pList) const { curl_slist_free_all(pList); }
    };
    void AddHeader(const std::string &strHeader);

    std::unique_ptr<CURL, Cleanup> m_pEasy;
    std::unique_ptr<curl_slist, Cleanup> m_pHeaders;
    std::string m_strReply;
    int m_fd = -1;
};

}  // namespace bench

#endif
