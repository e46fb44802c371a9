// The rows, one function for each area of the library.

#ifndef ZELO_BENCH_ROWS_H
#define ZELO_BENCH_ROWS_H

namespace bench {

// Before all others, in this order: the child processes of their rows have to come from one that
// has not called the library.
void AddColdCallRow();
void AddLogRows();

void AddCallRows();
void AddConnectionRows();
void AddCredentialRows();
void AddDownloadRows(int mib);
void AddFileRows();
void AddLogPushRow();

}  // namespace bench

#endif
