#include "tests/contract/Platform.h"

#include "iscsihost/host.h"
#include "platform/iscsi_config.h"
#include "platform/iscsi_lun.h"
#include "platform/iscsi_snapshot.h"
#include "platform/iscsi_target.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>
#include <memory>
#include <stdexcept>

namespace contract {
namespace {

void require(int err, const char *what)
{
    if (err)
        throw std::runtime_error(std::string(what) + ": " + std::to_string(err) + " " + iscsi_host_last_error());
}

/// One state store and one service for all tests of the program; each test leaves them empty.
class Host : public testing::Environment {
public:
    void SetUp() override
    {
        std::string pattern = testing::TempDir() + "contract.XXXXXX";
        if (!mkdtemp(pattern.data()))
            throw std::runtime_error("cannot make " + pattern);
        folder = std::filesystem::canonical(pattern);
        setenv("ISCSI_HOST_STATE", (folder + "/state").c_str(), 1);
        setenv("ISCSI_HOST_RUN", (folder + "/run").c_str(), 1);
        setenv("ISCSI_HOST_PROGRESS", (folder + "/progress").c_str(), 1);
        volume = folder + "/volume";
        files = folder + "/files";
        std::filesystem::create_directory(volume);
        require(iscsihost::addVolume(volume), "addVolume");
    }

    void TearDown() override
    {
        if (is_running) {
            EXPECT_EQ(iscsihost::stop(), 0) << iscsi_host_last_error();
        }
        std::filesystem::remove_all(folder);
    }

    void start()
    {
        if (is_running)
            return;
        is_running = true;
        iscsihost::SweepReport report;
        require(iscsihost::setPortal("127.0.0.1"), "setPortal");
        require(iscsihost::boot(report), "boot");
    }

    std::string volume, files;

private:
    std::string folder;
    bool is_running = false;
};

Host *const host = static_cast<Host *>(testing::AddGlobalTestEnvironment(new Host));

void removeTargets()
{
    _tag_iscsi_conf_query_ query{};
    query.kind = NORV_CONF_ALL_TARGETS;
    _tag_iscsi_conf_ *conf = nullptr;
    EXPECT_EQ(NORViSCSIConfGet(&query, &conf), 0);
    for (const auto *target = conf->targets; target; target = target->next)
        EXPECT_EQ(NORViSCSITargetRemove(target), 0) << iscsi_host_last_error();
    NORViSCSIConfFree(conf);
}

void removeLUNs()
{
    _tag_iscsi_lun_ *luns = nullptr;
    size_t count = 0;
    EXPECT_EQ(NORViSCSILunConfigGetAll(&luns, &count), 0);
    const std::unique_ptr<_tag_iscsi_lun_, decltype(&free)> owner(luns, free);
    for (size_t i = 0; i < count; ++i)
        EXPECT_EQ(NORViSCSILunDelete(&luns[i]), 0) << iscsi_host_last_error();
}

} // namespace

Platform::Platform() : volume(host->volume), folder(host->files)
{
    std::filesystem::create_directory(folder);
}

Platform::~Platform()
{
    removeTargets();
    removeLUNs();
    std::filesystem::remove_all(folder);
}

void Platform::startService()
{
    host->start();
}

void Platform::addSnapshotTask(int lid, const std::string &)
{
    int64_t id = 0;
    require(iscsihost::addSchedule("backup", lid, "daily", id), "addSchedule");
}

void Platform::addScheduledSnapshots(int lid)
{
    int64_t id = 0;
    require(iscsihost::addSchedule("snapshot", lid, "daily", id), "addSchedule");
}

void Platform::addRetentionPolicy(int lid)
{
    iscsihost::RetentionPolicy policy;
    policy.newest = 1;
    require(iscsihost::setRetentionPolicy(lid, policy), "setRetentionPolicy");
}

void Platform::unlock(const char *snapshot_uuid)
{
    require(iscsihost::setSnapshotUserLock(snapshot_uuid, false), "setSnapshotUserLock");
    _tag_iscsi_snapshot_ snapshot{};
    require(NORViSCSISnapshotConfGetByUUID(snapshot_uuid, &snapshot), "NORViSCSISnapshotConfGetByUUID");
    const std::unique_ptr<NLIBC_SZ_LIST, decltype(&NLIBCSzListFree)> keys(NLIBCSzListAlloc(512), NLIBCSzListFree);
    require(NORViSCSISnapshotLockedAppKeysGet(&snapshot, keys.get()), "NORViSCSISnapshotLockedAppKeysGet");
    for (int i = 0; i < keys->count; ++i)
        require(NORViSCSISnapshotUnlockByAppKey(&snapshot, NLIBCSzListGet(keys.get(), i)), "UnlockByAppKey");
}

} // namespace contract
