/// The platform's actions on targets and its queries of the configuration.
#include "host/core/LastError.h"
#include "host/storage/LunChecks.h"
#include "host/target/Change.h"
#include "host/target/Name.h"
#include "host/target/TargetStore.h"
#include "platform/error.h"
#include "platform/iscsi_config.h"
#include "platform/iscsi_target.h"

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <memory>
#include <new>

using namespace norvhost;

namespace {

constexpr uint32_t segment_min = 512, segment_max = 16777215; // RFC 7143, 13.12
constexpr uint32_t sessions_max = 65535;                      // session handles have 16 bits

/// RFC 7143, 9.2.1: secrets of less than 96 bits only under IPsec.
constexpr size_t secret_min = 12;

int missingArgument(const char *function)
{
    return fail(NORV_ERR_NULL_POINTER, "%s: an argument is missing", function);
}

template <size_t size>
bool isTerminated(const char (&field)[size])
{
    return memchr(field, '\0', size) != nullptr;
}

int checkTerminated(const _tag_iscsi_target_ &target)
{
    const bool ends = isTerminated(target.name) && isTerminated(target.iqn) && isTerminated(target.user) &&
                      isTerminated(target.password) && isTerminated(target.mutual_user) &&
                      isTerminated(target.mutual_password);
    return ends ? 0 : fail(NORV_ERR_BAD_PARAMETER, "a text of the target record has no end");
}

bool isPrintable(const char *text)
{
    return std::all_of(text, text + strlen(text), [](char c) { return c > ' ' && c < 0x7f; });
}

int checkUser(const char *user, int code, const char *field)
{
    if (*user == '\0')
        return fail(code, "%s: empty", field);
    // tgtd takes users and secrets apart at the comma.
    if (!isPrintable(user) || strchr(user, ','))
        return fail(code, "%s: only printable ASCII characters without space and comma", field);
    return 0;
}

int checkSecret(const char *secret, int code, const char *field)
{
    if (strlen(secret) < secret_min)
        return fail(code, "%s: a CHAP secret has at least %zu characters", field, secret_min);
    if (!isPrintable(secret))
        return fail(code, "%s: only printable ASCII characters without space", field);
    return 0;
}

int checkAuthentication(const _tag_iscsi_target_ &target)
{
    if (target.auth_type > NORV_TARGET_AUTH_MUTUAL_CHAP)
        return fail(NORV_ERR_TARGET_AUTH_TYPE, "auth type: 0 (none), 1 (CHAP) or 2 (mutual CHAP)");
    if (target.auth_type == NORV_TARGET_AUTH_NONE)
        return 0;
    if (int err = checkUser(target.user, NORV_ERR_TARGET_USER, "CHAP user"))
        return err;
    if (int err = checkSecret(target.password, NORV_ERR_TARGET_PASSWORD, "CHAP secret"))
        return err;
    if (target.auth_type == NORV_TARGET_AUTH_CHAP)
        return 0;
    if (int err = checkUser(target.mutual_user, NORV_ERR_TARGET_MUTUAL_USER, "mutual CHAP user"))
        return err;
    if (int err = checkSecret(target.mutual_password, NORV_ERR_TARGET_MUTUAL_PASSWORD, "mutual CHAP secret"))
        return err;
    if (strcmp(target.user, target.mutual_user) == 0)
        return fail(NORV_ERR_TARGET_MUTUAL_USER, "mutual CHAP user: must differ from the CHAP user");
    if (strcmp(target.password, target.mutual_password) == 0)
        return fail(NORV_ERR_TARGET_MUTUAL_PASSWORD, "mutual CHAP secret: must differ from the CHAP secret");
    return 0;
}

int checkNewTarget(_tag_iscsi_target_ &target)
{
    if (int err = checkTerminated(target))
        return err;
    if (checkLunName(target.name)) {
        const std::string reason = lastError();
        return fail(NORV_ERR_TARGET_NAME, "target name: %s", reason.c_str());
    }
    std::string iqn;
    if (!normaliseTargetName(target.iqn, iqn))
        return fail(NORV_ERR_TARGET_IQN,
                    "target IQN: 'iqn.<yyyy-mm>.<reversed domain name>[:<name>]', 'eui.' with 16 or 'naa.' with 16 or "
                    "32 hexadecimal digits; letters, digits, '-', '.' and ':', at most %zu bytes",
                    iscsi_name_max);
    snprintf(target.iqn, sizeof target.iqn, "%s", iqn.c_str());
    for (const auto &[bytes, field] : {std::pair(target.max_recv_seg_bytes, "maximum receive segment"),
                                       std::pair(target.max_send_seg_bytes, "maximum send segment")})
        if (bytes != 0 && (bytes < segment_min || bytes > segment_max))
            return fail(NORV_ERR_BAD_PARAMETER, "%s: %u to %u bytes, or 0 for the default", field, segment_min,
                        segment_max);
    if (target.max_sessions > sessions_max)
        return fail(NORV_ERR_TARGET_MAX_SESSIONS, "maximum sessions: at most %u, 0 for no limit", sessions_max);
    return checkAuthentication(target);
}

/// tgtd has one secret per user name.
int checkUsersFree(const _tag_iscsi_target_ &target)
{
    std::map<std::string, std::string> users;
    if (int err = loadUsers(users))
        return err;
    const auto clashes = [&](const char *user, const char *secret) {
        const auto known = users.find(user);
        return known != users.end() && known->second != secret;
    };
    if (target.auth_type != NORV_TARGET_AUTH_NONE && clashes(target.user, target.password))
        return fail(NORV_ERR_TARGET_USER, "CHAP user: '%s' has another secret on another target", target.user);
    if (target.auth_type == NORV_TARGET_AUTH_MUTUAL_CHAP && clashes(target.mutual_user, target.mutual_password))
        return fail(NORV_ERR_TARGET_MUTUAL_USER, "mutual CHAP user: '%s' has another secret on another target",
                    target.mutual_user);
    return 0;
}

// The records of an answer are copies on the heap, linked in order.

void answerTargets(const std::vector<_tag_iscsi_target_> &targets, _tag_iscsi_conf_ &conf)
{
    _tag_iscsi_target_ **link = &conf.targets, *previous = nullptr;
    for (const _tag_iscsi_target_ &target : targets) {
        *link = new _tag_iscsi_target_(target);
        (*link)->next = nullptr;
        (*link)->previous = previous;
        previous = *link;
        link = &previous->next;
    }
}

/// What does not exist is an empty answer.
int answerOne(int err, const _tag_iscsi_target_ &target, _tag_iscsi_conf_ &conf)
{
    if (err == NORV_ERR_NO_SUCH_TARGET)
        return 0;
    if (!err)
        answerTargets({target}, conf);
    return err;
}

int answerMappings(int lid, bool with_targets, _tag_iscsi_conf_ &conf)
{
    std::vector<Mapping> mappings;
    if (int err = loadMappingsOfLun(lid, mappings))
        return err;
    _tag_iscsi_mapping_ **end = &conf.mappings;
    std::vector<_tag_iscsi_target_> targets;
    for (const Mapping &mapping : mappings) {
        *end = new _tag_iscsi_mapping_{mapping.tid, mapping.lid, mapping.index, nullptr};
        end = &(*end)->next;
        if (!with_targets)
            continue;
        targets.emplace_back();
        if (int err = loadTarget(mapping.tid, targets.back()))
            return err;
    }
    answerTargets(targets, conf);
    return 0;
}

int answer(const _tag_iscsi_conf_query_ &query, _tag_iscsi_conf_ &conf)
{
    _tag_iscsi_target_ target = {};
    std::vector<_tag_iscsi_target_> targets;
    switch (query.kind) {
    case NORV_CONF_TARGET_BY_ID:
        return answerOne(loadTarget(query.tid, target), target, conf);
    case NORV_CONF_TARGET_BY_NAME:
        return query.name ? answerOne(loadTargetByName(query.name, target), target, conf) : missingArgument("name");
    case NORV_CONF_ALL_TARGETS:
        if (int err = loadTargets(targets))
            return err;
        answerTargets(targets, conf);
        return 0;
    case NORV_CONF_TARGETS_OF_LUN:
        return query.lun ? answerMappings(query.lun->lid, true, conf) : missingArgument("lun");
    case NORV_CONF_MAPPINGS_OF_LUN:
        return answerMappings(query.lid, false, conf);
    default:
        return fail(NORV_ERR_BAD_PARAMETER, "there is no configuration query of the kind 0x%x", query.kind);
    }
}

struct FreeConf {
    void operator()(_tag_iscsi_conf_ *conf) const { NORViSCSIConfFree(conf); }
};

} // namespace

