/// What initiators may do with a target.
#pragma once

#include "platform/iscsi_masking.h"

#include <map>
#include <string>
#include <string_view>

namespace norvhost {

struct Masking {
    std::map<std::string, int> named; ///< by normal name
    int others = NORV_AUTHORITY_NONE; ///< the default entry

    /// The permission of an initiator; none for what is no iSCSI name.
    int of(std::string_view initiator) const;

    /// Whether some entry gives this permission.
    bool gives(int permission) const;

    /// Whether every initiator has this permission.
    bool isOpen(int permission) const;
};

} // namespace norvhost
