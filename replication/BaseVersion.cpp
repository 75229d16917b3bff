#include "replication/BaseVersion.h"

#include "platform/extent_pool.h"

namespace ISCSI::LIB::LIBReplication {

std::optional<Base> baseOfLUN(const SnapshotsByVersion &source, const std::string &lun_base, bool is_modified,
                              bool is_sending_failed)
{
    if (lun_base == NORV_ZERO_UUID)
        return Base{};
    const auto held = source.find(lun_base);
    if (held == source.end() || (is_modified && !is_sending_failed))
        return std::nullopt;
    Base base;
    base.version = held->second.version;
    return base;
}

Base baseOfSnapshots(const SnapshotsByVersion &source, const std::vector<ISCSISnapshotInfo> &destination)
{
    Base base;
    for (const auto &snapshot : destination) {
        if (source.count(snapshot.version) == 0)
            continue;
        base.version = snapshot.version;
        base.not_aligned = true;
        base.restore_uuid = snapshot.uuid;
        return base;
    }
    base.need_full_sync = true;
    return base;
}

} // namespace ISCSI::LIB::LIBReplication
