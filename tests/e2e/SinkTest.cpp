/// Sinks, and sending to them.
#include "tests/e2e/Appliance.h"
#include "tests/e2e/Initiator.h"

#include "host/core/FileDescriptor.h"
#include "host/core/Process.h"
#include "host/services/Identity.h"
#include "host/state/Database.h"
#include "host/storage/LunStore.h"
#include "host/storage/MapFile.h"
#include "host/target/Service.h"
#include "host/target/Sinks.h"
#include "host/target/Wait.h"
#include "host/transfer/Sending.h"
#include "iscsihost/sink.h"
#include "platform/error.h"
#include "platform/extent_pool.h"
#include "platform/virtual_lun.h"

#include <csignal>
#include <cstring>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <random>
#include <sys/stat.h>
#include <unistd.h>

namespace e2e {
namespace {

using norvhost::IscsiUnit;

std::string readFile(const std::string &path)
{
    std::ifstream file(path, std::ios::binary | std::ios::ate);
    std::string text(static_cast<size_t>(std::max<std::streamoff>(file.tellg(), 0)), '\0');
    file.seekg(0).read(text.data(), static_cast<std::streamsize>(text.size()));
    return text;
}

std::string randomText(size_t size, unsigned seed)
{
    std::mt19937_64 engine(seed);
    std::string text(size, '\0');
    for (size_t at = 0; at < size; at += sizeof(uint64_t)) {
        const uint64_t number = engine();
        memcpy(&text[at], &number, sizeof number);
    }
    return text;
}

/// Bytes that a file takes on its volume.
uint64_t allocated(const std::string &path)
{
    struct stat status = {};
    EXPECT_EQ(stat(path.c_str(), &status), 0) << path;
    return static_cast<uint64_t>(status.st_blocks) * 512;
}

class SinkTest : public Appliance {
protected:
    static constexpr const char *slow = "200mbit"; ///< 100 MiB take 4 seconds

    void SetUp() override
    {
        Appliance::SetUp();
        ASSERT_EQ(norvhost::makeIdentity(), 0) << iscsi_host_last_error();
        useXfs(2000 * MiB);
        source = createLun("source", 256 * MiB, NORV_LUN_TYPE_ADV);
        sink = createLun("sink", 256 * MiB, NORV_LUN_TYPE_SINK);
    }

    void TearDown() override { setRate(""); }

    /// A sending that is to be disturbed must not be over by then: this is how fast it may be, "" for no limit.
    static void setRate(const std::string &rate)
    {
        std::vector<std::string> command = {"tc", "qdisc", "delete", "dev", "lo", "root"};
        if (!rate.empty())
            command = {"tc",   "qdisc", "replace", "dev",   "lo",      "root", "tbf",
                       "rate", rate,    "burst",   "256kb", "latency", "100ms"};
        norvhost::ProgramResult result;
        ASSERT_EQ(norvhost::runProgram({command, {}, 60}, result), 0) << iscsi_host_last_error();
        EXPECT_TRUE(rate.empty() || result.status == 0) << result.errors;
    }

    static void put(const _tag_iscsi_lun_ &lun, uint64_t at, const std::string &data)
    {
        const int fd = open(norvhost::dataPath(lun).c_str(), O_WRONLY | O_CLOEXEC);
        EXPECT_EQ(pwrite(fd, data.data(), data.size(), static_cast<off_t>(at)), static_cast<ssize_t>(data.size()));
        EXPECT_EQ(fsync(fd), 0);
        close(fd);
    }

    static std::string contents(const _tag_iscsi_lun_ &lun) { return readFile(norvhost::dataPath(lun)); }

    iscsihost::Sink openSink()
    {
        iscsihost::Sink opened;
        EXPECT_EQ(iscsihost::openSink(sink.uuid, opened), 0) << iscsi_host_last_error();
        return opened;
    }

    static int type(const _tag_iscsi_lun_ &lun)
    {
        norvhost::LunRow row;
        EXPECT_EQ(norvhost::loadLunByLid(lun.lid, row), 0);
        return row.record.type;
    }

    norvhost::SinkLogIn logIn() const
    {
        char key[256] = {};
        EXPECT_EQ(NORVExtentPoolRODKeyGet(key, sizeof key), 0);
        return norvhost::sinkLogIn(key, sink.uuid);
    }

    IscsiUnit unit(const iscsihost::Sink &opened) const
    {
        const norvhost::SinkLogIn log_in = logIn();
        return {"127.0.0.1:3261", opened.iqn,    opened.lun,         log_in.initiator,
                log_in.user,      log_in.secret, log_in.mutual_user, log_in.mutual_secret};
    }

