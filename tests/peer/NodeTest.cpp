#include "PeerTest.h"

#include "host/services/Identity.h"
#include "iscsihost/web.h"
#include "platform/dr_node.h"
#include "platform/error.h"
#include "platform/extent_pool.h"

#include <gmock/gmock.h>

namespace norvhost {
namespace {

using iscsihost::addPairedNode;
using iscsihost::describeLocalNode;
using iscsihost::describePairedNode;
using iscsihost::keepNodeSession;
using iscsihost::PairedNode;
using iscsihost::removePairedNode;
using NorvDRNode::DRNode;
using NorvDRNode::DRNodeAttr;
using NorvDRNode::DRNodeDB;
using testing::HasSubstr;
using testing::Not;

const std::string pin_a = "sha256//AAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAA=";
const std::string pin_b = "sha256//BBBBBBBBBBBBBBBBBBBBBBBBBBBBBBBBBBBBBBBBBBA=";

PairedNode peer(char digit = '1')
{
    PairedNode node;
    node.uuid = std::string(8, digit) + "-0000-4000-8000-00000000000a";
    node.host = std::string("peer") + digit;
    node.port = 5443;
    node.rod_key = "rod-key";
    node.token = "t0ken";
    node.pin = pin_a;
    return node;
}

std::vector<std::string> listedHosts()
{
    std::vector<DRNode> nodes;
    EXPECT_TRUE(DRNodeDB::List(nodes, NorvDRNode::CRED_REMOTE)) << reason();
    std::vector<std::string> hosts;
    for (const DRNode &node : nodes)
        hosts.push_back(node.host);
    return hosts;
}

struct NodeTest : PeerTest {};

TEST_F(NodeTest, AKeptSessionIsNoPairedNodeYet)
{
    ASSERT_EQ(0, keepNodeSession(peer())) << reason();
    DRNode found;
    EXPECT_FALSE(DRNodeDB::Get(peer().uuid, found));
    EXPECT_TRUE(listedHosts().empty());

    PairedNode added;
    added.uuid = "11111111-0000-4000-8000-00000000000A"; // all else was kept; case does not matter
    ASSERT_EQ(0, addPairedNode(added)) << reason();
    ASSERT_TRUE(DRNodeDB::Get(added.uuid, found)) << reason();
    EXPECT_EQ(peer().uuid, found.id);
    EXPECT_EQ("peer1", found.host);
    EXPECT_EQ(5443, found.port);
    EXPECT_EQ("https", found.protocol);
    EXPECT_EQ("t0ken", found.cred_session);
    std::vector<DRNodeAttr> attributes;
    ASSERT_TRUE(DRNodeDB::ListAttr(found.id, "NORV.iSCSI", attributes));
    ASSERT_EQ(1u, attributes.size());
    EXPECT_EQ("rod-key", attributes[0].value);

    PairedNode renewed = peer();
    renewed.token = "n3w";
    ASSERT_EQ(0, keepNodeSession(renewed)) << reason();
    ASSERT_TRUE(DRNodeDB::Get(peer().uuid, found)) << "it is paired still";
    EXPECT_EQ("n3w", found.cred_session);
}

TEST_F(NodeTest, KnownNodesAreNotAddedAgain)
{
    ASSERT_EQ(0, addPairedNode(peer('2'))) << reason();
    ASSERT_EQ(0, addPairedNode(peer('1'))) << reason();
    PairedNode other = peer('2');
    other.host = "elsewhere";
    EXPECT_EQ(NORV_ERR_NODE_UUID_EXISTS, addPairedNode(other));
    EXPECT_EQ((std::vector<std::string>{"peer2", "peer1"}), listedHosts());
    other.uuid = DRNode::getLocalNodeId();
    EXPECT_EQ(NORV_ERR_NODE_UUID_EXISTS, addPairedNode(other));
    EXPECT_EQ(NORV_ERR_NODE_UUID_EXISTS, keepNodeSession(other));
    EXPECT_EQ(2u, listedHosts().size());
}

TEST_F(NodeTest, BadRecordsChangeNothing)
{
    const auto refused = [](int code, auto change) {
        PairedNode node = peer();
        change(node);
        EXPECT_EQ(code, addPairedNode(node)) << reason();
        EXPECT_EQ(code, keepNodeSession(node)) << reason();
        EXPECT_THAT(reason(), Not(HasSubstr("s3cret")));
    };
    refused(NORV_ERR_NODE_UUID, [](PairedNode &node) { node.uuid = "../1"; });
    refused(NORV_ERR_NODE_HOST, [](PairedNode &node) { node.host = "a\r\nb"; });
    refused(NORV_ERR_NODE_HOST, [](PairedNode &node) { node.host.clear(); });
    refused(NORV_ERR_NODE_PORT, [](PairedNode &node) { node.port = 0; });
    refused(NORV_ERR_NODE_PROTOCOL, [](PairedNode &node) { node.protocol = "http"; });
    refused(NORV_ERR_ROD_KEY, [](PairedNode &node) { node.rod_key = "s3cret\n"; });
    refused(NORV_ERR_BAD_PARAMETER, [](PairedNode &node) { node.token = "s3cret x"; });
    refused(NORV_ERR_BAD_PARAMETER, [](PairedNode &node) { node.pin = "sha1//x"; });
    PairedNode found;
    EXPECT_EQ(NORV_ERR_NO_SUCH_NODE, describePairedNode(peer().uuid, found));
    std::string pin;
    ASSERT_EQ(0, iscsihost::getPin("peer1", 5443, pin));
    EXPECT_EQ("", pin);
}

TEST_F(NodeTest, AToldPinNeverReplacesAKnownOne)
{
    ASSERT_EQ(0, iscsihost::setPin("peer1", 5443, pin_b));
    EXPECT_EQ(NORV_ERR_NO_PERMISSION, addPairedNode(peer()));
    EXPECT_THAT(reason(), HasSubstr("iscsictl node trust peer1"));
    EXPECT_TRUE(listedHosts().empty());
    PairedNode node = peer();
    node.pin.clear();
    ASSERT_EQ(0, addPairedNode(node)) << reason();
    ASSERT_EQ(0, describePairedNode(node.uuid, node)) << reason();
    EXPECT_EQ(pin_b, node.pin);
}

TEST_F(NodeTest, RemovalForgetsAllOfANode)
{
    PairedNode neighbour = peer('2');
    neighbour.host = "PEER1"; // the same server, as another node: the pin stays for it
    ASSERT_EQ(0, addPairedNode(peer())) << reason();
    ASSERT_EQ(0, addPairedNode(neighbour)) << reason();
    ASSERT_EQ(0, removePairedNode(peer().uuid)) << reason();
    EXPECT_EQ(NORV_ERR_NO_SUCH_NODE, removePairedNode(peer().uuid));
    std::vector<DRNodeAttr> attributes;
    ASSERT_TRUE(DRNodeDB::ListAttr(peer().uuid, "NORV.iSCSI", attributes));
    EXPECT_TRUE(attributes.empty());
    std::string pin;
    ASSERT_EQ(0, iscsihost::getPin("peer1", 5443, pin));
    EXPECT_EQ(pin_a, pin);
    ASSERT_EQ(0, removePairedNode(neighbour.uuid)) << reason();
    ASSERT_EQ(0, iscsihost::getPin("peer1", 5443, pin));
    EXPECT_EQ("", pin);
}

TEST_F(NodeTest, AttributesAreOfKnownNodesAndTheLocalOne)
{
    const std::string local = DRNode::getLocalNodeId();
    EXPECT_TRUE(DRNode::isLocalNodeId(local));
    EXPECT_FALSE(DRNode::isLocalNodeId(""));
    DRNode found;
    ASSERT_TRUE(DRNodeDB::Get(local, found));
    EXPECT_EQ(local, found.id);
    EXPECT_TRUE(DRNodeDB::SetAttr({local, "app", "b", "1"}));
    EXPECT_TRUE(DRNodeDB::SetAttr({local, "app", "a", "2"}));
    EXPECT_TRUE(DRNodeDB::SetAttr({local, "app", "b", "3"}));
    EXPECT_FALSE(DRNodeDB::SetAttr({peer().uuid, "app", "a", "1"}));
    std::vector<DRNodeAttr> attributes;
    ASSERT_TRUE(DRNodeDB::ListAttr(local, "app", attributes));
    ASSERT_EQ(2u, attributes.size());
    EXPECT_EQ("2", attributes[0].value);
    EXPECT_EQ("3", attributes[1].value);
}

TEST_F(NodeTest, PeersAreToldTheKeyAndTheSetAddress)
{
    PairedNode described;
    EXPECT_EQ(NORV_ERR_FILE_NOT_FOUND, describeLocalNode("127.0.0.1", described)) << "it has no web server yet";
    ASSERT_EQ(0, iscsihost::makeWebCertificate()) << reason();
    ASSERT_EQ(0, describeLocalNode("127.0.0.1", described)) << reason();
    char key[64] = {};
    ASSERT_EQ(0, NORVExtentPoolRODKeyGet(key, sizeof key)) << reason();
    EXPECT_EQ(key, described.rod_key);
    EXPECT_EQ(DRNode::getLocalNodeId(), described.uuid);
    const auto told = [](const char *address) {
        PairedNode node;
        EXPECT_EQ(0, iscsihost::setNodeAddress(address)) << reason();
        EXPECT_EQ(0, describeLocalNode("127.0.0.1", node)) << reason();
        return node.host + " " + std::to_string(node.port);
    };
    EXPECT_EQ("a.example 5443", told("a.example"));
    EXPECT_EQ("a.example 1443", told("a.example:1443"));
    EXPECT_EQ("2001:db8::1 5443", told("2001:db8::1"));
    EXPECT_EQ("2001:db8::1 1443", told("[2001:db8::1]:1443"));
    for (const char *bad : {"", "a b", ":1443", "a:0", "a:65536", "a:x", "a:1443x", "[a]:1443", "[::1", "[::1]", "a/b"})
        EXPECT_EQ(NORV_ERR_NODE_HOST, iscsihost::setNodeAddress(bad)) << bad;
    std::string kept;
    ASSERT_EQ(0, iscsihost::getNodeAddress(kept));
    EXPECT_EQ("[2001:db8::1]:1443", kept);

    ASSERT_EQ(0, iscsihost::setWebListener({"127.0.0.2", 7443})) << reason();
    EXPECT_EQ("127.0.0.2 7443", told("auto"));
    EXPECT_EQ("a.example 7443", told("a.example"));
}

} // namespace
} // namespace norvhost
