// Client info file: how the latest dealings with the QRM server went, for programs outside the
// library. It lies in "/tmp", so it starts empty after a restart of the appliance.

#include "appliance.h"
#include "fixed_text.h"
#include "guard.h"
#include "key_value_file.h"
#include "platform_handles.h"
#include "terminated_text.h"
#include "zeloqrmclient.h"

namespace {

constexpr const char *kLockFile = "/tmp/qrm_client.info.lock";

// No lock: a file is only ever replaced as a whole, so a reader sees the old text or the new one.
bool GetInfo(const std::string &key, std::string &value) {
    FixedText<1024> text;
    if (!IsTerminatedText(key) ||
        YLIBCFileGetKeyValue(appliance::kClientInfoFile, key.c_str(), text.Buffer(),
                             FixedText<1024>::Size(), 0) < 0) {
        return false;
    }
    value = text.sz();
    return true;
}

bool SetInfo(const std::string &key, const std::string &value) {
    if (!IsTerminatedText(key) || !IsTerminatedText(value)) {
        return false;
    }
    FileLock lock;
    return YLIBCFileLockByFile(kLockFile, 0, lock.Address()) > 0 &&
           YLIBCFileSetKeyValue(appliance::kClientInfoFile, key.c_str(), value.c_str(), 0) >= 0;
}

}  // namespace

bool ZELOQRMClientGetInfo(const std::string &key, std::string &value) {
    return ZELO_GUARD(false, [&] { return GetInfo(key, value); });
}

bool ZELOQRMClientSetInfo(const std::string &key, const std::string &value) {
    return ZELO_GUARD(false, [&] { return SetInfo(key, value); });
}
