// The owner of an open file descriptor.

#ifndef ZELO_HOST_FILE_DESCRIPTOR_H
#define ZELO_HOST_FILE_DESCRIPTOR_H

#include <unistd.h>

#include <utility>

namespace host {

class FileDescriptor {
  public:
    FileDescriptor() = default;
    explicit FileDescriptor(int fd) : m_fd(fd) {}
    FileDescriptor(FileDescriptor &&other) noexcept : m_fd(std::exchange(other.m_fd, -1)) {}
    FileDescriptor &operator=(FileDescriptor &&other) noexcept {
        std::swap(m_fd, other.m_fd);
        return *this;
    }
    FileDescriptor(const FileDescriptor &) = delete;
    FileDescriptor &operator=(const FileDescriptor &) = delete;
    ~FileDescriptor() {
        if (m_fd >= 0) {
            close(m_fd);
        }
    }

    // The open call's result: -1 when there is nothing open.
    int Get() const { return m_fd; }
    bool IsOpen() const { return m_fd >= 0; }

  private:
    int m_fd = -1;
};

}  // namespace host

#endif
