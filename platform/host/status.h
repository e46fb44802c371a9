// Why something inside the host platform failed, and how its caller learns of it.
//
// A function of the host that can fail returns a Status. An exported operation runs its body in
// Operation(), which turns the status into the operation's result.

#ifndef ZELO_HOST_STATUS_H
#define ZELO_HOST_STATUS_H

#include <new>
#include <string>
#include <utility>

#include "last_error.h"
#include "source_stem.h"

namespace host {

class [[nodiscard]] Status {
  public:
    // Nothing has failed.
    Status() = default;

    // Failed: a code of YLIBC_ERROR, the place in the source, and the reason in words that tell an
    // operator what failed and why: "'/tmp/userlock' belongs to the user 1000". No secrets.
    Status(unsigned int code, const char *szStem, int line, std::string strWords)
        : m_code(code), m_szStem(szStem), m_line(line), m_strWords(std::move(strWords)) {}

    bool Failed() const { return m_code != YLIBC_ERR_NONE; }
    unsigned int Code() const { return m_code; }
    const std::string &Words() const { return m_strWords; }

    // The same failure, which is to be written to the system log when the operation ends: for what
    // its header promises a log line.
    Status Logged(int level) && {
        m_level = level;
        return std::move(*this);
    }

    // Writes the log line, if it is to have one, and forgets that it was to. For a failure that
    // ends no operation.
    void Log();

    // Makes this failure the calling thread's last error, with its words, and writes the log line.
    void Publish();

  private:
    unsigned int m_code = YLIBC_ERR_NONE;
    const char *m_szStem = "";
    int m_line = 0;
    int m_level = -1;  // none: no log line
    std::string m_strWords;
};

// A failure at this place: HOST_ERROR(code, words).
#define HOST_ERROR(code, ...) ::host::Status(code, ZELO_SOURCE_STEM, __LINE__, __VA_ARGS__)

// Returns the status of a call when it is a failure.
#define HOST_TRY(...)                                                   \
    do {                                                                \
        if (::host::Status status_ = (__VA_ARGS__); status_.Failed()) { \
            return status_;                                             \
        }                                                               \
    } while (false)

// A null or unusable argument.
#define HOST_REQUIRE(condition)                                                   \
    do {                                                                          \
        if (!(condition)) {                                                       \
            return HOST_ERROR(YLIBC_ERR_INVALID_ARGUMENT, "not so: " #condition); \
        }                                                                         \
    } while (false)

// The last error when memory is too short for words.
void PublishShortMemory(const char *szStem, int line);

// Runs the body of an exported operation, which returns a Status. Returns `result`, as it is then,
// or `failure` with the last error set.
template <typename Result, typename Body>
Result RunOperation(const char *szStem, int line, Result failure, Result &result, Body &&body) {
    try {
        Status status = std::forward<Body>(body)();
        if (!status.Failed()) {
            return std::move(result);
        }
        status.Publish();
    } catch (const std::bad_alloc &) {
        PublishShortMemory(szStem, line);
    }
    return failure;
}

// The same with the results 0 and -1.
template <typename Body>
int RunOperation(const char *szStem, int line, Body &&body) {
    int result = 0;
    return RunOperation(szStem, line, -1, result, std::forward<Body>(body));
}

// return HOST_OPERATION([&]() -> host::Status { … });                  0 or -1
// return HOST_OPERATION(failure, result, [&]() -> host::Status { … });  `result`, set by the body
#define HOST_OPERATION(...) ::host::RunOperation(ZELO_SOURCE_STEM, __LINE__, __VA_ARGS__)

// The words of the calling thread's last error; "" when it has none.
const char *LastErrorWords();

}  // namespace host

#endif
