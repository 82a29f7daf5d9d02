// Automatic blocking: an address that fails often enough within the window is blocked until
// the failures age out or a good login resets it; addresses are compared in canonical form.
#include <sqlite3.h>

#include <string>

#include <gtest/gtest.h>

#include "appliance.h"
#include "platform_test_util.h"
#include "quib_autoblock.h"
#include "quib_paths.h"

namespace {

using norvo::testing::Appliance;
using norvo::testing::Failed;
using norvo::testing::Outcome;

// Moves every recorded failure seconds into the past, as time passing would.
void Age(long seconds) {
    sqlite3 *db = nullptr;
    ASSERT_EQ(sqlite3_open(QUIB_AUTOBLOCK_DB, &db), SQLITE_OK);
    const std::string sql = "UPDATE login_failure SET at = at - " + std::to_string(seconds);
    EXPECT_EQ(sqlite3_exec(db, sql.c_str(), nullptr, nullptr, nullptr), SQLITE_OK);
    sqlite3_close(db);
}

int Fail(const char *ip, int times) {
    int rc = 0;
    for (int i = 0; i < times; ++i) rc |= AutoBlockFailLoginSet(ip, "FOLDER_SHARING");
    return rc;
}

class AutoBlockTest : public ::testing::Test {
protected:
    AutoBlockTest() { appliance_.Basic(); }
    Appliance appliance_;
};

TEST_F(AutoBlockTest, ThresholdWindowAndReset) {
    EXPECT_EQ(QuibCgiIsDeniedIP("192.0.2.1"), 0) << "nothing recorded yet";
    EXPECT_EQ(QUIBAutoBlockResetByIP("192.0.2.1"), 0);
    appliance_.SetSetting("auto_block_attempts", "3").SetSetting("auto_block_within_minutes", "2");
    ASSERT_EQ(Fail("192.0.2.1", 2), 0);
    EXPECT_EQ(QuibCgiIsDeniedIP("192.0.2.1"), 0);
    ASSERT_EQ(Fail("::ffff:192.0.2.1", 1), 0) << "the same address";
    EXPECT_EQ(QuibCgiIsDeniedIP("192.0.2.1"), 1);
    EXPECT_EQ(QuibCgiIsDeniedIP("::FFFF:c000:0201"), 1);
    EXPECT_EQ(QuibCgiIsDeniedIP("192.0.2.10"), 0);
    ASSERT_EQ(Fail("2001:db8::1", 3), 0);
    EXPECT_EQ(QuibCgiIsDeniedIP("2001:DB8:0:0::1"), 1);

    Age(119);
    EXPECT_EQ(QuibCgiIsDeniedIP("192.0.2.1"), 1) << "still within two minutes";
    Age(1);
    EXPECT_EQ(QuibCgiIsDeniedIP("192.0.2.1"), 0) << "aged out";
    ASSERT_EQ(Fail("192.0.2.1", 50), 0);
    EXPECT_EQ(QuibCgiIsDeniedIP("192.0.2.1"), 1);
    ASSERT_EQ(QUIBAutoBlockResetByIP("192.0.2.1"), 0);
    EXPECT_EQ(QuibCgiIsDeniedIP("192.0.2.1"), 0) << "a good login resets it";
    EXPECT_EQ(QuibCgiIsDeniedIP("2001:db8::1"), 0) << "the other's failures were aged too";

    // An address keeps at most the threshold's failures, so a flood can't stretch its block.
    ASSERT_EQ(Fail("192.0.2.1", 3), 0);
    Age(60);
    ASSERT_EQ(Fail("192.0.2.1", 5), 0);
    Age(60);
    EXPECT_EQ(QuibCgiIsDeniedIP("192.0.2.1"), 0);

    appliance_.SetSetting("auto_block_attempts", "0");
    ASSERT_EQ(Fail("192.0.2.1", 5), 0);
    EXPECT_EQ(QuibCgiIsDeniedIP("192.0.2.1"), 0) << "0 turns blocking off";
    // A damaged setting falls back to the default (5), never to off.
    appliance_.SetSetting("auto_block_attempts", "3x");
    ASSERT_EQ(Fail("192.0.2.7", 4), 0);
    EXPECT_EQ(QuibCgiIsDeniedIP("192.0.2.7"), 0);
    ASSERT_EQ(Fail("192.0.2.7", 1), 0);
    EXPECT_EQ(QuibCgiIsDeniedIP("192.0.2.7"), 1);
}

TEST_F(AutoBlockTest, OnlyIpLiteralsAndRoot) {
    for (const char *bad : {"", "10.0.0.1, 10.0.0.2", "[::1]", "host.example", "10.0.0.1\n", "010.0.0.1x", "1.2.3",
                            static_cast<const char *>(nullptr)}) {
        EXPECT_EQ(OUTCOME(QuibCgiIsDeniedIP(bad)), Failed(QUIB_ERR_BAD_PARAMETER)) << (bad ? bad : "null");
        EXPECT_EQ(OUTCOME(AutoBlockFailLoginSet(bad, "X")), Failed(QUIB_ERR_BAD_PARAMETER));
        EXPECT_EQ(OUTCOME(QUIBAutoBlockResetByIP(bad)), Failed(QUIB_ERR_BAD_PARAMETER));
    }
    for (const char *service : {"", "A B", "x;DROP TABLE", static_cast<const char *>(nullptr)}) {
        EXPECT_EQ(OUTCOME(AutoBlockFailLoginSet("10.0.0.1", service)), Failed(QUIB_ERR_BAD_PARAMETER));
    }
    ASSERT_EQ(Fail("10.0.0.1", 1), 0);
    EXPECT_EQ(appliance_.RunAs("alice", [] {
        const bool denied = AutoBlockFailLoginSet("10.0.0.1", "X") == -1 && VLIBCErrGet() == QUIB_ERR_ACCESS_DENIED;
        return denied && QuibCgiIsDeniedIP("10.0.0.1") == -1 && VLIBCErrGet() == QUIB_ERR_ACCESS_DENIED;
    }), 1) << "only root records or reads failures";
}

}  // namespace
