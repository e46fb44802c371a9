#include "ratio_table.h"
#include "rows.h"

int main(int argc, char **argv) {
    bench::AddConnectionRows();
    bench::AddCredentialRows();
    return bench::Run(argc, argv);
}
