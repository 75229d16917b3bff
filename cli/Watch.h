/// Long actions: started, and followed to their end.
#pragma once

#include "webapi/handlers/Route.h"

#include <json/value.h>

#include <cstdint>
#include <functional>
#include <string>

namespace cli {

/// How far an action is.
struct Progress {
    bool running = false;
    uint64_t done = 0;
    uint64_t total = 0; ///< bytes; 0 when it cannot be told
};

/// The request that starts an action, and how to see what becomes of it.
struct Action {
    std::string path; ///< of the Post
    Json::Value input;
    std::string title;             ///< "Exporting vm1_nightly"
    std::string later;             ///< what tells about it when nobody watches any more
    std::function<Progress()> ask; ///< throws Failure when the action has failed
    /// Hears the request's answer, for an `ask` that needs it; may be empty.
    std::function<void(const Json::Value &)> started = nullptr;
};

/// Starts the action and shows on standard error how far it is, until it has ended: a bar on a terminal, else lines.
/// Ctrl-C leaves the action running. Returns the answer of the request; throws Failure of the request or the action.
Json::Value watch(const Action &action);

} // namespace cli