    /// Sends the whole source.
    int send(const IscsiUnit &to, bool to_zeros, const std::function<int(uint64_t)> &progress = nullptr)
    {
        const norvhost::FileDescriptor from(open(norvhost::dataPath(source).c_str(), O_RDONLY | O_CLOEXEC));
        norvhost::Sending sending;
        sending.to = to;
        sending.from = from.get();
        sending.next = norvhost::fileRanges(from.get(), 0, source.size);
        sending.to_zeros = to_zeros;
        sending.progress = progress;
        return norvhost::sendRanges(sending);
    }

    _tag_iscsi_lun_ source = {}, sink = {};
};

TEST_F(SinkTest, TakesAllDataAndKeepsHoles)
{
    put(source, 0, randomText(3 * MiB, 1));
    put(source, 64 * MiB + 512, randomText(MiB + 1024, 2));
    put(source, 100 * MiB, std::string(2 * MiB, '\0'));
    put(source, source.size - 512, randomText(512, 3));
    const iscsihost::Sink opened = openSink();
    EXPECT_TRUE(opened.blank);
    EXPECT_EQ(opened.size, sink.size);
    uint64_t moved = 0;
    ASSERT_EQ(send(unit(opened), opened.blank, [&](uint64_t now) { return moved = now, 0; }), 0)
        << iscsi_host_last_error();
    EXPECT_GE(moved, 6 * MiB);
    EXPECT_LT(moved, 7 * MiB);
    EXPECT_EQ(contents(sink), contents(source));
    EXPECT_LE(allocated(norvhost::dataPath(sink)), 5 * MiB) << "zeros take no space";

    // Into a sink that holds something else: what is a hole here becomes one there.
    put(sink, 32 * MiB, randomText(8 * MiB, 4));
    put(sink, 200 * MiB, randomText(8 * MiB, 5));
    const iscsihost::Sink again = openSink();
    EXPECT_FALSE(again.blank);
    ASSERT_EQ(send(unit(again), again.blank), 0) << iscsi_host_last_error();
    EXPECT_EQ(contents(sink), contents(source));
    EXPECT_LE(allocated(norvhost::dataPath(sink)), 5 * MiB);

    EXPECT_EQ(iscsihost::closeSink(sink.uuid, again.iqn, true), 0) << iscsi_host_last_error();
    EXPECT_EQ(type(sink), NORV_LUN_TYPE_ADV);
}

TEST_F(SinkTest, OnlyItsPeerGetsIn)
{
    const iscsihost::Sink opened = openSink();
    const norvhost::SinkLogIn log_in = logIn();
    const Chap right = {log_in.user, log_in.secret, log_in.mutual_user, log_in.mutual_secret};
    const auto enters = [&](const std::string &name, const Chap &chap, int port) {
        Initiator initiator(name);
        iscsi_set_noautoreconnect(initiator.get(), 1);
        if (!chap.user.empty())
            initiator.setChap(chap);
        return initiator.logIn(opened.iqn, port) && initiator.capacity(opened.lun) == sink.size;
    };
    Chap wrong_secret = right, wrong_target = right;
    wrong_secret.secret.back() ^= 1;
    wrong_target.mutual_secret.back() ^= 1;
    for (int port : {portal_port, rw_port}) {
        EXPECT_TRUE(enters(log_in.initiator, right, port)) << port;
        EXPECT_FALSE(enters(log_in.initiator, {}, port)) << port;
        EXPECT_FALSE(enters(log_in.initiator, wrong_secret, port)) << port;
        EXPECT_FALSE(enters(log_in.initiator, wrong_target, port)) << "it proves who it is, " << port;
        EXPECT_FALSE(enters(alice, right, port)) << port;
    }
    EXPECT_TRUE(Initiator(alice).discover().empty());
    EXPECT_TRUE(Initiator(log_in.initiator).discover().empty());

    IscsiUnit refused = unit(opened);
    refused.secret = wrong_secret.secret;
    EXPECT_EQ(send(refused, true), -EACCES) << iscsi_host_last_error();
    EXPECT_EQ(std::string(iscsi_host_last_error()).find(right.secret), std::string::npos);
    refused = unit(opened);
    refused.portal = "127.0.0.1:9";
    EXPECT_EQ(send(refused, true), -ECONNREFUSED) << iscsi_host_last_error();

    EXPECT_EQ(NORViSCSILunDelete(&sink), NORV_ERR_LUN_LOCKED);
    EXPECT_EQ(iscsihost::closeSink(sink.uuid, opened.iqn, false), 0) << iscsi_host_last_error();
    EXPECT_EQ(type(sink), NORV_LUN_TYPE_SINK);
    EXPECT_FALSE(enters(log_in.initiator, right, rw_port)) << "closed";
    EXPECT_EQ(iscsihost::closeSink(sink.uuid, opened.iqn, true), NORV_ERR_NO_SUCH_TARGET);
    iscsihost::Sink none;
    EXPECT_EQ(iscsihost::openSink(source.uuid, none), NORV_ERR_LUN_TYPE);
    EXPECT_EQ(NORViSCSILunDelete(&sink), 0) << iscsi_host_last_error();
}

TEST_F(SinkTest, OpenedAnewShutsOutWhoeverWasThereBefore)
{
    put(source, 0, randomText(64 * MiB, 1));
    const iscsihost::Sink first = openSink();
    iscsihost::Sink second;
    const int err = send(unit(first), true, [&](uint64_t moved) {
        if (moved > 0 && moved < 64 * MiB && second.iqn.empty())
            second = openSink();
        return 0;
    });
    EXPECT_TRUE(second.iqn.empty() ? err == 0 : err < 0) << "it was over too soon, or it went on";
    second = openSink();
    EXPECT_EQ(send(unit(first), true), -EACCES);
    EXPECT_EQ(iscsihost::closeSink(sink.uuid, first.iqn, true), NORV_ERR_NO_SUCH_TARGET);
    EXPECT_EQ(send(unit(second), second.blank), 0) << iscsi_host_last_error();
    EXPECT_EQ(contents(sink), contents(source));
}

TEST_F(SinkTest, BecomesWritableUnderItsReaders)
{
    const _tag_iscsi_target_ target = createTarget("readers");
    map(sink, {target.tid});
    setDefault(target, NORV_AUTHORITY_READ_WRITE);
    Initiator initiator(alice);
    ASSERT_TRUE(initiator.logIn(target.iqn));
    put(source, 0, std::string(4096, 'x'));
    const iscsihost::Sink opened = openSink();
    ASSERT_EQ(send(unit(opened), opened.blank), 0) << iscsi_host_last_error();
    EXPECT_TRUE(initiator.holds(0, 'x'));
    EXPECT_FALSE(initiator.write(0, 1));
    ASSERT_EQ(iscsihost::closeSink(sink.uuid, opened.iqn, true), 0) << iscsi_host_last_error();
    EXPECT_TRUE(initiator.write(0, 1)) << initiator.error();
    EXPECT_TRUE(initiator.holds(0, 1));
}

TEST_F(SinkTest, IsClosedWithItsDaemonAndWhenNobodyComes)
{
    put(source, 0, randomText(4 * MiB, 1));
    iscsihost::Sink opened = openSink();
    killProcess(rw.processId());
    ASSERT_EQ(norvhost::startService(), 0) << iscsi_host_last_error();
    EXPECT_LT(send(unit(opened), opened.blank), 0);
    opened = openSink();
    EXPECT_EQ(send(unit(opened), opened.blank), 0) << iscsi_host_last_error();
    EXPECT_EQ(norvhost::closeAbandonedSinks(), 0) << iscsi_host_last_error();
    EXPECT_EQ(send(unit(opened), opened.blank), 0) << "too early to be closed";
    norvhost::Query past("UPDATE sinks SET seen = seen - 61");
    ASSERT_EQ(past.run(), 0);
    EXPECT_EQ(norvhost::closeAbandonedSinks(), 0) << iscsi_host_last_error();
    EXPECT_LT(send(unit(opened), opened.blank), 0);
    EXPECT_EQ(type(sink), NORV_LUN_TYPE_SINK);
}

TEST_F(SinkTest, ADaemonKilledUnderASenderEndsIt)
{
    put(source, 0, randomText(128 * MiB, 1));
    const iscsihost::Sink opened = openSink();
    setRate(slow);
    bool killed = false;
    EXPECT_EQ(send(unit(opened), opened.blank,
                   [&](uint64_t moved) {
                       if (!killed && moved > 0) {
                           kill(rw.processId(), SIGKILL);
                           killed = true;
                       }
                       return 0;
                   }),
              -ECONNRESET)
        << iscsi_host_last_error();
    ASSERT_EQ(norvhost::startService(), 0) << iscsi_host_last_error();
}

class VirtualLunTest : public SinkTest {
protected:
    void SetUp() override
    {
        SinkTest::SetUp();
        ASSERT_EQ(norvhost::localNodeId(node), 0);
        char buffer[37] = {};
        ASSERT_EQ(NORViSCSIVirtualLunCreate(source.uuid, NORV_VLUN_MODE_SEND, buffer, 0), 0) << iscsi_host_last_error();
        vlun = buffer;
    }

