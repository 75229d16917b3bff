/// The DR-node database: the appliances that this one is paired with, and itself.
#pragma once

#include "platform/sdk.h"

#include <string>
#include <vector>

namespace NorvDRNode {

/// Which nodes DRNodeDB::List returns.
enum CredType : int {
    CRED_REMOTE = 1, ///< those that this appliance holds a session for
};

/// One paired appliance.
class NORV_API DRNode {
public:
    std::string id; ///< UUID
    std::string host;
    int port = 0;
    std::string protocol;     ///< "http" or "https"
    std::string cred_session; ///< access token for the node's web API

    static bool isLocalNodeId(const std::string &id);
    /// Empty when this appliance has no identity yet.
    static std::string getLocalNodeId();
};

/// A named value kept with a node.
class NORV_API DRNodeAttr {
public:
    std::string node_id;
    std::string app;
    std::string key;
    std::string value;

    DRNodeAttr() = default;
    DRNodeAttr(const std::string &node_id, const std::string &app, const std::string &key, const std::string &value)
        : node_id(node_id), app(app), key(key), value(value)
    {
    }
};

/// Every function returns true on success; outputs are replaced, on success only.
class NORV_API DRNodeDB {
public:
    static bool Get(const std::string &id, DRNode &node);
    /// The paired nodes, without the local one.
    static bool List(std::vector<DRNode> &nodes, CredType type);
    static bool ListAttr(const std::string &id, const std::string &app, std::vector<DRNodeAttr> &attrs);
    static bool SetAttr(const DRNodeAttr &attr);
};

} // namespace NorvDRNode
