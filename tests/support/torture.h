// Torture: every platform call of a function fails in turn, and each failure has to come out as the
// table says: result, log line, what the store holds, nothing left allocated.

#ifndef ZELO_TESTS_TORTURE_H
#define ZELO_TESTS_TORTURE_H

#include <gtest/gtest.h>

#include <cstdio>
#include <functional>
#include <map>
#include <regex>
#include <sstream>
#include <string>
#include <vector>

#include "children.h"
#include "seam.h"

namespace torture {

struct Expected {
    std::string strResult;
    std::string strLog;     // the messages, a line each, "" for none
    std::string strStored;  // what the case's state function says afterwards
    int recordsKept = 0;    // records that stay allocated on purpose
};

// Calls that follow each other, and what has to come out when any of them fails.
struct Step {
    std::string strCalls;  // by name, separated by blanks; or with their arguments, a line each
    Expected failing;
};

struct Case {
    std::string strName;
    std::string strFile;  // the source file that logs; "" where each message begins with its file
    std::function<void()> setUp;
    std::function<std::string()> run;  // calls the function, returns its result as text
    std::function<std::string()> state;
    Expected unfaulted;
    std::vector<Step> steps;  // all calls in their order
    bool blInChild =
        false;              // each run in a process of its own, with nothing kept from the last one
    bool blGoesOn = false;  // calls that come after the steps are not looked at
};

// The tail with the platform's last error, whose lines come and go, as "[E]".
inline std::string WithoutErrorTail(const std::string &strMessage) {
    static const std::regex tail(R"(\[0x[0-9A-F]{4} [^\[]*:[0-9]+\]$)");
    return std::regex_replace(strMessage, tail, "[E]");
}

// Runs the body, in a child process where that is asked for; what the body expects counts as the
// test's own.
inline void Separately(bool blInChild, const std::function<void()> &body) {
    if (!blInChild) {
        body();
        return;
    }
    std::fflush(nullptr);
    EXPECT_TRUE(children::InOne([&] {
        body();
        std::fflush(nullptr);
        return !testing::Test::HasFailure();
    })) << "in the child process; see above";
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

inline std::string Joined(const std::vector<std::string> &parts, const char *szBetween) {
    std::string strAll;
    for (std::size_t i = 0; i < parts.size(); ++i) {
        strAll += (i == 0 ? "" : szBetween) + parts[i];
    }
    return strAll;
}

struct Call {
    std::string strText;  // the name, and the arguments where they count
    Expected failing;

    std::string Name() const { return strText.substr(0, strText.find('(')); }
    bool HasArguments() const { return strText.size() > Name().size(); }
};

inline std::vector<Call> Calls(const std::vector<Step> &steps) {
    std::vector<Call> calls;
    for (const Step &step : steps) {
        std::istringstream text(step.strCalls);
        const char end = step.strCalls.find('(') == std::string::npos ? ' ' : '\n';
        for (std::string strCall; std::getline(text, strCall, end);) {
            calls.push_back({strCall, step.failing});
        }
    }
    return calls;
}

// The calls that were made, told as the expected ones are.
inline void CheckCalls(const seam::Outcome &outcome, const std::vector<Call> &expected,
                       bool blGoesOn = false) {
    std::string strMade;
    std::string strExpected;
    for (std::size_t i = 0; i < outcome.calls.size() && !(blGoesOn && i >= expected.size()); ++i) {
        const bool blArguments = i < expected.size() && expected[i].HasArguments();
        strMade += (blArguments ? outcome.details[i] : outcome.calls[i]) + '\n';
    }
    for (const Call &call : expected) {
        strExpected += call.strText + '\n';
    }
    EXPECT_EQ(strMade, strExpected);
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
    const std::vector<Call> calls = Calls(test.steps);
    Separately(test.blInChild,
               [&] { CheckCalls(RunOnce(test, {}, test.unfaulted), calls, test.blGoesOn); });
    std::map<std::string, int> counts;
    for (const Call &call : calls) {
        const int nth = ++counts[call.Name()];
        SCOPED_TRACE("failing " + call.Name() + '#' + std::to_string(nth));
        Separately(test.blInChild, [&] { RunOnce(test, {call.Name(), nth}, call.failing); });
    }
}

}  // namespace torture

#endif