    /// A sender that has told its end is still giving its clone back, which keeps the volume busy.
    void TearDown() override
    {
        EXPECT_TRUE(norvhost::waitFor(hang_limit, [&] { return sender() == 0; }));
        SinkTest::TearDown();
    }

    int bind(const std::string &portal = "")
    {
        return NORViSCSIVirtualLunBindSink(vlun.c_str(), portal.c_str(), node.c_str(), sink.uuid);
    }

    _tag_viscsi_virtual_lun_stats_ stats() const
    {
        _tag_viscsi_virtual_lun_stats_ now = {};
        EXPECT_EQ(NORViSCSIVirtualLunStatsGet(vlun.c_str(), &now, 0), 0) << iscsi_host_last_error();
        EXPECT_LE(now.first, now.second);
        return now;
    }

    /// Waits until the transfer has ended.
    _tag_viscsi_virtual_lun_stats_ wait() const
    {
        _tag_viscsi_virtual_lun_stats_ now = {};
        EXPECT_TRUE(norvhost::waitFor(hang_limit,
                                      [&] {
                                          now = stats();
                                          return now.state != 0 || (now.second != 0 && now.first == now.second);
                                      }))
            << now.first << " of " << now.second;
        return now;
    }

    /// The sender's process: the one that has a file without a name open on the volume; 0 when there is none.
    pid_t sender() const
    {
        using std::filesystem::directory_iterator;
        const directory_iterator end;
        std::error_code error;
        for (const auto &process : directory_iterator("/proc"))
            // It may end while it is looked at.
            for (directory_iterator file(process.path() / "fd", error); !error && file != end; file.increment(error)) {
                std::error_code closed;
                const std::string name = std::filesystem::read_symlink(file->path(), closed);
                if (name.find(volume + "/@iSCSITrg/#") == 0)
                    return std::stoi(process.path().filename());
            }
        return 0;
    }

