// iscsictl: parse, run, and say what went wrong.
#include "cli/Commands.h"
#include "cli/Display.h"
#include "cli/Request.h"
#include "iscsiwebapi/ISCSIErrorCode.h"

#include <cstdio>
#include <unistd.h>

namespace {

constexpr int EXIT_FAILED = 1;
constexpr int EXIT_USAGE = 2;

/// The nouns and verbs of the command line, "lun create", as far as they were recognised.
std::string commandName(const CLI::App &app)
{
    const auto chosen = app.get_subcommands();
    if (chosen.empty())
        return "";
    const std::string rest = commandName(*chosen.front());
    return chosen.front()->get_name() + (rest.empty() ? "" : " " + rest);
}

/// What is wrong with words that do not parse. A word that is no noun or verb is named; the parser
/// only says that one is missing.
std::string parseProblem(const CLI::App &app, const CLI::ParseError &error)
{
    const auto chosen = app.get_subcommands();
    if (!chosen.empty())
        return parseProblem(*chosen.front(), error);
    const auto unknown = app.remaining();
    const bool wants_command = app.get_require_subcommand_min() > 0;
    return wants_command && !unknown.empty() ? "there is no '" + unknown.front() + "' here" : error.what();
}

void complain(const std::string &command, const std::string &text)
{
    fprintf(stderr, "iscsictl: %s%s%s\n", command.c_str(), command.empty() ? "" : ": ", cli::shown(text).c_str());
}

int usageError(const std::string &command, const std::string &text)
{
    complain(command, text);
    fprintf(stderr, "Try 'iscsictl %s%s--help'.\n", command.c_str(), command.empty() ? "" : " ");
    return EXIT_USAGE;
}

/// What to do about a failure, where that can be said; else null.
const char *hint(int code)
{
    switch (code) {
    case ISCSI::ERR_BAD_LUN_UUID:
    case ISCSI::ERR_NO_SUCH_LUN:
        return "'iscsictl lun list' shows the LUNs";
    case ISCSI::ERR_BAD_TARGET_ID:
    case ISCSI::ERR_NO_SUCH_TARGET:
    case ISCSI::ERR_FAILED_TO_LOAD_TARGET:
        return "'iscsictl target list' shows the targets";
    case ISCSI::ERR_NO_SUCH_NODE:
        return "'iscsictl node list' shows the nodes, 'iscsictl node join' adds one";
    case ISCSI::ERR_FAILED_TO_LOGIN:
        return cli::remote() ? nullptr
                             : "a node that has forgotten this appliance is removed and joined again: 'iscsictl node'";
    case ISCSI::ERR_FAILED_TO_SEND_THE_REQUEST:
        return cli::remote() ? "'login' shows a key that is new or has changed, and asks about it" : nullptr;
    case ISCSI::ERR_BAD_VLUN_UUID:
        return "'iscsictl vlun list' shows the virtual LUNs";
    case ISCSI::ERR_LUN_IS_MAPPED:
        return "'iscsictl lun show' tells to which targets, 'iscsictl lun unmap' removes it from them";
    case ISCSI::ERR_BAD_LUN_LOCATION:
        return "'iscsi-host volume list' shows the volumes, 'iscsi-host volume add' adds one";
    case ISCSI::ERR_BAD_SNAPSHOT_UUID:
    case ISCSI::ERR_NO_SUCH_SNAPSHOT:
        return "'iscsictl snapshot list' shows the snapshots; of a LUN whose name has an underscore, take the UUID";
    case ISCSI::ERR_LUN_IS_LOCKED:
        return "'iscsictl lun show' tells what is done with it; try again when that has ended";
    case ISCSI::ERR_SNAPSHOT_IS_LOCKED:
        return "'iscsictl snapshot show' tells who locks it, 'iscsictl snapshot unlock --app-key' takes a key's lock "
               "back";
    case ISCSI::ERR_CANNOT_DELETE_LOCKED_SNAPSHOT:
        return "'iscsictl snapshot unlock' lets it be deleted";
    case ISCSI::ERR_REACH_MAX_SNAPSHOT_COUNT:
        return "'iscsictl snapshot delete' makes room, 'iscsictl retention set' keeps it";
    case ISCSI::ERR_BAD_EXPORTING_LOCATION:
        return "the directory's path has to be absolute and outside of where LUNs and snapshots lie";
    case ISCSI::ERR_NOW_IS_NOT_EXPORTING:
    case ISCSI::ERR_EXPORT_INTERRUPT:
        return "'iscsictl snapshot show' tells whether it is exported";
    case ISCSI::ERR_NOW_IS_NOT_IMPORTING:
    case ISCSI::ERR_IMPORT_INTERRUPT:
        return "'iscsictl lun show' tells whether something is imported into it";
    default:
        return cli::remote() || geteuid() == 0 ? nullptr : "the appliance's state is usually root's alone";
    }
}

int failure(const std::string &command, const cli::Failure &failed)
{
    std::string text = std::string(ISCSI::ErrorCodeToString(failed.code)) + " (" + std::to_string(failed.code) + ")";
    if (!failed.reason.empty())
        text += ": " + failed.reason;
    complain(command, text);
    if (const char *advice = hint(failed.code))
        fprintf(stderr, "iscsictl: hint: %s\n", advice);
    return EXIT_FAILED;
}

int runCommandLine(int argc, char **argv)
{
    const auto commands = cli::makeCommands();
    std::string command;
    try {
        commands->app.parse(argc, argv);
        command = commandName(commands->app);
        if (!commands->host.empty())
            cli::connect(commands->host, commands->fingerprint);
        commands->run();
        return 0;
    } catch (const CLI::Success &asked_for_help) {
        return commands->app.exit(asked_for_help);
    } catch (const CLI::ParseError &e) {
        return usageError(commandName(commands->app), parseProblem(commands->app, e));
    } catch (const cli::UsageError &e) {
        return usageError(command, e.reason);
    } catch (const cli::Failure &e) {
        return failure(command, e);
    }
}

/// Verbs that the shells and the build use; their words are not ours to parse.
int runHelper(const std::string &verb, const std::vector<std::string> &words)
{
    try {
        if (verb == "__complete")
            cli::complete(words);
        else
            cli::printManual(words.empty() ? "" : words[0]);
        return 0;
    } catch (const cli::Failure &) {
        return EXIT_FAILED;
    } catch (const cli::UsageError &e) {
        return usageError(verb, e.reason);
    }
}

} // namespace

int main(int argc, char **argv)
{
    try {
        const std::string first = argc > 1 ? argv[1] : "";
        if (first == "__complete" || first == "__manual")
            return runHelper(first, std::vector<std::string>(argv + 2, argv + argc));
        return runCommandLine(argc, argv);
    } catch (const std::exception &e) {
        complain("", e.what());
        return EXIT_FAILED;
    }
}
