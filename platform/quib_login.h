// Login records of the web interface, and the domain and directory privilege lookups that
// are valid only for a logged-in sid.
#pragma once
#include <sys/types.h>
#include <string>
#include "platform_export.h"

QUIB_BEGIN_C

// Checks password against the shadow entry (crypt) and records a login for user from
// remoteAddr (may be null). 0 and the new sid (32 URL-safe characters) in sidBuf (sidSize
// bytes, at least 33); -1 with 0x1D00 unknown user, 0x0300 wrong password, locked or expired
// account, 0x0D00 bad argument, 0x8100 on failure.
QUIB_API int QUIBLoginCreate(const char *user, const char *password, const char *remoteAddr, char *sidBuf,
                             int sidSize);
// Looks the sid up and moves its expiry on: 0 with the user name (userBuf, userSize bytes);
// -1 with 0x0300 when the sid is unknown or expired, 0x0D00 when it is malformed or the name
// does not fit, 0x8100 when the records can't be read.
QUIB_API int QUIBLoginGet(const char *sid, char *userBuf, int userSize);
// Ends the login; 0 when removed, -1 when unknown (0x0300) or malformed (0x0D00).
QUIB_API int QUIBLoginRemove(const char *sid);

// The uid and primary gid of user when sid is a live login of user (names compared ignoring
// ASCII case); all bits set ((uid_t)-1, (gid_t)-1) otherwise, with the error slot set.
QUIB_API uid_t QuibCgiUIDGet(const char *sid, const char *user);
QUIB_API gid_t QuibCgiGIDGet(const char *sid, const char *user);

// The share privilege (0, 1 or 2) of a domain or directory account logged in under sid,
// from the share's lists as for a local account (no access, then read-write, then read-only).
// 0 with *priv set; -1 when the sid is not a live login of that user (0x0300), the name is not
// of that kind of account or the sid is malformed (0x0D00), or the share is unknown (0x1400);
// -2 when no domain (no directory service) is configured: the join test fails.
QUIB_API int QuibCgiDomGetPrivilege(const char *share, const char *user, const char *sid, int *priv);
QUIB_API int QuibCgiLDAPGetPrivilege(const char *share, const char *user, const char *sid, int *priv);

QUIB_END_C

// The login state of one CGI request (CGI/1.1 environment): the sid comes from the cookie
// "id" or the query parameter "_sid".
class QUIB_API WebMan {
public:
    WebMan();
    // true when the request carries a valid login sid whose account holds the access mask
    // (bit 0x1 local, 0x2 domain, 0x4 directory, 0x8 administrators; 15 allows all); the sid
    // is the cookie "id" of HTTP_COOKIE, else the parameter "_sid" of QUERY_STRING.
    // text and pos are accepted and not used (nothing is logged, no request body is read).
    bool IsAuthorized(const char *text, int mask, int pos);
    // The login user and sid of the last successful IsAuthorized, "" before it.
    std::string GetLoginUserName() const;
    std::string GetLoginSid() const;

private:
    std::string user_;
    std::string sid_;
};
