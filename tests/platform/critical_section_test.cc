// Critical sections between real processes: a waiter times out while another holds the
// section, gets it when the holder leaves or is killed, and the lock file is never someone
// else's file or a link.
#include <signal.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <string>

#include <gtest/gtest.h>

#include "appliance.h"
#include "platform_test_util.h"
#include "quib_cgi.h"

namespace {

using norvo::testing::Appliance;
using norvo::testing::Failed;

constexpr char kLock[] = "/tmp/foldersharing.current.users.lock";

// A process that enters the section, says so through a pipe, and holds it until it reads a
// byte (then leaves and exits) or is killed.
struct Holder {
    pid_t pid = -1;
    int command = -1;
    Holder() {
        int ready[2], go[2];
        EXPECT_EQ(pipe(ready), 0);
        EXPECT_EQ(pipe(go), 0);
        pid = fork();
        if (pid == 0) {
            const int handle = QuibCgiBeginCriticalSection(kLock, 0);
            char byte = handle >= 0 ? 'y' : 'n';
            if (write(ready[1], &byte, 1) != 1 || read(go[0], &byte, 1) < 0) _exit(2);
            _exit(QuibCgiEndCriticalSection(handle) == 0 ? 0 : 1);
        }
        close(ready[1]);
        close(go[0]);
        char byte = 0;
        EXPECT_EQ(read(ready[0], &byte, 1), 1);
        EXPECT_EQ(byte, 'y');
        close(ready[0]);
        command = go[1];
    }
    int Wait() {
        int status = 0;
        waitpid(pid, &status, 0);
        close(command);
        return status;
    }
};

class CriticalSectionTest : public ::testing::Test {
protected:
    Appliance appliance_;
};

TEST_F(CriticalSectionTest, AWaiterGetsInWhenTheHolderLeavesOrDies) {
    Holder holder;
    EXPECT_EQ(OUTCOME(QuibCgiBeginCriticalSection(kLock, 0)), Failed(QUIB_ERR_FAILED));
    EXPECT_EQ(OUTCOME(QuibCgiBeginCriticalSection(kLock, 30)), Failed(QUIB_ERR_FAILED));
    // The holder leaves while the waiter waits (the wait is far longer than it needs).
    ASSERT_EQ(write(holder.command, "x", 1), 1);
    const int handle = QuibCgiBeginCriticalSection(kLock, 60000);
    ASSERT_GE(handle, 0);
    EXPECT_EQ(holder.Wait(), 0);
    EXPECT_EQ(QuibCgiEndCriticalSection(handle), 0);
    EXPECT_EQ(OUTCOME(QuibCgiEndCriticalSection(handle)), Failed(QUIB_ERR_BAD_PARAMETER));

    Holder killed;
    EXPECT_EQ(QuibCgiBeginCriticalSection(kLock, 0), -1);
    kill(killed.pid, SIGKILL);
    EXPECT_TRUE(WIFSIGNALED(killed.Wait()));
    const int after = QuibCgiBeginCriticalSection(kLock, 60000);
    EXPECT_GE(after, 0) << "a dead holder leaves at once";
    EXPECT_EQ(QuibCgiEndCriticalSection(after), 0);
}

TEST_F(CriticalSectionTest, TheLockFileIsTheCallersOwnRegularFile) {
    umask(0);
    const int handle = QuibCgiBeginCriticalSection(kLock, 0);
    ASSERT_GE(handle, 0);
    struct stat st;
    ASSERT_EQ(stat(kLock, &st), 0);
    EXPECT_EQ(st.st_mode & 07777, 0600u);
    EXPECT_EQ(QuibCgiEndCriticalSection(handle), 0);
    EXPECT_EQ(stat(kLock, &st), 0) << "the lock file stays";

    appliance_.Basic().WriteFile("/tmp/alices.lock", "", "alice", 0666).WriteFile("/tmp/target", "keep", "root", 0600);
    appliance_.MakeDir("/tmp/dir.lock", "root", 0700);
    std::filesystem::create_symlink("/tmp/target", "/tmp/link.lock");
    mkfifo("/tmp/fifo.lock", 0600);
    struct Case { const char *name; int timeout; int code; } cases[] = {
        {"/tmp/alices.lock", 0, QUIB_ERR_ACCESS_DENIED}, {"/tmp/link.lock", 0, QUIB_ERR_ACCESS_DENIED},
        {"/tmp/dir.lock", 0, QUIB_ERR_ACCESS_DENIED}, {"/tmp/fifo.lock", 0, QUIB_ERR_ACCESS_DENIED},
        {"tmp/x.lock", 0, QUIB_ERR_BAD_PARAMETER}, {"/tmp/", 0, QUIB_ERR_BAD_PARAMETER},
        {"/tmp/..", 0, QUIB_ERR_BAD_PARAMETER}, {nullptr, 0, QUIB_ERR_BAD_PARAMETER},
        {kLock, -1, QUIB_ERR_BAD_PARAMETER}, {"/nowhere/x.lock", 0, QUIB_ERR_NO_SUCH_FILE},
    };
    for (const Case &c : cases) {
        EXPECT_EQ(OUTCOME(QuibCgiBeginCriticalSection(c.name, c.timeout)), Failed(c.code)) << (c.name ? c.name : "null");
    }
    // Alice's own section is hers; root's lock file is not.
    EXPECT_EQ(appliance_.RunAs("alice", [] {
        const int h = QuibCgiBeginCriticalSection("/tmp/alices.lock", 0);
        return (h >= 0 && QuibCgiEndCriticalSection(h) == 0) * 10 + (QuibCgiBeginCriticalSection(kLock, 0) == -1);
    }), 11);
    char text[8] = "";
    FILE *target = fopen("/tmp/target", "r");
    ASSERT_NE(target, nullptr);
    EXPECT_STREQ(fgets(text, sizeof text, target), "keep");
    fclose(target);
}

}  // namespace
