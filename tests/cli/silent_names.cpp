// Preloaded into a program, a name server that does not answer.

#include <netdb.h>
#include <unistd.h>

extern "C" int getaddrinfo(const char *, const char *, const addrinfo *, addrinfo **) {
    sleep(600);
    return EAI_AGAIN;
}
