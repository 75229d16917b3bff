/// Rows of LUNs in the state store.
#pragma once

#include "platform/iscsi_lun.h"

#include <functional>
#include <string>
#include <string_view>

namespace norvhost {

struct LunRow {
    _tag_iscsi_lun_ record = {};
    bool loaded = true; ///< wanted in the running iSCSI service
};

// Each returns 0, NORV_ERR_NO_SUCH_LUN or another error code. `row` is written on success only.
int loadLunByLid(int lid, LunRow &row);
int loadLunByUuid(std::string_view uuid, LunRow &row);
int loadLunByName(std::string_view name, LunRow &row);

/// Shows every LUN, ascending by ID; there are at most NORV_LUN_ID_MAX.
int forEachLun(const std::function<void(const LunRow &)> &visit);

/// Targets that the LUN is mapped to.
int countMappings(int lid, int &count);

/// Adds a row: NORV_ERR_LUN_NAME_EXISTS when another LUN bears the name, NORV_ERR_LUN_LOCATION when the volume was
/// removed meanwhile or another LUN has the device.
int insertLun(const LunRow &row);

/// Stores name, size, options and loaded mark of an existing row: NORV_ERR_LUN_NAME_EXISTS as above.
/// With the trash option newly set, NORV_ERR_LUN_MAPPED while it is mapped.
int updateLun(const LunRow &row);

/// Removes the row with the LUN's schedules and retention policy; NORV_ERR_LUN_MAPPED while it is mapped.
int removeLun(int lid);

/// A new random UUID.
std::string newUuid();

} // namespace norvhost
