#include "system_log.h"

#include <syslog.h>

#include <cstring>
#include <mutex>

#include "fixed_text.h"
#include "fork_safe.h"
#include "printable.h"

namespace system_log {
namespace {

// The C library's log has a lock of its own, which a child may find taken for ever.
std::mutex g_mutex;

// Before all other fork handlers of the library, since lines are written under other locks too.
__attribute__((constructor(101))) void RegisterForkHandlers() {
    HoldAroundForks<g_mutex>();
}

// Copies the text made safe for a line; false, with whole characters, when it is cut.
bool CopySafe(std::string_view text, FixedText<kMaxMessage> &out) {
    std::size_t cb = 0;
    for (std::size_t at = 0; at < text.size();) {
        const printable::Shown shown = printable::ShowAt(text, at);
        const std::size_t cbShown = std::strlen(shown.text.sz());
        if (cbShown >= kMaxMessage - cb) {
            return false;
        }
        std::memcpy(out.Buffer() + cb, shown.text.sz(), cbShown);
        cb += cbShown;
        at += shown.cb;
    }
    return true;
}

}  // namespace

void Write(int level, const char *szStem, int line, std::string_view text, std::size_t cbWhole,
           const char *szEnd) noexcept {
    FixedText<kMaxMessage> safe;
    const bool blWhole = CopySafe(text, safe) && cbWhole <= text.size();
    const std::lock_guard<std::mutex> lock(g_mutex);
    if (blWhole) {
        syslog(level, "%s:%d %s%s", szStem, line, safe.sz(), szEnd);
    } else {
        syslog(level, "%s:%d %s... [cut, %zu bytes in all]", szStem, line, safe.sz(),
               cbWhole == 0 ? text.size() + std::strlen(szEnd) : cbWhole);
    }
}

}  // namespace system_log
