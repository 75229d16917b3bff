/// Killing a process at a chosen point.
#pragma once

#include <functional>
#include <sys/types.h>

namespace norvhost {

/// Another process that has the state open, as the daemons have: the last one to close it writes everything back.
class StateKeeper {
public:
    StateKeeper();
    ~StateKeeper();
    StateKeeper(const StateKeeper &) = delete;
    StateKeeper &operator=(const StateKeeper &) = delete;

private:
    pid_t process;
};

/// Kills the work before each of its system calls that may change something, from the same beginning each time, and
/// looks at what is left. It must have more of them than `least`, or it was not followed.
void killAtEverySystemCall(int least, const std::function<void()> &prepare, const std::function<int()> &work,
                           const std::function<void()> &check);

} // namespace norvhost
