/// Retention policies.
#pragma once

#include "platform/sdk.h"

NORV_BEGIN_DECLS

/// Removes the policy of an object, named by its kind ("Lun#") and its key (the LUN ID in decimal).
/// 0 on success, also when there is none; negative on failure.
NORV_API int NORVRETENTIONRemovePolicy(const char *kind, const char *key);

NORV_END_DECLS
