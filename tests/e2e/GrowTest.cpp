#include "tests/e2e/Appliance.h"
#include "tests/e2e/Initiator.h"

#include "host/target/Wait.h"
#include "iscsihost/host.h"

#include <atomic>
#include <csignal>
#include <iscsi/scsi-lowlevel.h>
#include <poll.h>
#include <random>
#include <thread>
#include <unistd.h>

namespace e2e {
namespace {

constexpr int in_flight = 32;
constexpr uint32_t request_blocks = 128;
constexpr int slots = 128; ///< requests that fit into the smallest LUN

/// Writes, flushes and reads in random order with many commands under way, and compares what it reads with what it
/// wrote. One command of each slot at a time; without automatic reconnecting, so that a broken connection is a failure.
class Load {
public:
    Load(const std::string &name, const std::string &target) : initiator(name)
    {
        iscsi_set_noautoreconnect(initiator.get(), 1);
        connected = initiator.logIn(target);
    }

    bool isConnected() const { return connected; }
    void start()
    {
        thread = std::thread([this] { run(); });
    }
    void stop()
    {
        stopping = true;
        thread.join();
    }

    std::atomic<uint64_t> done{0};
    std::atomic<int> failures{0};
    std::string first_failure;

private:
    struct Slot {
        Load *load;
        int number;
        bool busy = false;
        enum {
            write,
            read,
            flush
        } action = write;
        uint32_t stamp = 0; ///< what its blocks hold, 0 = never written
        std::vector<uint32_t> data = std::vector<uint32_t>(size_t{request_blocks} * block_size / sizeof(uint32_t));
    };

    void failed(const std::string &what)
    {
        if (failures++ == 0)
            first_failure = what;
    }

    void send(Slot &slot)
    {
        iscsi_context *const iscsi = initiator.get();
        const uint64_t block = static_cast<uint64_t>(slot.number) * request_blocks;
        const auto size = static_cast<uint32_t>(slot.data.size() * sizeof(uint32_t));
        const unsigned dice = random() % 16;
        scsi_task *task;
        if (dice == 0) {
            slot.action = Slot::flush;
            task = iscsi_synchronizecache10_task(iscsi, 1, 0, 0, 0, 0, completed, &slot);
        } else if (dice < 6 && slot.stamp) {
            slot.action = Slot::read;
            task = iscsi_read16_task(iscsi, 1, block, size, block_size, 0, 0, 0, 0, 0, completed, &slot);
        } else {
            slot.action = Slot::write;
            slot.stamp = static_cast<uint32_t>(random()) | 1;
            for (uint32_t &word : slot.data)
                word = slot.stamp;
            task = iscsi_write16_task(iscsi, 1, block, reinterpret_cast<unsigned char *>(slot.data.data()), size,
                                      block_size, 0, 0, 0, 0, 0, completed, &slot);
        }
        slot.busy = task != nullptr;
        busy += slot.busy;
        if (!task)
            failed("cannot send: " + initiator.error());
    }

    static void completed(iscsi_context *, int status, void *data, void *context)
    {
        Slot &slot = *static_cast<Slot *>(context);
        Load &load = *slot.load;
        scsi_task *const task = static_cast<scsi_task *>(data);
        slot.busy = false;
        --load.busy;
        ++load.done;
        if (status != SCSI_STATUS_GOOD) {
            load.failed("status " + std::to_string(status) + ", sense key " +
                        std::to_string(task ? task->sense.key : -1) + ": " + load.initiator.error());
        } else if (slot.action == Slot::read) {
            const auto *words = reinterpret_cast<const uint32_t *>(task->datain.data);
            for (size_t i = 0; i < slot.data.size(); ++i)
                if (words[i] != slot.stamp) {
                    load.failed("read back something else than was written");
                    break;
                }
        }
        scsi_free_scsi_task(task);
    }

    void run()
    {
        for (int i = 0; i < slots; ++i) {
            all[static_cast<size_t>(i)].load = this;
            all[static_cast<size_t>(i)].number = i;
        }
        while (failures == 0 && (!stopping || busy > 0)) {
            while (!stopping && failures == 0 && busy < in_flight) {
                Slot &slot = all[random() % slots];
                if (!slot.busy)
                    send(slot);
            }
            pollfd event = {iscsi_get_fd(initiator.get()), static_cast<short>(iscsi_which_events(initiator.get())), 0};
            if (poll(&event, 1, 60000) <= 0 || iscsi_service(initiator.get(), event.revents) != 0) {
                failed("the connection broke: " + initiator.error());
                break;
            }
        }
    }

