// Pushing an entry to the joined server's log. The message is one of the interface's texts, in all
// of its languages; without a section it would be the second argument itself.
//
//     example-push-log VOLUME

#include <zeloqrmclient.h>

#include <iostream>

int main(int argc, char **argv) {
    if (argc != 2 || argv[1][0] == '-') {
        std::cerr << "usage: example-push-log VOLUME\n";
        return 2;
    }
    // "Volume {0} is degraded: {1}", whose second marker another text fills.
    const int level = ZELOQRMClientLogLevelStrToInt("warning");
    if (ZELOQRMClientLog(level, "qrm_log", "volume_degraded", argv[1], "{volume:disk_missing}",
                         nullptr) != 0) {
        std::cerr << "The server has not taken the entry; the system log says why.\n";
        return 1;
    }
    std::cout << "The server has the entry.\n";
    return 0;
}
