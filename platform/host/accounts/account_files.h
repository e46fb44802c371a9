// The system's account files, read and changed with the C library's account functions.
//
// A file is held as its lines. The C library reads each of them, and it writes the one that
// changes; every other line goes back byte for byte, whatever it holds (a comment, an entry in an
// odd form).

#ifndef ZELO_HOST_ACCOUNT_FILES_H
#define ZELO_HOST_ACCOUNT_FILES_H

#include <grp.h>
#include <gshadow.h>
#include <pwd.h>
#include <shadow.h>

#include <memory>
#include <new>
#include <string>
#include <string_view>
#include <vector>

#include "files/held_lock.h"
#include "files/trusted_file.h"
#include "status.h"

namespace host {

struct PasswdFormat {
    using Entry = passwd;
    static constexpr const char *kPath = "/etc/passwd";
    static constexpr bool kRequired = true;
    static constexpr auto kRead = fgetpwent_r;
    static constexpr auto kWrite = putpwent;
    static constexpr auto kName = &passwd::pw_name;
};

struct ShadowFormat {
    using Entry = spwd;
    static constexpr const char *kPath = "/etc/shadow";
    static constexpr bool kRequired = false;
    static constexpr auto kRead = fgetspent_r;
    static constexpr auto kWrite = putspent;
    static constexpr auto kName = &spwd::sp_namp;
};

struct GroupFormat {
    using Entry = group;
    static constexpr const char *kPath = "/etc/group";
    static constexpr bool kRequired = true;
    static constexpr auto kRead = fgetgrent_r;
    static constexpr auto kWrite = putgrent;
    static constexpr auto kName = &group::gr_name;
};

struct GroupShadowFormat {
    using Entry = sgrp;
    static constexpr const char *kPath = "/etc/gshadow";
    static constexpr bool kRequired = false;
    static constexpr auto kRead = fgetsgent_r;
    static constexpr auto kWrite = putsgent;
    static constexpr auto kName = &sgrp::sg_namp;
};

// In the password field of the other file: the hash stands in the shadow file.
constexpr std::string_view kHashInShadow = "x";

// Entries that are handed out live until they are replaced, or one is added or removed.
template <typename Format>
class AccountFile {
  public:
    using Entry = typename Format::Entry;

    // Reads the file. A shadow file that is not there has no entries and does not exist; without
    // one of the other two nobody can say which accounts there are.
    Status Read();
    bool Exists() const { return m_found.file.IsOpen(); }

    // All entries, in the order of the file.
    std::vector<const Entry *> Entries() const;

    // The first entry that passes the test; null when there is none.
    template <typename Test>
    const Entry *FindIf(const Test &passes) const {
        for (const Line &line : m_lines) {
            if (line.texts != nullptr && passes(line.entry)) {
                return &line.entry;
            }
        }
        return nullptr;
    }

    // The entry of this name, of several the first.
    const Entry *Find(const std::string &strName) const {
        return FindIf([&](const Entry &entry) { return entry.*kName == strName; });
    }

    // The same where it has to be there, else YLIBC_ERR_NOT_FOUND.
    Status Get(const std::string &strName, const Entry *&pEntry) const;

    // Puts the entry in the place of one of the file's own, which it may share texts with; at the
    // file's end when pPlace is null.
    Status Put(const Entry &entry, const Entry *pPlace);

    // Removes every entry of this name.
    void Remove(const std::string &strName);

    // Replaces the file, if anything has changed.
    Status Write();

    // Puts the content back that was read, where Write has replaced it; as far as that is possible.
    void PutBack() noexcept;

  private:
    static constexpr auto kName = Format::kName;

    struct Line {
        std::string strText;
        Entry entry = {};
        std::unique_ptr<char[]> texts;  // what the entry's pointers lead to; null: no entry
    };

    // Reads the entry from the line's text, if it holds one.
    static void Parse(Line &line);

    FoundFile m_found;
    std::string m_strRead;
    std::vector<Line> m_lines;
    bool m_blWritten = false;
};

using PasswdFile = AccountFile<PasswdFormat>;
using ShadowFile = AccountFile<ShadowFormat>;
using GroupFile = AccountFile<GroupFormat>;
using GroupShadowFile = AccountFile<GroupShadowFormat>;

// Reads the files.
template <typename... Files>
Status ReadAll(Files &...files) {
    Status status;
    static_cast<void>(((status = files.Read(), !status.Failed()) && ...));
    return status;
}

// Replaces the files in this order. When one cannot be written, those before it get their old
// content back. Readers who look in between see the first files already new: the file that makes an
// account exist goes last.
template <typename... Files>
Status WriteInOrder(Files &...files) {
    Status status;
    try {
        static_cast<void>(((status = files.Write(), !status.Failed()) && ...));
    } catch (const std::bad_alloc &) {
        status = HOST_ERROR(YLIBC_ERR_OUT_OF_MEMORY, "memory is short");
    }
    if (status.Failed()) {
        (files.PutBack(), ...);
    }
    return status;
}

// Takes the system's lock on its account files, which the shadow suite's programs take too.
Status LockAccounts(HeldLock &lock);

}  // namespace host

#endif
