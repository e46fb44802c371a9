#include "fork_guard.h"

#include <pthread.h>

namespace host {
namespace {

// A fork that waits goes before those who come later.
constexpr pthread_rwlock_t kFree = PTHREAD_RWLOCK_WRITER_NONRECURSIVE_INITIALIZER_NP;

pthread_rwlock_t g_lock = kFree;
void (*g_pfnInChild)() = nullptr;

void Enter() {
    pthread_rwlock_rdlock(&g_lock);
}

void Leave() {
    pthread_rwlock_unlock(&g_lock);
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
    return pthread_atfork([] { pthread_rwlock_wrlock(&g_lock); },
                          [] { pthread_rwlock_unlock(&g_lock); },
                          [] {
                              // The parent's thread holds the lock; the child's has another id.
                              g_lock = kFree;
                              g_pfnInChild();
                          });
}

}  // namespace host
