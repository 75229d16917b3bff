#include "tests/contract/Platform.h"
#include "tests/fake/Fake.h"

namespace contract {

Platform::Platform() : volume("/volume1"), folder("/usr/norv/contract")
{
    fake::reset();
}

Platform::~Platform() = default;

void Platform::startService() {}

void Platform::addSnapshotTask(int, const std::string &lun_name)
{
    fake::model().jobs[1] = {lun_name, 0};
}

void Platform::addScheduledSnapshots(int lid)
{
    fake::model().jobs[2] = {"", lid};
}

void Platform::addRetentionPolicy(int lid)
{
    fake::model().retention_policies.insert({"Lun#", std::to_string(lid)});
}

void Platform::unlock(const char *snapshot_uuid)
{
    for (auto &[place, snapshot] : fake::model().snapshots) {
        if (std::string(snapshot.record.uuid) != snapshot_uuid)
            continue;
        snapshot.record.user_locked = 0;
        snapshot.app_keys.clear();
    }
}

} // namespace contract