    std::vector<Slot> all = std::vector<Slot>(slots); ///< outlives the session, which tells them its end
    Initiator initiator;
    bool connected = false;
    std::thread thread;
    std::atomic<bool> stopping{false};
    int busy = 0;
    std::mt19937 random{20260101};
};

class GrowTest : public Appliance {};

TEST_F(GrowTest, AMappedLunGrowsUnderLoad)
{
    const Store store = createStore();
    const _tag_iscsi_target_ second = createTarget("second");
    map(store.lun, {second.tid});
    mask(second.tid, alice, NORV_AUTHORITY_READ_WRITE);

    Load load(alice, store.target.iqn), other(alice, second.iqn);
    ASSERT_TRUE(load.isConnected() && other.isConnected());
    Initiator watcher(bob);
    ASSERT_TRUE(watcher.logIn(store.target.iqn));
    load.start();
    uint64_t size = store.lun.size, done = 0;
    for (int i = 0; i < 24; ++i) {
        size += 1 * MiB + 512;
        EXPECT_EQ(grow(store.lun, size), 0) << iscsi_host_last_error();
        EXPECT_EQ(watcher.capacity(), size);
        done = load.done;
        EXPECT_TRUE(norvhost::waitFor(hang_limit, [&] { return load.done > done + in_flight; }))
            << "the load stands still";
    }
    load.stop();
    EXPECT_EQ(load.failures, 0) << load.first_failure;
    Initiator after(alice);
    ASSERT_TRUE(after.logIn(second.iqn));
    EXPECT_EQ(after.capacity(), size);
    EXPECT_EQ(shown(rw, store.target.tid).names, std::vector<std::string>{alice}) << "a name of ours was left";
}

TEST_F(GrowTest, AKilledGrowNeitherFailsNorHoldsUpTheLoad)
{
    const Store store = createStore();
    Load load(alice, store.target.iqn);
    ASSERT_TRUE(load.isConnected());
    load.start();
    std::mt19937 random(3);
    uint64_t size = store.lun.size;
    for (int i = 0; i < 15; ++i) {
        size += 2 * MiB;
        const pid_t child = inChild([&] { return grow(store.lun, size); });
        // Not a wait for anything: the moment of the kill is meant to be any.
        usleep(static_cast<useconds_t>(random() % 120000));
        kill(child, SIGKILL);
        waitForChild(child);
        const uint64_t done = load.done;
        EXPECT_TRUE(norvhost::waitFor(hang_limit, [&] { return load.done > done + in_flight; }))
            << "the load stands still";
        // A repeated command mends what the killed one left, as a further one does.
        if (i % 2)
            size += 2 * MiB;
        EXPECT_EQ(grow(store.lun, size), 0) << iscsi_host_last_error();
    }
    load.stop();
    EXPECT_EQ(load.failures, 0) << load.first_failure;
    Initiator after(alice);
    ASSERT_TRUE(after.logIn(store.target.iqn));
    EXPECT_EQ(after.capacity(), size);
}

TEST_F(GrowTest, ALunUnderLoadCanBeTakenAway)
{
    const Store store = createStore();
    for (const auto &take : std::vector<std::function<int()>>{
             [&] { return unmap(store.lun, {store.target.tid}); },
             [&] { return NORViSCSITargetRemove(&store.target); },
         }) {
        Load load(alice, store.target.iqn);
        ASSERT_TRUE(load.isConnected());
        load.start();
        EXPECT_TRUE(norvhost::waitFor(hang_limit, [&] { return load.done > 100; }));
        EXPECT_EQ(take(), 0) << iscsi_host_last_error();
        EXPECT_TRUE(norvhost::waitFor(hang_limit, [&] { return load.failures > 0; }));
        load.stop();
        EXPECT_TRUE(shown(rw, store.target.tid).units.empty());
        if (shown(rw, store.target.tid).tid)
            map(store.lun, {store.target.tid});
    }
}

} // namespace
} // namespace e2e
