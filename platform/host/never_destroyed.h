// An object that is made while the library is loaded and serves until the very end of a process:
// other threads may still use it while the process ends. It takes no memory of its own.

#ifndef ZELO_HOST_NEVER_DESTROYED_H
#define ZELO_HOST_NEVER_DESTROYED_H

#include <new>

namespace host {

// For an object at namespace scope. A static within a function is made at the first call; a fork in
// the middle of that leaves it half made in the child for ever.
template <typename T>
class NeverDestroyed {
  public:
    template <typename... Arguments>
    explicit NeverDestroyed(const Arguments &...arguments) noexcept {
        new (m_place) T(arguments...);
    }
    NeverDestroyed(const NeverDestroyed &) = delete;
    NeverDestroyed &operator=(const NeverDestroyed &) = delete;
    ~NeverDestroyed() = default;

    T &operator*() { return *std::launder(reinterpret_cast<T *>(m_place)); }
    T *operator->() { return &**this; }

  private:
    alignas(T) unsigned char m_place[sizeof(T)];
};

}  // namespace host

#endif
