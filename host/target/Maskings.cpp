/// The platform's ACL masking.
#include "host/core/LastError.h"
#include "host/target/Change.h"
#include "host/target/Name.h"
#include "host/target/TargetStore.h"
#include "platform/error.h"
#include "platform/iscsi_masking.h"
#include "platform/iscsi_target.h"

#include <algorithm>
#include <cstring>

using namespace norvhost;

namespace {

using Entry = _tag_struct_iscsi_acl_;

/// The form in which entries are compared; the default entry's name is its own.
int normalForm(const Entry &entry, std::string &name)
{
    if (!memchr(entry.iqn, '\0', sizeof entry.iqn))
        return fail(NORV_ERR_TARGET_ACL, "initiator IQN: the text has no end");
    if (!normaliseName(entry.iqn, name))
        return fail(NORV_ERR_TARGET_IQN, "initiator IQN: '%s' is no iSCSI name", entry.iqn);
    return 0;
}

int checkPermission(const Entry &entry)
{
    switch (entry.permission) {
    case NORV_AUTHORITY_NONE:
    case NORV_AUTHORITY_READ:
    case NORV_AUTHORITY_READ_WRITE:
        return 0;
    default:
        return fail(NORV_ERR_TARGET_PERMISSION, "permission of '%s': 0 (none), 1 (read) or 3 (read and write)",
                    entry.iqn);
    }
}

/// The target's stored entry for the same initiator, whatever the letter case; null when there is none.
int findStored(const Entry &entry, std::vector<Entry> &stored, const Entry *&found)
{
    std::string wanted, name;
    _tag_iscsi_target_ target;
    if (int err = normalForm(entry, wanted))
        return err;
    if (int err = loadTarget(entry.tid, target))
        return err;
    if (int err = loadMaskingEntries(entry.tid, stored))
        return err;
    const auto same = std::find_if(stored.begin(), stored.end(), [&](const Entry &other) {
        return normaliseName(other.iqn, name) && name == wanted;
    });
    found = same == stored.end() ? nullptr : &*same;
    return 0;
}

/// Runs `change` for each entry; all of them or none.
template <class Change>
int changeEach(const std::vector<Entry> &entries, Change change)
{
    return changeTargets([&](std::vector<int> &tids) {
        for (const Entry &entry : entries) {
            std::vector<Entry> stored;
            const Entry *found;
            if (int err = findStored(entry, stored, found))
                return err;
            if (int err = change(entry, found))
                return err;
            if (std::find(tids.begin(), tids.end(), entry.tid) == tids.end())
                tids.push_back(entry.tid);
        }
        return 0;
    });
}

int notListed(const Entry &entry)
{
    return fail(NORV_ERR_TARGET_ACL, "the masking of target %d has no entry for '%s'", entry.tid, entry.iqn);
}

} // namespace

int NORViSCSITargetMaskingGet(int tid, std::vector<Entry> &entries)
{
    _tag_iscsi_target_ target;
    if (int err = loadTarget(tid, target))
        return err;
    return loadMaskingEntries(tid, entries);
}

int NORViSCSIMaskingsCreate(const std::vector<Entry> &entries)
{
    return changeEach(entries, [](const Entry &entry, const Entry *found) {
        if (int err = checkPermission(entry))
            return err;
        // The same entry once more changes its permission; another spelling would be a second one.
        if (found && strcmp(found->iqn, entry.iqn) != 0)
            return fail(NORV_ERR_TARGET_ACL, "the masking of target %d has an entry for the same initiator: '%s'",
                        entry.tid, found->iqn);
        return storeMaskingEntry(entry);
    });
}

int NORViSCSIMaskingsUpdate(const std::vector<Entry> &entries)
{
    return changeEach(entries, [](const Entry &entry, const Entry *found) {
        if (int err = checkPermission(entry))
            return err;
        if (!found)
            return notListed(entry);
        Entry stored = *found;
        stored.permission = entry.permission;
        return storeMaskingEntry(stored);
    });
}

int NORViSCSIMaskingsRemove(const std::vector<Entry> &entries)
{
    return changeEach(entries, [](const Entry &entry, const Entry *found) {
        return found ? deleteMaskingEntry(found->tid, found->iqn) : notListed(entry);
    });
}

int NORViSCSIDefaultACLSet(const _tag_iscsi_target_ *target, int permission)
{
    if (!target)
        return fail(NORV_ERR_NULL_POINTER, "no target record");
    Entry entry = {};
    entry.tid = target->tid;
    strcpy(entry.iqn, NORV_DEFAULT_MASKING_IQN);
    entry.permission = permission;
    return NORViSCSIMaskingsCreate({entry});
}
