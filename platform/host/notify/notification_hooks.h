// Hooks: the executables in "/usr/zelo/etc/notify.d/", which an integrator puts there to pass
// notifications on.

#ifndef ZELO_HOST_NOTIFICATION_HOOKS_H
#define ZELO_HOST_NOTIFICATION_HOOKS_H

#include "notification_record.h"

namespace host {

// Runs all hooks, one after the other in the order of their names, each for 10 s at most, with the
// tag as the argument and in the environment
//     ZELO_NOTIFY_TAG, ZELO_NOTIFY_TITLE, ZELO_NOTIFY_TEXT
//     ZELO_NOTIFY_VAR_QRM_SERVER: the value of "%QRM_SERVER%", and so on for each variable.
// A hook is a regular file that may be executed and that nobody but root, or the user that this
// process runs as, can change. A hook that fails, or a file that is none, is worth one log line and
// does not keep the others from running. Throws nothing.
void RunHooks(const Notification &notification);

}  // namespace host

#endif
