/// Virtual LUNs as the front ends list and follow them.
#pragma once

#include <cstdint>
#include <iscsihost/host.h>
#include <string>
#include <vector>

namespace iscsihost {

/// A virtual LUN and what it sends.
struct VirtualLun {
    std::string uuid;
    std::string src_lun_uuid;
    std::string node_uuid;    ///< where it is bound to; this and the next two are empty before
    std::string dst_lun_uuid; ///< of the sink LUN there
    std::string portal;
    uint64_t moved = 0;   ///< bytes
    uint64_t total = 0;   ///< bytes; 0 while it is not known yet
    bool running = false; ///< its transfer goes on
    bool ended = false;   ///< its transfer came to an end, by itself
    int state = 0;        ///< 0, or the errno value that ended the transfer
};

/// Every virtual LUN, ascending by age.
ISCSI_HOST_API int listVirtualLuns(std::vector<VirtualLun> &vluns);

/// The transfer of a LUN that this virtual LUN makes, with an empty UUID the latest; after the virtual LUN's removal as
/// it was then, for the latest 16 of a LUN. One that is neither running nor ended was stopped by the removal. 18991001
/// ("Bad vLUN UUID") when there is none.
ISCSI_HOST_API int findTransfer(const std::string &src_lun_uuid, const std::string &vlun_uuid, VirtualLun &vlun);

} // namespace iscsihost
