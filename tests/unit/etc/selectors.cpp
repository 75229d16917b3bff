// What a caller's text names, for every kind of object that has such texts.
#include "iscsiwebapi/ISCSILUNInfo.h"
#include "iscsiwebapi/ISCSINodeInfo.h"
#include "iscsiwebapi/ISCSISnapshotInfo.h"
#include "iscsiwebapi/ISCSITargetInfo.h"
#include "tests/unit/replication/Pair.h"

namespace unit {
namespace {

using Resolve = int (*)(const std::string &, std::string &);

int targetID(const std::string &selector, std::string &out)
{
    int tid = -5;
    const int code = ISCSI::ISCSITargetInfo::GetTID(selector, tid);
    if (tid != -5)
        out = std::to_string(tid);
    return code;
}

const Resolve LUN = ISCSI::ISCSILUNInfo::GetLUNUUID, SNAP = ISCSI::ISCSISnapshotInfo::GetSnapshotUUID,
              TARGET = targetID, NODE = ISCSI::ISCSINodeInfo::GetNodeUUID,
              TASK_UUID = ISCSI::ISCSITaskInfo::GetTaskUUID;

const std::string ANY = "FFFFFFFF-ffff-FFFF-ffff-00000000000a", SECOND_TASK = "ABCDEF00-0000-4000-8000-00000000000f";
const std::string LONG(200000, 'a');

class Selectors : public LibraryTest {
protected:
    Selectors()
    {
        addNodes();
        for (const auto &[lid, name] :
             std::map<int, const char *>{{3, "vol1"}, {7, "lun#9"}, {8, "lun#2 "}, {9, "UPPER"}, {10, "%s%n%d"}})
            addLUN(lid, name);
        addSnapshot(3, 2, "%s%n");
        addSnapshot(3, 9, "snap_1");
        addSnapshot(9, 1, "snap_1");
        for (const auto &[tid, name] : std::map<int, const char *>{{2, "two"}, {40, "forty"}, {41, "300"}})
            addTarget(tid, name);
        addTask(true);
        addTask(false, SECOND_TASK);
    }
};

TEST_F(Selectors, NameAnObject)
{
    const struct {
        Resolve resolve;
        std::vector<std::pair<std::string, std::string>> cases;
    } kinds[] = {
        {LUN,
         {{"", ""},
          {ANY, ANY}, // whether it exists shows when it is loaded
          {"LUN#1", uuidOf(3)},
          {"Lun#2", uuidOf(7)},
          {"lun#005", uuidOf(10)},
          {"vol1", uuidOf(3)},
          {"lun#2 ", uuidOf(8)}, // a character behind the number makes it a name
          {"UPPER", uuidOf(9)},
          {"%s%n%d", uuidOf(10)}}},
        {SNAP,
         {{ANY, ANY},
          {"sn#1", snapshotUUIDOf(3, 2)},
          {"SN#3", snapshotUUIDOf(9, 1)},
          {"vol1_snap_1", snapshotUUIDOf(3, 9)},
          {"UPPER_snap_1", snapshotUUIDOf(9, 1)},
          {"vol1_ \t snap_1 and more", snapshotUUIDOf(3, 9)}, // a snapshot's name has no blanks
          {"vol1_%s%n", snapshotUUIDOf(3, 2)}}},
        {TARGET,
         {{"7", "7"},
          {"256", "256"},
          {"007", "7"},
          {"+7", "7"},
          {" 7", "7"},
          {"7up", "7"},
          {"tg#1", "2"},
          {"TG#2", "40"},
          {"two", "2"},
          {"300", "41"}}},
        {NODE, {{"", ""}, {ANY, ANY}, {"node#1", LOCAL_NODE}, {"NODE#2", PEER_NODE}, {"peer.example", PEER_NODE}}},
        {TASK_UUID, {{"", ""}, {ANY, ANY}, {"rep#1", TASK}, {"Rep#2", SECOND_TASK}}},
    };
    for (const auto &kind : kinds) {
        for (const auto &[selector, expected] : kind.cases) {
            std::string out = "untouched";
            EXPECT_EQ(kind.resolve(selector, out), 0) << selector;
            EXPECT_EQ(out, expected) << selector;
            EXPECT_TRUE(selector != expected || called().empty()) << "only what is an ID needs no lookup";
            called();
        }
    }
    EXPECT_EQ(logged(), Lines());
}

TEST_F(Selectors, NameNothing)
{
    const struct {
        Resolve resolve;
        int code;
        std::string prefix, out_of_range, count, invalid;
        std::vector<std::pair<std::string, std::string>> others; ///< with the last log line; empty: it is `invalid`
    } kinds[] = {
        {LUN, 18990505, "lun", "LUN", "#LUNs: 5", "LUN UUID, name", {{"sn#1", ""}, {"lun#1.0", ""}}},
        {SNAP,
         18990520,
         "sn",
         "snapshot",
         "#snapshots: 3",
         "snapshot UUID, name",
         {{"", ""},
          {"_snap_1", ""},
          {"vol1_ \n", ""},
          {"snap 1", ""},
          {"VOL1_snap_1", ": Failed to get lid by LUN name: VOL1."},
          {LONG + "_snap_1", ": Failed to get lid by LUN name: " + LONG + "."},
          {"vol1_" + LONG, ": Failed to get snapshot UUID by lid and snapshot name. lid: 3, name: " + LONG}}},
        {TARGET,
         18990710,
         "tg",
         "target",
         "#nodes: 3",
         "target ID, name",
         {{"", ""},
          {"0", ""},
          {"257", ""},
          {"-7", ""},
          {"4294967297", ""},
          {"TWO", ""},
          {std::string(200000, '9'), ""}}},
        {NODE, 18991100, "node", "node", "#nodes: 2", "node UUID, hostname", {{"Peer.example", ""}}},
        {TASK_UUID, 18990831, "rep", "task", "#nodes: 2", "task UUID", {}},
    };
    for (const auto &kind : kinds) {
        const std::string index = kind.prefix + "#", count = kind.count.substr(kind.count.size() - 1);
        const std::string out_of_range = ": Index of " + kind.out_of_range + " is out of range. index: ";
        const auto refuses = [&](const std::string &selector, const std::string &line) {
            std::string out = "untouched";
            EXPECT_EQ(kind.resolve(selector, out), kind.code) << selector.substr(0, 60);
            EXPECT_EQ(out, "untouched");
            const Lines lines = logged();
            ASSERT_FALSE(lines.empty()) << selector.substr(0, 60);
            EXPECT_EQ(lines.back().substr(0, line.size()), line);
        };
        for (const std::string &number : {std::string("0"), std::to_string(std::stoi(count) + 1)})
            refuses(index + number, out_of_range + number + ", " + kind.count);
        for (const char *number : {"4294967295", "4294967297", "18446744073709551617", "-1", "-4294967295",
                                   "-18446744073709551615"}) // some would be 1 if they wrapped around
            refuses(index + number, out_of_range);
        const std::string invalid = ": Invalid " + kind.invalid + " or index. input: ";
        for (const std::string &selector :
             {index, index + "1x", index + "x", "x" + index + "1", std::string("nothing"), ANY + "0", ANY + "\n",
              ANY.substr(0, 35), ANY.substr(0, 35) + "g", std::string(36, 'a'), std::string("../../etc/passwd"),
              std::string("two\nlines"), std::string("%s%s%s%n"), LONG, index + std::string(200000, '1') + "x"})
            refuses(selector, invalid + selector);
        for (const auto &[selector, line] : kind.others)
            refuses(selector, line.empty() ? invalid + selector : line);
    }
}

} // namespace
} // namespace unit
