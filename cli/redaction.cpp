#include "redaction.h"

#include <openssl/evp.h>

#include <algorithm>
#include <array>
#include <cctype>
#include <string_view>

#include "last_error.h"
#include "platform_handles.h"

namespace qrmctl {
namespace {

constexpr std::size_t kMinSecret = 4;
constexpr std::size_t kMaxToken = std::size_t{64} * 1024;

// --- By value -----------------------------------------------------------------------------------

std::string Hex(const std::string &strText, const char *szDigits) {
    std::string strHex;
    for (char c : strText) {
        const auto byte = static_cast<unsigned char>(c);
        strHex += {szDigits[byte >> 4U], szDigits[byte & 15U]};
    }
    return strHex;
}

// A run of backslashes as one: those that follow are passed over in the text.
std::string Collapsed(const std::string &strText) {
    std::string strShort;
    for (char c : strText) {
        if (c != '\\' || strShort.empty() || strShort.back() != '\\') {
            strShort += c;
        }
    }
    return strShort;
}

std::string Base64(const std::string &strText) {
    std::string strCode(4 * ((strText.size() + 2) / 3) + 1, '\0');
    const int cb = EVP_EncodeBlock(reinterpret_cast<unsigned char *>(strCode.data()),
                                   reinterpret_cast<const unsigned char *>(strText.data()),
                                   static_cast<int>(strText.size()));
    strCode.resize(static_cast<std::size_t>(cb));
    return strCode;
}

// The part of the secret's Base64 code that does not depend on its neighbours, when so many bytes
// stand before it in its group of three.
std::string Base64Core(const std::string &strSecret, std::size_t before) {
    constexpr std::array<std::size_t, 3> kBefore = {0, 2, 3};
    constexpr std::array<std::size_t, 3> kBehind = {0, 3, 2};
    const std::string strCode = Base64(std::string(before, '\0') + strSecret);
    const std::size_t cut = kBefore[before] + kBehind[(before + strSecret.size()) % 3];
    return strCode.size() <= cut ? std::string()
                                 : strCode.substr(kBefore[before], strCode.size() - cut);
}

bool IsBase64(char c) {
    return std::isalnum(static_cast<unsigned char>(c)) != 0 ||
           std::string_view("+/-_=").find(c) != std::string_view::npos;
}

// --- The store ----------------------------------------------------------------------------------

thread_local std::vector<long> *t_pIds = nullptr;

// A filter that keeps nothing: it takes the ids down.
int TakeId(const ZELO_CRED *pCred, const char * /*szValue*/) {
    long id = -1;
    if (ZELOCredItemGetID(&id, pCred) == 0) {
        t_pIds->push_back(id);
    }
    return 0;
}

// False when there is a token that cannot be read whole.
bool AddToken(int (*pfnGet)(char *, int, const ZELO_CRED_SESS *), const ZELO_CRED_SESS *pSess,
              Redaction &redaction) {
    std::vector<char> text(kMaxToken);
    if (pfnGet(text.data(), static_cast<int>(text.size()), pSess) != 0) {
        return YLIBCErrGet() == YLIBC_ERR_NOT_FOUND;
    }
    const std::string strToken = text.data();
    redaction.Add(strToken);
    return strToken.size() + 1 < kMaxToken;  // else it may be cut
}

}  // namespace

void Redaction::Add(const std::string &strSecret) {
    if (strSecret.size() < kMinSecret) {
        return;
    }
    m_secrets.Add(Collapsed(strSecret));
    m_secrets.Add(Hex(strSecret, "0123456789abcdef"));
    m_secrets.Add(Hex(strSecret, "0123456789ABCDEF"));
    for (std::size_t before = 0; before < 3; ++before) {
        std::string strCore = Base64Core(strSecret, before);
        if (strCore.size() < kMinSecret) {
            continue;
        }
        m_base64.Add(strCore);
        std::replace(strCore.begin(), strCore.end(), '+', '-');
        std::replace(strCore.begin(), strCore.end(), '/', '_');
        m_base64.Add(strCore);
    }
}

bool Redaction::AddStored() {
    std::vector<long> ids;
    t_pIds = &ids;
    ZELO_CRED *pList = nullptr;
    const int count = ZELOCredListGet(&pList, TakeId, "");
    t_pIds = nullptr;
    const CredListHandle list(pList);
    const CredSessHandle pSess(ZELOCredSessAlloc());
    bool blKnown = count >= 0 && pSess != nullptr;
    for (std::size_t i = 0; blKnown && i < ids.size(); ++i) {
        if (ZELOCredSessLoad(ids[i], pSess.get()) != 0) {
            blKnown = YLIBCErrGet() == YLIBC_ERR_NOT_FOUND;
            continue;
        }
        blKnown = AddToken(ZELOCredSessItemGetAccessToken, pSess.get(), *this) &&
                  AddToken(ZELOCredSessItemGetCsrfToken, pSess.get(), *this);
    }
    return blKnown;
}

std::string Redaction::Redact(const std::string &strText) const {
    std::string strSafe;
    for (std::size_t at = 0; at < strText.size();) {
        const std::size_t cb = m_secrets.LengthAt(strText, at);
        const std::size_t cbCode = m_base64.LengthAt(strText, at);
        if (cb == 0 && cbCode == 0) {
            strSafe += strText[at++];
            continue;
        }
        at += std::max(cb, cbCode);
        // The ends of a code hold some bits of the secret too.
        while (cbCode > 0 && at < strText.size() && IsBase64(strText[at])) {
            ++at;
        }
        while (cbCode > 0 && !strSafe.empty() && IsBase64(strSafe.back())) {
            strSafe.pop_back();
        }
        strSafe += kRedacted;
    }
    return strSafe;
}

}  // namespace qrmctl
