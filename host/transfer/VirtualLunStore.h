/// Rows of virtual LUNs in the state store.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

namespace norvhost {

struct VirtualLunRow {
    std::string uuid;
    int lid = 0; ///< of the source
    int kind = 0;
    std::string node, portal, sink; ///< what it is bound to; empty before
    std::string sink_iqn;           ///< of the sink's target, as long as it may be open for us
    uint64_t moved = 0, total = 0;  ///< bytes, of a transfer that ended
    bool ended = false;
    int state = 0; ///< errno value of a transfer that ended otherwise than complete
};

// Each returns 0 or an error code. Those of one row: NORV_ERR_VLUN_UUID when there is none.

int loadVirtualLun(std::string_view uuid, VirtualLunRow &row);
int insertVirtualLun(const VirtualLunRow &row);
/// A transfer begins.
int bindVirtualLun(const VirtualLunRow &row);
/// A transfer is over, unless it was said to be before.
int endVirtualLun(const std::string &uuid, int state, uint64_t moved, uint64_t total);
/// The sink whose target bears this name is not open for us any more.
int forgetSink(const std::string &uuid, const std::string &sink_iqn);
int deleteVirtualLun(const std::string &uuid);

} // namespace norvhost
