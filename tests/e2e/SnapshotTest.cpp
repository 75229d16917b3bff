/// Snapshots of a LUN that initiators use.
#include "tests/e2e/Appliance.h"
#include "tests/e2e/Initiator.h"

#include "host/storage/LunStore.h"
#include "host/storage/MapFile.h"
#include "host/target/Service.h"
#include "host/target/Wait.h"
#include "iscsihost/host.h"
#include "platform/iscsi_snapshot.h"

#include <atomic>
#include <csignal>
#include <cstring>
#include <fcntl.h>
#include <iscsi/scsi-lowlevel.h>
#include <thread>
#include <unistd.h>

namespace e2e {
namespace {

/// Writes ascending numbers, each to the first block and, when that was acknowledged, to the last one: by these one
/// sees of which time a copy of its LUN is.
class OrderedWriter {
public:
    OrderedWriter(const std::string &target, uint64_t size) : initiator(alice), last_block(size / block_size - 1)
    {
        iscsi_set_noautoreconnect(initiator.get(), 1);
        connected = initiator.logIn(target);
        thread = std::thread([this] {
            while (connected && !stopping && !failed && write(0, number + 1) && write(last_block, number + 1))
                ++number;
        });
    }
    ~OrderedWriter()
    {
        stopping = true;
        thread.join();
    }

    std::atomic<bool> connected{false}, failed{false};
    std::atomic<uint64_t> number{0};

private:
    bool write(uint64_t block, uint64_t value)
    {
        unsigned char data[block_size] = {};
        memcpy(data, &value, sizeof value);
        scsi_task *const task =
            iscsi_write16_sync(initiator.get(), 1, block, data, sizeof data, block_size, 0, 0, 0, 0, 0);
        failed = !task || task->status != SCSI_STATUS_GOOD;
        if (task)
            scsi_free_scsi_task(task);
        return !failed;
    }

    Initiator initiator;
    const uint64_t last_block;
    std::atomic<bool> stopping{false};
    std::thread thread;
};

/// The number that such a writer left at a place of the LUN's file.
uint64_t numberAt(const std::string &path, uint64_t at)
{
    uint64_t number = 0;
    const int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
    EXPECT_EQ(pread(fd, &number, sizeof number, static_cast<off_t>(at)), static_cast<ssize_t>(sizeof number));
    close(fd);
    return number;
}

class SnapshotTest : public Appliance {
protected:
    void SetUp() override
    {
        Appliance::SetUp();
        useXfs(300 * MiB);
        store = createStore(64 * MiB, NORV_LUN_TYPE_ADV);
    }

    _tag_iscsi_snapshot_ take(const std::string &name)
    {
        _tag_iscsi_snapshot_ snapshot = {};
        snprintf(snapshot.name, sizeof snapshot.name, "%s", name.c_str());
        EXPECT_EQ(NORViSCSISnapshotCreate(&store.lun, &snapshot), 0) << iscsi_host_last_error();
        return snapshot;
    }

    /// One extent for each 32 KiB: a clone takes milliseconds, in which a writer could slip.
    void scatter()
    {
        const int fd = open(norvhost::dataPath(store.lun).c_str(), O_WRONLY | O_CLOEXEC);
        const std::string block(4096, 's');
        for (uint64_t at = 32768; at < store.lun.size - MiB; at += 32768)
            ASSERT_EQ(pwrite(fd, block.data(), block.size(), static_cast<off_t>(at)), ssize_t{4096});
        close(fd);
    }

