#include <errno.h>

#include <gtest/gtest.h>

#include "appliance.h"
#include "errors/guard.h"
#include "norvo/errors.h"

namespace {

TEST(ErrorSlot, SetReturnsTheCodeAndGetReadsIt) {
    EXPECT_EQ(NvoLibGetErr(), 0);
    EXPECT_EQ(NvoLibSetErr(407), 407);
    EXPECT_EQ(NvoLibGetErr(), 407);
    NvoLibSetErr(0);
    EXPECT_EQ(NvoLibGetErr(), 0);
}

// What every entry point answers instead of letting an exception out.
TEST(ErrorSlot, TheGuardTurnsExceptionsIntoFailureAndACode) {
    EXPECT_EQ(norvo::Guarded(-1, [] { return 7; }), 7);
    EXPECT_EQ(norvo::Guarded(-1, []() -> int { throw std::bad_alloc(); }), -1);
    EXPECT_EQ(NvoLibGetErr(), NVO_ERR_SYSTEM);
    EXPECT_EQ(norvo::Guarded(-1, []() -> int { throw 1; }), -1);
    EXPECT_EQ(NvoLibGetErr(), NVO_ERR_GENERAL);
}

TEST(ErrnoMapping, EveryErrnoMapsAsTabled) {
    const struct {
        int err;
        int code;
    } table[] = {
        {EPERM, 407},  {EACCES, 407}, {ENOENT, 408},       {ENOTDIR, 408}, {EIO, 417},
        {EBUSY, 420},  {EEXIST, 414}, {ENOTEMPTY, 414},    {ENOSPC, 416},  {EROFS, 411},
        {EDQUOT, 415}, {ENAMETOOLONG, 412}, {0, 401},      {EINVAL, 401},  {EXDEV, 401},
        {ENOMEM, 401}, {-1, 401},     {100000, 401},
    };
    for (const auto &row : table) {
        EXPECT_EQ(NvoParseErrnoToError(row.err, nullptr, nullptr), row.code) << "errno " << row.err;
    }
    // The translation leaves the slot alone.
    NvoLibSetErr(123);
    NvoParseErrnoToError(EACCES, nullptr, nullptr);
    EXPECT_EQ(NvoLibGetErr(), 123);
}

TEST(QuibMapping, EveryPlatformCodeMapsAsTabled) {
    const struct {
        int quib;
        int code;
    } table[] = {
        {0x0300, 407}, {0x0600, 408}, {0x0700, 408}, {0x2400, 415}, {0x2900, 416}, {0x8400, 411},
        {0xA500, 419}, {0xC300, 412}, {0x0000, 401}, {0x0D00, 401}, {0x1400, 401}, {0xD800, 401},
        {-1, 401},
    };
    for (const auto &row : table) {
        EXPECT_EQ(NvoParseQuibErrToError(row.quib, nullptr), row.code) << std::hex << row.quib;
    }
}

TEST(MessageKeys, EveryCodeHasItsKeyAndOnlyUnknownCodesTakeTheFallback) {
    const struct {
        int code;
        const char *key;  // nullptr: the fallback is returned
    } table[] = {
        {400, "error:error_error_system"}, {401, "error:error_error_system"}, {402, "error:error_error_system"},
        {403, "error:error_invalid_user_group"}, {404, "error:error_invalid_user_group"},
        {405, "error:error_invalid_user_group"}, {406, "error:error_testjoin"},
        {407, "error:error_privilege_not_enough"}, {408, "error:error_no_path"},
        {409, "error:error_privilege_not_enough"}, {410, "error:conn_rv_fail"}, {411, "error:error_fs_ro"},
        {412, "error:error_long_path"}, {413, "error:error_encryption_long_path"},
        {414, "error:error_file_exist"}, {415, "error:error_quota_not_enough"},
        {416, "error:error_space_not_enough"}, {417, "error:error_io"}, {418, "error:error_reserved_name"},
        {419, "error:error_fat_reserved_name"}, {420, "error:error_error_system"},
        {421, "error:error_folder_busy"}, {1004, "error:error_overwrite_fail"},
        {1005, "error:error_select_conflict"}, {1006, "error:mvcp_filename_illegal"},
        {1007, "error:mvcp_file_too_big"}, {1400, "error:error_error_system"},
        {1401, "error:error_invalid_archive"}, {1402, "error:error_invalid_archive_data"},
        {1403, "error:extract_passwd_missing"}, {1404, "error:error_error_system"},
        {1405, "error:error_error_system"}, {0, nullptr}, {-5, nullptr}, {399, nullptr}, {422, nullptr},
        {1003, nullptr}, {1008, nullptr}, {1399, nullptr}, {1406, nullptr}, {1804, nullptr}, {1805, nullptr},
    };
    for (const auto &row : table) {
        const char *expected = row.key != nullptr ? row.key : "x";
        EXPECT_STREQ(NvoParseErrorToOBXString(row.code, "x"), expected) << row.code;
        const char *noFallback = row.key != nullptr ? row.key : "error:error_error_system";
        EXPECT_STREQ(NvoParseErrorToOBXString(row.code, nullptr), noFallback) << row.code;
    }
}

TEST(LongPathRule, EncryptedSharesGetTheirOwnCode) {
    norvo::testing::Appliance app;
    app.Basic();
    app.AddShare({.name = "vault", .readWrite = "alice", .encrypted = true});

    EXPECT_EQ(NvoParseErrnoToError(ENAMETOOLONG, "/volume1/vault/a/very/long/name", nullptr), 413);
    EXPECT_EQ(NvoParseErrnoToError(ENAMETOOLONG, "/volume1/public/x", nullptr), 412);
    EXPECT_EQ(NvoParseQuibErrToError(0xC300, "/volume1/vault/x"), 413);
    EXPECT_EQ(NvoParseQuibErrToError(0xC300, nullptr), 412);
    // A home path is never encrypted.
    EXPECT_EQ(NvoParseErrnoToError(ENAMETOOLONG, "/home/x", nullptr), 412);
    // No share at all: the plain code, and the translation leaves the slot and the log alone.
    NvoLibSetErr(0);
    EXPECT_EQ(NvoParseErrnoToError(ENAMETOOLONG, "/nowhere/x", nullptr), 412);
    EXPECT_EQ(NvoLibGetErr(), 0);
    EXPECT_TRUE(app.ErrorLines().empty());
}

TEST(BusyRule, AMountPointIsAFolderBusyError) {
    norvo::testing::Appliance app;
    app.AddVolume("/volume3");
    EXPECT_EQ(NvoParseErrnoToError(EBUSY, nullptr, nullptr), 420);
    EXPECT_EQ(NvoParseErrnoToError(EBUSY, nullptr, "/volume3"), 421);
    EXPECT_EQ(NvoParseErrnoToError(EBUSY, nullptr, "/volume3/deeper/dir"), 421);
    // The system disk is not in the platform's table of data mounts.
    EXPECT_EQ(NvoParseErrnoToError(EBUSY, nullptr, "/srv/x"), 420);
}

}  // namespace
