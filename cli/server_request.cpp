#include "server_request.h"

#include <limits>

#include "certificate_authorities.h"
#include "fixed_text.h"
#include "last_error.h"

namespace qrmctl {

void AddApiCall(CommandHandle command, ApiCall &call) {
    command.Text("API", call.strApi, "Web API, such as ZELO.QRM.RPC").Required();
    command.Text("METHOD", call.strMethod, "Its method").Required();
    command.Number("--version", call.version, "Version of the API")
        .ValueName("N")
        .Between(1, std::numeric_limits<int>::max())
        .ShowsDefault();
    command
        .Text("--params", call.strParams,
              "Parameters: a JSON object, or @FILE with one (@- for standard input)")
        .ValueName("JSON");
}

ZELO::Exchange LatestExchange() {
    return ZELO::LatestExchange != nullptr ? ZELO::LatestExchange() : ZELO::Exchange();
}

int CountAuthorities(std::string &strFlaw) {
    int count = 0;
    const auto countOne = [](void *pCount, const ZELO_CERT_AUTHORITY * /*pAuthority*/) {
        ++*static_cast<int *>(pCount);
    };
    if (ZELOCertAuthorityList(countOne, &count) < 0 && YLIBCErrGet() == YLIBC_ERR_FILE) {
        FixedText<4096> reason;
        if (ZELODiagnosisReason != nullptr) {
            ZELODiagnosisReason(reason.Buffer(), FixedText<4096>::Size());
        }
        strFlaw = reason.Empty() ? "a certificate authority of this appliance cannot be read"
                                 : reason.sz();
    }
    return count;
}

void WarnOfAuthority(Report &report) {
    std::string strFlaw;
    CountAuthorities(strFlaw);
    if (!strFlaw.empty()) {
        report.Warn(strFlaw);
    }
}

ExitCode FailExchange(ErrorId id, const std::string &strError, Report &report) {
    std::string strFlaw;
    CountAuthorities(strFlaw);
    return strFlaw.empty() ? report.Fail(id, strError)
                           : report.Fail(ErrorId::kCaUnreadable, strFlaw);
}

bool FindRefusal(Report &report, std::string &strAnswer) {
    constexpr int kStatusOk = 200;
    const ZELO::Exchange answer = LatestExchange();
    strAnswer.clear();
    if (answer.errorCode != 0) {
        const std::string strName = ServerErrorName(answer.errorCode);
        report.Member("server_code", answer.errorCode);
        report.Member("server_error", strName);
        strAnswer = "error code " + std::to_string(answer.errorCode) + " (" + strName + ')';
    }
    if (answer.httpStatus != 0 && answer.httpStatus != kStatusOk) {
        report.Member("http_status", answer.httpStatus);
        const std::string strStatus = "HTTP status " + std::to_string(answer.httpStatus);
        strAnswer += strAnswer.empty() ? strStatus + "; look at the server" : ", " + strStatus;
    }
    return !strAnswer.empty();
}

ExitCode FailRequest(ErrorId id, const std::string &strWhat, const std::string &strReasons,
                     Report &report) {
    std::string strAnswer;
    return FindRefusal(report, strAnswer)
               ? report.Fail(id, strWhat + ": it answered with " + strAnswer)
               : FailExchange(id, strWhat + strReasons, report);
}

}  // namespace qrmctl
