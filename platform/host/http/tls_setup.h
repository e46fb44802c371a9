// How TLS is set up for a connection: who is trusted, and what is noted of the handshake.

#ifndef ZELO_HOST_TLS_SETUP_H
#define ZELO_HOST_TLS_SETUP_H

namespace host {

struct CurlHandle;

// Sets the options of the handle's new connections.
void SetUpTls(CurlHandle &handle);

}  // namespace host

#endif
