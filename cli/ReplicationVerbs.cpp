// Replication of LUNs to a peer.
#include "cli/Commands.h"

#include "cli/Display.h"
#include "cli/Request.h"
#include "cli/Size.h"
#include "cli/Values.h"
#include "cli/Watch.h"

namespace cli {

using webapi::Method;

namespace {

constexpr char SELECTOR_HELP[] = "UUID or place in the list (\"rep#1\") of the replication";
constexpr char SNAPSHOT_HELP[] = "LUN_NAME, UUID or place in the list of the snapshot";
constexpr int STOPPED = -19; // what a sending that was stopped on purpose ends with

std::string taskPath(const std::string &selector, const std::string &rest = "")
{
    return "/replications/" + webapi::pathSegment(selector) + rest;
}

const char *roleOf(const Json::Value &task)
{
    return task["is_source"].asBool() ? "source" : "destination";
}

/// A verb on one replication.
CLI::App &addTaskVerb(Commands &commands, CLI::App &noun, const char *name, const char *description,
                      const std::shared_ptr<Arguments> &a, std::function<void()> action)
{
    CLI::App &verb = addVerb(commands, noun, name, description, std::move(action));
    addPositional(verb, "REPLICATION", a->selector, SELECTOR_HELP);
    return verb;
}

void printTask(const Json::Value &task, bool json, const std::string &done)
{
    if (json)
        return printJson(task);
    print(done + " replication of LUN " + shown(task["lun_name"].asString()) + " with " +
          shown(task["peer"].asString()) + ": " + task["uuid"].asString() + "\n");
}

void addCreate(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    CLI::App &verb = addVerb(commands, noun, "create", "Pair a LUN with a new one on a paired appliance", [a] {
        a->input["lun"] = a->selector;
        printTask(request(Method::Post, "/replications", a->input), a->json, "Created");
    });
    addPositional(verb, "LUN", a->selector, "Name, UUID or place in the list of the LUN");
    addText(verb, "--node", "NODE", a->input, "node", "Host name, UUID or place in the list of the peer").required();
    addText(verb, "--location", "LOCATION", a->input, "location", "Volume on the peer").required();
    addText(verb, "--name", "NAME", a->input, "name", "Name of the new LUN on the peer").required();
    addJson(verb, a->json);
}

void addList(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    CLI::App &verb = addVerb(commands, noun, "list", "List the replications", [a] {
        const Json::Value tasks = request(Method::Get, "/replications");
        if (a->json)
            return printJson(tasks);
        Table table({{"#", Align::Right},
                     {"LUN", Align::Left},
                     {"ROLE", Align::Left},
                     {"PEER", Align::Left},
                     {"STATE", Align::Left},
                     {"UUID", Align::Left}});
        size_t index = 0;
        for (const Json::Value &task : tasks)
            table.add({std::to_string(++index), task["lun_name"].asString(), roleOf(task), task["peer"].asString(),
                       task.isMember("problem") ? task["problem"].asString()
                                                : (task["is_locked"].asBool() ? "at work" : "idle"),
                       task["uuid"].asString()});
        print(table.text());
    });
    addJson(verb, a->json);
}

void addShow(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    CLI::App &verb = addTaskVerb(commands, noun, "show", "Show a replication", a, [a] {
        const Json::Value task = request(Method::Get, taskPath(a->selector));
        if (a->json)
            return printJson(task);
        print(keyValues({{"UUID", task["uuid"].asString()},
                         {"Role", roleOf(task)},
                         {"LUN", task["lun_name"].asString()},
                         {"Volume", task["root_path"].asString()},
                         {"Peer", task["peer"].asString()},
                         {"Source LUN", task["src_lun_uuid"].asString()},
                         {"Destination LUN", task["dst_lun_uuid"].asString()},
                         {"Base version", task["base_version"].asString()},
                         {"At work", yesNo(task["is_locked"])}}));
    });
    addJson(verb, a->json);
}

std::string whyFailed(const Json::Value &sending)
{
    const std::string reason = sending["reason"].asString();
    return sending["error_text"].asString() + (reason.empty() ? "" : ": " + shown(reason));
}

void addStatus(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    CLI::App &verb = addTaskVerb(commands, noun, "status", "Show how the last sending stands", a, [a] {
        const Json::Value sending = request(Method::Get, taskPath(a->selector, "/sending"));
        if (a->json)
            return printJson(sending);
        const int error = sending["error"].asInt();
        print(keyValues({{"At work", yesNo(sending["is_locked"])},
                         {"Sent", shownSize(sending["sent_size"].asUInt64())},
                         {"To send", shownSize(sending["send_total_size"].asUInt64())},
                         {"Ended with", error == 0         ? "no error"
                                        : error == STOPPED ? "stopped on purpose"
                                                           : whyFailed(sending)}}));
    });
    addJson(verb, a->json);
}

/// How far the sending is; throws when it has failed.
Progress sendingProgress(const std::string &task)
{
    const Json::Value told = request(Method::Get, taskPath(task, "/sending"));
    Progress progress;
    progress.running = told["is_locked"].asBool();
    progress.done = told["sent_size"].asUInt64();
    progress.total = told["send_total_size"].asUInt64();
    if (progress.running && progress.done == progress.total)
        progress.done = progress.total = 0; // the counts of the sending before
    const int error = told["error"].asInt();
    if (!progress.running && error != 0)
        throw Failure{error, error == STOPPED ? "it was stopped on purpose" : told["reason"].asString()};
    return progress;
}

void addSend(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    auto snapshot = std::make_shared<std::string>();
    CLI::App &verb =
        addTaskVerb(commands, noun, "send", "Send a snapshot to the peer, what changed since the last one", a, [=] {
            a->input["snapshot"] = *snapshot;
            Action action;
            action.path = taskPath(a->selector, "/send");
            action.input = a->input;
            action.title = "Sending " + *snapshot;
            action.later = "'iscsictl replication status' tells how far it is, 'iscsictl replication stop' stops it";
            action.ask = [a] { return sendingProgress(a->selector); };
            const Json::Value task = a->watch ? watch(action) : request(Method::Post, action.path, action.input);
            if (a->json)
                return printJson(a->watch ? request(Method::Get, taskPath(a->selector, "/sending")) : task);
            if (!a->watch)
                return print(shown(action.title + "; " + action.later) + "\n");
            const Json::Value end = request(Method::Get, taskPath(a->selector, "/sending"));
            print("Sent " + shown(*snapshot) + ": " + shownSize(end["sent_size"].asUInt64()) + " moved\n");
        });
    addPositional(verb, "SNAPSHOT", *snapshot, SNAPSHOT_HELP);
    addText(verb, "--address", "ADDRESS", a->input, "address", "Data address of the peer (the one that it gives)");
    addNumber(verb, "--port", a->input, "port", "Port of the data address (the one that the peer gives)");
    addFlag(verb, "--encrypted", a->input, "encrypted", "Send inside TLS; the port is then that of TLS");
    addWatch(verb, a->watch);
    addJson(verb, a->json);
}

void addUnsynced(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    auto snapshot = std::make_shared<std::string>();
    CLI::App &verb =
        addTaskVerb(commands, noun, "unsynced", "Count the bytes that sending a snapshot would move", a, [=] {
            a->input["snapshot"] = *snapshot;
            Action action;
            action.path = taskPath(a->selector, "/unsynced");
            action.input = a->input;
            action.title = "Comparing " + *snapshot;
            action.later = "the same command tells again";
            Json::Value count;
            action.ask = [a, &count] {
                count = request(Method::Get, taskPath(a->selector, "/unsynced"));
                Progress progress;
                progress.running = !count["is_completed"].asBool();
                return progress;
            };
            watch(action);
            if (a->json)
                return printJson(count);
            print(shownSize(count["unsync_size"].asUInt64()) + "\n");
        });
    addPositional(verb, "SNAPSHOT", *snapshot, SNAPSHOT_HELP);
    addText(verb, "--base", "SNAPSHOT", a->input, "base", "Snapshot that the peer has (none: everything counts)");
    addJson(verb, a->json);
}

void addRole(Commands &commands, CLI::App &noun, const char *name, const char *description, const char *done)
{
    auto a = std::make_shared<Arguments>();
    const std::string rest = std::string("/") + name;
    CLI::App &verb = addTaskVerb(commands, noun, name, description, a, [a, rest, done] {
        printTask(request(Method::Post, taskPath(a->selector, rest)), a->json, done);
    });
    addJson(verb, a->json);
}

void addStop(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    addTaskVerb(commands, noun, "stop", "Stop the sending under way", a,
                [a] { request(Method::Post, taskPath(a->selector, "/stop")); });
}

void addRemove(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    CLI::App &verb = addTaskVerb(commands, noun, "remove", "Remove this side's half of a replication", a,
                                 [a] { request(Method::Delete, taskPath(a->selector), a->input); });
    addFlag(verb, "--delete-lun", a->input, "delete_lun",
            "On the destination side delete the LUN too, instead of making it an ordinary one");
}

} // namespace

void addReplicationVerbs(Commands &commands)
{
    CLI::App &noun = addNoun(commands, "replication",
                             "Copies of LUNs on paired appliances, brought up to date by"
                             " sending snapshots");
    addCreate(commands, noun);
    addList(commands, noun);
    addShow(commands, noun);
    addSend(commands, noun);
    addStatus(commands, noun);
    addStop(commands, noun);
    addUnsynced(commands, noun);
    addRole(commands, noun, "promote", "Make the destination here the source (fail over)", "Promoted");
    addRole(commands, noun, "demote", "Make the source here the destination", "Demoted");
    addRemove(commands, noun);
}

} // namespace cli
