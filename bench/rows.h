// The rows, one function for each area of the library.

#ifndef ZELO_BENCH_ROWS_H
#define ZELO_BENCH_ROWS_H

namespace bench {

void AddConnectionRows();
void AddCredentialRows();

}  // namespace bench

#endif
