// A task's hits: stored, moved, removed and paged through the file index, always as chains
// of condition records.
#include <errno.h>
#include <stdio.h>
#include <string.h>

#include <memory>
#include <string>
#include <vector>

#include "common/log.h"
#include "common/modules.h"
#include "errors/guard.h"
#include "norvo/norvomisc.h"
#include "norvo/norvosearch.h"
#include "norvo/searchdb.h"
#include "norvosearch/search_db_record.h"
#include "norvosearch/search_scope.h"
#include "norvosearch/sql_cond_text.h"
#include "quib_user.h"
#include "vlibc_err.h"

using norvo::kNorvoSearch;
using namespace norvo::search;

namespace {

// The key of a hit: (path below the share, equal) and (share, equal), from a real path.
struct Key {
    __tag_FI_SQL_COND path{};
    __tag_FI_SQL_COND share{};
    std::string rest;
    std::string keyShare;
};

// Splits path as a key needs it, logging what is missing. false for a malformed path.
bool Split(const std::string &share, const std::string &path, std::string *root, std::string *rest) {
    switch (SplitRealPath(path, root, rest)) {
        case SplitResult::kNoShare:
            NVO_LOG(kNorvoSearch, "%s:%d Fail to find the share name %s from %s", share.c_str(),
                    path.c_str());
            return false;
        case SplitResult::kNoPath:
            NVO_LOG(kNorvoSearch, "%s:%d Fail to find the path name %s", path.c_str());
            return false;
        case SplitResult::kOk:
            break;
    }
    return true;
}

bool MakeKey(const std::string &share, const std::string &path, Key *key) {
    std::string root;
    if (!Split(share, path, &root, &key->rest)) {
        return false;
    }
    key->keyShare = KeyShare(share);
    SetSqlCondText(key->share, FI_COND_SHARE, FI_OP_EQ, key->keyShare.c_str(), nullptr, nullptr);
    SetSqlCondText(key->path, FI_COND_PATH, FI_OP_EQ, key->rest.c_str(), &key->share, nullptr);
    return true;
}

// A set list: records joined through orNext, in the order added.
class SetList {
public:
    void Text(__tag_FI_SQL_COND_TYPE column, const std::string &value) {
        items_.emplace_back();
        SetSqlCondText(items_.back(), column, FI_OP_EQ, value.c_str(), nullptr, nullptr);
    }
    void Number(__tag_FI_SQL_COND_TYPE column, unsigned long long value) {
        items_.emplace_back();
        SetSqlCondNumber(items_.back(), column, FI_OP_EQ, value, nullptr, nullptr);
    }
    // The new place of a hit: real share path, share, path, parent path and, when asked, name
    // and type.
    void Place(const std::string &root, const std::string &share, const std::string &rest, bool name) {
        const size_t slash = rest.rfind('/');
        Text(FI_COND_REAL_PATH, root);
        Text(FI_COND_SHARE, share);
        Text(FI_COND_PATH, rest);
        Text(FI_COND_PARENT_PATH, slash == std::string::npos ? std::string() : rest.substr(0, slash));
        if (name) {
            const std::string base = slash == std::string::npos ? rest : rest.substr(slash + 1);
            Text(FI_COND_NAME, base);
            Text(FI_COND_TYPE, TypeText(base.c_str(), false));
        }
    }
    void Times(const _tag_QUIBSTAT_ &st) {
        Number(FI_COND_CRTIME, static_cast<unsigned long long>(static_cast<long long>(st.st_crtim.tv_sec)));
        Number(FI_COND_ATIME, static_cast<unsigned long long>(static_cast<long long>(st.st_atim.tv_sec)));
        Number(FI_COND_MTIME, static_cast<unsigned long long>(static_cast<long long>(st.st_mtim.tv_sec)));
        Number(FI_COND_CTIME, static_cast<unsigned long long>(static_cast<long long>(st.st_ctim.tv_sec)));
    }
    // Links the records (the vector no longer grows) and gives the head.
    const __tag_FI_SQL_COND *Head() {
        for (size_t i = 0; i + 1 < items_.size(); ++i) {
            items_[i].orNext = &items_[i + 1];
        }
        return items_.empty() ? nullptr : &items_.front();
    }

private:
    std::vector<__tag_FI_SQL_COND> items_;
};

void NameOf(uid_t uid, gid_t gid, FI_FILE_INFO_DATA *r) {
    PQUIBUSER user = nullptr;
    if (QUIBUserGetByUID(uid, &user, 0) == 0) {
        snprintf(r->userName, sizeof r->userName, "%s", user->szName);
        QUIBUserFree(user);
    }
    PQUIBGROUP group = nullptr;
    if (QUIBGroupGetByGID(gid, &group, 0) == 0) {
        snprintf(r->groupName, sizeof r->groupName, "%s", group->szName);
        QUIBGroupFree(group);
    }
}

}  // namespace

