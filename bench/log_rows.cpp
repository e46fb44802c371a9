// A message in every language, against reading the same files and searching them for the same keys.

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#ifdef ZELO_BENCH_PARSERS
#include <glib.h>
#include <ini.h>
#endif

#include <array>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <memory>
#include <vector>

#include "bare_exchange.h"
#include "child_process.h"
#include "json.h"
#include "ratio_table.h"
#include "rows.h"
#include "text_containers.h"
#include "zeloqrmclient.h"

namespace bench {
namespace {

constexpr std::array<const char *, 20> kLanguages = {
    "chs", "cht", "csy", "dan", "enu", "fre", "ger", "hun", "ita", "jpn",
    "krn", "nld", "nor", "plk", "ptb", "ptg", "rus", "spn", "sve", "trk"};
constexpr const char *kTexts = "/usr/zelo/zeloman/webman/texts/";
constexpr int kSections = 600;
constexpr int kKeys = 20'000;
constexpr int kPairs = 15;

struct Name {
    std::string strSection;
    std::string strKey;
};

// The name of the text with this number; no two sections have a key in common.
Name NameOf(int number) {
    char szSection[32];
    char szKey[32];
    std::snprintf(szSection, sizeof(szSection), "section_%03d", number * kSections / kKeys);
    std::snprintf(szKey, sizeof(szKey), "key_%05d", number);
    return {szSection, szKey};
}

// The message, and what its two parameters refer to: spread over the file.
const std::array<Name, 3> kWanted = {NameOf(kKeys / 2), NameOf(kKeys / 4), NameOf(3 * kKeys / 4)};

std::string PathOf(const char *szLanguage) {
    return std::string(kTexts) + szLanguage + "/strings";
}

void WriteStrings(const char *szLanguage) {
    std::filesystem::create_directories(std::string(kTexts) + szLanguage);
    std::ofstream file(PathOf(szLanguage));
    std::string strSection;
    for (int i = 0; i < kKeys; ++i) {
        const Name name = NameOf(i);
        if (name.strSection != strSection) {
            strSection = name.strSection;
            file << '[' << strSection << "]\n";
        }
        file << name.strKey << "=\"" << szLanguage << " text of {0} and {1}, " << i << "\"\n";
    }
    file.close();
    Require(file.good(), "cannot write the strings files");
}

void WriteAllStrings() {
    static const bool blWritten = [] {
        for (const char *szLanguage : kLanguages) {
            WriteStrings(szLanguage);
        }
        return true;
    }();
    static_cast<void>(blWritten);
}

// --- Subject ------------------------------------------------------------------------------------

YLIBSZLIST *Params() {
    static YLIBSZLIST *const pParams = [] {
        YLIBSZLIST *pList = YLIBCSzListAlloc(512);
        const auto &[strSection, strKey] = kWanted[1];
        YLIBCSzListPush(&pList, ('{' + strSection + ':' + strKey + '}').c_str());
        YLIBCSzListPush(&pList,
                        ("_T(" + kWanted[2].strSection + ',' + kWanted[2].strKey + ')').c_str());
        return pList;
    }();
    return pParams;
}

bool Convert() {
    Json::Value texts;
    return ConvertLog(kWanted[0].strSection.c_str(), kWanted[0].strKey.c_str(), Params(), texts) ==
               0 &&
           texts.size() == kLanguages.size();
}

// --- Peers --------------------------------------------------------------------------------------

bool ReadWhole(const std::string &strPath, std::vector<char> &buffer) {
    const int fd = open(strPath.c_str(), O_RDONLY | O_CLOEXEC);
    struct stat status = {};
    if (fd < 0 || fstat(fd, &status) != 0) {
        return false;
    }
    buffer.resize(static_cast<std::size_t>(status.st_size));
    const ssize_t cb = read(fd, buffer.data(), buffer.size());
    close(fd);
    return cb == status.st_size;
}

// The buffer serves for all files, and for the next turn.
bool ReadAndSearch() {
    static std::vector<char> buffer;
    for (const char *szLanguage : kLanguages) {
        if (!ReadWhole(PathOf(szLanguage), buffer)) {
            return false;
        }
        for (const Name &name : kWanted) {
            if (memmem(buffer.data(), buffer.size(), name.strKey.data(), name.strKey.size()) ==
                nullptr) {
                return false;
            }
        }
    }
    return true;
}

#ifdef ZELO_BENCH_PARSERS
bool LookUpByKeyFile() {
    for (const char *szLanguage : kLanguages) {
        const std::unique_ptr<GKeyFile, void (*)(GKeyFile *)> pFile(g_key_file_new(),
                                                                    g_key_file_free);
        if (g_key_file_load_from_file(pFile.get(), PathOf(szLanguage).c_str(), G_KEY_FILE_NONE,
                                      nullptr) == 0) {
            return false;
        }
        for (const Name &name : kWanted) {
            const std::unique_ptr<char, void (*)(void *)> szValue(
                g_key_file_get_value(pFile.get(), name.strSection.c_str(), name.strKey.c_str(),
                                     nullptr),
                g_free);
            if (szValue == nullptr) {
                return false;
            }
        }
    }
    return true;
}

int TakeWanted(void *pContext, const char *szSection, const char *szKey, const char *szValue) {
    for (const Name &name : kWanted) {
        if (name.strKey == szKey && name.strSection == szSection) {
            static_cast<std::vector<std::string> *>(pContext)->emplace_back(szValue);
        }
    }
    return 1;
}

bool LookUpByInih() {
    std::vector<std::string> values;
    for (const char *szLanguage : kLanguages) {
        if (ini_parse(PathOf(szLanguage).c_str(), TakeWanted, &values) != 0) {
            return false;
        }
    }
    return values.size() == kWanted.size() * kLanguages.size();
}
#endif

// --- Rows ---------------------------------------------------------------------------------------

// Both in child processes, each of which calls for the first time.
Pair FirstPair(bool (*pfnPeer)()) {
    WriteAllStrings();
    const auto first = [](bool (*pfnOperation)()) {
        return [=] { return InChild([=] { return Seconds(pfnOperation); }); };
    };
    return {{nullptr, nullptr, first(Convert)}, {nullptr, nullptr, first(pfnPeer)}};
}

Pair LaterPair() {
    WriteAllStrings();
    return {{Convert, nullptr}, {ReadAndSearch, nullptr}};
}

// The peer sends the body that the library sends, ready made.
Pair PushPair() {
    WriteAllStrings();
    const auto pServer = std::make_shared<ServerProcess>();
    pServer->Join("https");
    Json::Value call;
    call["api"] = "ZELO.QRM.RPC.Log";
    call["method"] = "push";
    call["version"] = 1;
    Json::Value &params = call["params"];
    params["happen_time"] = 1;
    params["level"] = "info";
    params["username"] = "[bench]";
    Require(ConvertLog(kWanted[0].strSection.c_str(), kWanted[0].strKey.c_str(), Params(),
                       params["log"]) == 0,
            "cannot convert the message");
    std::string strBody;
    Require(json::ToString(call, strBody), "cannot write the body");
    const auto pBare = std::make_shared<BareExchange>();
    pBare->Post(pServer->Url("https", "/qrm/log"), strBody, kServerToken);
    const auto subject = [pServer] {
        return ZELOQRMClientLog(0, kWanted[0].strSection.c_str(), kWanted[0].strKey.c_str(),
                                Params(), nullptr) == 0;
    };
    const auto peer = [pBare] {
        Json::Value reply;
        return pBare->Perform(reply);
    };
    return {{subject, nullptr}, {peer, nullptr}};
}

void AddFirst(const char *szPeer, double goal, bool (*pfnPeer)()) {
    AddRow({std::string("ConvertLog, first in a process, ") + szPeer, szPeer, goal,
            [=] { return FirstPair(pfnPeer); }, "", kPairs});
}

}  // namespace

void AddLogRows() {
    AddFirst("read and memmem", 1.3, ReadAndSearch);
#ifdef ZELO_BENCH_PARSERS
    AddFirst("GKeyFile", 1.0 / 20, LookUpByKeyFile);
    AddFirst("inih", 1.0 / 10, LookUpByInih);
#endif
    AddRow({"ConvertLog, later", "read and memmem", 1.0 / 20, LaterPair, ""});
}

void AddLogPushRow() {
    AddRow({"ZELOQRMClientLog, warm", "bare libcurl exchange", 3.0, PushPair, ""});
}

}  // namespace bench
