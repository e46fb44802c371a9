// A file that stays open, so that asking for its state takes a third of the time of a look at its
// name.

#ifndef ZELO_HOST_KEPT_FILE_H
#define ZELO_HOST_KEPT_FILE_H

#include <fcntl.h>
#include <sys/stat.h>

#include <chrono>
#include <memory>
#include <utility>

#include "file_descriptor.h"
#include "file_state.h"

namespace host {

class KeptFile {
  public:
    // The file that a look at its name has just led to.
    void Keep(FileDescriptor file, const struct stat &state) {
        m_pDescriptor = std::make_shared<const FileDescriptor>(std::move(file));
        m_state = state;
        m_looked = Clock::now();
    }
    void Drop() { m_pDescriptor.reset(); }

    // For as long as the caller reads from it.
    std::shared_ptr<const FileDescriptor> Descriptor() const { return m_pDescriptor; }

    // Whether the path still leads to the file; its state now. While that is unchanged, the name is
    // looked at once a millisecond: that a folder above it was replaced shows so much later, all
    // else at once, since to be renamed or removed changes the state. flags: those of fstatat.
    bool Holds(const char *szPath, int flags, struct stat &state) {
        if (m_pDescriptor == nullptr) {
            return false;
        }
        const Clock::time_point now = Clock::now();
        // A name without a folder depends on where the process is.
        if (szPath[0] == '/' && now - m_looked < kLookInterval &&
            fstat(m_pDescriptor->Get(), &state) == 0 && IsUnchanged(state, m_state)) {
            return true;
        }
        if (fstatat(AT_FDCWD, szPath, &state, flags) != 0 || !IsSameFile(state, m_state)) {
            return false;
        }
        m_state = state;
        m_looked = now;
        return true;
    }

  private:
    using Clock = std::chrono::steady_clock;
    static constexpr std::chrono::milliseconds kLookInterval{1};

    std::shared_ptr<const FileDescriptor> m_pDescriptor;
    struct stat m_state = {};
    Clock::time_point m_looked;
};

}  // namespace host

#endif
