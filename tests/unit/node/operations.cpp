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
    Lines requests;
    for (const std::string &call : called()) {
        if (call.rfind("WebAPI", 0) == 0)
            requests.push_back(call);
    }
    const std::string add = "WebAPIClientNodeAddNode(", only_new = std::string(", {") + NEW_NODE + "})";
    EXPECT_EQ(requests, (Lines{"WebAPIClientNodeCreateSession(new.example, new.example)", add + LOCAL_NODE + only_new,
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

const std::string NOT_FOUND = "loadFromDRNode: Failed to get node info from DR Node. UUID: ";
const std::string NOT_TOLD = "createNode: Failed to add new node to: uuid: ";

const Operation operations[] = {
    operation(
        "createNode", addNodes,
        [] {
            ISCSILIBNode node = newNode();
            const int code = node.createNode();
            return Outcome{code, node.info.toString()};
        },
        "", stops("WebAPIClientNodeCreateSession", INJECTED, "createNode: Failed to create session. node: {info}"),
        stops("DRNodeDB::Get#1", 18991112, NOT_FOUND + LOCAL_NODE,
              "ListNodesFromDRNode: Failed to load local node info.", "createNode: Failed to list node."),
        goesOn("DRNodeDB::ListAttr"),
        stops("DRNodeDB::List", 18991120, "ListNodesFromDRNode: Failed to load list DR Nodes.",
              "createNode: Failed to list node."),
        stops("DRNodeDB::Get#2", 18991112, NOT_FOUND + PEER_NODE,
              std::string("ListNodesFromDRNode: Failed to load node info from DR Node. Node ID: ") + PEER_NODE,
              "createNode: Failed to list node."),
        stops("WebAPIClientNodeAddNode#1", INJECTED,
              NOT_TOLD + LOCAL_NODE +
                  " ,is_local_node: true ,rod_key:  ,hostname:  ,port: 0 ,protocol:  ,session_id: ."),
        stops("WebAPIClientNodeAddNode#2", INJECTED,
              NOT_TOLD + PEER_NODE +
                  " ,is_local_node: false ,rod_key: kept-rod-key ,hostname: peer.example"
                  " ,port: 5443 ,protocol: https ,session_id: peer-session."),
        stops("WebAPIClientNodeAddNode#3", INJECTED, "createNode: Failed to add all of joined nodes to: {info}.")),
};

INSTANTIATE_TEST_SUITE_P(NodeOperations, FailureSweep, testing::ValuesIn(operations), operationName);

} // namespace
} // namespace unit
