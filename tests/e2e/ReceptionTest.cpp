/// What arrives at a replication's destination.
#include "tests/e2e/Appliance.h"

#include "host/core/FileDescriptor.h"
#include "host/replication/Roles.h"
#include "host/replication/TaskStore.h"
#include "host/services/Identity.h"
#include "host/state/Database.h"
#include "host/storage/LunStore.h"
#include "host/storage/MapFile.h"
#include "host/storage/SnapshotStore.h"
#include "host/storage/Versions.h"
#include "iscsihost/replication.h"
#include "platform/error.h"

#include <fcntl.h>
#include <unistd.h>

namespace e2e {
namespace {

using iscsihost::Holding;
using iscsihost::Reception;

const std::string none, first = "11111111-0000-4000-8000-000000000000", second = "22222222-0000-4000-8000-000000000000";
const std::string task_uuid = "aaaaaaaa-0000-4000-8000-000000000000";

class ReceptionTest : public Appliance {
protected:
    void SetUp() override
    {
        Appliance::SetUp();
        ASSERT_EQ(norvhost::makeIdentity(), 0) << iscsi_host_last_error();
        useXfs(1000 * MiB);
        lun = createLun("copy", 64 * MiB, NORV_LUN_TYPE_SINK);
        norvhost::TaskRow task;
        setText(task.record.uuid, task_uuid);
        setText(task.record.src_lun_uuid, "bbbbbbbb-0000-4000-8000-000000000000");
        setText(task.record.dst_lun_uuid, lun.uuid);
        ASSERT_EQ(norvhost::insertTask(task), 0) << iscsi_host_last_error();
    }

    Reception begin(const std::string &version, const std::string &base)
    {
        Reception reception;
        EXPECT_EQ(iscsihost::beginReception(task_uuid, {version, base, "of " + version.substr(0, 1)}, reception), 0)
            << iscsi_host_last_error();
        return reception;
    }

    void end(const std::string &version, const Reception &reception)
    {
        EXPECT_EQ(iscsihost::endReception(task_uuid, version, reception.sink.iqn, MiB), 0) << iscsi_host_last_error();
    }

    void put(char byte) const
    {
        const norvhost::FileDescriptor file(open(path().c_str(), O_WRONLY | O_CLOEXEC));
        const std::string data(MiB, byte);
        EXPECT_EQ(pwrite(file.get(), data.data(), data.size(), 0), static_cast<ssize_t>(data.size()));
        EXPECT_EQ(fsync(file.get()), 0);
    }

    char firstByte() const
    {
        const norvhost::FileDescriptor file(open(path().c_str(), O_RDONLY | O_CLOEXEC));
        char byte = '?';
        EXPECT_EQ(pread(file.get(), &byte, 1, 0), 1);
        return byte;
    }

    std::string path() const { return norvhost::dataPath(lun); }

    norvhost::Versions versions() const
    {
        norvhost::Versions found;
        EXPECT_EQ(norvhost::readVersions(path(), found), 0);
        return found;
    }

    /// What arrives first, whole.
    void receiveFirst()
    {
        const Reception reception = begin(first, none);
        EXPECT_EQ(reception.holding, Holding::zeros);
        put('1');
        end(first, reception);
    }

    _tag_iscsi_lun_ lun = {};
};

TEST_F(ReceptionTest, AnEndThatNobodyHeardIsNoReasonToSendItAgain)
{
    receiveFirst();
    for (const char *what : {"begun again", "and once more"}) {
        SCOPED_TRACE(what);
        const Reception again = begin(first, none);
        EXPECT_EQ(again.offset, lun.size);
        EXPECT_TRUE(norvhost::isSynchronised(versions())) << "nothing was taken away";
        end(first, again);
        EXPECT_EQ(iscsihost::endReception(task_uuid, first, again.sink.iqn, MiB), 0) << "told twice";
    }
    EXPECT_EQ(versions().base, first);
    EXPECT_EQ(firstByte(), '1');
}

TEST_F(ReceptionTest, TheStateBeforeStaysUntilTheNextIsWhole)
{
    receiveFirst(); // and whoever sent it died before it had the snapshot taken
    const Reception reception = begin(second, first);
    EXPECT_EQ(reception.holding, Holding::base);
    std::vector<norvhost::SnapshotRow> snapshots;
    ASSERT_EQ(norvhost::loadSnapshotsOfLun(lun.lid, snapshots), 0);
    ASSERT_EQ(snapshots.size(), 1U);
    EXPECT_EQ(snapshots.front().record.version, first);
    EXPECT_STREQ(snapshots.front().record.name, "of 1");

    put('2');
    ASSERT_EQ(iscsihost::breakReception(task_uuid), 0) << iscsi_host_last_error();
    EXPECT_EQ(NORViSCSISnapshotDelete(&snapshots.front().record, "test"), NORV_ERR_SNAPSHOT_LOCKED);
    norvhost::TaskRow task;
    ASSERT_EQ(norvhost::loadTask(task_uuid, task), 0);
    ASSERT_EQ(norvhost::becomeSource(task), 0) << iscsi_host_last_error();
    EXPECT_EQ(firstByte(), '1');
    EXPECT_EQ(versions().current, first);
}

TEST_F(ReceptionTest, GoesOnFromWhereItsOwnSenderSaidAndNoOther)
{
    const Reception early = begin(first, none);
    put('1');
    ASSERT_EQ(iscsihost::noteReception(task_uuid, first, early.sink.iqn, MiB, MiB, 2 * MiB), 0);
    const Reception late = begin(first, none);
    EXPECT_EQ(late.offset, MiB);
    EXPECT_EQ(late.holding, Holding::zeros);
    EXPECT_EQ(iscsihost::noteReception(task_uuid, first, early.sink.iqn, 2 * MiB, 2 * MiB, 2 * MiB),
              NORV_ERR_NO_SUCH_TARGET);
    EXPECT_EQ(iscsihost::endReception(task_uuid, first, early.sink.iqn, 2 * MiB), NORV_ERR_NO_SUCH_TARGET);
    EXPECT_EQ(begin(first, none).offset, MiB);
}

TEST_F(ReceptionTest, DataWithoutAVersionAreNoZeros)
{
    put('x');
    EXPECT_EQ(begin(first, none).holding, Holding::unknown);
}

TEST_F(ReceptionTest, AVersionThatIsNoneDoesNotGetIntoTheFile)
{
    receiveFirst();
    Reception reception;
    EXPECT_EQ(iscsihost::beginReception(task_uuid, {std::string(36, ' '), first, "blank"}, reception),
              NORV_ERR_SENDING_SNAPSHOT);
    EXPECT_EQ(versions().current, first);
}

TEST_F(ReceptionTest, ALunThatIsNoSinkAnyMoreIsLeftAlone)
{
    receiveFirst();
    norvhost::LunRow row;
    ASSERT_EQ(norvhost::loadLunByLid(lun.lid, row), 0);
    ASSERT_EQ(norvhost::releaseSink(row), 0) << iscsi_host_last_error(); // a removal that was killed goes no further
    put('y');                                                            // by an initiator
    Reception reception;
    EXPECT_EQ(iscsihost::beginReception(task_uuid, {second, first, "second"}, reception), NORV_ERR_LUN_TYPE);
    EXPECT_EQ(iscsihost::breakReception(task_uuid), NORV_ERR_LUN_TYPE);
    EXPECT_EQ(firstByte(), 'y');
}

} // namespace
} // namespace e2e
