#include "webapi/cgi/Status.h"

#include "iscsiwebapi/ISCSIErrorCode.h"

#include <cerrno>
#include <climits>

namespace webapi {
namespace {

using namespace ISCSI;

struct Rule {
    int first, last;
    int status;
};

/// The first rule that holds a code counts: single codes stand before the ranges they lie in.
constexpr Rule RULES[] = {
    {ERR_NO_PERMISSION, ERR_NO_PERMISSION, 403},
    // What is not there.
    {ERR_NO_SUCH_API, ERR_NO_SUCH_API, 404},
    {ERR_BAD_LUN_UUID, ERR_BAD_LUN_UUID, 404}, // selectors that name nothing
    {ERR_BAD_SNAPSHOT_UUID, ERR_BAD_SNAPSHOT_UUID, 404},
    {ERR_BAD_TARGET_ID, ERR_BAD_TARGET_ID, 404},
    {ERR_BAD_NODE_UUID, ERR_BAD_NODE_UUID, 404},
    {ERR_BAD_VLUN_UUID, ERR_BAD_VLUN_UUID, 404},
    {ERR_NO_SUCH_LUN, ERR_NO_SUCH_FAMILY, 404},
    {ERR_NO_SUCH_TARGET, ERR_NO_SUCH_TARGET, 404},
    {ERR_FAILED_TO_LOAD_TARGET, ERR_FAILED_TO_LOAD_TARGET, 404},
    {ERR_NO_SUCH_TASK, ERR_NO_SUCH_TASK, 404},
    {ERR_NO_SUCH_TRACK, ERR_NO_SUCH_TRACK, 404},
    {ERR_NO_SUCH_NODE, ERR_NO_SUCH_NODE, 404},
    // What is not in the state for it.
    {ERR_FILE_EXISTS, ERR_FILE_EXISTS, 409},
    {ERR_LUN_IS_MAPPED, ERR_DUPLICATED_LUN_NAME, 409},
    {ERR_CANNOT_CLONE_A_BLOCK_LUN, ERR_SNAPSHOT_IS_LOCKED, 409},
    {ERR_NOW_IS_EXPORTING, ERR_NOW_IS_NOT_IMPORTING, 409},
    {ERR_NOT_A_SOURCE_TASK, ERR_STOP_SENDING_SNAPSHOT, 409},
    {ERR_NODE_UUID_EXISTS, ERR_NODE_UUID_EXISTS, 409},
    // Later.
    {ERR_TRY_AGAIN, ERR_TRY_AGAIN, 429},
    {ERR_OUT_OF_FREE_SPACE, ERR_OUT_OF_FREE_SPACE, 507},
    {ERR_TIMEOUT, ERR_TIMEOUT, 504},
    // A peer.
    {ERR_BAD_RESPONSE, ERR_FAILED_TO_GET_ERROR_CODE, 502},
    {ERR_NOT_IMPLEMENTED_YET, ERR_NOT_IMPLEMENTED_YET, 501},
    // What was asked for.
    {ERR_INVALID_INPUT, ERR_BAD_IP, 400},
    {ERR_BAD_PARAMETER, ERR_BAD_STRING_LENGTH, 422},
    {ERR_FILE_NOT_FOUND, ERR_FILE_NOT_FOUND, 422},
    {ERR_BAD_EP_FILE_TYPE, ERR_BAD_DELETED_BY, 422},
    {ERR_BAD_LUN_TYPE, ERR_NO_LUN_UUID, 422},
    {ERR_BAD_TARGET_NAME, ERR_BAD_TARGET_ACL_AUTHORITY, 422},
    {ERR_BAD_REPLICATION_TASK_INFO, ERR_BAD_SENDING_SNAPSHOT_UUID, 422},
    {ERR_BAD_VLUN_TYPE, ERR_NO_VLUN_UUID, 422},
    {ERR_BAD_NODE_HOSTNAME, ERR_NO_NODE_UUID, 422},
    {ENOSPC, ENOSPC, 507},
};

} // namespace

int httpStatus(int code)
{
    const int positive = code < 0 && code != INT_MIN ? -code : code; // errno values come in both signs
    for (const Rule &rule : RULES) {
        if (positive >= rule.first && positive <= rule.last)
            return rule.status;
    }
    return 500;
}

} // namespace webapi
