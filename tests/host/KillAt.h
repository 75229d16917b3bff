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

/// Kills a process of its own before the n-th system call of the work that may change something; false when the work
/// ended before.
bool killAtSystemCall(int n, const std::function<int()> &work);

} // namespace norvhost
