// Joining a server, and leaving it: the whole sequence of an enrolling program. It runs as root.
//
//     example-join-leave INFO.json   joins; the file holds what ZELOQRMClientSendCreateClient takes
//     example-join-leave             leaves

#include <json/reader.h>
#include <key_value_file.h>
#include <process.h>
#include <web_session.h>
#include <zeloqrmclient.h>

#include <cstdlib>
#include <fstream>
#include <iostream>
#include <random>

namespace {

// The join has stored where the server is. Whole records take the place of that one: the server's,
// with its session and the serial number, and the notification center's.
bool StoreCredentials(const Json::Value &info) {
    Json::Value center;
    const bool blFound =
        ZELOQRMClientGetServerCredential(center) && ZELOQRMClientDeleteServerCredential();
    center["access_token"] = info["access_token"];
    center["application"] = "ZELO.NotificationCenter";
    Json::Value server = center;
    server["application"] = "ZELO.QRM";
    server["extra_info"]["sn"] = info["sn"];
    return blFound && ZELOQRMClientCreateServerCredential(server) &&
           ZELOQRMClientCreateServerCredential(center);
}

bool AddWebSessions() {
    ZELO_CGI_CONTEXT context = {};
    const bool blAdded = ZeloCgiInit("", &context) != 0 &&
                         ZeloCgiAddSessionByIndex(&context, 13, "ZELO.QRM.Client") != 0 &&
                         ZeloCgiAddSessionByIndex(&context, 13, "ZELO.QRM.Client.Machine") != 0;
    ZeloCgiFree(&context);
    return blAdded;
}

// Each pass removes one record of possibly several. The account may be there without a membership.
bool Leave() {
    for (int i = 0; i < 100 && ZELOQRMClientStatus() != 0 && ZELOQRMClientDeleteServer(); ++i) {
    }
    return ZELOQRMClientStatus() == 0 && ZELOQRMClientDeleteServerUser();
}

// The join flag is set last, over a complete state. A join that fails on its way is undone.
bool Join(const Json::Value &info) {
    std::srand(std::random_device("/dev/urandom")());  // draws the account's password
    const bool blJoined =
        Leave() && ZELOQRMClientSendCreateClient(info) == 0 && StoreCredentials(info) &&
        YLIBCExec("/usr/zelo/etc/rc.d/S99zelocache.sh", "start", nullptr, nullptr, nullptr) == 0 &&
        AddWebSessions() && ZELOQRMClientCreateServerUser() &&
        YLIBCINFOSetKeyValue("join_nvo_qrm", "yes") == 0 && ZELOQRMClientStatus() == 1;
    if (!blJoined) {
        Leave();
    }
    return blJoined;
}

}  // namespace

int main(int argc, char **argv) {
    if (argc == 1) {
        return Leave() ? 0 : 1;
    }
    Json::Value info;
    std::ifstream file(argv[1]);
    if (!Json::parseFromStream(Json::CharReaderBuilder(), file, &info, nullptr) || !Join(info)) {
        std::cerr << "Not joined: " << argv[1] << " is no JSON, or the system log says why.\n";
        return 1;
    }
    return 0;
}
