// The CGI/1.1 request (RFC 3875) of a CGI program: its parameters and cookies, the response
// header with the cookies it sets; the platform's CGI record; named critical sections between
// the CGI processes; the web session timeout.
#pragma once
#include <memory>
#include "platform_export.h"

// Request bodies beyond this many bytes are refused: a CGI reads the whole body into memory.
#define QUIB_CGI_MAX_BODY (1 << 20)

QUIB_BEGIN_C

// The platform's CGI record: the record file of the program's sessions, the name of the lock
// that guards it, and the request's cookies (private). Made by QuibCgiAlloc, freed by QuibCgiFree.
typedef struct _tag_QUIBCGI_ {
    char szRecordFile[4096];
    char szLockName[4096];
    void *pPrivate;
} QuibCgi;

// A record for recordFile and lockName (each copied; at most 4095 bytes, else 0xC300) holding
// the cookies of HTTP_COOKIE as they are now. Null with the slot set on failure (0x0D00 for
// null arguments).
QUIB_API QuibCgi *QuibCgiAlloc(const char *recordFile, const char *lockName);
// Null is ignored.
QUIB_API void QuibCgiFree(QuibCgi *cgi);
// Copies the value of the first cookie called name into buf (size bytes, terminated). 0 when
// found; -1 with 0x0900 when there is none, 0x0D00 for null arguments or a name or value that
// is not a token (see QUIB::WebCGI::GetCookie), 0xC300 when it does not fit (never truncated).
QUIB_API int QuibCgiGetInCookies(QuibCgi *cgi, const char *name, char *buf, int size);

// Enters the critical section name, an absolute path whose last component is the lock file
// (created 0600 when missing; opened without following a link; it must be a regular file of
// the caller's effective user). Waits up to timeoutMs milliseconds (0: one try) for another
// holder to leave. Returns a handle (>= 0) for QuibCgiEndCriticalSection; -1 with 0x0D00 for a
// bad name or a negative timeout, 0x0300 for a lock file that is a link or not the caller's,
// 0x8100 (EWOULDBLOCK) on timeout, or the errno's code. A holder that dies leaves it at once.
QUIB_API int QuibCgiBeginCriticalSection(const char *name, int timeoutMs);
// Leaves the section entered with handle. 0; -1 with 0x0D00 for a handle that is not open.
QUIB_API int QuibCgiEndCriticalSection(int handle);

// The web session timeout in minutes: "obx_timeout_minutes" of /etc/quibinfo.conf, decimal
// digits from 1 to 525600. -1 when it is absent (slot 0x0900) or malformed (0x0D00), or the
// file can't be read (0x0900): the caller then uses its own default.
QUIB_API int VLIBCConfGetOBXTimeout(void);

// The language of the web interface for this request: the language of HTTP_ACCEPT_LANGUAGE
// with the highest q-value (RFC 9110; equal values in header order) that the interface has,
// a range such as "de-CH" also taking "de" and "zh" taking "zh-tw"; "en" when none matches or
// the header is absent or malformed. The interface has the languages whose folders exist
// under /usr/quib/quibman/webman/texts ("en" always). Never null; valid until the next call.
QUIB_API const char *QuibCgiSelectDefLang(void);

QUIB_END_C

namespace QUIB {

// One CGI request. Construct, then Init; a program makes one per request.
class QUIB_API WebCGI {
public:
    WebCGI();
    ~WebCGI();
    WebCGI(const WebCGI &) = delete;
    WebCGI &operator=(const WebCGI &) = delete;

    // Reads the request (before it, the request has no parameters or cookies): the parameters of
    // QUERY_STRING, then, for a POST of application/x-www-form-urlencoded, CONTENT_LENGTH bytes of body from
    // bodyFd; and the cookies of HTTP_COOKIE. The response header goes to outFd. 0; -1 with 0x0D00 when a
    // parameter has a broken escape or an escaped NUL, CONTENT_LENGTH is not decimal digits, or
    // the body ends short; 0xC300 when the body is longer than QUIB_CGI_MAX_BODY; the errno's
    // code when reading fails. A failed request has no parameters or cookies. Other bodies are
    // left unread. Called again, it reads nothing and returns the first result.
    int Init(int bodyFd = 0, int outFd = 1);

    // The value of the first parameter called name (query string first, then body), valid for
    // the object's life; null when there is none. Values may hold any byte but NUL (an
    // escaped LF included): callers check what they put into files or headers.
    const char *In(const char *name) const;
    // The same with fallback (which may be null) for a request without it.
    const char *In(const char *name, const char *fallback) const {
        const char *value = In(name);
        return value != nullptr ? value : fallback;
    }
    // The value of the first cookie called name when it is a token (quotes removed); null when
    // there is none or the first one's value is not a token.
    const char *GetCookie(const char *name) const;

    // Queues "Set-Cookie: name=value; Path=path; HttpOnly; SameSite=Lax" (and "; Secure" when
    // HTTPS is "on") for WriteHeader. 0; -1 with 0x0D00 when name or value is not a token or
    // path is not "/"-led visible ASCII without ';', or before Init or after WriteHeader.
    int AddCookieToHeader(const char *path, const char *name, const char *value);
    // Writes "Content-Type: <type>\r\n", the queued cookies and the blank line, once: later
    // calls write nothing and return 0. -1 with 0x0D00 for a type with a control character,
    // the errno's code when writing fails (the header then counts as written); 0x0D00 before Init.
    int WriteHeader(const char *contentType = "application/json; charset=utf-8");

private:
    struct Impl;
    std::unique_ptr<Impl> impl_;
};

}  // namespace QUIB
