// QUIB::WebCGI, the QuibCgi record and the web session timeout.
#include <errno.h>
#include <stdlib.h>
#include <string.h>
#include <unistd.h>

#include <string>

#include "api_guard.h"
#include "cgi_request.h"
#include "quib_cgi.h"
#include "quib_paths.h"
#include "text_util.h"
#include "vlibc_file.h"

using norvo::platform::Guarded;
using norvo::platform::IsToken;
using norvo::platform::NameValues;

namespace {

const char *EnvOr(const char *name, const char *fallback) {
    const char *value = getenv(name);
    return value != nullptr ? value : fallback;
}

const std::string *FirstOf(const NameValues &pairs, const char *name) {
    if (name == nullptr) {
        return nullptr;
    }
    for (const auto &[key, value] : pairs) {
        if (key == name) {
            return &value;
        }
    }
    return nullptr;
}

// The first cookie called name, when its value is a token; a later one never stands in for a
// refused first one (browsers send the most specific cookie first).
const std::string *TokenCookie(const NameValues &cookies, const char *name) {
    const std::string *value = FirstOf(cookies, name);
    return value != nullptr && IsToken(*value) ? value : nullptr;
}

bool IsVisibleAscii(const char *text, bool semicolonAllowed) {
    for (const char *p = text; *p != '\0'; ++p) {
        if (*p < ' ' || *p >= 0x7F || (*p == ';' && !semicolonAllowed)) {
            return false;
        }
    }
    return true;
}

// CONTENT_LENGTH: decimal digits only. The length, or -1 when malformed, -2 when too long.
long BodyLength(const char *text) {
    if (text == nullptr || *text == '\0') {
        return 0;
    }
    long length = 0;
    for (const char *p = text; *p != '\0'; ++p) {
        if (*p < '0' || *p > '9') {
            return -1;
        }
        length = length * 10 + (*p - '0');
        if (length > QUIB_CGI_MAX_BODY) {
            return -2;
        }
    }
    return length;
}

// Reads exactly length bytes. 0, QUIB_ERR_BAD_PARAMETER when the body ends short, or a code.
int ReadBody(int fd, long length, std::string *body) {
    body->resize(static_cast<size_t>(length));
    size_t done = 0;
    while (done < body->size()) {
        const ssize_t got = read(fd, &(*body)[done], body->size() - done);
        if (got < 0 && errno == EINTR) {
            continue;
        }
        if (got < 0) {
            return VLIBCErrFromErrno(errno);
        }
        if (got == 0) {
            return QUIB_ERR_BAD_PARAMETER;
        }
        done += static_cast<size_t>(got);
    }
    return QUIB_ERR_NONE;
}

int WriteAll(int fd, const std::string &text) {
    size_t done = 0;
    while (done < text.size()) {
        const ssize_t put = write(fd, text.data() + done, text.size() - done);
        if (put < 0 && errno == EINTR) {
            continue;
        }
        if (put < 0) {
            return VLIBCErrFromErrno(errno);
        }
        done += static_cast<size_t>(put);
    }
    return QUIB_ERR_NONE;
}

bool IsFormBody(const char *contentType) {
    // "application/x-www-form-urlencoded", perhaps with parameters ("; charset=UTF-8").
    constexpr char kForm[] = "application/x-www-form-urlencoded";
    const size_t n = sizeof kForm - 1;
    return contentType != nullptr && strncasecmp(contentType, kForm, n) == 0 &&
           (contentType[n] == '\0' || contentType[n] == ';' || contentType[n] == ' ');
}

// The request's parameters: 0 and *params, or a platform code.
int ReadParameters(int bodyFd, NameValues *params) {
    if (!norvo::platform::ParseUrlEncoded(EnvOr("QUERY_STRING", ""), params)) {
        return QUIB_ERR_BAD_PARAMETER;
    }
    if (strcmp(EnvOr("REQUEST_METHOD", ""), "POST") != 0 || !IsFormBody(getenv("CONTENT_TYPE"))) {
        return QUIB_ERR_NONE;
    }
    const long length = BodyLength(getenv("CONTENT_LENGTH"));
    if (length < 0) {
        return length == -2 ? QUIB_ERR_NAME_TOO_LONG : QUIB_ERR_BAD_PARAMETER;
    }
    std::string body;
    if (const int code = ReadBody(bodyFd, length, &body)) {
        return code;
    }
    NameValues posted;
    if (!norvo::platform::ParseUrlEncoded(body, &posted)) {
        return QUIB_ERR_BAD_PARAMETER;
    }
    params->insert(params->end(), posted.begin(), posted.end());
    return QUIB_ERR_NONE;
}

struct CgiCookies {
    NameValues cookies;
};

}  // namespace

