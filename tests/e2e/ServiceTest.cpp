#include "tests/e2e/Appliance.h"
#include "tests/e2e/Initiator.h"

#include "host/target/Service.h"
#include "host/target/ServiceLock.h"
#include "host/target/TargetStore.h"
#include "host/target/Wait.h"
#include "iscsihost/host.h"
#include "platform/error.h"
#include "platform/system.h"

#include <arpa/inet.h>
#include <csignal>
#include <cstring>
#include <random>
#include <set>
#include <sys/socket.h>

namespace e2e {
namespace {

class ServiceTest : public Appliance {
protected:
    /// Both daemons show what the store says, and nothing else.
    static void expectDaemonsAsStored()
    {
        std::vector<_tag_iscsi_target_> stored;
        ASSERT_EQ(norvhost::loadTargets(stored), 0);
        for (const norvhost::Tgtd &daemon : {rw, ro}) {
            const int permission = static_cast<int>(daemon.access());
            std::vector<norvhost::TgtdTarget> shown_targets;
            ASSERT_EQ(daemon.showTargets(shown_targets), 0) << iscsi_host_last_error();
            std::set<std::string> wanted, found;
            const auto add = [](std::set<std::string> &facts, int tid, const std::string &what,
                                const std::string &name) {
                facts.insert("target " + std::to_string(tid) + " " + what + " " + name);
            };
            for (const _tag_iscsi_target_ &target : stored) {
                norvhost::Masking masking;
                std::vector<norvhost::MappedLun> luns;
                ASSERT_EQ(norvhost::loadMasking(target.tid, masking), 0);
                ASSERT_EQ(norvhost::loadMappedLuns(target.tid, luns), 0);
                if (permission == NORV_AUTHORITY_READ && !masking.gives(permission))
                    continue;
                add(wanted, target.tid, target.enabled ? "ready" : "offline", target.iqn);
                for (const auto &lun : luns)
                    add(wanted, target.tid, "unit " + std::to_string(lun.index), lun.uuid);
                for (const auto &[name, given] : masking.named)
                    if (given == permission && target.enabled)
                        add(wanted, target.tid, "name", name);
                if (target.auth_type)
                    add(wanted, target.tid, "user", target.user);
            }
            for (const norvhost::TgtdTarget &target : shown_targets) {
                add(found, target.tid, target.ready ? "ready" : "offline", target.iqn);
                for (const auto &unit : target.units)
                    add(found, target.tid, "unit " + std::to_string(unit.lun), unit.serial);
                for (const std::string &name : target.names)
                    add(found, target.tid, "name", name);
                for (const std::string &user : target.users)
                    add(found, target.tid, "user", user);
            }
            EXPECT_EQ(found, wanted) << daemon.name();
        }
        EXPECT_FALSE(norvhost::daemonsMarked());
    }
};

TEST_F(ServiceTest, WithoutDaemonsACommandFailsClearlyAndChangesNothing)
{
    const Store store = createStore();
    killProcess(ro.processId());
    _tag_iscsi_target_ fresh = request("fresh");
    EXPECT_EQ(NORViSCSITargetCreate(&fresh), NORV_ERR_START_SERVICE);
    EXPECT_NE(std::string(iscsi_host_last_error()).find("iscsi-host boot"), std::string::npos);
    EXPECT_EQ(unmap(store.lun, {store.target.tid}), NORV_ERR_START_SERVICE);
    EXPECT_EQ(NORViSCSITargetRemove(&store.target), NORV_ERR_START_SERVICE);
    EXPECT_FALSE(norvhost::iscsiServiceAlive());
    std::vector<_tag_iscsi_target_> stored;
    EXPECT_EQ(norvhost::loadTargets(stored), 0);
    EXPECT_EQ(stored.size(), 1u);
    EXPECT_EQ(shown(rw, store.target.tid).units.size(), 1u);
    // LUNs are the volume's matter: they go on without the service.
    EXPECT_EQ(grow(store.lun, 32 * MiB), 0) << iscsi_host_last_error();
    EXPECT_EQ(norvhost::startService(), 0) << iscsi_host_last_error();
    EXPECT_TRUE(norvhost::iscsiServiceAlive());
    expectDaemonsAsStored();
    Initiator reader(bob);
    ASSERT_TRUE(reader.logIn(store.target.iqn));
    EXPECT_EQ(reader.capacity(), 32 * MiB);
}

TEST_F(ServiceTest, WhatRunsAnswersForTheAppliancesModules)
{
    std::string node;
    ASSERT_EQ(iscsihost::init(node), 0);
    const auto up = [] {
        std::string names;
        for (const char *name : {"iscsi_target_mod", "target_core_mod", "iscsi_extent_pool", "iscsi_rodsp", "configfs"})
            if (NORVCheckModule(name) == 1)
                names += std::string(name) + " ";
        return names;
    };
    EXPECT_EQ(up(), "iscsi_target_mod target_core_mod iscsi_extent_pool iscsi_rodsp configfs ");
    EXPECT_EQ(NORVSystemGetBootStep(), NORV_BOOT_DONE);
    killProcess(portalProcess());
    EXPECT_EQ(up(), "target_core_mod iscsi_extent_pool iscsi_rodsp configfs ");
    killProcess(ro.processId());
    EXPECT_EQ(up(), "iscsi_extent_pool iscsi_rodsp ");
}

TEST_F(ServiceTest, ATakenPortIsFoundOut)
{
    ASSERT_EQ(norvhost::stopService(), 0);
    sockaddr_in address = {};
    address.sin_family = AF_INET;
    for (int port : {3260, 3261, 3262}) {
        address.sin_port = htons(static_cast<uint16_t>(port));
        const int fd = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
        const int on = 1;
        setsockopt(fd, SOL_SOCKET, SO_REUSEADDR, &on, sizeof on);
        ASSERT_EQ(bind(fd, reinterpret_cast<sockaddr *>(&address), sizeof address), 0);
        ASSERT_EQ(listen(fd, 1), 0);
        EXPECT_EQ(norvhost::startService(), NORV_ERR_START_SERVICE) << port;
        EXPECT_NE(std::string(iscsi_host_last_error()).find(std::to_string(port)), std::string::npos)
            << iscsi_host_last_error();
        close(fd);
        ASSERT_EQ(norvhost::stopService(), 0);
    }
    EXPECT_EQ(norvhost::startService(), 0) << iscsi_host_last_error();
}

TEST_F(ServiceTest, ASupervisedServiceHealsWhileAnInitiatorWorks)
{
    const Store store = createStore();
    ASSERT_EQ(norvhost::stopService(), 0);
    const pid_t supervisor = inChild([] { return norvhost::superviseService(); });
    ASSERT_TRUE(norvhost::waitFor(hang_limit, [] { return norvhost::iscsiServiceAlive(); }));
    Initiator session(alice);
    ASSERT_TRUE(session.logIn(store.target.iqn));
    for (pid_t victim : {rw.processId(), ro.processId(), portalProcess()}) {
        EXPECT_TRUE(session.write(0, 0x5a)) << session.error();
        killProcess(victim);
        clearAttention(session.get(), 1); // it reconnects by itself
        EXPECT_TRUE(session.write(8, 0x5b)) << session.error();
        EXPECT_TRUE(session.holds(0, 0x5a)) << session.error();
        EXPECT_TRUE(norvhost::waitFor(hang_limit, [] { return norvhost::iscsiServiceAlive(); }));
    }
    expectDaemonsAsStored();
    kill(supervisor, SIGTERM);
    EXPECT_EQ(waitForChild(supervisor), 0);
    EXPECT_EQ(rw.processId() + ro.processId() + portalProcess(), 0) << "nothing is left running";
}

TEST_F(ServiceTest, WhoIsLetInByDefaultComesBackAfterARestart)
{
    const Store store = createStore();
    mask(store.target.tid, mallory, NORV_AUTHORITY_NONE);
    setDefault(store.target, NORV_AUTHORITY_READ_WRITE);
    Initiator session(iqn("guest"));
    ASSERT_TRUE(session.logIn(store.target.iqn));
    killProcess(rw.processId());
    ASSERT_EQ(norvhost::startService(), 0) << iscsi_host_last_error();
    clearAttention(session.get(), 1);
    EXPECT_TRUE(session.write(0, 0x5b)) << session.error();
}

TEST_F(ServiceTest, AKilledCommandIsMendedByTheNext)
{
    const _tag_iscsi_lun_ lun = createLun("lun");
    std::mt19937 random(1);
    for (int round = 0; round < 25; ++round) {
        const pid_t child = inChild([&] {
            for (int i = 0;; ++i) {
                _tag_iscsi_target_ target = request("t" + std::to_string(round) + "-" + std::to_string(i));
                target.auth_type = NORV_TARGET_AUTH_CHAP;
                setText(target.user, "user" + std::to_string(random() % 4));
                setText(target.password, "secret-of-a-user");
                if (NORViSCSITargetCreate(&target))
                    return 1;
                map(lun, {target.tid});
                mask(target.tid, alice, NORV_AUTHORITY_READ_WRITE);
                mask(target.tid, bob, NORV_AUTHORITY_READ);
                grow(lun, (17 + random() % 100) * MiB);
                mask(target.tid, bob, NORV_AUTHORITY_NONE);
                if (i % 2 && NORViSCSITargetRemove(&target))
                    return 1;
            }
        });
        // Not a wait for anything: the moment of the kill is meant to be any.
        usleep(static_cast<useconds_t>(random() % 150000));
        kill(child, SIGKILL);
        EXPECT_EQ(waitForChild(child), 128 + SIGKILL);

        std::vector<_tag_iscsi_target_> stored;
        ASSERT_EQ(norvhost::loadTargets(stored), 0);
        _tag_iscsi_target_ next = request("next");
        ASSERT_EQ(NORViSCSITargetCreate(&next), 0) << iscsi_host_last_error();
        expectDaemonsAsStored();
        ASSERT_EQ(NORViSCSITargetRemove(&next), 0);
        for (const _tag_iscsi_target_ &target : stored)
            ASSERT_EQ(NORViSCSITargetRemove(&target), 0) << iscsi_host_last_error();
        expectDaemonsAsStored();
    }
    std::vector<std::string> users;
    EXPECT_EQ(rw.showUsers(users), 0);
    EXPECT_TRUE(users.empty());
}

TEST_F(ServiceTest, AnInitiatorCannotTalkItselfIntoTheDaemonsAnswers)
{
    const Store store = createStore();
    Initiator session(alice), bystander(bob);
    iscsi_set_noautoreconnect(session.get(), 1);
    iscsi_set_alias(session.get(), "x\n            Connection: 0\n                IP Address: 127.0.0.1\n"
                                   "    LUN information:\n    Account information:\n    ACL information:\n        ALL");
    ASSERT_TRUE(session.logIn(store.target.iqn) && bystander.logIn(store.target.iqn));
    mask(store.target.tid, mallory, NORV_AUTHORITY_READ);
    expectDaemonsAsStored();
    EXPECT_EQ(session.capacity(), 0u) << "it lost its session for it";
    EXPECT_EQ(bystander.capacity(), store.lun.size);
}

TEST_F(ServiceTest, ReconcilingUndoesWhatWasDoneBehindItsBack)
{
    const Store store = createStore();
    const int tid = store.target.tid;
    bool busy;
    EXPECT_EQ(rw.bindInitiator(tid, norvhost::any_address), 0);
    EXPECT_EQ(rw.bindInitiator(tid, mallory), 0);
    EXPECT_EQ(ro.unbindInitiator(tid, bob), 0);
    EXPECT_EQ(rw.deleteUnit(tid, 1, busy), 0);
    EXPECT_EQ(ro.createUnit(tid, 7), 0);
    EXPECT_EQ(ro.createTarget(99, iqn("foreign")), 0);
    EXPECT_EQ(rw.setParameter(tid, "HeaderDigest", "CRC32C"), 0);
    EXPECT_EQ(rw.setReady(tid, false), 0);
    EXPECT_EQ(rw.createUser("somebody", "some-secret-text"), 0);
    EXPECT_EQ(norvhost::reconcileAll(), 0) << iscsi_host_last_error();
    expectDaemonsAsStored();
    std::map<std::string, std::string> parameters;
    EXPECT_EQ(rw.showParameters(tid, parameters), 0);
    EXPECT_EQ(parameters["HeaderDigest"], "None");
    EXPECT_FALSE(Initiator(mallory).logIn(store.target.iqn, rw_port));
}

} // namespace
} // namespace e2e
