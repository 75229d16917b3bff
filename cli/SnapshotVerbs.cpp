#include "cli/Commands.h"

#include "cli/Display.h"
#include "cli/Request.h"
#include "cli/Values.h"
#include "cli/Watch.h"

#include <algorithm>

namespace cli {

using webapi::Method;

namespace {

constexpr char SELECTOR_HELP[] = "LUN_NAME, UUID or place in the list of the snapshot";

void addSelector(CLI::App &verb, Arguments &arguments)
{
    addPositional(verb, "SNAPSHOT", arguments.selector, SELECTOR_HELP);
}

std::string nameOf(const Json::Value &snapshot)
{
    return snapshot["name"].asString() + " of LUN " + snapshot["lun_name"].asString();
}

std::string locksOf(const Json::Value &snapshot)
{
    std::string text = snapshot["is_user_locked"].asBool() ? "user" : "";
    for (const Json::Value &key : snapshot["locked_app_keys"])
        text += (text.empty() ? "" : ", ") + key.asString();
    return text.empty() ? "no" : text;
}

/// One line on what became of the snapshot, or its JSON form.
void printSnapshot(const Json::Value &snapshot, bool json, const char *done)
{
    if (json)
        return printJson(snapshot);
    const int number = snapshot["loaded_number"].asInt();
    print(std::string(done) + " snapshot " + shown(nameOf(snapshot)) + ": " + snapshot["uuid"].asString() +
          (number ? ", read as LUN " + std::to_string(number) + " of the LUN's targets" : "") + "\n");
}

/// How far the action is that locks the LUN.
Progress lunProgress(const std::string &lun)
{
    Progress progress;
    progress.running = request(Method::Get, lunPath(lun))["is_action_locked"].asBool();
    return progress;
}

void addTake(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    CLI::App &verb = addVerb(commands, noun, "take", "Take a snapshot of a LUN, also while it is in use", [a] {
        const std::string path = lunPath(a->selector, "/snapshots");
        if (!a->watch)
            return printSnapshot(request(Method::Post, path, a->input), a->json, "Took");
        Action action;
        action.path = path;
        action.input = a->input;
        action.title = "Taking a snapshot of " + a->selector;
        action.later = "'iscsictl snapshot list' shows it when it is there";
        action.ask = [a] { return lunProgress(a->selector); };
        printSnapshot(watch(action), a->json, "Took");
    });
    addPositional(verb, "LUN", a->selector, "Name, UUID or place in the list of the LUN");
    addText(verb, "--name", "NAME", a->input, "name", "Name of the snapshot, one that its LUN has not yet (chosen)");
    addText(verb, "--note", "TEXT", a->input, "description", "What to remember about it");
    addText(verb, "--taken-by", "WHO", a->input, "taken_by", "Who or what takes it");
    addFlag(verb, "--lock", a->input, "is_user_locked", "Lock it against deletion");
    addFlag(verb, "--app-consistent", a->input, "is_app_consistent", "Mark it: its applications are quiet now");
    addFlag(verb, "--scheduled", a->input, "is_scheduled", "Mark it as taken by a schedule");
    addWatch(verb, a->watch);
    addJson(verb, a->json);
}

void printList(const Json::Value &snapshots, bool of_lun)
{
    std::vector<std::pair<std::string, Align>> columns;
    if (!of_lun)
        columns.emplace_back("#", Align::Right);
    columns.insert(columns.end(), {{"LUN", Align::Left},
                                   {"NAME", Align::Left},
                                   {"TIME", Align::Left},
                                   {"SIZE", Align::Right},
                                   {"LOCKED", Align::Left},
                                   {"TAKEN BY", Align::Left},
                                   {"STATUS", Align::Left},
                                   {"UUID", Align::Left}});
    Table table(columns);
    size_t index = 0;
    for (const Json::Value &snapshot : snapshots) {
        std::vector<std::string> cells;
        if (!of_lun)
            cells.push_back(std::to_string(++index));
        for (const std::string &cell :
             {snapshot["lun_name"].asString(), snapshot["name"].asString(), timeText(snapshot["snapshot_time"]),
              sizeText(snapshot["total_size"]), locksOf(snapshot), snapshot["taken_by"].asString(),
              snapshot["status"].asString(), snapshot["uuid"].asString()})
            cells.push_back(cell);
        table.add(std::move(cells));
    }
    print(table.text());
}

void addList(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    CLI::App &verb = addVerb(commands, noun, "list", "List the snapshots of all LUNs, or of one", [a] {
        if (!a->selector.empty())
            a->input["lun"] = a->selector;
        const Json::Value snapshots = request(Method::Get, "/snapshots", a->input);
        if (a->json)
            return printJson(snapshots);
        printList(snapshots, a->input.isMember("lun"));
    });
    addPositional(verb, "LUN", a->selector, "Name, UUID or place in the list of the LUN").required(false);
    addJson(verb, a->json);
}

void printDetails(const Json::Value &snapshot)
{
    print(keyValues({
        {"Name", snapshot["name"].asString()},
        {"LUN", snapshot["lun_name"].asString()},
        {"UUID", snapshot["uuid"].asString()},
        {"Number", snapshot["snapshot_id"].asString()},
        {"Time", timeText(snapshot["snapshot_time"])},
        {"Recorded", timeText(snapshot["create_time"])},
        {"Taken by", snapshot["taken_by"].asString()},
        {"Note", snapshot["description"].asString()},
        {"Size", exactSizeText(snapshot["total_size"])},
        {"Allocated", exactSizeText(snapshot["mapped_size"])},
        {"Applications quiet", yesNo(snapshot["is_app_consistent"])},
        {"Locked", locksOf(snapshot)},
        {"In use by an action", yesNo(snapshot["is_action_locked"])},
        {"Loaded as LUN", snapshot["loaded_number"].asInt() ? snapshot["loaded_number"].asString() : "-"},
        {"Status", snapshot["status"].asString()},
        {"Volume", snapshot["root_path"].asString()},
    }));
}

void addShow(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    CLI::App &verb = addVerb(commands, noun, "show", "Show one snapshot, its locks and its export", [a] {
        const Json::Value snapshot = request(Method::Get, snapshotPath(a->selector));
        if (a->json)
            return printJson(snapshot);
        printDetails(snapshot);
        printTransfer("Export", snapshotPath(snapshot["uuid"].asString(), "/export"));
    });
    addSelector(verb, *a);
    addJson(verb, a->json);
}

void addDelete(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    auto selectors = std::make_shared<std::vector<std::string>>();
    CLI::App &verb = addVerb(commands, noun, "delete", "Delete snapshots", [a, selectors] {
        if (!a->yes)
            requireTerminal();
        // All first: a deletion changes the places of the others in the list.
        std::vector<Json::Value> snapshots;
        for (const std::string &selector : *selectors) {
            const Json::Value snapshot = request(Method::Get, snapshotPath(selector));
            const bool again = std::any_of(snapshots.begin(), snapshots.end(),
                                           [&](const Json::Value &other) { return other["uuid"] == snapshot["uuid"]; });
            if (!again)
                snapshots.push_back(snapshot);
        }
        for (const Json::Value &snapshot : snapshots) {
            if (!a->yes && !confirmed("Delete snapshot " + shown(nameOf(snapshot)) + "?"))
                continue;
            request(Method::Delete, snapshotPath(snapshot["uuid"].asString()), a->input);
            printSnapshot(snapshot, false, "Deleted");
        }
    });
    addPositionals(verb, "SNAPSHOT", *selectors, "LUN_NAMEs, UUIDs or places in the list of the snapshots");
    addText(verb, "--deleted-by", "WHO", a->input, "deleted_by", "Who or what deletes them, for the log");
    addYes(verb, a->yes);
}

void addRestore(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    CLI::App &verb = addVerb(commands, noun, "restore", "Set a LUN back to a snapshot, also while it is in use", [a] {
        if (!a->yes)
            requireTerminal();
        const Json::Value snapshot = request(Method::Get, snapshotPath(a->selector));
        const std::string lun = snapshot["lun_name"].asString();
        const std::string question = "Set LUN " + shown(lun) + " back to its snapshot " +
                                     shown(snapshot["name"].asString()) + " of " + timeText(snapshot["snapshot_time"]) +
                                     "? What was written since is lost.";
        if (!a->yes && !confirmed(question))
            return;
        Action action;
        action.path = snapshotPath(snapshot["uuid"].asString(), "/restore");
        action.input = Json::objectValue;
        action.title = "Restoring LUN " + lun;
        action.later = "'iscsictl lun show' tells its status, 'iscsictl events' when it is done";
        action.ask = [lun] { return lunProgress(lun); };
        if (a->watch) {
            printSnapshot(watch(action), a->json, "Restored");
            return;
        }
        const Json::Value started = request(Method::Post, action.path);
        if (a->json)
            return printJson(started);
        print(shown(action.title + " to snapshot " + snapshot["name"].asString()) + "; " + action.later + "\n");
    });
    addSelector(verb, *a);
    addYes(verb, a->yes);
    addWatch(verb, a->watch);
    addJson(verb, a->json);
}

void addClone(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    CLI::App &verb = addVerb(commands, noun, "clone", "Make a new LUN from a snapshot", [a] {
        Action action;
        action.path = snapshotPath(a->selector, "/clone");
        action.input = a->input;
        const std::string name = a->input["name"].asString();
        action.title = "Cloning to LUN " + name;
        action.later = "'iscsictl lun show' tells its status, 'iscsictl events' when it is done";
        action.ask = [name] { return lunProgress(name); };
        const Json::Value lun = a->watch ? watch(action) : request(Method::Post, action.path, action.input);
        if (a->json)
            return printJson(lun);
        const std::string uuid = lun["uuid"].asString();
        print(a->watch ? "Cloned to LUN " + shown(name) + ": " + uuid + "\n"
                       : shown(action.title) + ", " + uuid + "; " + action.later + "\n");
    });
    addSelector(verb, *a);
    addText(verb, "NEWNAME", "", a->input, "name", "Name of the new LUN").required();
    addWatch(verb, a->watch);
    addJson(verb, a->json);
}

void addLock(Commands &commands, CLI::App &noun, const char *name, const char *description, const char *done)
{
    auto a = std::make_shared<Arguments>();
    CLI::App &verb = addVerb(commands, noun, name, description, [a, name, done] {
        const std::string path = snapshotPath(a->selector, std::string("/") + name);
        printSnapshot(request(Method::Post, path, a->input), a->json, done);
    });
    addSelector(verb, *a);
    addText(verb, "--app-key", "KEY", a->input, "app_key", "The lock of an application, in place of its user's");
    addJson(verb, a->json);
}

void addPlain(Commands &commands, CLI::App &noun, const char *name, const char *description, const char *done,
              const char *trash)
{
    auto a = std::make_shared<Arguments>();
    CLI::App &verb = addVerb(commands, noun, name, description, [a, name, done] {
        const std::string path = snapshotPath(a->selector, std::string("/") + name);
        printSnapshot(request(Method::Post, path, a->input), a->json, done);
    });
    addSelector(verb, *a);
    if (trash)
        addFlag(verb, "--trash", a->input, "is_for_trash", trash);
    addJson(verb, a->json);
}

} // namespace

void addSnapshotVerbs(Commands &commands)
{
    CLI::App &noun = addNoun(commands, "snapshot", "Snapshots: take, restore, clone, lock, export");
    addTake(commands, noun);
    addList(commands, noun);
    addShow(commands, noun);
    addDelete(commands, noun);
    addRestore(commands, noun);
    addClone(commands, noun);
    addLock(commands, noun, "lock", "Lock a snapshot against deletion", "Locked");
    addLock(commands, noun, "unlock", "Take a lock of a snapshot back", "Unlocked");
    addPlain(commands, noun, "stop", "Stop the action that holds a snapshot and its LUN", "Nothing holds", nullptr);
    addPlain(commands, noun, "load", "Put a snapshot, read-only, into the running iSCSI service", "Loaded",
             "Take it out of the trash instead");
    addPlain(commands, noun, "unload", "Take a snapshot out of the running iSCSI service", "Unloaded",
             "Put it into the trash instead");
}

} // namespace cli
