// A harness at the platform seam: it sees every platform operation and system call that the library
// makes, in order, and makes chosen ones fail. The calls go to the real host platform; only the
// library's own are seen, not those that the platform makes, and only on the observing thread.

#ifndef ZELO_TESTS_SEAM_H
#define ZELO_TESTS_SEAM_H

#include <functional>
#include <string>
#include <type_traits>
#include <vector>

namespace seam {

struct LogLine {
    int level;
    std::string strFile;
    std::string strMessage;
};

struct Outcome {
    std::vector<std::string> calls;    // names of all calls but releases and log lines
    std::vector<std::string> details;  // the same with their arguments, "ZELOCredLoad(-1, *)"
    std::vector<LogLine> logs;
    int recordsLeft = 0;  // records allocated and not released
};

// All messages, one line each.
inline std::string Messages(const Outcome &outcome) {
    std::string strAll;
    for (const LogLine &log : outcome.logs) {
        strAll += (strAll.empty() ? "" : "\n") + log.strMessage;
    }
    return strAll;
}

struct Fault {
    std::string strOperation;
    int nth = 1;                 // which call of the operation, counted from 1; not for releases
    bool blForceResult = false;  // false: the call is not made and gives its failure value
    long result = 0;             // true: the call is made, and this takes the place of its result
    int killAt = 0;  // the call, counted from 1 over all of them, that the process dies before
    std::string strFill{};  // written into the call's buffers, without a zero, in place of the call
};

// An argument as it stands in the details: numbers and texts as they are, "buf" for a buffer to
// fill, "null" or "*" for any other pointer.
inline std::string ArgumentText(const char *sz) {
    return sz == nullptr ? "null" : '\'' + std::string(sz) + '\'';
}
inline std::string ArgumentText(const std::string &strText) {
    return '\'' + strText + '\'';
}
inline std::string ArgumentText(char *sz) {
    return sz == nullptr ? "null" : "buf";
}
template <typename T>
std::string ArgumentText(const T &argument) {
    if constexpr (std::is_pointer_v<T>) {
        return argument == nullptr ? "null" : "*";
    } else if constexpr (std::is_arithmetic_v<T> || std::is_enum_v<T>) {
        return std::to_string(static_cast<long>(argument));
    } else {
        return "*";
    }
}

template <typename... T>
std::string ArgumentTexts(const T &...arguments) {
    std::string strAll;
    ((strAll += (strAll.empty() ? "" : ", ") + ArgumentText(arguments)), ...);
    return '(' + strAll + ')';
}

// Runs the body on this thread and reports what the library did.
Outcome Observe(const std::function<void()> &body);
Outcome Observe(const Fault &fault, const std::function<void()> &body);

inline std::string MessagesOf(const std::function<void()> &body) {
    return Messages(Observe(body));
}
inline std::string MessagesOf(const Fault &fault, const std::function<void()> &body) {
    return Messages(Observe(fault, body));
}

}  // namespace seam

#endif
