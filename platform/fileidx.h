// The file index: per-search result databases (SQLite files of hits), queried with chains of
// condition records rather than SQL text, and the volume index a search may use instead of a
// walk.
//
// How a condition chain reads (the where argument of every call below). The records reached
// from a record R through orNext (R, R->orNext, R->orNext->orNext, ...) are R's alternatives:
// at least one of them must hold. The andNext of any of these alternatives leads to a further
// chain that must hold as well, whichever alternative held. So
//   A(orNext B, andNext X), B(orNext C), C          reads (A or B or C) and X
//   U(orNext N), N(andNext X)                       reads (U or N) and X
//   P(andNext Q), Q(andNext X)                      reads P and Q and X
// which is what the search conditions build: the alternatives of a name, the id-or-name of an
// owner, the two bounds of a size, and their conjunction. A null chain holds for every hit. A
// chain that reaches a record twice (a cycle or a shared record), holds more than
// FILEIDX_MAX_CONDS records, or has an unknown type, op or malformed number is refused (0x0D00).
//
// Terms: text columns compare bytes for FI_OP_EQ/LT/GT/GE; numeric columns compare the operand
// as a signed 64-bit number (operands are "%llu" of the two's complement, so a negative time
// reads back negative). FI_OP_LIKE is VLIBCUnicodeUTF8LikeMatch(operand, column, '\\'), never
// SQLite's LIKE. FI_OP_PATH_LIKE matches a path by components: the operand is split at "/",
// a component that is exactly "*" stands for one or more components, every other component
// must equal the path's byte for byte, "\" making the next byte literal (so "\*" is a folder
// named "*"); FI_OP_PATH_NOT_LIKE is its negation. So "a/*" is everything below a, but not a
// itself nor its sibling ab.
#pragma once
#include <stddef.h>

#include "platform_export.h"

// The file index's condition record. The layout is the wire format the platform's file index
// exchanges, so fields, order and widths are fixed: 4,112 bytes with 4-byte pointers (the
// appliance), 4,120 on x86-64.
enum __tag_FI_SQL_COND_TYPE : unsigned int {
    FI_COND_NAME = 0,         // base name
    FI_COND_REAL_PATH = 2,    // real path of the file's share
    FI_COND_PARENT_PATH = 3,  // share-relative path of the parent folder
    FI_COND_SHARE = 4,        // share name
    FI_COND_PATH = 5,         // path below the share, without a leading slash
    FI_COND_IS_DIR = 6,       // "1" directory, "0" anything else
    FI_COND_SIZE = 7,
    FI_COND_TYPE = 8,  // the file type used for sorting by "type"
    FI_COND_CRTIME = 9,
    FI_COND_CTIME = 10,
    FI_COND_ATIME = 11,
    FI_COND_MTIME = 12,
    FI_COND_POSIX = 13,  // permission text
    FI_COND_MODE = 14,
    FI_COND_UID = 15,
    FI_COND_GID = 16,
    FI_COND_USER_NAME = 17,
    FI_COND_GROUP_NAME = 18,
};

enum __tag_FI_SQL_COND_OP : unsigned int {
    FI_OP_EQ = 0,
    FI_OP_LT = 2,
    FI_OP_GT = 4,
    FI_OP_GE = 5,
    FI_OP_LIKE = 6,           // "*" any run, "?" one character, "\" escapes
    FI_OP_PATH_LIKE = 8,      // a path against a pattern whose "*" stands for any rest
    FI_OP_PATH_NOT_LIKE = 9,  // the negation of FI_OP_PATH_LIKE
};

struct __tag_FI_SQL_COND {
    __tag_FI_SQL_COND *andNext;  // must also hold; null at the end
    __tag_FI_SQL_COND *orNext;   // may hold instead; null at the end
    __tag_FI_SQL_COND_TYPE type;
    __tag_FI_SQL_COND_OP op;
    char value[4096];  // the operand as NUL-terminated text: a pattern, a name or a decimal
};

// The most records a condition chain or a set list may hold.
#define FILEIDX_MAX_CONDS 1024

