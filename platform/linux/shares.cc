// QUIBShareGet, the share cursor, BlSDKUserIsInList and the recycle-bin test, backed by
// QUIB_SHARE_CONF.
#include <stdlib.h>
#include <string.h>

#include <memory>
#include <string>
#include <vector>

#include "api_guard.h"
#include "fs_path.h"
#include "home_service.h"
#include "name_list.h"
#include "quib_share.h"
#include "share_config.h"
#include "text_util.h"

// The cursor: a snapshot of the configuration taken at open.
struct _tag_QUIBSHARE_DB_ {
    std::shared_ptr<const norvo::platform::ShareTable> table;
    size_t next = 0;
};

namespace norvo::platform {
namespace {

struct ShareRecordFree {
    void operator()(PQUIBSHARE share) const { QUIBShareFree(share); }
};
using ShareRecord = std::unique_ptr<QUIBSHARE, ShareRecordFree>;

// Longest path QUIBShareGet accepts in place of a name.
constexpr size_t kMaxSharePathArg = 4096;

// The configured shares; false with 0x0900 when the configuration can't be read.
bool LoadShares(std::shared_ptr<const ShareTable> *table) {
    if (CurrentShares(table) != 0) {
        QUIB_SET_ERR(QUIB_ERR_OPEN_FAILED);
        return false;
    }
    return true;
}

// A C record of entry; null with 0x2B00 when out of memory.
ShareRecord MakeRecord(const ShareEntry &entry) {
    ShareRecord record(static_cast<PQUIBSHARE>(calloc(1, sizeof(QUIBSHARE))));
    if (record) {
        record->szName = DupCString(entry.name);
        record->szPath = DupCString(entry.path);
        record->szComment = DupCString(entry.comment);
        record->szNoAccessList = DupCString(entry.noAccess);
        record->szRWList = DupCString(entry.readWrite);
        record->szROList = DupCString(entry.readOnly);
        record->fStatus = entry.status;
        record->fRestrict = entry.restrict;
        record->ftpPrivilege = entry.ftpPrivilege;
        record->blAclMode = entry.aclMode ? 1 : 0;
    }
    if (!record || record->szName == nullptr || record->szPath == nullptr || record->szComment == nullptr ||
        record->szNoAccessList == nullptr || record->szRWList == nullptr || record->szROList == nullptr) {
        QUIB_SET_ERR(QUIB_ERR_NO_MEMORY);
        return ShareRecord();
    }
    return record;
}

// The share holding path: the deepest share path that is path or a parent of it, else the
// share named by the first component ("/photo/a.jpg" -> "photo").
const ShareEntry *FindByPath(const ShareTable &table, std::string_view path) {
    std::string normal = NormalizePath(path);
    const ShareEntry *best = nullptr;
    for (const ShareEntry &share : table.shares) {
        if (PathIsWithin(share.path, normal) && (best == nullptr || share.path.size() > best->path.size())) {
            best = &share;
        }
    }
    if (best != nullptr) {
        return best;
    }
    std::string_view first = std::string_view(normal).substr(1);
    first = first.substr(0, first.find('/'));
    return first.empty() ? nullptr : table.Find(first);
}

// 1 when normal (normalised, absolute) is "#recycle" directly in a share's folder, or in a
// home folder (a folder directly under the homes root, the "home" share of its user) when
// there is a "homes" share; 0 when not; -1 with the slot set when a file can't be read.
int IsRecycleBin(std::string_view normal) {
    constexpr std::string_view kBin = "/#recycle";
    if (normal.size() <= kBin.size() || normal.substr(normal.size() - kBin.size()) != kBin) {
        return 0;
    }
    const std::string_view folder = normal.substr(0, normal.size() - kBin.size());
    std::shared_ptr<const ShareTable> table;
    if (!LoadShares(&table)) {
        return -1;
    }
    for (const ShareEntry &share : table->shares) {
        if (share.path == folder) {
            return 1;
        }
    }
    // Only then the settings: most bins are a share's own.
    const size_t slash = folder.rfind('/');
    if (table->Find("homes") == nullptr || slash == 0) {
        return 0;
    }
    std::string root;
    if (!HomesRoot(&root)) {
        return -1;
    }
    return !root.empty() && folder.substr(0, slash) == root ? 1 : 0;
}

}  // namespace
}  // namespace norvo::platform

