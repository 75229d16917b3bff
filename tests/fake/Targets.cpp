// Targets and the queries of the iSCSI configuration on the fake's model.
#include "platform/error.h"
#include "tests/fake/Script.h"

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <memory>

using namespace fake;

namespace {

/// An answer with what its lists point into.
struct Answer : _tag_iscsi_conf_ {
    std::vector<_tag_iscsi_target_> target_list;
    std::vector<_tag_iscsi_mapping_> mapping_list;

    Answer() : _tag_iscsi_conf_{} { noteAllocated(this); }
    Answer(const Answer &) = delete;
    Answer &operator=(const Answer &) = delete;
    ~Answer() { noteFreed(this); }

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

/// A target for each mapping of the LUN.
void addTargetsOfLUN(Answer &answer, int lid)
{
    addMappings(answer, lid);
    auto &mappings = answer.mapping_list;
    mappings.erase(std::remove_if(mappings.begin(), mappings.end(),
                                  [](const auto &mapping) { return model().targets.count(mapping.tid) == 0; }),
                   mappings.end());
    std::stable_sort(mappings.begin(), mappings.end(), [](const auto &a, const auto &b) { return a.tid < b.tid; });
    for (const auto &mapping : mappings)
        answer.target_list.push_back(model().targets.at(mapping.tid).record);
}

/// Fills the answer; says which field of the query is read, and nothing for a kind that is none.
std::optional<std::string> answerFrom(const _tag_iscsi_conf_query_ &query, Answer &answer)
{
    switch (query.kind) {
    case NORV_CONF_TARGET_BY_ID:
        addTargets(answer, [&](const auto &record) { return record.tid == query.tid; });
        return joined("", query.tid);
    case NORV_CONF_TARGET_BY_NAME:
        addTargets(answer, [&](const auto &record) { return strcmp(record.name, query.name) == 0; });
        return joined("", query.name);
    case NORV_CONF_ALL_TARGETS:
        addTargets(answer, [](const auto &) { return true; });
        return "";
    case NORV_CONF_TARGETS_OF_LUN:
        addTargetsOfLUN(answer, query.lun->lid);
        return joined("", query.lun->uuid);
    case NORV_CONF_MAPPINGS_OF_LUN:
        addMappings(answer, query.lid);
        return joined("", query.lid);
    default:
        return std::nullopt;
    }
}

int answerQuery(const char *name, const _tag_iscsi_conf_query_ &query, _tag_iscsi_conf_ **conf)
{
    *conf = nullptr;
    char kind[8];
    snprintf(kind, sizeof(kind), "0x%04X", query.kind);
    auto answer = std::make_unique<Answer>();
    const auto field = answerFrom(query, *answer);
    if (auto failure = called(name, kind + field.value_or("")))
        return *failure;
    if (!field)
        return NORV_ERR_BAD_PARAMETER;
    *conf = answer.release()->linked();
    return 0;
}

Target *byID(int tid)
{
    return valueOf(model().targets, tid);
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

int NORViSCSIConfGet(const _tag_iscsi_conf_query_ *query, _tag_iscsi_conf_ **conf)
{
    return answerQuery(__func__, *query, conf);
}

void NORViSCSIConfFree(_tag_iscsi_conf_ *conf)
{
    delete static_cast<Answer *>(conf);
}

int NORViSCSIConfTargetLoad(const _tag_iscsi_conf_query_ *query, _tag_iscsi_conf_ **conf)
{
    return answerQuery(__func__, *query, conf);
}

int NORViSCSITargetCreate(_tag_iscsi_target_ *target)
{
    NOTE_CALL(target->name, target->iqn, target->enabled ? "enabled" : "disabled");
    if (int err = judge(*target))
        return err;
    int tid = 1;
    while (byID(tid))
        ++tid;
    target->tid = tid;
    model().targets[tid].record = *target;
    return 0;
}

int NORViSCSITargetRemove(const _tag_iscsi_target_ *target)
{
    NOTE_CALL(target->tid);
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
    Target *known = byID(target->tid);
    NOTE_CALL_ON(known, target->tid);
    known->record.enabled = target->enabled = 1;
    return 0;
}
