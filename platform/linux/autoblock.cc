// Failed logins per client address, in SQLite.
#include <arpa/inet.h>
#include <errno.h>
#include <netinet/in.h>
#include <string.h>
#include <sys/stat.h>
#include <time.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "api_guard.h"
#include "locked_file.h"
#include "quib_autoblock.h"
#include "quib_paths.h"
#include "settings_format.h"
#include "sqlite_db.h"

using norvo::platform::Guarded;
namespace pf = norvo::platform;

namespace {

constexpr char kSchema[] =
    "CREATE TABLE IF NOT EXISTS login_failure(addr TEXT NOT NULL, service TEXT NOT NULL, at INTEGER NOT NULL);"
    "CREATE INDEX IF NOT EXISTS login_failure_addr ON login_failure(addr, at);";

struct Policy {
    long attempts = 5;
    long windowSeconds = 5 * 60;
};

// A setting of decimal digits within [low, high]; fallback when absent or anything else, so a
// damaged setting never turns blocking off.
long NumberSetting(const std::vector<pf::SettingsLine> &lines, const char *key, long low, long high,
                   long fallback) {
    const pf::SettingsLine *entry = pf::FindSettingsEntry(lines, key, false);
    const std::string value = entry != nullptr ? entry->value : std::string();
    if (value.empty() || value.size() > 7) {
        return fallback;
    }
    long number = 0;
    for (const char c : value) {
        if (c < '0' || c > '9') {
            return fallback;
        }
        number = number * 10 + (c - '0');
    }
    return number >= low && number <= high ? number : fallback;
}

// Both settings from one read of the file; an unreadable file gives the defaults.
Policy ReadPolicy() {
    Policy policy;
    std::string text;
    if (pf::ReadWholeFile(QUIB_INFO_CONF, &text) != 0) {
        return policy;
    }
    const std::vector<pf::SettingsLine> lines = pf::ParseSettings(text);
    policy.attempts = NumberSetting(lines, "auto_block_attempts", 0, 1000, policy.attempts);
    policy.windowSeconds =
        60 * NumberSetting(lines, "auto_block_within_minutes", 1, 525600, policy.windowSeconds / 60);
    return policy;
}

// The canonical text of an IP literal, or false.
bool CanonicalAddress(const char *ip, std::string *out) {
    if (ip == nullptr) {
        return false;
    }
    unsigned char bytes[sizeof(struct in6_addr)];
    char text[INET6_ADDRSTRLEN];
    if (inet_pton(AF_INET, ip, bytes) == 1) {
        inet_ntop(AF_INET, bytes, text, sizeof text);
    } else if (inet_pton(AF_INET6, ip, bytes) == 1) {
        const struct in6_addr *v6 = reinterpret_cast<const struct in6_addr *>(bytes);
        if (IN6_IS_ADDR_V4MAPPED(v6)) {
            inet_ntop(AF_INET, bytes + 12, text, sizeof text);
        } else {
            inet_ntop(AF_INET6, bytes, text, sizeof text);
        }
    } else {
        return false;
    }
    out->assign(text);
    return true;
}

bool IsServiceName(const char *service) {
    const size_t length = service != nullptr ? strlen(service) : 0;
    return length >= 1 && length <= 64 &&
           strspn(service,
                  "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz"
                  "0123456789_.-") == length;
}

int Fail(int code) {
    QUIB_SET_ERR(code);
    return -1;
}

// The address's failures within the window.
int CountRecent(sqlite3 *db, const std::string &addr, time_t since, long *count) {
    pf::Statement select;
    if (const int code =
            pf::Prepare(db, "SELECT count(*) FROM login_failure WHERE addr = ?1 AND at > ?2", &select)) {
        return code;
    }
    if (const int code = pf::BindText(select.get(), 1, addr)) {
        return code;
    }
    sqlite3_bind_int64(select.get(), 2, since);
    const int rc = sqlite3_step(select.get());
    if (rc != SQLITE_ROW) {
        return rc == SQLITE_DONE ? QUIB_ERR_FAILED : pf::CodeOfSqlite(rc);
    }
    *count = static_cast<long>(sqlite3_column_int64(select.get(), 0));
    return QUIB_ERR_NONE;
}

// Every address's failures outside (since, now]: old ones, and any from a clock that has since
// gone back.
int Purge(sqlite3 *db, time_t since, time_t now) {
    pf::Statement purge;
    if (const int code = pf::Prepare(db, "DELETE FROM login_failure WHERE at <= ?1 OR at > ?2", &purge)) {
        return code;
    }
    sqlite3_bind_int64(purge.get(), 1, since);
    sqlite3_bind_int64(purge.get(), 2, now);
    return pf::RunToEnd(purge.get());
}

// Opens the database; *missing when it does not exist and create is not set. readOnly: for a
// question only, without the schema (every request asks; a database without the table fails
// the question, as a damaged one would).
int Open(bool create, pf::SqliteDb *db, bool *missing, bool readOnly = false) {
    const int code = pf::OpenPrivateSqlite(QUIB_LOGIN_DIR, QUIB_AUTOBLOCK_DB_NAME, create,
                                           readOnly ? nullptr : kSchema, db);
    *missing = !create && code == QUIB_ERR_NO_SUCH_FILE;
    return *missing ? QUIB_ERR_NONE : code;
}

}  // namespace

