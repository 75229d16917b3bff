#include "tests/e2e/Appliance.h"
#include "tests/e2e/Initiator.h"

#include "host/core/FileDescriptor.h"
#include "host/target/ServiceLock.h"
#include "host/target/Wait.h"

#include <arpa/inet.h>
#include <atomic>
#include <filesystem>
#include <random>
#include <sys/socket.h>
#include <sys/time.h>
#include <thread>

namespace e2e {
namespace {

class PortalTest : public Appliance {
protected:
    static norvhost::FileDescriptor connectTo(int port)
    {
        norvhost::FileDescriptor fd(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
        sockaddr_in address = {};
        address.sin_family = AF_INET;
        address.sin_port = htons(static_cast<uint16_t>(port));
        address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
        EXPECT_EQ(connect(fd.get(), reinterpret_cast<sockaddr *>(&address), sizeof address), 0);
        const timeval limit = {5, 0};
        setsockopt(fd.get(), SOL_SOCKET, SO_RCVTIMEO, &limit, sizeof limit);
        return fd;
    }

    /// A first login request for discovery, complete.
    static std::string login()
    {
        std::string text = "InitiatorName=" + alice + '\0' + "SessionType=Discovery" + '\0' + "AuthMethod=None" + '\0';
        std::string pdu(48, '\0');
        pdu[0] = 0x43;
        pdu[1] = static_cast<char>(0x81);
        pdu[7] = static_cast<char>(text.size());
        return pdu + text + std::string((4 - text.size() % 4) % 4, '\0');
    }

    static size_t openDescriptors(pid_t pid)
    {
        const std::filesystem::directory_iterator entries("/proc/" + std::to_string(pid) + "/fd");
        return static_cast<size_t>(std::distance(begin(entries), end(entries)));
    }
};

TEST_F(PortalTest, GarbageEndsItsConnectionAndNothingElse)
{
    const Store store = createStore();
    const pid_t portal = portalProcess();
    const size_t descriptors = openDescriptors(portal);
    std::mt19937 random(7);
    const std::string good = login();
    for (int round = 0; round < 400; ++round) {
        const norvhost::FileDescriptor fd = connectTo(portal_port);
        std::string bytes = good;
        switch (round % 4) {
        case 0: // a login with a few bytes changed
            for (int i = 0; i < 4; ++i)
                bytes[random() % bytes.size()] = static_cast<char>(random());
            break;
        case 1: // noise
            bytes.resize(random() % 20000);
            for (char &c : bytes)
                c = static_cast<char>(random());
            break;
        case 2: // half of a login, then nothing
            bytes.resize(random() % bytes.size());
            break;
        default: // a session, then a changed request
            std::string next(48, '\0');
            for (int i = 0; i < 8; ++i)
                next[random() % 48] = static_cast<char>(random());
            bytes[1] = static_cast<char>(0x83);
            bytes += next;
        }
        send(fd.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
        if (round % 8 < 4)
            shutdown(fd.get(), SHUT_WR);
        char answer[4096];
        if (round % 4 == 0)
            recv(fd.get(), answer, sizeof answer, round % 8 < 4 ? 0 : MSG_DONTWAIT);
    }
    EXPECT_EQ(portalProcess(), portal);
    EXPECT_EQ(Initiator(alice).discover().count(store.target.iqn), 1u);
    EXPECT_TRUE(norvhost::waitFor(hang_limit, [&] { return openDescriptors(portal) == descriptors; }))
        << "descriptors are left";
}

TEST_F(PortalTest, SilentConnectionsDoNotKeepOthersOut)
{
    const Store store = createStore();
    std::vector<norvhost::FileDescriptor> silent;
    for (int i = 0; i < 700; ++i)
        silent.push_back(connectTo(portal_port));
    Initiator session(alice);
    EXPECT_TRUE(session.logIn(store.target.iqn)) << session.error();
    EXPECT_EQ(Initiator(bob).discover().size(), 1u);
}

TEST_F(PortalTest, EveryTargetIsDiscovered)
{
    constexpr int count = 256;
    for (int i = 0; i < count; ++i) {
        _tag_iscsi_target_ target = request("t" + std::to_string(i) + std::string(150, 'x'));
        ASSERT_EQ(NORViSCSITargetCreate(&target), 0);
        if (i != 100)
            mask(target.tid, alice, NORV_AUTHORITY_READ_WRITE);
    }
    const auto found = Initiator(alice).discover();
    EXPECT_EQ(found.size(), count - 1u);
    EXPECT_EQ(found.begin()->second, "127.0.0.1:3260,1");
    _tag_iscsi_target_ one_more = request("one-more");
    EXPECT_EQ(NORViSCSITargetCreate(&one_more), 18990542);
    EXPECT_TRUE(Initiator(alice).logIn(iqn("t255" + std::string(150, 'x'))));
}

TEST_F(PortalTest, Ipv6)
{
    const Store store = createStore();
    EXPECT_EQ(Initiator(alice, "[::1]").discover().at(store.target.iqn), "[::1]:3260,1");
    Initiator session(alice, "[::1]");
    ASSERT_TRUE(session.logIn(store.target.iqn)) << session.error();
    EXPECT_TRUE(session.write(0, 1));
    EXPECT_EQ(session.port(), rw_port);
}

TEST_F(PortalTest, AnUnknownNameWaitsForARunningChange)
{
    const Store store = createStore();
    setDefault(store.target, NORV_AUTHORITY_READ);
    norvhost::ServiceLock change;
    ASSERT_EQ(change.take(), 0);
    std::atomic<bool> ended{false};
    std::thread later([&] {
        Initiator listed(bob);
        EXPECT_TRUE(listed.logIn(store.target.iqn)) << "a listed name does not wait";
        poll(nullptr, 0, 300); // how long the change takes, not a wait
        ended = true;
        change = norvhost::ServiceLock();
    });
    Initiator guest(mallory);
    EXPECT_TRUE(guest.logIn(store.target.iqn)) << guest.error();
    EXPECT_TRUE(ended);
    later.join();
}

TEST_F(PortalTest, LearnedNamesAreBounded)
{
    const Store store = createStore();
    mask(store.target.tid, mallory, NORV_AUTHORITY_NONE);
    setDefault(store.target, NORV_AUTHORITY_READ_WRITE);
    Initiator first(iqn("guest-first"));
    ASSERT_TRUE(first.logIn(store.target.iqn));
    for (int i = 0; i < 300; ++i) {
        Initiator guest(iqn("guest-" + std::to_string(i)));
        ASSERT_TRUE(guest.logIn(store.target.iqn)) << i << guest.error();
    }
    const auto names = shown(rw, store.target.tid).names;
    EXPECT_LE(names.size(), 258u);
    EXPECT_EQ(std::count(names.begin(), names.end(), iqn("guest-first")), 1) << "one with a session stays";
    EXPECT_EQ(std::count(names.begin(), names.end(), iqn("guest-299")), 1);
    EXPECT_TRUE(first.write(0, 1));
}

} // namespace
} // namespace e2e
