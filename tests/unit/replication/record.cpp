#include "replication/BaseVersion.h"
#include "tests/unit/replication/Pair.h"

namespace unit {
namespace {

using ISCSI::ISCSILUNInfo;
using ISCSI::ISCSINodeInfo;
using ISCSI::ISCSISnapshotInfo;
using ISCSI::ISCSITaskInfo;

ISCSITaskInfo task(const std::string &uuid, bool is_source, const std::string &root_path = "/volume1",
                   const std::string &parent = "")
{
    return ISCSITaskInfo(uuid, is_source, ISCSILUNInfo(SOURCE), ISCSILUNInfo(DESTINATION), ISCSINodeInfo(LOCAL_NODE),
                         ISCSINodeInfo(PEER_NODE), root_path, parent);
}

using TaskRecord = LibraryTest;

TEST_F(TaskRecord, FillsTheSDKsRecordWhenItIsComplete)
{
    _tag_iscsi_task_ record;
    EXPECT_EQ(task("", true, std::string(319, 'p'), TASK).fillVISCSITask(record), 0) << "the SDK gives it its UUID";
    EXPECT_EQ(record.is_source, 1);
    EXPECT_EQ(record.src_lun_uuid + std::string(record.dst_lun_uuid), SOURCE + DESTINATION);
    EXPECT_EQ(record.src_node_uuid + std::string(record.dst_node_uuid), LOCAL_NODE + std::string(PEER_NODE));
    EXPECT_EQ(record.root_path + std::string(record.parent_task_uuid), std::string(319, 'p') + TASK);

    ISCSITaskInfo incomplete[] = {task("", false),  task(TASK, true, ""), task(TASK, true),
                                  task(TASK, true), task(TASK, true),     task(TASK, true)};
    incomplete[2].src_lun.uuid.clear();
    incomplete[3].dst_lun.uuid.clear();
    incomplete[4].src_node.uuid.clear();
    incomplete[5].dst_node.uuid.clear();
    for (auto &info : incomplete) {
        Json::Value json = "untouched";
        EXPECT_EQ(info.fillVISCSITask(record), 18990818);
        EXPECT_EQ(info.toJsonFormat(json), 18990818);
        EXPECT_EQ(json, "untouched");
        EXPECT_EQ(logged(),
                  (Lines{"fillVISCSITask: Bad task info: " + info.toString(),
                         "toJsonFormat: Not enough info to create task info in Json format: " + info.toString()}));
    }
    const std::pair<ISCSITaskInfo, const char *> too_long[] = {
        {task(TASK + "0", true), "Failed to copy UUID. task: "},
        {task(TASK, true, std::string(320, 'p')), "Failed to copy UUID. task: "},
        {task(TASK, true, "/volume1", TASK + "0"), "Failed to copy parent task UUID. task: "},
    };
    for (auto [info, sentence] : too_long) {
        EXPECT_EQ(info.fillVISCSITask(record), 18990025);
        EXPECT_EQ(logged().back(), "fillVISCSITask: " + (sentence + info.toString()));
    }
}

TEST_F(TaskRecord, HasTextAndJSONFormsWithTheSameKeys)
{
    Json::Value json;
    const ISCSITaskInfo info = task(TASK, true, "/volume1", "parent");
    EXPECT_EQ(info.toJsonFormat(json), 0);
    std::string text;
    for (const char *key : {"uuid", "is_source", "src_lun_uuid", "dst_lun_uuid", "src_node_uuid", "dst_node_uuid",
                            "root_path", "parent_task_uuid"})
        text += std::string(text.empty() ? "" : " ,") + key + ": " + json[key].asString();
    EXPECT_EQ(info.toString(), text);
    EXPECT_EQ(json.size(), 8u);
}

TEST_F(TaskRecord, LoadsWithoutWhatIsGoneUnlessStrict)
{
    _tag_iscsi_task_ record;
    addTask(false);
    ISCSITaskInfo info(TASK);
    EXPECT_EQ(info.loadFromConfig(record, true), 18990531);
    EXPECT_EQ(logged(), Lines{"loadFromConfig: Failed to load destination LUN. task: " + TASK});
    EXPECT_EQ(info.loadFromConfig(record, false), 0);
    EXPECT_EQ(info.dst_lun.uuid, DESTINATION);
    const std::string missing = "loadFromDRNode: Failed to get node info from DR Node. UUID: ";
    EXPECT_EQ(logged(), (Lines{missing + PEER_NODE, "loadFromConfig: Failed to load source node. task: " + TASK,
                               missing + LOCAL_NODE, "loadFromConfig: Failed to load destination node. task: " + TASK}))
        << "a missing node is told, a missing LUN is not";

    fake::reset();
    sourceSide();
    EXPECT_EQ(info.loadFromConfig(record, true), 0);
    EXPECT_EQ(info.src_lun.name + info.dst_lun.name, "vol1");
    EXPECT_EQ(info.src_node.is_local_node, true);
    EXPECT_EQ(info.dst_node.hostname, "peer.example");
    EXPECT_EQ(info.getLockPath(), LOCK_FILE);
    EXPECT_EQ(ISCSITaskInfo().getLockPath(), "");
    EXPECT_EQ(ISCSITaskInfo().loadFromConfig(record, false), 18990818);
}

TEST(BaseVersion, IsTheDestinationsOwnStateOrItsNewestCommonSnapshot)
{
    using namespace ISCSI::LIB::LIBReplication;
    const auto source = sourceSnapshots({"A", "B"});
    std::vector<ISCSISnapshotInfo> strangers(1), common(3);
    strangers[0].version = "X";
    common[0].version = "X";
    common[1].version = "B";
    common[1].uuid = "destination's B";
    common[2].version = "A";
    const struct {
        const char *lun_base;
        bool is_modified, is_sending_failed;
        std::vector<ISCSISnapshotInfo> snapshots;
        const char *version;
        bool need_full_sync, not_aligned;
        const char *restored;
    } cases[] = {
        {NORV_ZERO_UUID, true, false, common, "", false, false, ""},
        {"A", false, false, common, "A", false, false, ""},
        {"A", true, true, common, "A", false, false, ""},
        {"A", true, false, common, "B", false, true, "destination's B"},
        {"X", false, false, common, "B", false, true, "destination's B"},
        {"X", true, true, common, "B", false, true, "destination's B"},
        {"A", true, false, strangers, "", true, false, ""},
        {"X", false, false, {}, "", true, false, ""},
    };
    for (const auto &c : cases) {
        const auto own = baseOfLUN(source, c.lun_base, c.is_modified, c.is_sending_failed);
        const Base base = own ? *own : baseOfSnapshots(source, c.snapshots);
        EXPECT_EQ(base.version, c.version) << c.lun_base;
        EXPECT_EQ(base.need_full_sync, c.need_full_sync);
        EXPECT_EQ(base.not_aligned, c.not_aligned);
        EXPECT_EQ(base.restore_uuid, c.restored);
    }
}

} // namespace
} // namespace unit
