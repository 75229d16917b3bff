/// Requests to a peer appliance's web API: one class per request, built from the peer's node record
/// and the request's arguments.
#pragma once

#include "iscsiwebapi/ISCSINodeInfo.h"

#include <json/value.h>

#include <string>

namespace ISCSI::WebAPI {

/// One request. send() returns 0, a code of the web-API client range (ISCSIErrorCode.h) when no proper
/// answer came, or the code that the peer answered with. Getters of a request are valid after a send()
/// that returned 0.
class Client {
public:
    virtual ~Client();

    virtual int send();

protected:
    Client(const ISCSINodeInfo &node, const char *method, std::string path, Json::Value body = Json::Value());

    /// Takes what the request is for from the answer; false when the answer lacks it.
    virtual bool readResponse(const Json::Value &response);

    /// One request and its answer; `resource` is the path below the API's root. A failure as send() returns it.
    int exchange(const char *verb, const std::string &resource, const Json::Value &input, Json::Value &output) const;

    /// One segment of a path. What an identifier holds cannot lead to another resource.
    static std::string segment(const std::string &identifier);

    ISCSINodeInfo node; ///< session_id authenticates the request

private:
    const char *method;
    std::string path;
    Json::Value body;
};

} // namespace ISCSI::WebAPI
