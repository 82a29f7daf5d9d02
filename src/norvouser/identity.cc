// The request's user as the process's effective identity; the owner of a created file.
#include <errno.h>
#include <fcntl.h>
#include <grp.h>
#include <string.h>
#include <unistd.h>

#include <memory>

#include "common/log.h"
#include "common/modules.h"
#include "errors/guard.h"
#include "norvo/errors.h"
#include "norvo/norvouser.h"
#include "quib_fs.h"
#include "quib_login.h"
#include "quib_user.h"

using norvo::kNorvoUser;

namespace {

constexpr unsigned int kUnknown = static_cast<unsigned int>(-1);

const char *Text(const char *text) {
    return text != nullptr ? text : "(null)";
}

int Fail(int code) {
    NvoLibSetErr(code);
    return -1;
}

}  // namespace

int NvoLibEGIDSet(const char *sid, const char *user, unsigned int gid) {
    return norvo::Guarded(-1, [&] {
        if (user == nullptr || (sid == nullptr && gid == kUnknown)) {
            NVO_LOG(kNorvoUser, "%s:%d bad parameter");
            return Fail(NVO_ERR_GENERAL);
        }
        if (gid == kUnknown) {
            gid = QuibCgiGIDGet(sid, user);
        }
        // A refused setegid is a failure: going on would act with root's group.
        if (gid == kUnknown || setegid(gid) != 0) {
            return Fail(NVO_ERR_SYSTEM);
        }
        return 0;
    });
}

int NvoLibEUIDSet(const char *sid, const char *user, unsigned int uid) {
    return norvo::Guarded(-1, [&] {
        const int admin = QUIBGroupIsAdminGroupMem(user);
        if (user == nullptr || (sid == nullptr && uid == kUnknown)) {
            NVO_LOG(kNorvoUser, "%s:%d bad parameter");
            return Fail(NVO_ERR_GENERAL);
        }
        if (admin == -1) {
            NVO_LOG(kNorvoUser, "%s:%d QUIBGroupIsAdminGroupMem(%s) failed. [0x%04X %s:%d]", user,
                    VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
            return Fail(NVO_ERR_SYSTEM);
        }
        if (admin == 1) {
            uid = 0;  // administrators act with root's rights, under their own group
        } else if (uid == kUnknown) {
            uid = QuibCgiUIDGet(sid, user);
        }
        if (uid == kUnknown || seteuid(uid) != 0) {
            return Fail(NVO_ERR_SYSTEM);
        }
        return 0;
    });
}

int NvoLibUGIDSet(const char *sid, const char *user) {
    return norvo::Guarded(-1, [&] {
        if (user == nullptr) {
            NVO_LOG(kNorvoUser, "%s:%d Bad parameter");
            return Fail(NVO_ERR_GENERAL);
        }
        uid_t uid = kUnknown;
        gid_t gid = kUnknown;
        if (sid != nullptr) {
            gid = QuibCgiGIDGet(sid, user);
            if (gid == kUnknown && QUIBUserGetUGID(user, &uid, &gid) < 0) {
                NvoLibSetErr(VLIBCErrGet() == QUIB_ERR_NO_SUCH_USER ? NVO_ERR_NO_USER : NVO_ERR_SYSTEM);
                NVO_LOG(kNorvoUser, "%s:%d Failed to get GID for user=%s, sid=%s", user, sid);
                return -1;
            }
        } else if (QUIBUserGetUGID(user, &uid, &gid) < 0) {
            NvoLibSetErr(VLIBCErrGet() == QUIB_ERR_NO_SUCH_USER ? NVO_ERR_NO_USER : NVO_ERR_SYSTEM);
            NVO_LOG(kNorvoUser, "%s:%d Failed to get GID for user=%s", user);
            return -1;
        }
        // Groups first, then gid, then uid: once the uid has left root the rest can't be set.
        if (geteuid() == 0 && initgroups(user, gid) != 0) {
            NVO_LOG(kNorvoUser, "%s:%d Failed to initgroup for user=%s, sid=%s", user, Text(sid));
        }
        if (NvoLibEGIDSet(sid, user, gid) < 0) {
            NVO_LOG(kNorvoUser, "%s:%d Failed to set GID for user=%s, sid=%s", user, Text(sid));
            return -1;
        }
        if (NvoLibEUIDSet(sid, user, uid) < 0) {
            NVO_LOG(kNorvoUser, "%s:%d Failed to set UID for user=%s, sid=%s", user, Text(sid));
            return -1;
        }
        return 0;
    });
}

int NvoLibChown2Admin(const char *file, const char *owner) {
    return norvo::Guarded(-1, [&] {
        if (file == nullptr) {
            NVO_LOG(kNorvoUser, "%s(%d) bad parameter");
            return -1;
        }
        const int type = QUIBGetFSType(file, 0);
        if (type < 0) {
            syslog(LOG_ERR, "%s:%d(%s) : failed to get file-system type dir = %s", "NvoLibChown2Admin",
                   __LINE__, kNorvoUser, file);
            return -1;
        }
        if (type == FSTYPE_FAT || QUIBFSIsRemoteFS(type) == 1 || QUIBFSIsImageFS(type) == 1) {
            return 0;  // no Unix owners there
        }
        PQUIBUSER found = nullptr;
        if (QUIBUserGet(owner, &found) < 0) {
            return -1;
        }
        const std::unique_ptr<QUIBUSER, decltype(&QUIBUserFree)> record(found, &QUIBUserFree);
        // Never through a link: one planted at file would hand its target to owner.
        if (fchownat(AT_FDCWD, file, record->nUID, record->nGID, AT_SYMLINK_NOFOLLOW) != 0) {
            NVO_LOG(kNorvoUser, "%s(%d) change %s owner to admin fail(%s)", file, strerror(errno));
            return -1;
        }
        return 0;
    });
}
