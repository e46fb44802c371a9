// A lock by lock file (file_lock.h), for the rooms of the host platform.

#ifndef ZELO_HOST_HELD_LOCK_H
#define ZELO_HOST_HELD_LOCK_H

#include "file_lock.h"
#include "status.h"

namespace host {

// Takes the lock, for which it waits for so long; 0 and below: it tries once.
Status TakeLock(const char *szPath, int timeout_s, int &handle);

// The lock, which ends with its life.
class HeldLock {
  public:
    HeldLock() = default;
    ~HeldLock() {
        if (m_handle >= 0) {
            YLIBCFileUnlockByFile(m_handle);
        }
    }
    HeldLock(const HeldLock &) = delete;
    HeldLock &operator=(const HeldLock &) = delete;

    Status Take(const char *szPath, int timeout_s = 30) {
        return TakeLock(szPath, timeout_s, m_handle);
    }

  private:
    int m_handle = -1;
};

}  // namespace host

#endif
