/// What a LUN is in a replication: a source that initiators write, or a sink that only its peer does.
#pragma once

#include "host/replication/TaskStore.h"
#include "host/storage/LunStore.h"

namespace norvhost {

/// Turns the destination of a task into its source: the sink is closed, a state that arrived in part gives way to the
/// last whole one, and the LUN is an ordinary one. NORV_ERR_CONVERT_TASK when there is no whole state.
int becomeSource(TaskRow &task);

/// Turns the source of a task into its destination. What was written since the last snapshot that both sides have
/// goes when the first snapshot arrives. NORV_ERR_TASK_LOCKED while it sends, NORV_ERR_CONVERT_TASK while other tasks
/// have the LUN as their source.
int becomeDestination(TaskRow &task);

/// Turns a sink into an ordinary LUN with the last whole state that it received.
int releaseSink(const LunRow &lun);

/// Shuts out whoever is writing to the sink, as incomplete; none is no failure.
int shutSink(const std::string &lun_uuid);

/// Sets the LUN back to its snapshot of that version: NORV_ERR_NO_SUCH_SNAPSHOT when it has none.
int setBackTo(const LunRow &lun, std::string_view version);

} // namespace norvhost
