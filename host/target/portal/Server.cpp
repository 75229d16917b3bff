#include "host/target/portal/Server.h"

#include "host/core/FileDescriptor.h"
#include "host/core/LastError.h"
#include "host/target/portal/Conversation.h"
#include "host/target/portal/StoreDirectory.h"
#include "host/target/Portals.h"
#include "platform/error.h"

#include <algorithm>
#include <arpa/inet.h>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstring>
#include <list>
#include <netinet/in.h>
#include <sys/epoll.h>
#include <sys/signalfd.h>
#include <sys/socket.h>

namespace norvhost::portal {
namespace {

using Clock = std::chrono::steady_clock;
using namespace std::chrono_literals;

constexpr size_t connections_max = 512;
constexpr auto login_limit = 15s; ///< from the connection to the end of its login
constexpr auto idle_limit = 60s;  ///< between the requests of a discovery session
constexpr auto retry_interval = 20ms;
constexpr auto decision_limit = 10s;
constexpr auto session_check_interval = 5s;

struct Connection {
    Connection(int fd, Directory &directory, std::string address, int port)
        : socket(fd), conversation(directory, std::move(address), port)
    {
    }

    FileDescriptor socket;
    Conversation conversation;
    std::string unread; ///< received and not yet taken by the conversation, at most one read's worth
    bool writing = false;
    Clock::time_point since = Clock::now(), last_request = since, waiting_since = {};
};

/// The local end of a connection as it stands in a TargetAddress.
bool localAddress(int fd, std::string &address, int &port)
{
    sockaddr_storage name = {};
    socklen_t size = sizeof name;
    char text[INET6_ADDRSTRLEN];
    if (getsockname(fd, reinterpret_cast<sockaddr *>(&name), &size) != 0)
        return false;
    if (name.ss_family == AF_INET) {
        const auto *v4 = reinterpret_cast<const sockaddr_in *>(&name);
        address = inet_ntop(AF_INET, &v4->sin_addr, text, sizeof text);
        port = ntohs(v4->sin_port);
        return true;
    }
    const auto *v6 = reinterpret_cast<const sockaddr_in6 *>(&name);
    address = std::string("[") + inet_ntop(AF_INET6, &v6->sin6_addr, text, sizeof text) + "]";
    port = ntohs(v6->sin6_port);
    return true;
}

class Server {
public:
    int listen(const std::vector<ListenAddress> &addresses);
    void run();

private:
    using Connections = std::list<Connection>;

    void accept(int listener);
    void serve(Connection &connection, uint32_t events);
    bool read(Connection &connection);
    bool write(Connection &connection);
    void end(Connection &connection);
    void checkTimes();
    int nextTimeout() const;
    void watch(int fd, uint32_t events, void *data, int operation) const;

