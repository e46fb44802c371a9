// What the fuzz targets share: the parts of an input, a file that holds one, and the check that
// ends the program where a promise is broken.

#ifndef ZELO_FUZZ_INPUT_H
#define ZELO_FUZZ_INPUT_H

#include <syslog.h>
#include <unistd.h>

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <string>
#include <string_view>

#define FUZZ_EXPECT(condition)  \
    ((condition)                \
         ? static_cast<void>(0) \
         : (std::fprintf(stderr, "%s:%d: %s\n", __FILE__, __LINE__, #condition), std::abort()))

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *pData, std::size_t cb);

namespace fuzz {

// Millions of refused inputs are no news to the system log.
inline const int kFormerMask = setlogmask(LOG_MASK(LOG_EMERG));

inline std::string_view Input(const std::uint8_t *pData, std::size_t cb) {
    return {reinterpret_cast<const char *>(pData), cb};
}

// Takes the first byte off the input; 0 when nothing is left.
inline int TakeByte(std::string_view &input) {
    if (input.empty()) {
        return 0;
    }
    const int byte = static_cast<unsigned char>(input.front());
    input.remove_prefix(1);
    return byte;
}

// Takes the part up to a zero byte off the input.
inline std::string TakePart(std::string_view &input) {
    const std::string strPart(input.substr(0, input.find('\0')));
    input.remove_prefix(std::min(strPart.size() + 1, input.size()));
    return strPart;
}

// A file in memory that is written anew for each input. Everybody can write to its folder, so a
// change does not wait for a disk.
class InputFile {
  public:
    InputFile() : m_strPath("/dev/shm/fuzz_input_" + std::to_string(getpid())) {}
    ~InputFile() { unlink(m_strPath.c_str()); }
    InputFile(const InputFile &) = delete;
    InputFile &operator=(const InputFile &) = delete;

    void Write(std::string_view text) const {
        std::ofstream(m_strPath, std::ios::binary | std::ios::trunc) << text;
    }
    std::string Read() const {
        std::ifstream file(m_strPath, std::ios::binary);
        return {std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()};
    }
    const char *Path() const { return m_strPath.c_str(); }

  private:
    std::string m_strPath;
};

}  // namespace fuzz

#endif
