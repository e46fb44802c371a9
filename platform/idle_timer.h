// Disk idle timer: how long the disks stay idle before they go to sleep.
//
// One time for all disks. It is kept durably by the platform's configuration, and applied to each
// disk that has a timer of its own. Any thread and any process may call the operations at any time;
// a failure sets the last error (last_error.h).

#ifndef ZELO_PLATFORM_IDLE_TIMER_H
#define ZELO_PLATFORM_IDLE_TIMER_H

#include "api.h"

extern "C" {

// Reads the idle time in minutes into *pIdleTime; 0: the disks never sleep. A time that was never
// set is the platform's default.
//
// Returns 0 or more on success, a negative value, with *pIdleTime as it was, when the configuration
// cannot be read or holds no number.
ZELO_PLATFORM_API int ZELODiskAllIdleTimerGet(unsigned long *pIdleTime);

// Sets the idle time in minutes; 0: the disks never sleep. A time beyond what a disk's own timer
// can count is kept as it is, and applied as the longest time that the disk can count.
//
// Returns 0 or more when it is kept, a negative value, with the old time in force, when it is not.
// A disk without a timer, or one that does not take the time, is no failure.
ZELO_PLATFORM_API int ZELODiskAllIdleTimerSet(unsigned long idleTime);
}

#endif
