/// Retention policies: rows that say how many of an object's snapshots are kept, and runs of them.
#pragma once

#include "host/services/RetentionPolicy.h"

#include "platform/retention.h"

#include <cstdlib>
#include <memory>
#include <string_view>

namespace norvhost {

/// The kind of the policies of LUNs; their key is the LUN ID in decimal.
constexpr const char *lun_retention_kind = "Lun#";

/// Stores a policy, in place of an earlier one. 0, else an error code.
int setRetentionPolicy(std::string_view kind, std::string_view key, const RetentionPolicy &policy);

/// `found` is false, and the policy untouched, when there is none.
int loadRetentionPolicy(std::string_view kind, std::string_view key, bool &found, RetentionPolicy &policy);

/// 0, also when there is none.
int removeRetentionPolicy(std::string_view kind, std::string_view key);

/// A list of what a policy can keep or let go, from the C allocator.
struct FreeTargets {
    void operator()(_tag_retention_target_ *target) const
    {
        while (target) {
            _tag_retention_target_ *const next = target->next;
            free(target);
            target = next;
        }
    }
};
using RetentionTargets = std::unique_ptr<_tag_retention_target_, FreeTargets>;

/// As iscsihost::tryRetention().
int tryRetention(int lid, const RetentionPolicy *policy, std::vector<iscsihost::RetentionVerdict> &verdicts);

} // namespace norvhost
