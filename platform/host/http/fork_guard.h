// Who is inside libcurl, and thus perhaps inside OpenSSL, whose own locks a child process would
// find locked for ever: a fork waits until no thread is.

#ifndef ZELO_HOST_FORK_GUARD_H
#define ZELO_HOST_FORK_GUARD_H

namespace host {

// For as long as it lives, its thread is inside libcurl and no thread forks. Threads may be inside
// at the same time, each once; none waits there for anything.
class InsideLibcurl {
  public:
    InsideLibcurl();
    ~InsideLibcurl();
    InsideLibcurl(const InsideLibcurl &) = delete;
    InsideLibcurl &operator=(const InsideLibcurl &) = delete;
};

// The other way round: for as long as it lives, the thread, which is inside, runs a function of the
// program's, which may wait, fork, or make another exchange.
class OutsideLibcurl {
  public:
    OutsideLibcurl();
    ~OutsideLibcurl();
    OutsideLibcurl(const OutsideLibcurl &) = delete;
    OutsideLibcurl &operator=(const OutsideLibcurl &) = delete;
};

// Lets no thread fork while another is inside; then pfnInChild runs in the child. Called once,
// while the library is loaded.
int GuardForks(void (*pfnInChild)());

}  // namespace host

#endif
