// A source file's name for log lines and errors.

#ifndef ZELO_SOURCE_STEM_H
#define ZELO_SOURCE_STEM_H

#include <cstddef>

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

// The name of the source file that it stands in, a text with static storage.
#define ZELO_SOURCE_STEM                            \
    ([]() -> const char * {                         \
        static constexpr SourceStem stem(__FILE__); \
        return stem.sz;                             \
    }())

#endif
