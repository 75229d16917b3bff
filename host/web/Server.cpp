/// The web server: lighttpd with the configuration that is installed beside the CGI program.
#include "host/core/FileDescriptor.h"
#include "host/core/LastError.h"
#include "host/core/Paths.h"
#include "host/state/Database.h"
#include "host/web/Certificate.h"
#include "iscsihost/web.h"
#include "platform/error.h"

#include <arpa/inet.h>
#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <sys/socket.h>
#include <unistd.h>
#include <utility>

namespace norvhost {
namespace {

constexpr const char *address_setting = "web_address";
constexpr const char *port_setting = "web_port";
constexpr const char *server_program = "/usr/sbin/lighttpd";

/// The address as the server's configuration has it.
std::string bindAddress(const std::string &address)
{
    if (address == "all") {
        const FileDescriptor probe(socket(AF_INET6, SOCK_STREAM | SOCK_CLOEXEC, 0));
        return probe ? "[::]" : "0.0.0.0";
    }
    return address.find(':') == address.npos ? address : "[" + address + "]";
}

std::string webapiFolder()
{
    if (const char *named = getenv("ISCSI_HOST_WEBAPI"))
        return named;
    // An installed tree may have been moved as a whole.
    std::error_code error;
    const auto program = std::filesystem::read_symlink("/proc/self/exe", error);
    const auto beside = program.parent_path().parent_path() / "libexec/iscsi-host/webapi";
    return !error && access(beside.c_str(), X_OK) == 0 ? beside.string() : ISCSI_WEBAPI_FOLDER;
}

/// What the configuration takes from the environment: what differs between appliances on one machine. The server gives
/// its CGI programs nothing else of it.
int setEnvironment(const std::string &folder, const iscsihost::WebListener &listener)
{
    const char *path = getenv("PATH");
    const char *portald = getenv("ISCSI_HOST_PORTALD");
    const std::pair<const char *, std::string> variables[] = {
        {"ISCSI_HOST_WEBAPI", folder},
        {"ISCSI_HOST_WEB_ADDRESS", bindAddress(listener.address)},
        {"ISCSI_HOST_WEB_PORT", std::to_string(listener.port)},
        {"ISCSI_HOST_STATE", stateFolder()},
        {"ISCSI_HOST_RUN", runFolder()},
        {"ISCSI_HOST_PROGRESS", progressFolder()},
        {"ISCSI_HOST_PORTALD", portald ? portald : ""},
        {"PATH", path ? path : "/usr/sbin:/usr/bin:/sbin:/bin"},
    };
    for (const auto &[name, value] : variables) {
        if (setenv(name, value.c_str(), 1) != 0)
            return failErrno(NORV_ERR_START_SERVICE, errno, "cannot set %s", name);
    }
    return 0;
}

} // namespace
} // namespace norvhost

namespace iscsihost {

using namespace norvhost;

int setWebListener(const WebListener &listener)
{
    unsigned char binary[16];
    const int family = listener.address.find(':') == listener.address.npos ? AF_INET : AF_INET6;
    if (listener.address != "all" && inet_pton(family, listener.address.c_str(), binary) != 1)
        return fail(NORV_ERR_BAD_PARAMETER, "address: neither an IP address nor 'all'");
    if (listener.port == 0)
        return fail(NORV_ERR_BAD_PARAMETER, "port: must be from 1 to 65535");
    Transaction transaction;
    if (transaction.error())
        return transaction.error();
    if (int err = setSetting(address_setting, listener.address))
        return err;
    if (int err = setSetting(port_setting, std::to_string(listener.port)))
        return err;
    return transaction.commit();
}

int getWebListener(WebListener &listener)
{
    WebListener found;
    std::string port;
    if (int err = getSetting(address_setting, "all", found.address))
        return err;
    if (int err = getSetting(port_setting, "", port))
        return err;
    if (!port.empty())
        found.port = static_cast<uint16_t>(strtoul(port.c_str(), nullptr, 10));
    listener = found;
    return 0;
}

int runWebServer()
{
    const std::string folder = webapiFolder();
    std::string configuration = folder + "/iscsi-webapi.conf";
    if (access(configuration.c_str(), R_OK) != 0)
        return failErrno(NORV_ERR_START_SERVICE, errno, "%s", configuration.c_str());
    WebListener listener;
    if (int err = getWebListener(listener))
        return err;
    if (int err = makeFolder(runFolder()))
        return err;
    if (int err = provideCertificate())
        return err;
    if (int err = setEnvironment(folder, listener))
        return err;
    closeDatabase();
    execl(server_program, server_program, "-D", "-f", configuration.c_str(), static_cast<char *>(nullptr));
    return failErrno(NORV_ERR_START_SERVICE, errno, "cannot run %s", server_program);
}

} // namespace iscsihost
