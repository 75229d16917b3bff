// What callers of the node record's methods see when a platform call of theirs fails.
#include "iscsiwebapi/ISCSINodeInfo.h"
#include "tests/unit/Sweep.h"

namespace unit {
namespace {

using ISCSI::ISCSINodeInfo;

const char *const CONFIG = "/usr/norv/etc/iscsi_node.conf";
const std::string UUID = PEER_NODE;

void configured()
{
    addNodes();
    fake::model().section_files[CONFIG] = {{UUID,
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
template <class... Failures>
Operation onNode(const char *name, void (*set_up)(), int (*act)(ISCSINodeInfo &), const Failures &...failures)
{
    const auto run = [act] {
        ISCSINodeInfo node(UUID, "peer.example", 5443, "https", "", "admin", "peer-password", "123456");
        const int code = act(node);
        return Outcome{code, node.toString(), node.hostname + " " + node.session_id};
    };
    return operation(name, set_up, run, "peer.example ", failures...);
}

Operation with(Operation operation, const std::vector<Failure> &more)
{
    operation.failures.insert(operation.failures.end(), more.begin(), more.end());
    return operation;
}

std::string noHash(const std::string &method)
{
    return method + ": Failed to allocate hash memory, norverr=0x0900";
}

std::string noLock(const std::string &method)
{
    return method + ": Failed to lock: /tmp/iscsi_node.conf.lock";
}

std::string noUnlock(const std::string &method)
{
    return method + ": Failed to unlock: /tmp/iscsi_node.conf.lock";
}

std::string noSection(const std::string &method, const std::string &what)
{
    return method + ": Failed to " + what + " section: " + UUID + " from " + CONFIG + ", errno=0x0900";
}

/// The lines of updateConfig that both of its modes, and login, share. Its calls are the n-th of their names.
std::vector<Failure> update(int n, const std::string &outputs)
{
    const std::string nth = "#" + std::to_string(n);
    std::vector<Failure> failures = {
        stops("NLIBCSzHashAlloc" + nth, 18990001, noHash("updateConfig")),
        stops("NLIBCFileLockByFile" + nth, 18990015, noLock("updateConfig")),
        stops("NLIBCFileGetSection" + nth, 18990017, noSection("updateConfig", "get")),
        stops("NLIBCFileUnlockByFile" + nth, 0, noUnlock("updateConfig")),
    };
    const char *const keys[] = {"hostname", "port", "protocol", "rod_key", "account", "session_id"};
    for (int i = 0; i < 6; ++i)
        failures.push_back(stops("NLIBCSzHashSetValue#" + std::to_string(i + 1), 18990032,
                                 std::string("updateConfig: Failed to set hash value: ") + keys[i]));
    for (auto &failure : failures)
        failure.outputs = outputs;
    return failures;
}

Failure noCredential(const char *call)
{
    return stops(call, 18990001, "login: Failed to fill the credential. node: peer.example");
}

Failure noOption(int n, const std::string &option)
{
    return stops("NorvCgiSetOption#" + std::to_string(n), 18991115,
                 "createSession: Failed to set CGI option: " + option);
}

int listConfig(ISCSINodeInfo &node)
{
    std::vector<ISCSINodeInfo> nodes;
    const int code = ISCSINodeInfo::ListNodeFromConfig(nodes);
    if (!nodes.empty())
        node.session_id = nodes.back().session_id;
    return code;
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

int selectNode(ISCSINodeInfo &node, const char *selector)
{
    return ISCSINodeInfo::GetNodeUUID(selector, node.session_id);
}

const std::string MISSING = "loadFromConfig: Failed to get node info: " + UUID;
const std::string NOT_LISTED = "ListNodeFromConfig: Failed to load node info: " + UUID + ", errno=0x0900";
const std::string NOT_FOUND = "loadFromDRNode: Failed to get node info from DR Node. UUID: ";
const std::string NO_LOCAL = "ListNodesFromDRNode: Failed to load local node info.";
const std::string NO_PEER = "ListNodesFromDRNode: Failed to load node info from DR Node. Node ID: " + UUID;

const std::string NOT_BY_NAME = "GetNodeInfoByHostname: Failed to list nodes.";
const std::string INVALID = ": Invalid node UUID, hostname or index. input: peer.example";
const std::string KNOWN = "login: Node UUID exists. UUID: " + UUID;
const std::string KEPT = "peer.example ";
const std::string LOGGED_IN = "peer.example peer-token";
const std::string LOADED = "h peer-token";
const std::string MINE = "peer.example mine";

Failure noLogOut(const char *call)
{
    return stops(call, 18990001, "logout: Failed to fill the credential. node: h").leaving(LOADED);
}

const Operation operations[] = {
    onNode(
        "NodeLoadFromConfig", configured, [](auto &node) { return node.loadFromConfig(); },
        stops("NLIBCSzHashAlloc", 18990001, noHash("loadFromConfig")),
        stops("NLIBCFileLockByFile", 18990015, noLock("loadFromConfig")), stops("NLIBCFileExist", 18990011),
        stops("NLIBCFileGetSection", 18991109), stops("NLIBCSzHashGetValue", 18991112, MISSING),
        Failure{"NLIBCFileUnlockByFile", 0, {noUnlock("loadFromConfig")}, false, true}),
    with(onNode(
             "updateConfigOverwrites", configured, [](auto &node) { return node.updateConfig(false, true); },
             cleansUp("NLIBCFileExist", 18990019, noSection("updateConfig", "add")),
             stops("NLIBCFileSetSection", 18990018, noSection("updateConfig", "set"))),
         update(1, KEPT)),
    with(onNode(
             "updateConfigAdds", unconfigured, [](auto &node) { return node.updateConfig(true, false); },
             goesOn("NLIBCFileExist").leaving(KEPT),
             stops("NLIBCFileTouch", 18990023, std::string("updateConfig: Failed to touch ") + CONFIG),
             stops("NLIBCFileAddSection", 18990019, noSection("updateConfig", "add"))),
         update(1, KEPT)),
    onNode(
        "deleteFromNodeConfig", configured, [](auto &node) { return node.deleteFromNodeConfig(); },
        stops("NLIBCFileLockByFile", 18990015, noLock("deleteFromNodeConfig")), stops("NLIBCFileExist", 0),
        stops("NLIBCFileRemoveSection", 18990020, noSection("deleteFromNodeConfig", "remove")),
        stops("NLIBCFileUnlockByFile", 0, noUnlock("deleteFromNodeConfig"))),
    onNode("ListNodeFromConfig", configured, listConfig,
           stops("NLIBCSzHashAlloc#1", 18990001, noHash("ListNodeFromConfig")),
           stops("NLIBCSzListAlloc", 18990001, "ListNodeFromConfig: Failed to allocate list memory, norverr=0x0900"),
           stops("NLIBCFileLockByFile#1", 18990015, noLock("ListNodeFromConfig")), stops("NLIBCFileExist#1", 0),
           stops("NLIBCFileEnumSection", 18990301,
                 std::string("ListNodeFromConfig: Failed to NLIBCFileEnumSection ") + CONFIG + ", errno=0x0900"),
           stops("NLIBCFileUnlockByFile#1", 18990016, noUnlock("ListNodeFromConfig")),
           stops("NLIBCSzListGet", 18991112, "loadFromConfig: Node UUID is empty",
                 "ListNodeFromConfig: Failed to load node info: , errno=0x0900"),
           stops("NLIBCSzHashAlloc#2", 18991112, noHash("loadFromConfig"), NOT_LISTED),
           stops("NLIBCFileLockByFile#2", 18991112, noLock("loadFromConfig"), NOT_LISTED),
           stops("NLIBCFileExist#2", 18991112, NOT_LISTED), stops("NLIBCFileGetSection", 18991112, NOT_LISTED),
           stops("NLIBCSzHashGetValue", 18991112, MISSING, NOT_LISTED),
           Failure{"NLIBCFileUnlockByFile#2", 0, {noUnlock("loadFromConfig")}, false, true}),
    onNode(
        "loadFromDRNode", configured, [](auto &node) { return node.loadFromDRNode(); },
        stops("DRNodeDB::Get", 18991112, NOT_FOUND + UUID),
        stops("DRNodeDB::ListAttr", 0).leaving("peer.example peer-session")),
    onNode(
        "GetNodeUUIDByHostname", configured, [](auto &node) { return selectNode(node, "peer.example"); },
        stops("DRNodeDB::Get#1", 18991100, NOT_FOUND + LOCAL_NODE, NO_LOCAL, NOT_BY_NAME, INVALID),
        Failure{"DRNodeDB::ListAttr#1", 0, {}, true, true},
        stops("DRNodeDB::List", 18991100, "ListNodesFromDRNode: Failed to load list DR Nodes.", NOT_BY_NAME, INVALID),
        stops("DRNodeDB::Get#2", 18991100, NOT_FOUND + UUID, NO_PEER, NOT_BY_NAME, INVALID),
        Failure{"DRNodeDB::ListAttr#2", 0, {}, false, true}),
    onNode(
        "GetNodeUUIDByIndex", configured, [](auto &node) { return selectNode(node, "node#2"); },
        stops("DRNodeDB::Get#1", 18991112, NOT_FOUND + LOCAL_NODE, NO_LOCAL, ": Failed to list nodes."),
        Failure{"DRNodeDB::ListAttr#1", 0, {}, true, true},
        stops("DRNodeDB::List", 18991120, "ListNodesFromDRNode: Failed to load list DR Nodes.",
              ": Failed to list nodes."),
        stops("DRNodeDB::Get#2", 18991112, NOT_FOUND + UUID, NO_PEER, ": Failed to list nodes."),
        Failure{"DRNodeDB::ListAttr#2", 0, {}, false, true}),
    onNode(
        "insertRODKey", configured, [](auto &node) { return node.insertRODKey("key"); },
        stops("DRNodeDB::SetAttr", 18991118, "insertRODKey: Failed to set ROD key")),
    onNode(
        "loadLocalRODKey", configured, [](auto &node) { return node.loadLocalRODKey(node.session_id); },
        stops("NORVExtentPoolRODKeyGet", INJECTED, "loadLocalRODKey: Failed to get ROD key. err: {text}")),
    with(onNode(
             "login", unconfigured, [](auto &node) { return node.login(); },
             stops("NLIBCSzHashAlloc#1", 18991111, noHash("loadFromConfig"), KNOWN),
             stops("NLIBCFileLockByFile#1", 18991111, noLock("loadFromConfig"), KNOWN),
             goesOn("NLIBCFileExist").leaving(LOGGED_IN), goesOn("NLIBCFileGetSection#1").leaving(LOGGED_IN),
             cleansUp("NLIBCFileUnlockByFile#1", 18990015, noUnlock("loadFromConfig"), noLock("updateConfig"))
                 .leaving(LOGGED_IN),
             cleansUp("NORVCredAlloc", 18990001, "login: Failed to fill the credential. node: peer.example"),
             noCredential("NORVCredSessAlloc"), noCredential("NORVCredItemSetHost"),
             noCredential("NORVCredItemSetPort"), noCredential("NORVCredItemSetProtocol"),
             noCredential("NORVCredItemSetRemoteAccount"), noCredential("NORVCredItemSetRemotePasswd"),
             stops("CredRequestUtil::LoginWithOTP", 18990205, "login: Failed to login. node: peer.example"),
             stops("NORVCredSessItemGetAccessToken", 18990210, "login: Failed to get session ID. node: peer.example"),
             stops("NLIBCFileTouch", 18990023, std::string("updateConfig: Failed to touch ") + CONFIG)
                 .leaving(LOGGED_IN),
             stops("NLIBCFileAddSection", 18990019, noSection("updateConfig", "add")).leaving(LOGGED_IN)),
         update(2, LOGGED_IN)),
    onNode("logout", configured, logOut, stops("NLIBCSzHashAlloc", 18990001, noHash("loadFromConfig")),
           stops("NLIBCFileLockByFile", 18990015, noLock("loadFromConfig")), stops("NLIBCFileExist", 18990011),
           stops("NLIBCFileGetSection", 18991109), stops("NLIBCSzHashGetValue", 18991112, MISSING),
           Failure{"NLIBCFileUnlockByFile", 0, {noUnlock("loadFromConfig")}, true, true}, noLogOut("NORVCredAlloc"),
           noLogOut("NORVCredItemSetHost"), noLogOut("NORVCredItemSetPort"), noLogOut("NORVCredItemSetProtocol"),
           stops("CredRequestUtil::Logout", 18990206, "logout: Failed to logout. node: h").leaving(LOADED)),
    onNode(
        "createSession", configured, openSession, stops("NorvCgiInit", 18991113, "createSession: Failed to init cgi"),
        Failure{"NORVUserGetUGID", 0, {}, true, true}, noOption(1, "auth type"), noOption(2, "uid"), noOption(3, "gid"),
        noOption(4, "host"), noOption(5, "app"), noOption(6, "duration"), noOption(7, "skip check IP"),
        stops("NorvCgiLoginNoAuth", 18991116, "createSession: Failed to login without auth. ret: {code}")),
    onNode("deleteSession", configured, closeSession,
           stops("NorvCgiInit", 18991113, "deleteSession: Failed to init cgi").leaving(MINE),
           stops("NorvCgiRemoveSessionByIndex", 18990000).leaving(MINE)),
};

INSTANTIATE_TEST_SUITE_P(NodeRecord, FailureSweep, testing::ValuesIn(operations), operationName);

} // namespace
} // namespace unit
