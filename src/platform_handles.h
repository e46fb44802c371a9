// Owners of platform records: one alias per record, released when it goes out of scope.

#ifndef ZELO_PLATFORM_HANDLES_H
#define ZELO_PLATFORM_HANDLES_H

#include <memory>

#include "credential_store.h"

namespace platform_handles_detail {

template <auto pfnFree>
struct Release {
    template <typename Record>
    void operator()(Record *pRecord) const {
        pfnFree(pRecord);
    }
};

struct ReleaseList {
    void operator()(ZELO_CRED *pList) const { ZELOCredListFree(&pList); }
};

}  // namespace platform_handles_detail

using CredHandle = std::unique_ptr<ZELO_CRED, platform_handles_detail::Release<ZELOCredFree>>;
using CredSessHandle =
    std::unique_ptr<ZELO_CRED_SESS, platform_handles_detail::Release<ZELOCredSessFree>>;

// A list of credentials; get() is its first record.
using CredListHandle = std::unique_ptr<ZELO_CRED, platform_handles_detail::ReleaseList>;

#endif
