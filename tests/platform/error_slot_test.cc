// The error slot: its start, the place it records, and what success leaves in it.
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
    EXPECT_STREQ(VLIBCErrorGetFile(), "error_slot_test.cc");
    EXPECT_EQ(VLIBCErrorGetLine(), line);
    VLIBCErrSetEx(QUIB_ERR_NO_SUCH_FILE, nullptr, 7);
    EXPECT_STREQ(VLIBCErrorGetFile(), "");
    EXPECT_EQ(VLIBCErrorGetLine(), 7);
}

TEST(ErrorSlot, PlatformFailureNamesItsSourceAndSuccessKeepsIt) {
    PSZLIST list = VLIBCSzListAlloc(1);
    ASSERT_NE(list, nullptr);
    EXPECT_EQ(VLIBCSzListPush(nullptr, "x"), -1);
    EXPECT_STREQ(VLIBCErrorGetFile(), "szlist.cc") << "the name, not the build path";
    EXPECT_GT(VLIBCErrorGetLine(), 0);
    EXPECT_EQ(VLIBCSzListPush(&list, "ok"), 0);
    EXPECT_EQ(VLIBCErrGet(), QUIB_ERR_BAD_PARAMETER);
    VLIBCSzListFree(list);
}

}  // namespace
