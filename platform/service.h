// Services: telling the appliance's other programs that something they depend on has changed.

#ifndef ZELO_PLATFORM_SERVICE_H
#define ZELO_PLATFORM_SERVICE_H

#include "api.h"

// Service types by number: what has changed.
enum YLIB_SERVICE_TYPE {
    YLIB_SERVICE_TYPE_USERS = 8  // the local users or groups
};

extern "C" {

// Lets the services of a type, one of YLIB_SERVICE_TYPE, read anew what has changed. It waits until
// they have, within a bound for each of them; one that fails does not keep the others from it.
// Which services a type has is the appliance's business; it may have none.
//
// Returns 0 when all of them succeeded, a negative value, with the last error set (last_error.h),
// otherwise. Any thread may call it at any time.
ZELO_PLATFORM_API int YLIBServiceTypeReload(int type);
}

#endif
