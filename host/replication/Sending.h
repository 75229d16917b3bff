/// Sending snapshots of a task to its peer: the process that does it, and what others see of it.
#pragma once

#include "host/replication/TaskStore.h"

namespace norvhost {

/// Whether a sender of the task runs.
bool isSending(const char *task_uuid);

/// Ends a running sender and waits until it is gone: NORV_ERR_TIMEOUT when it does not go within ten seconds.
int stopSending(const TaskRow &task);

/// The progress as it is now: a sender that was killed is a failure.
int readProgress(const TaskRow &task, _tag_iscsi_task_progress_ &progress);

} // namespace norvhost
