/// Limits, in seconds, of the waits for a platform action.
#pragma once

namespace ISCSI::LIB::LIBLUN {

constexpr int ACTION_LIMIT = 1800; ///< a snapshot, restore or clone
constexpr int CANCEL_LIMIT = 180;
constexpr int NO_LIMIT = 0;

} // namespace ISCSI::LIB::LIBLUN
