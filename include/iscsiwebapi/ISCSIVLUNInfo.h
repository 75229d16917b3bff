/// The record of one virtual LUN: a local LUN's data on its way to a sink LUN of another node.
#pragma once

#include "iscsiwebapi/ISCSIExport.h"
#include "platform/virtual_lun.h"

#include <json/value.h>

#include <string>

namespace ISCSI {

/// Kind of a virtual LUN; only kind 1 can be created.
enum _tag_iscsi_vlun_type : unsigned int {
    VLUN_TYPE_NONE = 0,
    VLUN_TYPE_1 = 1,
    VLUN_TYPE_2 = 2,
    VLUN_TYPE_3 = 3,
};

/// A value object. Methods that return int return an error code (ISCSIErrorCode.h), log what failed
/// to the system log, and throw nothing.
class ISCSIWEBAPI_EXPORT ISCSIVLUNInfo {
public:
    std::string uuid;
    _tag_iscsi_vlun_type type = VLUN_TYPE_NONE;
    std::string src_lun_uuid; ///< of the local LUN

    ISCSIVLUNInfo() = default;
    explicit ISCSIVLUNInfo(const std::string &uuid);
    ISCSIVLUNInfo(_tag_iscsi_vlun_type type, const std::string &src_lun_uuid);
    ISCSIVLUNInfo(const ISCSIVLUNInfo &) = default;
    ISCSIVLUNInfo &operator=(const ISCSIVLUNInfo &) = default;
    ISCSIVLUNInfo(ISCSIVLUNInfo &&) = default;
    ISCSIVLUNInfo &operator=(ISCSIVLUNInfo &&) = default;
    virtual ~ISCSIVLUNInfo();

    /// Loads the virtual LUN named by `uuid` into `out` and this object. `uuid` then holds the source
    /// LUN's UUID; `src_lun_uuid` is unchanged.
    int loadFromConfig(_tag_viscsi_virtual_lun_ &out, int flag);

    /// One line for the log.
    std::string toString() const;

    /// Sets the record's keys in `value`. Returns 3328, and writes nothing, when the UUID is empty.
    int toJsonFormat(Json::Value &value) const;
};

} // namespace ISCSI
