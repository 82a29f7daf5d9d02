// The task store: records of long-running background tasks, shared between the process doing
// the work and the request processes that poll it. Each record has an identifier, JSON
// properties, a finished flag, a creation time and the process doing the work.
//
// Failures set the platform error slot; no exception leaves a call.
#pragma once
#include <sys/types.h>
#include <time.h>

#include <memory>

#include <json/value.h>

#include "platform_export.h"

namespace OBX {

class TaskStore;

// One task record as last read. Made by TaskMgr; the caller deletes it.
class QUIB_API Task {
public:
    ~Task();  // an update still open is rolled back
    Task(const Task &) = delete;
    Task &operator=(const Task &) = delete;

    // Re-reads the record. false when it can't be read or is gone (the old state is kept).
    bool reload();
    // The property as last read; null when absent (or key is null).
    Json::Value getProperty(const char *key) const;
    // Opens an update: takes the store's write lock (waiting up to 5 s for another writer) and
    // re-reads the properties, so that other writers' keys survive. false when it can't.
    bool beginUpdate();
    // Sets a property inside an update. false outside one or for a null key.
    bool setProperty(const char *key, const Json::Value &value);
    // Writes the properties and ends the update. false when nothing was written (no update
    // open, the record is gone, the write failed); the record is then unchanged.
    bool endUpdate();
    // true when the task was marked finished, or when the process recorded for it is gone (a
    // worker that died must not keep its record forever). See platform/README.md.
    bool isFinished() const;
    // Creation time, seconds since the epoch.
    time_t getCreateTime() const;
    // Deletes the record. false when it can't (a record already gone is not a failure).
    bool remove();

    // ours: the identifier, the pid of the process doing the work.
    const char *getId() const;
    pid_t getPid() const;
    // ours: marks the task finished (the worker's last word).
    bool setFinished();
    // ours: sets the creation time in the store (tests age records with it).
    bool setCreateTime(time_t created);

private:
    friend class TaskMgr;
    struct Impl;
    explicit Task(std::unique_ptr<Impl> impl);
    std::unique_ptr<Impl> impl_;
};

// The tasks of one owner (a user name), in a database only the owner and root can reach.
// Made by root, the manager creates the owner's directory and database when missing; made by
// the owner, it opens them if they are there. Another caller, an unknown owner or a name that
// can't be one directory (empty, "/", ".", ".."...) gives a manager that knows no task, with
// the error slot set.
class QUIB_API TaskMgr {
public:
    explicit TaskMgr(const char *owner);
    ~TaskMgr();
    TaskMgr(const TaskMgr &) = delete;
    TaskMgr &operator=(const TaskMgr &) = delete;

    // Whether the store holds the task. false for a null id or a store that could not be opened.
    bool hasTask(const char *id);
    // A new Task read from the store, or null (missing: slot 0x0600; or failure).
    Task *getTask(const char *id);
    // The identifiers that begin with prefix, bytes compared exactly ("_" and "%" are
    // themselves), in creation order; an empty array on failure.
    Json::Value getAllTaskId(const char *prefix);

    // ours: whether the owner's store is open.
    bool isOpen() const;
    // ours: creates the record of id (1 to 256 bytes, not yet in the store) for the running
    // process pid, unfinished, created now, properties {}. A new Task, or null: 0x0D00 for a
    // bad id, an id already there or a pid below 1, 0x0600 when pid is not running.
    Task *createTask(const char *id, pid_t pid);

private:
    std::shared_ptr<TaskStore> store_;
};

}  // namespace OBX
