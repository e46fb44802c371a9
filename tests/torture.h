// Torture: every platform call of a function fails in turn, and each failure has to come out as the
// table says: result, log line, what the store holds, nothing left allocated.

#ifndef ZELO_TESTS_TORTURE_H
#define ZELO_TESTS_TORTURE_H

#include <gtest/gtest.h>

#include <functional>
#include <map>
#include <string>
#include <vector>

#include "seam.h"

namespace torture {

struct Expected {
    std::string strResult;
    std::string strLog;     // the one message, "" for none
    std::string strStored;  // what the case's state function says afterwards
};

struct Case {
    std::string strName;
    std::string strFile;  // the source file that logs
    std::function<void()> setUp;
    std::function<std::string()> run;  // calls the function, returns its result as text
    std::function<std::string()> state;
    std::string strCalls;  // all calls in order, separated by blanks
    Expected unfaulted;
    // By "Operation" (any call of it) or "Operation#2" (the second call).
    std::map<std::string, Expected> faults;
};

inline void Check(const Case &test, const seam::Outcome &outcome, const std::string &strResult,
                  const Expected &expected) {
    EXPECT_EQ(strResult, expected.strResult);
    EXPECT_EQ(test.state(), expected.strStored);
    EXPECT_EQ(outcome.recordsLeft, 0);
    ASSERT_EQ(outcome.logs.size(), expected.strLog.empty() ? 0U : 1U);
    for (const seam::LogLine &log : outcome.logs) {
        EXPECT_EQ(log.strMessage, expected.strLog);
        EXPECT_EQ(log.strFile, test.strFile);
        EXPECT_EQ(log.level, 3);
    }
}

inline void Run(const Case &test) {
    SCOPED_TRACE(test.strName);
    test.setUp();
    std::string strResult;
    const seam::Outcome clean = seam::Observe([&] { strResult = test.run(); });
    Check(test, clean, strResult, test.unfaulted);

    std::string strCalls;
    std::map<std::string, int> counts;
    std::size_t used = 0;
    for (const std::string &strCall : clean.calls) {
        strCalls += (strCalls.empty() ? "" : " ") + strCall;
        const int nth = ++counts[strCall];
        const std::string strNth = strCall + '#' + std::to_string(nth);
        SCOPED_TRACE("failing " + strNth);
        auto row = test.faults.find(strNth);
        row = row == test.faults.end() ? test.faults.find(strCall) : row;
        if (row == test.faults.end()) {
            ADD_FAILURE() << "no row";
            continue;
        }
        ++used;
        test.setUp();
        const seam::Outcome outcome =
            seam::Observe({strCall, nth}, [&] { strResult = test.run(); });
        Check(test, outcome, strResult, row->second);
    }
    EXPECT_EQ(strCalls, test.strCalls);
    EXPECT_GE(used, test.faults.size()) << "rows without a call";
}

}  // namespace torture

#endif
