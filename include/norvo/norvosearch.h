// Search conditions. Each condition has two faces that must agree: an in-memory test of one
// walked file, and the file index's condition records that ask the same of the index or of a
// search database.
//
// Ownership: the caller owns every condition FindFactory::createFindOp appends and deletes it
// when the search ends. Each condition owns its records. A FindNameComp owns the alternatives
// joined to it with orComp: deleting the head deletes them, so only the head is deleted.
#pragma once
#include <string>
#include <vector>

#include "fileidx.h"  // __tag_FI_SQL_COND
#include "norvo/export.h"
#include "quib_stat.h"

namespace FileSearch {

// Zero-fills c, then stores the links, type, op and value (cut at 4,095 bytes).
NORVO_API void setSqlCond(__tag_FI_SQL_COND &c, __tag_FI_SQL_COND_TYPE type, __tag_FI_SQL_COND_OP op,
                          std::string value, __tag_FI_SQL_COND *andNext, __tag_FI_SQL_COND *orNext);
// The same with value written in decimal ("%llu"): a negative number, converted to unsigned
// long long by the caller, appears as its 64-bit two's complement.
NORVO_API void setSqlCond(__tag_FI_SQL_COND &c, __tag_FI_SQL_COND_TYPE type, __tag_FI_SQL_COND_OP op,
                          unsigned long long value, __tag_FI_SQL_COND *andNext, __tag_FI_SQL_COND *orNext);

// One search condition. Not copyable: it owns its records.
class NORVO_API FindComp {
public:
    // Frees cond and extraCond.
    virtual ~FindComp();
    // Whether the file at path (its status in st) meets the condition.
    virtual bool operator()(const char *path, const _tag_QUIBSTAT_ &st) = 0;

    // The record that starts this condition's part of a query (never null once constructed,
    // unless memory ran out).
    __tag_FI_SQL_COND *getFirstCond();
    // Links next after this condition in a conjunction: the andNext of this condition's last
    // record (extraCond when there is one, else cond) becomes next's first record. Nothing
    // happens for a null next. Ownership does not change.
    void operator()(FindComp *next);

    FindComp(const FindComp &) = delete;
    FindComp &operator=(const FindComp &) = delete;

protected:
    // Allocates cond zero-filled; extraCond stays null.
    FindComp();

    __tag_FI_SQL_COND *cond;
    __tag_FI_SQL_COND *extraCond;
};

// The base name fits a LIKE pattern.
class NORVO_API FindNameComp : public FindComp {
public:
    // The record (FI_COND_NAME, FI_OP_LIKE, pattern): doubled backslashes in term become single
    // ones; a term without wildcards ("\*" and "\?" count as none) that does not end in a
    // backslash is wrapped as "*term*", so it matches names that contain it. A null or empty
    // term builds no pattern: the record stays zero-filled and only an empty name matches.
    explicit FindNameComp(const char *term);
    // Deletes the alternatives joined with orComp.
    ~FindNameComp() override;
    // Tests the base name of path (for "/a/dir/", "dir"): true when an alternative matches, in
    // the order joined, or else this pattern (its first 493 bytes) does. st is not read.
    bool operator()(const char *path, const _tag_QUIBSTAT_ &st) override;
    using FindComp::operator();

    // Joins other as an alternative and takes ownership of it. other's record leads to this
    // condition's current first record through orNext and becomes the new first record, so the
    // newest alternative heads the record chain. Nothing happens for null, this condition, or
    // an alternative already joined; when memory runs out other is deleted at once.
    void orComp(FindNameComp *other);

protected:
    char pattern[494];
    std::vector<FindNameComp *> alternatives;

private:
    // This condition's own record: orComp moves cond to the newest alternative's record.
    __tag_FI_SQL_COND *ownCond;
};

// A directory, or a regular file (links, devices and the like are never "file").
class NORVO_API FindTypeComp : public FindComp {
public:
    // The record (FI_COND_IS_DIR, FI_OP_EQ, "1" for directories, "0" for files).
    explicit FindTypeComp(bool dir);
    ~FindTypeComp() override;
    bool operator()(const char *path, const _tag_QUIBSTAT_ &st) override;
    using FindComp::operator();

protected:
    bool isDir;
};

// The owner's id.
class NORVO_API FindUserComp : public FindComp {
public:
    // Records (FI_COND_UID, FI_OP_EQ, id) with orNext (FI_COND_USER_NAME, FI_OP_LIKE, name) as
    // extraCond; a null name counts as "". The name is for the index only: in memory the id
    // decides.
    FindUserComp(const char *name, unsigned int id);
    ~FindUserComp() override;
    // st_uid equals the id; never for the id 0xFFFFFFFF.
    bool operator()(const char *path, const _tag_QUIBSTAT_ &st) override;
    using FindComp::operator();

protected:
    unsigned int uid;
};

// The group's id, as FindUserComp (FI_COND_GID, FI_COND_GROUP_NAME, st_gid).
class NORVO_API FindGroupComp : public FindComp {
public:
    FindGroupComp(const char *name, unsigned int id);
    ~FindGroupComp() override;
    bool operator()(const char *path, const _tag_QUIBSTAT_ &st) override;
    using FindComp::operator();

protected:
    unsigned int gid;
};

// A time of the file at or after, or before, a moment.
class NORVO_API FindTimeComp : public FindComp {
public:
    ~FindTimeComp() override;
    // The subclass's time (signed) before the moment for "before", else at or after it.
    bool operator()(const char *path, const _tag_QUIBSTAT_ &st) override;
    using FindComp::operator();
    // The time of st this condition tests.
    virtual long getTime(const _tag_QUIBSTAT_ &st) = 0;

protected:
    // op "before" (in any case) gives the record (type, FI_OP_LT, when); any other op, null
    // included, (type, FI_OP_GE, when).
    FindTimeComp(__tag_FI_SQL_COND_TYPE type, const char *op, long when);

