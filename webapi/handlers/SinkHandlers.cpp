// Sink LUNs, which a peer has opened before it streams to them.
#include "webapi/handlers/Handlers.h"

#include "iscsihost/sink.h"

namespace webapi {

Json::Value sinkForm(const iscsihost::Sink &sink)
{
    Json::Value form(Json::objectValue);
    for (const std::string &portal : sink.portals)
        form["portals"].append(portal);
    form["iqn"] = sink.iqn;
    form["lun"] = sink.lun;
    form["tls_port"] = sink.tls_port;
    form["size"] = Json::UInt64(sink.size);
    form["is_blank"] = sink.blank;
    return form;
}

Result openSink(const Request &request)
{
    std::string lun_uuid;
    if (Result bad = selectLun(request.path.at("lun"), lun_uuid); bad.code)
        return bad;
    iscsihost::Sink sink;
    if (int err = iscsihost::openSink(lun_uuid, sink))
        return failed(err);
    Result result;
    result.value = sinkForm(sink);
    return result;
}

Result closeSink(const Request &request)
{
    std::string lun_uuid;
    if (Result bad = selectLun(request.path.at("lun"), lun_uuid); bad.code)
        return bad;
    const Json::Value &in = request.input;
    bool volume_full = false;
    if (int err = iscsihost::closeSink(lun_uuid, in["iqn"].asString(), in["complete"].asBool(), &volume_full))
        return failed(err);
    Result result;
    result.value["is_volume_full"] = volume_full;
    return result;
}

} // namespace webapi
