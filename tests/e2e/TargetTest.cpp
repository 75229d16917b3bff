#include "tests/e2e/Appliance.h"
#include "tests/e2e/Initiator.h"

#include "host/core/Lock.h"
#include "host/core/Process.h"
#include "host/target/Service.h"
#include "host/target/Wait.h"
#include "iscsihost/host.h"
#include "platform/error.h"
#include "platform/iscsi_config.h"

#include <algorithm>
#include <cstring>
#include <map>

namespace e2e {
namespace {

using namespace std::chrono_literals;

class TargetTest : public Appliance {
protected:
    static _tag_iscsi_target_ withChap(const std::string &name, const Chap &chap)
    {
        _tag_iscsi_target_ target = request(name);
        target.auth_type = chap.mutual_user.empty() ? NORV_TARGET_AUTH_CHAP : NORV_TARGET_AUTH_MUTUAL_CHAP;
        setText(target.user, chap.user);
        setText(target.password, chap.secret);
        setText(target.mutual_user, chap.mutual_user);
        setText(target.mutual_password, chap.mutual_secret);
        return target;
    }

    static bool logsIn(const std::string &target, const Chap *chap)
    {
        Initiator initiator(alice);
        if (chap)
            initiator.setChap(*chap);
        return initiator.logIn(target);
    }

