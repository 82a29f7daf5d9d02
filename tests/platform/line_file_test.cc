// Line files: appended lines come back whole, text that would break a line is refused, and the
// file is the caller's own regular file.
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>

#include <gtest/gtest.h>

#include "appliance.h"
#include "platform_test_util.h"
#include "vlibc_line_file.h"

namespace {

using norvo::testing::Appliance;
using norvo::testing::Failed;
using norvo::testing::Outcome;

constexpr char kFile[] = "/tmp/foldersharing.current.users";

std::string Content(const char *path) {
    std::ifstream in(path, std::ios::binary);
    std::stringstream text;
    text << in.rdbuf();
    return text.str();
}

class LineFileTest : public ::testing::Test {
protected:
    Appliance appliance_;
};

TEST_F(LineFileTest, LinesGoInWholeAndAreFoundByTheirText) {
    umask(0);
    char line[64] = "";
    EXPECT_EQ(OUTCOME(VLIBCFileGetLine(kFile, "x", line, sizeof line)), Failed(QUIB_ERR_OPEN_FAILED)) << "missing";
    ASSERT_EQ(VLIBCFileAddLine(kFile, "192.0.2.1,alice,abc,5,5,1,0,s"), 0);
    struct stat st;
    ASSERT_EQ(stat(kFile, &st), 0);
    EXPECT_EQ(st.st_mode & 07777, 0600u);
    // A torn last line (a writer killed mid-line) gets its end before the next line.
    std::ofstream(kFile, std::ios::app) << "torn,li";
    ASSERT_EQ(VLIBCFileAddLine(kFile, "192.0.2.2,bob,xyz,7,7,1,0,"), 0);
    std::ofstream(kFile, std::ios::app) << "crlf,abc2\r\n" << std::string("nul\0xyz9", 8) << "\n";
    EXPECT_EQ(Content(kFile), "192.0.2.1,alice,abc,5,5,1,0,s\ntorn,li\n192.0.2.2,bob,xyz,7,7,1,0,\ncrlf,abc2\r\n" +
                                  std::string("nul\0xyz9", 8) + "\n");

    struct Case { const char *text; Outcome outcome; const char *line; } cases[] = {
        {"abc", {1}, "192.0.2.1,alice,abc,5,5,1,0,s"}, {",bob,", {3}, "192.0.2.2,bob,xyz,7,7,1,0,"},
        {"abc2", {4}, "crlf,abc2"}, {"xyz9", Failed(QUIB_ERR_OPEN_FAILED), ""}, {"nope", Failed(QUIB_ERR_OPEN_FAILED), ""},
        {"", Failed(QUIB_ERR_BAD_PARAMETER), ""}, {"abc\n", Failed(QUIB_ERR_BAD_PARAMETER), ""},
        {"li\r", Failed(QUIB_ERR_BAD_PARAMETER), ""}, {"li\n192", Failed(QUIB_ERR_BAD_PARAMETER), ""},
    };
    for (const Case &c : cases) {
        line[0] = '\0';
        EXPECT_EQ(OUTCOME(VLIBCFileGetLine(kFile, c.text, line, sizeof line)), c.outcome) << c.text;
        EXPECT_STREQ(line, c.line) << c.text;
    }
    EXPECT_EQ(VLIBCFileGetLine(kFile, "xyz", nullptr, 0), 3);
    EXPECT_EQ(OUTCOME(VLIBCFileGetLine(kFile, "xyz", line, 26)), Failed(QUIB_ERR_NAME_TOO_LONG)) << "never truncated";

    const std::string before = Content(kFile);
    for (const char *bad : {"a\nb", "a\r", "\n", static_cast<const char *>(nullptr)}) {
        EXPECT_EQ(OUTCOME(VLIBCFileAddLine(kFile, bad)), Failed(QUIB_ERR_BAD_PARAMETER));
    }
    EXPECT_EQ(Content(kFile), before);
}

TEST_F(LineFileTest, OnlyTheCallersOwnRegularFileIsUsed) {
    appliance_.Basic().WriteFile("/tmp/alices", "a,b,c\n", "alice", 0666).WriteFile("/tmp/target", "t,u,v\n", "root", 0600);
    std::filesystem::create_symlink("/tmp/target", "/tmp/link");
    mkfifo("/tmp/fifo", 0600);
    for (const char *path : {"/tmp/alices", "/tmp/link", "/tmp/fifo", "/tmp"}) {
        EXPECT_EQ(OUTCOME(VLIBCFileAddLine(path, "x")), Failed(QUIB_ERR_ACCESS_DENIED)) << path;
        EXPECT_EQ(OUTCOME(VLIBCFileGetLine(path, "b", nullptr, 0)), Failed(QUIB_ERR_ACCESS_DENIED)) << path;
    }
    EXPECT_EQ(OUTCOME(VLIBCFileAddLine("tmp/rel", "x")), Failed(QUIB_ERR_BAD_PARAMETER));
    EXPECT_EQ(Content("/tmp/alices") + Content("/tmp/target"), "a,b,c\nt,u,v\n");
    EXPECT_EQ(appliance_.RunAs("alice", [] { return VLIBCFileAddLine("/tmp/alices", "d") + 10 * VLIBCFileGetLine("/tmp/alices", "d", nullptr, 0); }), 20);

    ASSERT_EQ(VLIBCFileAddLine("/tmp/new", "n"), 0);
    EXPECT_EQ(VLIBCSysRename("/tmp/new", "/tmp/link"), 0) << "the link is replaced, not followed";
    EXPECT_EQ(Content("/tmp/link") + Content("/tmp/target"), "n\nt,u,v\n");
    EXPECT_EQ(OUTCOME(VLIBCSysRename("/tmp/new", "/tmp/x")), Failed(QUIB_ERR_NO_SUCH_FILE));
    EXPECT_EQ(OUTCOME(VLIBCSysRename(nullptr, "/tmp/x")), Failed(QUIB_ERR_BAD_PARAMETER));
}

}  // namespace
