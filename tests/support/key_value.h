// Key-value files in a folder that everybody can write to.

#ifndef ZELO_TESTS_KEY_VALUE_H
#define ZELO_TESTS_KEY_VALUE_H

#include <gtest/gtest.h>

#include <functional>
#include <set>

#include "children.h"
#include "files.h"
#include "key_value_file.h"

namespace key_value {

using namespace files;
using Set = std::set<std::string>;
using std::string_literals::operator""s;

constexpr const char *kFolder = "/tmp/shared";
constexpr const char *kFile = "/tmp/shared/a.conf";

// A folder that everybody can write to, empty.
class KeyValueFile : public testing::Test {
  protected:
    void SetUp() override {
        fs::remove_all(kFolder);
        fs::create_directory(kFolder);
        chmod(kFolder, 01777);
    }
};

inline Set Names(const char *szFolder) {
    Set names;
    for (const auto &entry : fs::directory_iterator(szFolder)) {
        names.insert(entry.path().filename());
    }
    return names;
}

inline std::string Value(const char *szPath, const char *szKey) {
    std::string strValue(100000, 'x');
    const int cb = YLIBCFileGetKeyValue(szPath, szKey, strValue.data(), 100000, 0);
    return cb < 0 ? "unreadable" : strValue.substr(0, static_cast<std::size_t>(cb));
}

inline int SetValue(const char *szPath, const std::string &strKey, const std::string &strValue) {
    return YLIBCFileSetKeyValue(szPath, strKey.c_str(), strValue.c_str(), 0);
}

// Sets keys in so many processes at once; false when one of them has failed.
inline bool SetInProcesses(int processes, int keys,
                           const std::function<bool(const std::string &strKey)> &set) {
    return children::InEach(processes, [&](int process) {
        bool blAll = true;
        for (int i = 0; i < keys; ++i) {
            blAll = set(std::to_string(process) + '.' + std::to_string(i)) && blAll;
        }
        return blAll;
    });
}

}  // namespace key_value

#endif
