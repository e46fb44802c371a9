// The system log: one line per failure, written where the failure is noticed.
//
// A line is "<source file>:<line> <message>" at level LOG_ERR; file and line come from the place
// that logs. A line too long for a log daemon goes out cut, with its whole length named.

#ifndef ZELO_LOG_H
#define ZELO_LOG_H

#include <cstddef>
#include <string>

namespace qrm_log {

// A source file's name without directory and suffix, worked out while compiling, so that no path of
// the build machine gets into the library.
template <std::size_t N>
struct SourceStem {
    char sz[N] = {};

    constexpr explicit SourceStem(const char (&szPath)[N]) {
        std::size_t begin = 0;
        std::size_t end = N - 1;
        for (std::size_t i = 0; i + 1 < N; ++i) {
            if (szPath[i] == '/') {
                begin = i + 1;
                end = N - 1;
            } else if (szPath[i] == '.') {
                end = i;
            }
        }
        for (std::size_t i = begin; i < end; ++i) {
            sz[i - begin] = szPath[i];
        }
    }
};

// Writes one line. Never throws and allocates nothing, so it works when memory is short.
void Write(const char *szStem, int line, const char *szFormat, ...)
    __attribute__((format(printf, 3, 4)));

// Text from outside for a log line: the secret blanked out, also where it stands in JSON
// notation, and control characters escaped.
std::string SafeText(const std::string &strText, const std::string &strSecret);

}  // namespace qrm_log

#define ZELO_SOURCE_STEM                                       \
    ([]() -> const char * {                                    \
        static constexpr ::qrm_log::SourceStem stem(__FILE__); \
        return stem.sz;                                        \
    }())

#define ZELO_LOG(...) ::qrm_log::Write(ZELO_SOURCE_STEM, __LINE__, __VA_ARGS__)

#endif
