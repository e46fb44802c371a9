// What operations of the host platform wait for, so that another thread can name it.

#ifndef ZELO_HOST_WAITING_H
#define ZELO_HOST_WAITING_H

#include <initializer_list>
#include <string_view>

namespace host {

// For as long as it lives, its thread waits for this. It takes no lock and no memory; what does not
// fit is cut, and of very many waits at a time some are not kept.
class Waiting {
  public:
    // The parts of the text, such as {"waiting for the lock '", path, "'"}; without any, nothing is
    // waited for.
    explicit Waiting(std::initializer_list<std::string_view> parts);
    ~Waiting();
    Waiting(const Waiting &) = delete;
    Waiting &operator=(const Waiting &) = delete;

  private:
    int m_place = -1;
};

}  // namespace host

#endif