namespace QUIB {

struct WebCGI::Impl {
    int initResult = -1;  // until Init has read the whole request
    int outFd = 1;
    NameValues params;
    NameValues cookies;
    std::string setCookies;
    bool headerWritten = false;
};

// The state is made by Init, so that the constructor can't throw.
WebCGI::WebCGI() = default;
WebCGI::~WebCGI() = default;

int WebCGI::Init(int bodyFd, int outFd) {
    return Guarded(-1, [&] {
        if (impl_ != nullptr) {
            return impl_->initResult;
        }
        impl_ = std::make_unique<Impl>();
        Impl &impl = *impl_;
        impl.outFd = outFd;
        norvo::platform::ScopeExit forget([&impl] { impl.params.clear(), impl.cookies.clear(); });
        int code = ReadParameters(bodyFd, &impl.params);
        if (code == QUIB_ERR_NONE) {
            impl.cookies = norvo::platform::ParseCookies(EnvOr("HTTP_COOKIE", ""));
            forget.Dismiss();
        } else {
            QUIB_SET_ERR(code);
        }
        impl.initResult = code == QUIB_ERR_NONE ? 0 : -1;
        return impl.initResult;
    });
}

const char *WebCGI::In(const char *name) const {
    const std::string *value = impl_ != nullptr ? FirstOf(impl_->params, name) : nullptr;
    return value != nullptr ? value->c_str() : nullptr;
}

const char *WebCGI::GetCookie(const char *name) const {
    const std::string *value = impl_ != nullptr ? TokenCookie(impl_->cookies, name) : nullptr;
    return value != nullptr ? value->c_str() : nullptr;
}

int WebCGI::AddCookieToHeader(const char *path, const char *name, const char *value) {
    return Guarded(-1, [&] {
        if (impl_ == nullptr || impl_->headerWritten || path == nullptr || name == nullptr ||
            value == nullptr || path[0] != '/' || !IsVisibleAscii(path, false) || !IsToken(name) ||
            !IsToken(value)) {
            QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
            return -1;
        }
        std::string line =
            std::string("Set-Cookie: ") + name + "=" + value + "; Path=" + path + "; HttpOnly; SameSite=Lax";
        if (strcasecmp(EnvOr("HTTPS", ""), "on") == 0) {
            line += "; Secure";
        }
        impl_->setCookies += line + "\r\n";
        return 0;
    });
}

int WebCGI::WriteHeader(const char *contentType) {
    return Guarded(-1, [&] {
        if (impl_ != nullptr && impl_->headerWritten) {
            return 0;
        }
        if (impl_ == nullptr || contentType == nullptr || !IsVisibleAscii(contentType, true)) {
            QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
            return -1;
        }
        impl_->headerWritten = true;
        const std::string header =
            std::string("Content-Type: ") + contentType + "\r\n" + impl_->setCookies + "\r\n";
        if (const int code = WriteAll(impl_->outFd, header)) {
            QUIB_SET_ERR(code);
            return -1;
        }
        return 0;
    });
}

}  // namespace QUIB

QuibCgi *QuibCgiAlloc(const char *recordFile, const char *lockName) {
    return Guarded<QuibCgi *>(nullptr, [&]() -> QuibCgi * {
        if (recordFile == nullptr || lockName == nullptr) {
            QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
            return nullptr;
        }
        if (strlen(recordFile) >= sizeof(QuibCgi::szRecordFile) ||
            strlen(lockName) >= sizeof(QuibCgi::szLockName)) {
            QUIB_SET_ERR(QUIB_ERR_NAME_TOO_LONG);
            return nullptr;
        }
        auto cookies = std::make_unique<CgiCookies>();
        cookies->cookies = norvo::platform::ParseCookies(EnvOr("HTTP_COOKIE", ""));
        auto cgi = std::make_unique<QuibCgi>();
        memset(cgi.get(), 0, sizeof(QuibCgi));
        strcpy(cgi->szRecordFile, recordFile);
        strcpy(cgi->szLockName, lockName);
        cgi->pPrivate = cookies.release();
        return cgi.release();
    });
}

void QuibCgiFree(QuibCgi *cgi) {
    if (cgi != nullptr) {
        delete static_cast<CgiCookies *>(cgi->pPrivate);
        delete cgi;
    }
}

int QuibCgiGetInCookies(QuibCgi *cgi, const char *name, char *buf, int size) {
    return Guarded(-1, [&] {
        if (cgi == nullptr || cgi->pPrivate == nullptr || name == nullptr || buf == nullptr || size <= 0) {
            QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
            return -1;
        }
        const NameValues &cookies = static_cast<CgiCookies *>(cgi->pPrivate)->cookies;
        const std::string *value = FirstOf(cookies, name);
        if (value == nullptr) {
            QUIB_SET_ERR(QUIB_ERR_OPEN_FAILED);
            return -1;
        }
        if (!IsToken(*value)) {
            QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
            return -1;
        }
        if (value->size() >= static_cast<size_t>(size)) {
            QUIB_SET_ERR(QUIB_ERR_NAME_TOO_LONG);
            return -1;
        }
        memcpy(buf, value->c_str(), value->size() + 1);
        return 0;
    });
}

int VLIBCConfGetOBXTimeout(void) {
    return Guarded(-1, [] {
        char value[16] = "";
        const int got = VLIBCFileGetKeyValue(QUIB_INFO_CONF, "obx_timeout_minutes", value, sizeof value, 0);
        if (got <= 0) {
            return -1;  // the slot says absent or unreadable
        }
        long minutes = 0;
        bool ok = got <= 7 && value[0] != '\0';
        for (const char *p = value; ok && *p != '\0'; ++p) {
            ok = *p >= '0' && *p <= '9';
            minutes = minutes * 10 + (*p - '0');
        }
        if (!ok || minutes < 1 || minutes > 525600) {
            QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
            return -1;
        }
        return static_cast<int>(minutes);
    });
}
