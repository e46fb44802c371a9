// Fetching a file from the joined server: beside its place first, and there in one step when it is
// whole, so that nobody ever reads half of it.
//
//     example-fetch-file PATH NAME

#include <zeloqrmclient.h>

#include <cstdio>
#include <iostream>
#include <string>

int main(int argc, char **argv) {
    if (argc != 3) {
        std::cerr << "usage: example-fetch-file PATH NAME\n";
        return 2;
    }
    // A file that is there already would be offered to the server as the copy that may be current.
    const std::string strPart = std::string(argv[1]) + ".part";
    std::remove(strPart.c_str());

    Json::Value params;
    params["name"] = argv[2];
    params["size"] = 1000000;
    if (ZELOQRMClientGetFile(strPart, "ZELO.QRM.RPC.File", 1, "get", params) != 0) {
        std::remove(strPart.c_str());
        std::cerr << "The file could not be fetched; the system log says why.\n";
        return 1;
    }
    char szDigest[33];
    if (GetFileMd5String(strPart.c_str(), szDigest, sizeof(szDigest)) != 0 ||
        std::rename(strPart.c_str(), argv[1]) != 0) {
        std::perror(argv[1]);
        return 1;
    }
    std::cout << szDigest << "  " << argv[1] << '\n';
    return 0;
}
