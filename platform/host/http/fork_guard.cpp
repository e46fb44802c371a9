#include "fork_guard.h"

#include <pthread.h>
#include <unistd.h>

#include <atomic>
#include <mutex>

namespace host {
namespace {

// Who enters passes the gate, which a fork holds. Who is inside does not need it to leave.
std::mutex g_gate;
std::atomic<int> g_inside{0};
void (*g_pfnInChild)() = nullptr;

void Enter() {
    const std::lock_guard<std::mutex> gate(g_gate);
    ++g_inside;
}

void Leave() {
    --g_inside;
}

void AwaitNobodyInside() {
    constexpr useconds_t kPause_us = 100;
    g_gate.lock();
    while (g_inside != 0) {
        usleep(kPause_us);
    }
}

}  // namespace

InsideLibcurl::InsideLibcurl() {
    Enter();
}

InsideLibcurl::~InsideLibcurl() {
    Leave();
}

OutsideLibcurl::OutsideLibcurl() {
    Leave();
}

OutsideLibcurl::~OutsideLibcurl() {
    Enter();
}

int GuardForks(void (*pfnInChild)()) {
    g_pfnInChild = pfnInChild;
    return pthread_atfork(
        AwaitNobodyInside, [] { g_gate.unlock(); },
        [] {
            g_gate.unlock();
            g_pfnInChild();
        });
}

}  // namespace host
