// Keeps libcurl and fork apart. A child that is forked while another thread is inside libcurl, and
// thus perhaps inside OpenSSL, would find their locks taken for ever; so a fork waits until no
// thread is inside.

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

// For a thread inside that calls a function of the program's: for as long as it lives, the thread
// counts as outside, so the function may wait, fork, or make another exchange.
class OutsideLibcurl {
  public:
    OutsideLibcurl();
    ~OutsideLibcurl();
    OutsideLibcurl(const OutsideLibcurl &) = delete;
    OutsideLibcurl &operator=(const OutsideLibcurl &) = delete;
};

// From now on a fork waits until no thread is inside, and runs pfnInChild in the child. Called
// once, while the library is loaded.
int GuardForks(void (*pfnInChild)());

}  // namespace host

#endif
