#include "lost_reply.h"

#include "json_text.h"
#include "probe.h"

namespace qrmctl {
namespace {

constexpr const char *kDiscoveryPath = "/qrm/discover";
constexpr long kLimit_ms = 5000;
constexpr long kStatusOk = 200;

Probe Ask(const JoinedServer &server, const std::string &strApi) {
    Way way;
    way.strProtocol = AsText(server.protocol);
    way.strHost = AsText(server.host);
    json_text::ReadInt(server.port, way.port);
    return RunProbe(way, Extent::kExchange, kDiscoveryPath, "api=" + strApi, kLimit_ms);
}

}  // namespace

ExitCode FailRefused(const Json::Value &reply, const std::string &strWhat, Report &report) {
    const int code = json_text::ErrorCode(reply);
    const std::string strName = ServerErrorName(code);
    report.Member("server_code", code);
    report.Member("server_error", strName);
    return report.Fail(ErrorId::kRefused, "the server refused " + strWhat + " with error code " +
                                              std::to_string(code) + " (" + strName + ')');
}

ExitCode FailRequest(ErrorId id, const std::string &strError, const JoinedServer &server,
                     const std::string &strApi, Report &report) {
    Report::Stage("asking " + server.Address() + " why there was no reply");
    const Probe probe = Ask(server, strApi);
    if (probe.status == 0) {
        return report.FailExchange(id, strError);
    }
    if (probe.status != kStatusOk) {
        report.Member("http_status", static_cast<Json::Int64>(probe.status));
        return report.FailExchange(id, "the server at " + server.Address() +
                                           " answered with HTTP status " +
                                           std::to_string(probe.status) +
                                           ": look at the server; 'qrmctl doctor' shows more");
    }
    Json::Value reply;
    if (json_text::FromString(probe.strBody, reply) && json_text::ErrorCode(reply) != 0) {
        return FailRefused(reply, "to serve the API '" + strApi + '\'', report);
    }
    return report.FailExchange(id, strError);
}

}  // namespace qrmctl
