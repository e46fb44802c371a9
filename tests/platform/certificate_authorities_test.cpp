// Certificate authorities that are added, listed and removed.

#include "certificate_authorities.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "children.h"
#include "dev_server_process.h"
#include "diagnosis.h"
#include "files.h"
#include "last_error.h"

namespace {

using namespace files;

constexpr const char *kFolder = "/usr/zelo/etc/ssl/ca.d/";

std::vector<std::string> Fingerprints() {
    std::vector<std::string> all;
    EXPECT_EQ(ZELOCertAuthorityList(
                  [](void *pAll, const ZELO_CERT_AUTHORITY *pAuthority) {
                      static_cast<std::vector<std::string> *>(pAll)->emplace_back(
                          pAuthority->szFingerprint);
                      EXPECT_LT(pAuthority->notBefore, pAuthority->notAfter);
                  },
                  &all),
              0);
    return all;
}

std::string Reason() {
    char sz[512];
    ZELODiagnosisReason(sz, sizeof(sz));
    return sz;
}

class Authorities : public testing::Test {
  protected:
    void SetUp() override {
        fs::remove_all(kFolder);
        m_server.Start();
        m_other.Start();
    }
    // What a look at the server meets, and whether it is trusted.
    bool Trusts(DevServerProcess &server) {
        ZELO::Look look;
        look.strProtocol = "https";
        look.strHost = "localhost";
        look.port = server.HttpsPort();
        return ZELO::LookAtServer(look, m_met, nullptr);
    }
    DevServerProcess m_server{devserver::Options()};
    DevServerProcess m_other{devserver::Options()};
    ZELO::Exchange m_met;
};

TEST_F(Authorities, AreTrustedFromAddingToRemoving) {
    EXPECT_TRUE(Fingerprints().empty());
    EXPECT_FALSE(Trusts(m_server));
    for (int i = 0; i < 2; ++i) {
        EXPECT_EQ(ZELOCertAuthorityAdd(m_server.CaPem().c_str()), 0) << "again is no error";
        EXPECT_EQ(Fingerprints().size(), 1U);
    }
    EXPECT_TRUE(Trusts(m_server));
    EXPECT_FALSE(Trusts(m_other));
    const std::string strOwn = Fingerprints()[0];

    // A file of two, as an operator may put it there; the other one stays.
    Replace(std::string(kFolder) + "two.pem", m_server.CaPem() + m_other.CaPem());
    EXPECT_EQ(ZELOCertAuthorityRemove(strOwn.c_str()), 0);
    EXPECT_FALSE(Trusts(m_server));
    EXPECT_TRUE(Trusts(m_other));
    std::string strColons;
    const std::string strOther = Fingerprints().at(0);
    for (const char c : strOther) {
        strColons += strColons.size() % 3 == 2 ? ":" : "";
        strColons += static_cast<char>(toupper(c));
    }
    EXPECT_EQ(ZELOCertAuthorityRemove(strColons.c_str()), 0);
    EXPECT_EQ(ZELOCertAuthorityRemove(strColons.c_str()), -1);
    EXPECT_EQ(YLIBCErrGet(), unsigned{YLIBC_ERR_NOT_FOUND});
    EXPECT_FALSE(Trusts(m_other));
    EXPECT_TRUE(fs::is_empty(kFolder));
}

TEST_F(Authorities, NothingElseIsAdded) {
    Trusts(m_server);
    const std::string &strServers = m_met.certificate.strChainPem;
    const std::string strAll = m_server.CaPem() + strServers;
    for (const std::string &strPem : {strServers, strAll, std::string("text"), std::string()}) {
        EXPECT_EQ(ZELOCertAuthorityAdd(strPem.c_str()), -1);
        EXPECT_EQ(YLIBCErrGet(), unsigned{YLIBC_ERR_INVALID_ARGUMENT});
        EXPECT_NE(Reason(), "");
        EXPECT_TRUE(Fingerprints().empty());
    }
    fs::create_directories(kFolder);
    Replace(std::string(kFolder) + "broken.pem", "text");
    EXPECT_EQ(ZELOCertAuthorityAdd(m_server.CaPem().c_str()), -1);
    EXPECT_EQ(YLIBCErrGet(), unsigned{YLIBC_ERR_FILE});
    EXPECT_NE(Reason().find("broken.pem"), std::string::npos) << Reason();
    EXPECT_FALSE(Trusts(m_server));
    EXPECT_NE(m_met.strWords.find("broken.pem"), std::string::npos) << m_met.strWords;
}

}  // namespace
