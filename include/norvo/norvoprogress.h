// Task data and progress: waiting for a background task's record, saving its progress, stopping
// its process, and removing old finished tasks of the file manager. The records are the task
// store's (obx_task.h). These functions report through their results and the log only; the
// error slot is left alone.
#pragma once
#include <json/value.h>

#include "norvo/export.h"
#include "obx_task.h"

NORVO_BEGIN_C

// Limits count 10 for each pass of 100 ms (100 is about a second); 0 returns false at once.

// true once task's property key is not null; each pass reloads the task first. With limit 10
// one check, with 11 two. false for a null task or key.
NORVO_API bool WaitForTaskDataReady(OBX::Task *task, const char *key, unsigned limit);
// Waits until mgr knows taskId (a null mgr sleeps through the limit), then waits for the
// property with the whole limit again. The task object it reads is never deleted (intended:
// callers have always relied on nothing more).
NORVO_API bool WaitForMgrTaskDataReady(OBX::TaskMgr *mgr, const char *taskId, const char *key,
                                       unsigned limit);
// As WaitForTaskDataReady, except that a null value is then asked for member, which a null value
// never has; so in effect this waits for the property alone. Intended: kept as callers know it.
NORVO_API bool WaitForTaskDataKeyReady(OBX::Task *task, const char *key, const char *member, unsigned limit);
// Writes "progress" (as a double) and "data" in one update. false, logged, when not written.
NORVO_API bool SaveTaskData(OBX::Task *task, const Json::Value &data, float progress);
// Sends SIGTERM to pid. false for a pid below 1 (logged), or when kill fails (logged unless
// the process is already gone).
NORVO_API bool DoKill(int pid);
// Removes owner's finished tasks with ids beginning "Tovana_" created 172,800 seconds or more
// from now, either way. Unfinished tasks are kept however old.
NORVO_API void CleanTimeOutTasks(const char *owner);

NORVO_END_C
