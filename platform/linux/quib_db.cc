// QUIBDB*: read-only SQLite databases of the appliance, rows fetched by column name.
#include <errno.h>
#include <fcntl.h>
#include <limits.h>
#include <string.h>
#include <strings.h>
#include <sys/stat.h>
#include <unistd.h>

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "api_guard.h"
#include "locked_file.h"
#include "quib_db.h"
#include "sqlite_db.h"

struct _tag_QUIBDB_ {
    norvo::platform::SqliteDb db;
    std::string error;
};

struct _tag_QUIBDB_RESULT_ {
    std::vector<std::string> names;
    // One entry per row and column; nullopt for NULL.
    std::vector<std::vector<std::optional<std::string>>> rows;
    int next = 0;
};

namespace norvo::platform {
namespace {

constexpr size_t kMaxResultText = 64u << 20;

// Opens path one component at a time from "/" with O_NOFOLLOW: 0 and the final file's
// identity, or the errno (ELOOP for a link anywhere, EINVAL for a final non-regular file).
int WalkWithoutLinks(const char *path, struct stat *file) {
    if (path[0] != '/') {
        return EINVAL;
    }
    FileDescriptor dir(open("/", O_PATH | O_DIRECTORY | O_CLOEXEC));
    if (!dir.IsOpen()) {
        return errno;
    }
    std::string rest(path + 1);
    for (;;) {
        const size_t slash = rest.find('/');
        const std::string name = rest.substr(0, slash);
        if (name.empty() || name == "." || name == "..") {
            return EINVAL;
        }
        const bool last = slash == std::string::npos;
        FileDescriptor next(
            openat(dir.Get(), name.c_str(), O_PATH | O_NOFOLLOW | O_CLOEXEC | (last ? 0 : O_DIRECTORY)));
        if (!next.IsOpen()) {
            return errno == ENOTDIR ? ELOOP : errno;  // a link to a folder is refused as a link
        }
        if (last) {
            if (fstat(next.Get(), file) != 0) {
                return errno;
            }
            return S_ISLNK(file->st_mode) ? ELOOP : (S_ISREG(file->st_mode) ? 0 : EINVAL);
        }
        dir = std::move(next);
        rest.erase(0, slash + 1);
    }
}

void SetWalkError(int err) {
    QUIB_SET_ERR(err == ENOENT                   ? QUIB_ERR_NO_SUCH_FILE
                 : err == ELOOP || err == EINVAL ? QUIB_ERR_ACCESS_DENIED
                                                 : VLIBCErrFromErrno(err));
}

bool HasMoreStatements(const char *tail) {
    return tail != nullptr && tail[strspn(tail, " \t\r\n;")] != '\0';
}

}  // namespace
}  // namespace norvo::platform

namespace np = norvo::platform;

