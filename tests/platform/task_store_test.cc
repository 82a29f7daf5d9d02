// The task store: whose directory it is, hostile owners and ids, byte-exact prefixes, updates
// from several objects, and workers that died.
#include <signal.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "appliance.h"
#include "obx_task.h"
#include "platform_test_util.h"
#include "quib_paths.h"

namespace {

using namespace norvo::testing;
using Tasks = std::unique_ptr<OBX::Task>;

const std::string kAliceDir = QUIB_TASK_DIR "/alice";

// A child that waits to be killed; its pid stays until it is reaped.
pid_t Sleeper() {
    const pid_t pid = fork();
    if (pid == 0) {
        pause();
        _exit(0);
    }
    return pid;
}

std::string ModeOf(const std::string &path) {
    struct stat st {};
    return lstat(path.c_str(), &st) != 0 ? "missing"
                                          : std::to_string(st.st_uid) + ":" + std::to_string(st.st_gid) + " " +
                                                std::to_string(st.st_mode & 07777);
}

class TaskStore : public ::testing::Test {
protected:
    TaskStore() { app_.Basic(); }
    Appliance app_;
};

TEST_F(TaskStore, TheOwnersDirectoryIsTheOwnersAlone) {
    // Only root makes the store; the owner finds it.
    EXPECT_EQ(app_.RunAs("alice", [] { return OBX::TaskMgr("alice").isOpen() ? 1 : VLIBCErrGet() >> 8; }), 6);
    OBX::TaskMgr mgr("alice");
    ASSERT_TRUE(Tasks(mgr.createTask("Tovana_1", getpid())));
    const std::string alice = std::to_string(app_.Uid("alice")) + ":" + std::to_string(app_.Gid("users"));
    EXPECT_EQ(ModeOf(QUIB_TASK_DIR), "0:0 " + std::to_string(0711));
    EXPECT_EQ(ModeOf(kAliceDir), alice + " " + std::to_string(0700));
    EXPECT_EQ(ModeOf(kAliceDir + "/" QUIB_TASK_DB_NAME), alice + " " + std::to_string(0600));
    EXPECT_EQ(app_.RunAs("alice", [&] {
        OBX::TaskMgr own("alice");
        Tasks task(own.getTask("Tovana_1"));
        return task && task->beginUpdate() && task->setProperty("k", 1) && task->endUpdate() ? 1 : 0;
    }), 1);
    EXPECT_EQ(app_.RunAs("bob", [] { return OBX::TaskMgr("alice").isOpen() ? 1 : VLIBCErrGet() >> 8; }), 3);
    // Whatever is not exactly so is refused, to root as well.
    struct Case { const char *what, *command; } cases[] = {
        {"a directory others may enter", "chmod 0710 " QUIB_TASK_DIR "/alice"},
        {"a directory of bob's", "chown bob " QUIB_TASK_DIR "/alice"},
        {"a link to bob's", "mkdir -m 700 /run/b && chown bob /run/b && rm -rf " QUIB_TASK_DIR "/alice && ln -s /run/b " QUIB_TASK_DIR "/alice"},
        {"a database of bob's", "chown bob " QUIB_TASK_DIR "/alice/tasks.db"},
        {"a database others may read", "chmod 0640 " QUIB_TASK_DIR "/alice/tasks.db"},
        {"a journal of bob's", "touch " QUIB_TASK_DIR "/alice/tasks.db-journal && chown bob " QUIB_TASK_DIR "/alice/tasks.db-journal"},
        {"a top others may write", "chmod 0733 " QUIB_TASK_DIR},
        {"a database with a second name", "ln " QUIB_TASK_DIR "/alice/tasks.db /run/x"},
        {"a journal of root's", "install -m 600 /dev/null " QUIB_TASK_DIR "/alice/tasks.db-journal"},
    };
    for (const Case &c : cases) {
        ASSERT_EQ(system("rm -rf /run/b /run/x " QUIB_TASK_DIR), 0);
        ASSERT_TRUE(OBX::TaskMgr("alice").isOpen());
        ASSERT_EQ(system(c.command), 0) << c.what;
        EXPECT_EQ(OUTCOME(OBX::TaskMgr("alice").isOpen()), (Outcome{0, QUIB_ERR_ACCESS_DENIED})) << c.what;
    }
}

TEST_F(TaskStore, HostileOwnersAndIdsAreRefusedOrStayData) {
    const std::string longName(300, 'a'), longId(257, 'i');
    struct Owner { const char *name; int slot; } owners[] = {
        {nullptr, QUIB_ERR_BAD_PARAMETER}, {"", QUIB_ERR_BAD_PARAMETER}, {"/", QUIB_ERR_BAD_PARAMETER},
        {".", QUIB_ERR_BAD_PARAMETER}, {"..", QUIB_ERR_BAD_PARAMETER}, {"../alice", QUIB_ERR_BAD_PARAMETER},
        {"alice/x", QUIB_ERR_BAD_PARAMETER}, {"alice\n", QUIB_ERR_BAD_PARAMETER}, {"al\xffice", QUIB_ERR_BAD_PARAMETER},
        {longName.c_str(), QUIB_ERR_BAD_PARAMETER}, {"carol", QUIB_ERR_NO_SUCH_USER},
    };
    for (const Owner &o : owners) {
        OBX::TaskMgr mgr(nullptr);
        EXPECT_EQ(OUTCOME(OBX::TaskMgr(o.name).isOpen()), (Outcome{0, o.slot})) << (o.name ? o.name : "null");
        EXPECT_FALSE(mgr.hasTask("x"));
        EXPECT_EQ(Tasks(mgr.createTask("x", getpid())), nullptr);
        EXPECT_EQ(mgr.getAllTaskId(""), Json::Value(Json::arrayValue));
    }
    EXPECT_EQ(system("ls -A " QUIB_TASK_DIR " 2>/dev/null | grep -q ."), 256) << "no directory made for any of them";

    OBX::TaskMgr mgr("alice");
    const pid_t gone = Sleeper();
    kill(gone, SIGKILL);
    waitpid(gone, nullptr, 0);
    ASSERT_TRUE(Tasks(mgr.createTask("Tovana_1", getpid())));
    struct Id { const char *id; pid_t pid; int slot; } ids[] = {
        {nullptr, getpid(), QUIB_ERR_BAD_PARAMETER}, {"", getpid(), QUIB_ERR_BAD_PARAMETER},
        {longId.c_str(), getpid(), QUIB_ERR_BAD_PARAMETER}, {"Tovana_1", getpid(), QUIB_ERR_BAD_PARAMETER},
        {"x", 0, QUIB_ERR_BAD_PARAMETER}, {"x", -5, QUIB_ERR_BAD_PARAMETER}, {"x", gone, QUIB_ERR_NO_SUCH_FILE},
    };
    for (const Id &i : ids) {
        EXPECT_EQ(OUTCOME(Tasks(mgr.createTask(i.id, i.pid)) != nullptr), (Outcome{0, i.slot})) << (i.id ? i.id : "null");
    }
    // Quotes, wildcards and path syntax in an id are only bytes.
    for (const char *id : {"it's \"%\"", "../../etc/passwd", "Tovana_*", "x' OR '1'='1"}) {
        Tasks task(mgr.createTask(id, getpid()));
        ASSERT_TRUE(task) << id;
        EXPECT_STREQ(task->getId(), id);
        EXPECT_TRUE(mgr.hasTask(id));
    }
    EXPECT_EQ(mgr.getAllTaskId("").size(), 5u);
    EXPECT_EQ(OUTCOME(Tasks(mgr.getTask("%")) != nullptr), (Outcome{0, QUIB_ERR_NO_SUCH_FILE}));
    EXPECT_FALSE(mgr.hasTask("Tovana_%"));
    EXPECT_FALSE(mgr.hasTask(nullptr));
}

TEST_F(TaskStore, PrefixesCompareBytesNotPatterns) {
    const std::vector<std::string> ids = {"Tovana_1", "TovanaX1", "Tovana%", "tovana_2", "a_b", "aXb", "a%b",
                                          "a%", "ab", "T\xc3\xb6vana_", "_", "%", "Tovana_", "a\\_b"};
    OBX::TaskMgr mgr("alice");
    for (const std::string &id : ids) ASSERT_TRUE(Tasks(mgr.createTask(id.c_str(), getpid()))) << id;
    for (const std::string prefix : {"", "Tovana_", "Tovana%", "a_", "a%", "_", "%", "a\\", "T\xc3", "Tovana_1x", "A"}) {
        Json::Value expected(Json::arrayValue);
        for (const std::string &id : ids)
            if (id.compare(0, prefix.size(), prefix) == 0) expected.append(id);
        EXPECT_EQ(mgr.getAllTaskId(prefix.c_str()), expected) << prefix;
    }
}

TEST_F(TaskStore, UpdatesKeepOtherWritersKeysAndAreAllOrNothing) {
    OBX::TaskMgr mgr("alice");
    Tasks a(mgr.createTask("t", getpid())), b(mgr.getTask("t"));
    ASSERT_TRUE(a && b);
    EXPECT_FALSE(a->setProperty("x", 1)) << "outside an update";
    EXPECT_FALSE(a->endUpdate());
    ASSERT_TRUE(a->beginUpdate() && a->setProperty("x", 1) && a->endUpdate());
    ASSERT_TRUE(b->beginUpdate() && b->setProperty("y", "two") && b->endUpdate());
    EXPECT_TRUE(a->getProperty("y").isNull()) << "not before reload";
    ASSERT_TRUE(a->reload());
    EXPECT_EQ(a->getProperty("x"), 1);
    EXPECT_EQ(a->getProperty("y"), "two");
    EXPECT_TRUE(a->getProperty(nullptr).isNull());
    // An update that is dropped leaves nothing.
    ASSERT_TRUE(a->beginUpdate() && a->setProperty("x", 3));
    a.reset();
    ASSERT_TRUE(b->reload());
    EXPECT_EQ(b->getProperty("x"), 1);
    ASSERT_TRUE(b->remove());
    EXPECT_TRUE(b->remove()) << "already gone";
    EXPECT_EQ(OUTCOME(b->beginUpdate()), (Outcome{0, QUIB_ERR_NO_SUCH_FILE}));
    EXPECT_EQ(OUTCOME(b->reload()), (Outcome{0, QUIB_ERR_NO_SUCH_FILE}));
    EXPECT_EQ(b->getProperty("y"), "two") << "the last state read is kept";
}

TEST_F(TaskStore, ATaskWhoseWorkerIsGoneCountsAsFinished) {
    OBX::TaskMgr mgr("alice");
    const pid_t worker = Sleeper();
    Tasks task(mgr.createTask("w", worker)), self(mgr.createTask("self", getpid()));
    ASSERT_TRUE(task && self);
    EXPECT_FALSE(task->isFinished());
    kill(worker, SIGKILL);
    while (system(("grep -q '^State:.*Z' /proc/" + std::to_string(worker) + "/status").c_str()) != 0) usleep(1000);
    EXPECT_TRUE(task->isFinished()) << "a zombie does no more work";
    waitpid(worker, nullptr, 0);
    EXPECT_TRUE(task->isFinished());
    // The pid alone is not enough: a reused pid is another process.
    EXPECT_FALSE(self->isFinished());
    ASSERT_EQ(system("sqlite3 " QUIB_TASK_DIR "/alice/" QUIB_TASK_DB_NAME " \"UPDATE task SET pid_start = pid_start + 1\""), 0);
    ASSERT_TRUE(self->reload());
    EXPECT_TRUE(self->isFinished());
    // Marked finished, finished whatever the process.
    Tasks other(mgr.createTask("marked", getpid()));
    ASSERT_TRUE(other && other->setFinished() && other->reload());
    EXPECT_TRUE(other->isFinished());
}

}  // namespace
