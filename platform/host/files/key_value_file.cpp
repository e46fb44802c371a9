// Key-value files: read as a whole, line by line, and written as a whole.

#include "key_value_file.h"

#include <string_view>
#include <vector>

#include "file_replacement.h"
#include "fixed_text.h"
#include "held_lock.h"
#include "key_value_lookup.h"
#include "strings/hash_place.h"
#include "trusted_file.h"

namespace {

using host::Status;

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

Status Read(const char *szPath, std::string &strText) {
    host::FoundFile found;
    HOST_TRY(host::FindFile(szPath, found));
    if (!found.blThere) {
        return HOST_ERROR(YLIBC_ERR_NOT_FOUND, "there is no file '" + found.strPath + '\'');
    }
    return host::ReadContent(found, strText);
}

// A file as it stands before a change.
struct OldFile {
    host::FoundFile found;
    std::string strText;
};

// Reads a file that may be missing: it then counts as empty.
Status ReadForChange(const char *szPath, OldFile &old) {
    HOST_TRY(host::FindFile(szPath, old.found));
    return old.found.blThere ? host::ReadContent(old.found, old.strText) : Status();
}

Status Replace(OldFile &old, const std::string &strNew) {
    // A file system takes longer to replace a file that is still open.
    old.found.file = Descriptor();
    return host::ReplaceFile(old.found, strNew);
}

Status SetValue(const char *szPath, std::string_view key, std::string_view value) {
    OldFile old;
    HOST_TRY(ReadForChange(szPath, old));
    std::string strNew;
    strNew.reserve(old.strText.size() + key.size() + 2 * value.size() + sizeof("\n=\"\"\n"));
    Line line;
    std::string_view rest = old.strText;
    if (TakeLineWithKey(rest, key, line)) {
        if (ValueOf(line.value) == value) {
            return {};
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

Status RemoveLines(const char *szPath, std::string_view key) {
    OldFile old;
    HOST_TRY(ReadForChange(szPath, old));
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
    return strNew.size() == old.strText.size() ? Status() : Replace(old, strNew);
}

Status ReadPairs(const char *szPath, YLIBSZHASH **ppHash, int &keys) {
    std::string strText;
    HOST_TRY(Read(szPath, strText));
    // Of several lines with a key the first one holds: what it has set is not set again.
    YLIBSZHASH &hash = **ppHash;
    std::vector<bool> blOldSet(static_cast<std::size_t>(hash.nItem), false);
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
    return {};
}

Status NoSuchKey(const char *szPath, const char *szKey) {
    return HOST_ERROR(YLIBC_ERR_NOT_FOUND,
                      std::string("'") + szPath + "' does not have the key '" + szKey + '\'');
}

}  // namespace

Status host::LookUpKey(const char *szPath, const char *szKey, std::optional<std::string> &value) {
    std::string strText;
    HOST_TRY(Read(szPath, strText));
    Line line;
    std::string_view rest = strText;
    value.reset();
    if (TakeLineWithKey(rest, szKey, line)) {
        value = ValueOf(line.value);
    }
    return {};
}

Status host::ReadSetting(const char *szKey, std::optional<std::string> &value) {
    Status status = LookUpKey(kConfigFile, szKey, value);
    return status.Code() == YLIBC_ERR_NOT_FOUND ? Status() : status;
}

bool host::LookUpSetting(const char *szKey, std::string &strValue) {
    std::optional<std::string> value;
    const bool blFound = !LookUpKey(kConfigFile, szKey, value).Failed() && value;
    if (blFound) {
        strValue = *value;
    }
    return blFound;
}

Status host::SetSetting(const char *szKey, const char *szValue) {
    // What is refused does not leave a lock file behind.
    HOST_REQUIRE(CanHold(szKey, szValue));
    HeldLock lock;
    HOST_TRY(lock.Take(kConfigLock));
    return SetValue(kConfigFile, szKey, szValue);
}

int YLIBCFileGetKeyValue(const char *szPath, const char *szKey, char *szValue, int cbValue,
                         int /*flags*/) {
    int cb = 0;
    return HOST_OPERATION(-1, cb, [&]() -> Status {
        HOST_REQUIRE(szValue != nullptr && cbValue > 0);
        szValue[0] = '\0';
        HOST_REQUIRE(szPath != nullptr && szKey != nullptr);
        std::optional<std::string> value;
        HOST_TRY(host::LookUpKey(szPath, szKey, value));
        if (value) {
            cb = CopyToFit(szValue, cbValue, *value);
        } else {
            NoSuchKey(szPath, szKey).Publish();
        }
        return {};
    });
}

int YLIBCFileCheckKeyValue(const char *szPath, const char *szKey, const char *szExpected,
                           int /*flags*/) {
    int same = 0;
    return HOST_OPERATION(-1, same, [&]() -> Status {
        HOST_REQUIRE(szPath != nullptr && szKey != nullptr && szExpected != nullptr);
        std::optional<std::string> value;
        HOST_TRY(host::LookUpKey(szPath, szKey, value));
        if (value) {
            same = *value == szExpected ? 1 : 0;
        } else {
            NoSuchKey(szPath, szKey).Publish();
        }
        return {};
    });
}

int YLIBCFileSetKeyValue(const char *szPath, const char *szKey, const char *szValue,
                         int /*flags*/) {
    return HOST_OPERATION([&]() -> Status {
        HOST_REQUIRE(szPath != nullptr && szPath[0] != '\0');
        HOST_REQUIRE(szKey != nullptr && szValue != nullptr && CanHold(szKey, szValue));
        return SetValue(szPath, szKey, szValue);
    });
}

int YLIBCFileRemoveKey(const char *szPath, const char *szKey) {
    return HOST_OPERATION([&]() -> Status {
        HOST_REQUIRE(szPath != nullptr && szPath[0] != '\0' && szKey != nullptr);
        return RemoveLines(szPath, szKey);
    });
}

int YLIBCFileGetPair(const char *szPath, YLIBSZHASH **ppHash) {
    int keys = 0;
    return HOST_OPERATION(-1, keys, [&]() -> Status {
        HOST_REQUIRE(szPath != nullptr && ppHash != nullptr && *ppHash != nullptr);
        return ReadPairs(szPath, ppHash, keys);
    });
}

int YLIBCINFOSetKeyValue(const char *szKey, const char *szValue) {
    return HOST_OPERATION([&]() -> Status {
        HOST_REQUIRE(szKey != nullptr && szValue != nullptr);
        return host::SetSetting(szKey, szValue);
    });
}
