#include "file_state.h"

#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <ctime>

namespace host {
namespace {

bool IsSameTime(const timespec &a, const timespec &b) {
    return a.tv_sec == b.tv_sec && a.tv_nsec == b.tv_nsec;
}

// From a to b; differences of more than a few seconds are all the same.
std::int64_t Nanoseconds(const timespec &a, const timespec &b) {
    constexpr std::int64_t kFew = 8;
    const std::int64_t seconds = std::clamp<std::int64_t>(b.tv_sec - a.tv_sec, -kFew, kFew);
    return seconds * 1000000000 + b.tv_nsec - a.tv_nsec;
}

// The steps in which a file's times advance: the kernel's ticks, or two seconds in a file system
// that keeps no fractions.
std::int64_t TimeStep(const timespec &time) {
    timespec tick = {};
    clock_getres(CLOCK_REALTIME_COARSE, &tick);
    return time.tv_nsec == 0 ? Nanoseconds({0, 0}, {2, 0}) : 2 * Nanoseconds({0, 0}, tick);
}

}  // namespace

bool IsSameFile(const struct stat &a, const struct stat &b) {
    return a.st_ino == b.st_ino && a.st_dev == b.st_dev;
}

bool IsUnchanged(const struct stat &a, const struct stat &b) {
    return IsSameFile(a, b) && a.st_size == b.st_size && IsSameTime(a.st_mtim, b.st_mtim) &&
           IsSameTime(a.st_ctim, b.st_ctim);
}

bool IsSettled(const struct stat &state) {
    timespec now = {};
    clock_gettime(CLOCK_REALTIME, &now);
    // A time ahead of the clock's, which was set back, is as good.
    return std::abs(Nanoseconds(state.st_ctim, now)) > TimeStep(state.st_ctim);
}

}  // namespace host