// One stored hit. Text fields are NUL-terminated; a longer value read back is cut to the
// field. Times are seconds since the epoch.
typedef struct __tag_FI_FILE_INFO_DATA {
    char name[256];         // FI_COND_NAME: the base name
    char realPath[4096];    // FI_COND_REAL_PATH: the real path of the share (volume and folder)
    char parentPath[4096];  // FI_COND_PARENT_PATH: share-relative, "" at the top of the share
    char share[256];        // FI_COND_SHARE
    char path[4096];        // FI_COND_PATH: below the share, no leading slash; with share the key
    int isDir;              // FI_COND_IS_DIR: 1 directory, 0 anything else
    long long size;         // FI_COND_SIZE
    char type[64];          // FI_COND_TYPE: what sorting by type orders by; the caller chooses
    long long crtime;       // FI_COND_CRTIME
    long long ctime;        // FI_COND_CTIME
    long long atime;        // FI_COND_ATIME
    long long mtime;        // FI_COND_MTIME
    char posix[16];         // FI_COND_POSIX: the permission text
    unsigned int mode;      // FI_COND_MODE
    unsigned int uid;       // FI_COND_UID
    unsigned int gid;       // FI_COND_GID
    char userName[256];     // FI_COND_USER_NAME
    char groupName[256];    // FI_COND_GROUP_NAME
} FI_FILE_INFO_DATA;

// One sort key: a column and its direction.
typedef struct __tag_FI_SORT_KEY {
    __tag_FI_SQL_COND_TYPE type;
    int desc;  // non-zero: descending
} FI_SORT_KEY;

#define FI_MAX_SORT_KEYS 4

// A query: which hits, in which order. Text columns sort by VLIBCUnicodeUTF8StrCaseCmp,
// numbers by value; hits equal in every key keep the order in which they were stored, so
// pages of the same query never repeat or skip a hit.
typedef struct __tag_FI_QUERY {
    __tag_FI_SQL_COND *where;  // null: every hit
    unsigned int sortCount;    // 0 to FI_MAX_SORT_KEYS; 0 is storage order
    FI_SORT_KEY sort[FI_MAX_SORT_KEYS];
} FI_QUERY;

// Called once per hit; the record is valid during the call only. Returning 0 ends the select
// early (not a failure).
typedef int (*FILEIDX_SELECT_CB)(__tag_FI_FILE_INFO_DATA *record, void *arg);

// The row filter of FILEIDXResultGetAndTableGen: dir is the real path of the row's folder,
// name its base name; non-zero keeps the row.
typedef int (*FILEIDX_ROW_FILTER)(const char *dir, const char *name, void *arg);

// Where FILEIDXResultGetAndTableGen writes and what its filter is given.
typedef struct __tag_FI_TABLE_GEN_CONTEXT {
    const char *outputDbPath;  // a database made by FILEIDXDBCreate
    void *filterArg;           // handed to the filter unchanged
    int filesAndFolders;       // non-zero: rows of regular files and folders only
} FI_TABLE_GEN_CONTEXT;

// An output database open for a run of inserts (FILEIDXOutputDBOpen); one thread at a time.
typedef struct __tag_FI_OUTPUT_DB FI_OUTPUT_DB;

QUIB_BEGIN_C

// All calls: 0 (or the count or answer stated) on success; a negative value on failure with
// the platform error slot set: 0x0D00 bad argument or chain, 0x0600 no such database, 0x0300
// refused (a link, not a regular file, or not the caller's own), 0x2900 disk full, 0x2B00 out
// of memory, 0x8100 a damaged database or any other failure. Each call opens the database and
// closes it before it returns; no symbolic link is followed in any component of dbPath.

// Creates an empty result database at dbPath: the file must not exist (0x0300 when a link or
// anything else is in the way, 0x0600 when the folder is missing), is made 0600 for the
// caller without following a link in any component, and is left in WAL mode.
QUIB_API int FILEIDXDBCreate(const char *dbPath);

// Stores count hits in one transaction: all or none. A hit whose share and path are stored
// already replaces the stored one.
QUIB_API int FILEIDXDBInsert(const char *dbPath, const __tag_FI_FILE_INFO_DATA *records, int count);

// Calls callback for each hit of query from offset on, at most *limit of them (a null limit:
// all, a null offset: 0), in the query's order. flags must be 0. No update of the same database
// may run inside the callback.
QUIB_API int FILEIDXDBSelect(const char *dbPath, const FI_QUERY *query, FILEIDX_SELECT_CB callback, void *arg,
                             const unsigned long long *limit, const unsigned long long *offset, int flags);

