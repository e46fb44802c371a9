// Joining a server from a program of one's own: the library's join stores where the server is, the
// caller stores the session with the access token, and on failure removes what was added.
//
//     example-join HOST HTTPS-PORT SERIAL-NUMBER TOKEN-FILE

#include <credential_store.h>
#include <zeloqrmclient.h>

#include <cstdlib>
#include <fstream>
#include <iostream>
#include <memory>
#include <string>

namespace {

constexpr const char *kApplication = "ZELO.QRM";

bool StoreSession(const std::string &strToken) {
    const long id = ZELOCredIDGetByApplication(kApplication);
    const std::unique_ptr<ZELO_CRED_SESS, void (*)(ZELO_CRED_SESS *)> pSess(ZELOCredSessAlloc(),
                                                                            ZELOCredSessFree);
    return id >= 0 && pSess != nullptr && ZELOCredSessItemSetID(pSess.get(), id) >= 0 &&
           ZELOCredSessItemSetAccessToken(pSess.get(), strToken.c_str()) >= 0 &&
           ZELOCredSessSave(pSess.get()) >= 0;
}

// The credential stored first is in force: one that is left from before would hide the new one and
// take its token, and one that a failed join leaves would look like a membership.
bool RemoveCredentials() {
    for (long id = -1; (id = ZELOCredIDGetByApplication(kApplication)) >= 0;) {
        if (ZELOCredSessRemoveByID(id) < 0 || ZELOCredRemoveByID(id) < 0) {
            return false;
        }
    }
    return true;
}

}  // namespace

int main(int argc, char **argv) {
    std::string strToken;
    if (argc != 5 || !std::getline(std::ifstream(argv[4]), strToken)) {
        std::cerr << "usage: example-join HOST HTTPS-PORT SERIAL-NUMBER TOKEN-FILE\n";
        return 2;
    }
    Json::Value joinInfo;
    joinInfo["server_host"] = argv[1];
    joinInfo["server_https_port"] = std::atoi(argv[2]);
    joinInfo["server_http_port"] = 0;  // the token does not go over plain HTTP
    joinInfo["sn"] = argv[3];
    joinInfo["access_token"] = strToken;

    if (!RemoveCredentials()) {
        std::cerr << "What is stored from before cannot be removed; the system log says why.\n";
        return 1;
    }
    if (ZELOQRMClientSendCreateClient(joinInfo) != 0 || !StoreSession(strToken)) {
        RemoveCredentials();
        std::cerr << "Could not join " << argv[1] << "; the system log says why.\n";
        return 1;
    }
    Json::Value server;
    ZELOQRMClientGetServerCredentialWithToken(server);
    std::cout << "Joined " << server["host"].asString() << " over " << server["protocol"].asString()
              << ".\n";
    return 0;
}
