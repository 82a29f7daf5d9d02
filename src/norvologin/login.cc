// Login of a sharing-link visitor: a session id, a line in the session file, the cookie.
#include <crypt.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>

#include "common/log.h"
#include "norvo/norvologin.h"
#include "norvologin/session_file.h"
#include "quib_autoblock.h"
#include "quib_user.h"
#include "vlibc_err.h"
#include "vlibc_line_file.h"

namespace norvo::login {
namespace {

// Ids holding "/" are tried again at once, taken ones after a second: this bounds both.
constexpr int kMaxIdAttempts = 64;
constexpr char kService[] = "FOLDER_SHARING";

// Text that would split a line into other fields or lines.
bool BreaksLine(const char *text) {
    return strpbrk(text, ",\r\n") != nullptr;
}

bool Refused(int mask, bool admin, const char *user) {
    if (admin) {
        return (mask & 1) == 0;
    }
    if (strchr(user, '\\') != nullptr) {
        return (mask & 4) == 0;
    }
    if (strchr(user, '@') != nullptr) {
        return (mask & 8) == 0;
    }
    return (mask & 2) == 0;
}

// A free session id into id (14 bytes) and the uptime it was made at. -4 on failure.
int NewSessionId(const std::string &key, char (&id)[14], long *uptime) {
    for (int attempt = 0; attempt < kMaxIdAttempts; ++attempt) {
        if (!Uptime(uptime)) {
            return -4;
        }
        srand(static_cast<unsigned>(*uptime));
        const char salt[3] = {QUIBUserRandomNumMap2Seed(*uptime), QUIBUserRandomNumMap2Seed(rand()), '\0'};
        const char *made = salt[0] != '\0' && salt[1] != '\0' ? crypt(key.c_str(), salt) : nullptr;
        // Null or an error token ("*0"): never an id.
        if (made == nullptr || made[0] == '*' || strlen(made) != sizeof id - 1) {
            NVO_LOG(kModule, "%s (%d) QuibCgiLoginAddUser failed.");
            return -4;
        }
        if (strpbrk(made, "/:") != nullptr) {
            continue;
        }
        memcpy(id, made, sizeof id);
        const int found = VLIBCFileGetLine(SessionFile().c_str(), id, nullptr, 0);
        if (found < 0 && VLIBCErrGet() != QUIB_ERR_OPEN_FAILED) {
            return -4;
        }
        sleep(1);
        if (found < 0) {
            return 1;
        }
    }
    NVO_LOG(kModule, "%s (%d) QuibCgiLoginAddUser failed.");
    return -4;
}

// Appends the session line under the lock; false, logged, when it was not written.
bool AddSessionLine(const char *line) {
    const int lock = QuibCgiBeginCriticalSection(SessionLock().c_str(), kLockTimeoutMs);
    if (lock < 0) {
        NVO_LOG(kModule, "%s (%d) QuibCgiBeginCriticalSection Failed.");
        return false;
    }
    const bool added = VLIBCFileAddLine(SessionFile().c_str(), line) == 0;
    if (!added) {
        NVO_LOG(kModule, "%s (%d) VLIBCFileAddLine Failed.");
    } else {
        // Through the file just checked, not its name.
        const int fd = OpenOwnFile(SessionFile().c_str(), false);
        if (fd < 0 || fchmod(fd, 0600) != 0) {
            NVO_LOG(kModule, "%s:%d current.users chmod failed. errno=[0x%04X]", errno);
        }
        if (fd >= 0) {
            close(fd);
        }
    }
    QuibCgiEndCriticalSection(lock);
    return added;
}

}  // namespace
}  // namespace norvo::login

using namespace norvo::login;

