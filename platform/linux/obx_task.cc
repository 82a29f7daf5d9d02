// The task store in SQLite, one database per owner:
//
//   CREATE TABLE task(id TEXT PRIMARY KEY, pid INTEGER, pid_start INTEGER, created INTEGER,
//       finished INTEGER, props TEXT)
//
// pid_start is the process's start time (clock ticks since boot, /proc/<pid>/stat field 22):
// with the pid it names one process even after the pid is reused.
#include "obx_task.h"

#include <errno.h>
#include <fcntl.h>
#include <signal.h>
#include <unistd.h>

#include <string.h>

#include <optional>
#include <sstream>
#include <string>

#include <json/reader.h>
#include <json/writer.h>

#include "api_guard.h"
#include "locked_file.h"
#include "nss.h"
#include "private_dir.h"
#include "quib_paths.h"
#include "sqlite_db.h"
#include "text_util.h"

using norvo::platform::Guarded;
using norvo::platform::Statement;

namespace OBX {

class TaskStore {
public:
    norvo::platform::SqliteDb db;
};

namespace {

constexpr size_t kMaxIdLength = 256;

constexpr char kSchema[] =
    "CREATE TABLE IF NOT EXISTS task(id TEXT PRIMARY KEY NOT NULL, pid INTEGER NOT NULL, "
    "pid_start INTEGER NOT NULL, created INTEGER NOT NULL, finished INTEGER NOT NULL DEFAULT 0, "
    "props TEXT NOT NULL DEFAULT '{}')";

constexpr char kSelect[] = "SELECT pid, pid_start, created, finished, props FROM task WHERE id = ?1";

enum class ProcessState { kRunning, kGone, kUnknown };

// Whether /proc shows this process's pid namespace (a /proc mounted for another shows other
// processes under our pids).
bool ProcIsOurs() {
    char self[32] = "";
    const ssize_t size = readlink("/proc/self", self, sizeof self - 1);
    return size > 0 && std::to_string(getpid()) == std::string(self, static_cast<size_t>(size));
}

// The state of pid and its start time (0 when it can't be read). Existence is asked of the
// kernel (kill 0: EPERM is a process of someone else's); the start time and the zombie state
// come from /proc/<pid>/stat where /proc is ours. A zombie is gone: it does no more work.
ProcessState ReadProcess(pid_t pid, unsigned long long *start) {
    *start = 0;
    if (kill(pid, 0) != 0 && errno == ESRCH) {
        return ProcessState::kGone;
    }
    if (!ProcIsOurs()) {
        return ProcessState::kUnknown;
    }
    norvo::platform::FileDescriptor fd(
        open(("/proc/" + std::to_string(pid) + "/stat").c_str(), O_RDONLY | O_CLOEXEC));
    std::string text;
    const int err = fd.IsOpen() ? norvo::platform::ReadAll(fd.Get(), &text) : errno;
    if (err != 0) {
        return err == ENOENT || err == ESRCH ? ProcessState::kGone : ProcessState::kUnknown;
    }
    // The name in parentheses may hold anything, ")" and spaces included: fields follow the last ")".
    const size_t close = text.rfind(')');
    if (close == std::string::npos) {
        return ProcessState::kUnknown;
    }
    std::istringstream fields(text.substr(close + 1));
    std::string state, skip;
    fields >> state;
    for (int field = 4; field < 22 && fields >> skip; ++field) {
    }
    if (!(fields >> *start)) {
        *start = 0;
        return ProcessState::kUnknown;
    }
    return state == "Z" || state == "X" ? ProcessState::kGone : ProcessState::kRunning;
}

std::string ToText(const Json::Value &value) {
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "";
    return Json::writeString(builder, value);
}

// Properties as stored; damaged text reads as none.
Json::Value FromText(const char *text, int size) {
    Json::Value value;
    std::string errors;
    const std::unique_ptr<Json::CharReader> reader(Json::CharReaderBuilder().newCharReader());
    if (text == nullptr || !reader->parse(text, text + size, &value, &errors) || !value.isObject()) {
        return Json::Value(Json::objectValue);
    }
    return value;
}

bool IsGoodId(const char *id) {
    return id != nullptr && id[0] != '\0' && strnlen(id, kMaxIdLength + 1) <= kMaxIdLength;
}

bool Fail(int code) {
    QUIB_SET_ERR(code);
    return false;
}

// Opens the owner's store, creating directory and database when the caller is root.
int OpenStore(const char *owner, TaskStore *store) {
    if (!norvo::platform::IsAcceptableName(owner) || strchr(owner, '/') != nullptr ||
        strcmp(owner, ".") == 0 || strcmp(owner, "..") == 0) {
        return QUIB_ERR_BAD_PARAMETER;
    }
    norvo::platform::NssUser user;
    int err = 0;
    switch (norvo::platform::FindUserByName(owner, &user, &err)) {
        case norvo::platform::NssStatus::kFound:
            break;
        case norvo::platform::NssStatus::kNotFound:
            return QUIB_ERR_NO_SUCH_USER;
        case norvo::platform::NssStatus::kFailed:
            return norvo::platform::NssFailureCode(err);
    }
    // NSS may spell the name otherwise (case); the directory is named as NSS spells it.
    const bool root = geteuid() == 0;
    norvo::platform::FileDescriptor top, dir;
    int code = norvo::platform::OpenPassageDir(QUIB_TASK_DIR, root, &top);
    if (code == QUIB_ERR_NONE) {
        code = norvo::platform::OpenOwnerDir(top.Get(), user.name, user.uid, user.gid, root, &dir);
    }
    if (code == QUIB_ERR_NONE) {
        code = norvo::platform::CheckOwnerDatabase(dir.Get(), QUIB_TASK_DB_NAME, user.uid, user.gid, root);
    }
    if (code != QUIB_ERR_NONE) {
        return code;
    }
    return norvo::platform::OpenSqlite(std::string(QUIB_TASK_DIR "/") + user.name + "/" QUIB_TASK_DB_NAME,
                                       kSchema, &store->db);
}

}  // namespace

struct Task::Impl {
    std::shared_ptr<TaskStore> store;
    std::string id;
    pid_t pid = 0;
    unsigned long long pidStart = 0;
    time_t created = 0;
    bool finished = false;
    Json::Value props{Json::objectValue};
    std::optional<norvo::platform::Transaction> update;