namespace np = norvo::platform;

extern "C" {

int QUIBShareGet(const char *name, PQUIBSHARE *pshare) {
    if (pshare == nullptr || name == nullptr) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    bool isPath = name[0] == '/';
    bool acceptable =
        isPath ? strnlen(name, np::kMaxSharePathArg + 1) <= np::kMaxSharePathArg && np::IsValidUtf8(name)
               : np::IsAcceptableName(name);
    // No share can carry such a name: the answer is the ordinary "no such share".
    if (!acceptable) {
        QUIB_SET_ERR(name[0] == '\0' ? QUIB_ERR_BAD_PARAMETER : QUIB_ERR_NO_SUCH_SHARE);
        return -1;
    }
    return np::Guarded(-1, [&] {
        std::shared_ptr<const np::ShareTable> table;
        if (!np::LoadShares(&table)) {
            return -1;
        }
        const np::ShareEntry *entry = isPath ? np::FindByPath(*table, name) : table->Find(name);
        if (entry == nullptr) {
            QUIB_SET_ERR(QUIB_ERR_NO_SUCH_SHARE);
            return -1;
        }
        np::ShareRecord record = np::MakeRecord(*entry);
        if (!record) {
            return -1;
        }
        *pshare = record.release();
        return 0;
    });
}

void QUIBShareFree(PQUIBSHARE share) {
    if (share == nullptr) {
        return;
    }
    free(share->szName);
    free(share->szPath);
    free(share->szComment);
    free(share->szNoAccessList);
    free(share->szRWList);
    free(share->szROList);
    free(share);
}

PQUIBSHARE_DB QUIBShareDBOpen(void) {
    return np::Guarded<PQUIBSHARE_DB>(nullptr, [] {
        auto db = std::make_unique<QUIBSHARE_DB>();
        if (!np::LoadShares(&db->table)) {
            return static_cast<PQUIBSHARE_DB>(nullptr);
        }
        return db.release();
    });
}

int QUIBShareDBCursorGet(PQUIBSHARE_DB db, PQUIBSHARE *pshare) {
    if (db == nullptr || pshare == nullptr) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    if (db->next >= db->table->shares.size()) {
        return 1;
    }
    return np::Guarded(-1, [&] {
        np::ShareRecord record = np::MakeRecord(db->table->shares[db->next]);
        if (!record) {
            return -1;  // *pshare stays the caller's
        }
        ++db->next;
        QUIBShareFree(*pshare);
        *pshare = record.release();
        return 0;
    });
}

void QUIBShareDBClose(PQUIBSHARE_DB db) {
    delete db;
}

int QUIBShareIsShareRecycle(const char *realPath) {
    if (const int err = np::CheckPathArgument(realPath)) {
        return NORVO_FAIL_ERRNO(err);
    }
    // Lexical: a real path holds no link, and a share's folder is configured by its real path.
    // Normalising only drops components: without the name anywhere it can't end the path.
    // Walks ask this of every entry.
    if (strstr(realPath, "#recycle") == nullptr) {
        return 0;
    }
    return np::Guarded(-1, [&] { return np::IsRecycleBin(np::NormalizePath(realPath)); });
}

int BlSDKUserIsInList(const char *user, const char *list) {
    if (!np::IsAcceptableName(user) || list == nullptr) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return np::Guarded(-1, [&] {
        std::vector<std::string> entries = np::SplitNameList(list);
        np::ListMatcher matcher(user);
        // Names first: a listed name answers without asking NSS about groups.
        for (const std::string &entry : entries) {
            if (matcher.MatchesName(entry)) {
                return 1;
            }
        }
        // A group that could not be asked about only decides when no other entry matches.
        int result = 0;
        for (const std::string &entry : entries) {
            if (!entry.empty() && entry.front() == '@') {
                int match = matcher.Matches(entry);
                if (match == 1) {
                    return 1;
                }
                result = match < 0 ? -1 : result;
            }
        }
        return result;
    });
}

}  // extern "C"
