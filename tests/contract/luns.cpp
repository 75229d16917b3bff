#include "platform/error.h"
#include "platform/extent_pool.h"
#include "platform/iscsi_lun.h"
#include "platform/retention.h"
#include "platform/schedule.h"
#include "tests/contract/Platform.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

namespace contract {
namespace {

class LUNContract : public testing::Test, protected Platform {
protected:
    static _tag_iscsi_lun_ byUUID(const char *uuid)
    {
        _tag_iscsi_lun_ lun{};
        EXPECT_EQ(NORViSCSILunConfigGetByUUID(uuid, &lun, 0), 0);
        return lun;
    }

    static std::vector<std::string> names()
    {
        _tag_iscsi_lun_ *luns = nullptr;
        size_t count = 99;
        EXPECT_EQ(NORViSCSILunConfigGetAll(&luns, &count), 0);
        const std::unique_ptr<_tag_iscsi_lun_, decltype(&free)> owner(luns, free);
        std::vector<std::string> result;
        for (size_t i = 0; i < count; ++i) {
            result.emplace_back(luns[i].name);
            EXPECT_TRUE(i == 0 || luns[i - 1].lid < luns[i].lid);
        }
        EXPECT_EQ(luns == nullptr, count == 0);
        return result;
    }

    std::string mapFile(const _tag_iscsi_lun_ &lun, const char *folder = "@iSCSITrg") const
    {
        return volume + "/" + folder + "/iSCSI_" + std::to_string(lun.lid) + "_Extent_" + lun.name + "_000";
    }
};

TEST_F(LUNContract, ACreatedLUNIsFoundInEveryWay)
{
    EXPECT_TRUE(names().empty());
    for (int type : {NORV_LUN_TYPE_FILE, NORV_LUN_TYPE_THIN, NORV_LUN_TYPE_ADV, NORV_LUN_TYPE_SINK}) {
        const std::string name = "kind " + std::to_string(type);
        const auto created = createLUN(name, type);
        EXPECT_GE(created.lid, 1);
        EXPECT_LE(created.lid, NORV_LUN_ID_MAX);
        EXPECT_EQ(strlen(created.uuid), 36u);
        _tag_iscsi_lun_ by_id{}, by_name{};
        EXPECT_EQ(NORViSCSILunGetByLunId(created.lid, &by_id), 0);
        EXPECT_EQ(NORViSCSILunGetByLunName(name.c_str(), &by_name), 0);
        for (const auto &lun : {byUUID(created.uuid), by_id, by_name}) {
            EXPECT_EQ(memcmp(&lun, &created, sizeof(lun)), 0);
            EXPECT_EQ(lun.type, type);
            EXPECT_EQ(lun.size, 4 * MIB);
            EXPECT_EQ(lun.options, 0u);
            EXPECT_EQ(lun.restored_time, 0);
            EXPECT_EQ(lun.location, volume);
        }
    }
    EXPECT_EQ(names().size(), 4u);
}

TEST_F(LUNContract, BadRequestsLeaveNothing)
{
    createLUN("taken");
    const struct {
        int err;
        _tag_iscsi_lun_ lun;
    } cases[] = {
        {NORV_ERR_LUN_NAME_EXISTS, request("taken")},
        {NORV_ERR_LUN_NAME, request("")},
        {NORV_ERR_LUN_NAME, request("a/b")},
        {NORV_ERR_LUN_NAME, request("..")},
        {NORV_ERR_LUN_NAME, request("a\nb")},
        {NORV_ERR_LUN_TYPE, request("n", 0)},
        {NORV_ERR_LUN_TYPE, request("n", 2)},
        {NORV_ERR_LUN_SIZE, request("n", NORV_LUN_TYPE_THIN, 0)},
        {NORV_ERR_LUN_SIZE, request("n", NORV_LUN_TYPE_THIN, 4 * MIB + 1)},
        {NORV_ERR_LUN_SIZE, request("n", NORV_LUN_TYPE_THIN, uint64_t{1} << 63)},
    };
    for (auto [err, lun] : cases)
        EXPECT_EQ(NORViSCSILunCreate(&lun), err) << lun.name << ' ' << lun.type << ' ' << lun.size;
    auto elsewhere = request("n");
    set(elsewhere.location, "/no/such/volume");
    EXPECT_EQ(NORViSCSILunCreate(&elsewhere), NORV_ERR_LUN_LOCATION);
    EXPECT_EQ(names(), std::vector<std::string>{"taken"});
}

TEST_F(LUNContract, WhatDoesNotExistIsSaid)
{
    createLUN("other");
    _tag_iscsi_lun_ lun{};
    EXPECT_EQ(NORViSCSILunConfigGetByUUID(NO_UUID, &lun, 0), NORV_ERR_NO_SUCH_LUN);
    EXPECT_EQ(NORViSCSILunGetByLunId(1000, &lun), NORV_ERR_NO_SUCH_LUN);
    EXPECT_EQ(NORViSCSILunGetByLunName("OTHER", &lun), NORV_ERR_NO_SUCH_LUN);
    EXPECT_EQ(lun.lid, 0) << "filled on success only";
    _tag_iscsi_family_ family{};
    EXPECT_EQ(NORViSCSIFamilyConfGetByLID(1000, &family), NORV_ERR_NO_SUCH_FAMILY);

    auto gone = request("gone");
    set(gone.uuid, NO_UUID);
    EXPECT_EQ(NORViSCSILunUpdate(&gone), NORV_ERR_NO_SUCH_LUN);
    EXPECT_EQ(NORViSCSILunLoad(&gone), NORV_ERR_NO_SUCH_LUN);
    EXPECT_EQ(NORViSCSILunUnload(&gone), NORV_ERR_NO_SUCH_LUN);
    EXPECT_EQ(NORViSCSILunDelete(&gone), NORV_ERR_NO_SUCH_LUN);
}

TEST_F(LUNContract, NamesAreComparedByteWise)
{
    createLUN("Name");
    bool exists = false;
    EXPECT_EQ(NORViSCSILunIsNameExist("Name", &exists), 0);
    EXPECT_TRUE(exists);
    for (const char *name : {"name", "Name ", "Nam", ""}) {
        exists = true;
        EXPECT_EQ(NORViSCSILunIsNameExist(name, &exists), 0);
        EXPECT_FALSE(exists) << name;
    }
    createLUN("name");
}

TEST_F(LUNContract, UpdateRenamesAndGrows)
{
    const auto created = createLUN("before");
    createLUN("taken");
    auto lun = created;
    EXPECT_EQ(NORViSCSILunUpdate(&lun), 0) << "nothing to change is no failure";
    set(lun.name, "after");
    lun.size = 8 * MIB;
    EXPECT_EQ(NORViSCSILunUpdate(&lun), 0);
    EXPECT_STREQ(byUUID(created.uuid).name, "after");
    EXPECT_EQ(byUUID(created.uuid).size, 8 * MIB);

    lun.size = 4 * MIB;
    EXPECT_EQ(NORViSCSILunUpdate(&lun), NORV_ERR_LUN_SIZE) << "shrinks";
    lun.size = 8 * MIB;
    set(lun.name, "taken");
    EXPECT_EQ(NORViSCSILunUpdate(&lun), NORV_ERR_LUN_NAME_EXISTS);
    set(lun.name, "a/b");
    EXPECT_EQ(NORViSCSILunUpdate(&lun), NORV_ERR_LUN_NAME);
    EXPECT_STREQ(byUUID(created.uuid).name, "after");
    EXPECT_EQ(byUUID(created.uuid).size, 8 * MIB);
}

TEST_F(LUNContract, ADeletedLUNIsGone)
{
    auto lun = createLUN("n");
    createLUN("stays");
    EXPECT_EQ(NORViSCSILunDelete(&lun), 0);
    EXPECT_EQ(names(), std::vector<std::string>{"stays"});
    const auto again = createLUN("n");
    EXPECT_EQ(again.lid, lun.lid);
    EXPECT_STRNE(again.uuid, lun.uuid);
    EXPECT_EQ(NORViSCSILunDelete(&lun), NORV_ERR_NO_SUCH_LUN) << "an old record hits the next LUN";
    EXPECT_EQ(names().size(), 2u);
}

TEST_F(LUNContract, AnIdleLUNIsUnlockedAndHealthy)
{
    const auto lun = createLUN("n");
    bool is_locked = true;
    EXPECT_EQ(NORViSCSILunIsLocked(&lun, &is_locked), 0);
    EXPECT_FALSE(is_locked);
    _tag_iscsi_lun_progress_ progress{77, 77};
    EXPECT_EQ(NORViSCSILunProgressGet(&lun, &progress), 0);
    EXPECT_EQ(progress.st, NORV_LUN_IDLE);
    _tag_iscsi_family_ family{};
    EXPECT_EQ(NORViSCSIFamilyConfGetByLID(lun.lid, &family), 0);
    EXPECT_EQ(family.lid, lun.lid);
    EXPECT_STREQ(family.status, "Healthy");
}

TEST_F(LUNContract, AMapFileAnswersByItsPath)
{
    auto lun = createLUN("n");
    const auto answers = [&](const std::string &path) {
        char version[37] = "";
        _tag_map_file_version_ info{};
        uint64_t total = 1, synced = 1, done = 1, all = 1, mapped = UINT64_MAX;
        const int err = NORVExtentPoolMapFileBaseVersionGet(path.c_str(), version);
        EXPECT_EQ(NORVExtentPoolMapFileVersionInfoGet(path.c_str(), &info), err);
        EXPECT_EQ(NORVExtentPoolMapFileTotalCountGet(path.c_str(), &total), err);
        EXPECT_EQ(NORVExtentPoolMapFileSyncedCountGet(path.c_str(), &synced), err);
        EXPECT_EQ(NORViSCSIChildLunSyncProgressGet(path.c_str(), &done, &all), err);
        EXPECT_EQ(NORVExtentPoolMapFileMappedSizeGet(path.c_str(), lun.location, &mapped), err);
        if (!err) {
            EXPECT_STREQ(version, NORV_ZERO_UUID);
            EXPECT_STREQ(info.base_version, NORV_ZERO_UUID);
            EXPECT_EQ(strlen(info.current_version), 36u);
            EXPECT_EQ(total + synced + done + all, 0u);
            EXPECT_LE(mapped, lun.size);
        }
        return err;
    };
    EXPECT_EQ(answers(mapFile(lun)), 0);
    EXPECT_EQ(answers(mapFile(lun) + "0"), NORV_ERR_FILE_NOT_FOUND);

    lun.options = NORV_LUN_OPTION_TRASH;
    EXPECT_EQ(NORViSCSILunUnload(&lun), 0);
    EXPECT_EQ(byUUID(lun.uuid).options, static_cast<uint32_t>(NORV_LUN_OPTION_TRASH));
    EXPECT_EQ(answers(mapFile(lun)), NORV_ERR_FILE_NOT_FOUND);
    EXPECT_EQ(answers(mapFile(lun, "@EP_trash")), 0);
    EXPECT_EQ(NORViSCSILunLoad(&lun), 0);
    EXPECT_EQ(byUUID(lun.uuid).options, 0u);
    EXPECT_EQ(answers(mapFile(lun)), 0);
}

TEST_F(LUNContract, JobsAndPoliciesAreFoundAndRemoved)
{
    const auto lun = createLUN("n");
    EXPECT_EQ(NORViSCSILunTaskGetSchIDByName("n"), -1);
    EXPECT_EQ(ScheduleSnapshotTaskGetIDByLid(lun.lid), -1);
    addSnapshotTask(lun.lid, "n");
    addScheduledSnapshots(lun.lid);
    const long task = NORViSCSILunTaskGetSchIDByName("n");
    const long schedule = ScheduleSnapshotTaskGetIDByLid(lun.lid);
    EXPECT_NE(task, -1);
    EXPECT_NE(schedule, -1);
    EXPECT_NE(task, schedule);
    EXPECT_EQ(NORVSchedTaskRemove(task), 0);
    EXPECT_EQ(NORViSCSILunTaskGetSchIDByName("n"), -1);
    EXPECT_EQ(ScheduleSnapshotTaskGetIDByLid(lun.lid), schedule);
    EXPECT_LT(NORVSchedTaskRemove(task), 0);

    addRetentionPolicy(lun.lid);
    const std::string key = std::to_string(lun.lid);
    EXPECT_EQ(NORVRETENTIONRemovePolicy("Lun#", key.c_str()), 0);
    EXPECT_EQ(NORVRETENTIONRemovePolicy("Lun#", key.c_str()), 0) << "none is no failure";
}

} // namespace
} // namespace contract
