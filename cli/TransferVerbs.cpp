// Clones of LUNs, exports of snapshots and imports into LUNs.
#include "cli/Commands.h"

#include "cli/Display.h"
#include "cli/Request.h"
#include "cli/Size.h"
#include "cli/Watch.h"
#include "iscsiwebapi/ISCSIErrorCode.h"

#include <filesystem>

namespace cli {

using webapi::Method;

namespace {

constexpr char LUN_HELP[] = "Name, UUID or place in the list of the LUN";
constexpr char SNAPSHOT_HELP[] = "LUN_NAME, UUID or place in the list of the snapshot";

/// An export or an import, as the handlers tell it.
struct Transfer {
    std::string path; ///< where its progress is asked for
    int idle;         ///< the steps of a transfer that is not there, and of one that runs
    int busy;
    int interrupted; ///< what to say when it was stopped or killed
};

Transfer exportOf(const std::string &snapshot)
{
    return {snapshotPath(snapshot, "/export"), ISCSI::ERR_NOW_IS_NOT_EXPORTING, ISCSI::ERR_NOW_IS_EXPORTING,
            ISCSI::ERR_EXPORT_INTERRUPT};
}

Transfer importOf(const std::string &lun)
{
    return {lunPath(lun, "/import"), ISCSI::ERR_NOW_IS_NOT_IMPORTING, ISCSI::ERR_NOW_IS_IMPORTING,
            ISCSI::ERR_IMPORT_INTERRUPT};
}

/// How far it is. `complete` tells of one that is over and left no outcome whether it got to its end.
Progress askTransfer(const Transfer &transfer, const std::function<bool()> &complete)
{
    const Json::Value told = request(Method::Get, transfer.path);
    Progress progress;
    progress.done = told["done_bytes"].asUInt64();
    progress.total = told["total_bytes"].asUInt64();
    progress.running = told["is_action_locked"].asBool();
    const int step = told["step"].asInt();
    if (progress.running || step == 0 || (step == transfer.idle && complete()))
        return progress;
    if (step == transfer.idle || step == transfer.busy || step == transfer.interrupted)
        throw Failure{transfer.interrupted, "it was stopped before its end"};
    throw Failure{step, ""};
}

/// A path on the appliance: relative ones are those of this machine.
std::string absolutePath(const std::string &path)
{
    if (remote() && std::filesystem::path(path).is_relative())
        throw UsageError{"'" + path + "' is a directory of the appliance: give its whole path"};
    return std::filesystem::absolute(path).lexically_normal().string();
}

void run(Arguments &a, Action &action, const std::string &done)
{
    action.input = a.input;
    const Json::Value answer = a.watch ? watch(action) : request(Method::Post, action.path, action.input);
    if (a.json)
        return printJson(answer);
    print(shown(a.watch ? done : action.title + "; " + action.later) + "\n");
}

void addExport(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    auto folder = std::make_shared<std::string>();
    CLI::App &verb = addVerb(commands, noun, "export", "Copy a snapshot into a directory", [a, folder] {
        const std::string destination = absolutePath(*folder);
        a->input["directory"] = destination;
        Action action;
        action.path = snapshotPath(a->selector, "/export");
        action.title = "Exporting " + a->selector + " to " + destination;
        action.later = "'iscsictl snapshot show' tells how far it is, 'iscsictl snapshot export-cancel' stops it";
        action.ask = [transfer = exportOf(a->selector), destination] {
            // An export's record gets its name last.
            return askTransfer(transfer, [&] {
                std::error_code ignored;
                return !remote() && std::filesystem::exists(destination + "/export.record", ignored);
            });
        };
        run(*a, action, "Exported " + a->selector + " to " + destination);
    });
    addPositional(verb, "SNAPSHOT", a->selector, SNAPSHOT_HELP);
    addPositional(verb, "DIRECTORY", *folder, "Directory for the export, made if missing");
    addWatch(verb, a->watch);
    addJson(verb, a->json);
}

void addImport(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    auto folder = std::make_shared<std::string>();
    CLI::App &verb = addVerb(commands, noun, "import", "Fill a LUN from an exported snapshot", [a, folder] {
        const std::string source = absolutePath(*folder);
        a->input["directory"] = source;
        Action action;
        action.path = lunPath(a->selector, "/import");
        action.title = "Importing " + source + " into LUN " + a->selector;
        action.later = "'iscsictl lun show' tells how far it is, 'iscsictl lun import-cancel' stops it";
        action.ask = [transfer = importOf(a->selector)] { return askTransfer(transfer, [] { return false; }); };
        run(*a, action, "Imported " + source + " into LUN " + a->selector);
    });
    addPositional(verb, "LUN", a->selector, LUN_HELP);
    addPositional(verb, "DIRECTORY", *folder, "Directory of the export");
    addWatch(verb, a->watch);
    addJson(verb, a->json);
}

void addCancel(Commands &commands, CLI::App &noun, const char *name, const char *description,
               Transfer (*transfer)(const std::string &), const char *kind, const char *kind_help)
{
    auto a = std::make_shared<Arguments>();
    CLI::App &verb = addVerb(commands, noun, name, description,
                             [a, transfer] { request(Method::Delete, transfer(a->selector).path); });
    addPositional(verb, kind, a->selector, kind_help);
}

void addClone(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    CLI::App &verb = addVerb(commands, noun, "clone", "Make a new LUN from a LUN as it is now", [a] {
        const Json::Value lun = request(Method::Post, lunPath(a->selector, "/clone"), a->input);
        if (a->json)
            return printJson(lun);
        print("Cloned to LUN " + shown(lun["name"].asString()) + ": " + lun["uuid"].asString() + "\n");
    });
    addPositional(verb, "LUN", a->selector, LUN_HELP);
    addText(verb, "NEWNAME", "", a->input, "name", "Name of the new LUN").required();
    addJson(verb, a->json);
}

} // namespace

void printTransfer(const char *kind, const std::string &path)
{
    const Json::Value told = request(Method::Get, path);
    const int step = told["step"].asInt();
    if (step != ISCSI::ERR_NOW_IS_EXPORTING && step != ISCSI::ERR_NOW_IS_IMPORTING)
        return;
    print(std::string(kind) + ": " + shownSize(told["done_bytes"].asUInt64()) + " of " +
          shownSize(told["total_bytes"].asUInt64()) + "\n");
}

void addTransferVerbs(Commands &commands)
{
    CLI::App &lun = *commands.app.get_subcommand("lun");
    addClone(commands, lun);
    addImport(commands, lun);
    addCancel(commands, lun, "import-cancel", "Stop the import into a LUN", importOf, "LUN", LUN_HELP);
    CLI::App &snapshot = *commands.app.get_subcommand("snapshot");
    addExport(commands, snapshot);
    addCancel(commands, snapshot, "export-cancel", "Stop the export of a snapshot", exportOf, "SNAPSHOT",
              SNAPSHOT_HELP);
}

} // namespace cli
