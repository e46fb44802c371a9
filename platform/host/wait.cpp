// The waits of the process, in places that need no lock: one that another thread holds at a
// fork would stay locked in the child for ever.

#include "wait.h"

#include <pthread.h>

#include <array>
#include <atomic>
#include <cstddef>
#include <cstdint>
#include <new>
#include <string>

#include "fixed_text.h"
#include "status.h"
#include "waiting.h"

namespace {

constexpr const char *kFile = "waiting";
constexpr std::size_t kPlaces = 32;
constexpr std::size_t kMaxText = 512;

// Free at 0. Whoever takes a place writes the text and then the turn; the turns go up, so a reader
// that finds the same turn before and after its copy has a whole text, and the least is the oldest.
struct Place {
    std::atomic<bool> blTaken{false};
    std::atomic<std::uint64_t> turn{0};
    std::array<std::atomic<char>, kMaxText> text = {};
};

std::array<Place, kPlaces> g_places;
std::atomic<std::uint64_t> g_turns{0};

// The threads that wait are not in a child process.
void ForgetInChild() {
    for (Place &place : g_places) {
        place.turn.store(0, std::memory_order_relaxed);
        place.blTaken.store(false, std::memory_order_relaxed);
    }
}

const int g_forkHandlers = pthread_atfork(nullptr, nullptr, ForgetInChild);

std::size_t Copy(std::string_view text, Place &place, std::size_t at) {
    for (std::size_t i = 0; i < text.size() && at < kMaxText - 1; ++i, ++at) {
        place.text[at].store(text[i], std::memory_order_relaxed);
    }
    return at;
}

// The text of the place when it is still in the turn; else an empty one.
std::string TextOf(const Place &place, std::uint64_t turn) {
    std::string strText;
    for (const std::atomic<char> &byte : place.text) {
        const char c = byte.load(std::memory_order_relaxed);
        if (c == '\0') {
            break;
        }
        strText += c;
    }
    std::atomic_thread_fence(std::memory_order_acquire);
    return place.turn.load(std::memory_order_relaxed) == turn ? strText : std::string();
}

const Place *Oldest(std::uint64_t &turn) {
    const Place *pOldest = nullptr;
    for (const Place &place : g_places) {
        const std::uint64_t other = place.turn.load(std::memory_order_acquire);
        if (other != 0 && (pOldest == nullptr || other < turn)) {
            pOldest = &place;
            turn = other;
        }
    }
    return pOldest;
}

}  // namespace

namespace host {

Waiting::Waiting(std::initializer_list<std::string_view> parts) {
    for (std::size_t i = 0; parts.size() > 0 && i < kPlaces; ++i) {
        Place &place = g_places[i];
        if (place.blTaken.exchange(true, std::memory_order_acquire)) {
            continue;
        }
        m_place = static_cast<int>(i);
        std::atomic_thread_fence(std::memory_order_release);
        std::size_t end = 0;
        for (const std::string_view part : parts) {
            end = Copy(part, place, end);
        }
        place.text[end].store('\0', std::memory_order_relaxed);
        place.turn.store(++g_turns, std::memory_order_release);
        return;
    }
}

Waiting::~Waiting() {
    if (m_place >= 0) {
        Place &place = g_places[static_cast<std::size_t>(m_place)];
        place.turn.store(0, std::memory_order_relaxed);
        place.blTaken.store(false, std::memory_order_release);
    }
}

}  // namespace host

int ZELOWaitingFor(char *sz, int cb) {
    if (sz == nullptr || cb <= 0) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    *sz = '\0';
    try {
        std::uint64_t turn = 0;
        for (const Place *pPlace = Oldest(turn); pPlace != nullptr; pPlace = Oldest(turn)) {
            const std::string strText = TextOf(*pPlace, turn);
            if (!strText.empty()) {
                return CopyToFit(sz, cb, strText);
            }
        }
        return 0;
    } catch (const std::bad_alloc &) {
        return HOST_FAIL(YLIBC_ERR_OUT_OF_MEMORY);
    }
}
