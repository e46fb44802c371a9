// Keeping pages of other sites away from the development endpoints.
//
// A browser on this machine reaches the server for whatever page it shows: under a name of that
// page's own that leads to loopback (DNS rebinding), or as a request across sites. It says which in
// "Host" and "Origin".

#ifndef ZELO_FOREIGN_PAGE_H
#define ZELO_FOREIGN_PAGE_H

#include <string>

namespace httplib {
struct Request;
}

namespace devserver {

// Why the request may be that of another site's page, with the remedy, in one line; empty when it
// is not: each "Host" and "Origin" that it has names loopback.
std::string WhyForeign(const httplib::Request &request);

}  // namespace devserver

#endif
