// Finding secrets in text whose characters may be written in other ways: as in JSON (\" \/ \u002F
// \x2F), an URL (%2F) or HTML (&quot; &#47; &#x2F;), also several times over and one within the
// other (%252F, &amp;quot;, \u0026quot;).

#ifndef ZELO_SECRET_SEARCH_H
#define ZELO_SECRET_SEARCH_H

#include <array>
#include <cstddef>
#include <string>
#include <vector>

// One way to read the text at a place.
struct Reading {
    std::string strBytes;  // what stands there
    std::size_t end;       // where the text goes on
};

// Every way to read the text at the place; the byte itself comes first.
std::vector<Reading> ReadingsAt(const std::string &strText, std::size_t at);

class SecretSearch {
  public:
    // blWrapped: line ends and blanks within a secret do not count.
    explicit SecretSearch(bool blWrapped = false) : m_blWrapped(blWrapped) {}

    // An empty secret is found nowhere.
    void Add(const std::string &strSecret);

    // How many bytes of the text at the place stand for one of the secrets, the longest of them; 0
    // for none. Backslashes before a character do not count. Text whose first 32 bytes are those of
    // a secret counts as that secret, as far as the two agree: so looking at every place takes time
    // that grows with the text alone.
    std::size_t LengthAt(const std::string &strText, std::size_t at) const;

  private:
    std::size_t EndOf(const std::string &strSecret, const std::string &strText,
                      const Reading &first) const;

    bool m_blWrapped;
    std::array<std::vector<std::string>, 256> m_byFirstByte;
};

#endif
