// Files as tests see and change them.

#ifndef ZELO_TESTS_FILES_H
#define ZELO_TESTS_FILES_H

#include <sys/stat.h>

#include <cstdio>
#include <fstream>
#include <iterator>
#include <string>
#include <vector>

namespace files {

inline std::string FileText(const std::string &strPath) {
    std::ifstream file(strPath, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()};
}

// In place: a file that is there stays the same one.
inline void WriteFile(const std::string &strPath, const std::string &strText) {
    std::ofstream(strPath, std::ios::binary) << strText;
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

inline bool Holds(const std::string &strText, const std::string &strPart) {
    return strText.find(strPart) != std::string::npos;
}

}  // namespace files

#endif
