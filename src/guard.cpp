#include "guard.h"

#include <exception>

#include "log.h"

namespace guard {

void LogCurrentException(const char *szStem, int line) noexcept {
    try {
        throw;
    } catch (const std::exception &exception) {
        qrm_log::Write(szStem, line, "Unexpected exception: %s", exception.what());
    } catch (...) {
        qrm_log::Write(szStem, line, "Unexpected exception");
    }
}

}  // namespace guard
