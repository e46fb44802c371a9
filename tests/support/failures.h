// Why a call of the platform has failed.

#ifndef ZELO_TESTS_FAILURES_H
#define ZELO_TESTS_FAILURES_H

#include <string>

#include "diagnosis.h"
#include "last_error.h"

// Of the call that has just given the result; YLIBC_ERR_NONE when it has not failed.
inline YLIBC_ERROR FailureOf(long result) {
    return result < 0 ? static_cast<YLIBC_ERROR>(YLIBCErrGet()) : YLIBC_ERR_NONE;
}

namespace failures {

// The words of the thread's latest failure.
inline std::string Reason() {
    char szReason[1024] = {};
    ZELODiagnosisReason(szReason, sizeof(szReason));
    return szReason;
}

}  // namespace failures

#endif
