/// The operations on one virtual LUN.
#pragma once

#include "iscsiwebapi/ISCSIExport.h"
#include "iscsiwebapi/ISCSIVLUNInfo.h"

#include <set>
#include <string>

namespace ISCSI::LIB::LIBVLUN {

/// Methods return an error code (ISCSIErrorCode.h), log what failed to the system log, and throw
/// nothing. Output arguments are written only on success.
class ISCSIWEBAPI_EXPORT ISCSILIBVLUN {
public:
    ISCSIVLUNInfo info;                ///< the virtual LUN acted on
    _tag_viscsi_virtual_lun_ record{}; ///< buffer of the platform calls

    ISCSILIBVLUN() = default;
    explicit ISCSILIBVLUN(const std::string &uuid);
    ISCSILIBVLUN(_tag_iscsi_vlun_type type, const std::string &src_lun_uuid);
    virtual ~ISCSILIBVLUN();

    /// Creates a virtual LUN over `info.src_lun_uuid`; `info.uuid` receives its UUID.
    int createVLUN();

    /// Deletes it and ends its transfer.
    int deleteVLUN();

    /// How the transfer stands: `state` 0 or the errno value that ended it, `first` bytes moved of
    /// `second`.
    int loadStatus(int &state, unsigned long long &first, unsigned long long &second);

    /// Attaches it to the sink LUN `dst_lun_uuid` of a node through the first of the portals, and so
    /// starts the transfer. ERR_NO_PORTAL for an empty set.
    int bind(const std::string &dst_lun_uuid, const std::string &node_uuid, const std::set<std::string> &portals);
};

} // namespace ISCSI::LIB::LIBVLUN
