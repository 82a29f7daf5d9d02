// Login records of the web interface, and the domain and directory privilege lookups that
// are valid only for a logged-in sid.
#pragma once
#include <string>
#include <sys/types.h>
#include "platform_export.h"

QUIB_BEGIN_C

// Checks password against the shadow entry (crypt) and records a login for user from
// remoteAddr. 0 and the new sid in sidBuf (sidSize bytes); -1 with 0x1D00 unknown user,
// 0x0300 wrong password or expired account, 0x8100 on failure.
QUIB_API int QUIBLoginCreate(const char *user, const char *password, const char *remoteAddr,
                             char *sidBuf, int sidSize);
// Looks the sid up: 0 with the user name (userBuf, userSize bytes), -1 with 0x0300 when the sid
// is unknown or expired.
QUIB_API int QUIBLoginGet(const char *sid, char *userBuf, int userSize);
// Ends the login; 0 when removed, -1 when unknown.
QUIB_API int QUIBLoginRemove(const char *sid);

// The share privilege (0, 1 or 2) of a domain or directory account logged in under sid.
// 0 with *priv set; -1 when the sid is not a login of that user; -2 when no domain (no
// directory service) is configured: the join test fails.
QUIB_API int QuibCgiDomGetPrivilege(const char *share, const char *user, const char *sid, int *priv);
QUIB_API int QuibCgiLDAPGetPrivilege(const char *share, const char *user, const char *sid, int *priv);

QUIB_END_C

// The login state of one CGI request (CGI/1.1 environment): the sid comes from the cookie
// "id" or the query parameter "_sid".
class QUIB_API WebMan {
public:
    WebMan();
    // true when the request carries a valid login sid whose account holds the access mask
    // (bit 0x1 local, 0x2 domain, 0x4 directory, 0x8 administrators; 15 allows all).
    // text is the caller's context for the log; pos is kept for the platform's request parsing.
    bool IsAuthorized(const char *text, int mask, int pos);
    // The login user of the last successful IsAuthorized, "" before it.
    std::string GetLoginUserName() const;
    std::string GetLoginSid() const;

private:
    std::string user_;
    std::string sid_;
};
