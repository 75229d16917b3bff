#include "platform/error.h"
#include "platform/iscsi_config.h"
#include "platform/iscsi_masking.h"
#include "tests/contract/Platform.h"

#include <gtest/gtest.h>

#include <cstring>
#include <map>
#include <memory>
#include <string>
#include <vector>

namespace contract {
namespace {

using Masking = std::map<std::string, int>;
using Mappings = std::map<int, int>; ///< target ID to LUN number

class TargetContract : public testing::Test, protected Platform {
protected:
    TargetContract() { startService(); }

    static _tag_iscsi_target_ request(const std::string &name)
    {
        _tag_iscsi_target_ target{};
        target.max_recv_seg_bytes = target.max_send_seg_bytes = 262144;
        target.header_digest = 1;
        target.auth_type = NORV_TARGET_AUTH_CHAP;
        set(target.name, name);
        set(target.iqn, "iqn.2000-01.example:" + name);
        set(target.user, "alice");
        set(target.password, "secret-of-alice");
        return target;
    }

    static _tag_iscsi_target_ create(const std::string &name)
    {
        _tag_iscsi_target_ target = request(name);
        EXPECT_EQ(NORViSCSITargetCreate(&target), 0) << name;
        return target;
    }

    using Answer = std::unique_ptr<_tag_iscsi_conf_, decltype(&NORViSCSIConfFree)>;

    static Answer ask(const _tag_iscsi_conf_query_ &query, decltype(&NORViSCSIConfGet) get = NORViSCSIConfGet)
    {
        _tag_iscsi_conf_ *conf = nullptr;
        EXPECT_EQ(get(&query, &conf), 0);
        return {conf, NORViSCSIConfFree};
    }

    static std::vector<_tag_iscsi_target_> targets(uint16_t kind, int tid = 0, const char *name = nullptr)
    {
        std::vector<_tag_iscsi_target_> result;
        for (const auto get : {NORViSCSIConfGet, NORViSCSIConfTargetLoad}) {
            const Answer answer = ask({kind, 0, tid, name, nullptr}, get);
            result.clear();
            for (const auto *target = answer->targets; target; target = target->next)
                result.push_back(*target);
        }
        return result;
    }

    static Mappings mappings(const _tag_iscsi_lun_ &lun)
    {
        Mappings result;
        const Answer answer = ask({NORV_CONF_MAPPINGS_OF_LUN, lun.lid, 0, nullptr, nullptr});
        for (const auto *mapping = answer->mappings; mapping; mapping = mapping->next) {
            EXPECT_EQ(mapping->lid, lun.lid);
            result[mapping->tid] = mapping->mapping_index;
        }
        const Answer with_targets = ask({NORV_CONF_TARGETS_OF_LUN, 0, 0, nullptr, &lun});
        const auto *mapping = with_targets->mappings;
        size_t count = 0;
        for (const auto *target = with_targets->targets; target && mapping; target = target->next) {
            EXPECT_EQ(mapping->tid, target->tid) << "the n-th mapping belongs to the n-th target";
            EXPECT_EQ(result.at(mapping->tid), mapping->mapping_index);
            mapping = mapping->next;
            ++count;
        }
        EXPECT_EQ(mapping, nullptr);
        EXPECT_EQ(count, result.size());
        return result;
    }

    static std::vector<_tag_struct_iscsi_acl_> entries(int tid, const Masking &masking)
    {
        std::vector<_tag_struct_iscsi_acl_> result;
        for (const auto &[iqn, permission] : masking) {
            _tag_struct_iscsi_acl_ entry{};
            entry.tid = tid;
            entry.permission = permission;
            set(entry.iqn, iqn);
            result.push_back(entry);
        }
        return result;
    }

