// The top of the user-visible tree ("/"): the user's home folder, then the shares the user may
// see, with share privileges and volume figures, sorted and paged as a directory listing.
#include <errno.h>
#include <stdio.h>
#include <string.h>
#include <sys/statfs.h>
#include <unistd.h>

#include <list>
#include <string>

#include "common/log.h"
#include "common/modules.h"
#include "common/owners.h"
#include "common/text.h"
#include "errors/guard.h"
#include "info_flags.h"
#include "norvo/errors.h"
#include "norvo/norvodir.h"
#include "norvo/norvoenum.h"
#include "quib_s2s.h"
#include "quib_sdk_share.h"
#include "quib_share_list.h"
#include "quib_user.h"
#include "vlibc_support.h"

using norvo::kNorvoEnum;

namespace {

constexpr char kRemoteFail[] = "remotefail";

// The shares user may see, from the generator of the account's kind (a backslash makes a
// domain account even when an "@" follows). Null on failure.
norvo::SzList VisibleShares(const char *user, const char *context, bool flag) {
    if (norvo::IsDomainUser(user)) {
        return norvo::SzList(QuibCgiDomValidShareGen(context, user, 0, flag));
    }
    if (norvo::IsDirectoryUser(user)) {
        return norvo::SzList(QuibCgiLDAPValidShareGen(context, user, 0, flag));
    }
    return norvo::SzList(NvoLibValidShareGen(user, 0, flag));
}

// Volume figures of the volume holding path; a failed statfs64 leaves them 0. Nothing for an
// unreachable remote mount, whose statfs would only fail (or hang) again.
void FillVolumeStatus(NvoEnum &mounts, const char *path, int info, DIRENTRY_INFO &entry) {
    if ((info & NVO_INFO_VOLUME_STATUS) == 0 || entry.mount_point_type == kRemoteFail) {
        return;
    }
    struct statfs64 volume {};
    if (statfs64(path, &volume) == 0) {
        const uint64_t blockSize = static_cast<uint64_t>(volume.f_bsize);
        entry.freespace = static_cast<uint64_t>(volume.f_bavail) * blockSize;
        entry.totalspace = static_cast<uint64_t>(volume.f_blocks) * blockSize;
    }
    entry.readonly = mounts.IsReadOnly(path);
}

// FillFileInfo for one top-level folder; a folder that can't be described is only left out,
// so its error does not reach the caller's slot.
int FillKeepingSlot(NvoEnum &listing, const char *userPath, const char *realPath, const char *name,
                    unsigned char dtype, int info, DIRENTRY_INFO &entry) {
    const int saved = NvoLibGetErr();
    const int filled = listing.FillFileInfo(userPath, realPath, name, DIR_ENTRY_TYPE_DIR, dtype, info, entry);
    NvoLibSetErr(saved);
    return filled;
}

// Appends the home entry when user has a home folder. A home not made yet is listed all the
// same: it is made (as the home service makes it) when the user first opens it, and a listing,
// which runs as the user and only reads, neither can nor should make it. false (logged) when
// the home's real path can't be resolved; the slot then holds NvoLibRealFullPathGet's code.
bool AddHome(NvoEnum &listing, const char *user, int info, std::list<DIRENTRY_INFO> &out) {
    char home[4096] = {0};
    if (QUIBServiceHomePathGet(user, home, sizeof home) != 0) {
        return true;  // no home folder: shares only
    }
    char real[4096] = {0};
    std::string volumeProbe;  // where the volume figures are read
    if (access(home, F_OK) != 0 && errno == ENOENT) {
        snprintf(real, sizeof real, "%s", home);
        const char *slash = strrchr(home, '/');
        volumeProbe.assign(home, slash != nullptr && slash != home ? static_cast<size_t>(slash - home) : 1);
    } else if (!NvoLibRealFullPathGet(home, real, 4095)) {  // which leaves its own code in the slot
        NVO_LOG_AT(kNorvoEnum, 415, "%s:%d Failed to get real path (%s)", home);
        return false;
    } else {
        volumeProbe = real;
    }
    DIRENTRY_INFO entry;
    FillKeepingSlot(listing, "/home", real, "home", 4, info, entry);
    if ((info & NVO_INFO_PERM) != 0) {
        entry.share_privilege = 2;
        entry.ftp_privilege = 0;
        entry.acl_enabled = false;
        entry.synced_share = false;
    }
    FillVolumeStatus(listing, volumeProbe.c_str(), info, entry);
    out.push_back(std::move(entry));  // whatever FillFileInfo said: the home is always shown
    return true;
}

// Appends the share named name unless it can't be loaded, is hidden, or can't be described.
void AddShare(NvoEnum &listing, const char *user, const char *name, int info, bool syncSupported,
              std::list<DIRENTRY_INFO> &out) {
    const norvo::SdkShare share(SDK::Share::LoadShare(name));
    if (!share || (share->GetStatus() & SHARE_STATUS_HIDDEN) != 0) {
        return;
    }
    DIRENTRY_INFO entry;
    if ((info & NVO_INFO_PERM) != 0) {
        entry.share_privilege = share->GetAccessRight(user);
        entry.ftp_privilege = share->GetFTPPrivilege();
        entry.acl_enabled = share->GetACLEnable();
    }
    if ((info & NVO_INFO_SYNC_SHARE) != 0 && syncSupported) {
        entry.synced_share = QUIBS2SIsSyncedShare(name) == 1;
    }
    const std::string shareName = share->GetName();
    const std::string realPath = share->GetFullPath();
    const std::string userPath = "/" + std::string(name);
    const int filled =
        FillKeepingSlot(listing, userPath.c_str(), realPath.c_str(), shareName.c_str(), 0, info, entry);
    FillVolumeStatus(listing, realPath.c_str(), info, entry);
    if (filled == 0 || entry.mount_point_type == kRemoteFail) {
        out.push_back(std::move(entry));
    }
}

}  // namespace

int NvoEnum::NvoLibShareEntryListEnum(const char *user, const char *context, bool flag, const char *sortKey,
                                      int info, unsigned long offset, unsigned long limit, bool ascending,
                                      std::list<DIRENTRY_INFO> &out, unsigned long *total) {
    return norvo::Guarded(0, [&] {
        info = norvo::WidenInfoBySortKey(sortKey, info);
        if (user == nullptr) {
            NvoLibSetErr(NVO_ERR_NO_USER);
            NVO_LOG_AT(kNorvoEnum, 402, "%s:%d Failed to get user (%s)", norvo::OrNull(user));
            return 0;
        }
        const norvo::SzList names = VisibleShares(user, context, flag);
        if (!names) {
            NVO_LOG_AT(kNorvoEnum, 407, "%s:%d Failed to enum valid shares");
            NvoLibSetErr(NVO_ERR_SYSTEM);
            return 0;
        }
        if (!AddHome(*this, user, info, out)) {
            return 0;
        }
        const bool syncSupported = (info & NVO_INFO_SYNC_SHARE) != 0 && VLIBCSupportGet("support_s2s") > 0;
        for (int i = 0; i < VLIBCSzListCount(names.get()); ++i) {
            if (const char *name = VLIBCSzListGet(names.get(), i); name != nullptr) {
                AddShare(*this, user, name, info, syncSupported, out);
            }
        }
        // As a directory listing: the whole list is ordered, counted and paged.
        if (sortKey != nullptr) {
            EntryListSort(out, sortKey);
        }
        if (!ascending) {
            out.reverse();
        }
        if (total != nullptr) {
            *total = out.size();
        }
        if (limit != 0) {
            NvoLibDirEntrySlice(out, offset, limit);
        }
        return 1;
    });
}
