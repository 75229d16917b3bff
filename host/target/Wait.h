/// Waiting for what nobody announces.
#pragma once

#include <chrono>
#include <poll.h>

namespace norvhost {

/// Asks every few milliseconds until `done` says true; false when the limit comes first.
template <class Done>
bool waitFor(std::chrono::milliseconds limit, Done done)
{
    const auto deadline = std::chrono::steady_clock::now() + limit;
    while (!done()) {
        if (std::chrono::steady_clock::now() >= deadline)
            return false;
        poll(nullptr, 0, 3);
    }
    return true;
}

} // namespace norvhost
