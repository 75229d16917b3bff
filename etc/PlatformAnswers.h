/// Owners of what the platform allocates: freed on every path.
#pragma once

#include "platform/iscsi_config.h"
#include "platform/iscsi_lun.h"
#include "platform/iscsi_snapshot.h"
#include "platform/replication.h"

#include <cstdlib>
#include <memory>

namespace ISCSI {

struct FreeConf {
    void operator()(_tag_iscsi_conf_ *conf) const { NORViSCSIConfFree(conf); }
};
using Conf = std::unique_ptr<_tag_iscsi_conf_, FreeConf>;

struct FreeList {
    void operator()(void *list) const { free(list); }
};
using LUNRecords = std::unique_ptr<_tag_iscsi_lun_[], FreeList>;

using SnapshotRecord = std::unique_ptr<_tag_iscsi_snapshot_, FreeList>;

/// A list of snapshot records, given up record by record so that no record is held twice.
struct SnapshotRecords {
    _tag_iscsi_snapshot_list_ head{};

    SnapshotRecords() = default;
    SnapshotRecords(const SnapshotRecords &) = delete;
    SnapshotRecords &operator=(const SnapshotRecords &) = delete;
    ~SnapshotRecords()
    {
        while (takeFirst()) {
        }
    }

    /// Unlinks the first record; null at the end of the list.
    SnapshotRecord takeFirst()
    {
        _tag_iscsi_snapshot_ *record = head.first;
        if (record) {
            head.first = record->next;
            (record->next ? record->next->previous : head.last) = nullptr;
        }
        return SnapshotRecord(record);
    }
};

using TaskRecord = std::unique_ptr<_tag_iscsi_task_, FreeList>;

/// A queue of task records, given up record by record.
struct TaskRecords {
    _tag_iscsi_task_ head{};

    TaskRecords() = default;
    TaskRecords(const TaskRecords &) = delete;
    TaskRecords &operator=(const TaskRecords &) = delete;
    ~TaskRecords()
    {
        while (takeFirst()) {
        }
    }

    /// Unlinks the first record; null at the end of the queue.
    TaskRecord takeFirst()
    {
        _tag_iscsi_task_ *record = head.forward;
        if (!record || record == &head) // a queue ends in null, or is a ring
            return nullptr;
        head.forward = record->forward;
        if (head.forward)
            head.forward->backward = &head;
        return TaskRecord(record);
    }
};

struct FreeTextList {
    void operator()(NLIBC_SZ_LIST *list) const { NLIBCSzListFree(list); }
};
using TextList = std::unique_ptr<NLIBC_SZ_LIST, FreeTextList>;

struct FreeTextHash {
    void operator()(NLIBC_SZ_HASH *hash) const { NLIBCSzHashFree(hash); }
};
using TextHash = std::unique_ptr<NLIBC_SZ_HASH, FreeTextHash>;

/// NORViSCSIConfGet with an owned answer.
inline int queryConf(const _tag_iscsi_conf_query_ &query, Conf &out)
{
    _tag_iscsi_conf_ *conf = nullptr;
    const int err = NORViSCSIConfGet(&query, &conf);
    out.reset(conf);
    return err;
}

/// Whether the LUN is mapped to any target; entries with other target IDs are the SDK's own.
inline int queryIsMapped(int lid, bool &out)
{
    _tag_iscsi_conf_query_ query{};
    query.kind = NORV_CONF_MAPPINGS_OF_LUN;
    query.lid = lid;
    Conf conf;
    if (int err = queryConf(query, conf))
        return err;
    out = false;
    for (const _tag_iscsi_mapping_ *mapping = conf->mappings; mapping && !out; mapping = mapping->next)
        out = mapping->tid >= 1 && mapping->tid <= NORV_TARGET_ID_MAX;
    return 0;
}

} // namespace ISCSI
