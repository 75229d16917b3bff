/// Retention policies: rows that say how long an object's snapshots are kept.
#pragma once

#include <string_view>

namespace norvhost {

/// The kind of the policies of LUNs; their key is the LUN ID in decimal.
constexpr const char *lun_retention_kind = "Lun#";

/// Stores a policy, in place of an earlier one. 0, else an error code.
int setRetentionPolicy(std::string_view kind, std::string_view key, std::string_view policy);

/// 0, also when there is none.
int removeRetentionPolicy(std::string_view kind, std::string_view key);

} // namespace norvhost
