/// The inside of the platform's hash of texts.
#pragma once

#include "platform/core.h"

#include <string>
#include <utility>
#include <vector>

struct NLIBC_SZ_HASH {
    std::vector<std::pair<std::string, std::string>> entries; ///< keys and values, in the order of first setting
};
