// Read access to the appliance's SQLite databases (the sharing link database): a connection,
// a statement's rows held in memory, and fields fetched by column name.
#pragma once
#include "platform_export.h"

typedef struct _tag_QUIBDB_ QUIBDB, *PQUIBDB;
typedef struct _tag_QUIBDB_RESULT_ QUIBDB_RESULT, *PQUIBDB_RESULT;
// A row of a result: its index, filled by QUIBDBFetchRow.
typedef int QUIBDB_ROW;

QUIB_BEGIN_C

// Opens the database file path read-only. host, user and password name a database server,
// which Linux does not have: they must be null (0x0D00 otherwise). No symbolic link is
// followed in any component of path, which must be absolute and name a regular file (0x0300
// otherwise); 0x0600 when it is missing. Null on failure; close with QUIBDBClose.
QUIB_API PQUIBDB QUIBDBConnect(const char *host, const char *user, const char *password, const char *path);
// Null is ignored.
QUIB_API void QUIBDBClose(PQUIBDB db);
// Runs one SQL statement and keeps every row it gives (at most 64 MiB of text) in *result,
// which the caller frees with QUIBDBFreeResult. 0; -1 with the slot set (0x0D00 for null
// arguments or more than one statement, 0x2B00, 0x8100 for SQLite's refusals, whose text
// QUIBDBErrorGet gives), and then *result is null.
QUIB_API int QUIBDBExecute(PQUIBDB db, const char *sql, PQUIBDB_RESULT *result);
// The next row of result into *row: 0; -1 when there is none left (or null arguments).
QUIB_API int QUIBDBFetchRow(PQUIBDB_RESULT result, QUIBDB_ROW *row);
// The text of column name (ASCII case ignored, the first such column) in row, owned by the
// result; null when the value is NULL, the column or row does not exist, or for null arguments.
QUIB_API const char *QUIBDBFetchField(PQUIBDB_RESULT result, QUIBDB_ROW row, const char *name);
// Null is ignored.
QUIB_API void QUIBDBFreeResult(PQUIBDB_RESULT result);
// The message of the connection's last failure ("" when none, or for null); owned by db.
QUIB_API const char *QUIBDBErrorGet(PQUIBDB db);

QUIB_END_C
