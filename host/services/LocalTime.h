/// Local time as the functions of this folder that are pure but for the time zone see it.
#pragma once

#include <cstdint>
#include <ctime>

namespace norvhost {

inline tm localTime(int64_t seconds)
{
    const auto time = static_cast<time_t>(seconds);
    tm local = {};
    localtime_r(&time, &local);
    return local;
}

} // namespace norvhost
