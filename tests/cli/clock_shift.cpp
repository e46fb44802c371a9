// To be preloaded: the program's clock differs by CLOCK_SHIFT seconds.

#include <sys/syscall.h>
#include <sys/time.h>
#include <unistd.h>

#include <cstdlib>
#include <ctime>

extern "C" {

int clock_gettime(clockid_t clock, timespec *pTime) noexcept {
    const long result = syscall(SYS_clock_gettime, clock, pTime);
    const char *const szShift = std::getenv("CLOCK_SHIFT");
    if (result == 0 && clock == CLOCK_REALTIME && szShift != nullptr) {
        pTime->tv_sec += std::atol(szShift);
    }
    return static_cast<int>(result);
}

std::time_t time(std::time_t *pTime) noexcept {
    timespec now = {};
    clock_gettime(CLOCK_REALTIME, &now);
    if (pTime != nullptr) {
        *pTime = now.tv_sec;
    }
    return now.tv_sec;
}

int gettimeofday(timeval *pTime, void * /*pZone*/) noexcept {
    timespec now = {};
    const int result = clock_gettime(CLOCK_REALTIME, &now);
    *pTime = {now.tv_sec, now.tv_nsec / 1000};
    return result;
}
}
