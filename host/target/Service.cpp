#include "host/target/Service.h"

#include "host/core/BootMark.h"
#include "host/core/FileDescriptor.h"
#include "host/core/LastError.h"
#include "host/core/Paths.h"
#include "host/core/Process.h"
#include "host/storage/Restore.h"
#include "host/target/ExportLinks.h"
#include "host/target/Portals.h"
#include "host/target/ProcessLock.h"
#include "host/target/Reconcile.h"
#include "host/target/ServiceLock.h"
#include "host/target/Sinks.h"
#include "host/target/TargetStore.h"
#include "host/target/Tgtd.h"
#include "host/target/TlsServer.h"
#include "host/target/Wait.h"
#include "platform/error.h"

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <filesystem>
#include <poll.h>
#include <spawn.h>
#include <sys/signalfd.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <syslog.h>

extern "C" {
#include <sys/pidfd.h> // glibc 2.36 declares it without regard to C++
}

extern char **environ;

namespace norvhost {
namespace {

using namespace std::chrono_literals;

/// What takes longer hangs: a busy machine may be slow.
constexpr auto start_limit = 60s, kill_limit = 60s;
constexpr auto stop_limit = 5s;
constexpr auto supervise_interval = 5s, retry_interval = 1s, mend_interval = 30s;

constexpr const char *tgtd_program = "/usr/sbin/tgtd";

constexpr off_t messages_max = 1 << 20;

/// Two worker threads a unit: the default of 16 makes 1,601 threads of 100 LUNs.
constexpr const char *tgtd_threads = "2";

std::string portalProgram()
{
    if (const char *named = getenv("ISCSI_HOST_PORTALD"))
        return named;
    std::error_code error;
    const auto beside = std::filesystem::read_symlink("/proc/self/exe", error).replace_filename("iscsi-portald");
    return !error && access(beside.c_str(), X_OK) == 0 ? beside.string() : ISCSI_PORTALD_PATH;
}

std::string messagesPath(const std::string &name)
{
    return runFolder() + "/" + name + ".messages";
}

/// Starts a daemon in a session of its own; what it says goes to its file of messages.
int spawnDaemon(const std::string &name, std::vector<std::string> arguments, const std::string &variable, pid_t &pid)
{
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    // Read-only on purpose: a write that a bug sends to descriptor 0 fails instead of being swallowed.
    posix_spawn_file_actions_addopen(&actions, STDIN_FILENO, "/dev/null", O_RDONLY, 0);
    posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, messagesPath(name).c_str(),
                                     O_WRONLY | O_CREAT | O_TRUNC | O_APPEND, 0600);
    posix_spawn_file_actions_adddup2(&actions, STDOUT_FILENO, STDERR_FILENO);
    posix_spawn_file_actions_addclosefrom_np(&actions, STDERR_FILENO + 1);

    std::vector<char *> environment;
    std::string added = variable;
    environment.push_back(added.data());
    for (char **entry = environ; *entry; ++entry)
        // tgtd would tell our supervisor that the service is ready.
        if (strncmp(*entry, "NOTIFY_SOCKET=", 14) != 0 && strncmp(*entry, "TGT_IPC_SOCKET=", 15) != 0)
            environment.push_back(*entry);
    environment.push_back(nullptr);

