/// LUN kinds as text.
#pragma once

#include "platform/iscsi_lun.h"

namespace ISCSI {

/// "BLOCK", "FILE", "THIN", "ADV", "SINK", else "unknown".
const char *LUNTypeName(_tag_iscsi_lun_type type);

} // namespace ISCSI
