// Disk idle timer: the time is kept as a key of the platform's configuration; a disk that spins
// gets it through the kernel's runtime power management, where its driver offers that.

#include "idle_timer.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <charconv>
#include <filesystem>
#include <limits>
#include <optional>
#include <string>
#include <system_error>

#include "descriptor.h"
#include "files/key_value_lookup.h"
#include "status.h"

namespace {

namespace fs = std::filesystem;

constexpr const char *kKey = "disk_idle_minutes";
constexpr unsigned long kDefault_min = 20;
constexpr const char *kDisks = "/sys/block";
constexpr unsigned long kMsPerMinute = 60'000;

bool ReadNumber(const std::string &strText, unsigned long &number) {
    const char *const pEnd = strText.data() + strText.size();
    const auto parsed = std::from_chars(strText.data(), pEnd, number);
    return parsed.ec == std::errc() && parsed.ptr == pEnd;
}

bool WriteAttribute(const fs::path &path, const std::string &strText) {
    const Descriptor file(open(path.c_str(), O_WRONLY | O_CLOEXEC));
    return write(file.Get(), strText.data(), strText.size()) ==
           static_cast<ssize_t>(strText.size());
}

bool Spins(const fs::path &disk) {
    const Descriptor file(open((disk / "queue/rotational").c_str(), O_RDONLY | O_CLOEXEC));
    char c = '0';
    return read(file.Get(), &c, 1) == 1 && c == '1';
}

void ApplyTo(const fs::path &disk, unsigned long idleTime) {
    const fs::path power = disk / "device/power";
    if (idleTime == 0) {
        WriteAttribute(power / "control", "on");
        return;
    }
    constexpr unsigned long kLongest_min = std::numeric_limits<int>::max() / kMsPerMinute;
    const unsigned long delay_ms = std::min(idleTime, kLongest_min) * kMsPerMinute;
    // A driver without the timer refuses the delay; without a delay the disk would sleep at once.
    if (WriteAttribute(power / "autosuspend_delay_ms", std::to_string(delay_ms))) {
        WriteAttribute(power / "control", "auto");
    }
}

void Apply(unsigned long idleTime) {
    std::error_code error;
    for (fs::directory_iterator disk(kDisks, error); !error && disk != fs::directory_iterator();
         disk.increment(error)) {
        if (Spins(disk->path())) {
            ApplyTo(disk->path(), idleTime);
        }
    }
}

}  // namespace

int ZELODiskAllIdleTimerGet(unsigned long *pIdleTime) {
    return HOST_OPERATION([&]() -> host::Status {
        HOST_REQUIRE(pIdleTime != nullptr);
        std::optional<std::string> value;
        unsigned long idleTime = kDefault_min;
        HOST_TRY(host::LookUpKey(host::kConfigFile, kKey, value));
        if (value && !ReadNumber(*value, idleTime)) {
            return HOST_ERROR(YLIBC_ERR_FILE, "'" + *value + "' of '" + kKey + "' in '" +
                                                  host::kConfigFile + "' is no number");
        }
        *pIdleTime = idleTime;
        return {};
    });
}

int ZELODiskAllIdleTimerSet(unsigned long idleTime) {
    return HOST_OPERATION([&]() -> host::Status {
        HOST_TRY(host::SetSetting(kKey, std::to_string(idleTime).c_str()));
        Apply(idleTime);
        return {};
    });
}