    // Reads the record into the fields. 0, QUIB_ERR_NO_SUCH_FILE when gone, or a code.
    int Read() {
        sqlite3 *db = store->db.get();
        Statement select;
        if (const int code = norvo::platform::Prepare(db, kSelect, &select)) {
            return code;
        }
        if (const int code = norvo::platform::BindText(select.get(), 1, id)) {
            return code;
        }
        const int rc = sqlite3_step(select.get());
        if (rc == SQLITE_DONE) {
            return QUIB_ERR_NO_SUCH_FILE;
        }
        if (rc != SQLITE_ROW) {
            return norvo::platform::CodeOfSqlite(rc);
        }
        pid = static_cast<pid_t>(sqlite3_column_int64(select.get(), 0));
        pidStart = static_cast<unsigned long long>(sqlite3_column_int64(select.get(), 1));
        created = static_cast<time_t>(sqlite3_column_int64(select.get(), 2));
        finished = sqlite3_column_int(select.get(), 3) != 0;
        props = FromText(reinterpret_cast<const char *>(sqlite3_column_text(select.get(), 4)),
                         sqlite3_column_bytes(select.get(), 4));
        return QUIB_ERR_NONE;
    }

    // Runs one UPDATE or DELETE of this record (?1 the id, ?2 the value when given) in its own
    // transaction. 0, QUIB_ERR_NO_SUCH_FILE when the record is gone, or a code.
    int Write(const char *sql, std::optional<long long> value) {
        sqlite3 *db = store->db.get();
        norvo::platform::Transaction transaction(db);
        Statement statement;
        int code = transaction.Begin();
        code = code ? code : norvo::platform::Prepare(db, sql, &statement);
        code = code ? code : norvo::platform::BindText(statement.get(), 1, id);
        if (code == QUIB_ERR_NONE && value) {
            sqlite3_bind_int64(statement.get(), 2, *value);
        }
        code = code ? code : norvo::platform::RunToEnd(statement.get());
        if (code == QUIB_ERR_NONE && sqlite3_changes(db) == 0) {
            code = QUIB_ERR_NO_SUCH_FILE;
        }
        statement.reset();
        return code ? code : transaction.Commit();
    }
};

Task::Task(std::unique_ptr<Impl> impl) : impl_(std::move(impl)) {}

Task::~Task() = default;

bool Task::reload() {
    return Guarded(false, [&] {
        Impl fresh;
        fresh.store = impl_->store;
        fresh.id = impl_->id;
        if (const int code = fresh.Read()) {
            return Fail(code);
        }
        impl_->pid = fresh.pid;
        impl_->pidStart = fresh.pidStart;
        impl_->created = fresh.created;
        impl_->finished = fresh.finished;
        impl_->props = std::move(fresh.props);
        return true;
    });
}

Json::Value Task::getProperty(const char *key) const {
    return Guarded(Json::Value(),
                   [&] { return key == nullptr ? Json::Value() : impl_->props.get(key, Json::Value()); });
}

bool Task::beginUpdate() {
    return Guarded(false, [&] {
        if (impl_->update) {
            return Fail(QUIB_ERR_BAD_PARAMETER);
        }
        impl_->update.emplace(impl_->store->db.get());
        int code = impl_->update->Begin();
        code = code ? code : impl_->Read();
        if (code != QUIB_ERR_NONE) {
            impl_->update.reset();
            return Fail(code);
        }
        return true;
    });
}

bool Task::setProperty(const char *key, const Json::Value &value) {
    return Guarded(false, [&] {
        if (!impl_->update || key == nullptr) {
            return Fail(QUIB_ERR_BAD_PARAMETER);
        }
        impl_->props[key] = value;
        return true;
    });
}

bool Task::endUpdate() {
    return Guarded(false, [&] {
        if (!impl_->update) {
            return Fail(QUIB_ERR_BAD_PARAMETER);
        }
        // The update ends here whatever happens; what was not committed is rolled back.
        const norvo::platform::ScopeExit end([this] { impl_->update.reset(); });
        sqlite3 *db = impl_->store->db.get();
        Statement write;
        int code = norvo::platform::Prepare(db, "UPDATE task SET props = ?2 WHERE id = ?1", &write);
        code = code ? code : norvo::platform::BindText(write.get(), 1, impl_->id);
        code = code ? code : norvo::platform::BindText(write.get(), 2, ToText(impl_->props));
        code = code ? code : norvo::platform::RunToEnd(write.get());
        write.reset();
        code = code ? code : impl_->update->Commit();
        return code ? Fail(code) : true;
    });
}

bool Task::isFinished() const {
    return Guarded(false, [&] {
        if (impl_->finished) {
            return true;
        }
        unsigned long long start = 0;
        switch (ReadProcess(impl_->pid, &start)) {
            case ProcessState::kGone:
                return true;
            case ProcessState::kRunning:
                return impl_->pidStart != 0 && start != impl_->pidStart;  // the pid names another process
            case ProcessState::kUnknown:
                break;
        }
        return false;
    });
}

time_t Task::getCreateTime() const {
    return impl_->created;
}

bool Task::remove() {
    return Guarded(false, [&] {
        const int code = impl_->Write("DELETE FROM task WHERE id = ?1", std::nullopt);
        return code == QUIB_ERR_NONE || code == QUIB_ERR_NO_SUCH_FILE ? true : Fail(code);
    });
}

const char *Task::getId() const {
    return impl_->id.c_str();
}

pid_t Task::getPid() const {
    return impl_->pid;
}

bool Task::setFinished() {
    return Guarded(false, [&] {
        if (const int code = impl_->Write("UPDATE task SET finished = 1 WHERE id = ?1", std::nullopt)) {
            return Fail(code);
        }
        impl_->finished = true;
        return true;
    });
}

bool Task::setCreateTime(time_t created) {
    return Guarded(false, [&] {
        if (const int code = impl_->Write("UPDATE task SET created = ?2 WHERE id = ?1", created)) {
            return Fail(code);
        }
        impl_->created = created;
        return true;
    });
}

TaskMgr::TaskMgr(const char *owner) {
    Guarded(false, [&] {
        auto store = std::make_shared<TaskStore>();
        if (const int code = OpenStore(owner, store.get())) {
            return Fail(code);
        }
        store_ = std::move(store);
        return true;
    });
}

TaskMgr::~TaskMgr() = default;

bool TaskMgr::isOpen() const {
    return store_ != nullptr;
}

bool TaskMgr::hasTask(const char *id) {
    return Guarded(false, [&] {
        if (!store_ || id == nullptr) {
            return Fail(store_ ? QUIB_ERR_BAD_PARAMETER : QUIB_ERR_OPEN_FAILED);
        }
        Statement select;
        int code = norvo::platform::Prepare(store_->db.get(), "SELECT 1 FROM task WHERE id = ?1", &select);
        code = code ? code : norvo::platform::BindText(select.get(), 1, id);
        if (code != QUIB_ERR_NONE) {
            return Fail(code);
        }
        const int rc = sqlite3_step(select.get());
        return rc == SQLITE_ROW ? true : rc == SQLITE_DONE ? false : Fail(norvo::platform::CodeOfSqlite(rc));
    });
}

Task *TaskMgr::getTask(const char *id) {
    return Guarded<Task *>(nullptr, [&]() -> Task * {
        if (!store_ || id == nullptr) {
            Fail(store_ ? QUIB_ERR_BAD_PARAMETER : QUIB_ERR_OPEN_FAILED);
            return nullptr;
        }
        auto impl = std::make_unique<Task::Impl>();
        impl->store = store_;
        impl->id = id;
        if (const int code = impl->Read()) {
            Fail(code);
            return nullptr;
        }
        return new Task(std::move(impl));
    });
}

Json::Value TaskMgr::getAllTaskId(const char *prefix) {
    return Guarded(Json::Value(Json::arrayValue), [&] {
        Json::Value ids(Json::arrayValue);
        if (!store_ || prefix == nullptr) {
            Fail(store_ ? QUIB_ERR_BAD_PARAMETER : QUIB_ERR_OPEN_FAILED);
            return ids;
        }
        // Bytes compared as bytes: LIKE and GLOB would read "_", "%", "*" as patterns.
        Statement select;
        int code = norvo::platform::Prepare(store_->db.get(),
                                            "SELECT id FROM task WHERE substr(CAST(id AS BLOB), 1, ?2) = "
                                            "CAST(?1 AS BLOB) ORDER BY rowid",
                                            &select);
        code = code ? code : norvo::platform::BindText(select.get(), 1, prefix);
        if (code != QUIB_ERR_NONE) {
            Fail(code);
            return ids;
        }
        sqlite3_bind_int64(select.get(), 2, static_cast<sqlite3_int64>(strlen(prefix)));
        int rc;
        while ((rc = sqlite3_step(select.get())) == SQLITE_ROW) {
            ids.append(std::string(reinterpret_cast<const char *>(sqlite3_column_text(select.get(), 0)),
                                   static_cast<size_t>(sqlite3_column_bytes(select.get(), 0))));
        }
        if (rc != SQLITE_DONE) {
            Fail(norvo::platform::CodeOfSqlite(rc));
            return Json::Value(Json::arrayValue);
        }
        return ids;
    });
}

Task *TaskMgr::createTask(const char *id, pid_t pid) {
    return Guarded<Task *>(nullptr, [&]() -> Task * {
        if (!store_) {
            Fail(QUIB_ERR_OPEN_FAILED);
            return nullptr;
        }
        unsigned long long start = 0;
        if (!IsGoodId(id) || pid < 1) {
            Fail(QUIB_ERR_BAD_PARAMETER);
            return nullptr;
        }
        if (ReadProcess(pid, &start) == ProcessState::kGone) {
            Fail(QUIB_ERR_NO_SUCH_FILE);
            return nullptr;
        }
        sqlite3 *db = store_->db.get();
        Statement insert;
        int code = norvo::platform::Prepare(
            db, "INSERT INTO task(id, pid, pid_start, created) VALUES(?1, ?2, ?3, ?4) ON CONFLICT DO NOTHING",
            &insert);
        code = code ? code : norvo::platform::BindText(insert.get(), 1, id);
        if (code == QUIB_ERR_NONE) {
            sqlite3_bind_int64(insert.get(), 2, pid);
            sqlite3_bind_int64(insert.get(), 3, static_cast<sqlite3_int64>(start));
            sqlite3_bind_int64(insert.get(), 4, time(nullptr));
        }
        code = code ? code : norvo::platform::RunToEnd(insert.get());
        if (code == QUIB_ERR_NONE && sqlite3_changes(db) == 0) {
            code = QUIB_ERR_BAD_PARAMETER;  // the id is taken
        }
        if (code != QUIB_ERR_NONE) {
            Fail(code);
            return nullptr;
        }
        return getTask(id);
    });
}

}  // namespace OBX
