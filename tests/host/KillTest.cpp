/// What a kill at any moment leaves: a whole LUN or none, no lock, nothing that the next command or the sweep does
/// not put right.
#include "HostTest.h"
#include "KillAt.h"

#include "host/state/Database.h"

#include <chrono>
#include <cstdio>
#include <poll.h>
#include <random>
#include <unistd.h>

namespace norvhost {
namespace {

struct KillTest : HostTest {
    const StateKeeper keeper;

    void killEverywhere(const std::function<void()> &prepare, const std::function<int()> &work)
    {
        killAtEverySystemCall(20, prepare, work, [this] { expectNextCommandsWork(); });
    }

    void expectNextCommandsWork()
    {
        iscsihost::SweepReport report;
        ASSERT_EQ(0, iscsihost::sweep(report)) << iscsi_host_last_error();
        EXPECT_TRUE(report.failed.empty());
        EXPECT_TRUE(report.foreign.empty());
        expectConsistent();

        std::vector<_tag_iscsi_lun_> luns;
        ASSERT_EQ(0, forEachLun([&](const LunRow &row) { luns.push_back(row.record); }));
        for (_tag_iscsi_lun_ &lun : luns)
            EXPECT_EQ(0, NORViSCSILunDelete(&lun)) << iscsi_host_last_error();
        EXPECT_TRUE(files().empty());
    }
};

TEST_F(KillTest, CreationKilledAtEverySystemCall)
{
    killEverywhere([] {},
                   [this] {
                       _tag_iscsi_lun_ lun = wanted("a", NORV_LUN_TYPE_FILE, MiB);
                       return NORViSCSILunCreate(&lun);
                   });
}

TEST_F(KillTest, DeletionKilledAtEverySystemCall)
{
    _tag_iscsi_lun_ lun;
    killEverywhere([&] { lun = create("a"); }, [&] { return NORViSCSILunDelete(&lun); });
}

TEST_F(KillTest, RenameWithGrowthKilledAtEverySystemCall)
{
    _tag_iscsi_lun_ lun;
    killEverywhere([&] { lun = create("a", NORV_LUN_TYPE_FILE); }, [&] { return update(lun, "b", 5 * MiB); });
}

TEST_F(KillTest, MoveToTheTrashKilledAtEverySystemCall)
{
    _tag_iscsi_lun_ lun;
    killEverywhere(
        [&] {
            lun = create("a", NORV_LUN_TYPE_ADV);
            lun.options = NORV_LUN_OPTION_TRASH;
        },
        [&] { return NORViSCSILunUnload(&lun); });
}

/// Several workers at once, killed whenever it comes.
TEST_F(KillTest, RandomKillsOfManyWorkers)
{
    std::mt19937 random(std::random_device{}());
    const auto act = [this](const std::string &name, int i) {
        _tag_iscsi_lun_ lun = wanted(name, i % 2 ? NORV_LUN_TYPE_ADV : NORV_LUN_TYPE_FILE, MiB);
        if (int err = NORViSCSILunCreate(&lun))
            return err;
        if (int err = update(lun, name + "-renamed", 2 * MiB))
            return err;
        lun.options = NORV_LUN_OPTION_TRASH;
        if (int err = NORViSCSILunUnload(&lun))
            return err;
        return i % 3 ? NORViSCSILunDelete(&lun) : 0;
    };
    const auto busy = [&](int worker) {
        for (int i = 0;; ++i) {
            const std::string name = "lun-" + std::to_string(worker) + "-" + std::to_string(i);
            if (int err = act(name, i)) {
                fprintf(stderr, "%s: %d: %s\n", name.c_str(), err, iscsi_host_last_error());
                return 1;
            }
        }
    };
    for (int round = 0; round < 50 && !HasFailure(); ++round) {
        std::vector<pid_t> workers;
        closeDatabase();
        for (int worker = 0; worker < 2; ++worker)
            workers.push_back(inChild([&] { return busy(worker); }));
        for (pid_t worker : workers) {
            poll(nullptr, 0, static_cast<int>(random() % 20));
            kill(worker, SIGKILL);
            EXPECT_EQ(128 + SIGKILL, waitForChild(worker)) << "a worker failed before it was killed";
        }
        SCOPED_TRACE("round " + std::to_string(round));
        expectNextCommandsWork();
    }
}

} // namespace
} // namespace norvhost
