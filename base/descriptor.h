// Owner of an open file descriptor.

#ifndef ZELO_DESCRIPTOR_H
#define ZELO_DESCRIPTOR_H

#include <unistd.h>

#include <utility>

class Descriptor {
  public:
    Descriptor() = default;
    explicit Descriptor(int fd) : m_fd(fd) {}
    Descriptor(Descriptor &&other) noexcept : m_fd(std::exchange(other.m_fd, -1)) {}
    Descriptor &operator=(Descriptor &&other) noexcept {
        std::swap(m_fd, other.m_fd);
        return *this;
    }
    ~Descriptor() {
        if (m_fd >= 0) {
            close(m_fd);
        }
    }
    Descriptor(const Descriptor &) = delete;
    Descriptor &operator=(const Descriptor &) = delete;

    // The open call's result: negative when there is nothing open.
    int Get() const { return m_fd; }
    bool IsOpen() const { return m_fd >= 0; }

  private:
    int m_fd = -1;
};

#endif
