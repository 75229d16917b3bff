/// Rows of sessions.
#pragma once

#include "iscsihost/session.h"

#include <cstdint>
#include <optional>
#include <string>

namespace norvhost {

struct NewSession {
    std::string account;
    std::string app; ///< empty for a person's
    std::string opened_from;
    std::string address;             ///< the only one that it may be used from; empty for any
    std::optional<int64_t> duration; ///< seconds, 0 for no end; none for a person's, which has limits
};

// Each returns 0 or an error code.

/// Adds a session, and removes what has ended. To be called in a transaction.
int openSession(const NewSession &wanted, std::string &token);

/// `found` is false when no session has the token.
int endSession(const std::string &token, bool &found);

/// Ends a person's sessions.
int endSessionsOf(const std::string &account);

} // namespace norvhost
