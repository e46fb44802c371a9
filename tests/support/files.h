// Files as tests see and change them.

#ifndef ZELO_TESTS_FILES_H
#define ZELO_TESTS_FILES_H

#include <sys/stat.h>

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>
#include <vector>

namespace files {

namespace fs = std::filesystem;

constexpr const char *kConfig = "/etc/zeloinfo.conf";
constexpr const char *kCaFile = "/usr/zelo/etc/ssl/ca.d/server.pem";
constexpr const char *kMarker = "/tmp/qrmclientconnectfailed";
constexpr const char *kInfoFile = "/tmp/qrm_client.info";
constexpr const char *kJournal = "/var/log/notifications.jsonl";

inline std::string FileText(const std::string &strPath) {
    std::ifstream file(strPath, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()};
}

// In place: a file that is there stays the same one.
inline void WriteFile(const std::string &strPath, const std::string &strText) {
    std::ofstream(strPath, std::ios::binary) << strText;
}

// A new file, as an operator's tool writes it: the folder changes too.
inline void Replace(const std::string &strPath, const std::string &strText) {
    fs::remove(strPath);
    WriteFile(strPath, strText);
}

inline void WriteProgram(const std::string &strPath, const std::string &strScript,
                         mode_t mode = 0755) {
    WriteFile(strPath, "#!/bin/sh\n" + strScript + '\n');
    chmod(strPath.c_str(), mode);
}

inline std::vector<std::string> FileLines(const std::string &strPath) {
    std::ifstream file(strPath);
    std::vector<std::string> lines;
    for (std::string strLine; std::getline(file, strLine);) {
        lines.push_back(strLine);
    }
    return lines;
}

// 0 where there is none.
inline unsigned FileMode(const std::string &strPath) {
    struct stat status = {};
    return stat(strPath.c_str(), &status) == 0 ? status.st_mode & 07777U : 0;
}

// Puts something of another user's at the path, below "/tmp": a "file" that everybody may write to,
// or a "link" to "/tmp/target". False where none is left, or never was: tests/in_box makes them as
// root.
inline bool PutStrangers(const std::string &strKind, const std::string &strPath) {
    for (int i = 1; i <= 8; ++i) {
        const std::string strKept = "/tmp/strangers/" + strKind + std::to_string(i);
        if (std::rename(strKept.c_str(), strPath.c_str()) == 0) {
            return true;
        }
    }
    return false;
}

// The link's own where it is one; all zero where there is nothing.
inline struct stat Status(const std::string &strPath) {
    struct stat status = {};
    lstat(strPath.c_str(), &status);
    return status;
}

// As often as it fits.
inline std::string Repeated(const std::string &strText, std::size_t cbMost) {
    std::string strAll;
    while (strAll.size() + strText.size() <= cbMost) {
        strAll += strText;
    }
    return strAll;
}

// Whether a process, such as "self", has the file open.
inline bool HasOpen(const std::string &strProcess, const std::string &strPath) {
    std::error_code gone;
    for (const auto &entry : fs::directory_iterator("/proc/" + strProcess + "/fd")) {
        if (fs::read_symlink(entry, gone) == strPath) {
            return true;
        }
    }
    return false;
}

inline bool Holds(const std::string &strText, const std::string &strPart) {
    return strText.find(strPart) != std::string::npos;
}

}  // namespace files

#endif
