/// Queries of the iSCSI configuration: targets, and the mappings of a LUN.
#pragma once

#include "platform/iscsi_lun.h"
#include "platform/iscsi_target.h"

/// Kinds of query; the field of the query record that each reads is named behind it.
enum {
    NORV_CONF_TARGET_BY_ID = 0x1001,    ///< tid: that target
    NORV_CONF_TARGET_BY_NAME = 0x1004,  ///< name: that target
    NORV_CONF_ALL_TARGETS = 0x7000,     ///< every target, ascending by ID
    NORV_CONF_TARGETS_OF_LUN = 0x7020,  ///< lun: the targets it is mapped to, with its mapping entries
    NORV_CONF_MAPPINGS_OF_LUN = 0x7220, ///< lid: its mapping entries
};

typedef struct _tag_iscsi_conf_query_ {
    uint16_t kind;
    int32_t lid;
    int32_t tid;
    const char *name;
    const _tag_iscsi_lun_ *lun;
} _tag_iscsi_conf_query_;

/// One LUN in one target.
typedef struct _tag_iscsi_mapping_ {
    int32_t tid;
    int32_t lid;
    int32_t mapping_index; ///< the LUN number that the target's initiators see
    struct _tag_iscsi_mapping_ *next;
} _tag_iscsi_mapping_;

/// An answer: singly walked lists, null when empty. In a NORV_CONF_TARGETS_OF_LUN answer the n-th
/// mapping belongs to the n-th target.
typedef struct _tag_iscsi_conf_ {
    _tag_iscsi_target_ *targets;
    _tag_iscsi_mapping_ *mappings;
} _tag_iscsi_conf_;

NORV_BEGIN_DECLS

/// Answers a query; 0 on success (an object that does not exist is an empty answer), else an error
/// code with `*conf` null. The caller frees the answer with NORViSCSIConfFree.
NORV_API int NORViSCSIConfGet(const _tag_iscsi_conf_query_ *query, _tag_iscsi_conf_ **conf);

/// Frees an answer of either query function; null is allowed.
NORV_API void NORViSCSIConfFree(_tag_iscsi_conf_ *conf);

/// As NORViSCSIConfGet, for targets only and without the LUNs' side of the store.
NORV_API int NORViSCSIConfTargetLoad(const _tag_iscsi_conf_query_ *query, _tag_iscsi_conf_ **conf);

NORV_END_DECLS