    const SpawnAttributes attributes(POSIX_SPAWN_SETSID);
    const int errnum = posix_spawn(&pid, arguments[0].c_str(), &actions, attributes.get(), pointers(arguments).data(),
                                   environment.data());
    posix_spawn_file_actions_destroy(&actions);
    return errnum ? failErrno(NORV_ERR_START_SERVICE, errnum, "cannot run %s", arguments[0].c_str()) : 0;
}

/// tgtd tells every failed command; on a broken disk that is a lot.
void cutMessages()
{
    for (const char *name : {"tgtd-rw", "tgtd-ro", "iscsi-portald", "stunnel"}) {
        struct stat status;
        const std::string path = messagesPath(name);
        if (stat(path.c_str(), &status) == 0 && status.st_size > messages_max && truncate(path.c_str(), 0) != 0)
            syslog(LOG_WARNING, "cannot cut %s: %s", path.c_str(), strerror(errno));
    }
}

bool hasEnded(pid_t pid)
{
    int status;
    return waitpid(pid, &status, WNOHANG) == pid;
}

int didNotStart(const std::string &name)
{
    FileDescriptor file(open(messagesPath(name).c_str(), O_RDONLY | O_CLOEXEC));
    char text[2048] = {};
    const ssize_t size = file ? read(file.get(), text, sizeof text - 1) : 0;
    return fail(NORV_ERR_START_SERVICE, "%s did not start: %s", name.c_str(),
                size > 0 ? lastLine(text).c_str() : "it said nothing");
}

/// Ends a process for good. `holder` tells which one it is now: between asking and signalling, a process
/// ID may have become another process's, a descriptor never does.
template <class Holder>
int endProcess(Holder holder, int signal)
{
    const pid_t pid = holder();
    if (pid <= 0)
        return 0;
    const FileDescriptor process(pidfd_open(pid, 0));
    if (!process || holder() != pid)
        return 0;
    pollfd ended = {process.get(), POLLIN, 0};
    for (int next : {signal, SIGKILL}) {
        const std::chrono::milliseconds limit = next == SIGKILL ? kill_limit : stop_limit;
        pidfd_send_signal(process.get(), next, nullptr, 0);
        if (poll(&ended, 1, static_cast<int>(limit.count())) > 0) {
            hasEnded(pid); // it may be our child
            return 0;
        }
    }
    return fail(NORV_ERR_TIMEOUT, "process %d does not end", pid);
}

int stopTgtd(const Tgtd &daemon)
{
    // tgtd takes no notice of SIGTERM and refuses to end while it has targets. What it acknowledged has been
    // written to the LUN's file, so that killing it loses nothing.
    return endProcess([&] { return daemon.processId(); }, SIGKILL);
}

int stopPortal()
{
    return endProcess([] { return processLockHolder(portalLockPath()); }, SIGTERM);
}

/// A daemon that cannot have its portal listens on every address and the usual port instead.
int checkPortals(const Tgtd &daemon, const std::vector<std::string> &wanted)
{
    std::vector<std::string> shown;
    if (int err = daemon.showPortals(shown))
        return err;
    if (shown == wanted)
        return 0;
    std::string text;
    for (const std::string &portal : wanted)
        text += (text.empty() ? "" : ", ") + portal;
    return fail(NORV_ERR_START_SERVICE, "the %s iSCSI daemon cannot listen on %s: is something else there?",
                daemon.name(), text.c_str());
}

int startTgtd(const Tgtd &daemon)
{
    std::vector<std::string> addresses, portals;
    if (int err = portalAddresses(addresses))
        return err;
    std::string option;
    for (const std::string &address : addresses) {
        portals.push_back(portalName(address, daemon.port()));
        option += (option.empty() ? "portal=" : ",portal=") + portals.back();
    }
    std::sort(portals.begin(), portals.end());

    const std::string name = std::string("tgtd-") + daemon.name();
    pid_t pid;
    if (int err = spawnDaemon(name, {tgtd_program, "-f", "-t", tgtd_threads, "--iscsi", option},
                              "TGT_IPC_SOCKET=" + daemon.socketVariable(), pid))
        return err;
    bool ended = false, serves = false;
    waitFor(start_limit, [&] {
        serves = daemon.ping() == 0;
        return serves || (ended = hasEnded(pid));
    });
    const int err = serves ? checkPortals(daemon, portals) : didNotStart(name);
    if (err && !ended) {
        const KeptError kept;
        stopTgtd(daemon);
    }
    return err;
}

int startPortal()
{
    pid_t pid;
    if (int err = spawnDaemon("iscsi-portald", {portalProgram()}, "ISCSI_HOST_RUN=" + runFolder(), pid))
        return err;
    bool ended = false;
    const bool serves =
        waitFor(start_limit, [&] { return processLockHolder(portalLockPath()) == pid || (ended = hasEnded(pid)); });
    return serves && !ended ? 0 : didNotStart("iscsi-portald");
}

/// Nothing but encrypted sendings waits for it: what keeps it away is no failure of the service, and logged once.
void startTlsOrSayWhyNot()
{
    static std::string told;
    const std::string reason = startTls() == 0 ? "" : lastError();
    if (!reason.empty() && reason != told)
        syslog(LOG_WARNING, "no encrypted sendings to this appliance: %s", reason.c_str());
    told = reason;
}

/// Under the lock: everything, and the links of LUNs that no target shows any more.
int reconcileBoth(const ServiceLock &lock)
{
    if (int err = lock.mark())
        return err;
    for (Access access : {Access::read_write, Access::read})
        if (int err = reconcileDaemon(Tgtd(access)))
            return err;
    if (int err = removeUnusedExportLinks())
        return err;
    lock.clear();
    return 0;
}

/// Starts what is missing; 0 when everything runs as the store says.
int startMissing()
{
    ServiceLock lock;
    if (int err = lock.take())
        return err;
    bool changed = daemonsMarked();
    for (Access access : {Access::read_write, Access::read}) {
        const Tgtd daemon(access);
        if (daemon.processId() > 0)
            continue;
        if (int err = lock.mark())
            return err;
        if (access == Access::read_write)
            if (int err = forgetOpenSinks())
                return err;
        if (int err = startTgtd(daemon))
            return err;
        changed = true;
    }
    if (changed)
        if (int err = reconcileBoth(lock))
            return err;
    if (processLockHolder(portalLockPath()) <= 0)
        if (int err = startPortal())
            return err;
    startTlsOrSayWhyNot();
    return markBooted();
}

/// Process descriptors of all that runs.
std::vector<FileDescriptor> watchedProcesses()
{
    std::vector<FileDescriptor> processes;
    for (pid_t pid : {Tgtd(Access::read_write).processId(), Tgtd(Access::read).processId(),
                      processLockHolder(portalLockPath()), tlsProcess()})
        if (pid > 0)
            processes.emplace_back(pidfd_open(pid, 0));
    return processes;
}

/// Waits for the end of a process, a signal or the end of the interval; true for the signal.
bool waitForEvent(int signals)
{
    const std::vector<FileDescriptor> processes = watchedProcesses();
    std::vector<pollfd> events = {{signals, POLLIN, 0}};
    for (const FileDescriptor &process : processes)
        events.push_back({process.get(), POLLIN, 0});
    const std::chrono::milliseconds interval = iscsiServiceAlive() ? supervise_interval : retry_interval;
    poll(events.data(), events.size(), static_cast<int>(interval.count()));
    return events[0].revents != 0;
}

} // namespace

