// Where the body of a reply goes: into memory, bounded, or straight into a caller's open file.

#ifndef ZELO_HOST_REPLY_SINK_H
#define ZELO_HOST_REPLY_SINK_H

#include <cstdio>
#include <string>

#include "web_api_request.h"

namespace host {

class ReplySink {
  public:
    // With a stream, the body goes there (through pfnWrite when it is not null); without one into
    // memory. Only a request that told of a copy can be answered that the copy is current.
    ReplySink(std::FILE *pStream, ZELO::CredRequest::RespWriteCallback pfnWrite, bool blHasCopy)
        : m_pStream(pStream), m_pfnWrite(pfnWrite), m_blHasCopy(blHasCopy) {}

    // Takes the next piece of the body of a reply with this status. Returns false to end the
    // transfer; Error then says why. Never throws: libcurl calls it.
    bool Take(const char *pData, std::size_t cb, long status) noexcept;

    // After a transfer that went well: judges the status, and writes out what the stream still
    // holds.
    void Finish(long status) noexcept;

    // A value of ZELO::CRED_REQ_ERROR, and what goes with it for people.
    int Error() const { return m_error; }
    const std::string &Reason() const { return m_strReason; }

    long long Written() const { return m_cbWritten; }

    // What is in memory: the body, or with a stream the beginning of an error page.
    std::string &Body() { return m_strBody; }

  private:
    bool Fail(int error, const char *szReason) noexcept;
    bool Keep(const char *pData, std::size_t cb) noexcept;

    std::FILE *m_pStream;
    ZELO::CredRequest::RespWriteCallback m_pfnWrite;
    bool m_blHasCopy;
    std::string m_strBody;
    std::string m_strReason;
    std::size_t m_cbPassedOver = 0;
    long long m_cbWritten = 0;
    int m_error = ZELO::CRED_REQ_ERR_NONE;
};

}  // namespace host

#endif
