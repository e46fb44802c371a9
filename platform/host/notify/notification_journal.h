// The journal of notifications: "/var/log/notifications.jsonl", one JSON object on each line.
//
// Processes and threads append at once; every line is whole. A journal that would grow past 1 MiB
// becomes "/var/log/notifications.jsonl.1", in place of the former one, and a new one begins.

#ifndef ZELO_HOST_NOTIFICATION_JOURNAL_H
#define ZELO_HOST_NOTIFICATION_JOURNAL_H

#include <string>
#include <utility>
#include <vector>

#include "status.h"

namespace host {

struct Notification {
    std::string strTag;
    std::string strTitle;
    std::string strText;
    std::vector<std::pair<std::string, std::string>> variables;  // names as in "%QRM_SERVER%"
};

// Appends the notification, with the present time.
Status AppendToJournal(const Notification &notification);

}  // namespace host

#endif