bool NvoSearchDBTask::insertFile(std::string share, std::string path, std::string realShare,
                                 std::string realPath, _tag_QUIBSTAT_ &st) {
    return norvo::Guarded(false, [&] {
        Key key;
        if (!MakeKey(share, path, &key)) {
            return false;
        }
        // A stored hit is replaced by the insert; the look-up only proves the database answers
        // before anything is written.
        FI_QUERY query{};
        query.where = &key.path;
        const unsigned long long one = 1;
        const auto found = [](FI_FILE_INFO_DATA *, void *) { return 0; };
        if (FILEIDXDBSelect(dbPath.c_str(), &query, found, nullptr, &one, nullptr, 0) < 0) {
            NVO_LOG(kNorvoSearch, "%s:%d Fail to select data from DB %s", dbPath.c_str());
            return false;
        }
        std::string root, rest;
        if (!Split(realShare, realPath, &root, &rest)) {
            return false;
        }
        std::unique_ptr<FI_FILE_INFO_DATA> record(new FI_FILE_INFO_DATA());
        FillHit(KeyShare(realShare), root, rest, st, record.get());
        NameOf(st.st_uid, st.st_gid, record.get());
        if (FILEIDXDBInsert(dbPath.c_str(), record.get(), 1) < 0) {
            NVO_LOG(kNorvoSearch, "%s:%d Fail to insert data in DB %s", dbPath.c_str());
            return false;
        }
        return true;
    });
}

bool NvoSearchDBTask::delRecs(std::string share, std::string path) {
    return norvo::Guarded(false, [&] {
        Key key;
        if (!MakeKey(share, path, &key)) {
            return false;
        }
        __tag_FI_SQL_COND below{};
        SetSqlCondText(below, FI_COND_PATH, FI_OP_PATH_LIKE, BelowPattern(key.rest).c_str(), &key.share,
                       nullptr);
        if (FILEIDXDBDel(dbPath.c_str(), &key.path) < 0 || FILEIDXDBDel(dbPath.c_str(), &below) < 0) {
            NVO_LOG(kNorvoSearch, "%s:%d Fail to delete data in DB %s", dbPath.c_str());
            return false;
        }
        return true;
    });
}

bool NvoSearchDBTask::updatePermRecs(std::string share, std::string path, const char *userName,
                                     const char *groupName, _tag_QUIBSTAT_ &st) {
    return norvo::Guarded(false, [&] {
        Key key;
        if (!MakeKey(share, path, &key)) {
            return false;
        }
        SetList set;
        set.Text(FI_COND_USER_NAME, userName != nullptr ? userName : "");
        set.Text(FI_COND_GROUP_NAME, groupName != nullptr ? groupName : "");
        set.Number(FI_COND_UID, st.st_uid);
        set.Number(FI_COND_GID, st.st_gid);
        set.Text(FI_COND_POSIX, GetPrivilegeStr(st.st_mode).substr(0, 9));
        set.Number(FI_COND_MODE, st.st_mode);
        set.Times(st);
        if (FILEIDXDBUpdate(dbPath.c_str(), set.Head(), &key.path) < 0) {
            NVO_LOG(kNorvoSearch, "%s:%d Fail to update data in DB %s", dbPath.c_str());
            return false;
        }
        return true;
    });
}

bool NvoSearchDBTask::updateFile(std::string share, std::string path, std::string newShare,
                                 std::string newPath, _tag_QUIBSTAT_ &st) {
    return norvo::Guarded(false, [&] {
        Key key;
        std::string root, rest;
        if (!MakeKey(share, path, &key) || !Split(newShare, newPath, &root, &rest)) {
            return false;
        }
        SetList set;
        set.Place(root, KeyShare(newShare), rest, true);
        set.Times(st);
        if (FILEIDXDBUpdate(dbPath.c_str(), set.Head(), &key.path) < 0) {
            NVO_LOG(kNorvoSearch, "%s:%d Fail to update data in DB %s", dbPath.c_str());
            return false;
        }
        return true;
    });
}

