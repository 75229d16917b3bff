#include "cli/Commands.h"

#include "cli/Request.h"
#include "cli/Size.h"

namespace cli {
namespace {

constexpr char FOOTER[] = "A LUN is selected by its name, its UUID or its place in the list (lun#1), a\n"
                          "target by its name, its ID or its place in the list (tg#1), a snapshot by the\n"
                          "names of its LUN and its own (vm1_nightly), its UUID or its place in the list\n"
                          "(sn#1), a node by its host name, its UUID or its place in the list (node#2).\n"
                          "Sizes are bytes, or take a binary unit: 512M, 1.5G, 10T.\n"
                          "Exit status: 0 done, 1 failed, 2 wrong arguments.";

/// Help without the lists of options that need or exclude each other; the parser tells when it matters.
class HelpFormatter : public CLI::Formatter {
    std::string make_option_opts(const CLI::Option *option) const override
    {
        std::string text;
        if (option->get_type_size() != 0 && !option->get_type_name().empty())
            text += " " + option->get_type_name();
        if (option->get_expected_max() > 1)
            text += " ...";
        if (option->get_required())
            text += " (required)";
        return text;
    }
};

} // namespace

std::unique_ptr<Commands> makeCommands()
{
    auto commands = std::make_unique<Commands>();
    CLI::App &app = commands->app;
    app.set_version_flag("--version", std::string("iscsictl ") + ISCSICTL_VERSION);
    app.footer(FOOTER);
    app.formatter(std::make_shared<HelpFormatter>());
    app.require_subcommand(1);
    app.add_option("--host", commands->host,
                   "Work on the appliance there, https://HOST[:PORT], and not on this machine")
        ->type_name("URL");
    app.add_option("--fingerprint", commands->fingerprint, "Key of that appliance, unless it is known by a login")
        ->type_name("FINGERPRINT");
    addLunVerbs(*commands);
    addSnapshotVerbs(*commands);
    addTransferVerbs(*commands);
    addUpkeepVerbs(*commands);
    addTargetVerbs(*commands);
    addNodeVerbs(*commands);
    addVlunVerbs(*commands);
    addReplicationVerbs(*commands);
    addSessionVerbs(*commands);

    CLI::App &completion = addNoun(*commands, "completion", "Print a script that completes words for a shell");
    for (const char *shell : {"bash", "zsh"})
        addVerb(*commands, completion, shell, "Print the script for this shell",
                [shell] { print(completionScript(shell)); });
    return commands;
}

CLI::App &addNoun(Commands &commands, const char *name, const char *description)
{
    CLI::App &noun = *commands.app.add_subcommand(name, description);
    noun.footer("");
    // One verb, so that what follows it is never taken for another.
    noun.require_subcommand(1);
    return noun;
}

CLI::App &addVerb(Commands &commands, CLI::App &noun, const char *name, const char *description,
                  std::function<void()> action)
{
    CLI::App &verb = *noun.add_subcommand(name, description);
    verb.callback([&commands, action = std::move(action)] { commands.run = action; });
    return verb;
}

CLI::Option &addPositional(CLI::App &verb, const char *name, std::string &value, const char *description)
{
    return *verb.add_option(name, value, description)->required()->type_name("");
}

CLI::Option &addPositionals(CLI::App &verb, const char *name, std::vector<std::string> &values, const char *description)
{
    return *verb.add_option(name, values, description)->required()->type_name("");
}

CLI::Option &addText(CLI::App &verb, const char *flags, const char *type, Json::Value &input, const char *key,
                     const char *description)
{
    const auto set = [&input, key](const std::string &text) { input[key] = text; };
    return *verb.add_option_function<std::string>(flags, set, description)->type_name(type);
}

CLI::Option &addSize(CLI::App &verb, const char *flags, Json::Value &input, const char *key, const char *description)
{
    const auto set = [&input, key, flags](const std::string &text) {
        const auto bytes = parseSize(text);
        if (!bytes)
            throw CLI::ValidationError(flags, "'" + text + "' is not a size; 10G, 512M and 1.5T are");
        input[key] = static_cast<Json::UInt64>(*bytes);
    };
    return *verb.add_option_function<std::string>(flags, set, description)->type_name("SIZE");
}

CLI::Option &addNumber(CLI::App &verb, const char *flags, Json::Value &input, const char *key, const char *description)
{
    const auto set = [&input, key](const unsigned &number) { input[key] = number; };
    return *verb.add_option_function<unsigned>(flags, set, description)->type_name("NUMBER");
}

void addFlag(CLI::App &verb, const char *flags, Json::Value &input, const char *key, const char *description)
{
    verb.add_flag_callback(
        flags, [&input, key] { input[key] = true; }, description);
}

void addJson(CLI::App &verb, bool &json)
{
    verb.add_flag("--json", json, "Print JSON, for programs");
}

void addYes(CLI::App &verb, bool &yes)
{
    verb.add_flag("-y,--yes", yes, "Do not ask");
}

void addWatch(CLI::App &verb, bool &watch)
{
    verb.add_flag("--watch", watch, "Show how far it is until it has ended; Ctrl-C ends the watching only");
}

void addPasswordFile(CLI::App &verb, std::string &file)
{
    verb.add_option("--password-file", file,
                    "File whose first line is the password, - for standard input; without it, you are asked")
        ->type_name("FILE");
}

std::vector<const CLI::Option *> shownOptions(const CLI::App &verb)
{
    return verb.get_options([](const CLI::Option *option) { return !option->get_group().empty(); });
}

std::vector<const CLI::App *> shownSubcommands(const CLI::App &app)
{
    return app.get_subcommands([](const CLI::App *) { return true; });
}

std::string argumentKind(const CLI::Option &option)
{
    return option.get_positional() ? option.get_name(true) : option.get_type_name();
}

} // namespace cli
