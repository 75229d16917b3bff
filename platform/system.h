/// The appliance itself: its modules and its boot.
#pragma once

#include "platform/sdk.h"

NORV_BEGIN_DECLS

/// Whether a part that iSCSI copy work needs, named as on the appliance, is up: 1 when it is.
NORV_API int NORVCheckModule(const char *name);

enum {
    NORV_BOOT_DONE = 4,
};

/// How far the system has booted; NORV_BOOT_DONE is all the way.
NORV_API int NORVSystemGetBootStep(void);

NORV_END_DECLS
