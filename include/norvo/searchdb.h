// The result database of one search: a task with an id of its own, whose hits live in a file
// under "<volume>/@tmp/norvo/FBSearch/<user>/<id>", so that later requests can page, sort and
// filter them, and file operations made meanwhile can be applied to them.
//
// Task objects are plain handles: each call opens and closes the database through the file
// index (fileidx.h). Every operation reports failure by returning false and logging one line;
// none throws.
//
// Untrusted input: the volume must be a volume's own folder ("/volume1", never a path below or
// beside it), the task id must be what getUniqueID makes (upper-case hexadecimal, 2 to 16
// digits, no leading zero) and the user a single path component without control characters.
// Anything else is refused before it reaches a path (the platform error 0x0D00, the line
// "Bad Parameter") and nothing on disk is touched.
#pragma once
#include <string>

#include "fileidx.h"
#include "norvo/export.h"
#include "quib_stat.h"

// Declared with its values in norvoenum.h; 0 directories, 1 files, 2 both.
enum _tag_dir_entry_type_ : int;

class NORVO_API NvoSearchDBTask {
public:
    // Keeps user; takes taskId, or a new id from getUniqueID when it is null; creates the
    // task's folders (createDBTaskDir) when the task's file does not exist yet. The database
    // file itself is made by the search (FILEIDXDBCreate on getDBTaskFilePath()). With a bad
    // volume, user or id the object is inert: its file path is empty and every operation fails.
    NvoSearchDBTask(const char *volume, const char *user, const char *taskId);

    const std::string &getDBTaskId() const;
    const std::string &getDBTaskFilePath() const;

    // "<volume>/@tmp/norvo/FBSearch/<user>", cut at 4,095 bytes. Formatting only.
    static std::string getDBTaskDir(const char *volume, const char *user);
    // "<task folder>/<taskId>". Formatting only.
    static std::string getDBTaskFilePath(const char *volume, const char *user, const char *taskId);
    // Whether the user's task folder, or the task's database file, exists; false for a bad
    // volume, user or id.
    static bool checkDBTaskDirExists(const char *volume, const char *user);
    static bool checkDBTaskExists(const char *volume, const char *user, const char *taskId);
    // 32 random bits from /dev/urandom, else /dev/random, else random() seeded with the time.
    static int GetRandom();
    // "%X%X" of the time and a random number, drawn again while a task of that id exists. The
    // random number is mixed with this process's id and a per-process count, so two draws
    // differ even when no random device can be read. Empty for a bad volume or user.
    static std::string getUniqueID(const char *volume, const char *user);

    // Makes "<volume>/@tmp" and "<volume>/@tmp/norvo" (NvoCreateTmpDir), the search root
    // (root's, 01777: everyone may add a folder, nobody may take another's) and the user's task
    // folder (the user's own, 0700), as root when the real user is root. No link is followed:
    // the folders are reached through descriptors, and an existing search root must be root's
    // and a task folder the user's, or nothing is created. The effective user is given back,
    // except when the temporary folders could not be made. false with the platform error set:
    // 0x2500 disk full, 0x0D00 bad argument, 0x8100 anything else.
    bool createDBTaskDir(const char *volume, const char *user, const char *taskId);

    // Stores the hit of realPath ("/volume1/photo/2013/a.jpg": volume and share folder, then
    // the path below the share) under the key of path in share ("homes" for a home).
    bool insertFile(std::string share, std::string path, std::string realShare, std::string realPath,
                    _tag_QUIBSTAT_ &st);
    // Removes the hit of path and every hit below it (never a sibling that merely starts with
    // its name).
    bool delRecs(std::string share, std::string path);
    // Rewrites owner, group, permissions and times of one hit.
    bool updatePermRecs(std::string share, std::string path, const char *userName, const char *groupName,
                        _tag_QUIBSTAT_ &st);
    // Moves one hit to newPath in newShare.
    bool updateFile(std::string share, std::string path, std::string newShare, std::string newPath,
                    _tag_QUIBSTAT_ &st);
    // Moves every hit below the folder path to the folder newPath; a hit whose file can't be
    // read at its new place is left as it was (and logged).
    bool updateFileInFolder(std::string share, std::string path, std::string newShare, std::string newPath);
    // Calls callback for at most limit hits from offset on, sorted by sortBy ("size", "mtime",
    // "crtime", "ctime", "atime", "user", "group", "posix", "type", "ppath" for share and
    // parent folder, anything else the name; only when sortDesc is given too), of type (null
    // or 2 any, 1 files, else folders) and whose name contains pattern (a LIKE pattern; null
    // or empty: any). *total receives the number of matching hits. false at once for a limit
    // of 0 or a null total (*total untouched).
    bool queryResult(unsigned long offset, unsigned long limit, const char *sortBy, const bool *sortDesc,
                     const _tag_dir_entry_type_ *type, const char *pattern, FILEIDX_SELECT_CB callback,
                     void *arg, unsigned long long *total) const;
    // Deletes the database file; true when unlink succeeds.
    bool remove();

private:
    std::string user;
    std::string taskId;
    std::string dbPath;
};

class NORVO_API NvoSearchDBTaskMgr {
public:
    explicit NvoSearchDBTaskMgr(const char *user);
    bool hasDBTask(const char *volume, const char *taskId) const;
    // A new task object for an existing task (the caller deletes it); null when there is none.
    NvoSearchDBTask *getDBTask(const char *volume, const char *taskId) const;
    // A new task object (the caller deletes it); a null id makes a new one. Null for a bad
    // volume or id.
    NvoSearchDBTask *createDBTask(const char *volume, const char *taskId);
    std::string getDBTaskDir(const char *volume) const;

private:
    std::string user;
};
