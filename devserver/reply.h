// What the development server answers, and how it goes out: at once, or slowly, cut or without end.

#ifndef ZELO_DEV_REPLY_H
#define ZELO_DEV_REPLY_H

#include <json/value.h>

#include <functional>
#include <map>
#include <memory>
#include <string>

#include "generated_file.h"
#include "next_answer.h"

namespace httplib {
struct Response;
}

namespace devserver {

struct Reply {
    int status = 200;
    std::string strType = "application/json";
    std::string strBody;
    std::shared_ptr<const GeneratedFile> pFile;  // goes out in place of strBody
    std::map<std::string, std::string> headers = {};
};

Reply JsonReply(int status, const Json::Value &value);

// Waits so many milliseconds; false when the server is ending.
using Pause = std::function<bool(int ms)>;

// Ends the connection, in its own way.
using End = std::function<void()>;

// Makes the response out of the reply, with the headers, the rate and the end that the answer asks
// for.
void Send(const Reply &reply, const NextAnswer &answer, const Pause &pause, const End &end,
          httplib::Response &response);

}  // namespace devserver

#endif
