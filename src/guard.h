// The guard around every exported function: nothing thrown leaves the library.

#ifndef ZELO_GUARD_H
#define ZELO_GUARD_H

#include <cxxabi.h>

#include <utility>

#include "log.h"

namespace guard {

// Logs the exception that is being handled.
void LogCurrentException(const char *szStem, int line) noexcept;

// Runs the body and returns its result; whatever it throws becomes the failure value and a log
// line. The unwinding of a cancelled thread passes through, as it has to.
template <typename Result, typename Body>
Result Run(const char *szStem, int line, Result failure, Body &&body) {
    try {
        return std::forward<Body>(body)();
    } catch (const abi::__forced_unwind &) {
        throw;
    } catch (...) {
        LogCurrentException(szStem, line);
        return failure;
    }
}

}  // namespace guard

// ZELO_GUARD(failure value, [&] { … }): the failure value's type is the result's.
#define ZELO_GUARD(failure, ...) ::guard::Run(ZELO_SOURCE_STEM, __LINE__, failure, __VA_ARGS__)

#endif
