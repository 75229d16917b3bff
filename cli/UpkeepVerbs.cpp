// What the appliance does by itself: retention, schedules, and the log of events.
#include "cli/Commands.h"

#include "cli/Display.h"
#include "cli/Request.h"
#include "cli/Values.h"

#include <json/writer.h>

#include <chrono>
#include <cstring>
#include <thread>

namespace cli {

using webapi::Method;

namespace {

CLI::Option &addLun(CLI::App &verb, Arguments &arguments)
{
    return addPositional(verb, "LUN", arguments.selector, "Name, UUID or place in the list of the LUN");
}

std::string retentionPath(const Arguments &a, const char *rest = "")
{
    return lunPath(a.selector, std::string("/retention") + rest);
}

void addRules(CLI::App &verb, Json::Value &input)
{
    addNumber(verb, "--keep", input, "newest", "Keep the newest so many");
    addNumber(verb, "--hourly", input, "hourly", "Keep one of each of the latest so many hours");
    addNumber(verb, "--daily", input, "daily", "Keep one of each of the latest so many days");
    addNumber(verb, "--weekly", input, "weekly", "Keep one of each of the latest so many weeks");
}

void printPolicy(const Json::Value &policy, bool json)
{
    if (json)
        return printJson(policy);
    std::string text;
    const auto add = [&](const char *key, const char *what) {
        if (policy[key].asInt() != 0)
            text += (text.empty() ? "" : ", ") + policy[key].asString() + what;
    };
    add("newest", " newest");
    add("hourly", " hourly");
    add("daily", " daily");
    add("weekly", " weekly");
    print("Kept: " + (text.empty() ? "all" : text) + "\n");
}

void printVerdicts(const Json::Value &verdicts)
{
    Table table({{"ID", Align::Right},
                 {"NAME", Align::Left},
                 {"TIME", Align::Left},
                 {"VERDICT", Align::Left},
                 {"REASON", Align::Left}});
    for (const Json::Value &verdict : verdicts)
        table.add({verdict["snapshot_id"].asString(), verdict["name"].asString(), timeText(verdict["snapshot_time"]),
                   verdict["is_kept"].asBool() ? "stays" : "goes", verdict["reason"].asString()});
    print(table.text());
}

void addRetention(Commands &commands)
{
    CLI::App &noun = addNoun(commands, "retention", "Which snapshots of a LUN are kept, after each new one");

    auto set = std::make_shared<Arguments>();
    CLI::App &set_verb = addVerb(commands, noun, "set", "Set what is kept; each rule keeps for itself", [set] {
        if (set->input.empty())
            throw UsageError{"--keep, --hourly, --daily or --weekly is required"};
        printPolicy(request(Method::Put, retentionPath(*set), set->input), set->json);
    });
    addLun(set_verb, *set);
    addRules(set_verb, set->input);
    addJson(set_verb, set->json);

    auto show = std::make_shared<Arguments>();
    CLI::App &show_verb = addVerb(commands, noun, "show", "Show what is kept",
                                  [show] { printPolicy(request(Method::Get, retentionPath(*show)), show->json); });
    addLun(show_verb, *show);
    addJson(show_verb, show->json);

    auto remove = std::make_shared<Arguments>();
    addLun(addVerb(commands, noun, "remove", "Keep all snapshots of a LUN",
                   [remove] { request(Method::Delete, retentionPath(*remove)); }),
           *remove);

    auto dry = std::make_shared<Arguments>();
    CLI::App &dry_verb = addVerb(
        commands, noun, "dry-run", "Tell which snapshots would go now, and why each of the others stays", [dry] {
            const Json::Value verdicts = request(Method::Get, retentionPath(*dry, "/verdicts"), dry->input);
            if (dry->json)
                return printJson(verdicts);
            printVerdicts(verdicts);
        });
    addLun(dry_verb, *dry);
    addRules(dry_verb, dry->input);
    addJson(dry_verb, dry->json);
    dry_verb.footer("With a rule given, these rules are tried in place of those that are set.");
}

void printSchedules(const Json::Value &schedules)
{
    Table table({{"ID", Align::Right},
                 {"LUN", Align::Left},
                 {"KIND", Align::Left},
                 {"RULE", Align::Left},
                 {"NEXT", Align::Left},
                 {"LAST", Align::Left}});
    for (const Json::Value &schedule : schedules)
        table.add({schedule["schedule_id"].asString(), schedule["lun_name"].asString(), schedule["kind"].asString(),
                   schedule["rule"].asString(), timeText(schedule["next_run"]), timeText(schedule["last_run"])});
    print(table.text());
}

/// Whether the text has the form of an interval, "15m"; what it may be is the platform's to judge.
bool isInterval(const std::string &text)
{
    const size_t digits = text.find_first_not_of("0123456789");
    return digits != 0 && digits != text.npos && digits + 1 == text.size() && strchr("mhdw", text[digits]);
}

void addSchedules(Commands &commands)
{
    CLI::App &noun = addNoun(commands, "schedule", "When snapshots are taken by themselves");

    auto add = std::make_shared<Arguments>();
    CLI::App &add_verb = addVerb(commands, noun, "add", "Take snapshots of a LUN regularly", [add] {
        if (!add->input.isMember("rule"))
            throw UsageError{"--every or --cron is required"};
        const Json::Value schedule = request(Method::Post, "/schedules", add->input);
        if (add->json)
            return printJson(schedule);
        print("Added schedule " + schedule["schedule_id"].asString() + " of LUN " +
              shown(schedule["lun_name"].asString()) + ": next run " + timeText(schedule["next_run"]) + "\n");
    });
    addText(add_verb, "--lun", "LUN", add->input, "lun", "The LUN").required();
    CLI::Option &every = addText(add_verb, "--every", "INTERVAL", add->input, "rule", "Interval: 15m, 1h, 2d, 1w");
    every.check([](const std::string &text) {
        return isInterval(text) ? "" : "'" + text + "' is no interval as 15m, 1h, 2d and 1w are; --cron takes times";
    });
    addText(add_verb, "--cron", "TEXT", add->input, "rule",
            "Minute, hour, day of the month, month and day of the week as in crontab, or a word: daily")
        .excludes(&every)
        ->check([](const std::string &text) {
            return isInterval(text) ? "'" + text + "' is an interval, which --every takes" : "";
        });
    addJson(add_verb, add->json);

    auto list = std::make_shared<Arguments>();
    CLI::App &list_verb = addVerb(commands, noun, "list", "List the schedules", [list] {
        const Json::Value schedules = request(Method::Get, "/schedules");
        if (list->json)
            return printJson(schedules);
        printSchedules(schedules);
    });
    addJson(list_verb, list->json);

    auto remove = std::make_shared<Arguments>();
    CLI::App &remove_verb = addVerb(commands, noun, "remove", "Remove a schedule", [remove] {
        request(Method::Delete, "/schedules/" + webapi::pathSegment(remove->selector));
    });
    addPositional(remove_verb, "ID", remove->selector, "ID of the schedule, as in the list");
}

void printEvents(const Json::Value &events, bool json)
{
    static const char *const levels[] = {"", "info", "warning", "error"};
    std::string text;
    for (const Json::Value &event : events) {
        const int level = event["level"].asInt();
        if (json) {
            Json::StreamWriterBuilder builder;
            builder["indentation"] = "";
            text += Json::writeString(builder, event) + "\n";
            continue;
        }
        text += timeText(event["time"]) + "  " + (level >= 1 && level <= 3 ? levels[level] : "?") + "  " +
                shown(event["message"].asString()) + "\n";
    }
    print(text);
}

/// Prints new events as they come, until somebody stops it.
[[noreturn]] void followEvents(Json::Value input, bool json)
{
    constexpr auto LOOK_INTERVAL = std::chrono::seconds(1);
    constexpr int ALL = 10000;
    while (true) {
        const Json::Value events = request(Method::Get, "/events", input);
        printEvents(events, json);
        if (!events.empty())
            input["since"] = events[events.size() - 1]["event_id"];
        input["count"] = ALL;
        std::this_thread::sleep_for(LOOK_INTERVAL);
    }
}

void addEvents(Commands &commands)
{
    auto a = std::make_shared<Arguments>();
    auto follow = std::make_shared<bool>(false);
    CLI::App &verb = addVerb(commands, commands.app, "events", "Show the latest events", [a, follow] {
        if (*follow)
            followEvents(a->input, a->json);
        const Json::Value events = request(Method::Get, "/events", a->input);
        if (a->json)
            return printJson(events);
        printEvents(events, false);
    });
    verb.footer("");
    addNumber(verb, "--last", a->input, "count", "How many of them (20)");
    verb.add_flag("--follow", *follow, "Go on with each new one, as one line of JSON with --json");
    addJson(verb, a->json);
}

} // namespace

void addUpkeepVerbs(Commands &commands)
{
    addRetention(commands);
    addSchedules(commands);
    addEvents(commands);
}

} // namespace cli