    static int count(const std::string &folder, const std::string &text)
    {
        norvhost::ProgramResult result;
        EXPECT_EQ(norvhost::runProgram({{"grep", "-rlF", "--", text, folder}, {}, 10}, result), 0);
        return static_cast<int>(std::count(result.output.begin(), result.output.end(), '\n'));
    }
};

TEST_F(TargetTest, ChapInOneAndBothDirections)
{
    const Chap good = {"user", "secret-of-user", "", ""}, wrong = {"user", "another-secret", "", ""};
    const Chap mutual = {"user2", "secret-of-user2", "target", "secret-of-target"};
    const Chap liar = {"user2", "secret-of-user2", "target", "secret-of-nobody"};
    _tag_iscsi_target_ one = withChap("one", good), both = withChap("both", mutual);
    for (_tag_iscsi_target_ *target : {&one, &both}) {
        ASSERT_EQ(NORViSCSITargetCreate(target), 0) << iscsi_host_last_error();
        setDefault(*target, NORV_AUTHORITY_READ_WRITE);
    }
    EXPECT_TRUE(logsIn(one.iqn, &good));
    EXPECT_FALSE(logsIn(one.iqn, &wrong));
    EXPECT_FALSE(logsIn(one.iqn, nullptr));
    EXPECT_FALSE(logsIn(one.iqn, &mutual)) << "another target's user";
    EXPECT_TRUE(logsIn(both.iqn, &mutual));
    EXPECT_FALSE(logsIn(both.iqn, &liar)) << "the target does not prove itself";

    // A LUN of a target with CHAP grows too: our own session has to log in there.
    const _tag_iscsi_lun_ lun = createLun("lun");
    map(lun, {one.tid, both.tid});
    EXPECT_EQ(grow(lun, 32 * MiB), 0) << iscsi_host_last_error();
    Initiator initiator(alice);
    initiator.setChap(mutual);
    ASSERT_TRUE(initiator.logIn(both.iqn));
    EXPECT_EQ(initiator.capacity(), 32 * MiB);

    EXPECT_EQ(count(root + "/run", "secret-of"), 0) << "a secret in a message";
    // The user's next secret is valid at once, and only it.
    EXPECT_EQ(NORViSCSITargetRemove(&one), 0);
    one = withChap("one", wrong);
    ASSERT_EQ(NORViSCSITargetCreate(&one), 0) << iscsi_host_last_error();
    setDefault(one, NORV_AUTHORITY_READ_WRITE);
    EXPECT_TRUE(logsIn(one.iqn, &wrong));
    EXPECT_FALSE(logsIn(one.iqn, &good));
}

TEST_F(TargetTest, BadRequestsAreRefusedByFieldAndChangeNothing)
{
    const Chap chap = {"user", "secret-of-user", "target", "secret-of-target"};
    _tag_iscsi_target_ first = withChap("first", chap);
    ASSERT_EQ(NORViSCSITargetCreate(&first), 0);
    using Change = std::function<void(_tag_iscsi_target_ &)>;
    const auto text = [](auto field, const std::string &value) -> Change {
        return [=](_tag_iscsi_target_ &target) { setText(target.*field, value); };
    };
    const auto iqnIs = [&](const std::string &value) { return text(&_tag_iscsi_target_::iqn, value); };
    const std::string long_name = "iqn.2026-01.example:" + std::string(223 - 20, 'x');
    const struct {
        int code;
        Change change;
    } bad[] = {
        {NORV_ERR_TARGET_NAME, text(&_tag_iscsi_target_::name, "a/b")},
        {NORV_ERR_TARGET_IQN, iqnIs("iqn.2026-01.example:FIRST")},
        {NORV_ERR_TARGET_IQN, iqnIs("iqn.2026-01.example:a\nTarget 7: x")},
        {NORV_ERR_TARGET_IQN, iqnIs(long_name + "x")},
        {NORV_ERR_TARGET_MAX_SESSIONS, [](auto &t) { t.max_sessions = 65536; }},
        {NORV_ERR_BAD_PARAMETER, [](auto &t) { t.max_recv_seg_bytes = 511; }},
        {NORV_ERR_BAD_PARAMETER, [](auto &t) { t.max_send_seg_bytes = 1 << 24; }},
        {NORV_ERR_TARGET_USER, [](auto &t) { setText(t.user, ""); }},
        {NORV_ERR_TARGET_USER, [](auto &t) { setText(t.user, "a,password=b"); }},
        {NORV_ERR_TARGET_MUTUAL_USER, [](auto &t) { setText(t.user, "target"); }},
        {NORV_ERR_TARGET_PASSWORD, [](auto &t) { setText(t.password, "eleven-char"); }},
        {NORV_ERR_TARGET_PASSWORD, [](auto &t) { setText(t.password, "with a space in it"); }},
        {NORV_ERR_TARGET_USER, [](auto &t) { setText(t.password, "another-secret"); }},
        {NORV_ERR_TARGET_MUTUAL_USER, [](auto &t) { setText(t.mutual_user, "user"); }},
        {NORV_ERR_TARGET_MUTUAL_PASSWORD, [](auto &t) { setText(t.mutual_password, "secret-of-user"); }},
        {NORV_ERR_TARGET_MUTUAL_PASSWORD, [](auto &t) { setText(t.mutual_password, ""); }},
        {NORV_ERR_TARGET_MUTUAL_USER, [](auto &t) { setText(t.mutual_password, "another-secret"); }},
        {NORV_ERR_BAD_PARAMETER, [](auto &t) { memset(t.password, 'x', sizeof t.password); }},
    };
    for (const auto &entry : bad) {
        _tag_iscsi_target_ target = withChap("second", chap);
        entry.change(target);
        const std::string iqn_given = target.iqn;
        EXPECT_EQ(NORViSCSITargetCreate(&target), entry.code) << &entry - bad << ": " << iscsi_host_last_error();
        EXPECT_EQ(target.iqn, iqn_given);
        EXPECT_EQ(target.tid, 0);
        EXPECT_EQ(std::string(iscsi_host_last_error()).find("secret-"), std::string::npos);
    }
    EXPECT_TRUE(shown(rw, 2).iqn.empty());

    _tag_iscsi_target_ longest = request("longest");
    setText(longest.iqn, long_name);
    EXPECT_EQ(NORViSCSITargetCreate(&longest), 0) << iscsi_host_last_error();
    EXPECT_EQ(shown(rw, longest.tid).iqn, long_name);
}

TEST_F(TargetTest, LunNumbersAreLowestFreeAndStay)
{
    const int one = createTarget("one").tid, two = createTarget("two").tid;
    const _tag_iscsi_lun_ a = createLun("a"), b = createLun("b"), c = createLun("c");
    const auto numbers = [&](int tid) {
        std::map<std::string, uint64_t> found;
        for (const auto &unit : shown(rw, tid).units)
            found[unit.serial] = unit.lun;
        return found;
    };
    map(a, {one});
    map(b, {one, two});
    map(c, {one, two});
    EXPECT_EQ(unmap(a, {one}), 0);
    const std::map<std::string, uint64_t> expected = {{b.uuid, 2}, {c.uuid, 3}};
    EXPECT_EQ(numbers(one), expected);
    EXPECT_EQ(numbers(two), (std::map<std::string, uint64_t>{{b.uuid, 1}, {c.uuid, 2}}));
    const std::string scsi_id = shown(rw, one).units[0].scsi_id;
    EXPECT_EQ(shown(rw, two).units[0].scsi_id, scsi_id) << "one LUN, one identity";

    killProcess(rw.processId());
    EXPECT_EQ(norvhost::startService(), 0) << iscsi_host_last_error();
    EXPECT_EQ(numbers(one), expected);
    EXPECT_EQ(shown(rw, one).units[0].scsi_id, scsi_id);
    map(a, {one, two});
    EXPECT_EQ(numbers(one).at(a.uuid), 1u);
    EXPECT_EQ(numbers(two).at(a.uuid), 3u);
    map(a, {one});
    EXPECT_EQ(numbers(one).size(), 3u) << "mapping once more changes nothing";
}

TEST_F(TargetTest, MappingsThatCannotBe)
{
    const Store store = createStore();
    const int tid = store.target.tid, other = createTarget("other").tid;
    const int good[] = {other}, with_unknown[] = {other, 200}, out_of_range[] = {other, 257};
    EXPECT_EQ(NORViSCSILunMappingsAdd(good, 1024, 1), NORV_ERR_NO_SUCH_LUN);
    EXPECT_EQ(NORViSCSILunMappingsAdd(with_unknown, store.lun.lid, 2), NORV_ERR_NO_SUCH_TARGET);
    EXPECT_EQ(NORViSCSILunMappingsAdd(out_of_range, store.lun.lid, 2), NORV_ERR_TARGET_ID);
    EXPECT_EQ(NORViSCSILunMappingsAdd(nullptr, store.lun.lid, 1), NORV_ERR_TARGET_ID);
    EXPECT_EQ(unmap(store.lun, {tid, other}), NORV_ERR_NO_SUCH_MAPPING);
    EXPECT_EQ(shown(rw, tid).units.size(), 1u);
    EXPECT_TRUE(shown(rw, other).units.empty());

    _tag_iscsi_lun_ trashed = createLun("trashed");
    trashed.options = NORV_LUN_OPTION_TRASH;
    EXPECT_EQ(NORViSCSILunUnload(&trashed), 0) << iscsi_host_last_error();
    EXPECT_EQ(NORViSCSILunMappingsAdd(good, trashed.lid, 1), NORV_ERR_LUN_NOT_LOADED);
    const pid_t holder = inChild([&] {
        norvhost::LunLock lock;
        return lock.take(store.lun.lid, NORV_LUN_PROCESSING) ||
               NORViSCSILunMappingsAdd(good, store.lun.lid, 1) != NORV_ERR_LUN_LOCKED;
    });
    EXPECT_EQ(waitForChild(holder), 0);
}

TEST_F(TargetTest, AnUnloadedLunIsGoneAndARenamedOneStays)
{
    Store store = createStore();
    Initiator session(alice);
    ASSERT_TRUE(session.logIn(store.target.iqn));
    EXPECT_TRUE(session.write(0, 0x42));

    _tag_iscsi_lun_ renamed = store.lun;
    setText(renamed.name, "renamed (1)");
    EXPECT_EQ(NORViSCSILunUpdate(&renamed), 0) << iscsi_host_last_error();
    EXPECT_TRUE(session.holds(0, 0x42));
    EXPECT_EQ(NORViSCSILunUnload(&renamed), 0) << iscsi_host_last_error();
    EXPECT_EQ(session.capacity(), 0u);
    EXPECT_TRUE(shown(rw, store.target.tid).units.empty());
    EXPECT_EQ(NORViSCSILunLoad(&renamed), 0) << iscsi_host_last_error();
    clearAttention(session.get(), 1);
    EXPECT_TRUE(session.holds(0, 0x42)) << session.error();
}

TEST_F(TargetTest, ADisabledTargetLetsNobodyInUntilItIsEnabled)
{
    _tag_iscsi_target_ target = request("off");
    target.enabled = 0;
    ASSERT_EQ(NORViSCSITargetCreate(&target), 0);
    mask(target.tid, alice, NORV_AUTHORITY_READ_WRITE);
    const _tag_iscsi_lun_ lun = createLun("lun");
    map(lun, {target.tid});
    for (int port : {portal_port, rw_port}) {
        EXPECT_TRUE(Initiator(alice).discover(port).empty());
        EXPECT_FALSE(Initiator(alice).logIn(target.iqn, port));
    }
    EXPECT_EQ(grow(lun, 32 * MiB), 0) << iscsi_host_last_error();
    EXPECT_EQ(NORViSCSITargetEnable(&target), 0);
    Initiator session(alice);
    ASSERT_TRUE(session.logIn(target.iqn)) << session.error();
    EXPECT_EQ(session.capacity(), 32 * MiB);
}

TEST_F(TargetTest, DigestsAreOfferedOnlyWhereTheyAreOn)
{
    _tag_iscsi_target_ with = request("with"), without = request("without");
    with.header_digest = with.data_digest = 1;
    for (_tag_iscsi_target_ *target : {&with, &without}) {
        ASSERT_EQ(NORViSCSITargetCreate(target), 0);
        setDefault(*target, NORV_AUTHORITY_READ_WRITE);
        map(createLun(target->name), {target->tid});
    }
    // A response without data is 48 bytes long, and 4 more with a header digest.
    const auto responseSize = [](const _tag_iscsi_target_ &target, iscsi_header_digest digest) -> uint64_t {
        Initiator initiator(alice);
        iscsi_set_header_digest(initiator.get(), digest);
        std::vector<norvhost::TgtdConnection> connections;
        uint64_t before = 0, after = 0;
        if (!initiator.logIn(target.iqn) || !initiator.write(0, 0x33) || !initiator.holds(0, 0x33) ||
            rw.showConnections(target.tid, connections) || connections.size() != 1 ||
            rw.showBytesSent(connections[0].session, connections[0].connection, before) || !initiator.write(0, 0x34) ||
            rw.showBytesSent(connections[0].session, connections[0].connection, after))
            return 0;
        return after - before;
    };
    EXPECT_EQ(responseSize(with, ISCSI_HEADER_DIGEST_CRC32C), 52u);
    EXPECT_EQ(responseSize(with, ISCSI_HEADER_DIGEST_CRC32C_NONE), 52u);
    EXPECT_EQ(responseSize(with, ISCSI_HEADER_DIGEST_NONE), 48u) << "offered, not required";
    EXPECT_EQ(responseSize(without, ISCSI_HEADER_DIGEST_CRC32C_NONE), 48u);
}

} // namespace
} // namespace e2e
