#include "host/transfer/Tunnel.h"

#include "host/core/FileContent.h"
#include "host/core/LastError.h"
#include "host/peer/Address.h"
#include "host/target/Portals.h"
#include "host/target/Stunnel.h"
#include "platform/error.h"

#include <cerrno>
#include <csignal>
#include <fcntl.h>
#include <netinet/in.h>
#include <sys/mman.h>
#include <sys/wait.h>

namespace norvhost {
namespace {

constexpr const char *own_address = "127.0.0.1";
constexpr size_t messages_limit = 1 << 20;

int portOf(const FileDescriptor &listener)
{
    sockaddr_in name = {};
    socklen_t size = sizeof name;
    return getsockname(listener.get(), reinterpret_cast<sockaddr *>(&name), &size) == 0 ? ntohs(name.sin_port) : 0;
}

} // namespace

int Tunnel::open(const std::string &host, uint16_t port, const std::string &rod_key)
{
    if (!isHost(host) || port == 0)
        return fail(NORV_ERR_TASK_ADDRESS, "'%s' is no host name and no address", host.c_str());
    StunnelRun run;
    StunnelWay way;
    if (int err = listenOn(own_address, 0, way.listener))
        return err;
    const int own_port = portOf(way.listener);
    way.to = host + ":" + std::to_string(port);
    run.ways.push_back(std::move(way));
    run.client = true;
    run.rod_key = rod_key;
    run.options = "pid =\n";
    messages.reset(memfd_create("messages", MFD_CLOEXEC));
    if (!messages || fcntl(messages.get(), F_SETFL, O_APPEND) != 0)
        return failErrno(NORV_ERR_UNKNOWN, errno, "cannot hear stunnel");
    run.messages = messages.get();
    if (int err = startStunnel(run, process))
        return err;
    entry = portalName(own_address, own_port);
    exit = authority(host, port);
    return 0;
}

Tunnel::~Tunnel()
{
    if (process <= 0)
        return;
    kill(process, SIGKILL);
    waitpid(process, nullptr, 0);
}

int Tunnel::explain(int failure) const
{
    std::string said;
    if (!messages || lseek(messages.get(), 0, SEEK_SET) != 0 || readAll(messages.get(), messages_limit, said) != 0)
        return failure;
    const std::string complaint = stunnelComplaint(said);
    if (complaint.empty())
        return failure;
    // What TLS 1.3 answers to somebody with another key.
    if (complaint.find("alert illegal parameter") != complaint.npos)
        return fail(NORV_ERR_ROD_KEY, "%s has another ROD key: %s", exit.c_str(), complaint.c_str());
    const bool unreachable = complaint.rfind("s_connect", 0) == 0;
    return fail(unreachable ? -ECONNREFUSED : failure, "TLS to %s: %s", exit.c_str(), complaint.c_str());
}

} // namespace norvhost
