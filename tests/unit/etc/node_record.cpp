#include "iscsiwebapi/ISCSINodeInfo.h"
#include "tests/unit/Sweep.h"

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
    Lines calls = called();
    ASSERT_EQ(calls.size(), 12u);
    calls.erase(calls.begin() + 3, calls.begin() + 9); // the values of the section
    const std::string config = CONFIG;
    EXPECT_EQ(calls, (Lines{"NLIBCSzHashAlloc(1024)", "NLIBCFileLockByFile(/tmp/iscsi_node.conf.lock, 1)",
                            "NLIBCFileExist(" + config + ")", "NLIBCFileTouch(" + config + ")",
                            "NLIBCFileAddSection(" + config + ", " + PEER_NODE + ", " + lines + ")",
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
    fake::model().section_files[CONFIG] = {
        {uuidOf(1), keys}, {PEER_NODE, {keys.begin(), keys.end() - 1}}, {uuidOf(3), keys}};
    std::vector<ISCSINodeInfo> nodes(3);
    EXPECT_EQ(ISCSINodeInfo::ListNodeFromConfig(nodes), 18991112);
    ASSERT_EQ(nodes.size(), 1u);
    EXPECT_EQ(nodes[0].uuid, uuidOf(1));
    EXPECT_EQ(nodes[0].port, 1) << "truncated to 16 bits";
    const std::string uuid = PEER_NODE;
    EXPECT_EQ(logged(), (Lines{"loadFromConfig: Failed to get node info: " + uuid,
                               "ListNodeFromConfig: Failed to load node info: " + uuid + ", errno=0x0900"}));
    ISCSINodeInfo node = peer();
    EXPECT_EQ(node.loadFromConfig(), 18991112);
    EXPECT_EQ(node.toString() + node.account, peer().toString() + "admin");
    logged();
    fake::model().section_files.clear();
    nodes.resize(3);
    EXPECT_EQ(ISCSINodeInfo::ListNodeFromConfig(nodes), 0) << "no file";
    EXPECT_TRUE(nodes.empty());
    EXPECT_EQ(ISCSINodeInfo().loadFromConfig(), 18991100);
    EXPECT_FALSE(ISCSINodeInfo().isInConfig());
    EXPECT_EQ(logged(), Lines{"loadFromConfig: Node UUID is empty"});
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

TEST_F(NodeDatabase, AKeyIsStoredWithItsNode)
{
    ISCSINodeInfo node(LOCAL_NODE), read(LOCAL_NODE);
    std::string key;
    EXPECT_EQ(node.loadLocalRODKey(key), 0);
    EXPECT_EQ(node.insertRODKey(key), 0);
    EXPECT_EQ(read.loadFromDRNode(), 0);
    EXPECT_EQ(read.rod_key, "local-rod-key");
    EXPECT_EQ(node.insertRODKey(""), 18991104);
    EXPECT_EQ(ISCSINodeInfo().insertRODKey("key"), 18991100);
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
    EXPECT_EQ(called({"NORVCred", "CredRequest"}), Lines());
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
    EXPECT_EQ(logged(),
              Lines{"toJsonFormat: Need node UUID to create node info in Json format: uuid:  ,is_local_node: true"
                    " ,rod_key: *** ,hostname: peer.example ,port: 5443 ,protocol: https ,session_id: ***"});
    EXPECT_EQ(ISCSINodeInfo("h", "a", "s").session_id, "s");
    const ISCSINodeInfo whole("u", "s", "h", 7, "p", "r", "a", true);
    EXPECT_EQ(whole.toString() + whole.account,
              "uuid: u ,is_local_node: true ,rod_key: r ,hostname: h ,port: 7 ,protocol: p ,session_id: sa");
}

// Failing calls.

void configured()
{
    addNodes();
    fake::model().section_files[CONFIG] = {{PEER_NODE,
                                            {{"hostname", "h"},
                                             {"port", "1"},
                                             {"protocol", "https"},
                                             {"rod_key", "r"},
                                             {"account", "a"},
                                             {"session_id", "peer-token"}}}};
    fake::model().account_ids = {{"u@dir", {9, 10}}};
    fake::model().cgi_sessions = {"mine"};
}

void unconfigured()
{
    fake::model().section_files[CONFIG] = {};
}

/// Runs `act` on a peer's record; its host name and session are the outputs.
Operation onNode(const char *name, void (*set_up)(), int (*act)(ISCSINodeInfo &), const std::string &untouched,
                 const Failures &failures)
{
    const auto run = [act](ISCSINodeInfo &node, std::string &outputs) {
        const int code = act(node);
        outputs = node.hostname + " " + node.session_id;
        return code;
    };
    return on(peer, name, set_up, run, untouched, failures);
}

int listConfig(ISCSINodeInfo &)
{
    std::vector<ISCSINodeInfo> nodes;
    return ISCSINodeInfo::ListNodeFromConfig(nodes);
}

int select(ISCSINodeInfo &node, const char *selector)
{
    return ISCSINodeInfo::GetNodeUUID(selector, node.session_id);
}

int logOut(ISCSINodeInfo &node)
{
    node.logged_in = true;
    return node.logout();
}

int openSession(ISCSINodeInfo &node)
{
    node.account = "u@dir";
    return node.createSession();
}

int closeSession(ISCSINodeInfo &node)
{
    node.session_id = "mine";
    return node.deleteSession();
}

const char *const KEPT = "peer.example ";

const Operation operations[] = {
    onNode("updateConfig", configured, [](auto &node) { return node.updateConfig(false, true); }, KEPT,
           {{"NLIBCSzHashAlloc", 18990001},
            {"NLIBCFileLockByFile", 18990015},
            {"NLIBCFileExist", 18990019, Then::CLEANS_UP}, // to it there is no file, and the section cannot be added
            {"NLIBCFileGetSection", 18990017},
            {"NLIBCSzHashSetValue", 18990032},
            {"NLIBCFileSetSection", 18990018},
            {"NLIBCFileUnlockByFile", 0, Then::ONLY_THE_LOG_TELLS}}),
    onNode("deleteFromNodeConfig", configured, [](auto &node) { return node.deleteFromNodeConfig(); }, KEPT,
           {{"NLIBCFileLockByFile", 18990015},
            {"NLIBCFileExist", 0, Then::GOES_ON},
            {"NLIBCFileRemoveSection", 18990020},
            {"NLIBCFileUnlockByFile", 0, Then::ONLY_THE_LOG_TELLS}}),
    onNode("ListNodeFromConfig", configured, listConfig, KEPT,
           {{"NLIBCSzHashAlloc#1 NLIBCSzListAlloc", 18990001},
            {"NLIBCFileLockByFile#1", 18990015},
            {"NLIBCFileExist#1", 0, Then::GOES_ON},
            {"NLIBCFileEnumSection", 18990301},
            {"NLIBCFileUnlockByFile#1", 18990016},
            {"NLIBCSzListGet NLIBCSzHashAlloc#2 NLIBCFileLockByFile#2 NLIBCFileExist#2 NLIBCFileGetSection "
             "NLIBCSzHashGetValue",
             18991112},
            {"NLIBCFileUnlockByFile#2", 0, Then::ONLY_THE_LOG_TELLS}}),
    onNode("GetNodeUUIDByHostname", configured, [](auto &node) { return select(node, "peer.example"); }, KEPT,
           {{"DRNodeDB::Get DRNodeDB::List", 18991100}, {"DRNodeDB::ListAttr", 0, Then::GOES_ON}}),
    onNode("GetNodeUUIDByIndex", configured, [](auto &node) { return select(node, "node#2"); }, KEPT,
           {{"DRNodeDB::Get", 18991112}, {"DRNodeDB::List", 18991120}, {"DRNodeDB::ListAttr", 0, Then::GOES_ON}}),
    onNode("insertRODKey", configured, [](auto &node) { return node.insertRODKey("key"); }, KEPT,
           {{"DRNodeDB::SetAttr", 18991118}}),
    onNode("loadLocalRODKey", configured, [](auto &node) { return node.loadLocalRODKey(node.session_id); }, KEPT, {}),
    onNode("login", unconfigured, [](auto &node) { return node.login(); }, "",
           {{"NLIBCSzHashAlloc#1 NLIBCFileLockByFile#1", 18991111},
            {"NLIBCFileExist NLIBCFileGetSection#1", 0, Then::GOES_ON},
            {"NLIBCFileUnlockByFile#1", 18990015, Then::CLEANS_UP}, // the next lock waits for none
            {"NORVCredAlloc", 18990001, Then::CLEANS_UP},
            {"NORVCredSessAlloc NORVCredItemSetHost NORVCredItemSetPort NORVCredItemSetProtocol "
             "NORVCredItemSetRemoteAccount NORVCredItemSetRemotePasswd NLIBCSzHashAlloc#2",
             18990001},
            {"CredRequestUtil::LoginWithOTP", 18990205},
            {"NORVCredSessItemGetAccessToken", 18990210},
            {"NLIBCFileLockByFile#2", 18990015},
            {"NLIBCFileGetSection#2", 18990017},
            {"NLIBCSzHashSetValue", 18990032},
            {"NLIBCFileTouch", 18990023},
            {"NLIBCFileAddSection", 18990019},
            {"NLIBCFileUnlockByFile#2", 0, Then::ONLY_THE_LOG_TELLS}}),
    onNode(
        "logout", configured, logOut, "",
        {{"NLIBCFileLockByFile", 18990015},
         {"NLIBCFileExist", 18990011, Then::STOPS_SILENTLY},
         {"NLIBCFileGetSection", 18991109, Then::STOPS_SILENTLY},
         {"NLIBCSzHashGetValue", 18991112},
         {"NLIBCFileUnlockByFile", 0, Then::ONLY_THE_LOG_TELLS},
         {"NLIBCSzHashAlloc NORVCredAlloc NORVCredItemSetHost NORVCredItemSetPort NORVCredItemSetProtocol", 18990001},
         {"CredRequestUtil::Logout", 18990206}}),
    onNode("createSession", configured, openSession, KEPT,
           {{"NorvCgiInit", 18991113},
            {"NORVUserGetUGID", 0, Then::GOES_ON},
            {"NorvCgiSetOption", 18991115},
            {"NorvCgiLoginNoAuth", 18991116}}),
    onNode("deleteSession", configured, closeSession, "",
           {{"NorvCgiInit", 18991113}, {"NorvCgiRemoveSessionByIndex", 18990000, Then::STOPS_SILENTLY}}),
};

INSTANTIATE_TEST_SUITE_P(NodeRecord, FailureSweep, testing::ValuesIn(operations), operationName);

} // namespace
} // namespace unit
