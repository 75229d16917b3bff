// Targets and the queries of the iSCSI configuration on the fake's model.
#include "platform/error.h"
#include "tests/fake/Script.h"

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <memory>

using namespace fake;

namespace {

int unfreed = 0;

/// An answer with what its lists point into.
struct Answer : _tag_iscsi_conf_ {
    std::vector<_tag_iscsi_target_> target_list;
    std::vector<_tag_iscsi_mapping_> mapping_list;

    Answer() : _tag_iscsi_conf_{} { ++unfreed; }
    Answer(const Answer &) = delete;
    Answer &operator=(const Answer &) = delete;
    ~Answer() { --unfreed; }

    /// Call once, when the lists are complete.
    Answer *linked()
    {
        for (size_t i = 0; i < target_list.size(); ++i) {
            target_list[i].next = i + 1 < target_list.size() ? &target_list[i + 1] : nullptr;
            target_list[i].previous = i ? &target_list[i - 1] : nullptr;
        }
        for (size_t i = 0; i < mapping_list.size(); ++i)
            mapping_list[i].next = i + 1 < mapping_list.size() ? &mapping_list[i + 1] : nullptr;
        targets = target_list.empty() ? nullptr : target_list.data();
        mappings = mapping_list.empty() ? nullptr : mapping_list.data();
        return this;
    }
};

template <class Test>
void addTargets(Answer &answer, Test test)
{
    for (const auto &[tid, target] : model().targets) {
        if (test(target.record))
            answer.target_list.push_back(target.record);
    }
}

void addMappings(Answer &answer, int lid)
{
    for (const auto &mapping : model().mappings) {
        if (mapping.lid == lid)
            answer.mapping_list.push_back(mapping);
    }
}

void addTargetsOfLUN(Answer &answer, int lid)
{
    for (const auto &[tid, target] : model().targets) {
        for (const auto &mapping : model().mappings) {
            if (mapping.tid == tid && mapping.lid == lid) {
                answer.target_list.push_back(target.record);
                answer.mapping_list.push_back(mapping);
            }
        }
    }
}

bool answerTargets(const _tag_iscsi_conf_query_ &query, Answer &answer)
{
    switch (query.kind) {
    case NORV_CONF_TARGET_BY_ID:
        addTargets(answer, [&](const auto &record) { return record.tid == query.tid; });
        return true;
    case NORV_CONF_TARGET_BY_NAME:
        addTargets(answer, [&](const auto &record) { return strcmp(record.name, query.name) == 0; });
        return true;
    case NORV_CONF_ALL_TARGETS:
        addTargets(answer, [](const auto &) { return true; });
        return true;
    default:
        return false;
    }
}

bool answerMappings(const _tag_iscsi_conf_query_ &query, Answer &answer)
{
    switch (query.kind) {
    case NORV_CONF_TARGETS_OF_LUN:
        addTargetsOfLUN(answer, query.lun->lid);
        return true;
    case NORV_CONF_MAPPINGS_OF_LUN:
        addMappings(answer, query.lid);
        return true;
    default:
        return false;
    }
}

/// The kind, and the field that it reads.
std::string describe(const _tag_iscsi_conf_query_ &query)
{
    char kind[8];
    snprintf(kind, sizeof(kind), "0x%04X", query.kind);
    switch (query.kind) {
    case NORV_CONF_TARGET_BY_ID:
        return joined(kind, query.tid);
    case NORV_CONF_TARGET_BY_NAME:
        return joined(kind, query.name);
    case NORV_CONF_TARGETS_OF_LUN:
        return joined(kind, query.lun->uuid);
    case NORV_CONF_MAPPINGS_OF_LUN:
        return joined(kind, query.lid);
    default:
        return kind;
    }
}

Target *byID(int tid)
{
    const auto found = model().targets.find(tid);
    return found == model().targets.end() ? nullptr : &found->second;
}

int judge(const _tag_iscsi_target_ &target)
{
    if (!isName(target.name, sizeof(target.name) - 1))
        return NORV_ERR_TARGET_NAME;
    if (!isName(target.iqn, sizeof(target.iqn) - 1))
        return NORV_ERR_TARGET_IQN;
    if (target.auth_type > NORV_TARGET_AUTH_MUTUAL_CHAP)
        return NORV_ERR_TARGET_AUTH_TYPE;
    for (const auto &[tid, other] : model().targets) {
        if (strcmp(other.record.name, target.name) == 0)
            return NORV_ERR_TARGET_NAME;
        if (strcmp(other.record.iqn, target.iqn) == 0)
            return NORV_ERR_TARGET_IQN;
    }
    return 0;
}

} // namespace

int fake::unfreedAnswers()
{
    return unfreed + unfreedRecords() + unfreedLists() + unfreedHashes() + unfreedHandles();
}

int NORViSCSIConfGet(const _tag_iscsi_conf_query_ *query, _tag_iscsi_conf_ **conf)
{
    *conf = nullptr;
    if (auto failure = called(__func__, describe(*query)))
        return *failure;
    auto answer = std::make_unique<Answer>();
    if (!answerTargets(*query, *answer) && !answerMappings(*query, *answer))
        return NORV_ERR_BAD_PARAMETER;
    *conf = answer.release()->linked();
    return 0;
}

void NORViSCSIConfFree(_tag_iscsi_conf_ *conf)
{
    delete static_cast<Answer *>(conf);
}

int NORViSCSIConfTargetLoad(const _tag_iscsi_conf_query_ *query, _tag_iscsi_conf_ **conf)
{
    *conf = nullptr;
    if (auto failure = called(__func__, describe(*query)))
        return *failure;
    auto answer = std::make_unique<Answer>();
    if (!answerTargets(*query, *answer))
        return NORV_ERR_BAD_PARAMETER;
    *conf = answer.release()->linked();
    return 0;
}

int NORViSCSITargetCreate(_tag_iscsi_target_ *target)
{
    if (auto failure = called(__func__, target->name, target->iqn, target->enabled ? "enabled" : "disabled"))
        return *failure;
    if (int err = judge(*target))
        return err;
    int tid = 1;
    while (byID(tid))
        ++tid;
    if (tid > NORV_TARGET_ID_MAX)
        return NORV_ERR_MAX_TARGETS;
    target->tid = tid;
    model().targets[tid].record = *target;
    return 0;
}

int NORViSCSITargetRemove(const _tag_iscsi_target_ *target)
{
    if (auto failure = called(__func__, target->tid))
        return *failure;
    if (model().targets.erase(target->tid) == 0)
        return NORV_ERR_NO_SUCH_TARGET;
    auto &mappings = model().mappings;
    mappings.erase(std::remove_if(mappings.begin(), mappings.end(),
                                  [&](const auto &mapping) { return mapping.tid == target->tid; }),
                   mappings.end());
    return 0;
}

int NORViSCSITargetEnable(_tag_iscsi_target_ *target)
{
    if (auto failure = called(__func__, target->tid))
        return *failure;
    Target *known = byID(target->tid);
    if (!known)
        return NORV_ERR_NO_SUCH_TARGET;
    known->record.enabled = target->enabled = 1;
    return 0;
}
