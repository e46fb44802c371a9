#include <cstdio>
#include <cstring>
#include <filesystem>

#include "ratio_table.h"
#include "rows.h"

int main(int argc, char **argv) {
    if (std::filesystem::exists("/usr/zelo/etc/credentials/credentials.db")) {
        std::fputs(
            "zelo-bench: there is a credential store: run scripts/bench, which makes a box\n",
            stderr);
        return 2;
    }
    const bool blQuick = argc > 1 && std::strcmp(argv[1], "--quick") == 0;
    if (blQuick) {
        argv[1] = argv[0];
        --argc;
        ++argv;
    }
    // First what first calls cost: their processes are born of this one, which has called nothing
    // yet.
    bench::AddColdCallRow();
    bench::AddLogRows();
    bench::AddCallRows();
    bench::AddLogPushRow();
    bench::AddConnectionRows();
    bench::AddCredentialRows();
    bench::AddFileRows();
    // Last: so much memory, taken and given back, changes what smaller rows after it find.
    bench::AddDownloadRows(blQuick ? 256 : 1024);
    return bench::Run(argc, argv);
}
