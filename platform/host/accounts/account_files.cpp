#include "account_files.h"

#include <sys/time.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <mutex>
#include <new>
#include <utility>

#include "files/file_replacement.h"
#include "fork_safe.h"
#include "status.h"
#include "wait.h"

namespace host {
namespace {

constexpr const char *kFile = "account_files";

using Stream = std::unique_ptr<std::FILE, int (*)(std::FILE *)>;
using CText = std::unique_ptr<char, void (*)(void *)>;

// The lines of a text, each with its line feed; the last one may have none.
std::vector<std::string> SplitLines(const std::string &strText) {
    std::vector<std::string> lines;
    for (std::size_t begin = 0; begin < strText.size();) {
        const std::size_t feed = strText.find('\n', begin);
        const std::size_t end = feed == std::string::npos ? strText.size() : feed + 1;
        lines.push_back(strText.substr(begin, end - begin));
        begin = end;
    }
    return lines;
}

// The line that the C library writes for an entry; "" when it refuses a field.
template <typename Format>
std::string WriteLine(const typename Format::Entry &entry) {
    char *szLine = nullptr;
    std::size_t cbLine = 0;
    Stream pStream(open_memstream(&szLine, &cbLine), std::fclose);
    if (pStream == nullptr) {
        throw std::bad_alloc();
    }
    const bool blWritten = Format::kWrite(&entry, pStream.get()) == 0;
    const bool blComplete = std::fclose(pStream.release()) == 0;
    const CText line(szLine, std::free);
    return blWritten && blComplete ? std::string(szLine, cbLine) : std::string();
}

}  // namespace

template <typename Format>
void AccountFile<Format>::Parse(Line &line) {
    // Twice the line holds most entries; a group's members need a pointer each besides.
    int error = ERANGE;
    Entry *pEntry = nullptr;
    for (std::size_t cb = 2 * line.strText.size() + 128; error == ERANGE; cb *= 2) {
        const Stream pStream(fmemopen(line.strText.data(), line.strText.size(), "r"), std::fclose);
        if (pStream == nullptr) {
            throw std::bad_alloc();
        }
        line.texts = std::make_unique<char[]>(cb);
        error = Format::kRead(pStream.get(), &line.entry, line.texts.get(), cb, &pEntry);
    }
    if (error != 0 || pEntry == nullptr) {
        line.texts.reset();
    }
}

template <typename Format>
bool AccountFile<Format>::Read() {
    Status status = FindFile(Format::kPath, m_found);
    if (!status.Failed() && m_found.blThere) {
        status = ReadContent(m_found, m_strRead);
    }
    if (status.Failed()) {
        status.Publish();
        return false;
    }
    if (!m_found.blThere) {
        return !Format::kRequired || HOST_FAIL(YLIBC_ERR_FILE) == 0;
    }
    for (std::string &strLine : SplitLines(m_strRead)) {
        m_lines.emplace_back();
        m_lines.back().strText = std::move(strLine);
        Parse(m_lines.back());
    }
    return true;
}

template <typename Format>
const typename AccountFile<Format>::Entry *AccountFile<Format>::Find(
    const std::string &strName) const {
    for (const Line &line : m_lines) {
        if (line.texts != nullptr && line.entry.*kName == strName) {
            return &line.entry;
        }
    }
    return nullptr;
}

template <typename Format>
std::vector<const typename Format::Entry *> AccountFile<Format>::Entries() const {
    std::vector<const Entry *> entries;
    for (const Line &line : m_lines) {
        if (line.texts != nullptr) {
            entries.push_back(&line.entry);
        }
    }
    return entries;
}

template <typename Format>
bool AccountFile<Format>::Put(const Entry &entry, const Entry *pPlace) {
    Line line;
    line.strText = WriteLine<Format>(entry);
    Parse(line);
    if (line.texts == nullptr || std::strcmp(line.entry.*kName, entry.*kName) != 0) {
        HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
        return false;
    }
    const auto place = std::find_if(m_lines.begin(), m_lines.end(),
                                    [&](const Line &old) { return &old.entry == pPlace; });
    if (place != m_lines.end()) {
        *place = std::move(line);
        return true;
    }
    if (!m_lines.empty() && m_lines.back().strText.back() != '\n') {
        m_lines.back().strText += '\n';
    }
    m_lines.push_back(std::move(line));
    return true;
}

template <typename Format>
void AccountFile<Format>::Remove(const std::string &strName) {
    const auto blNamed = [&](const Line &line) {
        return line.texts != nullptr && line.entry.*kName == strName;
    };
    m_lines.erase(std::remove_if(m_lines.begin(), m_lines.end(), blNamed), m_lines.end());
}

template <typename Format>
bool AccountFile<Format>::Write() {
    std::string strText;
    for (const Line &line : m_lines) {
        strText += line.strText;
    }
    if (strText == m_strRead) {
        return true;
    }
    m_blWritten = true;
    Status status = ReplaceFile(m_found, strText);
    if (status.Failed()) {
        status.Publish();
    }
    return !status.Failed();
}

template <typename Format>
void AccountFile<Format>::PutBack() {
    if (m_blWritten) {
        static_cast<void>(ReplaceFile(m_found, m_strRead));
    }
}

template class AccountFile<PasswdFormat>;
template class AccountFile<ShadowFormat>;
template class AccountFile<GroupFormat>;
template class AccountFile<GroupShadowFormat>;

// --- The lock -----------------------------------------------------------------------------------

namespace {

// The C library's lock excludes processes; the threads of one process are kept apart here. A child
// process could not take the C library's when another thread held it at the fork.
std::mutex g_threads;
const int g_forkHandlers = HoldAroundForks<g_threads>();

}  // namespace

AccountLock::AccountLock() {
    const Waiting waiting({"waiting for the lock '/etc/.pwd.lock'"});
    g_threads.lock();
    // lckpwdf limits its wait with the process's alarm, and would leave the caller without its own.
    struct itimerval callers = {};
    const struct itimerval none = {};
    setitimer(ITIMER_REAL, &none, &callers);
    m_blHeld = lckpwdf() == 0;
    const int error = errno;
    setitimer(ITIMER_REAL, &callers, nullptr);
    if (!m_blHeld) {
        HOST_FAIL(error == EINTR ? YLIBC_ERR_BUSY : YLIBC_ERR_FILE);
    }
}

AccountLock::~AccountLock() {
    if (m_blHeld) {
        ulckpwdf();
    }
    g_threads.unlock();
}

}  // namespace host