// Stores in *total how many hits query->where selects (the sort keys are not used).
QUIB_API int FILEIDXCountGet(const char *dbPath, const FI_QUERY *query, unsigned long long *total);

// Sets columns of every hit that where selects. setList is a chain through orNext of records
// (column, FI_OP_EQ, new value as text; "%llu" for numbers), andNext null. Setting share or
// path so that two hits would share a key fails and changes nothing.
QUIB_API int FILEIDXDBUpdate(const char *dbPath, const __tag_FI_SQL_COND *setList,
                             const __tag_FI_SQL_COND *where);

// Deletes every hit that where selects; a null where is refused (0x0D00).
QUIB_API int FILEIDXDBDel(const char *dbPath, const __tag_FI_SQL_COND *where);

// A walk's inserts: Open starts a batch on an existing result database; Insert adds one hit
// (committed in batches of FILEIDX_OUTPUT_BATCH rows, so readers see a running search grow);
// Commit makes every hit inserted so far durable; Close commits and frees the handle (also on
// a cancelled walk: what was found stays). After a failed Insert or Commit the uncommitted
// hits are lost and the handle refuses further inserts; Close still frees it. Close(NULL)
// does nothing; Close returns the commit's result.
#define FILEIDX_OUTPUT_BATCH 4096
QUIB_API int FILEIDXOutputDBOpen(const char *dbPath, FI_OUTPUT_DB **out);
QUIB_API int FILEIDXOutputDBInsert(FI_OUTPUT_DB *db, const __tag_FI_FILE_INFO_DATA *record);
QUIB_API int FILEIDXOutputDBCommit(FI_OUTPUT_DB *db);
QUIB_API int FILEIDXOutputDBClose(FI_OUTPUT_DB *db);

// 1 when volume keeps a file index that a query can use now: "<volume>/@fileidx/fileidx.db",
// root's, finished, whole and readable by this process (root, or a process whose saved user is
// root). 0 when it is missing, being built, damaged or out of reach (the search then walks);
// -1 on a bad argument.
QUIB_API int FILEIDXIsIndexEnable(const char *volume);

// Copies into context->outputDbPath every entry of volume's index that lies in a share and
// that conditions (null: all) and folderConditions (null: all) select, with the share's name and
// real path, and filter (null: keep) keeps. Each row is the entry's status now (lstat as the
// caller, no link followed); an entry gone since the index last saw it is left out. The index
// is read as root only while it is read.
QUIB_API int FILEIDXResultGetAndTableGen(const char *volume, const __tag_FI_SQL_COND *conditions,
                                         const __tag_FI_SQL_COND *folderConditions, FILEIDX_ROW_FILTER filter,
                                         const FI_TABLE_GEN_CONTEXT *context);

// The upkeep of a volume's index; root only (0x0300 otherwise). The whole volume is walked
// without following a link, "@tmp" and "@fileidx" at its top left out.

// Builds the index anew into a scratch file that replaces the index when whole.
QUIB_API int FILEIDXIndexBuild(const char *volume);

// Brings the index up to date: every known folder is looked at, and only those whose change
// or modify time moved (or that are new) are read again. *foldersRead (may be null) says how
// many were read. Without an index it builds one.
QUIB_API int FILEIDXIndexUpdate(const char *volume, unsigned long long *foldersRead);

enum {
    FI_INDEX_NONE = 0,     // no index
    FI_INDEX_READY = 1,    // a query can use it
    FI_INDEX_DAMAGED = 2,  // present but unusable
};

typedef struct __tag_FI_INDEX_STATUS {
    int state;                   // FI_INDEX_*
    int building;                // 1 while a build, update or watch holds the index
    unsigned long long entries;  // names, sub-folders included
    unsigned long long folders;
    unsigned long long bytes;  // the database's size on disk
    long long built;           // seconds since the epoch; 0 unknown
    long long updated;
} FI_INDEX_STATUS;

QUIB_API int FILEIDXIndexStatus(const char *volume, FI_INDEX_STATUS *status);

// Keeps the index current until *stop becomes non-zero: an update first, then the changes the
// kernel reports (inotify) as they happen, each applied within a second. When the kernel drops
// events or runs out of watches it falls back to an update (once, or every second).
QUIB_API int FILEIDXIndexWatch(const char *volume, const volatile int *stop);

QUIB_END_C