int QuibCgiIsDeniedIP(const char *ip) {
    return Guarded(-1, [&] {
        std::string addr;
        if (!CanonicalAddress(ip, &addr)) {
            return Fail(QUIB_ERR_BAD_PARAMETER);
        }
        // Every request asks, and mostly nothing is recorded, or nothing recent: one lstat
        // answers that. A failure is stamped (at) before the write that records it, so a database
        // last written before the window began holds none within it; the second of margin covers
        // the file system's coarser clock. Only root may find the database, so others go the
        // whole way (and are refused).
        struct stat st;
        const bool found = lstat(QUIB_AUTOBLOCK_DB, &st) == 0;
        if (!found && errno == ENOENT && geteuid() == 0) {
            return 0;
        }
        const Policy policy = ReadPolicy();
        if (policy.attempts == 0) {
            return 0;
        }
        const time_t since = time(nullptr) - policy.windowSeconds;
        if (found && S_ISREG(st.st_mode) && st.st_mtime + 1 < since && geteuid() == 0) {
            return 0;
        }
        pf::SqliteDb db;
        bool missing = false;
        if (const int code = Open(false, &db, &missing, true)) {
            return Fail(code);
        }
        if (missing) {
            return 0;
        }
        long count = 0;
        if (const int code = CountRecent(db.get(), addr, since, &count)) {
            return Fail(code);
        }
        return count >= policy.attempts ? 1 : 0;
    });
}

int AutoBlockFailLoginSet(const char *ip, const char *service) {
    return Guarded(-1, [&] {
        std::string addr;
        if (!CanonicalAddress(ip, &addr) || !IsServiceName(service)) {
            return Fail(QUIB_ERR_BAD_PARAMETER);
        }
        const Policy policy = ReadPolicy();
        if (policy.attempts == 0) {
            return 0;
        }
        pf::SqliteDb db;
        bool missing = false;
        if (const int code = Open(true, &db, &missing)) {
            return Fail(code);
        }
        const time_t now = time(nullptr);
        pf::Transaction transaction(db.get());
        long count = 0;
        int code = transaction.Begin();
        if (code == QUIB_ERR_NONE) {
            code = Purge(db.get(), now - policy.windowSeconds, now);
        }
        if (code == QUIB_ERR_NONE) {
            code = CountRecent(db.get(), addr, now - policy.windowSeconds, &count);
        }
        if (code == QUIB_ERR_NONE && count < policy.attempts) {
            pf::Statement insert;
            code = pf::Prepare(db.get(), "INSERT INTO login_failure(addr, service, at) VALUES(?1, ?2, ?3)",
                               &insert);
            if (code == QUIB_ERR_NONE) {
                code = pf::BindText(insert.get(), 1, addr);
            }
            if (code == QUIB_ERR_NONE) {
                code = pf::BindText(insert.get(), 2, service);
            }
            if (code == QUIB_ERR_NONE) {
                sqlite3_bind_int64(insert.get(), 3, now);
                code = pf::RunToEnd(insert.get());
            }
        }
        if (code == QUIB_ERR_NONE) {
            code = transaction.Commit();
        }
        return code == QUIB_ERR_NONE ? 0 : Fail(code);
    });
}

int QUIBAutoBlockResetByIP(const char *ip) {
    return Guarded(-1, [&] {
        std::string addr;
        if (!CanonicalAddress(ip, &addr)) {
            return Fail(QUIB_ERR_BAD_PARAMETER);
        }
        pf::SqliteDb db;
        bool missing = false;
        if (const int code = Open(false, &db, &missing)) {
            return Fail(code);
        }
        if (missing) {
            return 0;
        }
        pf::Statement remove;
        int code = pf::Prepare(db.get(), "DELETE FROM login_failure WHERE addr = ?1", &remove);
        if (code == QUIB_ERR_NONE) {
            code = pf::BindText(remove.get(), 1, addr);
        }
        if (code == QUIB_ERR_NONE) {
            code = pf::RunToEnd(remove.get());
        }
        return code == QUIB_ERR_NONE ? 0 : Fail(code);
    });
}
