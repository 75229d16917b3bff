/// The portal's decisions, from the state store and the daemons.
#pragma once

#include "host/target/Masking.h"
#include "host/target/portal/Conversation.h"
#include "host/target/Tgtd.h"
#include "platform/iscsi_target.h"

#include <chrono>
#include <string>
#include <vector>

namespace norvhost::portal {

/// Reads the store at every login, so that a change needs no signal.
///
/// A daemon knows initiators by the exact bytes of their names only. One that the default entry lets in,
/// or that writes its name in other letter case than its entry, is bound to the daemon's target here before
/// it is sent there, under the service lock.
class StoreDirectory : public Directory {
public:
    std::vector<std::string> targetsFor(const std::string &initiator) override;
    Decision decide(const std::string &initiator, const std::string &target) override;

private:
    /// A login on its way from here to a daemon, which its daemon does not count yet.
    struct Redirected {
        std::string target; ///< its name: target IDs are used again
        std::string initiator;
        std::chrono::steady_clock::time_point until;
    };

    bool isFull(const _tag_iscsi_target_ &target, const Tgtd &daemon, const std::string &initiator, int &error);
    Decision bindLearned(const Tgtd &daemon, const std::string &initiator, const std::string &target);
    int makeRoom(const Tgtd &daemon, int tid, const Masking &masking, const std::string &added, bool &room);

    std::vector<Redirected> redirected;
};

/// Ends sessions above their target's limit, the newest first: those that went past the portal.
void enforceSessionLimits();

} // namespace norvhost::portal
