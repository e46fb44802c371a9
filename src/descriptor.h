// Owner of an open file descriptor.

#ifndef ZELO_DESCRIPTOR_H
#define ZELO_DESCRIPTOR_H

#include <unistd.h>

class Descriptor {
  public:
    explicit Descriptor(int fd) : m_fd(fd) {}
    ~Descriptor() {
        if (m_fd >= 0) {
            close(m_fd);
        }
    }
    Descriptor(const Descriptor &) = delete;
    Descriptor &operator=(const Descriptor &) = delete;

    // The descriptor; negative when there is none.
    int Get() const { return m_fd; }

  private:
    int m_fd;
};

#endif
