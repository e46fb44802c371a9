// To be preloaded: runs the program again and again, each time in a process of its own in which
// another allocation after the beginning of main fails, until a run makes no more so many.
// SHORT_MEMORY is "once", or "on" where the later ones fail too; SHORT_MEMORY_STEP allocations lie
// between two runs. Prints of each run the wait status, what it wrote to standard output, and to
// standard error, with a zero byte behind each.

#include <dlfcn.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

extern "C" {
void *__libc_malloc(std::size_t cb);
void *__libc_calloc(std::size_t count, std::size_t cb);
void *__libc_realloc(void *p, std::size_t cb);
void *__libc_memalign(std::size_t alignment, std::size_t cb);
}

namespace {

using Main = int (*)(int, char **, char **);

std::atomic<long> g_left{0};  // allocations up to the one that fails; 0 before main
std::atomic<bool> *g_pFailed = nullptr;
bool g_blGoesOn = false;
Main g_main = nullptr;

bool Fails() {
    if (g_pFailed == nullptr || (*g_pFailed && !g_blGoesOn) || --g_left > 0) {
        return false;
    }
    *g_pFailed = true;
    errno = ENOMEM;
    return true;
}

void PutOut(int fd) {
    std::string strText(static_cast<std::size_t>(lseek(fd, 0, SEEK_CUR)), '\0');
    const ssize_t cb = pread(fd, strText.data(), strText.size(), 0);
    std::fwrite(strText.c_str(), 1, static_cast<std::size_t>(cb) + 1, stdout);
}

// Whether the allocation was asked for.
bool RunWithout(long nth, int argc, char **argv, char **envp) {
    auto *const pFailed = static_cast<std::atomic<bool> *>(
        mmap(nullptr, sizeof(bool), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0));
    const int out = memfd_create("out", 0);
    const int err = memfd_create("err", 0);
    const pid_t pid = fork();
    if (pid == 0) {
        dup2(out, STDOUT_FILENO);
        dup2(err, STDERR_FILENO);
        g_left = nth;
        g_pFailed = pFailed;
        std::exit(g_main(argc, argv, envp));
    }
    int status = -1;
    waitpid(pid, &status, 0);
    std::printf("%d%c", status, '\0');
    PutOut(out);
    PutOut(err);
    std::fflush(stdout);
    const bool blFailed = *pFailed;
    close(out);
    close(err);
    munmap(pFailed, sizeof(bool));
    return blFailed;
}

int Sweep(int argc, char **argv, char **envp) {
    g_blGoesOn = std::strcmp(std::getenv("SHORT_MEMORY"), "on") == 0;
    const long step = std::atol(std::getenv("SHORT_MEMORY_STEP"));
    unsetenv("LD_PRELOAD");  // not for the programs that this one runs
    for (long nth = 1; RunWithout(nth, argc, argv, envp); nth += step) {
    }
    return 0;
}

}  // namespace

extern "C" {
void *malloc(std::size_t cb) {
    return Fails() ? nullptr : __libc_malloc(cb);
}
void *calloc(std::size_t count, std::size_t cb) {
    return Fails() ? nullptr : __libc_calloc(count, cb);
}
void *realloc(void *p, std::size_t cb) {
    return Fails() ? nullptr : __libc_realloc(p, cb);
}
void *aligned_alloc(std::size_t alignment, std::size_t cb) {
    return Fails() ? nullptr : __libc_memalign(alignment, cb);
}

int __libc_start_main(Main main, int argc, char **argv, void (*init)(), void (*fini)(),
                      void (*rtldFini)(), void *pStackEnd) {
    using Start = int (*)(Main, int, char **, void (*)(), void (*)(), void (*)(), void *);
    const auto start = reinterpret_cast<Start>(dlsym(RTLD_NEXT, "__libc_start_main"));
    g_main = main;
    return start(Sweep, argc, argv, init, fini, rtldFini, pStackEnd);
}
}
