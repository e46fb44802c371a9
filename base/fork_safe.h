// Locks and fork: a mutex that another thread holds while the process forks stays locked in the
// child for ever, since that thread is not there.

#ifndef ZELO_FORK_SAFE_H
#define ZELO_FORK_SAFE_H

#include <pthread.h>

#include <mutex>

// Takes the mutex around each fork from now on, so that the child finds it free. Use at namespace
// scope, so that it runs while the library is loaded:
//     std::mutex g_mutex;
//     const int g_forkHandlers = HoldAroundForks<g_mutex>();
// What is registered first is taken last: a mutex that is taken under another goes first.
template <std::mutex &mutex>
int HoldAroundForks() {
    return pthread_atfork([] { mutex.lock(); }, [] { mutex.unlock(); }, [] { mutex.unlock(); });
}

#endif
