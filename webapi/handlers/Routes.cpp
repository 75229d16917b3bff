// The table: everything that can be asked for, by whom and with which input.
#include "webapi/handlers/Handlers.h"

#include "iscsiwebapi/ISCSIErrorCode.h"

#include <cstdint>

namespace webapi {
namespace {

using namespace ISCSI;

constexpr bool REQUIRED = true;
constexpr bool OPTIONAL = false;

// What fits the SDK's records.
constexpr uint64_t NAME_MAX_BYTES = 255;
constexpr uint64_t LOCATION_MAX_BYTES = 4094;
constexpr uint64_t CHAP_MAX_BYTES = 63;
constexpr uint64_t IQN_MAX_BYTES = 223;     // RFC 7143, 4.2.7.1
constexpr uint64_t SEGMENT_MIN_BYTES = 512; // RFC 7143, 13.12
constexpr uint64_t SEGMENT_MAX_BYTES = (1 << 24) - 1;
constexpr uint64_t MAX_TARGETS = 256;
constexpr uint64_t NOTE_MAX_BYTES = 1023;
constexpr uint64_t ACTOR_MAX_BYTES = 31;
constexpr uint64_t APP_KEY_MAX_BYTES = 127;
constexpr uint64_t RULE_MAX_BYTES = 255;
constexpr uint64_t EVENTS_MAX = 10000;                // as many as are kept
constexpr uint64_t MAX_SNAPSHOTS = 256;               // of one LUN
constexpr uint64_t SNAPSHOT_SELECTOR_MAX_BYTES = 511; // LUN's name, '_', snapshot's name
constexpr uint64_t MAX_MASKS = 1024;                  // bounds the work of one request
constexpr uint64_t MAX_NODES = 256;
constexpr uint64_t MAX_PORTALS = 16;
constexpr uint64_t HOST_MAX_BYTES = 253; // RFC 1035, 3.1, as text
constexpr uint64_t PORTAL_MAX_BYTES = HOST_MAX_BYTES + 8;
constexpr uint64_t PASSWORD_MAX_BYTES = 512;
constexpr uint64_t OTP_MAX_BYTES = 16;
constexpr uint64_t PIN_MAX_BYTES = 64;
constexpr uint64_t TOKEN_MAX_BYTES = 255;
constexpr uint64_t UUID_BYTES = 36;

constexpr Field LOGIN[] = {
    {"account", Type::Text, REQUIRED, 1, NAME_MAX_BYTES, ERR_INVALID_INPUT},
    {"password", Type::Text, REQUIRED, 1, PASSWORD_MAX_BYTES, ERR_INVALID_INPUT},
    {"otp_code", Type::Text, OPTIONAL, 0, OTP_MAX_BYTES, ERR_INVALID_INPUT},
};

constexpr Field LUN_LIST[] = {
    {"status", Type::Boolean, OPTIONAL, 0, 0, 0},
};

constexpr Field LUN_CREATE[] = {
    {"name", Type::Text, REQUIRED, 1, NAME_MAX_BYTES, ERR_BAD_LUN_NAME},
    {"type", Type::Unsigned, REQUIRED, 1, INT32_MAX, ERR_BAD_LUN_TYPE},
    {"location", Type::Text, REQUIRED, 1, LOCATION_MAX_BYTES, ERR_BAD_LUN_LOCATION},
    {"size", Type::Unsigned, OPTIONAL, 1, INT64_MAX, ERR_BAD_LUN_SIZE}, // a block LUN has its device's
    {"extent_size", Type::Unsigned, OPTIONAL, 1, UINT32_MAX, ERR_BAD_LUN_EXTENT_SIZE},
};

constexpr Field LUN_UPDATE[] = {
    {"name", Type::Text, OPTIONAL, 1, NAME_MAX_BYTES, ERR_BAD_LUN_NAME},
    {"size", Type::Unsigned, OPTIONAL, 1, INT64_MAX, ERR_BAD_LUN_SIZE},
};

constexpr Field SELECTOR[] = {{"", Type::Text, REQUIRED, 1, NAME_MAX_BYTES, ERR_BAD_TARGET_ID}};
constexpr Field LUN_MAPPING[] = {
    {"targets", Type::List, REQUIRED, 1, MAX_TARGETS, ERR_BAD_TARGET_ID, nullptr, SELECTOR},
};

constexpr Field LUN_LOADING[] = {
    {"is_for_trash", Type::Boolean, OPTIONAL, 0, 0, 0},
};

constexpr Field TARGET_LIST[] = {
    {"lun", Type::Text, OPTIONAL, 1, NAME_MAX_BYTES, ERR_BAD_LUN_UUID},
};

constexpr Field TARGET_CREATE[] = {
    {"name", Type::Text, REQUIRED, 1, NAME_MAX_BYTES, ERR_BAD_TARGET_NAME},
    {"iqn", Type::Text, OPTIONAL, 1, IQN_MAX_BYTES, ERR_BAD_TARGET_IQN},
    {"has_header_checksum", Type::Boolean, OPTIONAL, 0, 0, 0},
    {"has_data_checksum", Type::Boolean, OPTIONAL, 0, 0, 0},
    {"max_recv_seq_bytes", Type::Unsigned, OPTIONAL, SEGMENT_MIN_BYTES, SEGMENT_MAX_BYTES, ERR_BAD_PARAMETER},
    {"max_send_seq_bytes", Type::Unsigned, OPTIONAL, SEGMENT_MIN_BYTES, SEGMENT_MAX_BYTES, ERR_BAD_PARAMETER},
    {"max_sessions", Type::Unsigned, OPTIONAL, 0, UINT32_MAX, ERR_BAD_TARGET_MAX_SESSIONS},
    {"user", Type::Text, OPTIONAL, 1, CHAP_MAX_BYTES, ERR_BAD_TARGET_USER},
    {"password", Type::Text, OPTIONAL, 1, CHAP_MAX_BYTES, ERR_BAD_TARGET_PASSWORD},
    {"mutual_user", Type::Text, OPTIONAL, 1, CHAP_MAX_BYTES, ERR_BAD_TARGET_MUTUAL_USER},
    {"mutual_password", Type::Text, OPTIONAL, 1, CHAP_MAX_BYTES, ERR_BAD_TARGET_MUTUAL_PASSWORD},
};

constexpr Field MASK[] = {
    {"iqn", Type::Text, REQUIRED, 1, IQN_MAX_BYTES, ERR_BAD_TARGET_IQN},
    {"permission", Type::Text, REQUIRED, 1, 2, ERR_BAD_TARGET_AUTH_INFO, "rw|r|-"},
};
constexpr Field MASK_ELEMENT[] = {{"", Type::Object, REQUIRED, 0, 0, 0, nullptr, MASK}};
constexpr Field IQN_ELEMENT[] = {{"", Type::Text, REQUIRED, 1, IQN_MAX_BYTES, ERR_BAD_TARGET_IQN}};

constexpr Field MASKS_SET[] = {
    {"masks", Type::List, REQUIRED, 0, MAX_MASKS, ERR_BAD_TARGET_ACL, nullptr, MASK_ELEMENT},
};

constexpr Field MASKS_CHANGE[] = {
    {"add", Type::List, OPTIONAL, 0, MAX_MASKS, ERR_BAD_TARGET_ACL, nullptr, MASK_ELEMENT},
    {"remove", Type::List, OPTIONAL, 0, MAX_MASKS, ERR_BAD_TARGET_ACL, nullptr, IQN_ELEMENT},
};

constexpr Field SNAPSHOT_LIST[] = {
    {"lun", Type::Text, OPTIONAL, 1, NAME_MAX_BYTES, ERR_BAD_LUN_UUID},
};

constexpr Field SNAPSHOT_TAKE[] = {
    {"name", Type::Text, OPTIONAL, 1, NAME_MAX_BYTES, ERR_BAD_SNAPSHOT_NAME},
    {"description", Type::Text, OPTIONAL, 0, NOTE_MAX_BYTES, ERR_BAD_SNAPSHOT_NOTE},
    {"taken_by", Type::Text, OPTIONAL, 1, ACTOR_MAX_BYTES, ERR_BAD_PARAMETER},
    {"is_app_consistent", Type::Boolean, OPTIONAL, 0, 0, 0},
    {"is_user_locked", Type::Boolean, OPTIONAL, 0, 0, 0},
    {"is_scheduled", Type::Boolean, OPTIONAL, 0, 0, 0},
    {"snapshot_time", Type::Unsigned, OPTIONAL, 0, INT32_MAX, ERR_BAD_SNAPSHOT_TIME}, // 0: now
};

constexpr Field SNAPSHOT_DELETE[] = {
    {"deleted_by", Type::Text, OPTIONAL, 1, ACTOR_MAX_BYTES, ERR_BAD_PARAMETER},
};

constexpr Field SNAPSHOT_LOCK[] = {
    {"app_key", Type::Text, OPTIONAL, 1, APP_KEY_MAX_BYTES, ERR_BAD_APP_KEY},
};

constexpr Field CLONE[] = {
    {"name", Type::Text, REQUIRED, 1, NAME_MAX_BYTES, ERR_BAD_LUN_NAME},
};

constexpr Field DIRECTORY[] = {
    {"directory", Type::Text, REQUIRED, 1, LOCATION_MAX_BYTES, ERR_BAD_EXPORTING_LOCATION},
};

constexpr Field RETENTION[] = {
    {"newest", Type::Unsigned, OPTIONAL, 0, INT32_MAX, ERR_BAD_PARAMETER},
    {"hourly", Type::Unsigned, OPTIONAL, 0, INT32_MAX, ERR_BAD_PARAMETER},
    {"daily", Type::Unsigned, OPTIONAL, 0, INT32_MAX, ERR_BAD_PARAMETER},
    {"weekly", Type::Unsigned, OPTIONAL, 0, INT32_MAX, ERR_BAD_PARAMETER},
};

constexpr Field SCHEDULE[] = {
    {"lun", Type::Text, REQUIRED, 1, NAME_MAX_BYTES, ERR_BAD_LUN_UUID},
    {"rule", Type::Text, REQUIRED, 1, RULE_MAX_BYTES, ERR_BAD_PARAMETER},
};

constexpr Field EVENTS[] = {
    {"since", Type::Unsigned, OPTIONAL, 0, INT64_MAX, ERR_BAD_PARAMETER},
    {"count", Type::Unsigned, OPTIONAL, 1, EVENTS_MAX, ERR_BAD_PARAMETER},
};

constexpr Field PEER_HOST[] = {
    {"hostname", Type::Text, REQUIRED, 1, HOST_MAX_BYTES, ERR_BAD_NODE_HOSTNAME},
};

constexpr Field PEER[] = {
    {"hostname", Type::Text, REQUIRED, 1, HOST_MAX_BYTES, ERR_BAD_NODE_HOSTNAME},
    {"port", Type::Unsigned, OPTIONAL, 1, UINT16_MAX, ERR_BAD_NODE_PORT},
};

constexpr Field NODE_JOIN[] = {
    {"hostname", Type::Text, REQUIRED, 1, HOST_MAX_BYTES, ERR_BAD_NODE_HOSTNAME},
    {"port", Type::Unsigned, OPTIONAL, 1, UINT16_MAX, ERR_BAD_NODE_PORT},
    {"account", Type::Text, REQUIRED, 1, NAME_MAX_BYTES, ERR_BAD_NODE_ACCOUNT},
    {"password", Type::Text, REQUIRED, 1, PASSWORD_MAX_BYTES, ERR_BAD_NODE_PASSWORD},
    {"otp_code", Type::Text, OPTIONAL, 0, OTP_MAX_BYTES, ERR_BAD_NODE_OTP_CODE},
    {"pin", Type::Text, OPTIONAL, 1, PIN_MAX_BYTES, ERR_BAD_PARAMETER},
};

constexpr Field NODE[] = {
    {"uuid", Type::Text, REQUIRED, 1, UUID_BYTES, ERR_BAD_NODE_UUID},
    {"hostname", Type::Text, REQUIRED, 1, HOST_MAX_BYTES, ERR_BAD_NODE_HOSTNAME},
    {"port", Type::Unsigned, REQUIRED, 1, UINT16_MAX, ERR_BAD_NODE_PORT},
    {"protocol", Type::Text, REQUIRED, 1, 8, ERR_BAD_NODE_PROTOCOL, "https|http"},
    {"rod_key", Type::Text, REQUIRED, 0, TOKEN_MAX_BYTES, ERR_BAD_NODE_ROD_KEY},
    {"session_id", Type::Text, REQUIRED, 0, TOKEN_MAX_BYTES, ERR_FAILED_TO_GET_SESSION_ID},
    {"pin", Type::Text, OPTIONAL, 0, PIN_MAX_BYTES, ERR_BAD_PARAMETER},
};
constexpr Field NODE_ELEMENT[] = {{"", Type::Object, REQUIRED, 0, 0, 0, nullptr, NODE}};

constexpr Field NODES_ADD[] = {
    {"nodes", Type::List, REQUIRED, 1, MAX_NODES, ERR_INVALID_INPUT, nullptr, NODE_ELEMENT},
};

constexpr Field NODE_TRUST[] = {
    {"pin", Type::Text, REQUIRED, 1, PIN_MAX_BYTES, ERR_BAD_PARAMETER},
};

constexpr Field NODE_LOGIN[] = {
    {"account", Type::Text, REQUIRED, 1, NAME_MAX_BYTES, ERR_BAD_NODE_ACCOUNT},
    {"password", Type::Text, REQUIRED, 1, PASSWORD_MAX_BYTES, ERR_BAD_NODE_PASSWORD},
    {"otp_code", Type::Text, OPTIONAL, 0, OTP_MAX_BYTES, ERR_BAD_NODE_OTP_CODE},
};

constexpr Field VLUN_CREATE[] = {
    {"lun", Type::Text, REQUIRED, 1, NAME_MAX_BYTES, ERR_BAD_LUN_UUID},
};

constexpr Field PORTAL_ELEMENT[] = {{"", Type::Text, REQUIRED, 1, PORTAL_MAX_BYTES, ERR_BAD_PORTALS}};

constexpr Field REMOTE_CLONE_SHOW[] = {
    {"vlun_uuid", Type::Text, OPTIONAL, 1, UUID_BYTES, ERR_BAD_VLUN_UUID}, // the latest unless it is given
};

constexpr Field VLUN_BIND[] = {
    {"node", Type::Text, REQUIRED, 1, HOST_MAX_BYTES, ERR_BAD_NODE_UUID},
    {"dst_lun_uuid", Type::Text, REQUIRED, 1, UUID_BYTES, ERR_BAD_DESTINATION_LUN_UUID},
    {"portals", Type::List, OPTIONAL, 1, MAX_PORTALS, ERR_BAD_PORTALS, nullptr, PORTAL_ELEMENT},
};

constexpr Field SINK_CLOSE[] = {
    {"iqn", Type::Text, OPTIONAL, 1, IQN_MAX_BYTES, ERR_BAD_TARGET_IQN},
    {"complete", Type::Boolean, REQUIRED, 0, 0, 0},
};

constexpr Field REMOTE_CLONE[] = {
    {"node", Type::Text, REQUIRED, 1, HOST_MAX_BYTES, ERR_BAD_NODE_UUID},
    {"name", Type::Text, OPTIONAL, 1, NAME_MAX_BYTES, ERR_BAD_LUN_NAME},
    {"location", Type::Text, OPTIONAL, 1, LOCATION_MAX_BYTES, ERR_BAD_LUN_LOCATION},
    {"portals", Type::List, OPTIONAL, 1, MAX_PORTALS, ERR_BAD_PORTALS, nullptr, PORTAL_ELEMENT},
    {"dst_lun_uuid", Type::Text, OPTIONAL, 1, UUID_BYTES, ERR_BAD_DESTINATION_LUN_UUID},
    {"watch", Type::Boolean, OPTIONAL, 0, 0, 0}, // true unless it is given
};

constexpr Field REPLICATION_CREATE[] = {
    {"lun", Type::Text, REQUIRED, 1, NAME_MAX_BYTES, ERR_BAD_LUN_UUID},
    {"node", Type::Text, REQUIRED, 1, HOST_MAX_BYTES, ERR_BAD_NODE_UUID},
    {"location", Type::Text, REQUIRED, 1, LOCATION_MAX_BYTES, ERR_BAD_LUN_LOCATION},
    {"name", Type::Text, REQUIRED, 1, NAME_MAX_BYTES, ERR_BAD_LUN_NAME},
};

constexpr Field TASK_CREATE[] = {
    {"uuid", Type::Text, REQUIRED, UUID_BYTES, UUID_BYTES, ERR_BAD_REPLICATION_TASK_UUID},
    {"is_source", Type::Boolean, REQUIRED, 0, 0, 0},
    {"src_lun_uuid", Type::Text, REQUIRED, UUID_BYTES, UUID_BYTES, ERR_REPLICATION_BAD_SOURCE_LUN_UUID},
    {"dst_lun_uuid", Type::Text, REQUIRED, UUID_BYTES, UUID_BYTES, ERR_REPLICATION_BAD_DESTINATION_LUN_UUID},
    {"src_node_uuid", Type::Text, REQUIRED, UUID_BYTES, UUID_BYTES, ERR_BAD_SOURCE_NODE_UUID},
    {"dst_node_uuid", Type::Text, REQUIRED, UUID_BYTES, UUID_BYTES, ERR_BAD_DESTINATION_NODE_UUID},
};

constexpr Field REPLICATION_SHOW[] = {
    {"additional", Type::Boolean, OPTIONAL, 0, 0, 0},
};

constexpr Field REPLICATION_SEND[] = {
    {"snapshot", Type::Text, REQUIRED, 1, SNAPSHOT_SELECTOR_MAX_BYTES, ERR_BAD_SENDING_SNAPSHOT_UUID},
    {"address", Type::Text, OPTIONAL, 0, HOST_MAX_BYTES, ERR_BAD_DESTINATION_ADDRESS},
    {"port", Type::Unsigned, OPTIONAL, 0, UINT16_MAX, ERR_BAD_DESTINATION_PORT},
    {"encrypted", Type::Boolean, OPTIONAL, 0, 0, 0},
};

constexpr Field UNSYNCED[] = {
    {"snapshot", Type::Text, REQUIRED, 1, SNAPSHOT_SELECTOR_MAX_BYTES, ERR_BAD_SENDING_SNAPSHOT_UUID},
    {"base", Type::Text, OPTIONAL, 0, SNAPSHOT_SELECTOR_MAX_BYTES, ERR_BAD_BASE_SNAPSHOT_UUID},
};

constexpr Field VERSION[] = {
    {"uuid", Type::Text, REQUIRED, UUID_BYTES, UUID_BYTES, ERR_BAD_SOURCE_SNAPSHOTS},
    {"version", Type::Text, REQUIRED, 1, UUID_BYTES, ERR_BAD_SOURCE_SNAPSHOTS},
};
constexpr Field VERSION_ELEMENT[] = {{"", Type::Object, REQUIRED, 0, 0, 0, nullptr, VERSION}};
constexpr Field VERSIONS[] = {
    {"snapshots", Type::List, REQUIRED, 0, MAX_SNAPSHOTS, ERR_BAD_SOURCE_SNAPSHOTS, nullptr, VERSION_ELEMENT},
};

constexpr Field ARRIVAL_BEGIN[] = {
    {"version", Type::Text, REQUIRED, UUID_BYTES, UUID_BYTES, ERR_BAD_SENDING_SNAPSHOT_UUID},
    {"base", Type::Text, OPTIONAL, 0, UUID_BYTES, ERR_BAD_BASE_SNAPSHOT_UUID},
    {"name", Type::Text, OPTIONAL, 0, NAME_MAX_BYTES, ERR_BAD_SNAPSHOT_NAME},
};
constexpr Field ARRIVAL[] = {
    {"version", Type::Text, REQUIRED, UUID_BYTES, UUID_BYTES, ERR_BAD_SENDING_SNAPSHOT_UUID},
    {"iqn", Type::Text, REQUIRED, 1, IQN_MAX_BYTES, ERR_BAD_TARGET_IQN},
    {"offset", Type::Unsigned, REQUIRED, 0, INT64_MAX, ERR_BAD_PARAMETER},
    {"moved", Type::Unsigned, REQUIRED, 0, INT64_MAX, ERR_BAD_PARAMETER},
    {"total", Type::Unsigned, REQUIRED, 0, INT64_MAX, ERR_BAD_PARAMETER},
};
constexpr Field ARRIVAL_END[] = {
    {"version", Type::Text, REQUIRED, UUID_BYTES, UUID_BYTES, ERR_BAD_SENDING_SNAPSHOT_UUID},
    {"iqn", Type::Text, REQUIRED, 1, IQN_MAX_BYTES, ERR_BAD_TARGET_IQN},
    {"total", Type::Unsigned, REQUIRED, 0, INT64_MAX, ERR_BAD_PARAMETER},
};

constexpr Field REPLICATION_DELETE[] = {
    {"delete_lun", Type::Boolean, OPTIONAL, 0, 0, 0},
};

constexpr Field CONNECTION[] = {
    {"address", Type::Text, REQUIRED, 1, HOST_MAX_BYTES, ERR_BAD_DESTINATION_ADDRESS},
    {"port", Type::Unsigned, OPTIONAL, 0, UINT16_MAX, ERR_BAD_DESTINATION_PORT},
};

constexpr Fields NONE;

} // namespace

const std::vector<Route> &routes()
{
    static const std::vector<Route> table = {
        {Method::Get, "/health", Role::Anyone, NONE, showHealth},
        {Method::Get, "/openapi.json", Role::Viewer, NONE, showOpenApi},
        {Method::Post, "/session", Role::Anyone, LOGIN, openSession},
        {Method::Get, "/session", Role::Viewer, NONE, showSession},
        {Method::Delete, "/session", Role::Viewer, NONE, closeSession},
        {Method::Get, "/luns", Role::Viewer, LUN_LIST, listLuns},
        {Method::Post, "/luns", Role::Admin, LUN_CREATE, createLun},
        {Method::Get, "/luns/{lun}", Role::Viewer, NONE, showLun},
        {Method::Patch, "/luns/{lun}", Role::Admin, LUN_UPDATE, updateLun},
        {Method::Delete, "/luns/{lun}", Role::Admin, NONE, deleteLun},
        {Method::Post, "/luns/{lun}/map", Role::Admin, LUN_MAPPING, mapLun},
        {Method::Post, "/luns/{lun}/unmap", Role::Admin, LUN_MAPPING, unmapLun},
        {Method::Post, "/luns/{lun}/load", Role::Admin, LUN_LOADING, loadLun},
        {Method::Post, "/luns/{lun}/unload", Role::Admin, LUN_LOADING, unloadLun},
        {Method::Post, "/luns/{lun}/clone", Role::Admin, CLONE, cloneLun},
        {Method::Get, "/luns/{lun}/remote-clone", Role::Viewer, REMOTE_CLONE_SHOW, showRemoteClone},
        {Method::Post, "/luns/{lun}/remote-clone", Role::Admin, REMOTE_CLONE, remoteCloneLun},
        {Method::Get, "/luns/{lun}/import", Role::Viewer, NONE, showImport},
        {Method::Post, "/luns/{lun}/import", Role::Admin, DIRECTORY, importLun},
        {Method::Delete, "/luns/{lun}/import", Role::Admin, NONE, cancelImport},
        {Method::Get, "/luns/{lun}/retention", Role::Viewer, NONE, showRetention},
        {Method::Put, "/luns/{lun}/retention", Role::Admin, RETENTION, setRetention},
        {Method::Delete, "/luns/{lun}/retention", Role::Admin, NONE, removeRetention},
        {Method::Get, "/luns/{lun}/retention/verdicts", Role::Viewer, RETENTION, tryRetention},
        {Method::Post, "/luns/{lun}/snapshots", Role::Admin, SNAPSHOT_TAKE, takeSnapshot},
        {Method::Get, "/snapshots", Role::Viewer, SNAPSHOT_LIST, listSnapshots},
        {Method::Get, "/snapshots/{snapshot}", Role::Viewer, NONE, showSnapshot},
        {Method::Delete, "/snapshots/{snapshot}", Role::Admin, SNAPSHOT_DELETE, deleteSnapshot},
        {Method::Post, "/snapshots/{snapshot}/restore", Role::Admin, NONE, restoreSnapshot},
        {Method::Post, "/snapshots/{snapshot}/clone", Role::Admin, CLONE, cloneSnapshot},
        {Method::Post, "/snapshots/{snapshot}/lock", Role::Admin, SNAPSHOT_LOCK, lockSnapshot},
        {Method::Post, "/snapshots/{snapshot}/unlock", Role::Admin, SNAPSHOT_LOCK, unlockSnapshot},
        {Method::Post, "/snapshots/{snapshot}/stop", Role::Admin, NONE, stopSnapshot},
        {Method::Post, "/snapshots/{snapshot}/load", Role::Admin, LUN_LOADING, loadSnapshot},
        {Method::Post, "/snapshots/{snapshot}/unload", Role::Admin, LUN_LOADING, unloadSnapshot},
        {Method::Get, "/snapshots/{snapshot}/export", Role::Viewer, NONE, showExport},
        {Method::Post, "/snapshots/{snapshot}/export", Role::Admin, DIRECTORY, exportSnapshot},
        {Method::Delete, "/snapshots/{snapshot}/export", Role::Admin, NONE, cancelExport},
        {Method::Get, "/schedules", Role::Viewer, NONE, listSchedules},
        {Method::Post, "/schedules", Role::Admin, SCHEDULE, addSchedule},
        {Method::Delete, "/schedules/{schedule}", Role::Admin, NONE, removeSchedule},
        {Method::Get, "/events", Role::Viewer, EVENTS, listEvents},
        {Method::Get, "/targets", Role::Viewer, TARGET_LIST, listTargets},
        {Method::Post, "/targets", Role::Admin, TARGET_CREATE, createTarget},
        {Method::Get, "/targets/{target}", Role::Viewer, NONE, showTarget},
        {Method::Delete, "/targets/{target}", Role::Admin, NONE, deleteTarget},
        {Method::Get, "/targets/{target}/masks", Role::Viewer, NONE, showMasks},
        {Method::Put, "/targets/{target}/masks", Role::Admin, MASKS_SET, setMasks},
        {Method::Patch, "/targets/{target}/masks", Role::Admin, MASKS_CHANGE, changeMasks},
        {Method::Get, "/nodes", Role::Viewer, NONE, listNodes},
        {Method::Post, "/nodes", Role::Admin, NODES_ADD, addNodes},
        {Method::Post, "/nodes/join", Role::Admin, NODE_JOIN, joinNode},
        {Method::Get, "/nodes/local/status", Role::Viewer, NONE, showLocalStatus},
        {Method::Get, "/nodes/local/key", Role::Admin, NONE, showLocalKey},
        {Method::Post, "/nodes/local/sessions", Role::Admin, PEER_HOST, openPeerSession},
        {Method::Get, "/nodes/{node}", Role::Viewer, NONE, showNode},
        {Method::Delete, "/nodes/{node}", Role::Admin, NONE, removeNode},
        {Method::Post, "/nodes/{node}/trust", Role::Admin, NODE_TRUST, trustNode},
        {Method::Post, "/nodes/{node}/login", Role::Admin, NODE_LOGIN, loginNode},
        {Method::Post, "/nodes/{node}/logout", Role::Admin, NONE, logoutNode},
        {Method::Get, "/peer-key", Role::Admin, PEER, showPeerKey},
        {Method::Post, "/nodes/{node}/check", Role::Admin, CONNECTION, checkReplicationNode},
        {Method::Get, "/replications", Role::Viewer, NONE, listReplications},
        {Method::Post, "/replications", Role::Admin, REPLICATION_CREATE, createReplication},
        {Method::Post, "/replications/tasks", Role::Admin, TASK_CREATE, createReplicationTask},
        {Method::Get, "/replications/{task}", Role::Viewer, REPLICATION_SHOW, showReplication},
        {Method::Delete, "/replications/{task}", Role::Admin, REPLICATION_DELETE, deleteReplication},
        {Method::Get, "/replications/{task}/sending", Role::Viewer, NONE, showSending},
        {Method::Post, "/replications/{task}/send", Role::Admin, REPLICATION_SEND, sendReplication},
        {Method::Post, "/replications/{task}/stop", Role::Admin, NONE, stopReplication},
        {Method::Get, "/replications/{task}/unsynced", Role::Viewer, NONE, showUnsynced},
        {Method::Post, "/replications/{task}/unsynced", Role::Admin, UNSYNCED, countUnsynced},
        {Method::Post, "/replications/{task}/promote", Role::Admin, NONE, promoteReplication},
        {Method::Post, "/replications/{task}/demote", Role::Admin, NONE, demoteReplication},
        {Method::Post, "/replications/{task}/base-version", Role::Admin, VERSIONS, chooseBaseVersion},
        {Method::Post, "/replications/{task}/arrival", Role::Admin, ARRIVAL_BEGIN, beginReception},
        {Method::Patch, "/replications/{task}/arrival", Role::Admin, ARRIVAL, noteReception},
        {Method::Post, "/replications/{task}/arrival/end", Role::Admin, ARRIVAL_END, endReception},
        {Method::Get, "/vluns", Role::Viewer, NONE, listVluns},
        {Method::Post, "/vluns", Role::Admin, VLUN_CREATE, createVlun},
        {Method::Get, "/vluns/{uuid}", Role::Viewer, NONE, showVlun},
        {Method::Delete, "/vluns/{uuid}", Role::Admin, NONE, deleteVlun},
        {Method::Post, "/vluns/{uuid}/bind", Role::Admin, VLUN_BIND, bindVlun},
        {Method::Post, "/sinks/{lun}/open", Role::Admin, NONE, openSink},
        {Method::Post, "/sinks/{lun}/close", Role::Admin, SINK_CLOSE, closeSink},
    };
    return table;
}

} // namespace webapi
