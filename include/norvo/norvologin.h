// Visitors of public sharing links: a short session per visitor, kept as one line of the
// session file /tmp/foldersharing.current.users (address, user, id, login and last-access
// uptimes, position, persistent flag, cookie name) under the critical section
// /tmp/foldersharing.current.users.lock. These functions report through their results and the
// log only; the library's error slot is left alone.
#pragma once
#include <string>

#include "norvo/export.h"
#include "quib_cgi.h"

// Who may log in, in order of the login line's fields.
typedef struct _tag_login_params {
    const char *szUser;     // the account; must be present
    const char *szPass;     // must be present; not otherwise read here
    const char *szService;  // not read here
    int authMask;           // bit 0 administrators, 1 local, 2 domain ("\\"), 3 directory ("@") users
    int persistent;         // stored as the line's seventh field; non-zero: the session never expires
} LOGIN_PARAMS;

// What an authorisation accepts.
typedef struct _tag_confirm_policy {
    int acceptMask;  // bit 0: administrators (result 2); bit 1: other users (result 1)
    int noRefresh;   // non-zero: the last access stays, and an expired line is kept
} CONFIRM_POLICY;

// The calling program; each but CGI_POSITION_NONE needs its application privilege.
enum _tag_cgi_position {
    CGI_POSITION_NONE = 0,
    CGI_POSITION_LOGIN = 1,         // stored at login
    CGI_POSITION_FILE_BROWSER = 2,  // "QUIB.TVQ.App.Tovana3.Instance"
    CGI_POSITION_AURELO = 3,        // "QUIB.TVQ.Aurelo.Application"
    CGI_POSITION_SILVORY = 4,       // "QUIB.TVQ.Silvory"
    CGI_POSITION_DUNETRA = 5,       // "QUIB.TVQ.Dunetra.Application"
};

NORVO_BEGIN_C

// The user of the session whose id is the request's "id" cookie and whose cookie name is
// cookieName, in cgi's record file (under its lock, 30 s), copied into userOut (userOutLen bytes,
// terminated, cut to fit). 1 when found; 0 when not, or on any failure.
NORVO_API int QuibCgiHasRecord(QuibCgi *cgi, char *userOut, int userOutLen, const char *cookieName);

NORVO_END_C

namespace NorvoLogin {

// Authorises the session sessionId of cookie cookieName for the client's address, refreshing its
// line (last access, position) unless the policy says not to, and drops every expired line.
// The session's user goes to userOut (userOutLen bytes, cut to fit) and the environment's
// "USERNAME". 2 administrator, 1 user, -1 expired, -2 not authorised (no such session, refused,
// lock failed, or an address blocked for failing), -4 bad arguments or a file error (the file
// is then unchanged). A session id matching no line counts as a failed login of the address.
NORVO_API int IsAuthorizedByPath(QUIB::WebCGI *cgi, const char *sessionId, char *userOut, int userOutLen,
                                 _tag_confirm_policy *policy, _tag_cgi_position position,
                                 const char *cookieName);

class NORVO_API FolderSharingLoginManager {
public:
    // Logs params' user in from the client's address: appends a session line, copies the new id
    // to sessionOut (cut to sessionOutLen) and queues the cookie cookieName=id (path "/") on cgi.
    // Takes a second or more: one per id tried. 1 logged in, -3 refused (blocked address, or an
    // account kind params do not allow), -4 failure (bad arguments, a user or cookie name that
    // would break the line, no IP address, file errors).
    int login(QUIB::WebCGI *cgi, char *sessionOut, int sessionOutLen, _tag_login_params *params,
              const char *cookieName);
    // IsAuthorizedByPath of the cookie cookieName's value; -5 without that cookie. The user
    // found (or "") becomes the manager's user, also when refused.
    int isAuthorized(QUIB::WebCGI *cgi, char *userOut, int userOutLen, _tag_confirm_policy *policy,
                     _tag_cgi_position position, const char *cookieName);
    // The file browser's check: policy {15, 0}, position 2. true when authorised.
    bool isAuthorized(QUIB::WebCGI &cgi, const std::string &cookieName);
    // The same with the cookie name from "HTTP_FOLDER_SHARING" or else the parameter
    // "FOLDER_SHARING"; false without either.
    bool isAuthorized(QUIB::WebCGI &cgi);
    // true when already authorised; else logs userName in as a sharing-link visitor (password
    // "Anomyous", service "folderSharing", every account kind, not persistent).
    bool folderSharingLogin(QUIB::WebCGI &cgi, const std::string &cookieName, const std::string &userName);
    // Counts a failed login of the client's address for the automatic blocking.
    void folderSharingFailLoginSet();
    std::string GetLoginUserName() const;
    // The folder of the sharing link whose id is "HTTP_FOLDER_SHARING" or else the parameter
    // "FOLDER_SHARING": the "filepath" of its row in /usr/quib/etc/filebrowser/fbsharing.db
    // when the link is within its validity dates; "" otherwise (unknown link, out of its
    // period, database failure: logged).
    std::string GetSharingFolderPath(QUIB::WebCGI &cgi) const;
    // Writes the response header and the landing page of a sharing link for folderPath to
    // standard output. What reaches the page is escaped for where it goes; an md5 that is not
    // hexadecimal and a "tunnel" that is not a plain same-site path are left out.
    void WriteWebPage(QUIB::WebCGI &cgi, const std::string &md5, const std::string &folderPath);

private:
    std::string user_;
};

}  // namespace NorvoLogin
