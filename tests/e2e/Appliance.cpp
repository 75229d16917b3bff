#include "tests/e2e/Appliance.h"

#include "host/core/Process.h"
#include "host/state/Database.h"
#include "host/target/ProcessLock.h"
#include "host/target/Service.h"
#include "host/target/Wait.h"
#include "iscsihost/host.h"

#include <csignal>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <sched.h>
#include <sys/wait.h>
#include <unistd.h>

namespace e2e {

const std::string alice = "iqn.2026-01.example:alice", bob = "iqn.2026-01.example:bob",
                  mallory = "iqn.2026-01.example:mallory";
const norvhost::Tgtd Appliance::rw(norvhost::Access::read_write), Appliance::ro(norvhost::Access::read);

Appliance::Appliance()
{
    char folder[] = "/mnt/e2e-XXXXXX";
    root = mkdtemp(folder);
    setenv("ISCSI_HOST_STATE", (root + "/state").c_str(), 1);
    setenv("ISCSI_HOST_PORTALD", PORTALD_PATH, 1);
    setenv("ISCSI_HOST_RUN", (root + "/run").c_str(), 1);
    volume = root + "/volume";
    std::filesystem::create_directory(volume);
    EXPECT_EQ(iscsihost::addVolume(volume), 0) << iscsi_host_last_error();
}

void Appliance::SetUp()
{
    ASSERT_EQ(norvhost::startService(), 0) << iscsi_host_last_error();
}

Appliance::~Appliance()
{
    EXPECT_EQ(norvhost::stopService(), 0) << iscsi_host_last_error();
    norvhost::closeDatabase();
    if (volume == root + "/xfs") {
        norvhost::ProgramResult result;
        EXPECT_EQ(norvhost::runProgram({{"umount", volume}, {}, 60}, result), 0);
        EXPECT_EQ(result.status, 0) << result.errors;
    }
    std::filesystem::remove_all(root);
}

void Appliance::useXfs(uint64_t size)
{
    volume = root + "/xfs";
    ASSERT_EQ(iscsihost::createVolume(volume, size, root + "/image"), 0) << iscsi_host_last_error();
}

_tag_iscsi_lun_ Appliance::createLun(const std::string &name, uint64_t size, int type) const
{
    _tag_iscsi_lun_ lun = {};
    lun.type = type;
    lun.size = size;
    setText(lun.name, name);
    setText(lun.location, volume);
    EXPECT_EQ(NORViSCSILunCreate(&lun), 0) << iscsi_host_last_error();
    return lun;
}

std::string Appliance::iqn(const std::string &name)
{
    return "iqn.2026-01.example:" + name;
}

_tag_iscsi_target_ Appliance::request(const std::string &name)
{
    _tag_iscsi_target_ target = {};
    setText(target.name, name);
    setText(target.iqn, iqn(name));
    target.enabled = 1;
    return target;
}

_tag_iscsi_target_ Appliance::createTarget(const std::string &name)
{
    _tag_iscsi_target_ target = request(name);
    EXPECT_EQ(NORViSCSITargetCreate(&target), 0) << iscsi_host_last_error();
    return target;
}

void Appliance::map(const _tag_iscsi_lun_ &lun, const std::vector<int> &tids)
{
    EXPECT_EQ(NORViSCSILunMappingsAdd(tids.data(), lun.lid, static_cast<int>(tids.size())), 0)
        << iscsi_host_last_error();
}

int Appliance::unmap(const _tag_iscsi_lun_ &lun, const std::vector<int> &tids)
{
    return NORViSCSILunMappingsRemove(tids.data(), lun.lid, static_cast<int>(tids.size()));
}

namespace {

std::vector<_tag_struct_iscsi_acl_> entry(int tid, const std::string &initiator, int permission)
{
    _tag_struct_iscsi_acl_ entry = {};
    entry.tid = tid;
    setText(entry.iqn, initiator);
    entry.permission = permission;
    return {entry};
}

} // namespace

void Appliance::mask(int tid, const std::string &initiator, int permission)
{
    EXPECT_EQ(NORViSCSIMaskingsCreate(entry(tid, initiator, permission)), 0) << iscsi_host_last_error();
}

void Appliance::unmask(int tid, const std::string &initiator)
{
    EXPECT_EQ(NORViSCSIMaskingsRemove(entry(tid, initiator, 0)), 0) << iscsi_host_last_error();
}

void Appliance::setDefault(const _tag_iscsi_target_ &target, int permission)
{
    EXPECT_EQ(NORViSCSIDefaultACLSet(&target, permission), 0) << iscsi_host_last_error();
}

int Appliance::grow(const _tag_iscsi_lun_ &lun, uint64_t size)
{
    _tag_iscsi_lun_ wanted = lun;
    wanted.size = size;
    return NORViSCSILunUpdate(&wanted);
}

Appliance::Store Appliance::createStore(uint64_t size, int type) const
{
    const Store store = {createTarget("store"), createLun("store", size, type)};
    map(store.lun, {store.target.tid});
    mask(store.target.tid, alice, NORV_AUTHORITY_READ_WRITE);
    mask(store.target.tid, bob, NORV_AUTHORITY_READ);
    return store;
}

norvhost::TgtdTarget Appliance::shown(const norvhost::Tgtd &daemon, int tid)
{
    std::vector<norvhost::TgtdTarget> targets;
    EXPECT_EQ(daemon.showTargets(targets), 0) << iscsi_host_last_error();
    for (const norvhost::TgtdTarget &target : targets)
        if (target.tid == tid)
            return target;
    return {};
}

void Appliance::killProcess(pid_t pid)
{
    ASSERT_GT(pid, 1);
    kill(pid, SIGKILL);
    EXPECT_TRUE(
        norvhost::waitFor(hang_limit, [=] { return kill(pid, 0) != 0 || waitpid(pid, nullptr, WNOHANG) == pid; }));
}

pid_t Appliance::portalProcess()
{
    return norvhost::processLockHolder(norvhost::portalLockPath());
}

pid_t Appliance::inChild(const std::function<int()> &work)
{
    const pid_t child = fork();
    if (child == 0)
        _exit(work());
    return child;
}

int Appliance::waitForChild(pid_t child)
{
    int status = 0;
    waitpid(child, &status, 0);
    return WIFSIGNALED(status) ? 128 + WTERMSIG(status) : WEXITSTATUS(status);
}

} // namespace e2e

