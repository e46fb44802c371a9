// A mutex that is free in a child process, whatever other threads did when the process forked.

#ifndef ZELO_HOST_HELD_MUTEX_H
#define ZELO_HOST_HELD_MUTEX_H

#include <pthread.h>

#include <mutex>

namespace host {

// Takes the mutex around each fork from now on. Use at namespace scope, so that it runs while the
// library is loaded:
//     std::mutex g_mutex;
//     const int g_forkHandlers = host::HoldAroundForks<g_mutex>();
template <std::mutex &mutex>
int HoldAroundForks() {
    return pthread_atfork([] { mutex.lock(); }, [] { mutex.unlock(); }, [] { mutex.unlock(); });
}

}  // namespace host

#endif
