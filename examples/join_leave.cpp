// Joining a server, and leaving it: the whole sequence of an enrolling program. It runs as root.
//
//     example-join-leave join INFO.json | leave
//
// INFO.json holds what ZELOQRMClientSendCreateClient takes: {"server_host": "qrm.example",
// "server_http_port": 0, "server_https_port": 5001, "sn": "2150ABC", "access_token": "secret"}

#include <json/reader.h>
#include <key_value_file.h>
#include <process.h>
#include <web_session.h>
#include <zeloqrmclient.h>

#include <cstdlib>
#include <fstream>
#include <iostream>
#include <random>
#include <string>

// The join has stored where the server is. Whole records take the place of that one: the server's,
// with its session and the serial number, and the notification center's.
static bool StoreCredentials(const Json::Value &info) {
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

static bool AddWebSessions() {
    ZELO_CGI_CONTEXT context = {};
    const bool blAdded = ZeloCgiInit("", &context) != 0 &&
                         ZeloCgiAddSessionByIndex(&context, 13, "ZELO.QRM.Client") != 0 &&
                         ZeloCgiAddSessionByIndex(&context, 13, "ZELO.QRM.Client.Machine") != 0;
    ZeloCgiFree(&context);
    return blAdded;
}

// Each pass removes one record of possibly several. The account may be there without a membership.
static bool Leave() {
    for (int i = 0; i < 100 && ZELOQRMClientStatus() != 0 && ZELOQRMClientDeleteServer(); ++i) {
    }
    return ZELOQRMClientStatus() == 0 && ZELOQRMClientDeleteServerUser();
}

// The join flag is set last, over a complete state.
static bool Join(const Json::Value &info) {
    std::srand(std::random_device("/dev/urandom")());  // draws the account's password
    return Leave() && ZELOQRMClientSendCreateClient(info) == 0 && StoreCredentials(info) &&
           !YLIBCExec("/usr/zelo/etc/rc.d/S99zelocache.sh", "start", nullptr, nullptr, nullptr) &&
           AddWebSessions() && ZELOQRMClientCreateServerUser() &&
           YLIBCINFOSetKeyValue("join_nvo_qrm", "yes") == 0 && ZELOQRMClientStatus() == 1;
}

int main(int argc, char **argv) {
    const bool blJoin = argc == 3 && std::string(argv[1]) == "join";
    if (!blJoin && !(argc == 2 && std::string(argv[1]) == "leave")) {
        std::cerr << "usage: example-join-leave join INFO.json | leave\n";
        return 2;
    }
    Json::Value info;
    std::ifstream file(argv[argc - 1]);
    if (blJoin && !Json::parseFromStream(Json::CharReaderBuilder(), file, &info, nullptr)) {
        std::cerr << argv[2] << " cannot be read, or is no JSON.\n";
        return 1;
    }
    if (!(blJoin ? Join(info) : Leave())) {
        Leave();  // what a join that failed on its way has begun
        std::cerr << (blJoin ? "Not joined" : "Not left") << "; the system log says why.\n";
        return 1;
    }
    std::cout << (blJoin ? "Joined.\n" : "Left.\n");
    return 0;
}
