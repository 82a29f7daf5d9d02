#include <errno.h>
#include <signal.h>
#include <stdint.h>
#include <string.h>
#include <syslog.h>
#include <time.h>
#include <unistd.h>

#include <memory>

#include "common/log.h"
#include "common/modules.h"
#include "norvo/norvoprogress.h"

namespace {

constexpr useconds_t kPassMicroseconds = 100000;
constexpr unsigned kPassCount = 10;
constexpr char kFileManagerPrefix[] = "Tovana_";
constexpr long long kMaxAge = 172799;

// No exception crosses the boundary; these functions leave the error slot alone, so an
// escaping one (bad_alloc in practice) is just the failure value.
template <typename R, typename F>
R Caught(R failResult, F &&body) noexcept {
    try {
        return body();
    } catch (...) {
        return failResult;
    }
}

// Passes of the waits: n = 1, 2, ... while 10 x n is below limit, each ended by a sleep.
template <typename Ready>
bool Poll(unsigned limit, Ready &&ready) {
    if (limit == 0) {
        return false;
    }
    for (uint64_t n = 1;; ++n) {
        if (ready()) {
            return true;
        }
        usleep(kPassMicroseconds);
        if (kPassCount * n >= limit) {
            return false;
        }
    }
}

}  // namespace

bool WaitForTaskDataReady(OBX::Task *task, const char *key, unsigned limit) {
    return Caught(false, [&] {
        return limit != 0 && task != nullptr && key != nullptr && Poll(limit, [&] {
                   task->reload();
                   return !task->getProperty(key).isNull();
               });
    });
}

bool WaitForMgrTaskDataReady(OBX::TaskMgr *mgr, const char *taskId, const char *key, unsigned limit) {
    return Caught(false, [&] {
        if (limit == 0) {
            return false;
        }
        // 64 bits: a count near UINT_MAX must not wrap and wait forever.
        for (uint64_t count = 0;;) {
            count += kPassCount;
            if (mgr != nullptr && mgr->hasTask(taskId)) {
                break;
            }
            usleep(kPassMicroseconds);
            if (count >= limit) {
                return false;
            }
        }
        return WaitForTaskDataReady(mgr->getTask(taskId), key, limit);
    });
}

bool WaitForTaskDataKeyReady(OBX::Task *task, const char *key, const char *member, unsigned limit) {
    return Caught(false, [&] {
        return limit != 0 && task != nullptr && key != nullptr && Poll(limit, [&] {
                   task->reload();
                   if (!task->getProperty(key).isNull()) {
                       return true;
                   }
                   return member != nullptr && task->getProperty(key).isMember(member);
               });
    });
}

bool SaveTaskData(OBX::Task *task, const Json::Value &data, float progress) {
    return Caught(false, [&] {
        if (task == nullptr) {
            return false;
        }
        task->beginUpdate();
        task->setProperty("progress", Json::Value(static_cast<double>(progress)));
        task->setProperty("data", data);
        if (!task->endUpdate()) {
            syslog(LOG_ERR, "Failed to write progress.");
            return false;
        }
        return true;
    });
}

bool DoKill(int pid) {
    if (pid < 1) {
        syslog(LOG_ERR, "invalid process id");
        return false;
    }
    if (kill(pid, SIGTERM) == 0) {
        return true;
    }
    const int err = errno;
    if (err != ESRCH) {
        NVO_LOG(norvo::kNorvoProgress, "%s (%d) Failed to kill %d, reason=%s(%d)", pid, strerror(err), err);
    }
    return false;
}

void CleanTimeOutTasks(const char *owner) {
    Caught(0, [&] {
        OBX::TaskMgr mgr(owner);
        const time_t now = time(nullptr);
        const Json::Value ids = mgr.getAllTaskId(kFileManagerPrefix);
        for (const Json::Value &id : ids) {
            const std::unique_ptr<OBX::Task> task(mgr.getTask(id.asCString()));
            if (task == nullptr || !task->isFinished()) {
                continue;
            }
            const long long age = static_cast<long long>(task->getCreateTime()) - static_cast<long long>(now);
            if (age > kMaxAge || -age > kMaxAge) {
                task->remove();
            }
        }
        return 0;
    });
}
