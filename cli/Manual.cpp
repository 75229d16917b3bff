#include "cli/Commands.h"

#include "cli/Request.h"

#include <fstream>

namespace cli {
namespace {

/// A text as roff prints it, wherever it stands in a line.
std::string roff(const std::string &text)
{
    std::string out;
    for (char c : text) {
        if (c == '\\')
            out += "\\e";
        else if (c == '-')
            out += "\\-";
        else if ((c == '.' || c == '\'') && (out.empty() || out.back() == '\n'))
            out += std::string("\\&") + c;
        else
            out += c;
    }
    return out;
}

std::string optionText(const CLI::Option &option)
{
    if (option.get_positional())
        return "\\fI" + roff(option.get_name(true)) + "\\fR";
    std::string text;
    for (const std::string &name : option.get_snames())
        text += "\\fB" + roff("-" + name) + "\\fR, ";
    text += "\\fB" + roff("--" + option.get_lnames().front()) + "\\fR";
    if (option.get_items_expected_max() > 0)
        text += " \\fI" + roff(option.get_type_name()) + "\\fR";
    return text;
}

/// "lun create [OPTION]... NAME --size SIZE": what has to be given, spelled out.
std::string synopsis(const CLI::App &verb, const std::string &path)
{
    std::string text = "\\fB" + roff(path) + "\\fR";
    for (const CLI::Option *option : shownOptions(verb)) {
        if (option->get_required())
            text += " " + optionText(*option) + (option->get_items_expected_max() > 1 ? "..." : "");
    }
    return text + " [\\fIOPTION\\fR]...";
}

void addVerbs(std::string &text, const CLI::App &app, const std::string &path)
{
    for (const CLI::App *sub : shownSubcommands(app)) {
        const std::string name = path + " " + sub->get_name();
        if (!shownSubcommands(*sub).empty()) {
            addVerbs(text, *sub, name);
            continue;
        }
        text += ".SS " + roff(name.substr(1)) + "\n" + synopsis(*sub, name.substr(1)) + "\n.PP\n" +
                roff(sub->get_description()) + ".\n";
        for (const CLI::Option *option : shownOptions(*sub)) {
            if (option != sub->get_help_ptr())
                text += ".TP\n" + optionText(*option) + "\n" + roff(option->get_description()) + ".\n";
        }
        if (!sub->get_footer().empty())
            text += ".PP\n.nf\n" + roff(sub->get_footer()) + "\n.fi\n";
    }
}

} // namespace

void printManual(const std::string &source)
{
    std::ifstream in(source);
    if (!in)
        throw UsageError{source + " cannot be read"};
    std::string text;
    for (std::string line; std::getline(in, line);) {
        if (line == "@COMMANDS@")
            addVerbs(text, makeCommands()->app, "");
        else
            text += line + "\n";
    }
    print(text);
}

} // namespace cli