bool NvoSearchDBTask::updateFileInFolder(std::string share, std::string path, std::string newShare,
                                         std::string newPath) {
    return norvo::Guarded(false, [&] {
        Key key;
        std::string root, rest;
        if (!MakeKey(share, path, &key) || !Split(newShare, newPath, &root, &rest)) {
            return false;
        }
        __tag_FI_SQL_COND below{};
        SetSqlCondText(below, FI_COND_PATH, FI_OP_PATH_LIKE, BelowPattern(key.rest).c_str(), &key.share,
                       nullptr);
        FI_QUERY query{};
        query.where = &below;
        // Collected first: no update may run while the select is open.
        std::vector<std::string> hits;
        const auto collect = [](FI_FILE_INFO_DATA *r, void *arg) {
            static_cast<std::vector<std::string> *>(arg)->push_back(r->path);
            return 1;
        };
        if (FILEIDXDBSelect(dbPath.c_str(), &query, collect, &hits, nullptr, nullptr, 0) < 0) {
            NVO_LOG(kNorvoSearch, "%s:%d Fail to select data from DB %s", dbPath.c_str());
            return false;
        }
        const std::string shareKey = KeyShare(newShare);
        bool ok = true;
        for (const std::string &hit : hits) {
            const std::string moved = rest + hit.substr(key.rest.size());
            const std::string real = root + "/" + moved;
            _tag_QUIBSTAT_ st{};
            if (VLIBCFileLStat(real.c_str(), QUIB_STAT_BASIC | QUIB_STAT_CRTIME, &st) != 0) {
                const int err = errno;
                NVO_LOG(kNorvoSearch, "%s:%d VLIBCFileLStat: (%s), %s, quiberr=%x.", real.c_str(),
                        strerror(err), VLIBCErrGet());
                continue;
            }
            __tag_FI_SQL_COND where{}, whereShare{};
            SetSqlCondText(whereShare, FI_COND_SHARE, FI_OP_EQ, key.keyShare.c_str(), nullptr, nullptr);
            SetSqlCondText(where, FI_COND_PATH, FI_OP_EQ, hit.c_str(), &whereShare, nullptr);
            SetList set;
            set.Place(root, shareKey, moved, false);
            set.Times(st);
            if (FILEIDXDBUpdate(dbPath.c_str(), set.Head(), &where) < 0) {
                NVO_LOG(kNorvoSearch, "%s:%d Fail to update data in DB %s", dbPath.c_str());
                ok = false;
            }
        }
        return ok;
    });
}

bool NvoSearchDBTask::queryResult(unsigned long offset, unsigned long limit, const char *sortBy,
                                  const bool *sortDesc, const _tag_dir_entry_type_ *type, const char *pattern,
                                  FILEIDX_SELECT_CB callback, void *arg, unsigned long long *total) const {
    return norvo::Guarded(false, [&] {
        if (limit == 0 || total == nullptr) {
            return false;
        }
        FI_QUERY query{};
        if (sortBy != nullptr && sortDesc != nullptr) {
            static const struct {
                const char *word;
                __tag_FI_SQL_COND_TYPE column;
            } kKeys[] = {{"size", FI_COND_SIZE},        {"mtime", FI_COND_MTIME}, {"crtime", FI_COND_CRTIME},
                         {"ctime", FI_COND_CTIME},      {"atime", FI_COND_ATIME}, {"user", FI_COND_USER_NAME},
                         {"group", FI_COND_GROUP_NAME}, {"posix", FI_COND_POSIX}, {"type", FI_COND_TYPE},
                         {"ppath", FI_COND_PARENT_PATH}};
            __tag_FI_SQL_COND_TYPE column = FI_COND_NAME;
            for (const auto &key : kKeys) {
                column = strcmp(sortBy, key.word) == 0 ? key.column : column;
            }
            const int desc = *sortDesc ? 1 : 0;
            if (column == FI_COND_PARENT_PATH) {
                query.sort[query.sortCount++] = {FI_COND_SHARE, desc};
            }
            query.sort[query.sortCount++] = {column, desc};
        }
        __tag_FI_SQL_COND typeCond{}, nameCond{};
        if (type != nullptr && static_cast<int>(*type) != 2) {
            char value[16];
            snprintf(value, sizeof value, "%d", static_cast<int>(*type) == 1 ? 0 : 1);
            SetSqlCondText(typeCond, FI_COND_IS_DIR, FI_OP_EQ, value, nullptr, nullptr);
            query.where = &typeCond;
        }
        if (pattern != nullptr && pattern[0] != '\0') {
            char value[4096];
            snprintf(value, sizeof value, "*%s*", pattern);
            SetSqlCondText(nameCond, FI_COND_NAME, FI_OP_LIKE, value, nullptr, nullptr);
            if (query.where != nullptr) {
                typeCond.andNext = &nameCond;
            } else {
                query.where = &nameCond;
            }
        }
        if (FILEIDXCountGet(dbPath.c_str(), &query, total) < 0) {
            NVO_LOG(kNorvoSearch, "%s:%d Fail to Select the record from DB %s", dbPath.c_str());
            return false;
        }
        const unsigned long long pageLimit = limit, pageOffset = offset;
        if (FILEIDXDBSelect(dbPath.c_str(), &query, callback, arg, &pageLimit, &pageOffset, 0) < 0) {
            NVO_LOG(kNorvoSearch, "%s:%d Fail to select data from DB %s", dbPath.c_str());
            return false;
        }
        return true;
    });
}