namespace NorvoLogin {

int FolderSharingLoginManager::login(QUIB::WebCGI *cgi, char *sessionOut, int sessionOutLen,
                                     _tag_login_params *params, const char *cookieName) try {
    if (cookieName == nullptr) {
        cookieName = "";
    }
    // A comma or line end in a name would forge fields or lines of the session file.
    if (cgi == nullptr || sessionOut == nullptr || sessionOutLen <= 0 || params == nullptr ||
        params->szUser == nullptr || params->szPass == nullptr || BreaksLine(params->szUser) ||
        BreaksLine(cookieName) || strlen(params->szUser) + strlen(cookieName) > 512) {
        NVO_LOG(kModule, "%s (%d) Bad parameter.");
        return -4;
    }
    const char *user = params->szUser;
    char address[64];
    if (!ClientAddress(address)) {
        NVO_LOG(kModule, "%s:%d Failed to get client ip.");
        return -4;
    }
    if (QuibCgiIsDeniedIP(address) == 1) {
        NVO_LOG(kModule, "%s:%d QUIBAutoBlockIsDeniedIP");
        return -3;
    }
    int admin = QUIBGroupIsAdminGroupMemEx(user, 1);
    if (admin < 0) {
        if (VLIBCErrGet() != QUIB_ERR_NO_SUCH_USER) {
            NVO_LOG(kModule, "%s:%d QUIBGroupIsAdminGroupMem(%s) failed. [0x%04X %s:%d]", user, VLIBCErrGet(),
                    VLIBCErrorGetFile(), VLIBCErrorGetLine());
        }
        admin = 0;
    }
    if (Refused(params->authMask, admin == 1, user)) {
        NVO_LOG(kModule, "%s:%d LOGIN_ERR_INVALID");
        return -3;
    }
    setenv("USERNAME", user, 1);
    char id[14];
    long uptime = 0;
    if (NewSessionId(std::string(user) + address, id, &uptime) != 1) {
        return -4;
    }
    char line[kLineBuffer];
    snprintf(line, sizeof line, "%s,%s,%s,%ld,%ld,%d,%d,%s", address, user, id, uptime, uptime, 1,
             params->persistent, cookieName);
    if (!AddSessionLine(line)) {
        NVO_LOG(kModule, "%s (%d) QuibCgiLoginAddUser failed.");
        return -4;
    }
    snprintf(sessionOut, static_cast<size_t>(sessionOutLen), "%s", id);
    QUIBAutoBlockResetByIP(address);
    if (cgi->AddCookieToHeader("/", cookieName, id) != 0) {
        NVO_LOG(kModule, "%s (%d) AddCookieToHeader failed.");
    }
    return 1;
} catch (...) {
    return -4;
}

int FolderSharingLoginManager::isAuthorized(QUIB::WebCGI *cgi, char *userOut, int userOutLen,
                                            _tag_confirm_policy *policy, _tag_cgi_position position,
                                            const char *cookieName) try {
    const char *session = cgi != nullptr && cookieName != nullptr ? cgi->GetCookie(cookieName) : nullptr;
    if (session == nullptr) {
        return -5;
    }
    if (userOut != nullptr && userOutLen > 0) {
        userOut[0] = '\0';
    }
    const int result = IsAuthorizedByPath(cgi, session, userOut, userOutLen, policy, position, cookieName);
    user_ = userOut != nullptr && userOutLen > 0 ? userOut : "";
    return result;
} catch (...) {
    return -4;
}

bool FolderSharingLoginManager::isAuthorized(QUIB::WebCGI &cgi, const std::string &cookieName) try {
    char user[64] = "";
    CONFIRM_POLICY policy = {15, 0};
    return isAuthorized(&cgi, user, sizeof user, &policy, CGI_POSITION_FILE_BROWSER, cookieName.c_str()) > 0;
} catch (...) {
    return false;
}

bool FolderSharingLoginManager::isAuthorized(QUIB::WebCGI &cgi) try {
    const char *name = getenv("HTTP_FOLDER_SHARING");
    if (name == nullptr) {
        name = cgi.In("FOLDER_SHARING");
    }
    return name != nullptr && isAuthorized(cgi, std::string(name));
} catch (...) {
    return false;
}

bool FolderSharingLoginManager::folderSharingLogin(QUIB::WebCGI &cgi, const std::string &cookieName,
                                                   const std::string &userName) try {
    if (isAuthorized(cgi, cookieName)) {
        return true;
    }
    // "Anomyous": the spelling the session machinery has always been given.
    LOGIN_PARAMS params = {userName.c_str(), "Anomyous", "folderSharing", 15, 0};
    char session[64];
    if (login(&cgi, session, sizeof session, &params, cookieName.c_str()) != 1) {
        return false;
    }
    user_ = userName;
    return true;
} catch (...) {
    return false;
}

void FolderSharingLoginManager::folderSharingFailLoginSet() try {
    char address[64];
    if (!ClientAddress(address)) {
        NVO_LOG(kModule, "%s:%d Failed to get client ip.");
        return;
    }
    AutoBlockFailLoginSet(address, kService);
} catch (...) {
}

std::string FolderSharingLoginManager::GetLoginUserName() const {
    return user_;
}

}  // namespace NorvoLogin
