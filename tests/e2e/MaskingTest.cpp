#include "tests/e2e/Appliance.h"
#include "tests/e2e/Initiator.h"

#include "host/target/Wait.h"
#include "platform/error.h"

#include <cstring>
#include <iscsi/scsi-lowlevel.h>
#include <tuple>

namespace e2e {
namespace {

class MaskingTest : public Appliance {
protected:
    /// How the initiator gets to the target by way of the portal, and straight to each daemon.
    struct Reach {
        bool listed, writes, reads, straight_rw, straight_ro;
        bool operator==(const Reach &other) const
        {
            return std::tie(listed, writes, reads, straight_rw, straight_ro) ==
                   std::tie(other.listed, other.writes, other.reads, other.straight_rw, other.straight_ro);
        }
    };

    static Reach reach(const std::string &name, const std::string &target)
    {
        Reach found = {};
        found.straight_rw = Initiator(name).logIn(target, rw_port);
        found.straight_ro = Initiator(name).logIn(target, ro_port);
        found.listed = Initiator(name).discover().count(target) == 1;
        Initiator session(name);
        if (session.logIn(target)) {
            found.reads = session.holds(100, 0);
            found.writes = session.write(0, 0x11);
        }
        return found;
    }

    static constexpr Reach nothing = {false, false, false, false, false};
    static constexpr Reach writing = {true, true, true, true, false};
    static constexpr Reach reading = {true, false, true, false, true};
    /// Let in by the default entry: a daemon learns of them at the portal.
    static constexpr Reach writing_by_default = {true, true, true, false, false};
    static constexpr Reach reading_by_default = {true, false, true, false, false};
};

/// Whether a session without automatic reconnecting has ended.
bool hasEnded(Initiator &session)
{
    return norvhost::waitFor(hang_limit, [&] { return session.capacity() == 0; });
}

TEST_F(MaskingTest, NamedInitiatorsGetWhatTheirEntrySaysOnEveryWayIn)
{
    const Store store = createStore();
    EXPECT_EQ(reach(alice, store.target.iqn), writing);
    EXPECT_EQ(reach(bob, store.target.iqn), reading);
    EXPECT_EQ(reach(mallory, store.target.iqn), nothing);
    mask(store.target.tid, mallory, NORV_AUTHORITY_NONE);
    EXPECT_EQ(reach(mallory, store.target.iqn), nothing);
    for (int port : {rw_port, ro_port})
        EXPECT_TRUE(Initiator(mallory).discover(port).empty());
}

TEST_F(MaskingTest, DefaultEntriesHaveExceptions)
{
    const Store store = createStore();
    const std::string guest = iqn("guest");
    mask(store.target.tid, mallory, NORV_AUTHORITY_NONE);
    setDefault(store.target, NORV_AUTHORITY_READ_WRITE);
    EXPECT_EQ(reach(guest, store.target.iqn), writing_by_default);
    EXPECT_TRUE(Initiator(guest).logIn(store.target.iqn, rw_port)) << "the portal made it known";
    EXPECT_EQ(reach(bob, store.target.iqn), reading);
    EXPECT_EQ(reach(mallory, store.target.iqn), nothing);

    setDefault(store.target, NORV_AUTHORITY_READ);
    EXPECT_EQ(reach(guest, store.target.iqn), reading_by_default);
    EXPECT_EQ(reach(alice, store.target.iqn), writing);
    EXPECT_EQ(reach(mallory, store.target.iqn), nothing);

    unmask(store.target.tid, mallory);
    unmask(store.target.tid, alice);
    EXPECT_EQ(shown(ro, store.target.tid).names, std::vector<std::string>{norvhost::any_address})
        << "nobody is excepted";
    EXPECT_EQ(reach(mallory, store.target.iqn), reading);
    mask(store.target.tid, mallory, NORV_AUTHORITY_NONE);
    EXPECT_EQ(reach(mallory, store.target.iqn), nothing);
    unmask(store.target.tid, NORV_DEFAULT_MASKING_IQN);
    EXPECT_EQ(reach(guest, store.target.iqn), nothing);
}

TEST_F(MaskingTest, LetterCaseOfANameDoesNotMatter)
{
    const Store store = createStore();
    Initiator shouting("iqn.2026-01.EXAMPLE:Alice"), reader("iqn.2026-01.example:BOB");
    ASSERT_TRUE(shouting.logIn(store.target.iqn)) << shouting.error();
    EXPECT_TRUE(shouting.write(0, 0x77));
    ASSERT_TRUE(reader.logIn(store.target.iqn)) << reader.error();
    EXPECT_FALSE(reader.write(0, 0x78));
    EXPECT_EQ(Initiator("iqn.2026-01.example:BOB").logIn(store.target.iqn, rw_port), false);
    // The entry as it was given is what is listed, and what its other spelling means.
    mask(store.target.tid, iqn("Carol"), NORV_AUTHORITY_READ);
    std::vector<_tag_struct_iscsi_acl_> entries, other(1);
    EXPECT_EQ(NORViSCSITargetMaskingGet(store.target.tid, entries), 0);
    EXPECT_EQ(entries[0].iqn, iqn("Carol"));
    other[0] = entries[0];
    setText(other[0].iqn, iqn("carol"));
    EXPECT_EQ(NORViSCSIMaskingsCreate(other), NORV_ERR_TARGET_ACL);
    EXPECT_EQ(NORViSCSIMaskingsRemove(other), 0);
}

TEST_F(MaskingTest, ALostPermissionEndsTheSession)
{
    const Store store = createStore();
    const auto session = [&](const std::string &name) {
        auto initiator = std::make_unique<Initiator>(name);
        EXPECT_TRUE(initiator->logIn(store.target.iqn)) << initiator->error();
        iscsi_set_noautoreconnect(initiator->get(), 1);
        return initiator;
    };
    auto writer = session(alice), reader = session(bob);
    mask(store.target.tid, alice, NORV_AUTHORITY_READ);
    EXPECT_TRUE(hasEnded(*writer));
    EXPECT_EQ(reach(alice, store.target.iqn), reading);
    EXPECT_EQ(reader->capacity(), store.lun.size) << "another's session stays";

    unmask(store.target.tid, bob);
    EXPECT_TRUE(hasEnded(*reader));
    setDefault(store.target, NORV_AUTHORITY_READ_WRITE);
    auto guest = session(mallory);
    setDefault(store.target, NORV_AUTHORITY_NONE);
    EXPECT_TRUE(hasEnded(*guest));
    EXPECT_EQ(reach(mallory, store.target.iqn), nothing);

    auto last = session(alice);
    EXPECT_EQ(NORViSCSITargetRemove(&store.target), 0);
    EXPECT_TRUE(hasEnded(*last));
    EXPECT_EQ(reach(alice, store.target.iqn), nothing);
}

TEST_F(MaskingTest, NoCommandWritesThroughAReadersSession)
{
    const Store store = createStore();
    Initiator writer(alice), reader(bob);
    ASSERT_TRUE(writer.logIn(store.target.iqn) && reader.logIn(store.target.iqn));
    ASSERT_TRUE(writer.write(0, 0xaa, 1, 64));
    iscsi_context *const iscsi = reader.get();
    unsigned char data[2 * block_size] = {};
    unmap_list all = {0, 64};
    scsi_task *const tasks[] = {
        iscsi_write10_sync(iscsi, 1, 0, data, block_size, block_size, 0, 0, 0, 0, 0),
        iscsi_write12_sync(iscsi, 1, 0, data, block_size, block_size, 0, 0, 0, 0, 0),
        iscsi_write16_sync(iscsi, 1, 0, data, block_size, block_size, 0, 0, 0, 0, 0),
        iscsi_writeverify10_sync(iscsi, 1, 0, data, block_size, block_size, 0, 0, 1, 0),
        iscsi_writeverify16_sync(iscsi, 1, 0, data, block_size, block_size, 0, 0, 1, 0),
        iscsi_orwrite_sync(iscsi, 1, 0, data, block_size, block_size, 0, 0, 0, 0, 0),
        iscsi_compareandwrite_sync(iscsi, 1, 0, data, 2 * block_size, block_size, 0, 0, 0, 0, 0),
        iscsi_writesame10_sync(iscsi, 1, 0, data, block_size, 64, 0, 1, 0, 0),
        iscsi_writesame16_sync(iscsi, 1, 0, data, block_size, 64, 0, 1, 0, 0),
        iscsi_unmap_sync(iscsi, 1, 0, 0, &all, 1),
    };
    for (scsi_task *task : tasks) {
        ASSERT_TRUE(task);
        EXPECT_EQ(task->status, SCSI_STATUS_CHECK_CONDITION) << "opcode " << int(task->cdb[0]);
        scsi_free_scsi_task(task);
    }
    EXPECT_TRUE(writer.holds(0, 0xaa, 1, 64));
}

TEST_F(MaskingTest, ASinkIsForReadersOnly)
{
    const _tag_iscsi_lun_ sink = createLun("sink", 16 * MiB, NORV_LUN_TYPE_SINK), plain = createLun("plain");
    const _tag_iscsi_target_ target = createTarget("both");
    map(sink, {target.tid});
    map(plain, {target.tid});
    mask(target.tid, alice, NORV_AUTHORITY_READ_WRITE);
    mask(target.tid, bob, NORV_AUTHORITY_READ);
    Initiator writer(alice), reader(bob);
    ASSERT_TRUE(writer.logIn(target.iqn) && reader.logIn(target.iqn));
    for (Initiator *initiator : {&writer, &reader}) {
        EXPECT_EQ(initiator->luns(), (std::vector<int>{1, 2}));
        EXPECT_FALSE(initiator->write(0, 1, 1));
        EXPECT_TRUE(initiator->holds(0, 0, 1));
    }
    EXPECT_TRUE(writer.write(0, 1, 2));
}

TEST_F(MaskingTest, NoMoreSessionsThanAllowed)
{
    _tag_iscsi_target_ target = request("few");
    target.max_sessions = 2;
    ASSERT_EQ(NORViSCSITargetCreate(&target), 0);
    mask(target.tid, alice, NORV_AUTHORITY_READ_WRITE);
    mask(target.tid, bob, NORV_AUTHORITY_READ);
    Initiator writer(alice), third(alice);
    {
        Initiator reader(bob);
        EXPECT_TRUE(writer.logIn(target.iqn) && reader.logIn(target.iqn));
        EXPECT_FALSE(third.logIn(target.iqn)) << "one more";
    }
    Initiator second(alice);
    EXPECT_TRUE(norvhost::waitFor(hang_limit, [&] { return second.logIn(target.iqn); })) << "places become free";
    // Past the portal nobody counts at the login, but what is too much does not last: maybe not to the login's end.
    std::unique_ptr<Initiator> straight;
    EXPECT_TRUE(norvhost::waitFor(hang_limit, [&] {
        straight = std::make_unique<Initiator>(alice);
        iscsi_set_noautoreconnect(straight->get(), 1);
        return straight->logIn(target.iqn, rw_port);
    }));
    EXPECT_TRUE(norvhost::waitFor(hang_limit, [&] { return shown(rw, target.tid).nexuses.size() == 2; }));
}

} // namespace
} // namespace e2e
