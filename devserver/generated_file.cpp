#include "generated_file.h"

#include <openssl/evp.h>

#include <algorithm>
#include <array>
#include <cstdio>
#include <functional>
#include <random>

#include "dev_certificate.h"

namespace devserver {
namespace {

// A prime, so that no block size of a reader lines up with the repetition.
constexpr std::size_t kPattern = 262'139;
constexpr std::size_t kPiece = 256UL * 1024;

}  // namespace

GeneratedFile::GeneratedFile(const std::string &strName, std::uint64_t size) : m_size(size) {
    std::minstd_rand bytes(static_cast<unsigned int>(std::hash<std::string>{}(strName)));
    m_strPattern.resize(std::min<std::uint64_t>(kPattern, size));
    std::generate(m_strPattern.begin(), m_strPattern.end(),
                  [&bytes] { return static_cast<char>(bytes() >> 16U); });
}

std::string GeneratedFile::Read(std::uint64_t offset, std::size_t cb) const {
    std::string strPiece;
    const std::uint64_t end = std::min<std::uint64_t>(m_size, offset + cb);
    while (offset + strPiece.size() < end) {
        const std::uint64_t at = offset + strPiece.size();
        strPiece.append(m_strPattern, at % m_strPattern.size(), end - at);
    }
    return strPiece;
}

std::string GeneratedFile::Md5() const {
    const std::unique_ptr<EVP_MD_CTX, OpensslRelease<EVP_MD_CTX_free>> pDigest(EVP_MD_CTX_new());
    std::array<unsigned char, EVP_MAX_MD_SIZE> digest = {};
    unsigned int cbDigest = 0;
    EVP_DigestInit_ex(pDigest.get(), EVP_md5(), nullptr);
    for (std::uint64_t offset = 0; offset < m_size; offset += kPiece) {
        const std::string strPiece = Read(offset, kPiece);
        EVP_DigestUpdate(pDigest.get(), strPiece.data(), strPiece.size());
    }
    EVP_DigestFinal_ex(pDigest.get(), digest.data(), &cbDigest);
    std::string strDigits;
    for (unsigned int i = 0; i < cbDigest; ++i) {
        std::array<char, 3> digits = {};
        std::snprintf(digits.data(), digits.size(), "%02x", digest[i]);
        strDigits += digits.data();
    }
    return strDigits;
}

}  // namespace devserver
