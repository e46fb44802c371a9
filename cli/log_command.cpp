// qrmctl log: pushes a log entry to the joined server, or shows what it would say.

#include <algorithm>
#include <memory>
#include <vector>

#include "commands.h"
#include "joined_server.h"
#include "json.h"
#include "platform_handles.h"
#include "server_request.h"
#include "zeloqrmclient.h"

namespace qrmctl {
namespace {

struct Options {
    std::string strLevel;
    std::string strSection;
    std::string strKey;
    std::vector<std::string> params;
    std::string strExtraInfo;
    bool blExtraInfo = false;
    bool blRender = false;
};

// An option for each parameter: an option with a list of values would take "[a,b]" for two.
void AddParams(CommandHandle command, Options &options) {
    constexpr int kMostParams = 32;
    for (int i = 0; i < kMostParams; ++i) {
        const auto add = [&options](const std::string &strParam) {
            options.params.push_back(strParam);
        };
        const OptionHandle param = command
                                       .Text("PARAM" + (i == 0 ? "" : std::to_string(i)), add,
                                             "What fills its markers {0}, {1}, ...")
                                       .MayBeEmpty();
        if (i > 0) {
            param.Hidden();
        }
    }
}

bool ReadLevel(const std::string &strLevel, int &level) {
    for (const QRMCLIENT_LOG_LEVEL *pEntry = gZELOQRMClientLogLevelTable; pEntry->level >= 0;
         ++pEntry) {
        if (strLevel == pEntry->name || strLevel == std::to_string(pEntry->level)) {
            level = pEntry->level;
            return true;
        }
    }
    return false;
}

bool Convert(const Options &options, YLIBSZLIST *pslParams, Json::Value &texts) {
    Report::Stage("reading the strings files");
    const char *szSection = options.strSection == "-" ? nullptr : options.strSection.c_str();
    return ConvertLog(szSection, options.strKey.c_str(), pslParams, texts) == 0;
}

// The library cuts a text to so many bytes, and leaves a marker whose parameter does not fit.
constexpr std::size_t kMaxText = 4095;

void WarnOfCut(const std::string &strWhat, const std::string &strText, Report &report) {
    if (strText.size() > kMaxText) {
        report.Warn(strWhat + " has " + std::to_string(strText.size()) +
                    " bytes: it is cut to at most " + std::to_string(kMaxText));
    }
}

// How long the text would be with the value in place of the markers that are still in it.
std::size_t SizeFilled(const std::string &strText, const std::string &strMarker,
                       const std::string &strValue) {
    std::size_t cb = strText.size();
    for (std::size_t at = 0; (at = strText.find(strMarker, at)) != std::string::npos;
         at += strMarker.size()) {
        cb = cb - strMarker.size() + strValue.size();
    }
    return cb;
}

void WarnOfLeftMarker(const std::string &strMarker, const Json::Value &texts,
                      const Json::Value &values, Report &report) {
    std::size_t cb = 0;
    const std::vector<std::string> languages = texts.getMemberNames();
    const auto language =
        std::find_if(languages.begin(), languages.end(), [&](const std::string &strLanguage) {
            cb = SizeFilled(texts[strLanguage].asString(), strMarker,
                            json::Member(values, strLanguage.c_str()).asString());
            return cb > kMaxText;
        });
    if (language != languages.end()) {
        report.Warn("with the parameter of " + strMarker + " the message has " +
                    std::to_string(cb) + " bytes in '" + *language + "', more than " +
                    std::to_string(kMaxText) + ": the marker is left in it");
    }
}

void WarnOfLosses(const Options &options, const Json::Value &texts, YLIBSZLIST *pslParams,
                  Report &report) {
    if (options.strSection == "-") {
        WarnOfCut("the message", options.strKey, report);
    }
    for (std::size_t i = 0; i < options.params.size(); ++i) {
        const std::string strMarker = '{' + std::to_string(i) + '}';
        WarnOfCut("the parameter of " + strMarker, options.params[i], report);
        Json::Value values;  // the parameter alone, as each language has it
        static_cast<void>(ConvertLog(nullptr, strMarker.c_str(), pslParams, values));
        WarnOfLeftMarker(strMarker, texts, values, report);
    }
}

ExitCode Render(const Json::Value &texts, Report &report) {
    if (report.IsJson()) {
        report.Fact("log", texts);
    } else {
        for (const std::string &strLanguage : texts.getMemberNames()) {
            report.Fact(strLanguage, texts[strLanguage]);
        }
    }
    return report.Done();
}

ExitCode Push(const Options &options, Report &report) {
    int level = 0;
    if (!ReadLevel(options.strLevel, level)) {
        return report.Fail(
            ErrorId::kNoSuchLevel,
            "there is no level '" + options.strLevel +
                "': give 0 to 7, or emerg, alert, crit, err, warning, notice, info or "
                "debug");
    }
    constexpr int kListSize = 1024;
    ListHandle params(YLIBCSzListAlloc(kListSize));
    for (const std::string &strParam : options.params) {
        if (YLIBCSzListPush(params.Address(), strParam.c_str()) < 0) {
            return report.Fail(ErrorId::kOutOfMemory, "out of memory");
        }
    }
    ExitCode code = kFailed;
    std::optional<JoinedServer> server;
    if (!options.blRender && !(server = RequireJoinedServer(report, code))) {
        return code;
    }
    Json::Value texts;
    if (!Convert(options, params.Get(), texts)) {
        return report.Fail(ErrorId::kNoSuchText, "no strings file has the key '" + options.strKey +
                                                     "' in the section '" + options.strSection +
                                                     "', nothing was sent");
    }
    WarnOfLosses(options, texts, params.Get(), report);
    if (options.blRender) {
        return Render(texts, report);
    }
    Report::Stage("pushing the log entry to " + server->Address());
    Report::Remedy("the server may have the entry: look there before this is run again");
    const char *szSection = options.strSection == "-" ? nullptr : options.strSection.c_str();
    if (ZELOQRMClientLog(level, szSection, options.strKey.c_str(), params.Get(),
                         options.blExtraInfo ? options.strExtraInfo.c_str() : nullptr) != 0) {
        return FailRequest(ErrorId::kLogNotConfirmed, "the server has not confirmed the log entry",
                           ": run 'qrmctl doctor'; -v shows the reason", report);
    }
    report.Say("The server has the log entry.");
    return report.Done();
}

}  // namespace

void AddLog(CommandHandle program, Action &action) {
    const CommandHandle command = program.Add("log", "Push a log entry to the joined server");
    const auto pOptions = std::make_shared<Options>();
    command.Text("LEVEL", pOptions->strLevel, "0 to 7, or a name")
        .Suggests("LEVEL", {"emerg", "alert", "crit", "err", "warning", "notice", "info", "debug"})
        .Required();
    command
        .Text("SECTION", pOptions->strSection,
              "Section of the strings files; - when KEY is the message itself")
        .Required();
    command.Text("KEY", pOptions->strKey, "The message").Required();
    AddParams(command, *pOptions);
    const OptionHandle extraInfo =
        command.Text("--extra-info", pOptions->strExtraInfo, "Text sent beside the message")
            .ValueName("TEXT")
            .MayBeEmpty();
    command.Flag("--render", pOptions->blRender,
                 "Show the message in every language and send nothing");
    command.RunsWhenChosen([pOptions, extraInfo, &action] {
        pOptions->blExtraInfo = extraInfo.IsGiven();
        action = [pOptions](Report &report) { return Push(*pOptions, report); };
    });
}

}  // namespace qrmctl
