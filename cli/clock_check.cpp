#include "clock_check.h"

#include <cstdlib>

namespace qrmctl {
namespace {

constexpr long kMinute_s = 60;
constexpr long kHour_s = 60 * kMinute_s;
constexpr long kDay_s = 24 * kHour_s;
constexpr long kYear_s = 31'556'952;

// A clock that differs by less does no harm.
constexpr long kMaxSkew_s = kMinute_s;

// The moment of a Date header, in any of the three forms that HTTP has; -1 when it is none.
std::time_t ReadDate(const std::string &strDate) {
    for (const char *szForm :
         {"%a, %d %b %Y %H:%M:%S GMT", "%A, %d-%b-%y %H:%M:%S GMT", "%a %b %d %H:%M:%S %Y"}) {
        std::tm utc = {};
        const char *szRest = strptime(strDate.c_str(), szForm, &utc);
        if (szRest != nullptr && *szRest == '\0') {
            return timegm(&utc);
        }
    }
    return -1;
}

// Such as "about 4 years", in the largest unit of which there are two.
std::string InWords(long time_s) {
    constexpr struct {
        long length_s;
        const char *szName;
    } kUnits[] = {{kYear_s, " years"}, {kDay_s, " days"}, {kHour_s, " hours"}};
    for (const auto &unit : kUnits) {
        if (time_s >= 2 * unit.length_s) {
            return "about " + std::to_string((time_s + unit.length_s / 2) / unit.length_s) +
                   unit.szName;
        }
    }
    return "about " + std::to_string((time_s + kMinute_s / 2) / kMinute_s) + " minutes";
}

// Such as "about 4 years behind (126230400 s)".
std::string Skew(long skew_s) {
    const long time_s = std::labs(skew_s);
    const char *const szWay = skew_s < 0 ? " behind" : " ahead";
    const std::string strExact = std::to_string(time_s) + " s";
    return time_s < 2 * kMinute_s ? strExact + szWay
                                  : InWords(time_s) + szWay + " (" + strExact + ')';
}

bool IsWithin(std::time_t time, std::time_t notBefore, std::time_t notAfter) {
    return time >= notBefore && time <= notAfter;
}

}  // namespace

std::string TimeText(std::time_t time) {
    std::tm utc = {};
    gmtime_r(&time, &utc);
    char sz[32] = {};
    std::strftime(sz, sizeof(sz), "%Y-%m-%dT%H:%M:%SZ", &utc);
    return sz;
}

std::string Validity(std::time_t notBefore, std::time_t notAfter) {
    return "valid from " + TimeText(notBefore) + " to " + TimeText(notAfter);
}

void CheckClock(const ZELO::Exchange &met, CheckList &checks) {
    const std::time_t serverTime = ReadDate(met.strDate);
    if (serverTime < 0) {
        checks.Skip("clock", "the server tells no time", "check this appliance's clock by hand");
        return;
    }
    const long skew_s = serverTime - met.ownTime;
    const std::string strSeen = "the server's clock is " + Skew(skew_s);
    if (std::labs(skew_s) <= kMaxSkew_s) {
        checks.Ok("clock", 0, strSeen);
    } else {
        checks.Warn("clock", 0, strSeen,
                    "set the clock that is wrong, this appliance's says " + TimeText(met.ownTime));
    }
}

void CheckInvalidNow(const ZELO::ServerCertificate &certificate, const std::string &strWhich,
                     const ZELO::Exchange &hint, CheckList &checks) {
    const std::time_t serverTime = ReadDate(hint.strDate);
    const std::time_t ownTime = std::time(nullptr);
    const long skew_s = serverTime - ownTime;
    const long took_ms = std::max(0L, hint.whole_ms);
    const std::string strOwn = "this appliance's clock says " + TimeText(ownTime);
    const std::string strBoth =
        strOwn + ", that of the server, which is not verified, is " + Skew(skew_s);
    std::string strInvalid = certificate.strVerifyWords;
    if (certificate.verifyDepth > 0) {
        strInvalid += ", that of an authority, " +
                      Validity(certificate.verifyNotBefore, certificate.verifyNotAfter);
    }
    strInvalid += ": " + strWhich;

    // The authority's certificate is as invalid by a wrong clock as the server's own.
    if (serverTime >= 0 &&
        IsWithin(serverTime, certificate.verifyNotBefore, certificate.verifyNotAfter) &&
        IsWithin(serverTime, certificate.notBefore, certificate.notAfter)) {
        checks.Fail("clock", took_ms,
                    strBoth +
                        ": the certificate is valid by the server's clock, this appliance's clock "
                        "is the suspect",
                    "set this appliance's clock");
        checks.Fail("certificate", 0, "by this appliance's clock, " + strInvalid,
                    "see 'clock': set this appliance's clock");
        return;
    }
    checks.Fail("certificate", 0, strInvalid,
                "see 'clock': set this appliance's clock if it is wrong, else have the "
                "certificate renewed");
    if (serverTime < 0) {
        checks.Warn("clock", took_ms, strOwn + ", the server tells no time",
                    "check this appliance's clock first");
    } else if (std::labs(skew_s) <= kMaxSkew_s) {
        checks.Ok("clock", took_ms, strBoth + ": the clock is not the suspect");
    } else {
        checks.Warn("clock", took_ms,
                    strBoth + ": the clocks differ, and the certificate is valid by neither",
                    "set both clocks, then look at the certificate again");
    }
}

}  // namespace qrmctl
