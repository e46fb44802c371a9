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
    const bool blFull = argc > 1 && std::strcmp(argv[1], "--full") == 0;
    if (blFull) {
        argv[1] = argv[0];
        --argc;
        ++argv;
    }
    bench::AddColdCallRow();
    bench::AddCallRows();
    bench::AddConnectionRows();
    bench::AddCredentialRows();
    bench::AddDownloadRows(blFull ? 1024 : 256);
    bench::AddFileRows();
    bench::AddLogRows();
    return bench::Run(argc, argv);
}
