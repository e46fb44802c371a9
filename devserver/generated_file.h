// Files of any size, made as they are read: the same name and size always give the same content.

#ifndef ZELO_GENERATED_FILE_H
#define ZELO_GENERATED_FILE_H

#include <cstdint>
#include <string>

namespace devserver {

class GeneratedFile {
  public:
    GeneratedFile(const std::string &strName, std::uint64_t size);

    std::uint64_t Size() const { return m_size; }

    // At most cb bytes from the offset on; fewer at the end.
    std::string Read(std::uint64_t offset, std::size_t cb) const;

    // The MD5 digest of the whole, 32 lower-case hexadecimal digits. Reads all of it.
    std::string Md5() const;

  private:
    std::string m_strPattern;  // the content is this, over and over
    std::uint64_t m_size;
};

}  // namespace devserver

#endif
