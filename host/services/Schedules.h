/// Schedules: stored jobs of LUNs, at most one of a kind for each LUN. They go with their LUN.
#pragma once

#include "iscsihost/host.h"

#include <string_view>

namespace norvhost {

/// The LUN's snapshot task as its name finds it, and its scheduled-snapshot task as its ID does.
constexpr const char *backup_schedule = "backup";
constexpr const char *snapshot_schedule = "snapshot";

/// As iscsihost::addSchedule(); `id` is set on success. NORV_ERR_NO_SUCH_LUN, NORV_ERR_FILE_EXISTS when the LUN has
/// one of the kind.
int addSchedule(std::string_view kind, int lid, std::string_view rule, int64_t &id);

int listSchedules(std::vector<iscsihost::Schedule> &schedules);

/// NORV_ERR_BAD_PARAMETER when there is none with this ID.
int removeSchedule(int64_t id);

/// The snapshot jobs that are due at `now`, each claimed: its next run is after `now`, so nobody else gets it. Jobs of
/// LUNs in the trash wait until these are back.
int claimDueSchedules(int64_t now, std::vector<iscsihost::Schedule> &due);

/// As iscsihost::runDueSchedules().
int runDueSchedules(std::vector<iscsihost::ScheduleRun> &runs);

} // namespace norvhost
