/// Error codes of the library and their texts.
///
/// Every operation returns a signed 32-bit code: 0 is success. The library's own failures are the
/// constants below, in nine ranges by subject. Codes of the platform and of the C library pass
/// through unchanged, so a caller can also meet an errno value, negated or plain.
#pragma once

#include <cstring>

namespace ISCSI {

// General: memory, parameters, files, directories, locks, services, system calls.
constexpr int ERR_DEFAULT_ERROR_CODE = 18990000;
constexpr int ERR_OUT_OF_MEMORY = 18990001;
constexpr int ERR_OUT_OF_FREE_SPACE = 18990002;
constexpr int ERR_NULL_POINTER = 18990003;
constexpr int ERR_BAD_PARAMETER = 18990004;
constexpr int ERR_BAD_FILE_SYSTEM_TYPE = 18990005;
constexpr int ERR_BAD_FILE_TYPE = 18990006;
constexpr int ERR_BAD_FILE_SIZE = 18990007;
constexpr int ERR_BAD_STRING_LENGTH = 18990008;
constexpr int ERR_NO_PERMISSION = 18990009;
constexpr int ERR_TIMEOUT = 18990010;
constexpr int ERR_FILE_NOT_FOUND = 18990011;
constexpr int ERR_FILE_EXISTS = 18990012;
constexpr int ERR_TRY_AGAIN = 18990013;
constexpr int ERR_FAILED_TO_FORK = 18990014;
constexpr int ERR_FAILED_TO_LOCK_FILE = 18990015;
constexpr int ERR_FAILED_TO_UNLOCK_FILE = 18990016;
constexpr int ERR_FAILED_TO_GET_FILE_SESSION = 18990017;
constexpr int ERR_FAILED_TO_SET_FILE_SESSION = 18990018;
constexpr int ERR_FAILED_TO_ADD_FILE_SESSION = 18990019;
constexpr int ERR_FAILED_TO_REMOVE_FILE_SESSION = 18990020;
constexpr int ERR_FAILED_TO_STAT_PATH = 18990021;
constexpr int ERR_FAILED_TO_ACCESS_PATH = 18990022;
constexpr int ERR_FAILED_TO_TOUCH_FILE = 18990023;
constexpr int ERR_FAILED_TO_FLUSH_OR_CLOSE_FILE = 18990024;
constexpr int ERR_FAILED_TO_COPY_STRING = 18990025;
constexpr int ERR_FAILED_TO_OPEN_DIRECTORY = 18990026;
constexpr int ERR_FAILED_TO_CLOSE_DIRECTORY = 18990027;
constexpr int ERR_FAILED_TO_CERATE_DIRECTORY = 18990028;
constexpr int ERR_FAILED_TO_REMOVE_DIRECTORY = 18990029;
constexpr int ERR_FAILED_TO_INSMOD_KERNEL_MODULE = 18990030;
constexpr int ERR_FAILED_TO_RMMOD_KERNEL_MODULE = 18990031;
constexpr int ERR_FAILED_TO_SET_HASH_VALUE = 18990032;
constexpr int ERR_FAILED_TO_GET_HASH_VALUE = 18990033;
constexpr int ERR_FAILED_TO_SET_PAIRS = 18990034;
constexpr int ERR_FAILED_TO_GET_PAIRS = 18990035;
constexpr int ERR_FAILED_TO_LINK_FILE = 18990036;
constexpr int ERR_FAILED_TO_UNLINK_FILE = 18990037;
constexpr int ERR_FAILED_TO_OPEN_FILE = 18990038;
constexpr int ERR_FAILED_TO_READ_FILE = 18990039;
constexpr int ERR_FAILED_TO_WRITE_FILE = 18990040;
constexpr int ERR_FAILED_TO_SEEK_FILE = 18990041;
constexpr int ERR_FAILED_TO_RENAME_FILE = 18990042;
constexpr int ERR_FAILED_TO_COPY_FILE = 18990043;
constexpr int ERR_FAILED_TO_GLOB = 18990044;
constexpr int ERR_FAILED_TO_START_SERVICE = 18990045;
constexpr int ERR_FAILED_TO_STOP_SERVICE = 18990046;
constexpr int ERR_FAILED_TO_GET_FILE_PATH = 18990047;
constexpr int ERR_FAILED_TO_ALLOCATE_FILE = 18990048;
constexpr int ERR_FAILED_TO_GET_TIME = 18990049;
constexpr int ERR_FAILED_TO_PARSE_STRING = 18990050;
constexpr int ERR_FAILED_TO_GET_HOSTENT = 18990051;
constexpr int ERR_FAILED_TO_GET_FILESYSTEM_INFO = 18990052;
constexpr int ERR_FAILED_TO_PIN_VOLUME = 18990053;
constexpr int ERR_FAILED_TO_MOUNT = 18990054;
constexpr int ERR_FAILED_TO_GET_HOSTNAME = 18990055;
constexpr int ERR_FAILED_TO_GET_TRUNCATE_MODE = 18990056;
constexpr int ERR_FAILED_TO_TRUNCATE_FILE = 18990057;

// Web-API client: calls to a peer appliance's web API.
constexpr int ERR_NO_SUCH_API = 18990200;
constexpr int ERR_INVALID_INPUT = 18990201;
constexpr int ERR_BAD_CLIENT_INPUT = 18990202;
constexpr int ERR_BAD_IP = 18990203;
constexpr int ERR_BAD_RESPONSE = 18990204;
constexpr int ERR_FAILED_TO_LOGIN = 18990205;
constexpr int ERR_FAILED_TO_LOGOUT = 18990206;
constexpr int ERR_FAILED_TO_CREATE_REQUEST = 18990207;
constexpr int ERR_FAILED_TO_CONVERT_TO_JSON = 18990208;
constexpr int ERR_FAILED_TO_GET_UUID = 18990209;
constexpr int ERR_FAILED_TO_GET_SESSION_ID = 18990210;
constexpr int ERR_FAILED_TO_SEND_THE_REQUEST = 18990211;
constexpr int ERR_FAILED_TO_GET_ERROR_CODE = 18990212;
constexpr int ERR_NOT_IMPLEMENTED_YET = 18990213;

// Configuration and volume: section/key configuration files, lists, volumes, plug-in hooks, notifications.
constexpr int ERR_FAILED_TO_GET_VOLUME_INFO = 18990300;
constexpr int ERR_FAILED_TO_ENUMERATE_SECTION = 18990301;
constexpr int ERR_FAILED_TO_ENUMERATE_CONFIG_SECTION = 18990302;
constexpr int ERR_FAILED_TO_GET_SECTION = 18990303;
constexpr int ERR_FAILED_TO_ADD_SECTION = 18990304;
constexpr int ERR_FAILED_TO_SET_SECTION = 18990305;
constexpr int ERR_FAILED_TO_REMOVE_SECTION = 18990306;
constexpr int ERR_FAILED_TO_MODIFY_SECTION = 18990307;
constexpr int ERR_FAILED_TO_PUSH_TO_LIST = 18990308;
constexpr int ERR_FAILED_TO_GET_FROM_LIST = 18990309;
constexpr int ERR_FAILED_TO_PARSE_HEADER = 18990310;
constexpr int ERR_FAILED_TO_PARSE_VOLUME_ID = 18990311;
constexpr int ERR_FAILED_TO_INIT_PLUGIN_HOOK = 18990312;
constexpr int ERR_FAILED_TO_RUN_PLUGIN_ACTION = 18990313;
constexpr int ERR_FAILED_TO_GET_SERIAL_NUMBER = 18990314;
constexpr int ERR_FAILED_TO_SEND_NOTIFICATION = 18990315;
constexpr int ERR_FAILED_TO_GET_SPACE_DEVICE_SIZE = 18990316;

// Extent pool and EP files: extent-pool objects, portals, map files, progress files, UUID generation.
constexpr int ERR_BAD_EP_FILE_TYPE = 18990400;
constexpr int ERR_BAD_EP_FILE_PATH = 18990401;
constexpr int ERR_BAD_PORTALS = 18990402;
constexpr int ERR_BAD_DESCRIPTION = 18990403;
constexpr int ERR_BAD_DELETED_BY = 18990404;
constexpr int ERR_NEED_LIO_SUPPORT = 18990405;
constexpr int ERR_NO_PORTAL = 18990406;
constexpr int ERR_NO_PLUGIN_NOTIFIED = 18990407;
constexpr int ERR_FAILED_TO_PLUGIN_NOTIFY = 18990408;
constexpr int ERR_FAILED_TO_PLUGIN_START = 18990409;
constexpr int ERR_FAILED_TO_PLUGIN_END = 18990410;
constexpr int ERR_FAILED_TO_CREATE_OBJECT_FILE = 18990411;
constexpr int ERR_FAILED_TO_CREATE_COMMUNICATION = 18990412;
constexpr int ERR_FAILED_TO_FILL_EP_FILE = 18990413;
constexpr int ERR_FAILED_TO_GET_MAPPED_SIZE = 18990414;
constexpr int ERR_FAILED_TO_ADD_EXTENT_POOL = 18990415;
constexpr int ERR_FAILED_TO_CREATE_EPIO_JOURNAL = 18990416;
constexpr int ERR_INCONSISTENT_EPIO_JOURNAL = 18990417;
constexpr int ERR_FAILED_TO_ENABLE_EXTENT_POOL = 18990418;
constexpr int ERR_FAILED_TO_DISABLE_EXTENT_POOL = 18990419;
constexpr int ERR_FAILED_TO_SET_VOLUME_ID = 18990420;
constexpr int ERR_FAILED_TO_SET_MAP_FILE_PATH = 18990421;
constexpr int ERR_FAILED_TO_CREATE_PROGRESS_FILE = 18990422;
constexpr int ERR_FAILED_TO_DELETE_PROGRESS_FILE = 18990423;
constexpr int ERR_FAILED_TO_SET_PROGRESS_FILE = 18990424;
constexpr int ERR_FAILED_TO_GET_ISCSICONFIG = 18990425;
constexpr int ERR_FAILED_TO_GENERATE_UUID = 18990426;

// LUN and snapshot: LUN and snapshot validation and operations, import and export.
constexpr int ERR_BAD_LUN_TYPE = 18990500;
constexpr int ERR_BAD_LUN_LOCATION = 18990501;
constexpr int ERR_BAD_LUN_SIZE = 18990502;
constexpr int ERR_BAD_LUN_NAME = 18990503;
constexpr int ERR_BAD_LUN_ID = 18990504;
constexpr int ERR_BAD_LUN_UUID = 18990505;
constexpr int ERR_BAD_LUN_IS_SAME_POOL = 18990506;
constexpr int ERR_BAD_LUN_EXTENT_SIZE = 18990507;
constexpr int ERR_BAD_SOURCE_LUN_UUID = 18990508;
constexpr int ERR_BAD_DESTINATION_LUN_UUID = 18990509;
constexpr int ERR_BAD_EXPORTING_LOCATION = 18990510;
constexpr int ERR_BAD_EXPORTING_LUN_NAME = 18990511;
constexpr int ERR_BAD_EXPORTED_LUN_UUID = 18990512;
constexpr int ERR_BAD_SNAPSHOT_NAME = 18990513;
constexpr int ERR_BAD_IS_LOCKED = 18990514;
constexpr int ERR_BAD_IS_APP_CONSISTENT = 18990515;
constexpr int ERR_BAD_IS_COUNT_ONLY = 18990516;
constexpr int ERR_BAD_ADDITIONAL = 18990517;
constexpr int ERR_BAD_SNAPSHOT_NOTE = 18990518;
constexpr int ERR_BAD_SNAPSHOT_ID = 18990519;
constexpr int ERR_BAD_SNAPSHOT_UUID = 18990520;
constexpr int ERR_BAD_SNAPSHOT_TIME = 18990521;
constexpr int ERR_BAD_NEW_NAME = 18990522;
constexpr int ERR_BAD_NEW_SIZE = 18990523;
constexpr int ERR_BAD_APP_KEY = 18990524;
constexpr int ERR_BAD_EXPORT_STATUS = 18990525;
constexpr int ERR_BAD_IMPORT_STATUS = 18990526;
constexpr int ERR_BAD_IS_SCHEDULED = 18990527;
constexpr int ERR_BAD_IS_FOR_TRASH = 18990528;
constexpr int ERR_BAD_IS_FOR_UNSYNC_SIZE = 18990529;
constexpr int ERR_NO_LUN_UUID = 18990530;
constexpr int ERR_NO_SUCH_LUN = 18990531;
constexpr int ERR_NO_SUCH_SNAPSHOT = 18990532;
constexpr int ERR_NO_SUCH_FAMILY = 18990533;
constexpr int ERR_LUN_IS_MAPPED = 18990534;
constexpr int ERR_LUN_IS_LOCKED = 18990535;
constexpr int ERR_LUN_NOT_LOADED = 18990536;
constexpr int ERR_LUN_CONFIG_REPAIRED = 18990537;
constexpr int ERR_DUPLICATED_LUN_NAME = 18990538;
constexpr int ERR_CANNOT_CLONE_A_BLOCK_LUN = 18990539;
constexpr int ERR_CANNOT_DELETE_LOCKED_SNAPSHOT = 18990540;
constexpr int ERR_REACH_MAX_LUN_COUNT = 18990541;
constexpr int ERR_REACH_MAX_TARGET_COUNT = 18990542;
constexpr int ERR_REACH_MAX_SNAPSHOT_COUNT = 18990543;
constexpr int ERR_FAMILY_CONFIG_REPAIRED = 18990544;
constexpr int ERR_SNAPSHOT_CONFIG_REPAIRED = 18990545;
constexpr int ERR_SNAPSHOT_NOT_LOADED = 18990546;
constexpr int ERR_SNAPSHOT_IS_LOCKED = 18990547;
constexpr int ERR_FAILED_TO_CREATE_LUN = 18990548;
constexpr int ERR_FAILED_TO_CONVERT_TO_SINK = 18990549;
constexpr int ERR_FAILED_TO_LOAD_LUN_CONFIG = 18990550;
constexpr int ERR_FAILED_TO_DELETE_LUN = 18990551;
constexpr int ERR_FAILED_TO_CLONE_LUN = 18990552;
constexpr int ERR_FAILED_TO_MIRROR_LUN = 18990553;
constexpr int ERR_FAILED_TO_PROMOTE_LUN = 18990554;
constexpr int ERR_FAILED_TO_GET_LUN_ID = 18990555;
constexpr int ERR_FAILED_TO_ADD_LUN_CONFIG = 18990556;
constexpr int ERR_FAILED_TO_LIST_LUN = 18990557;
constexpr int ERR_FAILED_TO_LOAD_FAMILY_CONFIG = 18990558;
constexpr int ERR_FAILED_TO_ADD_FAMILY_CONFIG = 18990559;
constexpr int ERR_FAILED_TO_REMOVE_FAMILY_CONFIG = 18990560;
constexpr int ERR_FAILED_TO_REMOVE_SNAPSHOT = 18990561;
constexpr int ERR_FAILED_TO_REMOVE_RETENTION_POLICY = 18990562;
constexpr int ERR_FAILED_TO_RUN_RETENTION_POLICY = 18990563;
constexpr int ERR_FAILED_TO_REMOVE_LUN_BACKUP_TASK = 18990564;
constexpr int ERR_FAILED_TO_REMOVE_SCHEDULE_SNAPSHOT_TASK = 18990565;
constexpr int ERR_FAILED_TO_GET_EXTENT_SIZE = 18990566;
constexpr int ERR_FAILED_TO_GET_SNAPSHOT_COUNT = 18990567;
constexpr int ERR_FAILED_TO_ACCESS_FAMILY_CONFIG = 18990568;
constexpr int ERR_FAILED_TO_TAKE_A_SNAPSHOT = 18990569;
constexpr int ERR_FAILED_TO_MAP_TARGET = 18990570;
constexpr int ERR_FAILED_TO_GET_SNAPSHOT_INFO = 18990571;
constexpr int ERR_FAILED_TO_GET_NEW_SNAPSHOT_NAME = 18990572;
constexpr int ERR_FAILED_TO_LOAD_SNAPSHOT_CONFIG = 18990573;
constexpr int ERR_FAILED_TO_CLONE_SNAPSHOT = 18990574;
constexpr int ERR_FAILED_TO_LOAD_SNAPSHOT = 18990575;
constexpr int ERR_FAILED_TO_UNLOAD_SNAPSHOT = 18990576;
constexpr int ERR_FAILED_TO_ENABLE_SNAPSHOT = 18990577;
constexpr int ERR_FAILED_TO_LOAD_LUN = 18990578;
constexpr int ERR_FAILED_TO_UNLOAD_LUN = 18990579;
constexpr int ERR_FAILED_TO_GET_UNUSED_LID = 18990580;
constexpr int ERR_FAILED_TO_GET_UNUSED_SID = 18990581;
constexpr int ERR_FAILED_TO_UPDATE_LUN = 18990582;
constexpr int ERR_FAILED_TO_GET_UPDATE_LUN_BACKUP_TASK = 18990583;
constexpr int ERR_FAILED_TO_PASS_SPACE_CHECK = 18990584;
constexpr int ERR_FAILED_TO_FINISH_EXPORT = 18990585;
constexpr int ERR_FAILED_TO_FINISH_IMPORT = 18990586;
constexpr int ERR_FAILED_TO_GET_LUN_STATUS = 18990587;
constexpr int ERR_EXPORT_INTERRUPT = 18990588;
constexpr int ERR_IMPORT_INTERRUPT = 18990589;
constexpr int ERR_NOW_IS_EXPORTING = 18990590;
constexpr int ERR_NOW_IS_IMPORTING = 18990591;
constexpr int ERR_NOW_IS_NOT_EXPORTING = 18990592;
constexpr int ERR_NOW_IS_NOT_IMPORTING = 18990593;
constexpr int ERR_I_O_ERROR = 18990594;
constexpr int ERR_FAILED_TO_FINISH_MAPPING_FILE_OPERATION = 18990595;

// Target: targets, authentication, ACL masking, LUN mapping.
constexpr int ERR_BAD_TARGET_NAME = 18990700;
constexpr int ERR_BAD_TARGET_IQN = 18990701;
constexpr int ERR_BAD_TARGET_AUTH_TYPE = 18990702;
constexpr int ERR_BAD_TARGET_MAX_SESSIONS = 18990703;
constexpr int ERR_BAD_TARGET_USER = 18990704;
constexpr int ERR_BAD_TARGET_PASSWORD = 18990705;
constexpr int ERR_BAD_TARGET_MUTUAL_USER = 18990706;
constexpr int ERR_BAD_TARGET_MUTUAL_PASSWORD = 18990707;
constexpr int ERR_BAD_TARGET_AUTH_INFO = 18990708;
constexpr int ERR_BAD_TARGET_PERMISSION = 18990709;
constexpr int ERR_BAD_TARGET_ID = 18990710;
constexpr int ERR_BAD_TARGET_ACL = 18990711;
constexpr int ERR_BAD_TARGET_ACL_AUTHORITY = 18990712;
constexpr int ERR_NO_SUCH_TARGET = 18990713;
constexpr int ERR_FAILED_TO_CREATE_TARGET = 18990714;
constexpr int ERR_FAILED_TO_CREATE_ACL_MASKING = 18990715;
constexpr int ERR_FAILED_TO_DELETE_ACL_MASKING = 18990716;
constexpr int ERR_FAILED_TO_UPDATE_ACL_MASKING = 18990717;
constexpr int ERR_FAILED_TO_ENABLE_TARGET = 18990718;
constexpr int ERR_FAILED_TO_DISABLE_TARGET = 18990719;
constexpr int ERR_FAILED_TO_DELETE_TARGET = 18990720;
constexpr int ERR_FAILED_TO_LIST_TARGET = 18990721;
constexpr int ERR_FAILED_TO_LOAD_TARGET = 18990722;
constexpr int ERR_FAILED_TO_UNLOAD_TARGET = 18990723;
constexpr int ERR_FAILED_TO_LOAD_TARGET_CONFIG = 18990724;
constexpr int ERR_FAILED_TO_ADD_TARGET_CONFIG = 18990725;
constexpr int ERR_FAILED_TO_UPDATE_TARGET_CONFIG = 18990726;
constexpr int ERR_FAILED_TO_REMOVE_TARGET_CONFIG = 18990727;
constexpr int ERR_FAILED_TO_LOAD_TARGET_MAPPING = 18990728;
constexpr int ERR_FAILED_TO_UNLOAD_TARGET_MAPPING = 18990729;
constexpr int ERR_FAILED_TO_REMOVE_TARGET_MAPPING = 18990730;
constexpr int ERR_FAILED_TO_LOAD_MAPPING_CONFIG = 18990731;
constexpr int ERR_FAILED_TO_GET_MAPPING_STATUS = 18990732;
constexpr int ERR_FAILED_TO_ENABLE_ISERT = 18990733;

// Replication: replication tasks, tracks, snapshot sending.
constexpr int ERR_NOT_A_SOURCE_TASK = 18990800;
constexpr int ERR_NOT_A_DESTINATION_TASK = 18990801;
constexpr int ERR_NOT_A_RESTORABLE_TASK = 18990802;
constexpr int ERR_NOT_ALLOWED_TO_DO_FULL_SYNC = 18990803;
constexpr int ERR_TASK_IS_NOT_RUNNING = 18990804;
constexpr int ERR_TASK_IS_NOT_PLAYABLE = 18990805;
constexpr int ERR_TASK_IS_NOT_STOPPED = 18990806;
constexpr int ERR_TASK_IS_STOPPED = 18990807;
constexpr int ERR_TASK_IS_LOCKED = 18990808;
constexpr int ERR_TASK_IS_TRACK_PLAYED = 18990809;
constexpr int ERR_NO_SUCH_TASK = 18990810;
constexpr int ERR_NO_IDLE_TRACKS = 18990811;
constexpr int ERR_NO_SUCH_TRACK = 18990812;
constexpr int ERR_NO_ALIGNED_TRACK = 18990813;
constexpr int ERR_REWIND_TO_LATEST_VERSION = 18990814;
constexpr int ERR_AUTO_REWINDING = 18990815;
constexpr int ERR_FAILOVER_DETECTED = 18990816;
constexpr int ERR_STOP_SENDING_SNAPSHOT = 18990817;
constexpr int ERR_BAD_REPLICATION_TASK_INFO = 18990818;
constexpr int ERR_BAD_REPLICATION_TASK_UUID = 18990819;
constexpr int ERR_REPLICATION_BAD_SOURCE_LUN_UUID = 18990820;
constexpr int ERR_REPLICATION_BAD_DESTINATION_LUN_UUID = 18990821;
constexpr int ERR_BAD_SOURCE_NODE_UUID = 18990822;
constexpr int ERR_BAD_DESTINATION_NODE_UUID = 18990823;
constexpr int ERR_BAD_IS_SOURCE = 18990824;
constexpr int ERR_BAD_REPLICATION_TYPE = 18990825;
constexpr int ERR_BAD_QUEUE_SIZE = 18990826;
constexpr int ERR_BAD_ASYNC_PERIOD = 18990827;
constexpr int ERR_BAD_TRACK_SIZE_LIMIT = 18990828;
constexpr int ERR_BAD_REBASE_PERIOD = 18990829;
constexpr int ERR_BAD_SOURCE_TASK_UUID = 18990830;
constexpr int ERR_BAD_TASK_UUID = 18990831;
constexpr int ERR_BAD_IS_TIME_UP = 18990832;
constexpr int ERR_BAD_TASK_STATUS = 18990833;
constexpr int ERR_BAD_PARENT_TASK_UUID = 18990834;
constexpr int ERR_BAD_TRACK_UUID = 18990835;
constexpr int ERR_BAD_TRACK_VERSION = 18990836;
constexpr int ERR_BAD_SOURCE_TRACK_UUID = 18990837;
constexpr int ERR_BAD_DESTINATION_TRACK_UUID = 18990838;
constexpr int ERR_BAD_DROP_IDLE_TRACKS = 18990839;
constexpr int ERR_BAD_DELETE_LUN = 18990840;
constexpr int ERR_BAD_MAPPED_SIZE = 18990841;
constexpr int ERR_BAD_TO_SOURCE = 18990842;
constexpr int ERR_BAD_TRACK_NOTE = 18990843;
constexpr int ERR_BAD_SOURCE_ADDRESS = 18990844;
constexpr int ERR_BAD_DESTINATION_ADDRESS = 18990845;
constexpr int ERR_BAD_SOURCE_PORT = 18990846;
constexpr int ERR_BAD_DESTINATION_PORT = 18990847;
constexpr int ERR_BAD_IS_FULL_SYNC_ALLOWED = 18990848;
constexpr int ERR_BAD_IS_DATA_ENCRYPTED = 18990849;
constexpr int ERR_BAD_DO_UPDATE_TRACK = 18990850;
constexpr int ERR_BAD_DO_SEND_TRACK = 18990851;
constexpr int ERR_BAD_SOURCE_SNAPSHOTS = 18990852;
constexpr int ERR_BAD_BASE_SNAPSHOT_UUID = 18990853;
constexpr int ERR_BAD_SENDING_SNAPSHOT_UUID = 18990854;
constexpr int ERR_FAILED_TO_CREATE_REPLICATION_TASK = 18990855;
constexpr int ERR_FAILED_TO_DELETE_REPLICATION_TASK = 18990856;
constexpr int ERR_FAILED_TO_START_REPLICATION_TASK = 18990857;
constexpr int ERR_FAILED_TO_LOAD_REPLICATION_TASK_CONFIG = 18990858;
constexpr int ERR_FAILED_TO_GET_REPLICATION_TASK_UUID = 18990859;
constexpr int ERR_FAILED_TO_UPDATE_TRACK = 18990860;
constexpr int ERR_FAILED_TO_SEND_TRACK = 18990861;
constexpr int ERR_FAILED_TO_SYNC_SOURCE_TASK = 18990862;
constexpr int ERR_FAILED_TO_SYNC_DESTINATION_TASK = 18990863;
constexpr int ERR_FAILED_TO_LIST_TASK = 18990864;
constexpr int ERR_FAILED_TO_GET_TRACK_STATUS = 18990865;
constexpr int ERR_FAILED_TO_LIST_TRACK = 18990866;
constexpr int ERR_FAILED_TO_GET_TRACK_INFO = 18990867;
constexpr int ERR_FAILED_TO_FREEZE_TASK = 18990868;
constexpr int ERR_FAILED_TO_CONVERT_TASK = 18990869;
constexpr int ERR_FAILED_TO_LOAD_TRACK = 18990870;
constexpr int ERR_FAILED_TO_UNLOAD_TRACK = 18990871;
constexpr int ERR_FAILED_TO_RESTORE_TASK = 18990872;
constexpr int ERR_FAILED_TO_REBASE_TASK = 18990873;
constexpr int ERR_FAILED_TO_SET_STATUS = 18990874;
constexpr int ERR_FAILED_TO_UNSET_STATUS = 18990875;
constexpr int ERR_FAILED_TO_GET_BASE_VERSION = 18990876;
constexpr int ERR_FAILED_TO_GET_PROGRESS = 18990877;
constexpr int ERR_FAILED_TO_DO_TASK_ACTION = 18990878;
constexpr int ERR_FAILED_TO_COMPLETE_RESTORE = 18990879;
constexpr int ERR_FAILED_TO_COMPLETE_REBASE = 18990880;
constexpr int ERR_FAILED_TO_PAUSE_SENDING_TRACK = 18990881;
constexpr int ERR_FAILED_TO_GET_PLAYING_CANDIDATE = 18990882;
constexpr int ERR_FAILED_TO_CLONE_TRACK = 18990883;
constexpr int ERR_FAILED_TO_DELETE_TRACK = 18990884;
constexpr int ERR_FAILED_TO_SET_BASE_SNAPSHOT = 18990885;
constexpr int ERR_FAILED_TO_SEND_SNAPSHOT = 18990886;
constexpr int ERR_FAILED_TO_COMPUTE_UNSYNC_SIZE = 18990887;

// Virtual LUN: virtual LUNs.
constexpr int ERR_BAD_VLUN_TYPE = 18991000;
constexpr int ERR_BAD_VLUN_UUID = 18991001;
constexpr int ERR_NO_VLUN_UUID = 18991002;
constexpr int ERR_FAILED_TO_CREATE_VLUN = 18991003;
constexpr int ERR_FAILED_TO_BIND = 18991004;
constexpr int ERR_FAILED_TO_LOAD_VLUN_CONFIG = 18991005;
constexpr int ERR_FAILED_TO_DELETE_VLUN = 18991006;
constexpr int ERR_FAILED_TO_LOAD_VLUN_STATUS = 18991007;
constexpr int ERR_FAILED_TO_LOAD_NAA = 18991008;
constexpr int ERR_FAILED_TO_UNLOAD_NAA = 18991009;

// Node: remote peer nodes, sessions, ROD keys.
constexpr int ERR_BAD_NODE_UUID = 18991100;
constexpr int ERR_BAD_NODE_HOSTNAME = 18991101;
constexpr int ERR_BAD_NODE_PORT = 18991102;
constexpr int ERR_BAD_NODE_PROTOCOL = 18991103;
constexpr int ERR_BAD_NODE_ROD_KEY = 18991104;
constexpr int ERR_BAD_NODE_ACCOUNT = 18991105;
constexpr int ERR_BAD_NODE_PASSWORD = 18991106;
constexpr int ERR_BAD_NODE_OTP_CODE = 18991107;
constexpr int ERR_INVAILD_NET_FAMILY = 18991108;
constexpr int ERR_NO_SUCH_NODE = 18991109;
constexpr int ERR_NO_NODE_UUID = 18991110;
constexpr int ERR_NODE_UUID_EXISTS = 18991111;
constexpr int ERR_FAILED_TO_LOAD_NODE_CONFIG = 18991112;
constexpr int ERR_FAILED_TO_INIT_CGI = 18991113;
constexpr int ERR_FAILED_TO_GET_AUTH_TYPE = 18991114;
constexpr int ERR_FAILED_TO_SET_CGI_OPTION = 18991115;
constexpr int ERR_FAILED_TO_LOGIN_WITHOUT_AUTH = 18991116;
constexpr int ERR_FAILED_TO_LOAD_ROD_KEY = 18991117;
constexpr int ERR_FAILED_TO_SET_ROD_KEY = 18991118;
constexpr int ERR_FAILED_TO_GET_ROD_KEY = 18991119;
constexpr int ERR_FAILED_TO_LIST_NODES = 18991120;
constexpr int ERR_FAILED_TO_GET_ADDRESS_INFO = 18991121;

namespace error_table {

/// The texts of all codes, one range after another; a text is interface, odd spellings included.
inline constexpr const char *const texts[] = {
    // General, from 18990000
    "Default error code",
    "Out of memory",
    "Out of free space",
    "Null pointer",
    "Bad parameter",
    "Bad file system type",
    "Bad file type",
    "Bad file size",
    "Bad string length",
    "No permission",
    "Timeout",
    "File not found",
    "File exists",
    "Try again",
    "Failed to fork",
    "Failed to lock file",
    "Failed to unlock file",
    "Failed to get file session",
    "Failed to set file session",
    "Failed to add file session",
    "Failed to remove file session",
    "Failed to stat path",
    "Failed to access path",
    "Failed to touch file",
    "Failed to flush or close file",
    "Failed to copy string",
    "Failed to open directory",
    "Failed to close directory",
    "Failed to cerate directory",
    "Failed to remove directory",
    "Failed to insmod kernel module",
    "Failed to rmmod kernel module",
    "Failed to set hash value",
    "Failed to get hash value",
    "Failed to set pairs",
    "Failed to get pairs",
    "Failed to link file",
    "Failed to unlink file",
    "Failed to open file",
    "Failed to read file",
    "Failed to write file",
    "Failed to seek file",
    "Failed to rename file",
    "Failed to copy file",
    "Failed to glob",
    "Failed to start service",
    "Failed to stop service",
    "Failed to get file path",
    "Failed to allocate file",
    "Failed to get time",
    "Failed to parse string",
    "Failed to get hostent",
    "Failed to get filesystem info",
    "Failed to pin volume",
    "Failed to mount",
    "Failed to get hostname",
    "Failed to get truncate mode",
    "Failed to truncate file",
    // Web-API client, from 18990200
    "No such API",
    "Invalid input",
    "Bad client input",
    "Bad IP",
    "Bad response",
    "Failed to login",
    "Failed to logout",
    "Failed to create request",
    "Failed to convert to json",
    "Failed to get uuid",
    "Failed to get session ID",
    "Failed to send the request",
    "Failed to get error code",
    "Not implemented yet",
    // Configuration and volume, from 18990300
    "Failed to get volume info",
    "Failed to enumerate section",
    "Failed to enumerate config section",
    "Failed to get section",
    "Failed to add section",
    "Failed to set section",
    "Failed to remove section",
    "Failed to modify section",
    "Failed to push to list",
    "Failed to get from list",
    "Failed to parse header",
    "Failed to parse volume ID",
    "Failed to init plugin hook",
    "Failed to run plugin action",
    "Failed to get serial number",
    "Failed to send notification",
    "Failed to get space device size",
    // Extent pool and EP files, from 18990400
    "Bad EP file type",
    "Bad EP file path",
    "Bad portals",
    "Bad description",
    "Bad deleted_by",
    "Need LIO support",
    "No portal",
    "No plugin notified",
    "Failed to plugin-notify",
    "Failed to plugin-start",
    "Failed to plugin-end",
    "Failed to create object file",
    "Failed to create communication",
    "Failed to fill EP file",
    "Failed to get mapped size",
    "Failed to add extent pool",
    "Failed to create EPIO journal",
    "Inconsistent EPIO journal",
    "Failed to enable extent pool",
    "Failed to disable extent pool",
    "Failed to set volume ID",
    "Failed to set map file path",
    "Failed to create progress file",
    "Failed to delete progress file",
    "Failed to set progress file",
    "Failed to get iSCSIConfig",
    "Failed to generate UUID",
    // LUN and snapshot, from 18990500
    "Bad LUN type",
    "Bad LUN location",
    "Bad LUN size",
    "Bad LUN name",
    "Bad LUN ID",
    "Bad LUN UUID",
    "Bad LUN is_same_pool",
    "Bad LUN extent_size",
    "Bad source LUN UUID",
    "Bad destination LUN UUID",
    "Bad exporting location",
    "Bad exporting LUN name",
    "Bad exported LUN UUID",
    "Bad snapshot_name",
    "Bad is_locked",
    "Bad is_app_consistent",
    "Bad is_count_only",
    "Bad additional",
    "Bad snapshot_note",
    "Bad snapshot ID",
    "Bad snapshot UUID",
    "Bad snapshot time",
    "Bad new_name",
    "Bad new_size",
    "Bad app_key",
    "Bad export_status",
    "Bad import_status",
    "Bad is_scheduled",
    "Bad is_for_trash",
    "Bad is_for_unsync_size",
    "No LUN UUID",
    "No such LUN",
    "No such snapshot",
    "No such family",
    "LUN is mapped",
    "LUN is locked",
    "LUN not loaded",
    "LUN config repaired",
    "Duplicated LUN name",
    "Cannot clone a block LUN",
    "Cannot delete locked snapshot",
    "Reach max LUN count",
    "Reach max target count",
    "Reach max snapshot count",
    "Family config repaired",
    "Snapshot config repaired",
    "Snapshot not loaded",
    "Snapshot is locked",
    "Failed to create LUN",
    "Failed to convert to sink",
    "Failed to load LUN config",
    "Failed to delete LUN",
    "Failed to clone LUN",
    "Failed to mirror LUN",
    "Failed to promote LUN",
    "Failed to get LUN ID",
    "Failed to add LUN config",
    "Failed to list LUN",
    "Failed to load family config",
    "Failed to add family config",
    "Failed to remove family config",
    "Failed to remove snapshot",
    "Failed to remove retention policy",
    "Failed to run retention policy",
    "Failed to remove LUN backup task",
    "Failed to remove schedule snapshot task",
    "Failed to get extent size",
    "Failed to get snapshot count",
    "Failed to access family config",
    "Failed to take a snapshot",
    "Failed to map target",
    "Failed to get snapshot info",
    "Failed to get new snapshot name",
    "Failed to load snapshot config",
    "Failed to clone snapshot",
    "Failed to load snapshot",
    "Failed to unload snapshot",
    "Failed to enable snapshot",
    "Failed to load LUN",
    "Failed to unload LUN",
    "Failed to get unused lid",
    "Failed to get unused sid",
    "Failed to update LUN",
    "Failed to get update LUN backup task",
    "Failed to pass space check",
    "Failed to finish export",
    "Failed to finish import",
    "Failed to get LUN status",
    "Export interrupt",
    "Import interrupt",
    "Now is exporting",
    "Now is importing",
    "Now is not exporting",
    "Now is not importing",
    "I/O error",
    "Failed to finish mapping file operation",
    // Target, from 18990700
    "Bad target name",
    "Bad target iqn",
    "Bad target auth_type",
    "Bad target max_sessions",
    "Bad target user",
    "Bad target password",
    "Bad target mutual_user",
    "Bad target mutual_password",
    "Bad target auth info",
    "Bad target permission",
    "Bad target ID",
    "Bad target acl",
    "Bad target acl authority",
    "No such target",
    "Failed to create target",
    "Failed to create ACL masking",
    "Failed to delete ACL masking",
    "Failed to update ACL masking",
    "Failed to enable target",
    "Failed to disable target",
    "Failed to delete target",
    "Failed to list target",
    "Failed to load target",
    "Failed to unload target",
    "Failed to load target config",
    "Failed to add target config",
    "Failed to update target config",
    "Failed to remove target config",
    "Failed to load target mapping",
    "Failed to unload target mapping",
    "Failed to remove target mapping",
    "Failed to load mapping config",
    "Failed to get mapping status",
    "Failed to enable isert",
    // Replication, from 18990800
    "Not a source task",
    "Not a destination task",
    "Not a restorable task",
    "Not allowed to do full sync",
    "Task is not running",
    "Task is not playable",
    "Task is not stopped",
    "Task is stopped",
    "Task is locked",
    "Task is track played",
    "No such task",
    "No idle tracks",
    "No such track",
    "No aligned track",
    "Rewind to latest version",
    "Auto rewinding",
    "Failover detected",
    "Stop sending snapshot",
    "Bad replication task info",
    "Bad replication task UUID",
    "Bad source LUN UUID",
    "Bad destination LUN UUID",
    "Bad source Node UUID",
    "Bad destination Node UUID",
    "Bad is_source",
    "Bad replication type",
    "Bad queue size",
    "Bad async period",
    "Bad track size limit",
    "Bad rebase period",
    "Bad source task UUID",
    "Bad task UUID",
    "Bad is_time_up",
    "Bad task status",
    "Bad parent task UUID",
    "Bad track UUID",
    "Bad track version",
    "Bad source track UUID",
    "Bad destination track UUID",
    "Bad drop_idle_tracks",
    "Bad delete_lun",
    "Bad mapped_size",
    "Bad to_source",
    "Bad track_note",
    "Bad source address",
    "Bad destination address",
    "Bad source port",
    "Bad destination port",
    "Bad is_full_sync_allowed",
    "Bad is_data_encrypted",
    "Bad do_update_track",
    "Bad do_send_track",
    "Bad source_snapshots",
    "Bad base_snapshot_uuid",
    "Bad sending_snapshot_uuid",
    "Failed to create replication task",
    "Failed to delete replication task",
    "Failed to start replication task",
    "Failed to load replication task config",
    "Failed to get replication task UUID",
    "Failed to update track",
    "Failed to send track",
    "Failed to sync source task",
    "Failed to sync destination task",
    "Failed to list task",
    "Failed to get track status",
    "Failed to list track",
    "Failed to get track info",
    "Failed to freeze task",
    "Failed to convert task",
    "Failed to load track",
    "Failed to unload track",
    "Failed to restore task",
    "Failed to rebase task",
    "Failed to set status",
    "Failed to unset status",
    "Failed to get base version",
    "Failed to get progress",
    "Failed to do task action",
    "Failed to complete restore",
    "Failed to complete rebase",
    "Failed to pause sending track",
    "Failed to get playing candidate",
    "Failed to clone track",
    "Failed to delete track",
    "Failed to set base snapshot",
    "Failed to send snapshot",
    "Failed to compute unsync size",
    // Virtual LUN, from 18991000
    "Bad vLUN type",
    "Bad vLUN UUID",
    "No vLUN UUID",
    "Failed to create vLUN",
    "Failed to bind",
    "Failed to load vLUN config",
    "Failed to delete vLUN",
    "Failed to load vLUN status",
    "Failed to load NAA",
    "Failed to unload NAA",
    // Node, from 18991100
    "Bad node UUID",
    "Bad node hostname",
    "Bad node port",
    "Bad node protocol",
    "Bad node ROD key",
    "Bad node account",
    "Bad node password",
    "Bad node OTP code",
    "Invaild net family",
    "No such node",
    "No node UUID",
    "Node UUID exists",
    "Failed to load node config",
    "Failed to init CGI",
    "Failed to get auth type",
    "Failed to set CGI option",
    "Failed to login without auth",
    "Failed to load ROD key",
    "Failed to set ROD key",
    "Failed to get ROD key",
    "Failed to list nodes",
    "Failed to get address info",
};

struct Range {
    int first, last;
    int index; ///< of the first code's text in `texts`
};

inline constexpr Range ranges[] = {
    {18990000, 18990057, 0},   // General
    {18990200, 18990213, 58},  // Web-API client
    {18990300, 18990316, 72},  // Configuration and volume
    {18990400, 18990426, 89},  // Extent pool and EP files
    {18990500, 18990595, 116}, // LUN and snapshot
    {18990700, 18990733, 212}, // Target
    {18990800, 18990887, 246}, // Replication
    {18991000, 18991009, 334}, // Virtual LUN
    {18991100, 18991121, 344}, // Node
};

static_assert(sizeof(texts) / sizeof(texts[0]) == 366, "one text for every code");

} // namespace error_table

/// The text of any code: the table's for the library's own codes, strerror's for errno values
/// (-255 to -1 are negated first) and for everything else. Never null; not freed by the caller. A
/// strerror text is valid until the thread's next call of strerror.
static inline const char *ErrorCodeToString(int code)
{
    for (const auto &range : error_table::ranges) {
        if (code >= range.first && code <= range.last)
            return error_table::texts[range.index + code - range.first];
    }
    const char *text = strerror(code >= -255 && code <= -1 ? -code : code);
    return text ? text : "Undefined error string";
}

} // namespace ISCSI
