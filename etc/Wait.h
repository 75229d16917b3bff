/// Waiting by polling: once a second, until a limit.
#pragma once

#include <cstdint>
#include <unistd.h>

namespace ISCSI {

/// Counts the seconds of one wait:
///
///     for (Wait wait(timeout);;) {
///         ... ask; return when done ...
///         if (wait.expired())
///             return fail(ERR_TIMEOUT, ...);
///     }
class Wait {
public:
    /// `limit` in seconds, 0 for none.
    explicit Wait(unsigned int limit) : limit(limit) {}

    /// Lets a second pass; whether the limit is reached.
    bool expired() { return expiredAfter(count + 1); }

    /// The same, counting only seconds without progress; the first is compared with 0.
    bool stalled(uint64_t progress)
    {
        const bool moved = progress != previous;
        previous = progress;
        return expiredAfter(moved ? 0 : count + 1);
    }

private:
    bool expiredAfter(unsigned int seconds)
    {
        count = seconds;
        sleep(1);
        return limit != 0 && count >= limit;
    }

    unsigned int limit;
    unsigned int count = 0;
    uint64_t previous = 0;
};

} // namespace ISCSI
