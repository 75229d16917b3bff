#include "iscsiwebapi/ISCSINodeInfo.h"
#include "tests/unit/Library.h"

namespace unit {
namespace {

using ISCSI::ISCSINodeInfo;

const char *const CONFIG = "/usr/norv/etc/iscsi_node.conf";

ISCSINodeInfo peer()
{
    return ISCSINodeInfo(PEER_NODE, "peer.example", 5443, "https", "key", "admin", "peer-password", "123456");
}

/// Sections of the configuration file as the fake holds them: "name: key=value ...".
Lines sections()
{
    Lines lines;
    for (const auto &section : fake::model().section_files[CONFIG]) {
        std::string line = section.name + ":";
        for (const auto &[key, value] : section.keys)
            line.append(" ").append(key).append("=").append(value);
        lines.push_back(line);
    }
    return lines;
}

using NodeConfig = LibraryTest;

TEST_F(NodeConfig, ASectionIsWrittenUnderTheLockAndReadBack)
{
    ISCSINodeInfo node = peer();
    node.session_id = "token";
    EXPECT_FALSE(node.isInConfig());
    called();
    EXPECT_EQ(node.updateConfig(false, false), 0) << "without a file a section may be added";
    const std::string lines = "\thostname=peer.example\n\tport=5443\n\tprotocol=https\n\trod_key=key\n\taccount=admin\n"
                              "\tsession_id=token\n";
    const Lines calls = called();
    ASSERT_EQ(calls.size(), 12u);
    EXPECT_EQ(Lines(calls.begin(), calls.begin() + 3),
              (Lines{"NLIBCSzHashAlloc(1024)", "NLIBCFileLockByFile(/tmp/iscsi_node.conf.lock, 1)",
                     std::string("NLIBCFileExist(") + CONFIG + ")"}));
    EXPECT_EQ(Lines(calls.begin() + 9, calls.end()),
              (Lines{std::string("NLIBCFileTouch(") + CONFIG + ")",
                     std::string("NLIBCFileAddSection(") + CONFIG + ", " + PEER_NODE + ", " + lines + ")",
                     "NLIBCFileUnlockByFile()"}));

    EXPECT_TRUE(node.isInConfig());
    ISCSINodeInfo read(PEER_NODE);
    read.password = "kept";
    EXPECT_EQ(read.loadFromConfig(), 0);
    EXPECT_EQ(read.toString(), node.toString());
    EXPECT_EQ(read.account + " " + read.password, "admin kept");

    EXPECT_EQ(node.deleteFromNodeConfig(), 0);
    EXPECT_EQ(node.deleteFromNodeConfig(), 0) << "not there is success";
    EXPECT_EQ(read.loadFromConfig(), 18991109);
    EXPECT_EQ(read.hostname, "peer.example");
    EXPECT_EQ(logged(), Lines());
    EXPECT_EQ(fake::lockedFiles(), Lines());
}

TEST_F(NodeConfig, AddsAndOverwritesAsItIsAllowedTo)
{
    ISCSINodeInfo other(uuidOf(1)), known = peer();
    EXPECT_EQ(known.updateConfig(true, false), 0);
    known.hostname = "moved.example";
    EXPECT_EQ(known.updateConfig(true, false), 18991111);
    EXPECT_EQ(known.updateConfig(false, false), 18991111);
    EXPECT_EQ(other.updateConfig(false, true), 18991109);
    const std::string rest = " port=5443 protocol=https rod_key=key account=admin session_id=";
    EXPECT_EQ(sections(), Lines{PEER_NODE + (": hostname=peer.example" + rest)});
    EXPECT_EQ(known.updateConfig(false, true), 0);
    EXPECT_EQ(other.updateConfig(true, false), 0);
    EXPECT_EQ(sections(), (Lines{PEER_NODE + (": hostname=moved.example" + rest),
                                 uuidOf(1) + ": hostname= port=0 protocol= rod_key= account= session_id="}));
}

TEST_F(NodeConfig, AnIncompleteSectionIsNotLoaded)
{
    const std::vector<std::pair<std::string, std::string>> keys = {{"hostname", "h"}, {"port", "65537"},
                                                                   {"protocol", "p"}, {"rod_key", "r"},
                                                                   {"account", "a"},  {"session_id", "s"}};
    for (size_t missing = 0; missing < keys.size(); ++missing) {
        auto fewer = keys;
        fewer.erase(fewer.begin() + static_cast<long>(missing));
        fake::model().section_files[CONFIG] = {{uuidOf(1), keys}, {uuidOf(2), fewer}, {uuidOf(3), keys}};
        std::vector<ISCSINodeInfo> nodes(3);
        EXPECT_EQ(ISCSINodeInfo::ListNodeFromConfig(nodes), 18991112);
        ASSERT_EQ(nodes.size(), 1u);
        EXPECT_EQ(nodes[0].uuid, uuidOf(1));
        EXPECT_EQ(nodes[0].port, 1) << "truncated to 16 bits";
        EXPECT_EQ(logged(), (Lines{"loadFromConfig: Failed to get node info: " + uuidOf(2),
                                   "ListNodeFromConfig: Failed to load node info: " + uuidOf(2) + ", errno=0x0900"}));
        ISCSINodeInfo node = peer();
        node.uuid = uuidOf(2);
        EXPECT_EQ(node.loadFromConfig(), 18991112);
        EXPECT_EQ(node.hostname + node.protocol + node.rod_key + node.account, "peer.examplehttpskeyadmin");
        logged();
    }
    fake::model().section_files.clear();
    std::vector<ISCSINodeInfo> nodes(3);
    EXPECT_EQ(ISCSINodeInfo::ListNodeFromConfig(nodes), 0) << "no file";
    EXPECT_TRUE(nodes.empty());
    EXPECT_EQ(ISCSINodeInfo().loadFromConfig(), 18991100);
    EXPECT_FALSE(ISCSINodeInfo().isInConfig());
    EXPECT_EQ(logged(), Lines{"loadFromConfig: Node UUID is empty"});
}

TEST_F(NodeConfig, ALockHeldElsewhereIsReported)
{
    int fd = -1;
    ASSERT_EQ(NLIBCFileLockByFile("/tmp/iscsi_node.conf.lock", 1, &fd), 1);
    ISCSINodeInfo node = peer();
    std::vector<ISCSINodeInfo> nodes;
    EXPECT_EQ(node.loadFromConfig(), 18990015);
    EXPECT_EQ(node.updateConfig(true, true), 18990015);
    EXPECT_EQ(node.deleteFromNodeConfig(), 18990015);
    EXPECT_FALSE(node.isInConfig());
    EXPECT_EQ(ISCSINodeInfo::ListNodeFromConfig(nodes), 18990015);
    EXPECT_EQ(logged().size(), 5u);
    EXPECT_TRUE(sections().empty());
}

class NodeDatabase : public LibraryTest {
protected:
    NodeDatabase() { addNodes(); }
};

TEST_F(NodeDatabase, TheLocalNodeComesFirstAndKeepsItsAddress)
{
    ISCSINodeInfo local(LOCAL_NODE, "mine", 1, "http", "old-key", "", "", "");
    EXPECT_EQ(local.loadFromDRNode(), 0);
    EXPECT_TRUE(local.is_local_node);
    EXPECT_EQ(local.hostname + local.protocol + local.rod_key, "minehttp");

    std::vector<ISCSINodeInfo> nodes;
    EXPECT_EQ(ISCSINodeInfo::ListNodesFromDRNode(nodes), 0);
    ASSERT_EQ(nodes.size(), 2u);
    EXPECT_EQ(nodes[0].uuid, LOCAL_NODE);
    EXPECT_EQ(nodes[1].toString(), std::string("uuid: ") + PEER_NODE +
                                       " ,is_local_node: false ,rod_key: kept-rod-key ,hostname: peer.example"
                                       " ,port: 5443 ,protocol: https ,session_id: peer-session");

    fake::model().local_node.clear();
    EXPECT_EQ(ISCSINodeInfo::ListNodesFromDRNode(nodes), 18991100);
    EXPECT_EQ(logged(),
              (Lines{"loadFromDRNode: Node UUID is empty", "ListNodesFromDRNode: Failed to load local node info."}));
}

TEST_F(NodeDatabase, SelectorsNameANode)
{
    const std::string any = "ABCDEF00-0000-4000-8000-00000000000f";
    const struct {
        std::string selector;
        int code;
        std::string uuid;
        Lines lines;
    } cases[] = {
        {"", 0, "", {}},
        {any, 0, any, {}},
        {"node#1", 0, LOCAL_NODE, {}},
        {"NODE#2", 0, PEER_NODE, {}},
        {"node#0", 18991100, "before", {": Index of node is out of range. index: 0, #nodes: 2"}},
        {"node#3", 18991100, "before", {": Index of node is out of range. index: 3, #nodes: 2"}},
        {"peer.example", 0, PEER_NODE, {}},
        {"Peer.example",
         18991100,
         "before",
         {"GetNodeInfoByHostname: No such hostname: Peer.example",
          ": Invalid node UUID, hostname or index. input: Peer.example"}},
        {any + "0",
         18991100,
         "before",
         {"GetNodeInfoByHostname: No such hostname: " + any + "0",
          ": Invalid node UUID, hostname or index. input: " + any + "0"}},
    };
    for (const auto &c : cases) {
        std::string uuid = "before";
        EXPECT_EQ(ISCSINodeInfo::GetNodeUUID(c.selector, uuid), c.code) << c.selector;
        EXPECT_EQ(uuid, c.code ? "before" : c.uuid);
        EXPECT_EQ(logged(), c.lines);
    }
}

TEST_F(NodeDatabase, AROD_KeyIsStoredWithItsNode)
{
    ISCSINodeInfo node(LOCAL_NODE), read(LOCAL_NODE);
    std::string key;
    EXPECT_EQ(node.loadLocalRODKey(key), 0);
    EXPECT_EQ(node.insertRODKey(key), 0);
    EXPECT_EQ(node.rod_key, "local-rod-key");
    EXPECT_EQ(read.loadFromDRNode(), 0);
    EXPECT_EQ(read.rod_key, "local-rod-key");
    EXPECT_EQ(node.insertRODKey(""), 18991104);
    EXPECT_EQ(ISCSINodeInfo().insertRODKey("key"), 18991100);
    EXPECT_EQ(logged(), (Lines{"insertRODKey: Node ROD key is empty", "insertRODKey: Node UUID is empty"}));
}

using NodeSession = LibraryTest;

TEST_F(NodeSession, ALogInIsKeptInTheConfigurationAndItsPasswordDropped)
{
    ISCSINodeInfo node = peer();
    EXPECT_EQ(node.login(), 0);
    EXPECT_TRUE(node.logged_in);
    EXPECT_EQ(node.session_id, "peer-token");
    EXPECT_EQ(node.password, "");
    EXPECT_EQ(sections(), Lines{std::string(PEER_NODE) + ": hostname=peer.example port=5443 protocol=https rod_key=key"
                                                         " account=admin session_id=peer-token"});
    called();
    EXPECT_EQ(node.login(), 0) << "it is logged in";
    EXPECT_EQ(called(), Lines());

    ISCSINodeInfo again = peer();
    EXPECT_EQ(again.login(), 18991111);
    for (const std::string &call : called())
        EXPECT_EQ(call.find("Cred"), std::string::npos) << call;
    EXPECT_EQ(ISCSINodeInfo(PEER_NODE).logout(), 0) << "it did not log in";
    EXPECT_EQ(called(), Lines());

    EXPECT_EQ(node.logout(), 0);
    EXPECT_EQ(called().back(), "CredRequestUtil::Logout(https://peer.example:5443, peer-token)");
    EXPECT_EQ(sections().size(), 1u) << "the section stays";
}

TEST_F(NodeSession, ALogInNeedsAllItsParts)
{
    const std::vector<void (*)(ISCSINodeInfo &)> spoil = {
        [](auto &node) { node.hostname.clear(); }, [](auto &node) { node.port = 0; },
        [](auto &node) { node.protocol.clear(); }, [](auto &node) { node.account.clear(); },
        [](auto &node) { node.password.clear(); },
    };
    for (const auto change : spoil) {
        ISCSINodeInfo node = peer();
        change(node);
        EXPECT_TRUE(node.isInvalid(true));
        EXPECT_FALSE(node.isInvalid(false));
        EXPECT_EQ(node.login(), 18990004);
    }
    ISCSINodeInfo stranger = peer();
    stranger.otp_code = "654321";
    EXPECT_EQ(stranger.login(), 18990205);
    EXPECT_FALSE(stranger.logged_in);
    EXPECT_EQ(stranger.password, "peer-password");
    EXPECT_TRUE(sections().empty());
    EXPECT_EQ(ISCSINodeInfo("", "h", 1, "https", "", "a", "p", "").login(), 18991111) << "it has no name";
}

TEST_F(NodeSession, APeersSessionRunsAsItsAccountIsAuthenticated)
{
    fake::model().account_ids = {
        {"DOM\\u@x", {7, 8}}, {"u@dir", {9, 10}}, {"a@nogroup", {9, 0xFFFFFFFF}}, {"plain", {5, 6}}};
    const std::string rest[] = {"NorvCgiSetOption(8, peer.example)", "NorvCgiSetOption(7, NORV.iSCSI)",
                                "NorvCgiSetOption(10, 4294967295)", "NorvCgiSetOption(1, 1)"};
    const struct {
        std::string account;
        Lines options;
    } cases[] = {
        {"DOM\\u@x",
         {"NORVUserGetUGID(DOM\\u@x)", "NorvCgiSetOption(3, 2)", "NorvCgiSetOption(4, 7)", "NorvCgiSetOption(5, 8)"}},
        {"u@dir",
         {"NORVUserGetUGID(u@dir)", "NorvCgiSetOption(3, 8)", "NorvCgiSetOption(4, 9)", "NorvCgiSetOption(5, 10)"}},
        {"a@nogroup", {"NORVUserGetUGID(a@nogroup)", "NorvCgiSetOption(3, 1)"}},
        {"un@known", {"NORVUserGetUGID(un@known)", "NorvCgiSetOption(3, 1)"}},
        {"plain", {"NorvCgiSetOption(3, 1)"}},
    };
    for (const auto &c : cases) {
        ISCSINodeInfo node("peer.example", c.account);
        EXPECT_EQ(node.createSession(), 0);
        Lines expected = c.options;
        expected.insert(expected.begin(), "NorvCgiInit()");
        expected.insert(expected.end(), std::begin(rest), std::end(rest));
        expected.push_back("NorvCgiLoginNoAuth(100, " + c.account + ")");
        EXPECT_EQ(called(), expected);
        EXPECT_EQ(node.session_id, "session-of-peer.example");
        EXPECT_EQ(node.deleteSession(), 0);
        EXPECT_EQ(called().back(), "NorvCgiRemoveSessionByIndex(2, session-of-peer.example)");
        EXPECT_EQ(node.deleteSession(), 18990000);
        called();
    }
}

using NodeRecord = LibraryTest;

TEST_F(NodeRecord, HasAJSONFormWithoutThePassword)
{
    ISCSINodeInfo node = peer();
    node.session_id = "token";
    node.is_local_node = true;
    Json::Value value = parsed(R"({"left": "over"})");
    EXPECT_EQ(node.toJsonFormat(value), 0);
    EXPECT_EQ(value, parsed(R"({"uuid": "11111111-0000-4000-8000-000000000002", "session_id": "token",
        "hostname": "peer.example", "port": 5443, "protocol": "https", "rod_key": "key", "account": "admin",
        "is_local_node": true})"));
    node.uuid.clear();
    EXPECT_EQ(node.toJsonFormat(value), 18991110);
    EXPECT_EQ(value["hostname"], "peer.example") << "untouched";
    EXPECT_EQ(logged(), Lines{"toJsonFormat: Need node UUID to create node info in Json format: " + node.toString()});
    EXPECT_EQ(ISCSINodeInfo("h", "a", "s").session_id, "s");
    const ISCSINodeInfo whole("u", "s", "h", 7, "p", "r", "a", true);
    EXPECT_EQ(whole.toString() + whole.account,
              "uuid: u ,is_local_node: true ,rod_key: r ,hostname: h ,port: 7 ,protocol: p ,session_id: sa");
}

} // namespace
} // namespace unit
