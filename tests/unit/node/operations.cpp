#include "iscsiwebapi/ISCSILIBNode.h"
#include "tests/unit/Sweep.h"

namespace unit {
namespace {

using ISCSI::LIB::LIBNode::ISCSILIBNode;

const char *const NEW_NODE = "11111111-0000-4000-8000-000000000003";

ISCSILIBNode newNode()
{
    return ISCSILIBNode(NEW_NODE, "new.example", 5443, "https", "", "admin", "peer-password", "123456");
}

using NodeOperations = LibraryTest;

TEST_F(NodeOperations, StatusTellsMissingModulesAndAnUnfinishedBoot)
{
    const ISCSILIBNode node;
    EXPECT_EQ(node.getStatus(), 0u);
    EXPECT_EQ(called(), (Lines{"NORVCheckModule(iscsi_target_mod)", "NORVCheckModule(target_core_mod)",
                               "NORVCheckModule(iscsi_extent_pool)", "NORVCheckModule(iscsi_rodsp)",
                               "NORVCheckModule(configfs)", "NORVSystemGetBootStep()"}));
    fake::answer("NORVSystemGetBootStep", {3});
    EXPECT_EQ(node.getStatus(), 4u);
    fake::model().missing_modules = {"target_core_mod"};
    called();
    EXPECT_EQ(node.getStatus(), 1u);
    EXPECT_EQ(called().size(), 3u) << "modules behind a missing one are not asked for";
    fake::failCall("NORVCheckModule", 1, -1);
    fake::answer("NORVSystemGetBootStep", {5});
    EXPECT_EQ(node.getStatus(), 5u);
    EXPECT_STREQ(ISCSI::LIB::LIBNode::NODE_STATUS_TEXTS[3], "system is not in BOOT_DONE status");
}

TEST_F(NodeOperations, ANewNodeAndTheOthersAreToldOfEachOther)
{
    addNodes();
    EXPECT_EQ(newNode().createNode(), 0);
    const std::string add = "WebAPIClientNodeAddNode(", only_new = std::string(", {") + NEW_NODE + "})";
    EXPECT_EQ(called({"WebAPI"}),
              (Lines{"WebAPIClientNodeCreateSession(new.example, new.example)", add + LOCAL_NODE + only_new,
                     add + "peer.example" + only_new,
                     add + "new.example, {" + LOCAL_NODE + " " + PEER_NODE + " " + NEW_NODE + "})"}));

    fake::failCall("WebAPIClientNodeAddNode", 3, 18991111);
    EXPECT_EQ(newNode().createNode(), 0) << "the new node knew some of them";
    EXPECT_EQ(logged(), Lines());
    called();
    fake::failCall("WebAPIClientNodeAddNode", 1, 18991111);
    EXPECT_EQ(newNode().createNode(), 18991111) << "of another node it is a failure";
    EXPECT_EQ(logged().size(), 1u);
}

const Operation operations[] = {
    on(newNode, "createNode", addNodes, [](auto &node, auto &) { return node.createNode(); }, "",
       {{"DRNodeDB::Get", 18991112}, {"DRNodeDB::List", 18991120}, {"DRNodeDB::ListAttr", 0, Then::GOES_ON}}),
};

INSTANTIATE_TEST_SUITE_P(NodeOperations, FailureSweep, testing::ValuesIn(operations), operationName);

} // namespace
} // namespace unit
