// The journal of notifications: "/var/log/notifications.jsonl", one JSON object on each line.
//
// Processes and threads append at once; every line is whole. A journal that would grow past 1 MiB
// becomes "/var/log/notifications.jsonl.1", in place of the former one, and a new one begins.

#ifndef ZELO_HOST_NOTIFICATION_JOURNAL_H
#define ZELO_HOST_NOTIFICATION_JOURNAL_H

#include "notification_record.h"

namespace host {

// Appends the notification, with the present time. Returns 0, or -1 with the last error set and a
// log line.
int AppendToJournal(const Notification &notification);

}  // namespace host

#endif
