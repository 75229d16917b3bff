/// Schedules: stored jobs of LUNs, at most one of a kind for each LUN. They go with their LUN.
#pragma once

#include <cstdint>
#include <string_view>

namespace norvhost {

/// The LUN's snapshot task as its name finds it, and its scheduled-snapshot task as its ID does.
constexpr const char *backup_schedule = "backup";
constexpr const char *snapshot_schedule = "snapshot";

/// Stores a job; `id` is set on success. NORV_ERR_NO_SUCH_LUN, NORV_ERR_FILE_EXISTS when the LUN has one of the kind.
int addSchedule(std::string_view kind, int lid, std::string_view rule, int64_t &id);

} // namespace norvhost
