// The error slot and the errno translation table.
#include <errno.h>
#include <string.h>

#include <gtest/gtest.h>

#include "vlibc_err.h"
#include "vlibc_szlist.h"

namespace {

TEST(ErrorSlot, StartsEmptyAndKeepsTheCallersPlace) {
    EXPECT_EQ(VLIBCErrGet(), 0);
    EXPECT_STREQ(VLIBCErrorGetFile(), "");
    EXPECT_EQ(VLIBCErrorGetLine(), 0);

    int line = __LINE__ + 1;
    QUIB_SET_ERR(QUIB_ERR_NO_SUCH_USER);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_NO_SUCH_USER);
    EXPECT_NE(strstr(VLIBCErrorGetFile(), "error_slot_test.cc"), nullptr);
    EXPECT_EQ(VLIBCErrorGetLine(), line);
    VLIBCErrSetEx(QUIB_ERR_NO_SUCH_FILE, nullptr, 7);
    EXPECT_STREQ(VLIBCErrorGetFile(), "");
    EXPECT_EQ(VLIBCErrorGetLine(), 7);
}

TEST(ErrorSlot, PlatformFailureNamesItsSourceAndSuccessKeepsIt) {
    PSZLIST list = VLIBCSzListAlloc(1);
    ASSERT_NE(list, nullptr);
    EXPECT_EQ(VLIBCSzListPush(nullptr, "x"), -1);
    EXPECT_NE(strstr(VLIBCErrorGetFile(), "szlist.cc"), nullptr);
    EXPECT_GT(VLIBCErrorGetLine(), 0);
    EXPECT_EQ(VLIBCSzListPush(&list, "ok"), 0);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER);
    VLIBCSzListFree(list);
}

TEST(ErrorSlot, TranslatesErrno) {
    const struct {
        int err;
        int code;
    } rows[] = {
        {EACCES, 0x0300}, {EPERM, 0x0300},  {ENOENT, 0x0600}, {ENOTDIR, 0x0700}, {EDQUOT, 0x2400},
        {ENOSPC, 0x2900}, {EROFS, 0x8400},  {ENAMETOOLONG, 0xC300}, {ENOMEM, 0x2B00},
        {EINVAL, 0x0D00}, {EIO, 0x8100},    {EEXIST, 0x8100}, {0, 0x8100}, {-1, 0x8100},
    };
    for (const auto &row : rows) {
        EXPECT_EQ(VLIBCErrFromErrno(row.err), row.code) << "errno " << row.err;
    }
}

}  // namespace
