// ACL masking on the fake's model.
#include "platform/error.h"
#include "platform/iscsi_masking.h"
#include "tests/fake/Script.h"

#include <algorithm>

using namespace fake;

namespace {

using Entries = std::vector<_tag_struct_iscsi_acl_>;

std::string listed(const Entries &entries)
{
    std::string text;
    for (const auto &entry : entries)
        text += (text.empty() ? "" : " ") + textOf(entry.iqn) + "=" + std::to_string(entry.permission);
    return text;
}

int tidOf(const Entries &entries)
{
    return entries.empty() ? 0 : entries.front().tid;
}

auto find(Target &target, const std::string &iqn)
{
    return std::find_if(target.masking.begin(), target.masking.end(),
                        [&](const auto &entry) { return entry.first == iqn; });
}

bool isPermission(int permission)
{
    return permission == NORV_AUTHORITY_NONE || permission == NORV_AUTHORITY_READ ||
           permission == NORV_AUTHORITY_READ_WRITE;
}

/// Changes the masking entry by entry, on a copy of the targets that counts only when all went well.
template <class Change>
int changeAll(const Entries &entries, Change change)
{
    auto targets = model().targets;
    for (const auto &entry : entries) {
        const auto found = targets.find(entry.tid);
        if (found == targets.end())
            return NORV_ERR_NO_SUCH_TARGET;
        if (int err = change(found->second, textOf(entry.iqn), entry.permission))
            return err;
    }
    model().targets = std::move(targets);
    return 0;
}

int setEntry(Target &target, const std::string &iqn, int permission)
{
    if (!isPermission(permission))
        return NORV_ERR_TARGET_PERMISSION;
    const auto entry = find(target, iqn);
    if (entry == target.masking.end())
        target.masking.emplace_back(iqn, permission);
    else
        entry->second = permission;
    return 0;
}

} // namespace

int NORViSCSIDefaultACLSet(const _tag_iscsi_target_ *target, int permission)
{
    Target *known = valueOf(model().targets, target->tid);
    NOTE_CALL_ON(known, target->tid, permission);
    return setEntry(*known, NORV_DEFAULT_MASKING_IQN, permission);
}

int NORViSCSITargetMaskingGet(int tid, Entries &entries)
{
    const Target *known = valueOf(model().targets, tid);
    NOTE_CALL_ON(known, tid);
    entries.clear();
    for (const auto &[iqn, permission] : known->masking) {
        _tag_struct_iscsi_acl_ entry{};
        entry.tid = tid;
        put(entry.iqn, iqn);
        entry.permission = permission;
        entries.push_back(entry);
    }
    return 0;
}

int NORViSCSIMaskingsCreate(const Entries &entries)
{
    NOTE_CALL(tidOf(entries), listed(entries));
    return changeAll(entries, setEntry);
}

int NORViSCSIMaskingsUpdate(const Entries &entries)
{
    NOTE_CALL(tidOf(entries), listed(entries));
    return changeAll(entries, [](Target &target, const std::string &iqn, int permission) {
        return find(target, iqn) == target.masking.end() ? NORV_ERR_TARGET_ACL : setEntry(target, iqn, permission);
    });
}

int NORViSCSIMaskingsRemove(const Entries &entries)
{
    NOTE_CALL(tidOf(entries), listed(entries));
    return changeAll(entries, [](Target &target, const std::string &iqn, int) {
        const auto entry = find(target, iqn);
        if (entry == target.masking.end())
            return static_cast<int>(NORV_ERR_TARGET_ACL);
        target.masking.erase(entry);
        return 0;
    });
}
