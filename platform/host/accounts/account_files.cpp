#include "account_files.h"

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <new>
#include <utility>

#include "files/file_replacement.h"

namespace host {
namespace {

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
Status AccountFile<Format>::Read() {
    HOST_TRY(FindFile(Format::kPath, m_found));
    if (!m_found.blThere) {
        return Format::kRequired
                   ? HOST_ERROR(YLIBC_ERR_FILE, std::string("there is no '") + Format::kPath + '\'')
                   : Status();
    }
    HOST_TRY(ReadContent(m_found, m_strRead));
    for (std::string &strLine : SplitLines(m_strRead)) {
        m_lines.emplace_back();
        m_lines.back().strText = std::move(strLine);
        Parse(m_lines.back());
    }
    return {};
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
Status AccountFile<Format>::Get(const std::string &strName, const Entry *&pEntry) const {
    pEntry = Find(strName);
    return pEntry != nullptr
               ? Status()
               : HOST_ERROR(YLIBC_ERR_NOT_FOUND, std::string("there is no '") + strName + "' in '" +
                                                     Format::kPath + '\'');
}

template <typename Format>
Status AccountFile<Format>::Put(const Entry &entry, const Entry *pPlace) {
    Line line;
    line.strText = WriteLine<Format>(entry);
    Parse(line);
    if (line.texts == nullptr || std::strcmp(line.entry.*kName, entry.*kName) != 0) {
        return HOST_ERROR(YLIBC_ERR_INVALID_ARGUMENT, std::string("no line of '") + Format::kPath +
                                                          "' can hold what is to be stored for '" +
                                                          entry.*kName + '\'');
    }
    const auto place = std::find_if(m_lines.begin(), m_lines.end(),
                                    [&](const Line &old) { return &old.entry == pPlace; });
    if (place != m_lines.end()) {
        *place = std::move(line);
        return {};
    }
    if (!m_lines.empty() && m_lines.back().strText.back() != '\n') {
        m_lines.back().strText += '\n';
    }
    m_lines.push_back(std::move(line));
    return {};
}

template <typename Format>
void AccountFile<Format>::Remove(const std::string &strName) {
    const auto isNamed = [&](const Line &line) {
        return line.texts != nullptr && line.entry.*kName == strName;
    };
    m_lines.erase(std::remove_if(m_lines.begin(), m_lines.end(), isNamed), m_lines.end());
}

template <typename Format>
Status AccountFile<Format>::Write() {
    std::string strText;
    for (const Line &line : m_lines) {
        strText += line.strText;
    }
    if (strText == m_strRead) {
        return {};
    }
    m_blWritten = true;
    return ReplaceFile(m_found, strText);
}

template <typename Format>
void AccountFile<Format>::PutBack() noexcept {
    try {
        static_cast<void>(!m_blWritten || ReplaceFile(m_found, m_strRead).Failed());
    } catch (const std::bad_alloc &) {
        // The file stays as it is now.
    }
}

template class AccountFile<PasswdFormat>;
template class AccountFile<ShadowFormat>;
template class AccountFile<GroupFormat>;
template class AccountFile<GroupShadowFormat>;

// The C library locks the whole file, which excludes locks on its bytes.
Status LockAccounts(HeldLock &lock) {
    constexpr int kLimit_s = 15;
    const Status status = lock.Take("/etc/.pwd.lock", kLimit_s);
    return status.Code() == YLIBC_ERR_BUSY
               ? HOST_ERROR(YLIBC_ERR_BUSY,
                            "the lock on the account files was held for 15 s by another program")
               : status;
}

}  // namespace host