    static Masking maskingOf(int tid)
    {
        std::vector<_tag_struct_iscsi_acl_> listed(3);
        EXPECT_EQ(NORViSCSITargetMaskingGet(tid, listed), 0);
        Masking result;
        for (const auto &entry : listed) {
            EXPECT_EQ(entry.tid, tid);
            result[entry.iqn] = entry.permission;
        }
        return result;
    }
};

TEST_F(TargetContract, ACreatedTargetIsFoundInEveryWay)
{
    EXPECT_TRUE(targets(NORV_CONF_ALL_TARGETS).empty());
    const auto created = create("one");
    create("two");
    EXPECT_GE(created.tid, 1);
    EXPECT_LE(created.tid, NORV_TARGET_ID_MAX);
    for (const auto &found : {targets(NORV_CONF_TARGET_BY_ID, created.tid), targets(NORV_CONF_TARGET_BY_NAME, 0, "one"),
                              targets(NORV_CONF_ALL_TARGETS)}) {
        ASSERT_FALSE(found.empty());
        EXPECT_EQ(memcmp(&found[0], &created, offsetof(_tag_iscsi_target_, next)), 0);
        EXPECT_EQ(found[0].enabled, 0);
    }
    const auto all = targets(NORV_CONF_ALL_TARGETS);
    ASSERT_EQ(all.size(), 2u);
    EXPECT_LT(all[0].tid, all[1].tid);
    EXPECT_TRUE(targets(NORV_CONF_TARGET_BY_ID, 200).empty());
    EXPECT_TRUE(targets(NORV_CONF_TARGET_BY_NAME, 0, "none").empty());
}

TEST_F(TargetContract, BadRequestsLeaveNothing)
{
    create("taken");
    auto same_name = request("taken");
    set(same_name.iqn, "iqn.2000-01.example:free");
    auto same_iqn = request("taken");
    set(same_iqn.name, "free");
    auto nameless = request("");
    auto bad_iqn = request("n");
    set(bad_iqn.iqn, "");
    auto bad_auth = request("n");
    bad_auth.auth_type = 3;
    EXPECT_EQ(NORViSCSITargetCreate(&same_name), NORV_ERR_TARGET_NAME);
    EXPECT_EQ(NORViSCSITargetCreate(&same_iqn), NORV_ERR_TARGET_IQN);
    EXPECT_EQ(NORViSCSITargetCreate(&nameless), NORV_ERR_TARGET_NAME);
    EXPECT_EQ(NORViSCSITargetCreate(&bad_iqn), NORV_ERR_TARGET_IQN);
    EXPECT_EQ(NORViSCSITargetCreate(&bad_auth), NORV_ERR_TARGET_AUTH_TYPE);
    EXPECT_EQ(targets(NORV_CONF_ALL_TARGETS).size(), 1u);
}

TEST_F(TargetContract, EnablingAndRemoving)
{
    auto target = create("one");
    EXPECT_EQ(NORViSCSITargetEnable(&target), 0);
    EXPECT_NE(target.enabled, 0);
    EXPECT_NE(targets(NORV_CONF_TARGET_BY_ID, target.tid).at(0).enabled, 0);
    EXPECT_EQ(NORViSCSITargetRemove(&target), 0);
    EXPECT_TRUE(targets(NORV_CONF_ALL_TARGETS).empty());
    EXPECT_EQ(NORViSCSITargetRemove(&target), NORV_ERR_NO_SUCH_TARGET);
    EXPECT_EQ(NORViSCSITargetEnable(&target), NORV_ERR_NO_SUCH_TARGET);
    EXPECT_EQ(NORViSCSIDefaultACLSet(&target, NORV_AUTHORITY_READ), NORV_ERR_NO_SUCH_TARGET);
}

TEST_F(TargetContract, MaskingIsChangedAsAWholeOrNotAtAll)
{
    const auto target = create("one");
    const std::string a = "iqn.2000-01.example:a", b = "iqn.2000-01.example:b", none = "iqn.2000-01.example:none";
    EXPECT_EQ(maskingOf(target.tid), Masking());
    EXPECT_EQ(NORViSCSIDefaultACLSet(&target, 3), 0);
    EXPECT_EQ(NORViSCSIMaskingsCreate(entries(target.tid, {{a, 3}, {b, 0}})), 0);
    EXPECT_EQ(NORViSCSIMaskingsUpdate(entries(target.tid, {{b, 1}, {NORV_DEFAULT_MASKING_IQN, 0}})), 0);
    const Masking expected = {{a, 3}, {b, 1}, {NORV_DEFAULT_MASKING_IQN, 0}};
    EXPECT_EQ(maskingOf(target.tid), expected);

    EXPECT_NE(NORViSCSIMaskingsCreate(entries(target.tid, {{none, 3}, {none + "2", 2}})), 0);
    EXPECT_NE(NORViSCSIMaskingsUpdate(entries(target.tid, {{a, 0}, {b, 7}})), 0);
    EXPECT_NE(NORViSCSIMaskingsCreate(entries(200, {{none, 3}})), 0);
    EXPECT_EQ(maskingOf(target.tid), expected);
    EXPECT_EQ(NORViSCSIMaskingsRemove(entries(target.tid, {{a, 3}, {NORV_DEFAULT_MASKING_IQN, 0}})), 0);
    EXPECT_EQ(maskingOf(target.tid), (Masking{{b, 1}}));

    std::vector<_tag_struct_iscsi_acl_> kept(3);
    EXPECT_EQ(NORViSCSITargetMaskingGet(200, kept), NORV_ERR_NO_SUCH_TARGET);
    EXPECT_EQ(kept.size(), 3u) << "replaced on success only";
}

TEST_F(TargetContract, MappingsAreAddedAndRemovedTogether)
{
    const auto lun = createLUN("one"), other = createLUN("two");
    const int first = create("first").tid, second = create("second").tid;
    const int both[] = {first, second}, with_unknown[] = {first, 200};

    EXPECT_NE(NORViSCSILunMappingsAdd(with_unknown, lun.lid, 2), 0);
    EXPECT_EQ(mappings(lun), Mappings());
    EXPECT_EQ(NORViSCSILunMappingsAdd(&first, lun.lid, 1), 0);
    EXPECT_EQ(NORViSCSILunMappingsAdd(both, other.lid, 2), 0);
    const Mappings of_other = mappings(other);
    EXPECT_EQ(of_other.size(), 2u);
    EXPECT_NE(of_other.at(first), mappings(lun).at(first)) << "two LUNs under one number";
    EXPECT_NE(NORViSCSILunMappingsRemove(both, lun.lid, 2), 0);
    EXPECT_EQ(mappings(lun).size(), 1u);
    EXPECT_EQ(NORViSCSILunMappingsRemove(&first, lun.lid, 1), 0);
    EXPECT_EQ(mappings(lun), Mappings());
    EXPECT_EQ(mappings(other), of_other) << "LUN numbers are stable";
}

TEST_F(TargetContract, AMappedLUNStaysAndATargetTakesItsMappingsAlong)
{
    auto lun = createLUN("one");
    const auto target = create("first");
    EXPECT_EQ(NORViSCSILunMappingsAdd(&target.tid, lun.lid, 1), 0);
    EXPECT_EQ(NORViSCSILunDelete(&lun), NORV_ERR_LUN_MAPPED);
    EXPECT_EQ(NORViSCSITargetRemove(&target), 0);
    EXPECT_EQ(mappings(lun), Mappings());
    EXPECT_EQ(NORViSCSILunDelete(&lun), 0);
}

TEST_F(TargetContract, QueriesThatCannotBeAnsweredLeaveNoAnswer)
{
    _tag_iscsi_conf_query_ query{};
    query.kind = 0x1234;
    for (const auto get : {NORViSCSIConfGet, NORViSCSIConfTargetLoad}) {
        _tag_iscsi_conf_ *conf = reinterpret_cast<_tag_iscsi_conf_ *>(&query);
        EXPECT_NE(get(&query, &conf), 0);
        EXPECT_EQ(conf, nullptr);
    }
    NORViSCSIConfFree(nullptr);
}

} // namespace
} // namespace contract
