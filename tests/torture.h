// Torture: every platform call of a function fails in turn, and each failure has to come out as the
// table says: result, log line, what the store holds, nothing left allocated.

#ifndef ZELO_TESTS_TORTURE_H
#define ZELO_TESTS_TORTURE_H

#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <functional>
#include <map>
#include <set>
#include <sstream>
#include <string>
#include <vector>

#include "seam.h"

namespace torture {

struct Expected {
    std::string strResult;
    std::string strLog;     // the messages, a line each, "" for none
    std::string strStored;  // what the case's state function says afterwards
    int recordsKept = 0;    // records that stay allocated on purpose
};

struct Case {
    std::string strName;
    std::string strFile;  // the source file that logs; "" where each message begins with its file
    std::function<void()> setUp;
    std::function<std::string()> run;  // calls the function, returns its result as text
    std::function<std::string()> state;
    // All calls in order, separated by blanks; with their arguments, a line each, where a test says
    // so.
    std::string strCalls;
    Expected unfaulted;
    // By "Operation" (any call of it) or "Operation#2" (the second call).
    std::map<std::string, Expected> faults;
    bool blInChild =
        false;  // each run in a process of its own, with nothing kept from the last one
    std::size_t countedCalls = static_cast<std::size_t>(-1);  // only the first calls are looked at
};

// The tail with the platform's last error, whose lines come and go, as "[E]".
inline std::string WithoutErrorTail(const std::string &strMessage) {
    const std::size_t at = strMessage.rfind("[0x");
    unsigned int code = 0;
    int cbCode = 0;
    int line = 0;
    char end = '\0';
    if (at == std::string::npos ||
        std::sscanf(strMessage.c_str() + at, "[0x%4X %n", &code, &cbCode) != 1 || cbCode != 8 ||
        std::sscanf(strMessage.c_str() + strMessage.rfind(':'), ":%d%c", &line, &end) != 2 ||
        end != ']') {
        return strMessage;
    }
    return strMessage.substr(0, at) + "[E]";
}

// Runs the body, in a child process where that is asked for; what the body expects counts as the
// test's own.
inline void Separately(bool blInChild, const std::function<void()> &body) {
    if (!blInChild) {
        body();
        return;
    }
    std::fflush(nullptr);
    const pid_t pid = fork();
    ASSERT_GE(pid, 0);
    if (pid == 0) {
        body();
        std::fflush(nullptr);
        _exit(testing::Test::HasFailure() ? 1 : 0);
    }
    int status = -1;
    waitpid(pid, &status, 0);
    EXPECT_EQ(status, 0) << "in the child process; see above";
}

inline void Check(const Case &test, const seam::Outcome &outcome, const std::string &strResult,
                  const Expected &expected) {
    EXPECT_EQ(strResult, expected.strResult);
    EXPECT_EQ(test.state(), expected.strStored);
    EXPECT_EQ(outcome.recordsLeft, expected.recordsKept);
    std::string strLog;
    for (const seam::LogLine &log : outcome.logs) {
        strLog += (strLog.empty() ? "" : "\n") + (test.strFile.empty() ? log.strFile + ' ' : "") +
                  WithoutErrorTail(log.strMessage);
        EXPECT_TRUE(test.strFile.empty() || log.strFile == test.strFile) << log.strFile;
        EXPECT_EQ(log.level, 3);
    }
    EXPECT_EQ(strLog, expected.strLog);
}

inline std::string Joined(const std::vector<std::string> &parts, const char *szBetween,
                          std::size_t most = static_cast<std::size_t>(-1)) {
    std::string strAll;
    for (std::size_t i = 0; i < std::min(parts.size(), most); ++i) {
        strAll += (i == 0 ? "" : szBetween) + parts[i];
    }
    return strAll;
}

inline bool HasArguments(const Case &test) {
    return test.strCalls.find('(') != std::string::npos;
}

// The names of the calls that the case expects.
inline std::vector<std::string> CallNames(const Case &test) {
    std::vector<std::string> names;
    std::istringstream calls(test.strCalls);
    std::string strCall;
    while (std::getline(calls, strCall, HasArguments(test) ? '\n' : ' ')) {
        names.push_back(strCall.substr(0, strCall.find('(')));
    }
    return names;
}

inline seam::Outcome RunOnce(const Case &test, const seam::Fault &fault, const Expected &expected) {
    test.setUp();
    std::string strResult;
    seam::Outcome outcome = seam::Observe(fault, [&] { strResult = test.run(); });
    Check(test, outcome, strResult, expected);
    return outcome;
}

inline void Run(const Case &test) {
    SCOPED_TRACE(test.strName);
    Separately(test.blInChild, [&] {
        const seam::Outcome clean = RunOnce(test, {}, test.unfaulted);
        EXPECT_EQ(HasArguments(test) ? Joined(clean.details, "\n", test.countedCalls)
                                     : Joined(clean.calls, " ", test.countedCalls),
                  test.strCalls);
    });

    std::map<std::string, int> counts;
    std::set<std::string> used;
    for (const std::string &strCall : CallNames(test)) {
        const int nth = ++counts[strCall];
        const std::string strNth = strCall + '#' + std::to_string(nth);
        SCOPED_TRACE("failing " + strNth);
        auto row = test.faults.find(strNth);
        row = row == test.faults.end() ? test.faults.find(strCall) : row;
        if (row == test.faults.end()) {
            ADD_FAILURE() << "no row";
            continue;
        }
        used.insert(row->first);
        Separately(test.blInChild, [&] { RunOnce(test, {strCall, nth}, row->second); });
    }
    EXPECT_EQ(used.size(), test.faults.size()) << "rows without a call";
}

}  // namespace torture

#endif
