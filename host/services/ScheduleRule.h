/// When a schedule runs, as pure functions of its rule.
#pragma once

#include <bitset>
#include <cstdint>
#include <optional>
#include <string_view>

namespace norvhost {

/// A period, or the minutes of local time that five cron fields name.
struct ScheduleRule {
    int64_t period = 0; ///< seconds; 0 = the fields below
    std::bitset<60> minutes;
    std::bitset<24> hours;
    std::bitset<32> days; ///< of the month; bit 0 is not used
    std::bitset<13> months;
    std::bitset<7> weekdays; ///< from Sunday
};

/// Reads a rule of the forms that iscsihost::addSchedule() names: NORV_ERR_BAD_PARAMETER with the field that is wrong.
int parseScheduleRule(std::string_view text, ScheduleRule &rule);

/// The first time after `now`, in seconds since the epoch: for a period a multiple of it away from `anchor`. Nothing
/// when it never comes ("0 0 31 2 *").
///
/// Where fields name particular hours, a time that the clock skips in spring comes when it has skipped, and one that
/// the clock shows twice in autumn comes the first time; with every hour named, the hours that really pass count.
std::optional<int64_t> nextRun(const ScheduleRule &rule, int64_t anchor, int64_t now);

} // namespace norvhost
