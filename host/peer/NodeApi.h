/// Calls of a paired node's web API.
#pragma once

#include "iscsihost/node.h"

#include <json/value.h>
#include <string>

namespace norvhost {

/// Asks the node with its own session and key; `path` begins below "/api/v1". Codes as callApi() (iscsihost/https.h).
int askNode(const iscsihost::PairedNode &node, const char *method, const std::string &path, const Json::Value &input,
            Json::Value &answer);

} // namespace norvhost
