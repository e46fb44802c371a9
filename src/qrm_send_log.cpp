// Log entries for the server: the names of the levels, the message in every language of the
// appliance's interface, and the push.

#include <array>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <memory>

#include "fixed_text.h"
#include "guard.h"
#include "host_name.h"
#include "json.h"
#include "log.h"
#include "platform_handles.h"
#include "strings_file.h"
#include "zeloqrmclient.h"

// Filled when the library is loaded; the last entry ends a scan.
const QRMCLIENT_LOG_LEVEL gZELOQRMClientLogLevelTable[9] = {
    {0, "emerg"},  {1, "alert"}, {2, "crit"},  {3, "err"}, {4, "warning"},
    {5, "notice"}, {6, "info"},  {7, "debug"}, {-1, ""}};

namespace {

// --- Levels -------------------------------------------------------------------------------------

constexpr int kInfo = 6;

std::string LevelName(int level) {
    for (const QRMCLIENT_LOG_LEVEL *pEntry = gZELOQRMClientLogLevelTable; pEntry->level >= 0;
         ++pEntry) {
        if (pEntry->level == level) {
            return pEntry->name;
        }
    }
    return "info";
}

int LevelNumber(const std::string &name) {
    for (const QRMCLIENT_LOG_LEVEL *pEntry = gZELOQRMClientLogLevelTable; pEntry->level >= 0;
         ++pEntry) {
        if (pEntry->name == name) {
            return pEntry->level;
        }
    }
    return kInfo;
}

// --- References to interface texts --------------------------------------------------------------

constexpr int kReferenceLimit = 512;

// More references than people can write into a parameter, and an end for texts that name each other
// in a circle.
constexpr int kMaxReplacements = 1024;

struct FreeText {
    void operator()(char *sz) const { std::free(sz); }
};
using TextCopy = std::unique_ptr<char, FreeText>;

TextCopy Copy(const char *szText) {
    return TextCopy(szText == nullptr ? nullptr : strndup(szText, std::strlen(szText)));
}

// "{section:key}": everything between the marks counts, blanks too.
int FindPlaceholder(const char *szText, char *szSection, char *szKey, int limit) {
    if (szText == nullptr || szSection == nullptr || szKey == nullptr) {
        ZELO_LOG_NULL_ARGUMENT(szText == nullptr      ? "__null != szText"
                               : szSection == nullptr ? "__null != szSection"
                                                      : "__null != szKey");
        return -1;
    }
    // Most texts hold none, and then there is nothing to copy.
    const TextCopy copy = Copy(std::strchr(szText, '{'));
    char *szOpen = copy.get();
    char *szColon = szOpen == nullptr ? nullptr : std::strchr(szOpen, ':');
    char *szClose = szColon == nullptr ? nullptr : std::strchr(szColon, '}');
    if (szClose == nullptr || szColon - szOpen > limit || szClose - szColon > limit) {
        return -1;
    }
    *szColon = '\0';
    *szClose = '\0';
    CopyToFit(szSection, limit, szOpen + 1);
    CopyToFit(szKey, limit, szColon + 1);
    return 0;
}

// "_T(section,key)", trimmed of blanks and quotes.
int FindToken(const char *szText, char *szSection, char *szKey, char *szToken, int limit) {
    constexpr const char *kOpen = "_T(";
    constexpr const char *kTrimmed = " \t\r\n\"'";
    if (szSection == nullptr || szKey == nullptr || szToken == nullptr) {
        ZELO_LOG_NULL_ARGUMENT(szSection == nullptr ? "__null != szSection"
                               : szKey == nullptr   ? "__null != szKey"
                                                    : "__null != szToken");
        return -1;
    }
    const TextCopy copy = Copy(szText == nullptr ? nullptr : std::strstr(szText, kOpen));
    char *szOpen = copy.get();
    char *szClose = szOpen == nullptr ? nullptr : std::strchr(szOpen, ')');
    if (szClose == nullptr) {
        return -1;
    }
    if (szClose + 1 - szOpen >= limit) {
        ZELO_LOG("Char string length not enough");
        return -1;
    }
    szClose[1] = '\0';
    CopyToFit(szToken, limit, szOpen);

    *szClose = '\0';
    char *szRest = szOpen + std::strlen(kOpen);
    const char *szSectionPart = YLIBCStrTokIndex(&szRest, ",");
    if (szSectionPart == nullptr || YLIBCStrTrim(szSectionPart, szSection, kTrimmed) <= 0 ||
        szRest == nullptr) {
        return -1;
    }
    return YLIBCStrTrim(szRest, szKey, kTrimmed) > 0 ? 0 : -1;
}

using ReferredText = FixedText<1024>;

// One reference as it stands in a text, and what it names.
struct Reference {
    FixedText<kReferenceLimit> section;
    FixedText<kReferenceLimit> key;
    FixedText<2 * kReferenceLimit + 4> whole;
};

bool NextPlaceholder(const char *szText, Reference &reference) {
    if (CheckSectionKey_tpl1(szText, reference.section.Buffer(), reference.key.Buffer(),
                             kReferenceLimit) != 0) {
        return false;
    }
    return reference.whole.Join({"{", reference.section.sz(), ":", reference.key.sz(), "}"});
}

bool NextToken(const char *szText, Reference &reference) {
    return CheckSectionKey_tpl2(szText, reference.section.Buffer(), reference.key.Buffer(),
                                reference.whole.Buffer(), kReferenceLimit) == 0;
}

// Replaces references until none is found, or a replacement leaves the text as it was.
void Expand(bool (*pfnNext)(const char *, Reference &), const char *szStringsFile, char *szText,
            int cbText, Reference &reference) {
    for (int i = 0; i < kMaxReplacements; ++i) {
        if (!pfnNext(szText, reference)) {
            return;
        }
        ReferredText value;
        const bool blFound =
            YLIBCFileGetSectionValue(szStringsFile, reference.section.sz(), reference.key.sz(),
                                     value.Buffer(), ReferredText::Size()) >= 0;
        const TextCopy before = Copy(szText);
        static_cast<void>(YLIBCStrReplace(szText, reference.whole.sz(),
                                          blFound ? value.sz() : reference.key.sz(), 0, cbText));
        szText[cbText - 1] = '\0';
        if (before == nullptr || std::strcmp(before.get(), szText) == 0) {
            return;
        }
    }
}

void GetParam(YLIBSZLIST *pslParams, int index, const char *szStringsFile, char *szOut, int cbOut) {
    if (szOut == nullptr) {
        ZELO_LOG_NULL_ARGUMENT("__null != szOut");
        return;
    }
    if (cbOut <= 0) {
        return;
    }
    const char *szParam = YLIBCSzListGet(pslParams, index);
    CopyToFit(szOut, cbOut, szParam == nullptr ? "" : szParam);
    Reference reference;
    Expand(NextPlaceholder, szStringsFile, szOut, cbOut, reference);
    Expand(NextToken, szStringsFile, szOut, cbOut, reference);
}

// --- The message in every language --------------------------------------------------------------

constexpr const char *kLanguages =
    "chs,cht,csy,dan,enu,fre,ger,hun,ita,jpn,krn,nld,nor,plk,ptb,ptg,rus,spn,sve,trk";
constexpr const char *kTextsFolder = "/usr/zelo/zeloman/webman/texts/";
constexpr const char *kFallbackLanguage = "enu";
constexpr int kLanguageListSize = 512;

using MessageText = FixedText<4096>;
using PathText = FixedText<64>;

void SetStringsFile(const char *szLanguage, PathText &path) {
    path.Join({kTextsFolder, szLanguage, "/strings"});
}

bool ReadMessage(const char *szFile, const char *szSection, const char *szKey, MessageText &text) {
    return YLIBCFileGetSectionValue(szFile, szSection, szKey, text.Buffer(), MessageText::Size()) >=
           0;
}

void FillMarkers(YLIBSZLIST *pslParams, const char *szStringsFile, MessageText &text) {
    for (int i = 0; i < pslParams->nItem; ++i) {
        MessageText param;
        ParamGet(pslParams, i, szStringsFile, param.Buffer(), MessageText::Size());
        FixedText<8> marker;
        if (marker.Join({"{", std::to_string(i), "}"})) {
            static_cast<void>(
                YLIBCStrReplace(text.Buffer(), marker.sz(), param.sz(), 0, MessageText::Size()));
        }
    }
}

// False when the message is in neither the language's file nor the English one.
bool Render(const char *szLanguage, const char *szSection, const char *szKey, YLIBSZLIST *pslParams,
            MessageText &text) {
    PathText path;
    SetStringsFile(szLanguage, path);
    if (szSection == nullptr) {
        CopyToFit(text.Buffer(), MessageText::Size(), szKey);
    } else if (!ReadMessage(path.sz(), szSection, szKey, text)) {
        SetStringsFile(kFallbackLanguage, path);
        if (!ReadMessage(path.sz(), szSection, szKey, text)) {
            return false;
        }
    }
    if (pslParams != nullptr) {
        FillMarkers(pslParams, path.sz(), text);
    }
    return true;
}

int Convert(const char *szSection, const char *szKey, YLIBSZLIST *pslParams, Json::Value &out) {
    if (szKey == nullptr || !(out.isNull() || out.isObject())) {
        return -1;
    }
    ListHandle languages(YLIBCSzListAlloc(kLanguageListSize));
    if (languages.Get() == nullptr) {
        ZELO_LOG("%s:%d(%s) pslList calloc failure\n", ZELO_SOURCE_STEM, __LINE__, "ConvertLog");
        return -1;
    }
    if (YLIBCStrTok(kLanguages, ",", languages.Address()) == -1) {
        return -1;
    }
    for (int i = 0; i < languages.Get()->nItem; ++i) {
        const char *szLanguage = YLIBCSzListGet(languages.Get(), i);
        MessageText text;
        if (szLanguage == nullptr || !Render(szLanguage, szSection, szKey, pslParams, text)) {
            return -1;
        }
        out[szLanguage] = text.sz();
    }
    return 0;
}

// --- Push ---------------------------------------------------------------------------------------

constexpr const char *kApi = "ZELO.QRM.RPC.Log";
constexpr const char *kMethod = "push";
constexpr int kVersion = 1;
constexpr int kParamListSize = 1024;

int Push(int level, const char *szSection, const char *szKey, YLIBSZLIST *pslParams,
         const char *szExtraInfo) {
    if (szKey == nullptr) {
        ZELO_LOG_NULL_ARGUMENT("__null != szKey");
        return -1;
    }
    // One byte more than the platform is told, so that a text of the full size still ends.
    FixedText<ZELO_LNX_HOSTNAME_SIZE + 1> hostName;
    if (ZELOLnxGetHostname(hostName.Buffer()) < 0) {
        ZELO_LOG("get hostname failed ");
        return -1;
    }
    Json::Value request(Json::objectValue);
    request["happen_time"] = static_cast<Json::Int64>(std::time(nullptr));
    request["level"] = ZELOQRMClientLogLevelIntToStr(level);
    request["username"] = std::string("[") + hostName.sz() + "]";
    if (szExtraInfo != nullptr) {
        request["extra_info"] = szExtraInfo;
    }
    Json::Value log;
    if (ConvertLog(szSection, szKey, pslParams, log) < 0) {
        ZELO_LOG("conver %s:%s string failed. ", szSection == nullptr ? "(null)" : szSection,
                 szKey);
        return -1;
    }
    request["log"] = log;

    Json::Value reply;
    if (ZELOQRMClientSendWebapi(reply, kApi, kVersion, kMethod, request, false) < 0) {
        ZELO_LOG("push log webapi failed, jsReq=%s", json::ToLogText(request).c_str());
        return -1;
    }
    const Json::Value &success = json::Member(reply, "success");
    if (!success.isBool() || !success.asBool()) {
        ZELO_LOG("push log webapi response failed, jsReq=%s", json::ToLogText(request).c_str());
        return -1;
    }
    return 0;
}

int PushTexts(int level, const char *szSection, const char *szKey,
              const std::array<const char *, 3> &params) {
    ListHandle list(YLIBCSzListAlloc(kParamListSize));
    if (list.Get() == nullptr) {
        ZELO_LOG("Failed to allocate list");
        return -1;
    }
    for (const char *szParam : params) {
        if (szParam != nullptr) {
            static_cast<void>(YLIBCSzListPush(list.Address(), szParam));
        }
    }
    return ZELOQRMClientLog(level, szSection, szKey, list.Get(), nullptr);
}

}  // namespace