    FileDescriptor events_fd, signals_fd;
    std::vector<FileDescriptor> listeners;
    Connections connections;
    StoreDirectory directory;
    Clock::time_point next_session_check = Clock::now() + session_check_interval;
    bool stopping = false;
};

void Server::watch(int fd, uint32_t events, void *data, int operation) const
{
    epoll_event event = {};
    event.events = events;
    event.data.ptr = data;
    epoll_ctl(events_fd.get(), operation, fd, &event);
}

int Server::listen(const std::vector<ListenAddress> &addresses)
{
    sigset_t signals;
    sigemptyset(&signals);
    sigaddset(&signals, SIGTERM);
    sigaddset(&signals, SIGINT);
    sigprocmask(SIG_BLOCK, &signals, nullptr);
    signals_fd.reset(signalfd(-1, &signals, SFD_CLOEXEC | SFD_NONBLOCK));
    events_fd.reset(epoll_create1(EPOLL_CLOEXEC));
    if (!signals_fd || !events_fd)
        return failErrno(NORV_ERR_START_SERVICE, errno, "the iSCSI portal cannot start");
    for (const ListenAddress &address : addresses) {
        listeners.emplace_back();
        if (int err = listenOn(address.address, address.port, listeners.back()))
            return err;
    }
    watch(signals_fd.get(), EPOLLIN, &signals_fd, EPOLL_CTL_ADD);
    for (FileDescriptor &listener : listeners)
        watch(listener.get(), EPOLLIN, &listener, EPOLL_CTL_ADD);
    return 0;
}

void Server::run()
{
    epoll_event events[64];
    while (!stopping) {
        const int count = epoll_wait(events_fd.get(), events, std::size(events), nextTimeout());
        for (int i = 0; i < count; ++i) {
            void *const data = events[i].data.ptr;
            const auto listener =
                std::find_if(listeners.begin(), listeners.end(), [=](const FileDescriptor &fd) { return &fd == data; });
            if (data == &signals_fd)
                stopping = true;
            else if (listener != listeners.end())
                accept(listener->get());
            else
                serve(*static_cast<Connection *>(data), events[i].events);
        }
        // Only here: an event of this round may still point to a connection that ended in it.
        connections.remove_if([](const Connection &connection) { return !connection.socket; });
        checkTimes();
    }
}

void Server::accept(int listener)
{
    const int fd = accept4(listener, nullptr, nullptr, SOCK_NONBLOCK | SOCK_CLOEXEC);
    std::string address;
    int port;
    if (fd < 0)
        return;
    if (!localAddress(fd, address, port)) {
        close(fd);
        return;
    }
    if (connections.size() >= connections_max) {
        // Whoever fills the table with connections that say nothing loses them first.
        const auto oldest = std::min_element(connections.begin(), connections.end(), [](const auto &a, const auto &b) {
            return a.last_request < b.last_request;
        });
        end(*oldest);
    }
    connections.emplace_back(fd, directory, std::move(address), port);
    watch(fd, EPOLLIN, &connections.back(), EPOLL_CTL_ADD);
}

void Server::serve(Connection &connection, uint32_t events)
{
    if (!connection.socket)
        return;
    if ((events & (EPOLLIN | EPOLLHUP | EPOLLERR)) && !read(connection))
        return end(connection);
    if (!write(connection))
        end(connection);
}

bool Server::read(Connection &connection)
{
    Conversation &conversation = connection.conversation;
    if (conversation.finished() || conversation.waiting() || !connection.unread.empty())
        return true;
    char buffer[4096];
    const ssize_t count = recv(connection.socket.get(), buffer, sizeof buffer, 0);
    if (count < 0)
        return errno == EAGAIN || errno == EINTR;
    if (count == 0)
        return false;
    connection.unread.assign(buffer, static_cast<size_t>(count));
    connection.last_request = Clock::now();
    return true;
}

/// Moves bytes from what was received to the conversation and from the conversation to the peer until
/// either side has to wait.
bool Server::write(Connection &connection)
{
    Conversation &conversation = connection.conversation;
    std::string &output = conversation.output();
    for (;;) {
        while (!output.empty()) {
            const ssize_t count = send(connection.socket.get(), output.data(), output.size(), MSG_NOSIGNAL);
            if (count < 0 && errno != EAGAIN && errno != EINTR)
                return false;
            if (count < 0)
                break;
            output.erase(0, static_cast<size_t>(count));
        }
        if (!output.empty() || conversation.waiting() || connection.unread.empty() || conversation.finished())
            break;
        std::string_view bytes = connection.unread;
        conversation.receive(bytes);
        connection.unread.erase(0, connection.unread.size() - bytes.size());
        if (conversation.waiting())
            connection.waiting_since = Clock::now();
    }
    if (conversation.finished() && output.empty()) {
        // The answer must not be lost to a reset for what was not read.
        shutdown(connection.socket.get(), SHUT_WR);
        return false;
    }
    // While we cannot take more, more is not looked at: the peer waits.
    const bool reading = output.empty() && !conversation.waiting() && connection.unread.empty();
    watch(connection.socket.get(), (reading ? EPOLLIN : 0u) | (output.empty() ? 0u : EPOLLOUT), &connection,
          EPOLL_CTL_MOD);
    return true;
}

void Server::end(Connection &connection)
{
    connection.socket.reset();
}

void Server::checkTimes()
{
    const auto now = Clock::now();
    for (Connection &connection : connections) {
        Conversation &conversation = connection.conversation;
        if (conversation.waiting()) {
            conversation.retry();
            if (conversation.waiting() && now - connection.waiting_since > decision_limit)
                conversation.giveUp();
            if (!write(connection))
                end(connection);
        } else if (conversation.loggedIn() ? now - connection.last_request > idle_limit
                                           : now - connection.since > login_limit) {
            end(connection);
        }
    }
    connections.remove_if([](const Connection &connection) { return !connection.socket; });
    if (now >= next_session_check) {
        enforceSessionLimits();
        next_session_check = Clock::now() + session_check_interval;
    }
}

int Server::nextTimeout() const
{
    const bool waiting = std::any_of(connections.begin(), connections.end(),
                                     [](const Connection &connection) { return connection.conversation.waiting(); });
    return waiting ? static_cast<int>(std::chrono::milliseconds(retry_interval).count()) : 1000;
}

} // namespace

int serve(const std::vector<ListenAddress> &addresses, void (*ready)())
{
    Server server;
    if (int err = server.listen(addresses))
        return err;
    ready();
    server.run();
    return 0;
}

} // namespace norvhost::portal
