#include "progress.h"

#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstdio>
#include <string>

namespace qrmctl {
namespace {

constexpr auto kRedraw = std::chrono::milliseconds(100);
constexpr int kBarWidth = 24;

std::string SizeText(double cb) {
    constexpr std::array<const char *, 5> kUnits = {"B", "KiB", "MiB", "GiB", "TiB"};
    std::size_t unit = 0;
    for (; cb >= 1024 && unit + 1 < kUnits.size(); ++unit) {
        cb /= 1024;
    }
    std::array<char, 32> text = {};
    std::snprintf(text.data(), text.size(), unit == 0 ? "%.0f %s" : "%.1f %s", cb, kUnits[unit]);
    return text.data();
}

std::string TimeText(double seconds) {
    const long whole_s = static_cast<long>(std::min(seconds, 359999.0));
    std::array<char, 32> text = {};
    std::snprintf(text.data(), text.size(), "%ld:%02ld:%02ld", whole_s / 3600, whole_s / 60 % 60,
                  whole_s % 60);
    return text.data();
}

}  // namespace

Progress::Progress(bool blShow) : m_blShow(blShow && isatty(STDERR_FILENO) == 1) {}

void Progress::Clear() {
    if (m_blShow && m_drawn != Clock::time_point()) {
        std::fputs("\r\033[K", stderr);
        std::fflush(stderr);
    }
    m_drawn = Clock::time_point();
}

void Progress::Update(long long cbDone, long long cbExpected) {
    m_cbDone = cbDone;
    const Clock::time_point now = Clock::now();
    if (m_blShow && now - m_drawn >= kRedraw) {
        m_drawn = now;
        Draw(cbExpected, std::chrono::duration<double>(now - m_start).count());
    }
}

void Progress::Draw(long long cbExpected, double elapsed_s) const {
    const auto cbDone = static_cast<double>(m_cbDone);
    const double speed = elapsed_s > 0 ? cbDone / elapsed_s : 0;
    std::string strLine = SizeText(cbDone);
    if (cbExpected > 0) {
        const double share = std::min(1.0, cbDone / static_cast<double>(cbExpected));
        const auto filled = static_cast<std::size_t>(share * kBarWidth);
        strLine = '[' + std::string(filled, '#') + std::string(kBarWidth - filled, ' ') + "] " +
                  std::to_string(static_cast<int>(share * 100)) + "% " + strLine + " of " +
                  SizeText(static_cast<double>(cbExpected));
    }
    strLine += ", " + SizeText(speed) + "/s";
    if (cbExpected > m_cbDone && speed > 0) {
        strLine += ", " + TimeText(static_cast<double>(cbExpected - m_cbDone) / speed) + " left";
    }
    std::fprintf(stderr, "\r\033[K%s", strLine.c_str());
    std::fflush(stderr);
}

}  // namespace qrmctl
