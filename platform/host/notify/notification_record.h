// One notification, as the journal and the hooks get it.

#ifndef ZELO_HOST_NOTIFICATION_RECORD_H
#define ZELO_HOST_NOTIFICATION_RECORD_H

#include <string>
#include <utility>
#include <vector>

namespace host {

struct Notification {
    std::string strTag;
    std::string strTitle;
    std::string strText;
    std::vector<std::pair<std::string, std::string>> variables;  // names as in "%QRM_SERVER%"
};

}  // namespace host

#endif
