#include "transfer.h"

#include <string_view>

#include "exchange_options.h"
#include "exchange_record.h"
#include "fork_guard.h"
#include "server_address.h"

namespace host {
namespace {

// For a body in memory; one that goes to a stream may take its time as long as it moves.
constexpr std::chrono::seconds kWholeLimit{300};
// Headers, trailers, informational replies and what a relay or proxy answers, together.
constexpr std::size_t kMaxBesidesBody = 300'000;

struct Observer {
    ZELO::CredRequestUtil::ProgressObserver pfn = nullptr;
    void *pContext = nullptr;
};

thread_local Observer t_observer;

Wait::Clock::duration LimitOf(const HttpRequest &request) {
    if (request.limit_ms > 0) {
        return std::chrono::milliseconds(request.limit_ms);
    }
    return request.pStream == nullptr ? kWholeLimit : Wait::Clock::duration::max();
}

// --- Callbacks: they run inside libcurl, so nothing may be thrown out of them -------------------

// Runs before each sending of a request. libcurl sends it again when a connection that was kept
// ends before the reply; what has been carried out by then, nobody knows.
int AllowSending(void *pContext, char * /*szPeer*/, char * /*szOwn*/, int /*peerPort*/,
                 int /*ownPort*/) {
    auto *const pTransfer = static_cast<Transfer *>(pContext);
    pTransfer->handle.blTlsEnded = false;
    ++pTransfer->sendings;
    return pTransfer->request.blPost && pTransfer->sendings > 1 ? CURL_PREREQFUNC_ABORT
                                                                : CURL_PREREQFUNC_OK;
}

// Trailers and the headers of informational replies come here too. libcurl takes headers that are
// cut for a reply without a body.
size_t TakeHeader(char *pData, size_t size, size_t count, void *pContext) {
    const std::string_view line(pData, size * count);
    auto *const pTransfer = static_cast<Transfer *>(pContext);
    if (line.substr(0, 5) == "HTTP/") {
        pTransfer->blHeadersEnded = false;
    } else if (line == "\r\n" || line == "\n") {
        pTransfer->blHeadersEnded = true;
    }
    pTransfer->cbBesidesBody += line.size();
    return pTransfer->IsTooMuch() ? CURL_WRITEFUNC_ERROR : line.size();
}

// Whether the body has an encoding besides "identity", the one that is asked for.
bool IsEncoded(CURL *pEasy) {
    curl_header *pHeader = nullptr;
    for (std::size_t i = 0;
         curl_easy_header(pEasy, "Content-Encoding", i, CURLH_HEADER, -1, &pHeader) == CURLHE_OK;
         ++i) {
        if (!curl_strequal(pHeader->value, "identity")) {
            return true;
        }
    }
    return false;
}

// A stream may keep the write waiting, and a function of the program's may do anything.
bool PutIntoSink(const char *pData, std::size_t cb, Transfer &transfer) {
    if (transfer.request.pStream == nullptr) {
        return transfer.sink.Take(pData, cb, transfer.status);
    }
    bool blTaken = false;
    {
        const OutsideLibcurl outside;
        blTaken = transfer.sink.Take(pData, cb, transfer.status);
    }
    return blTaken && !transfer.handle.blForked;
}

size_t TakeBody(char *pData, size_t size, size_t count, void *pContext) {
    auto *const pTransfer = static_cast<Transfer *>(pContext);
    if (pTransfer->status == 0) {
        CURL *const pEasy = pTransfer->handle.pEasy.get();
        curl_easy_getinfo(pEasy, CURLINFO_RESPONSE_CODE, &pTransfer->status);
        pTransfer->blEncoded = IsEncoded(pEasy);
    }
    const size_t cb = size * count;
    return !pTransfer->blEncoded && PutIntoSink(pData, cb, *pTransfer) ? cb : CURL_WRITEFUNC_ERROR;
}

// libcurl reads what a relay answers byte by byte, tells of nothing but its headers, and calls this
// after each. Until a request is sent, a call counts as a byte.
int ShowProgress(void *pContext, curl_off_t cbExpected, curl_off_t /*cbReceived*/,
                 curl_off_t /*cbToSend*/, curl_off_t /*cbSent*/) {
    auto *const pTransfer = static_cast<Transfer *>(pContext);
    NoteConnection(pTransfer->handle.pEasy.get(), pTransfer->handle.record);
    if (pTransfer->IsConnecting()) {
        ++pTransfer->cbBesidesBody;
    }
    {
        const OutsideLibcurl outside;
        static_cast<void>(pTransfer->wait.Slice());
        pTransfer->blStopped = t_observer.pfn != nullptr &&
                               !t_observer.pfn(t_observer.pContext, pTransfer->sink.Written(),
                                               cbExpected > 0 ? cbExpected : -1);
    }
    return pTransfer->blStopped || pTransfer->IsTooMuch() || pTransfer->IsTimeUp() ||
                   pTransfer->handle.blForked
               ? 1
               : 0;
}

}  // namespace

Transfer::Transfer(const HttpRequest &ofRequest, CurlHandle &onHandle)
    : request(ofRequest),
      handle(onHandle),
      sink(request.pStream, request.pfnWrite, request.blHasCopy),
      wait("the reply of " + HostAndPortOf(request.strUrl), LimitOf(request)),
      connecting("", std::chrono::seconds(kConnectLimit_s)) {}

bool Transfer::IsTooMuch() const {
    return cbBesidesBody > kMaxBesidesBody;
}

bool Transfer::IsTimeUp() const {
    return wait.Left() == Wait::Clock::duration::zero() ||
           (IsConnecting() && connecting.Left() == Wait::Clock::duration::zero());
}

void SetCallbacks(Transfer &transfer) {
    CURL *const pEasy = transfer.handle.pEasy.get();
    curl_easy_setopt(pEasy, CURLOPT_PREREQFUNCTION, AllowSending);
    curl_easy_setopt(pEasy, CURLOPT_PREREQDATA, &transfer);
    curl_easy_setopt(pEasy, CURLOPT_HEADERFUNCTION, TakeHeader);
    curl_easy_setopt(pEasy, CURLOPT_HEADERDATA, &transfer);
    curl_easy_setopt(pEasy, CURLOPT_WRITEFUNCTION, TakeBody);
    curl_easy_setopt(pEasy, CURLOPT_WRITEDATA, &transfer);
    curl_easy_setopt(pEasy, CURLOPT_XFERINFOFUNCTION, ShowProgress);
    curl_easy_setopt(pEasy, CURLOPT_XFERINFODATA, &transfer);
    curl_easy_setopt(pEasy, CURLOPT_NOPROGRESS, 0L);
}

}  // namespace host

void ZELO::CredRequestUtil::SetProgressObserver(ProgressObserver pfnObserver, void *pContext) {
    host::t_observer = {pfnObserver, pContext};
}
