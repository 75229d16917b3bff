/// The definitions of nouns, verbs and options: what is parsed, helped with, completed and documented.
///
/// The type name of an option, and the name of a positional argument, says what can stand there: LUN,
/// SNAPSHOT, TARGET, NODE and VLUN are selectors, FILE and DIR paths, words between '|' the only ones allowed.
#pragma once

#include <CLI/CLI.hpp>
#include <json/value.h>

#include <functional>
#include <memory>
#include <string>

namespace cli {

struct Commands {
    CLI::App app{"Manage the LUNs and targets of an iSCSI storage appliance.", "iscsictl"};
    std::function<void()> run; ///< what the parsed verb does; throws Failure and UsageError
    std::string host;          ///< URL of the appliance to talk to; empty: this machine is it
    std::string fingerprint;   ///< that appliance's key; empty: the one that is known
};

std::unique_ptr<Commands> makeCommands();

void addLunVerbs(Commands &commands);
void addTargetVerbs(Commands &commands);
void addSnapshotVerbs(Commands &commands);
void addTransferVerbs(Commands &commands); ///< of the nouns "lun" and "snapshot", which exist
void addUpkeepVerbs(Commands &commands);
void addNodeVerbs(Commands &commands);
void addVlunVerbs(Commands &commands); ///< some of the noun "lun", which exists
void addReplicationVerbs(Commands &commands);
void addSessionVerbs(Commands &commands);

/// What most verbs take.
struct Arguments {
    std::string selector;
    Json::Value input{Json::objectValue}; ///< of the request
    bool json = false;
    bool yes = false;
    bool watch = false;
};

CLI::App &addNoun(Commands &commands, const char *name, const char *description);

/// A verb that, once parsed, makes `action` what the program does.
CLI::App &addVerb(Commands &commands, CLI::App &noun, const char *name, const char *description,
                  std::function<void()> action);

/// A required positional argument.
CLI::Option &addPositional(CLI::App &verb, const char *name, std::string &value, const char *description);
CLI::Option &addPositionals(CLI::App &verb, const char *name, std::vector<std::string> &values,
                            const char *description);

// Options that fill one key of the request's input.
CLI::Option &addText(CLI::App &verb, const char *flags, const char *type, Json::Value &input, const char *key,
                     const char *description);
CLI::Option &addNumber(CLI::App &verb, const char *flags, Json::Value &input, const char *key, const char *description);
CLI::Option &addSize(CLI::App &verb, const char *flags, Json::Value &input, const char *key, const char *description);
void addFlag(CLI::App &verb, const char *flags, Json::Value &input, const char *key, const char *description);

void addJson(CLI::App &verb, bool &json);
void addYes(CLI::App &verb, bool &yes);
void addWatch(CLI::App &verb, bool &watch);
void addPasswordFile(CLI::App &verb, std::string &file);

/// The options and positional arguments of a verb that are shown to people.
std::vector<const CLI::Option *> shownOptions(const CLI::App &verb);
std::vector<const CLI::App *> shownSubcommands(const CLI::App &app);

/// What can stand in an option's place, see above.
std::string argumentKind(const CLI::Option &option);

/// Prints what completes the last word, one candidate a line, or ":FILE" or ":DIR".
void complete(const std::vector<std::string> &words);
std::string completionScript(const std::string &shell);

/// Prints a manual page source with the line "@COMMANDS@" replaced by the commands.
void printManual(const std::string &source);

} // namespace cli