namespace {

/// The first process of the namespaces: runs the tests in a child and takes in what is orphaned.
int runTestsIsolated()
{
    const pid_t tests = fork();
    if (tests == 0)
        return RUN_ALL_TESTS();
    int status, ended;
    while ((ended = wait(&status)) != tests)
        if (ended < 0)
            return 1;
    _exit(WIFEXITED(status) ? WEXITSTATUS(status) : 1);
}

} // namespace

/// libiscsi 1.19 loses a few bytes when a connection breaks under one of its blocking calls.
extern "C" __attribute__((visibility("default"))) const char *__lsan_default_suppressions()
{
    return "leak:libiscsi.so";
}

int main(int argc, char **argv)
{
    const bool only_lists = argc > 1 && strstr(argv[1], "--gtest_list_tests");
    testing::InitGoogleTest(&argc, argv);
    if (only_lists)
        return RUN_ALL_TESTS();
    if (unshare(CLONE_NEWNET | CLONE_NEWNS | CLONE_NEWPID | CLONE_NEWIPC) != 0) {
        perror("these tests make namespaces, run them as root");
        return 1;
    }
    signal(SIGPIPE, SIG_IGN); // libiscsi does not mind it
    const pid_t first = fork();
    if (first == 0) {
        norvhost::ProgramResult result;
        for (const std::vector<std::string> &command : {std::vector<std::string>{"ip", "link", "set", "lo", "up"},
                                                        {"mount", "--make-rprivate", "/"},
                                                        {"mount", "-t", "tmpfs", "tmpfs", "/mnt"},
                                                        {"mount", "-t", "proc", "proc", "/proc"}})
            if (norvhost::runProgram({command, {}, 60}, result) || result.status != 0) {
                fprintf(stderr, "%s failed: %s\n", command[0].c_str(), result.errors.c_str());
                _exit(1);
            }
        return runTestsIsolated();
    }
    int status = 1;
    waitpid(first, &status, 0);
    _exit(WIFEXITED(status) ? WEXITSTATUS(status) : 1); // no leak check: /proc is the namespace's
}
