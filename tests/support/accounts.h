// The appliance's accounts as tests see and change them.

#ifndef ZELO_TESTS_ACCOUNTS_H
#define ZELO_TESTS_ACCOUNTS_H

#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <map>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "files.h"
#include "user_group.h"

namespace accounts {

using Files = std::map<std::string, std::string>;
using Names = std::vector<std::string>;
using User = std::unique_ptr<ZELO_USER, decltype(&ZELOUserFree)>;
using Group = std::unique_ptr<ZELO_GROUP, decltype(&ZELOGroupFree)>;

// The account files that there are.
inline Files ReadFiles() {
    Files files;
    for (const char *szName : {"passwd", "shadow", "group", "gshadow"}) {
        if (std::filesystem::exists(std::string("/etc/") + szName)) {
            files[szName] = files::FileText(std::string("/etc/") + szName);
        }
    }
    return files;
}

inline void WriteFiles(const Files &files) {
    for (const char *szName : {"passwd", "shadow", "group", "gshadow"}) {
        std::filesystem::remove(std::string("/etc/") + szName);
    }
    for (const auto &[strName, strContent] : files) {
        files::WriteFile("/etc/" + strName, strContent);
    }
}

// What the system's own checks of the account files have to say.
inline std::string Findings() {
    const int status = std::system("{ pwck -r && grpck -r; } >/tmp/findings 2>&1");
    return files::FileText("/tmp/findings") + (status == 0 ? "" : "failed");
}

inline int Add(const User &pUser) {
    return ZELOUserSetOne(nullptr, pUser.get(), nullptr);
}

inline int Change(const User &pUser) {
    return ZELOUserSetOne(pUser->szName, pUser.get(), nullptr);
}

inline User Get(const char *szName) {
    ZELO_USER *pUser = nullptr;
    const int result = ZELOUserGet(szName, &pUser);
    return {result == 0 ? pUser : nullptr, ZELOUserFree};
}

inline int Delete(const std::vector<const char *> &names) {
    return ZELOUserDelete(names.data(), static_cast<int>(names.size()), nullptr);
}

// The password field of a user, or of a group, in one of the account files.
inline std::string PasswordIn(const char *szFile, const std::string &strName) {
    const std::string strFile = '\n' + ReadFiles()[szFile];
    const std::size_t field = strFile.find('\n' + strName + ':') + strName.size() + 2;
    return strFile.substr(field, strFile.find(':', field) - field);
}

inline Group Administrators() {
    ZELO_GROUP *pGroup = nullptr;
    const int result = ZELOGroupGet("administrators", &pGroup);
    return {result == 0 ? pGroup : nullptr, ZELOGroupFree};
}

inline Names Members() {
    Names members;
    const Group pGroup = Administrators();
    for (char **ppsz = pGroup->ppszMembers; *ppsz != nullptr; ++ppsz) {
        members.emplace_back(*ppsz);
    }
    return members;
}

// Exchanges the record's list for a new one, and has the old one released, as any caller does.
inline int SetMembers(const Names &members, const Group &pGroup = Administrators()) {
    const Group pOld(new ZELO_GROUP(), ZELOGroupFree);
    pOld->ppszMembers = static_cast<char **>(std::calloc(members.size() + 1, sizeof(char *)));
    for (std::size_t i = 0; i < members.size(); ++i) {
        pOld->ppszMembers[i] = strdup(members[i].c_str());
    }
    std::swap(pOld->ppszMembers, pGroup->ppszMembers);
    return ZELOGroupSet("administrators", pGroup.get());
}

}  // namespace accounts

#endif
