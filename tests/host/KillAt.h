/// Killing a process at a chosen point.
#pragma once

#include <functional>

namespace norvhost {

/// Kills a process of its own before the n-th system call of the work; false when the work ended before.
bool killAtSystemCall(int n, const std::function<int()> &work);

} // namespace norvhost
