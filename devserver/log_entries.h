// Log entries that clients pushed: which parameters make one, and the newest of them.

#ifndef ZELO_DEV_LOG_ENTRIES_H
#define ZELO_DEV_LOG_ENTRIES_H

#include <json/value.h>

#include <deque>
#include <string>

namespace devserver {

// Not locked: its owner keeps callers apart.
class LogEntries {
  public:
    // Why the parameters are no entry, in one line; empty when they are one.
    static std::string WhyRefused(const Json::Value &params);

    // Keeps what belongs to an entry, in place of the oldest one where there are too many.
    void Add(const Json::Value &params);

    // The entries that are kept, the oldest first.
    Json::Value All() const;

  private:
    std::deque<Json::Value> m_entries;
};

}  // namespace devserver

#endif