int startService()
{
    if (int err = makeFolder(runFolder()))
        return err;
    return startMissing();
}

int stopService()
{
    ServiceLock lock;
    if (int err = lock.take())
        return err;
    int err = stopPortal();
    if (int failed = endProcess(tlsProcess, SIGTERM))
        err = failed;
    for (Access access : {Access::read_write, Access::read})
        if (int failed = stopTgtd(Tgtd(access)))
            err = failed;
    return err;
}

bool iscsiServiceAlive()
{
    return Tgtd(Access::read_write).processId() > 0 && Tgtd(Access::read).processId() > 0 &&
           processLockHolder(portalLockPath()) > 0;
}

int reconcileAll()
{
    ServiceLock lock;
    if (int err = lock.take())
        return err;
    return reconcileBoth(lock);
}

int superviseService()
{
    sigset_t signals;
    sigemptyset(&signals);
    for (int signal : {SIGTERM, SIGINT})
        sigaddset(&signals, signal);
    sigprocmask(SIG_BLOCK, &signals, nullptr);
    const FileDescriptor stop(signalfd(-1, &signals, SFD_CLOEXEC));
    if (!stop)
        return failErrno(NORV_ERR_START_SERVICE, errno, "cannot wait for signals");

    if (int err = startService())
        return err;
    auto next_mend = std::chrono::steady_clock::now();
    do {
        if (int err = startMissing())
            syslog(LOG_ERR, "the iSCSI service is not complete (%d): %s", err, lastError());
        // Initiators are not to work for long on a LUN whose restore was cut short. mendRestores() logs its failures.
        if (std::chrono::steady_clock::now() >= next_mend) {
            mendRestores();
            if (int err = closeAbandonedSinks())
                syslog(LOG_ERR, "an abandoned sink stays open (%d): %s", err, lastError());
            next_mend = std::chrono::steady_clock::now() + mend_interval;
        }
        cutMessages();
        while (waitpid(-1, nullptr, WNOHANG) > 0)
            ;
    } while (!waitForEvent(stop.get()));
    return stopService();
}

} // namespace norvhost
