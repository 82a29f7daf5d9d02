// The sharing link database: a link id to the folder it shares, within its validity dates.
#include <stdlib.h>
#include <time.h>

#include <memory>
#include <string>

#include <sqlite3.h>

#include "common/log.h"
#include "norvo/norvologin.h"
#include "norvologin/session_file.h"
#include "quib_db.h"

namespace norvo::login {
namespace {

const std::string kLinkDatabase = "/usr/quib/etc/filebrowser/fbsharing.db";
constexpr long long kLastSecondOfDay = 86399;

struct SqlFree {
    void operator()(char *sql) const { sqlite3_free(sql); }
};
struct DbClose {
    void operator()(PQUIBDB db) const { QUIBDBClose(db); }
};
struct ResultFree {
    void operator()(PQUIBDB_RESULT result) const { QUIBDBFreeResult(result); }
};

// Whether now lies in the link's period. An ExpDate not ending in 0 is an exact moment and is
// first moved back a day less a second; one ending in 0 is the start of a day, valid through
// it. 128-bit arithmetic keeps dates near the 64-bit limits exact.
bool InPeriod(long long availDate, long long expDate, long long now) {
    __int128 expiry = expDate;
    if (expDate % 10 != 0) {
        expiry -= kLastSecondOfDay;
    }
    if (expiry == 0) {
        return true;  // never expires; the start date is not looked at either
    }
    return !(availDate > now || static_cast<__int128>(now) > expiry + kLastSecondOfDay);
}

// The link's folder, or false after logging why not (summary: whether the query itself failed).
bool LookUp(const char *id, std::string *folder, bool *queryFailed) {
    *queryFailed = true;
    std::unique_ptr<char, SqlFree> sql(
        sqlite3_mprintf("SELECT * FROM sharingLinks WHERE linkID = %Q LIMIT 1;", id));
    if (!sql) {
        return false;
    }
    std::unique_ptr<QUIBDB, DbClose> db(QUIBDBConnect(nullptr, nullptr, nullptr, kLinkDatabase.c_str()));
    if (!db) {
        NVO_LOG(kModule, "%s:%d Failed to connect to database");
        return false;
    }
    PQUIBDB_RESULT raw = nullptr;
    if (QUIBDBExecute(db.get(), sql.get(), &raw) == -1) {
        NVO_LOG(kModule, "%s:%d Failed to exec [%s] (%s)", sql.get(), QUIBDBErrorGet(db.get()));
        return false;
    }
    std::unique_ptr<QUIBDB_RESULT, ResultFree> result(raw);
    const long long now = time(nullptr);
    QUIBDB_ROW row = 0;
    if (QUIBDBFetchRow(result.get(), &row) == -1) {
        NVO_LOG(kModule, "%s:%d faild to fetch query result");
        return false;
    }
    if (QUIBDBFetchField(result.get(), row, "uid") == nullptr) {
        NVO_LOG(kModule, "%s:%d faild to fetch uid");
        return false;
    }
    const char *path = QUIBDBFetchField(result.get(), row, "filepath");
    // The name and password are the calling program's to use (the password page).
    (void)QUIBDBFetchField(result.get(), row, "filename");
    (void)QUIBDBFetchField(result.get(), row, "password");
    const char *avail = QUIBDBFetchField(result.get(), row, "AvailDate");
    if (avail == nullptr) {
        NVO_LOG(kModule, "%s:%d faild to fetch AvailDate");
        return false;
    }
    const char *exp = QUIBDBFetchField(result.get(), row, "ExpDate");
    if (exp == nullptr) {
        NVO_LOG(kModule, "%s:%d ExpDate");
        return false;
    }
    *queryFailed = false;
    if (!InPeriod(strtoll(avail, nullptr, 10), strtoll(exp, nullptr, 10), now)) {
        NVO_LOG(kModule, "%s:%d sharing link out of valid duration");
        return false;
    }
    *folder = path != nullptr ? path : "";
    return true;
}

}  // namespace
}  // namespace norvo::login

namespace NorvoLogin {

std::string FolderSharingLoginManager::GetSharingFolderPath(QUIB::WebCGI &cgi) const try {
    const char *id = getenv("HTTP_FOLDER_SHARING");
    if (id == nullptr) {
        id = cgi.In("FOLDER_SHARING");
    }
    std::string folder;
    bool queryFailed = false;
    if (!norvo::login::LookUp(id, &folder, &queryFailed)) {
        if (queryFailed) {
            NVO_LOG(norvo::login::kModule, "%s:%d Sharing download DBquery failed");
        }
        return "";
    }
    return folder;
} catch (...) {
    return "";  // only bad_alloc: no exception leaves the library
}

}  // namespace NorvoLogin
