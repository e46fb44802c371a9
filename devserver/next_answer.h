// What the development server is told to answer next, in C++ and as JSON.

#ifndef ZELO_NEXT_ANSWER_H
#define ZELO_NEXT_ANSWER_H

#include <cstddef>
#include <map>
#include <optional>
#include <string>

namespace devserver {

// How to answer a request in place of the ordinary answer. With a status, a body or an error code
// the request is not carried out at all; otherwise it is, and its answer is delayed, slowed down,
// cut, kept back, or given the headers.
struct NextAnswer {
    std::string method;         // "discover" for the discovery; empty for any request
    std::optional<int> status;  // 200 when only a body or an error code is given
    std::optional<std::string> body;
    std::optional<int> error_code;  // makes the body a response envelope, unless there is a body
    std::map<std::string, std::string> headers;  // set in the reply
    int delay_ms = 0;
    std::optional<std::size_t> cut_after;  // the connection ends after so many bytes of the body
    int bytes_per_s = 0;                   // the body goes out at this rate; 0: at once
    bool endless = false;                  // the body goes on for ever, with blanks
    bool no_length = false;                // the body ends with the connection
    bool no_reply = false;                 // the connection ends in place of the reply
    bool closes = false;                   // it ends after the reply, without an announcement
    int times = 1;                         // how many requests are answered like this
};

// Reads {"api": …} with the members of NextAnswer, all of them optional. Returns what is wrong with
// the text in one line; nothing when it is right.
std::string ReadNextAnswer(const std::string &strJson, std::string &strApi, NextAnswer &answer);

}  // namespace devserver

#endif
