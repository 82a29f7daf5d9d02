// Task data and progress: waits against a second process that writes while the first waits,
// saving, killing real children, and the clean-up at its age boundary. The passes of a wait are
// counted by standing in for usleep.
#include <errno.h>
#include <signal.h>
#include <sys/wait.h>
#include <time.h>
#include <unistd.h>

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "appliance.h"
#include "norvo/norvoprogress.h"

namespace {

using norvo::testing::Appliance;
using Tasks = std::unique_ptr<OBX::Task>;

std::function<void(useconds_t)> g_onSleep;  // when set, usleep calls it instead of sleeping

}  // namespace

extern "C" __attribute__((visibility("default"))) int usleep(useconds_t us) {
    if (g_onSleep) {
        g_onSleep(us);
        return 0;
    }
    const timespec wait{static_cast<time_t>(us / 1000000), static_cast<long>(us % 1000000) * 1000};
    return nanosleep(&wait, nullptr);
}

namespace {

constexpr char kId[] = "Tovana_w";

// A child that waits to be killed; its pid stays until it is reaped.
pid_t Sleeper() {
    const pid_t pid = fork();
    if (pid == 0) {
        pause();
        _exit(0);
    }
    return pid;
}

// The exit status of a child, or 1000 + signal.
int Reap(pid_t pid) {
    int status = 0;
    waitpid(pid, &status, 0);
    return WIFEXITED(status) ? WEXITSTATUS(status) : 1000 + WTERMSIG(status);
}

// The worker: a process of alice's that, on each command byte, creates the task ('c') or saves
// progress into it ('s'), and answers with a byte when done.
class Writer {
public:
    Writer(uid_t uid, gid_t gid) {
        if (pipe(commands_) != 0 || pipe(done_) != 0) abort();
        pid_ = fork();
        if (pid_ == 0) {
            close(commands_[1]);
            if (setresgid(gid, gid, gid) != 0 || setresuid(uid, uid, uid) != 0) _exit(1);
            OBX::TaskMgr mgr("alice");
            char command;
            while (read(commands_[0], &command, 1) == 1) {
                const bool ok = command == 'c' ? Tasks(mgr.createTask(kId, getpid())) != nullptr
                                               : SaveTaskData(Tasks(mgr.getTask(kId)).get(), Json::Value("d"), 0.5f);
                if (write(done_[1], ok ? "y" : "n", 1) != 1) _exit(1);
            }
            _exit(0);
        }
        close(commands_[0]);
        close(done_[1]);
    }
    ~Writer() {
        close(commands_[1]);
        close(done_[0]);
        Reap(pid_);
    }
    bool Do(char command) {
        char answer = 0;
        return write(commands_[1], &command, 1) == 1 && read(done_[0], &answer, 1) == 1 && answer == 'y';
    }

private:
    int commands_[2], done_[2];
    pid_t pid_;
};

class TaskData : public ::testing::Test {
protected:
    TaskData() { app_.Basic(); }
    Appliance app_;
};

TEST_F(TaskData, WaitsCountPassesAndSeeAnotherProcessWrite) {
    enum Fn { kTask, kKey, kMgr, kNullMgr };
    struct Case { Fn fn; unsigned limit; const char *before, *after; int at; bool ready; int sleeps; } cases[] = {
        // before: commands done before the wait; after: done at sleep number `at`.
        {kTask, 0, "cs", "", 0, false, 0},  {kTask, 10, "c", "", 0, false, 1},   {kTask, 10, "cs", "", 0, true, 0},
        {kTask, 10, "c", "s", 1, false, 1}, {kTask, 11, "c", "s", 1, true, 1},   {kTask, 30, "c", "s", 2, true, 2},
        {kTask, 30, "c", "", 0, false, 3},  {kTask, 4294967295u, "c", "s", 5, true, 5},
        // A value without the member is ready; the member is only looked for in null.
        {kKey, 0, "cs", "", 0, false, 0},   {kKey, 10, "cs", "", 0, true, 0},    {kKey, 11, "c", "s", 1, true, 1},
        {kKey, 20, "c", "", 0, false, 2},
        // Waits for the task, then for the property with the whole limit again.
        {kMgr, 0, "cs", "", 0, false, 0},   {kNullMgr, 30, "cs", "", 0, false, 3}, {kMgr, 10, "", "cs", 1, false, 1},
        {kMgr, 11, "", "cs", 1, true, 1},   {kMgr, 20, "c", "", 0, false, 2},    {kMgr, 20, "", "c", 1, false, 3},
    };
    for (const Case &c : cases) {
        const std::string name = std::to_string(c.fn) + "/" + std::to_string(c.limit) + "/" + c.before + "/" + c.after;
        if (Tasks old{OBX::TaskMgr("alice").getTask(kId)}) old->remove();
        Writer writer(app_.Uid("alice"), app_.Gid("users"));
        for (const char *command = c.before; *command != '\0'; ++command) ASSERT_TRUE(writer.Do(*command)) << name;
        // The waiter is a process of its own: the manager's wait keeps the task it read.
        const pid_t waiter = fork();
        if (waiter == 0) {
            int sleeps = 0;
            bool wrong = false;
            g_onSleep = [&](useconds_t us) {
                wrong = wrong || us != 100000;
                if (++sleeps == c.at)
                    for (const char *command = c.after; *command != '\0'; ++command) wrong = !writer.Do(*command) || wrong;
            };
            OBX::TaskMgr mgr("alice");
            Tasks task(mgr.getTask(kId));
            bool ready = false;
            switch (c.fn) {
                case kTask: ready = WaitForTaskDataReady(task.get(), "progress", c.limit); break;
                case kKey: ready = WaitForTaskDataKeyReady(task.get(), "data", "missing", c.limit); break;
                case kMgr: ready = WaitForMgrTaskDataReady(&mgr, kId, "progress", c.limit); break;
                case kNullMgr: ready = WaitForMgrTaskDataReady(nullptr, kId, "progress", c.limit); break;
            }
            _exit(wrong ? 99 : ready * 50 + sleeps);
        }
        EXPECT_EQ(Reap(waiter), c.ready * 50 + c.sleeps) << name;
    }
    EXPECT_TRUE(app_.ErrorLines().empty());
}

TEST_F(TaskData, SaveWritesProgressAsADoubleAndLogsAFailedWrite) {
    OBX::TaskMgr mgr("alice");
    Tasks task(mgr.createTask(kId, getpid())), reader(mgr.getTask(kId));
    Json::Value data;
    data["files"][0] = "na\xc3\xafve \"x\"";
    data["done"] = 3;
    ASSERT_TRUE(SaveTaskData(task.get(), data, 0.1f));
    ASSERT_TRUE(reader->reload());
    EXPECT_EQ(reader->getProperty("progress"), static_cast<double>(0.1f));
    EXPECT_EQ(reader->getProperty("data"), data);
    ASSERT_TRUE(reader->remove());
    EXPECT_FALSE(SaveTaskData(task.get(), data, 1));
    EXPECT_FALSE(SaveTaskData(nullptr, data, 1));
    EXPECT_EQ(app_.ErrorLines(), std::vector<std::string>{"Failed to write progress."});
}

TEST_F(TaskData, KillSignalsOnlyWhatItIsGiven) {
    const pid_t child = Sleeper(), gone = Sleeper();
    kill(gone, SIGKILL);
    Reap(gone);
    EXPECT_TRUE(DoKill(child));
    EXPECT_EQ(Reap(child), 1000 + SIGTERM);
    EXPECT_FALSE(DoKill(gone)) << "gone: no line";
    EXPECT_FALSE(DoKill(0));
    EXPECT_FALSE(DoKill(-5));
    const pid_t roots = Sleeper();
    EXPECT_EQ(app_.RunAs("bob", [&] { return DoKill(roots) ? 1 : 0; }), 0);
    kill(roots, SIGKILL);
    Reap(roots);
    EXPECT_EQ(app_.ErrorLines(), (std::vector<std::string>{
                                     "invalid process id", "invalid process id",
                                     "norvoprogress (#) Failed to kill " + std::to_string(roots) +
                                         ", reason=Operation not permitted(1)"}));
}

TEST_F(TaskData, CleanUpRemovesFinishedFileManagerTasksTwoDaysFromNow) {
    struct Case { const char *id; long age; enum { kFinished, kRunning, kDead } state; bool kept; } cases[] = {
        {"Tovana_a", 172799, Case::kFinished, true},   {"Tovana_b", 172800, Case::kFinished, false},
        {"Tovana_c", -172799, Case::kFinished, true},  {"Tovana_d", -172800, Case::kFinished, false},
        {"Tovana_e", 3000000, Case::kRunning, true},   {"Tovana_f", 172800, Case::kDead, false},
        {"Tovana_g", 0, Case::kDead, true},            {"TovanaXb", 172800, Case::kFinished, true},
        {"tovana_b", 172800, Case::kFinished, true},   {"Other_b", 172800, Case::kFinished, true},
        {"Tovana_", 172800, Case::kFinished, false},
    };
    OBX::TaskMgr mgr("alice");
    // The ages are counted from the second the clean-up runs in: tried again if the clock ticks.
    for (time_t now = 0; now != time(nullptr);) {
        for (const Json::Value &id : mgr.getAllTaskId("")) Tasks(mgr.getTask(id.asCString()))->remove();
        const pid_t dead = Sleeper();
        now = time(nullptr);
        for (const Case &c : cases) {
            Tasks task(mgr.createTask(c.id, c.state == Case::kDead ? dead : getpid()));
            ASSERT_TRUE(task && task->setCreateTime(now - c.age) && (c.state != Case::kFinished || task->setFinished()));
        }
        kill(dead, SIGKILL);
        Reap(dead);
        // Other owners' calls touch nothing of alice's; her own process may clean up.
        EXPECT_EQ(app_.RunAs("bob", [] { CleanTimeOutTasks("alice"); CleanTimeOutTasks("bob"); return 0; }), 0);
        CleanTimeOutTasks(nullptr);
        CleanTimeOutTasks("../alice");
        ASSERT_EQ(mgr.getAllTaskId("").size(), std::size(cases));
        EXPECT_EQ(app_.RunAs("alice", [] { CleanTimeOutTasks("alice"); return 0; }), 0);
    }
    for (const Case &c : cases) EXPECT_EQ(mgr.hasTask(c.id), c.kept) << c.id;
    EXPECT_TRUE(app_.ErrorLines().empty());
}

}  // namespace
