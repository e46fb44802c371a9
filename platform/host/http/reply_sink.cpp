#include "reply_sink.h"

#include <cerrno>
#include <cstring>
#include <new>

namespace host {
namespace {

constexpr std::size_t kMaxBody = 16UL * 1024 * 1024;
constexpr std::size_t kMaxEnvelope = 64UL * 1024;
constexpr long kStatusUnchanged = 304;

bool IsSuccess(long status) {
    return status >= 200 && status <= 299;
}

}  // namespace

bool ReplySink::Fail(int error, const char *szReason) noexcept {
    m_error = error;
    try {
        m_strReason = szReason;
    } catch (const std::bad_alloc &) {
        m_strReason.clear();
    }
    return false;
}

bool ReplySink::Keep(const char *pData, std::size_t cb) noexcept {
    if (cb > kMaxBody - m_strBody.size()) {
        return Fail(ZELO::CRED_REQ_ERR_REPLY, "the reply is larger than 16 MiB");
    }
    try {
        m_strBody.append(pData, cb);
        return true;
    } catch (const std::bad_alloc &) {
        return Fail(ZELO::CRED_REQ_ERR_MEMORY, "out of memory");
    }
}

bool ReplySink::Take(const char *pData, std::size_t cb, long status) noexcept {
    if (m_pStream == nullptr) {
        return Keep(pData, cb);
    }
    if (!IsSuccess(status)) {
        // An error page is read to its end, so that the connection stays usable, but not for ever;
        // its beginning may say why.
        m_cbPassedOver += cb;
        if (m_cbPassedOver <= kMaxEnvelope && !Keep(pData, cb)) {
            return false;
        }
        return m_cbPassedOver <= kMaxBody ||
               Fail(ZELO::CRED_REQ_ERR_STATUS, "the server answered with an error, without end");
    }
    const std::size_t cbTaken = m_pfnWrite != nullptr ? m_pfnWrite(pData, cb, m_pStream)
                                                      : std::fwrite(pData, 1, cb, m_pStream);
    if (cbTaken != cb) {
        return Fail(ZELO::CRED_REQ_ERR_STREAM, std::strerror(errno));
    }
    m_cbWritten += static_cast<long long>(cb);
    return true;
}

void ReplySink::Finish(long status) noexcept {
    if (m_pStream == nullptr) {
        return;
    }
    if (status == kStatusUnchanged && m_blHasCopy) {
        Fail(ZELO::CRED_REQ_ERR_UNCHANGED, "the copy is current");
    } else if (!IsSuccess(status)) {
        Fail(ZELO::CRED_REQ_ERR_STATUS, "the server answered with an error status");
    } else if (std::fflush(m_pStream) != 0) {
        Fail(ZELO::CRED_REQ_ERR_STREAM, std::strerror(errno));
    }
}

}  // namespace host
