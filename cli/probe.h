// Probing a connection with libcurl, as far as it is asked to go, and telling how far it came.
//
// A probe follows the rules of the platform's requests: the same authorities, the host name
// verified, no redirect, no proxy of the environment unless the configuration allows it. It carries
// no token.

#ifndef QRMCTL_PROBE_H
#define QRMCTL_PROBE_H

#include <ctime>
#include <string>
#include <vector>

namespace qrmctl {

// A way to a server.
struct Way {
    std::string strProtocol;  // "https", "http" or "fld"
    std::string strHost;
    int port = 0;

    bool IsRelayed() const { return strProtocol == "fld"; }
    bool IsSecure() const { return strProtocol != "http"; }
};

// The relay that the configuration names, as "host:port"; empty when it names none.
std::string RelayAddress();

enum class Extent {
    kResolve,      // look the name up; nothing is opened
    kConnect,      // open a TCP connection, to the relay where there is one
    kHandshake,    // the same, then the tunnel and TLS
    kExchange,     // ask for the API's path
    kLookAtClock,  // the same without verifying anything: what comes back is a hint, not a fact
};

struct Certificate {
    bool blSeen = false;
    std::string strSubject;
    std::string strNames;  // the alternative names
    std::string strIssuer;
    std::time_t notBefore = 0;
    std::time_t notAfter = 0;
    bool blNamesHost = false;
    int verifyError = 0;          // OpenSSL's, X509_V_OK when the chain is verified
    int depth = 0;                // where in the chain that is; 0: the server's own certificate
    std::string strVerifyReason;  // the same as text
};

struct Probe {
    bool blDone = false;    // it came as far as it was asked to
    bool blInTime = true;   // it did not run out of time
    std::string strReason;  // why not; one line

    std::vector<std::string> addresses;  // of the name; of the extent kResolve alone
    std::string strAddress;              // the one that is connected to, with its port
    long relayStatus = 0;                // the relay's answer, 0 for none
    std::string strTlsVersion;
    Certificate certificate;
    bool blCertificateAsked = false;  // the server asked for one of this client
    long duration_ms = 0;

    long status = 0;  // of HTTP, 0 for no answer
    std::string strBody;
    std::time_t serverTime = -1;  // of the Date header
    std::time_t ownTime = -1;     // the appliance's clock at that moment
};

// szPath and strQuery ("name=value") say what is asked for. The probe ends within limit_ms.
Probe RunProbe(const Way &way, Extent extent, const char *szPath, const std::string &strQuery,
               long limit_ms);

}  // namespace qrmctl

#endif
