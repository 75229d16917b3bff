#include "host/target/Stunnel.h"

#include "host/core/Crypto.h"
#include "host/core/FileContent.h"
#include "host/core/LastError.h"
#include "platform/error.h"

#include <cctype>
#include <cerrno>
#include <charconv>
#include <csignal>
#include <fcntl.h>
#include <sstream>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace norvhost {
namespace {

constexpr const char *stunnel_program = "/usr/bin/stunnel4";
constexpr int first_socket = 3; // SD_LISTEN_FDS_START of sd_listen_fds(3): so stunnel is given sockets

/// A file in memory, which has no name to open it by.
int makeHiddenFile(const std::string &text, FileDescriptor &file)
{
    file.reset(memfd_create("stunnel", MFD_CLOEXEC));
    if (!file || fchmod(file.get(), 0600) != 0 || !writeAll(file.get(), text) || lseek(file.get(), 0, SEEK_SET) != 0)
        return failErrno(NORV_ERR_UNKNOWN, errno, "cannot hand stunnel its configuration");
    return 0;
}

std::string secretsText(const std::string &rod_key)
{
    return "appliance:" + toHex(hmacSha256(rod_key, "norv sink: tls")) + "\n";
}

std::string configurationText(const StunnelRun &run, int secrets)
{
    std::ostringstream text;
    text << "foreground = yes\n"
            "syslog = no\n"
            "debug = err\n"
         << run.options << "client = " << (run.client ? "yes" : "no")
         << "\n"
            "sslVersionMin = TLSv1.3\n"
            // Those of SHA-256, the hash that a key belongs to when nothing else is said.
            "ciphersuites = TLS_AES_128_GCM_SHA256:TLS_CHACHA20_POLY1305_SHA256\n"
            // A server that does not know the key may offer a certificate in place of it, and stunnel would take any.
            // The only algorithm that we let it sign with is one that TLS 1.3 does not sign handshakes with.
            "config = SignatureAlgorithms:RSA+SHA256\n"
            "sessionResume = no\n"
            "libwrap = no\n"
            "TIMEOUTbusy = 30\n"
            "PSKsecrets = /proc/self/fd/"
         << secrets << "\n";
    for (size_t i = 0; i < run.ways.size(); ++i) // "accept" must be there; the socket that is given counts
        text << "[way" << i << "]\naccept = 127.0.0.1:1\nconnect = " << run.ways[i].to << "\n";
    return text.str();
}

/// What the child needs, made before it is there.
struct Preparation {
    std::vector<int> files; ///< sockets, configuration, secrets, lock file: from first_socket on
    std::string configuration, sockets;
    char own_id[32] = "LISTEN_PID=";
    bool locks = false;
};

/// Between fork() and exec(): nothing that another thread may have locked.
[[noreturn]] void becomeStunnel(const StunnelRun &run, Preparation &p, pid_t parent)
{
    if (run.client) {
        prctl(PR_SET_PDEATHSIG, SIGKILL);
        if (getppid() != parent)
            _exit(127);
    } else {
        setsid();
    }
    for (int number = 1; number < NSIG; ++number)
        signal(number, SIG_DFL);
    sigset_t none;
    sigemptyset(&none);
    sigprocmask(SIG_SETMASK, &none, nullptr);

    dup2(run.messages, STDOUT_FILENO);
    dup2(run.messages, STDERR_FILENO);
    const int nothing = open("/dev/null", O_RDONLY | O_CLOEXEC);
    dup2(nothing, STDIN_FILENO);
    const int count = static_cast<int>(p.files.size());
    for (int &file : p.files) // out of each other's way
        file = fcntl(file, F_DUPFD, first_socket + count);
    for (int i = 0; i < count; ++i)
        dup2(p.files[static_cast<size_t>(i)], first_socket + i);
    closefrom(first_socket + count);

    // Closing any descriptor of the file would drop the lock: it is taken last, and exec() leaves it alone.
    struct flock lock = {};
    lock.l_type = F_WRLCK;
    lock.l_whence = SEEK_SET;
    lock.l_len = 1;
    if (p.locks && fcntl(first_socket + count - 1, F_SETLK, &lock) != 0)
        _exit(127);

    *std::to_chars(p.own_id + sizeof "LISTEN_PID=" - 1, p.own_id + sizeof p.own_id - 1, getpid()).ptr = 0;
    char name[] = "stunnel4", option[] = "-fd";
    char *const arguments[] = {name, option, p.configuration.data(), nullptr};
    char *const environment[] = {p.sockets.data(), p.own_id, nullptr};
    execve(stunnel_program, arguments, environment);
    _exit(127);
}

bool startsWith(const std::string &text, const char *begin)
{
    return text.rfind(begin, 0) == 0;
}

} // namespace

int requireStunnel()
{
    return access(stunnel_program, X_OK) == 0
               ? 0
               : failErrno(NORV_ERR_FILE_NOT_FOUND, errno, "stunnel is not installed: %s", stunnel_program);
}

int startStunnel(StunnelRun &run, pid_t &pid)
{
    if (int err = requireStunnel())
        return err;
    FileDescriptor configuration, secrets, lock;
    const int count = static_cast<int>(run.ways.size());
    if (int err = makeHiddenFile(configurationText(run, first_socket + count + 1), configuration))
        return err;
    if (int err = makeHiddenFile(secretsText(run.rod_key), secrets))
        return err;
    Preparation prepared;
    for (const StunnelWay &way : run.ways)
        prepared.files.push_back(way.listener.get());
    prepared.files.push_back(configuration.get());
    prepared.files.push_back(secrets.get());
    if (!run.lock.empty()) {
        lock.reset(open(run.lock.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600));
        if (!lock)
            return failErrno(NORV_ERR_LOCK_FILE, errno, "cannot open %s", run.lock.c_str());
        prepared.files.push_back(lock.get());
        prepared.locks = true;
    }
    prepared.configuration = std::to_string(first_socket + count);
    prepared.sockets = "LISTEN_FDS=" + std::to_string(count);

    const pid_t parent = getpid();
    const pid_t child = fork();
    if (child < 0)
        return failErrno(NORV_ERR_FORK, errno, "cannot start stunnel");
    if (child == 0)
        becomeStunnel(run, prepared, parent);
    run.ways.clear();
    pid = child;
    return 0;
}

std::string stunnelComplaint(const std::string &messages)
{
    std::string complaint;
    std::istringstream lines(messages);
    for (std::string line; std::getline(lines, line);) {
        const size_t level = line.find(" LOG3["), text = line.find("]: ");
        std::string said;
        if (startsWith(line, "[!] ") && complaint.empty()) // it does not like its configuration
            said = line.substr(4);
        else if (level != line.npos && text != line.npos && isdigit(static_cast<unsigned char>(line[level + 6])))
            said = line.substr(text + 3); // of a connection, which has a number
        if (const size_t reason = said.find(":SSL routines::"); reason != said.npos)
            said = "the TLS handshake failed: " + said.substr(reason + 15);
        if (!said.empty() && said != "No more addresses to connect" && said != "No trusted certificates found")
            complaint = said;
    }
    return complaint;
}

} // namespace norvhost