    std::string node, vlun;
};

TEST_F(VirtualLunTest, ClonesAndCounts)
{
    EXPECT_EQ(stats().second, 0u);
    put(source, 5 * MiB, randomText(40 * MiB, 1));
    EXPECT_EQ(NORViSCSILunDelete(&source), NORV_ERR_LUN_LOCKED);
    ASSERT_EQ(bind(), 0) << iscsi_host_last_error();
    const _tag_viscsi_virtual_lun_stats_ end = wait();
    EXPECT_EQ(end.state, 0);
    EXPECT_GE(end.second, 40 * MiB);
    EXPECT_LT(end.second, 41 * MiB);
    EXPECT_EQ(type(sink), NORV_LUN_TYPE_ADV) << "complete means that its sink is an ordinary LUN";
    EXPECT_EQ(contents(sink), contents(source));
    _tag_viscsi_virtual_lun_ record = {};
    EXPECT_EQ(NORViSCSIVirtualLunFillByUUID(vlun.c_str(), &record, 0), 0);
    EXPECT_EQ(record.src_lid, source.lid);
    EXPECT_EQ(record.kind, 1);
    EXPECT_EQ(bind(), NORV_ERR_LUN_TYPE) << "no sink any more";
    EXPECT_EQ(NORViSCSIVirtualLunRemove(vlun.c_str()), 0) << iscsi_host_last_error();
    EXPECT_EQ(NORViSCSIVirtualLunRemove(vlun.c_str()), NORV_ERR_VLUN_UUID);
    EXPECT_EQ(NORViSCSILunDelete(&source), 0) << iscsi_host_last_error();
}

TEST_F(VirtualLunTest, AnEmptyLunIsClonedToo)
{
    ASSERT_EQ(bind("127.0.0.1"), 0) << iscsi_host_last_error();
    const _tag_viscsi_virtual_lun_stats_ end = wait();
    EXPECT_EQ(end.state, 0);
    EXPECT_GT(end.second, 0u);
    EXPECT_LE(allocated(norvhost::dataPath(sink)), 64u << 10);
}

TEST_F(VirtualLunTest, RemovalStopsItAtOnceAndLeavesTheSinkClosed)
{
    put(source, 0, randomText(200 * MiB, 1));
    setRate(slow);
    ASSERT_EQ(bind(), 0) << iscsi_host_last_error();
    EXPECT_EQ(bind(), NORV_ERR_LUN_LOCKED);
    ASSERT_TRUE(norvhost::waitFor(hang_limit, [&] { return stats().first > 0; }));
    EXPECT_EQ(NORViSCSIVirtualLunRemove(vlun.c_str()), 0) << iscsi_host_last_error();
    EXPECT_EQ(sender(), 0);
    EXPECT_EQ(type(sink), NORV_LUN_TYPE_SINK);
    EXPECT_EQ(iscsihost::closeSink(sink.uuid, "", false), NORV_ERR_NO_SUCH_TARGET) << "it is closed";
    EXPECT_EQ(NORViSCSILunDelete(&sink), 0) << iscsi_host_last_error();
}

TEST_F(VirtualLunTest, AKilledSenderIsNoticedAndCanBeginAnew)
{
    put(source, 0, randomText(200 * MiB, 1));
    std::mt19937 random(testing::UnitTest::GetInstance()->random_seed());
    for (int i = 0; i < 8; ++i) {
        ASSERT_EQ(bind(), 0) << iscsi_host_last_error();
        const auto pause = std::chrono::milliseconds(random() % 200);
        const pid_t pid = sender();
        norvhost::waitFor(pause, [] { return false; });
        if (pid > 0)
            kill(pid, SIGKILL);
        const _tag_viscsi_virtual_lun_stats_ end = wait();
        EXPECT_TRUE(end.state == EPIPE || end.first == end.second) << end.state;
        if (end.state == 0)
            break; // it was faster
        EXPECT_EQ(type(sink), NORV_LUN_TYPE_SINK);
    }
    if (type(sink) == NORV_LUN_TYPE_SINK) {
        ASSERT_EQ(bind(), 0) << iscsi_host_last_error();
    }
    EXPECT_EQ(wait().state, 0);
    EXPECT_EQ(contents(sink), contents(source));
}

TEST_F(VirtualLunTest, ADaemonKilledUnderItIsItsState)
{
    put(source, 0, randomText(200 * MiB, 1));
    setRate(slow);
    ASSERT_EQ(bind(), 0) << iscsi_host_last_error();
    ASSERT_TRUE(norvhost::waitFor(hang_limit, [&] { return stats().first > 0; }));
    killProcess(rw.processId());
    EXPECT_NE(wait().state, 0);
    EXPECT_EQ(NORViSCSIVirtualLunRemove(vlun.c_str()), 0) << iscsi_host_last_error();
    EXPECT_EQ(NORViSCSILunDelete(&sink), 0)
        << "its sink is closed though the daemon is down: " << iscsi_host_last_error();
    ASSERT_EQ(norvhost::startService(), 0) << iscsi_host_last_error();
}

TEST_F(VirtualLunTest, WhatCannotBeBoundLeavesNothingBehind)
{
    EXPECT_EQ(bind("127.0.0.1:9"), 0) << "the sender finds out";
    EXPECT_EQ(wait().state, ECONNREFUSED);
    EXPECT_TRUE(norvhost::waitFor(hang_limit, [&] { return NORViSCSILunDelete(&sink) == 0; }))
        << iscsi_host_last_error();
    EXPECT_EQ(bind(), NORV_ERR_NO_SUCH_LUN);

    sink = createLun("small", 128 * MiB, NORV_LUN_TYPE_SINK);
    EXPECT_EQ(bind(), NORV_ERR_LUN_SIZE);
    EXPECT_EQ(iscsihost::closeSink(sink.uuid, "", false), NORV_ERR_NO_SUCH_TARGET);
    const char *const uuid = vlun.c_str(), *const here = node.c_str();
    EXPECT_EQ(NORViSCSIVirtualLunBindSink(uuid, "", norvhost::newUuid().c_str(), sink.uuid), NORV_ERR_NO_SUCH_NODE);
    EXPECT_EQ(NORViSCSIVirtualLunBindSink(uuid, "", here, "../../luns"), NORV_ERR_LUN_UUID);
    EXPECT_EQ(NORViSCSIVirtualLunBindSink("", "", here, sink.uuid), NORV_ERR_VLUN_UUID);
    char buffer[37] = {};
    EXPECT_EQ(NORViSCSIVirtualLunCreate(source.uuid, 1, buffer, 0), NORV_ERR_BAD_PARAMETER);
    EXPECT_EQ(NORViSCSIVirtualLunCreate(vlun.c_str(), 2, buffer, 0), NORV_ERR_NO_SUCH_LUN);
    EXPECT_STREQ(buffer, "");
}

} // namespace
} // namespace e2e