    Store store = {};
};

TEST_F(SnapshotTest, NeverHoldsALaterWriteWithoutTheEarlierOne)
{
    scatter();
    OrderedWriter writer(store.target.iqn, store.lun.size);
    ASSERT_TRUE(writer.connected);
    uint64_t before = 0;
    for (int i = 0; i < 60; ++i) {
        EXPECT_TRUE(norvhost::waitFor(hang_limit, [&] { return writer.number > before; })) << "the writer stands still";
        const uint64_t acknowledged = writer.number;
        const _tag_iscsi_snapshot_ snapshot = take("s" + std::to_string(i));
        const std::string path = norvhost::snapshotDataPath(snapshot);
        const uint64_t first = numberAt(path, 0), second = numberAt(path, store.lun.size - block_size);
        EXPECT_TRUE(first == second || first == second + 1) << first << " and " << second;
        EXPECT_GE(second, acknowledged) << "an acknowledged write is missing";
        EXPECT_LE(before, second);
        before = second;
        EXPECT_EQ(NORViSCSISnapshotDelete(&snapshot, "test"), 0) << iscsi_host_last_error();
    }
    EXPECT_FALSE(writer.failed) << "the initiator saw a failure";
}

TEST_F(SnapshotTest, RestoresUnderASession)
{
    Initiator writer(alice), reader(bob);
    ASSERT_TRUE(writer.logIn(store.target.iqn) && reader.logIn(store.target.iqn));
    ASSERT_TRUE(writer.write(0, 0x11) && writer.write(100000, 0x11));
    const _tag_iscsi_snapshot_ snapshot = take("s");
    ASSERT_TRUE(writer.write(0, 0x22) && writer.write(50000, 0x22));
    ASSERT_TRUE(reader.holds(0, 0x22));
    ASSERT_EQ(NORViSCSISnapshotRestore(&snapshot, &store.lun), 0) << iscsi_host_last_error();
    for (Initiator *session : {&writer, &reader})
        EXPECT_TRUE(session->holds(0, 0x11) && session->holds(50000, 0) && session->holds(100000, 0x11))
            << session->error();
    EXPECT_TRUE(writer.write(0, 0x33)) << writer.error();
    EXPECT_TRUE(reader.holds(0, 0x33));
}

TEST_F(SnapshotTest, TheSupervisorCompletesARestoreThatWasCutShort)
{
    Initiator writer(alice);
    ASSERT_TRUE(writer.logIn(store.target.iqn) && writer.write(0, 0x11));
    const _tag_iscsi_snapshot_ snapshot = take("s");
    ASSERT_TRUE(writer.write(0, 0x22));
    ASSERT_EQ(norvhost::markRestore(store.lun.lid, snapshot.uuid), 0);
    ASSERT_TRUE(writer.holds(0, 0x22)) << "the service itself looks for nothing";
    const pid_t supervisor = inChild([] { return norvhost::superviseService(); });
    EXPECT_TRUE(norvhost::waitFor(hang_limit, [&] { return writer.holds(0, 0x11); }));
    kill(supervisor, SIGTERM);
    EXPECT_EQ(waitForChild(supervisor), 0);
}

TEST_F(SnapshotTest, ALoadedOneIsAReadOnlyUnitUntilItIsUnloaded)
{
    constexpr int number = 128;
    const auto logIn = [&](Initiator &initiator) { return initiator.logIn(store.target.iqn); };
    Initiator writer(alice);
    ASSERT_TRUE(logIn(writer) && writer.write(0, 0x11));
    const _tag_iscsi_snapshot_ snapshot = take("s"), other = take("t");
    ASSERT_TRUE(writer.write(0, 0x22));
    ASSERT_EQ(NORViSCSISnapshotLoad(&snapshot), 0) << iscsi_host_last_error();
    ASSERT_EQ(NORViSCSISnapshotLoad(&snapshot), 0) << "loading again changes nothing";
    ASSERT_EQ(NORViSCSISnapshotLoad(&other), 0) << iscsi_host_last_error();

    const auto expectShown = [&](const std::string &name) {
        Initiator initiator(name);
        ASSERT_TRUE(logIn(initiator));
        EXPECT_EQ(initiator.luns(), (std::vector<int>{1, number, number + 1}));
        EXPECT_EQ(initiator.capacity(number), store.lun.size);
        EXPECT_TRUE(initiator.holds(0, 0x11, number));
        EXPECT_TRUE(initiator.holds(0, 0x22, 1));
        EXPECT_FALSE(initiator.write(0, 0x33, number));
        EXPECT_NE(initiator.serial(number).find(snapshot.uuid), std::string::npos);
        EXPECT_NE(initiator.identification(number), initiator.identification(1));
    };
    expectShown(alice);
    expectShown(bob);

    killProcess(rw.processId());
    ASSERT_EQ(norvhost::startService(), 0) << iscsi_host_last_error();
    expectShown(alice);

    // A second target of the LUN shows it under the same number.
    const _tag_iscsi_target_ second = createTarget("second");
    map(store.lun, {second.tid});
    mask(second.tid, alice, NORV_AUTHORITY_READ_WRITE);
    Initiator elsewhere(alice);
    ASSERT_TRUE(elsewhere.logIn(second.iqn));
    EXPECT_TRUE(elsewhere.holds(0, 0x11, number));

    ASSERT_EQ(NORViSCSISnapshotUnload(&snapshot), 0) << iscsi_host_last_error();
    EXPECT_EQ(elsewhere.luns(), (std::vector<int>{1, number + 1}));
    ASSERT_EQ(NORViSCSISnapshotDelete(&other, "test"), 0) << iscsi_host_last_error();
    EXPECT_EQ(elsewhere.luns(), std::vector<int>{1});
    ASSERT_EQ(NORViSCSISnapshotLoad(&snapshot), 0);
    EXPECT_EQ(unmap(store.lun, {second.tid}), 0);
    EXPECT_TRUE(elsewhere.luns().empty());
}

} // namespace
} // namespace e2e