std::string ZELOQRMClientLogLevelIntToStr(int level) {
    return LevelName(level);
}

int ZELOQRMClientLogLevelStrToInt(const std::string &name) {
    return LevelNumber(name);
}

int CheckSectionKey_tpl1(const char *szText, char *szSection, char *szKey, int limit) {
    return ZELO_GUARD(-1, [&] { return FindPlaceholder(szText, szSection, szKey, limit); });
}

int CheckSectionKey_tpl2(const char *szText, char *szSection, char *szKey, char *szToken,
                         int limit) {
    return ZELO_GUARD(-1, [&] { return FindToken(szText, szSection, szKey, szToken, limit); });
}

void ParamGet(YLIBSZLIST *pslParams, int index, const char *szStringsFile, char *szOut, int cbOut) {
    ZELO_GUARD(0, [&] {
        GetParam(pslParams, index, szStringsFile, szOut, cbOut);
        return 0;
    });
}

int ConvertLog(const char *szSection, const char *szKey, YLIBSZLIST *pslParams, Json::Value &out) {
    return ZELO_GUARD(-1, [&] { return Convert(szSection, szKey, pslParams, out); });
}

int ZELOQRMClientLog(int level, const char *szSection, const char *szKey, YLIBSZLIST *pslParams,
                     const char *szExtraInfo) {
    return ZELO_GUARD(-1, [&] { return Push(level, szSection, szKey, pslParams, szExtraInfo); });
}

int ZELOQRMClientLog(int level, const char *szSection, const char *szKey, const char *szParam1,
                     const char *szParam2, const char *szParam3) {
    return ZELO_GUARD(-1, [&] {
        return PushTexts(level, szSection, szKey, {szParam1, szParam2, szParam3});
    });
}
