// Key-value files: read as a whole, line by line, and written as a whole.

#include "key_value_file.h"

#include <new>
#include <string_view>
#include <utility>
#include <vector>

#include "file_lock.h"
#include "file_replacement.h"
#include "fixed_text.h"
#include "key_value_lookup.h"
#include "status.h"
#include "strings/hash_place.h"
#include "trusted_file.h"

namespace {

constexpr const char *kFile = "key_value_file";
constexpr const char *kConfigLock = "/etc/.zeloinfo.conf.lock";

// --- The format ---------------------------------------------------------------------------------

bool IsBlank(char c) {
    return c == ' ' || c == '\t' || c == '\r' || c == '\n';
}

std::string_view Trim(std::string_view text) {
    while (!text.empty() && IsBlank(text.front())) {
        text.remove_prefix(1);
    }
    while (!text.empty() && IsBlank(text.back())) {
        text.remove_suffix(1);
    }
    return text;
}

// The text up to the closing quote. What follows that quote does not count; without one the value
// ends with the line.
std::string Unquote(std::string_view quoted) {
    const std::string_view plain = quoted.substr(1, quoted.find('"', 1) - 1);
    if (plain.find('\\') == std::string_view::npos) {
        return std::string(plain);
    }
    std::string strValue;
    for (std::size_t i = 1; i < quoted.size() && quoted[i] != '"'; ++i) {
        if (quoted[i] == '\\' && i + 1 < quoted.size()) {
            ++i;
        }
        strValue += quoted[i];
    }
    return strValue;
}

std::string ValueOf(std::string_view text) {
    return !text.empty() && text.front() == '"' ? Unquote(text) : std::string(text);
}

// A line of a file, with its line feed. One that is no pair has an empty key, and so has one with a
// zero byte: no caller could be handed it whole.
struct Line {
    std::string_view text;
    std::string_view key;
    std::string_view value;

    bool HasKey(std::string_view wanted) const { return !key.empty() && key == wanted; }
};

// Takes the next line off the front of the text. False at the end.
bool TakeLine(std::string_view &text, Line &line) {
    const std::size_t end = text.find('\n');
    line = {text.substr(0, end == std::string_view::npos ? end : end + 1), {}, {}};
    text.remove_prefix(line.text.size());
    const std::size_t equals = line.text.find('=');
    if (equals == std::string_view::npos || line.text.find('\0') != std::string_view::npos) {
        return !line.text.empty();
    }
    const std::string_view key = Trim(line.text.substr(0, equals));
    if (!key.empty() && key.front() != '#') {
        line.key = key;
        line.value = Trim(line.text.substr(equals + 1));
    }
    return true;
}

// Takes lines off the front of the text up to the first one with the key. False when there is none.
// A line that does not hold the key's characters anywhere is passed over unread.
bool TakeLineWithKey(std::string_view &text, std::string_view key, Line &line) {
    for (std::size_t at = text.find(key); at != std::string_view::npos; at = text.find(key)) {
        text.remove_prefix(text.substr(0, at).rfind('\n') + 1);  // npos + 1 is 0
        if (!TakeLine(text, line)) {
            return false;
        }
        if (line.HasKey(key)) {
            return true;
        }
    }
    text = {};
    return false;
}

bool HoldsLineEnd(std::string_view text) {
    return text.find_first_of("\r\n") != std::string_view::npos;
}

// Whether a line written with the key and the value reads as that pair.
bool CanHold(std::string_view key, std::string_view value) {
    return !key.empty() && key.front() != '#' && key.find('=') == std::string_view::npos &&
           Trim(key) == key && !HoldsLineEnd(key) && !HoldsLineEnd(value);
}

// In quotes every value reads as it was written, whatever it begins or ends with.
void AppendLine(std::string &strText, std::string_view key, std::string_view value) {
    strText.append(key).append("=\"");
    for (char c : value) {
        if (c == '"' || c == '\\') {
            strText += '\\';
        }
        strText += c;
    }
    strText += "\"\n";
}

// --- Reading and changing -----------------------------------------------------------------------

// Runs the body of an operation. Short memory fails it like anything else.
template <typename Body>
int Guarded(const Body &body) {
    try {
        return body();
    } catch (const std::bad_alloc &) {
        return HOST_FAIL(YLIBC_ERR_OUT_OF_MEMORY);
    }
}

bool Read(const char *szPath, std::string &strText) {
    host::FoundFile found;
    switch (host::FindFile(szPath, found)) {
        case host::Find::kFile:
            return host::ReadContent(found, strText);
        case host::Find::kNoFile:
            HOST_FAIL(YLIBC_ERR_NOT_FOUND);
            return false;
        default:
            return false;
    }
}

// A file as it stands before a change.
struct OldFile {
    host::FoundFile found;
    std::string strText;
};

// Reads a file that may be missing: it then counts as empty.
bool ReadForChange(const char *szPath, OldFile &old) {
    const host::Find find = host::FindFile(szPath, old.found);
    return find == host::Find::kNoFile ||
           (find == host::Find::kFile && host::ReadContent(old.found, old.strText));
}

int Replace(OldFile &old, const std::string &strNew) {
    // A file system takes longer to replace a file that is still open.
    old.found.file = Descriptor();
    return host::ReplaceFile(old.found, strNew);
}

int SetValue(const char *szPath, std::string_view key, std::string_view value) {
    OldFile old;
    if (!ReadForChange(szPath, old)) {
        return -1;
    }
    std::string strNew;
    strNew.reserve(old.strText.size() + key.size() + 2 * value.size() + sizeof("\n=\"\"\n"));
    Line line;
    std::string_view rest = old.strText;
    if (TakeLineWithKey(rest, key, line)) {
        if (ValueOf(line.value) == value) {
            return 0;
        }
        strNew.assign(old.strText, 0, old.strText.size() - rest.size() - line.text.size());
    } else {
        strNew.append(old.strText);
        if (!strNew.empty() && strNew.back() != '\n') {
            strNew += '\n';
        }
    }
    AppendLine(strNew, key, value);
    strNew.append(rest);
    return Replace(old, strNew);
}

int RemoveLines(const char *szPath, std::string_view key) {
    OldFile old;
    if (!ReadForChange(szPath, old)) {
        return -1;
    }
    std::string strNew;
    strNew.reserve(old.strText.size());
    Line line;
    std::string_view rest = old.strText;
    std::string_view kept = rest;
    while (TakeLineWithKey(rest, key, line)) {
        strNew.append(kept, 0, kept.size() - rest.size() - line.text.size());
        kept = rest;
    }
    strNew.append(kept);
    return strNew.size() == old.strText.size() ? 0 : Replace(old, strNew);
}

int ReadPairs(const char *szPath, YLIBSZHASH **ppHash) {
    std::string strText;
    if (!Read(szPath, strText)) {
        return -1;
    }
    // Of several lines with a key the first one holds: what it has set is not set again.
    YLIBSZHASH &hash = **ppHash;
    std::vector<bool> blOldSet(static_cast<std::size_t>(hash.nItem), false);
    int keys = 0;
    Line line;
    for (std::string_view rest = strText; TakeLine(rest, line);) {
        if (line.key.empty()) {
            continue;
        }
        std::string strValue = ValueOf(line.value);
        const int before = hash.nItem;
        const host::PlaceInHash place = host::FindOrAddKey(hash, line.key);
        const bool blOld = place.index < blOldSet.size();
        if (hash.nItem > before || (blOld && !blOldSet[place.index])) {
            place.strValue.swap(strValue);
            ++keys;
        }
        if (blOld) {
            blOldSet[place.index] = true;
        }
    }
    return keys;
}

}  // namespace