extern "C" {

PQUIBDB QUIBDBConnect(const char *host, const char *user, const char *password, const char *path) {
    if (host != nullptr || user != nullptr || password != nullptr || path == nullptr || path[0] == '\0') {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return nullptr;
    }
    if (strnlen(path, PATH_MAX) >= PATH_MAX) {
        QUIB_SET_ERR(QUIB_ERR_NAME_TOO_LONG);
        return nullptr;
    }
    return np::Guarded(static_cast<PQUIBDB>(nullptr), [&]() -> PQUIBDB {
        struct stat before;
        if (int err = np::WalkWithoutLinks(path, &before); err != 0) {
            np::SetWalkError(err);
            return nullptr;
        }
        auto db = std::make_unique<QUIBDB>();
        sqlite3 *raw = nullptr;
        const int rc = sqlite3_open_v2(path, &raw, SQLITE_OPEN_READONLY | SQLITE_OPEN_NOFOLLOW, nullptr);
        db->db.reset(raw);
        if (rc != SQLITE_OK) {
            QUIB_SET_ERR(np::CodeOfSqlite(rc));
            return nullptr;
        }
        // SQLite opened the path again: it must still be the file walked, reached the same way.
        struct stat after;
        if (np::WalkWithoutLinks(path, &after) != 0 || after.st_dev != before.st_dev ||
            after.st_ino != before.st_ino) {
            QUIB_SET_ERR(QUIB_ERR_ACCESS_DENIED);
            return nullptr;
        }
        sqlite3_busy_timeout(raw, np::kBusyTimeoutMs);
        return db.release();
    });
}

void QUIBDBClose(PQUIBDB db) {
    delete db;
}

int QUIBDBExecute(PQUIBDB db, const char *sql, PQUIBDB_RESULT *result) {
    if (result != nullptr) {
        *result = nullptr;
    }
    if (db == nullptr || sql == nullptr || result == nullptr) {
        QUIB_SET_ERR(QUIB_ERR_BAD_PARAMETER);
        return -1;
    }
    return np::Guarded(-1, [&] {
        auto fail = [&](int code, const char *message) {
            db->error = message;
            QUIB_SET_ERR(code);
            return -1;
        };
        sqlite3_stmt *raw = nullptr;
        const char *tail = nullptr;
        int rc = sqlite3_prepare_v2(db->db.get(), sql, -1, &raw, &tail);
        np::Statement statement(raw);
        if (rc != SQLITE_OK) {
            return fail(np::CodeOfSqlite(rc), sqlite3_errmsg(db->db.get()));
        }
        if (statement == nullptr || np::HasMoreStatements(tail)) {
            return fail(QUIB_ERR_BAD_PARAMETER, "one statement expected");
        }
        auto out = std::make_unique<QUIBDB_RESULT>();
        const int columns = sqlite3_column_count(raw);
        for (int i = 0; i < columns; ++i) {
            const char *name = sqlite3_column_name(raw, i);
            out->names.emplace_back(name != nullptr ? name : "");
        }
        size_t total = 0;
        while ((rc = sqlite3_step(raw)) == SQLITE_ROW) {
            std::vector<std::optional<std::string>> row;
            for (int i = 0; i < columns; ++i) {
                const auto *text = reinterpret_cast<const char *>(sqlite3_column_text(raw, i));
                if (text == nullptr) {
                    row.emplace_back();
                    continue;
                }
                const size_t len = static_cast<size_t>(sqlite3_column_bytes(raw, i));
                total += len;
                if (total > np::kMaxResultText) {
                    return fail(QUIB_ERR_NO_MEMORY, "result too large");
                }
                row.emplace_back(std::string(text, len));
            }
            out->rows.push_back(std::move(row));
        }
        if (rc != SQLITE_DONE) {
            return fail(np::CodeOfSqlite(rc), sqlite3_errmsg(db->db.get()));
        }
        db->error.clear();
        *result = out.release();
        return 0;
    });
}

int QUIBDBFetchRow(PQUIBDB_RESULT result, QUIBDB_ROW *row) {
    if (result == nullptr || row == nullptr || result->next >= static_cast<int>(result->rows.size())) {
        return -1;
    }
    *row = result->next++;
    return 0;
}

const char *QUIBDBFetchField(PQUIBDB_RESULT result, QUIBDB_ROW row, const char *name) {
    if (result == nullptr || name == nullptr || row < 0 || row >= static_cast<int>(result->rows.size())) {
        return nullptr;
    }
    for (size_t i = 0; i < result->names.size(); ++i) {
        if (strcasecmp(result->names[i].c_str(), name) == 0) {
            const auto &value = result->rows[static_cast<size_t>(row)][i];
            return value ? value->c_str() : nullptr;
        }
    }
    return nullptr;
}

void QUIBDBFreeResult(PQUIBDB_RESULT result) {
    delete result;
}

const char *QUIBDBErrorGet(PQUIBDB db) {
    return db == nullptr ? "" : db->error.c_str();
}

}  // extern "C"
