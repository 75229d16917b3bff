#include "iscsiwebapi/ISCSILIBVLUN.h"
#include "tests/unit/Sweep.h"

namespace unit {
namespace {

using ISCSI::_tag_iscsi_vlun_type;
using ISCSI::ISCSIVLUNInfo;
using ISCSI::LIB::LIBVLUN::ISCSILIBVLUN;

const std::string VLUN = "00000000-0000-4000-8000-000000000001"; // the first that the fake makes
const std::string UUID = uuidOf(3);

using VirtualLUNs = LibraryTest;

TEST_F(VirtualLUNs, OnlyKindOneIsCreated)
{
    addLUN(3, "vol1");
    const struct {
        unsigned int type;
        int code;
        Lines lines;
    } cases[] = {
        {0, 18991000, {"createVLUN: Bad vLUN type. vLUN: uuid:  ,type: 0 ,src_lun_uuid: " + UUID}},
        {2, 18990004, {"createVLUN: doCreate: Coming soooooooooooon T_T"}},
        {3, 18990004, {"createVLUN: doCreate: Coming soooooooooooon T_T"}},
        {7, 18991000, {"createVLUN: No such type. vLUN: uuid:  ,type: 7 ,src_lun_uuid: " + UUID + "."}},
    };
    for (const auto &c : cases) {
        ISCSILIBVLUN vlun(static_cast<_tag_iscsi_vlun_type>(c.type), UUID);
        EXPECT_EQ(vlun.createVLUN(), c.code);
        EXPECT_EQ(vlun.info.uuid, "");
        EXPECT_EQ(logged(), c.lines);
        EXPECT_EQ(called(), Lines());
    }
    ISCSILIBVLUN vlun(ISCSI::VLUN_TYPE_1, UUID);
    EXPECT_EQ(vlun.createVLUN(), 0);
    EXPECT_EQ(vlun.info.uuid, VLUN);
    EXPECT_EQ(called(), Lines{"NORViSCSIVirtualLunCreate(" + UUID + ", 2, 0)"});

    ISCSILIBVLUN nameless(ISCSI::VLUN_TYPE_1, UUID);
    fake::failCall("NORViSCSIVirtualLunCreate", 1, 0); // done, it says, and gives no UUID
    EXPECT_EQ(nameless.createVLUN(), 18991001);
    EXPECT_EQ(logged(), Lines{"createVLUN: Failed to get vLUN UUID. vLUN: " + nameless.info.toString() + "."});
}

TEST_F(VirtualLUNs, BindTakesTheSmallestPortal)
{
    addNodes();
    fake::model().virtual_luns[VLUN] = {};
    ISCSILIBVLUN vlun(VLUN);
    EXPECT_EQ(vlun.bind("dst", PEER_NODE, {"10.0.0.2:3260", "10.0.0.10:3260", "192.168.0.1:3260"}), 0);
    EXPECT_EQ(called().back(), "NORViSCSIVirtualLunBindSink(" + VLUN + ", 10.0.0.10:3260, " + PEER_NODE + ", dst)");
    EXPECT_EQ(vlun.bind("dst", PEER_NODE, {}), 18990406);
    EXPECT_EQ(logged(), Lines{"bind: No portal. vLUN: " + vlun.info.toString()});
    EXPECT_EQ(vlun.bind("dst", LOCAL_NODE + std::string("0"), {}), 18991112) << "the node is looked up first";
}

TEST_F(VirtualLUNs, ALoadedRecordGoesByItsSourceLUN)
{
    addLUN(3, "vol1");
    auto &record = fake::model().virtual_luns[VLUN].record;
    record.src_lid = 3;
    for (int kind : {1, 3, 4, -1}) {
        record.kind = kind;
        ISCSIVLUNInfo info(VLUN);
        _tag_viscsi_virtual_lun_ out;
        memset(&out, 0x55, sizeof(out));
        EXPECT_EQ(info.loadFromConfig(out, 0), 0);
        EXPECT_EQ(info.toString(), "uuid: " + UUID + " ,type: " +
                                       (kind == 1 || kind == 3 ? std::to_string(kind) : "0") + " ,src_lun_uuid: ");
        EXPECT_EQ(out.src_lid, 3);
        EXPECT_EQ(out.kind, kind);
    }
    _tag_viscsi_virtual_lun_ out{};
    EXPECT_EQ(ISCSIVLUNInfo().loadFromConfig(out, 0), 18991002);
    EXPECT_EQ(logged(), Lines{"loadFromConfig: No vLUN UUID. vLUN: uuid:  ,type: 0 ,src_lun_uuid: "});

    ISCSIVLUNInfo info(ISCSI::VLUN_TYPE_1, "source");
    Json::Value value;
    EXPECT_EQ(info.toJsonFormat(value), 3328);
    EXPECT_TRUE(value.isNull());
    EXPECT_EQ(logged(), Lines{"toJsonFormat: Not enough info to create task info in Json format: " + info.toString()});
    info.uuid = "u";
    EXPECT_EQ(info.toJsonFormat(value), 0);
    EXPECT_EQ(value, parsed(R"({"uuid": "u", "type": 1, "src_lun_uuid": "source"})"));
}

void transfer()
{
    addLUN(3, "vol1");
    addNodes();
    auto &vlun = fake::model().virtual_luns[VLUN];
    vlun.record.src_lid = 3;
    vlun.record.kind = 1;
    vlun.stats.values = {{200, 100, 0, 5, 0}};
}

/// Runs `act` on the virtual LUN; what it writes into the text is the outputs.
Operation onVLUN(const char *name, int (*act)(ISCSILIBVLUN &, std::string &), const std::string &untouched,
                 const Failures &failures)
{
    const auto run = [act](ISCSILIBVLUN &vlun, std::string &outputs) {
        vlun.info.uuid = VLUN;
        outputs.clear();
        const int code = act(vlun, outputs);
        outputs += vlun.info.uuid;
        return code;
    };
    return on([] { return ISCSILIBVLUN(ISCSI::VLUN_TYPE_1, UUID); }, name, transfer, run, untouched, failures);
}

int status(ISCSILIBVLUN &vlun, std::string &outputs)
{
    int state = 9;
    unsigned long long first = 9, second = 9;
    const int code = vlun.loadStatus(state, first, second);
    outputs = std::to_string(state) + std::to_string(first) + std::to_string(second);
    return code;
}

const Operation operations[] = {
    onVLUN("createVLUN", [](auto &vlun, auto &) { return vlun.createVLUN(); }, VLUN,
           {{"NORViSCSIVirtualLunCreate", 18991003}}),
    onVLUN("deleteVLUN", [](auto &vlun, auto &) { return vlun.deleteVLUN(); }, VLUN,
           {{"NORViSCSIVirtualLunRemove", 18991006}}),
    onVLUN("loadStatus", status, "999" + VLUN, {{"NORViSCSIVirtualLunStatsGet", 18991007}}),
    onVLUN("bind", [](auto &vlun, auto &) { return vlun.bind("dst", PEER_NODE, {"portal"}); }, VLUN,
           {{"DRNodeDB::Get", 18991112},
            {"DRNodeDB::ListAttr", 0, Then::GOES_ON},
            {"NORViSCSIVirtualLunBindSink", 18991004}}),
    onVLUN("VLUNLoadFromConfig", [](auto &vlun, auto &) { return vlun.info.loadFromConfig(vlun.record, 0); }, VLUN,
           {{"NORViSCSIVirtualLunFillByUUID", 18991005}, {"NORViSCSILunGetByLunId", 18990531}}),
};

INSTANTIATE_TEST_SUITE_P(VirtualLUNs, FailureSweep, testing::ValuesIn(operations), operationName);

} // namespace
} // namespace unit