host::LookUp host::LookUpKey(const char *szPath, const char *szKey, std::string &strValue) {
    std::string strText;
    if (!Read(szPath, strText)) {
        return LookUp::kUnreadable;
    }
    Line line;
    std::string_view rest = strText;
    if (!TakeLineWithKey(rest, szKey, line)) {
        return LookUp::kAbsent;
    }
    strValue = ValueOf(line.value);
    return LookUp::kFound;
}

bool host::LookUpSetting(const char *szKey, std::string &strValue) {
    const LastError before;
    const bool blFound = LookUpKey(kConfigFile, szKey, strValue) == LookUp::kFound;
    before.Restore();
    return blFound;
}

int YLIBCFileGetKeyValue(const char *szPath, const char *szKey, char *szValue, int cbValue,
                         int /*flags*/) {
    if (szValue == nullptr || cbValue <= 0) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    szValue[0] = '\0';
    if (szPath == nullptr || szKey == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    return Guarded([&] {
        std::string strValue;
        switch (host::LookUpKey(szPath, szKey, strValue)) {
            case host::LookUp::kFound:
                return CopyToFit(szValue, cbValue, strValue);
            case host::LookUp::kAbsent:
                HOST_FAIL(YLIBC_ERR_NOT_FOUND);
                return 0;
            default:
                return -1;
        }
    });
}

int YLIBCFileCheckKeyValue(const char *szPath, const char *szKey, const char *szExpected,
                           int /*flags*/) {
    if (szPath == nullptr || szKey == nullptr || szExpected == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    return Guarded([&] {
        std::string strValue;
        switch (host::LookUpKey(szPath, szKey, strValue)) {
            case host::LookUp::kFound:
                return strValue == szExpected ? 1 : 0;
            case host::LookUp::kAbsent:
                HOST_FAIL(YLIBC_ERR_NOT_FOUND);
                return 0;
            default:
                return -1;
        }
    });
}

int YLIBCFileSetKeyValue(const char *szPath, const char *szKey, const char *szValue,
                         int /*flags*/) {
    if (szPath == nullptr || szPath[0] == '\0' || szKey == nullptr || szValue == nullptr ||
        !CanHold(szKey, szValue)) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    return Guarded([&] { return SetValue(szPath, szKey, szValue); });
}

int YLIBCFileRemoveKey(const char *szPath, const char *szKey) {
    if (szPath == nullptr || szPath[0] == '\0' || szKey == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    return Guarded([&] { return RemoveLines(szPath, szKey); });
}

int YLIBCFileGetPair(const char *szPath, YLIBSZHASH **ppHash) {
    if (szPath == nullptr || ppHash == nullptr || *ppHash == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    return Guarded([&] { return ReadPairs(szPath, ppHash); });
}

int YLIBCINFOSetKeyValue(const char *szKey, const char *szValue) {
    // What is refused does not leave a lock file behind.
    if (szKey == nullptr || szValue == nullptr || !CanHold(szKey, szValue)) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    int lock = -1;
    if (YLIBCFileLockByFile(kConfigLock, 0, &lock) < 0) {
        return -1;
    }
    const int result = YLIBCFileSetKeyValue(host::kConfigFile, szKey, szValue, 0);
    YLIBCFileUnlockByFile(lock);
    return result;
}
