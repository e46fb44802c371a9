#include "seam.h"

#include <gtest/gtest.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdarg>
#include <cstddef>
#include <cstdio>
#include <ctime>
#include <map>
#include <new>
#include <type_traits>

#include "credential_store.h"
#include "file_lock.h"
#include "file_system.h"
#include "host_name.h"
#include "idle_timer.h"
#include "key_value_file.h"
#include "notification.h"
#include "plugin_sdk.h"
#include "process.h"
#include "serial_number.h"
#include "service.h"
#include "strings_file.h"
#include "text_containers.h"
#include "user_group.h"
#include "web_api_request.h"
#include "web_session.h"

namespace seam {
namespace {

struct Observation {
    Outcome outcome;
    Fault fault;
    std::map<std::string, int> counts;
};

thread_local Observation *t_pObservation = nullptr;

// Counts a call, a release included, and ends the process at the one that the fault names.
void Count() {
    if (t_pObservation != nullptr && --t_pObservation->fault.killAt == 0) {
        raise(SIGKILL);
    }
}

// Whether this call is the one that the fault names.
bool Enter(const char *szName, const std::string &strArguments) {
    Count();
    if (t_pObservation == nullptr) {
        return false;
    }
    t_pObservation->outcome.calls.emplace_back(szName);
    t_pObservation->outcome.details.push_back(szName + strArguments);
    const int nth = ++t_pObservation->counts[szName];
    return t_pObservation->fault.strOperation == szName && t_pObservation->fault.nth == nth;
}

// A release is made in any case; what fails is its result.
bool FailsRelease(const char *szName) {
    return t_pObservation != nullptr && t_pObservation->fault.strOperation == szName;
}

bool IsForced() {
    return t_pObservation->fault.blForceResult;
}

template <typename Result>
Result Force(Result result) {
    if constexpr (std::is_integral_v<Result>) {
        return static_cast<Result>(t_pObservation->fault.result);
    } else {
        return result;
    }
}

bool Fills() {
    return !t_pObservation->fault.strFill.empty();
}

template <typename T>
void FillOne(const T & /*argument*/) {}
void FillOne(char *sz) {
    t_pObservation->fault.strFill.copy(sz, std::string::npos);
}

template <typename... T>
void Fill(const T &...arguments) {
    (FillOne(arguments), ...);
}

void AddRecords(int count) {
    if (t_pObservation != nullptr) {
        t_pObservation->outcome.recordsLeft += count;
    }
}

void WriteLog(int level, const char *szFormat, va_list args) {
    char szLine[16384];
    std::vsnprintf(szLine, sizeof(szLine), szFormat, args);
    if (t_pObservation == nullptr) {
        return;
    }
    const std::string strLine = szLine;
    const std::size_t colon = strLine.find(':');
    const std::size_t blank = strLine.find(' ');
    ASSERT_TRUE(colon < blank && blank != std::string::npos) << strLine;
    EXPECT_GT(std::atoi(strLine.c_str() + colon + 1), 0) << strLine;
    EXPECT_GE(strLine.find('\n'), strLine.size() - 1) << strLine;
    t_pObservation->outcome.logs.push_back(
        {level, strLine.substr(0, colon), strLine.substr(blank + 1)});
}

}  // namespace

Outcome Observe(const std::function<void()> &body) {
    return Observe(Fault(), body);
}

Outcome Observe(const Fault &fault, const std::function<void()> &body) {
    Observation observation;
    observation.fault = fault;
    t_pObservation = &observation;
    body();
    t_pObservation = nullptr;
    return observation.outcome;
}

}  // namespace seam

#define SEAM(symbol, name, Result, parameters, arguments, failure, gained)    \
    Result Real_##name parameters asm("__real_" symbol);                      \
    Result Wrap_##name parameters asm("__wrap_" symbol);                      \
    Result Wrap_##name parameters {                                           \
        const bool blHit = seam::Enter(#name, seam::ArgumentTexts arguments); \
        if (blHit && !seam::IsForced()) {                                     \
            return failure;                                                   \
        }                                                                     \
        if (blHit && seam::Fills()) {                                         \
            seam::Fill arguments;                                             \
            return seam::Force<Result>(failure);                              \
        }                                                                     \
        Result result = Real_##name arguments;                                \
        seam::AddRecords(gained);                                             \
        return blHit ? seam::Force<Result>(result) : result;                  \
    }

#define SEAM_RELEASE(symbol, name, parameters, arguments, lost) \
    void Real_##name parameters asm("__real_" symbol);          \
    void Wrap_##name parameters asm("__wrap_" symbol);          \
    void Wrap_##name parameters {                               \
        seam::Count();                                          \
        seam::AddRecords(-static_cast<int>(lost));              \
        Real_##name arguments;                                  \
    }

#define SEAM_RELEASE_RESULT(symbol, name, Result, parameters, arguments, failure, lost) \
    Result Real_##name parameters asm("__real_" symbol);                                \
    Result Wrap_##name parameters asm("__wrap_" symbol);                                \
    Result Wrap_##name parameters {                                                     \
        seam::Count();                                                                  \
        seam::AddRecords(-static_cast<int>(lost));                                      \
        Result result = Real_##name arguments;                                          \
        return seam::FailsRelease(#name) ? (failure) : result;                          \
    }

#include "seam_operations.inc"

void Wrap_syslog(int level, const char *szFormat, ...) asm("__wrap_syslog");
void Wrap_syslog(int level, const char *szFormat, ...) {
    va_list args;
    va_start(args, szFormat);
    seam::WriteLog(level, szFormat, args);
    va_end(args);
}

// What a fortified build calls.
void Wrap_syslog_chk(int level, int flag, const char *szFormat, ...) asm("__wrap___syslog_chk");
void Wrap_syslog_chk(int level, int /*flag*/, const char *szFormat, ...) {
    va_list args;
    va_start(args, szFormat);
    seam::WriteLog(level, szFormat, args);
    va_end(args);
}
