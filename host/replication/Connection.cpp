/// Whether a sending could reach a peer.
#include "host/core/Crypto.h"
#include "host/core/LastError.h"
#include "host/core/LibIscsi.h"
#include "host/core/PipeSignalBlock.h"
#include "host/peer/Address.h"
#include "host/target/Portals.h"
#include "host/transfer/Tunnel.h"
#include "iscsihost/node.h"
#include "platform/dr_node.h"
#include "platform/error.h"
#include "platform/replication.h"

#include <cerrno>
#include <memory>
#include <vector>

namespace norvhost {
namespace {

constexpr int limit_seconds = 10;
constexpr int connect_retries = 2; // after 1 and 3 seconds; it gives up after 7

/// A discovery log-in: whoever answers it speaks iSCSI. -ECONNREFUSED when nothing is there, -EPROTO when it is
/// something else.
int checkPortal(const std::string &portal)
{
    const PipeSignalBlock block;
    const std::unique_ptr<iscsi_context, decltype(iscsi_destroy_context)> context(
        iscsi_create_context("iqn.2001-01.norv:check"), iscsi_destroy_context);
    if (!context)
        return fail(NORV_ERR_OUT_OF_MEMORY, "no memory for a connection");
    iscsi_set_session_type(context.get(), ISCSI_SESSION_DISCOVERY);
    iscsi_set_noautoreconnect(context.get(), 1);
    iscsi_set_timeout(context.get(), limit_seconds);
    iscsi_set_tcp_syncnt(context.get(), connect_retries); // else the kernel tries for two minutes
    if (iscsi_connect_sync(context.get(), portal.c_str()) != 0)
        return fail(-ECONNREFUSED, "nothing answers at %s: %s", portal.c_str(), iscsi_get_error(context.get()));
    if (iscsi_login_sync(context.get()) != 0)
        return fail(-EPROTO, "no iSCSI portal answers at %s: %s", portal.c_str(), iscsi_get_error(context.get()));
    iscsi_disconnect(context.get());
    return 0;
}

/// Only who has the key comes through: this proves that the peer has it.
int checkTls(const std::string &host, uint16_t port, const std::string &rod_key)
{
    Tunnel tunnel;
    if (int err = tunnel.open(host, port, rod_key))
        return err;
    const int err = checkPortal(tunnel.portal());
    return err ? tunnel.explain(err) : 0;
}

/// Whether it is the key of a paired appliance.
int checkRodKey(const std::string &rod_key)
{
    std::vector<NorvDRNode::DRNode> nodes;
    if (!NorvDRNode::DRNodeDB::List(nodes, NorvDRNode::CRED_REMOTE))
        return NORV_ERR_GET_CONFIG;
    for (const NorvDRNode::DRNode &node : nodes) {
        iscsihost::PairedNode paired;
        if (iscsihost::describePairedNode(node.id, paired) == 0 && sameBytes(paired.rod_key, rod_key))
            return 0;
    }
    return fail(NORV_ERR_ROD_KEY, "the ROD key is no paired appliance's");
}

} // namespace
} // namespace norvhost

using namespace norvhost;

int NORViSCSIReplicationTaskCheckConnection(const char *address, unsigned int port, const char *rod_key)
{
    if (!address || !rod_key || !*rod_key)
        return fail(NORV_ERR_NULL_POINTER, "an address and a ROD key are needed");
    if (!isHost(address) || port > UINT16_MAX)
        return fail(NORV_ERR_TASK_ADDRESS, "address: is no host name or address with a port");
    if (int err = checkRodKey(rod_key))
        return err;
    const uint16_t data_port = static_cast<uint16_t>(port ? port : read_write_port);
    const int err = checkPortal(authority(address, data_port));
    if (err != -EPROTO)
        return err;
    const std::string reason = lastError();
    const int tls_err = checkTls(address, data_port, rod_key);
    return tls_err == 0 || tls_err == NORV_ERR_ROD_KEY ? tls_err : fail(err, "%s", reason.c_str());
}
