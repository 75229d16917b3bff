/// Retention as pure functions: a policy's text, and what a policy keeps.
#pragma once

#include "iscsihost/host.h"

#include <string_view>

namespace norvhost {

using iscsihost::RetentionPolicy;

/// The policy as it is stored: {"newest":7,"hourly":24,"daily":7,"weekly":4}; a rule that is not there is 0.
std::string retentionText(const RetentionPolicy &policy);

/// NORV_ERR_BAD_PARAMETER for a text of another form, and for a policy that checkRetention() refuses.
int parseRetention(std::string_view text, RetentionPolicy &policy);

/// Every rule is 0 or more, and one is not 0.
int checkRetention(const RetentionPolicy &policy);

struct RetentionCandidate {
    int64_t time = 0; ///< seconds since the epoch
    std::string lock; ///< why it never goes, empty for one that is not locked
};

struct RetentionDecision {
    bool kept = false;
    std::string reason;
};

/// One decision for each candidate. Locked ones, and those with a time after `now`, are kept and count for no rule;
/// `now` decides nothing else. Of two with the same time the later one of the list is the newer.
std::vector<RetentionDecision> decideRetention(const std::vector<RetentionCandidate> &candidates,
                                               const RetentionPolicy &policy, int64_t now);

} // namespace norvhost
