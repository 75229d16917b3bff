#include "host/target/TlsServer.h"

#include "host/core/FileContent.h"
#include "host/core/LastError.h"
#include "host/core/Paths.h"
#include "host/target/Portals.h"
#include "host/target/ProcessLock.h"
#include "host/target/Stunnel.h"
#include "host/target/Wait.h"
#include "platform/error.h"
#include "platform/extent_pool.h"

#include <cerrno>
#include <csignal>
#include <fcntl.h>
#include <pwd.h>
#include <sys/wait.h>
#include <unistd.h>

namespace norvhost {
namespace {

using namespace std::chrono_literals;

constexpr const char *user = "stunnel4"; // the package makes it
constexpr auto start_limit = 60s;        // a busy machine may be slow
constexpr size_t rod_key_size = 256;
constexpr size_t messages_limit = 2 << 20;

std::string lockPath()
{
    return runFolder() + "/tls.lock";
}

std::string messagesPath()
{
    return runFolder() + "/stunnel.messages";
}

/// The only folder that it sees once it serves.
std::string jailPath()
{
    return runFolder() + "/tls";
}

/// It writes its process ID there when it has taken its configuration and given up root's rights.
std::string readyPath()
{
    return jailPath() + "/pid";
}

int makeJail()
{
    if (int err = makeFolder(jailPath()))
        return err;
    const passwd *account = getpwnam(user);
    if (!account)
        return fail(NORV_ERR_START_SERVICE, "there is no user %s", user);
    if (chown(jailPath().c_str(), account->pw_uid, account->pw_gid) != 0)
        return failErrno(NORV_ERR_START_SERVICE, errno, "cannot give %s to %s", jailPath().c_str(), user);
    unlink(readyPath().c_str());
    return 0;
}

int listenOnAll(std::vector<StunnelWay> &ways)
{
    std::vector<std::string> addresses;
    if (int err = portalAddresses(addresses))
        return err;
    for (const std::string &address : addresses) {
        StunnelWay way;
        if (int err = listenOn(address, tls_port, way.listener))
            return err;
        const std::string target = address == "0.0.0.0" ? "127.0.0.1" : address == "::" ? "::1" : address;
        way.to = target + ":" + std::to_string(read_write_port);
        ways.push_back(std::move(way));
    }
    return 0;
}

std::string complaint()
{
    const FileDescriptor file(open(messagesPath().c_str(), O_RDONLY | O_CLOEXEC));
    std::string text;
    return file && readAll(file.get(), messages_limit, text) == 0 ? stunnelComplaint(text) : "";
}

bool hasEnded(pid_t pid)
{
    return waitpid(pid, nullptr, WNOHANG) == pid;
}

} // namespace

pid_t tlsProcess()
{
    return processLockHolder(lockPath());
}

int startTls()
{
    if (tlsProcess() > 0)
        return 0;
    StunnelRun run;
    if (int err = requireStunnel())
        return err;
    char rod_key[rod_key_size] = {};
    if (int err = NORVExtentPoolRODKeyGet(rod_key, sizeof rod_key))
        return err;
    run.rod_key = rod_key;
    if (int err = makeJail())
        return err;
    if (int err = listenOnAll(run.ways))
        return err;
    run.options = "chroot = " + jailPath() + "\nsetuid = " + user + "\nsetgid = " + user + "\npid = /pid\n";
    run.lock = lockPath();
    const FileDescriptor messages(
        open(messagesPath().c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_APPEND | O_CLOEXEC, 0600));
    run.messages = messages.get();
    pid_t pid;
    if (int err = startStunnel(run, pid))
        return err;
    bool ended = false;
    const bool serves =
        waitFor(start_limit, [&] { return access(readyPath().c_str(), F_OK) == 0 || (ended = hasEnded(pid)); });
    if (serves && !ended)
        return 0;
    const std::string said = complaint();
    if (!ended) {
        kill(pid, SIGKILL);
        waitpid(pid, nullptr, 0);
    }
    return fail(NORV_ERR_START_SERVICE, "stunnel did not start: %s", said.empty() ? "it said nothing" : said.c_str());
}

std::string tlsProblem()
{
    if (tlsProcess() > 0)
        return "";
    return requireStunnel() != 0 ? "stunnel is not installed" : "stunnel does not run: the system log says why";
}

} // namespace norvhost
