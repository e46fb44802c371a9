#include "reply.h"

#include <httplib.h>

#include <algorithm>
#include <ctime>
#include <iomanip>
#include <sstream>

#include "json.h"

namespace devserver {
namespace {

constexpr std::size_t kPiece = 256UL * 1024;
constexpr int kTick_ms = 50;
constexpr int kSecond_ms = 1000;

// The body piece by piece, at the rate that is asked for.
class Pieces {
  public:
    Pieces(const Reply &reply, const NextAnswer &answer, Pause pause, End end)
        : m_reply(reply), m_answer(answer), m_pause(std::move(pause)), m_end(std::move(end)) {}

    std::uint64_t Size() const {
        return m_reply.pFile != nullptr ? m_reply.pFile->Size() : m_reply.strBody.size();
    }

    // Writes the piece at the offset; false ends the connection.
    bool Write(std::uint64_t offset, httplib::DataSink &sink) const {
        const std::uint64_t end = m_answer.cut_after.value_or(m_answer.endless ? kNoEnd : Size());
        if (offset >= end) {
            return false;
        }
        std::uint64_t cb = std::min<std::uint64_t>(kPiece, end - offset);
        if (m_answer.bytes_per_s > 0) {
            const int bytes_per_s = m_answer.bytes_per_s;
            const bool blSlow = bytes_per_s < kSecond_ms / kTick_ms;
            if (!m_pause(blSlow ? kSecond_ms / bytes_per_s : kTick_ms)) {
                return false;
            }
            cb = std::min<std::uint64_t>(cb, blSlow ? 1 : bytes_per_s * kTick_ms / kSecond_ms);
        }
        const std::string strPiece = PieceAt(offset, cb);
        if (!sink.write(strPiece.data(), strPiece.size())) {
            return false;
        }
        if (EndsInOrder() && offset + strPiece.size() == Size()) {
            m_end();
            if (m_answer.no_length) {
                sink.done();
            }
        }
        return true;
    }

  private:
    bool EndsInOrder() const {
        return !m_answer.cut_after && (m_answer.closes || m_answer.no_length);
    }

    static constexpr std::uint64_t kNoEnd = ~std::uint64_t{0};

    // Past the end of an endless body come blanks.
    std::string PieceAt(std::uint64_t offset, std::size_t cb) const {
        std::string strPiece;
        if (m_reply.pFile != nullptr) {
            strPiece = m_reply.pFile->Read(offset, cb);
        } else if (offset < m_reply.strBody.size()) {
            strPiece = m_reply.strBody.substr(offset, cb);
        }
        return strPiece.empty() ? std::string(cb, ' ') : strPiece;
    }

    Reply m_reply;
    NextAnswer m_answer;
    Pause m_pause;
    End m_end;
};

// Such as "Sun, 06 Nov 1994 08:49:37 GMT", whatever the language of the process.
std::string HttpDate(std::time_t time) {
    constexpr const char *kDays[] = {"Sun", "Mon", "Tue", "Wed", "Thu", "Fri", "Sat"};
    constexpr const char *kMonths[] = {"Jan", "Feb", "Mar", "Apr", "May", "Jun",
                                       "Jul", "Aug", "Sep", "Oct", "Nov", "Dec"};
    std::tm utc = {};
    gmtime_r(&time, &utc);
    std::ostringstream text;
    text << kDays[utc.tm_wday] << std::put_time(&utc, ", %d ") << kMonths[utc.tm_mon]
         << std::put_time(&utc, " %Y %H:%M:%S GMT");
    return text.str();
}

}  // namespace

Reply JsonReply(int status, const Json::Value &value) {
    Reply reply;
    reply.status = status;
    json::ToString(value, reply.strBody);
    return reply;
}

void Send(const Reply &reply, const NextAnswer &answer, const Pause &pause, const End &end,
          httplib::Response &response) {
    response.status = reply.status;
    // A header that is set twice goes out twice.
    if (answer.headers.count("Date") == 0) {
        response.set_header("Date", HttpDate(std::time(nullptr)));
    }
    for (const auto *pHeaders : {&reply.headers, &answer.headers}) {
        for (const auto &[strName, strValue] : *pHeaders) {
            response.set_header(strName, strValue);
        }
    }
    const auto typeOf = answer.headers.find("Content-Type");
    const std::string strType = typeOf == answer.headers.end() ? reply.strType : typeOf->second;
    response.headers.erase("Content-Type");

    const auto pPieces = std::make_shared<const Pieces>(reply, answer, pause, end);
    if (answer.endless) {
        response.set_chunked_content_provider(
            strType, [pPieces](std::size_t offset, httplib::DataSink &sink) {
                return pPieces->Write(offset, sink);
            });
    } else if (answer.no_length) {
        response.set_content_provider(strType,
                                      [pPieces](std::size_t offset, httplib::DataSink &sink) {
                                          return pPieces->Write(offset, sink);
                                      });
    } else if (reply.pFile != nullptr || answer.cut_after || answer.bytes_per_s > 0 ||
               answer.closes) {
        // A cut reply promises more than it sends; giving up half-way is what closes.
        const std::uint64_t promised =
            std::max<std::uint64_t>(pPieces->Size(), answer.cut_after ? *answer.cut_after + 1 : 0);
        response.set_content_provider(
            promised, strType,
            [pPieces](std::size_t offset, std::size_t /*length*/, httplib::DataSink &sink) {
                return pPieces->Write(offset, sink);
            });
    } else {
        response.set_content(reply.strBody, strType);
    }
}

}  // namespace devserver