int NORViSCSITargetCreate(_tag_iscsi_target_ *target)
{
    if (!target)
        return missingArgument(__func__);
    _tag_iscsi_target_ created = *target;
    if (int err = checkNewTarget(created))
        return err;
    const int err = changeTargets([&](std::vector<int> &tids) {
        if (int failed = checkUsersFree(created))
            return failed;
        if (int failed = insertTarget(created))
            return failed;
        tids.push_back(created.tid);
        return 0;
    });
    if (!err)
        *target = created;
    return err;
}

int NORViSCSITargetRemove(const _tag_iscsi_target_ *target)
{
    if (!target)
        return missingArgument(__func__);
    return changeTargets([&](std::vector<int> &tids) {
        tids.push_back(target->tid);
        return deleteTarget(target->tid);
    });
}

int NORViSCSITargetEnable(_tag_iscsi_target_ *target)
{
    if (!target)
        return missingArgument(__func__);
    const int err = changeTargets([&](std::vector<int> &tids) {
        tids.push_back(target->tid);
        return setTargetEnabled(target->tid, true);
    });
    if (!err)
        target->enabled = 1;
    return err;
}

int NORViSCSIConfGet(const _tag_iscsi_conf_query_ *query, _tag_iscsi_conf_ **conf)
{
    if (!query || !conf)
        return missingArgument(__func__);
    *conf = nullptr;
    try {
        std::unique_ptr<_tag_iscsi_conf_, FreeConf> found(new _tag_iscsi_conf_{nullptr, nullptr});
        if (int err = answer(*query, *found))
            return err;
        *conf = found.release();
        return 0;
    } catch (const std::bad_alloc &) {
        return fail(NORV_ERR_OUT_OF_MEMORY, "no memory for an answer about the configuration");
    }
}

void NORViSCSIConfFree(_tag_iscsi_conf_ *conf)
{
    if (!conf)
        return;
    while (_tag_iscsi_target_ *target = conf->targets) {
        conf->targets = target->next;
        delete target;
    }
    while (_tag_iscsi_mapping_ *mapping = conf->mappings) {
        conf->mappings = mapping->next;
        delete mapping;
    }
    delete conf;
}

int NORViSCSIConfTargetLoad(const _tag_iscsi_conf_query_ *query, _tag_iscsi_conf_ **conf)
{
    return NORViSCSIConfGet(query, conf);
}
