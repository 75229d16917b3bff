#include "host/services/RetentionPolicy.h"

#include "host/core/LastError.h"
#include "host/services/LocalTime.h"
#include "platform/error.h"

#include <algorithm>
#include <json/json.h>
#include <limits>
#include <memory>
#include <numeric>

namespace norvhost {
namespace {

constexpr int largest_rule = 100000;
constexpr size_t longest_text = 256; // far less nesting than what the JSON reader gives up at

const struct {
    const char *key;
    int RetentionPolicy::*count;
} rules[] = {
    {"newest", &RetentionPolicy::newest},
    {"hourly", &RetentionPolicy::hourly},
    {"daily", &RetentionPolicy::daily},
    {"weekly", &RetentionPolicy::weekly},
};

int readRule(const std::string &key, const Json::Value &value, RetentionPolicy &policy)
{
    for (const auto &rule : rules) {
        if (key != rule.key)
            continue;
        if (!value.isInt())
            return fail(NORV_ERR_BAD_PARAMETER, "the retention rule '%s' is no whole number", rule.key);
        policy.*rule.count = value.asInt();
        return 0;
    }
    return fail(NORV_ERR_BAD_PARAMETER, "there is no retention rule '%s'", key.c_str());
}

/// The start of the local hour, so that the hour that comes twice in autumn is two.
int64_t hourOf(int64_t time)
{
    const tm local = localTime(time);
    return time - local.tm_min * int64_t(60) - local.tm_sec;
}

int64_t dayOf(int64_t time)
{
    constexpr int64_t seconds = 86400;
    const int64_t local = time + localTime(time).tm_gmtoff;
    return local / seconds - (local % seconds < 0 ? 1 : 0);
}

int64_t weekOf(int64_t time)
{
    // Day 0 of the epoch was a Thursday.
    const int64_t since_monday = dayOf(time) + 3;
    return since_monday / 7 - (since_monday % 7 < 0 ? 1 : 0);
}

struct Decider {
    const std::vector<RetentionCandidate> &candidates;
    std::vector<size_t> newest_first; ///< those that count
    std::vector<RetentionDecision> decisions;

    void keep(size_t index, const std::string &reason)
    {
        RetentionDecision &decision = decisions[index];
        decision.reason += (decision.kept ? ", " : "") + reason;
        decision.kept = true;
    }

    void keepNewest(int count)
    {
        const size_t kept = std::min(newest_first.size(), static_cast<size_t>(count));
        for (size_t i = 0; i < kept; ++i)
            keep(newest_first[i], "newest " + std::to_string(i + 1) + " of " + std::to_string(count));
    }

    void keepSlots(const char *name, int count, int64_t (*slotOf)(int64_t time))
    {
        int filled = 0;
        int64_t last = std::numeric_limits<int64_t>::max();
        for (const size_t index : newest_first) {
            if (filled == count)
                return;
            const int64_t slot = slotOf(candidates[index].time);
            if (slot >= last)
                continue;
            last = slot;
            keep(index, name + (" " + std::to_string(++filled)) + " of " + std::to_string(count));
        }
    }
};

} // namespace

std::string retentionText(const RetentionPolicy &policy)
{
    Json::Value json(Json::objectValue);
    for (const auto &rule : rules)
        if (policy.*rule.count)
            json[rule.key] = policy.*rule.count;
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "";
    return Json::writeString(builder, json);
}

int parseRetention(std::string_view text, RetentionPolicy &policy)
{
    Json::CharReaderBuilder builder;
    Json::CharReaderBuilder::strictMode(&builder.settings_);
    const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
    Json::Value json;
    if (text.size() > longest_text || !reader->parse(text.data(), text.data() + text.size(), &json, nullptr) ||
        !json.isObject())
        return fail(NORV_ERR_BAD_PARAMETER, "the retention policy is no JSON object");
    RetentionPolicy read;
    for (const std::string &key : json.getMemberNames())
        if (int err = readRule(key, json[key], read))
            return err;
    if (int err = checkRetention(read))
        return err;
    policy = read;
    return 0;
}

int checkRetention(const RetentionPolicy &policy)
{
    bool keeps = false;
    for (const auto &rule : rules) {
        const int count = policy.*rule.count;
        if (count < 0 || count > largest_rule)
            return fail(NORV_ERR_BAD_PARAMETER, "the retention rule '%s' is not within 0 to %d", rule.key,
                        largest_rule);
        keeps = keeps || count > 0;
    }
    return keeps ? 0 : fail(NORV_ERR_BAD_PARAMETER, "a retention policy without a rule would keep no snapshot");
}

std::vector<RetentionDecision> decideRetention(const std::vector<RetentionCandidate> &candidates,
                                               const RetentionPolicy &policy, int64_t now)
{
    Decider decider{candidates, {}, std::vector<RetentionDecision>(candidates.size())};
    for (size_t i = 0; i < candidates.size(); ++i) {
        if (!candidates[i].lock.empty())
            decider.keep(i, candidates[i].lock);
        else if (candidates[i].time > now)
            decider.keep(i, "from the future");
        else
            decider.newest_first.push_back(i);
    }
    const auto newer = [&](size_t a, size_t b) {
        return candidates[a].time != candidates[b].time ? candidates[a].time > candidates[b].time : a > b;
    };
    std::sort(decider.newest_first.begin(), decider.newest_first.end(), newer);

    decider.keepNewest(policy.newest);
    decider.keepSlots("hour", policy.hourly, hourOf);
    decider.keepSlots("day", policy.daily, dayOf);
    decider.keepSlots("week", policy.weekly, weekOf);
    for (RetentionDecision &decision : decider.decisions)
        if (!decision.kept)
            decision.reason = "no rule keeps it";
    return std::move(decider.decisions);
}

} // namespace norvhost
