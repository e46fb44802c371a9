// Owners of platform records: one alias per record, released when it goes out of scope.

#ifndef ZELO_PLATFORM_HANDLES_H
#define ZELO_PLATFORM_HANDLES_H

#include <memory>

#include "credential_store.h"
#include "file_lock.h"
#include "text_containers.h"
#include "web_api_request.h"

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

using RequestHandle = std::unique_ptr<ZELO::CredRequest>;

// Owner of a record that moves when something is put into it: such operations take the address of
// the owner's own pointer.
template <typename Record, void (*pfnFree)(Record *)>
class MovingHandle {
  public:
    MovingHandle() = default;
    explicit MovingHandle(Record *pRecord) : m_pRecord(pRecord) {}
    ~MovingHandle() { Reset(nullptr); }
    MovingHandle(const MovingHandle &) = delete;
    MovingHandle &operator=(const MovingHandle &) = delete;

    void Reset(Record *pRecord) {
        if (m_pRecord != nullptr) {
            pfnFree(m_pRecord);
        }
        m_pRecord = pRecord;
    }
    Record *Get() const { return m_pRecord; }
    Record **Address() { return &m_pRecord; }

  private:
    Record *m_pRecord = nullptr;
};

using HashHandle = MovingHandle<YLIBSZHASH, YLIBCSzHashFree>;
using ListHandle = MovingHandle<YLIBSZLIST, YLIBCSzListFree>;

// A lock between processes, released at the end of its scope when it was taken.
class FileLock {
  public:
    FileLock() = default;
    ~FileLock() {
        if (m_handle >= 0) {
            YLIBCFileUnlockByFile(m_handle);
        }
    }
    FileLock(const FileLock &) = delete;
    FileLock &operator=(const FileLock &) = delete;

    // For the operation that takes the lock.
    int *Address() { return &m_handle; }

  private:
    int m_handle = -1;
};

#endif