    int mode;  // 2 at or after, 3 before
    long lowTime;
    long highTime;
};

class NORVO_API FindMTimeComp : public FindTimeComp {
public:
    FindMTimeComp(const char *op, long when);  // FI_COND_MTIME
    ~FindMTimeComp() override;
    long getTime(const _tag_QUIBSTAT_ &st) override;
};

class NORVO_API FindCRTimeComp : public FindTimeComp {
public:
    FindCRTimeComp(const char *op, long when);  // FI_COND_CRTIME
    ~FindCRTimeComp() override;
    long getTime(const _tag_QUIBSTAT_ &st) override;
};

class NORVO_API FindATimeComp : public FindTimeComp {
public:
    FindATimeComp(const char *op, long when);  // FI_COND_ATIME
    ~FindATimeComp() override;
    long getTime(const _tag_QUIBSTAT_ &st) override;
};

// The size in bytes; a directory counts as 0.
class NORVO_API FindSizeComp : public FindComp {
public:
    // op "equal" (exactly that word: "EQUAL" is not it, intended) allows a tolerance of
    // d = max((bytes >> 2) / 5, 1): records (FI_COND_SIZE, FI_OP_LT, bytes + d) with andNext
    // (FI_COND_SIZE, FI_OP_GE, bytes - d, or 0 when bytes <= d) as extraCond, so 100 matches
    // 95 to 104. "less" gives (FI_COND_SIZE, FI_OP_LT, bytes); any other op, null included,
    // (FI_COND_SIZE, FI_OP_GT, bytes). The upper bound saturates at the largest size rather
    // than wrap around.
    FindSizeComp(const char *op, long long bytes);
    ~FindSizeComp() override;
    bool operator()(const char *path, const _tag_QUIBSTAT_ &st) override;
    using FindComp::operator();

protected:
    int mode;  // 1 equal, 2 greater, 3 less
    long long upper;
    long long size;
};

class NORVO_API FindTypeCompFactory {
public:
    // "dir" or "file" (ASCII case ignored) gives a new FindTypeComp the caller deletes; any
    // other word, null included, gives null.
    static FindComp *createFindTypeOpt(const char *word);
};

class NORVO_API FindFactory {
public:
    // The request fields. Any int is a valid value: those not listed are unknown fields.
    enum _tag_FIND_FIELD_ : int {
        FIND_FIELD_NAME = 0,   // value: comma-separated name terms
        FIND_FIELD_TYPE = 1,   // op: "dir" or "file"
        FIND_FIELD_EXT = 2,    // value: comma-separated extensions
        FIND_FIELD_USER = 3,   // value: user name
        FIND_FIELD_GROUP = 4,  // value: group name
        FIND_FIELD_MTIME = 5,  // op: "before" or anything else; value: decimal seconds
        FIND_FIELD_CRTIME = 6,
        FIND_FIELD_ATIME = 7,
        FIND_FIELD_SIZE = 8,  // op: "equal", "less" or anything else; value: decimal bytes
    };

    // Appends the conditions of one request field to out (the caller deletes them).
    //
    // Names: value is split at ","; each term is trimmed of white space and empty ones are
    // skipped. Unquoted terms are alternatives of one condition. A term in double quotes starts
    // a condition of its own, appended at once, and later unquoted terms become its
    // alternatives; unquoted terms before the first quoted one are dropped. So "x,\"y\",z"
    // gives one condition (y or z), and two quoted terms must both match. These consequences
    // are intended.
    // Extensions: a files-only FindTypeComp, then one condition "*.ext" with the others as
    // alternatives (not trimmed, empty ones kept).
    // Times and sizes: value is read as strtoull reads it (a value that is not a number reads
    // as 0), cut to long (long long for sizes).
    //
    // true when done, also for an unknown field, an unknown type word and only empty terms
    // (nothing is appended). false with the error slot set: 400 when value is null (for any
    // field but the type) or op is null (type, times, size); 403 unknown user; 404 unknown
    // group; 401 out of memory. Conditions appended before a failure stay in out.
    static bool createFindOp(_tag_FIND_FIELD_ field, const char *op, const char *value,
                             std::vector<FindComp *> &out);
};

}  // namespace FileSearch
