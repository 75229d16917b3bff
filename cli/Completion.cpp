#include "cli/Commands.h"

#include "cli/Request.h"

namespace cli {
namespace {

using Words = std::vector<std::string>;

// Both scripts leave everything to "iscsictl __complete", which knows the definitions.
constexpr char BASH[] = R"(# bash completion for iscsictl
_iscsictl() {
    local word=${COMP_WORDS[COMP_CWORD]} quote='' line
    local -a found=()
    case $word in
        [\'\"]*) quote=${word:0:1} word=${word:1} ;;
        *) word=${word//\\/} ;;
    esac
    COMPREPLY=()
    mapfile -t found < <("${COMP_WORDS[0]}" __complete "${COMP_WORDS[@]:1:COMP_CWORD-1}" "$word" 2>/dev/null)
    case ${found[0]-} in
        :FILE) compopt -o filenames && mapfile -t COMPREPLY < <(compgen -f -- "$word") ;;
        :DIR) compopt -o filenames && mapfile -t COMPREPLY < <(compgen -d -- "$word") ;;
        *)
            for line in "${found[@]}"; do
                [[ -n $quote ]] || printf -v line %q "$line"
                COMPREPLY+=("$line")
            done
            ;;
    esac
}
complete -F _iscsictl iscsictl
)";

constexpr char ZSH[] = R"(#compdef iscsictl
# zsh completion for iscsictl
_iscsictl() {
    local -a found
    found=("${(@f)$(${(Q)words[1]} __complete "${(@Q)words[2,CURRENT]}" 2>/dev/null)}")
    case $found[1] in
        :FILE) _files ;;
        :DIR) _files -/ ;;
        *) compadd -a found ;;
    esac
}
if [[ $funcstack[1] == _iscsictl ]]; then
    _iscsictl "$@"
else
    compdef _iscsictl iscsictl
fi
)";

void addKeys(Words &found, const char *path, const char *key)
{
    for (const Json::Value &object : request(webapi::Method::Get, path)) {
        if (!object[key].asString().empty())
            found.push_back(object[key].asString());
    }
}

/// A snapshot's name is that of its LUN up to the first underscore, and its own up to the first blank.
void addSnapshotNames(Words &found)
{
    for (const Json::Value &snapshot : request(webapi::Method::Get, "/snapshots")) {
        const std::string lun = snapshot["lun_name"].asString();
        const std::string name = snapshot["name"].asString();
        const bool has_name = lun.find('_') == std::string::npos && name.find(' ') == std::string::npos;
        found.push_back(has_name ? lun + "_" + name : snapshot["uuid"].asString());
    }
}

Words candidatesOf(const CLI::Option &option)
{
    const std::string kind = argumentKind(option);
    Words found;
    if (kind == "LUN")
        addKeys(found, "/luns", "name");
    else if (kind == "TARGET")
        addKeys(found, "/targets", "name");
    else if (kind == "SNAPSHOT")
        addSnapshotNames(found);
    else if (kind == "NODE")
        addKeys(found, "/nodes", "hostname");
    else if (kind == "VLUN")
        addKeys(found, "/vluns", "uuid");
    else if (kind == "FILE" || kind == "DIR")
        found.push_back(":" + kind);
    else if (kind == "DIRECTORY")
        found.push_back(":DIR");
    else if (kind.find('|') != std::string::npos && kind.find('=') == std::string::npos)
        found = CLI::detail::split(kind, '|');
    return found;
}

Words optionNames(const CLI::App &app)
{
    Words names;
    for (const CLI::Option *option : shownOptions(app)) {
        for (const std::string &name : option->get_lnames())
            names.push_back("--" + name);
    }
    return names;
}

const CLI::App *subcommand(const CLI::App &app, const std::string &name)
{
    const auto found = app.get_subcommands([&](const CLI::App *sub) { return sub->get_name() == name; });
    return found.empty() ? nullptr : found.front();
}

/// The option that takes its value from the words after it, among those that are not positional.
const CLI::Option *valueOption(const CLI::App &app, const std::string &word)
{
    const CLI::Option *option = app.get_option_no_throw(word);
    return option && !option->get_positional() && option->get_items_expected_max() > 0 ? option : nullptr;
}

/// Puts together what bash takes apart at colons, up to the last word.
Words rejoined(const Words &words)
{
    Words out;
    for (size_t i = 0; i < words.size(); ++i) {
        const bool last = i + 1 == words.size();
        const bool goes_on = i > 0 && !last && (words[i] == ":" || words[i - 1] == ":");
        if (goes_on && !out.empty())
            out.back() += words[i];
        else
            out.push_back(words[i]);
    }
    return out;
}

Words candidates(const CLI::App &root, const Words &words)
{
    const CLI::App *app = &root;
    const CLI::Option *open = nullptr; // waits for its value
    size_t positionals = 0;
    bool only_positionals = false;
    for (size_t i = 0; i + 1 < words.size(); ++i) {
        const std::string &word = words[i];
        if (open && word != "=") { // bash makes "--size=1G" three words
            if (open == root.get_option("--host"))
                connect(word, "");
            open = nullptr;
        } else if (open) {
            continue;
        } else if (word == "--" && !only_positionals) {
            only_positionals = true;
        } else if (word.size() > 1 && word[0] == '-' && !only_positionals) {
            open = valueOption(*app, word);
        } else if (const CLI::App *sub = positionals == 0 ? subcommand(*app, word) : nullptr) {
            app = sub;
        } else {
            ++positionals;
        }
    }
    const std::string last = words.empty() || words.back() == "=" ? "" : words.back();
    if (open)
        return candidatesOf(*open);
    if (!last.empty() && last[0] == '-' && !only_positionals)
        return optionNames(*app);
    Words found;
    for (const CLI::App *sub : shownSubcommands(*app))
        found.push_back(sub->get_name());
    if (!found.empty())
        return found;
    for (const CLI::Option *option : shownOptions(*app)) {
        if (option->get_positional() && (positionals-- == 0 || option->get_items_expected_max() > 1))
            return candidatesOf(*option);
    }
    return {};
}

} // namespace

void complete(const Words &words)
{
    const std::string last = words.empty() || words.back() == "=" ? "" : words.back();
    std::string text;
    for (const std::string &found : candidates(makeCommands()->app, rejoined(words))) {
        const bool one_line = found.find('\n') == std::string::npos;
        if (one_line && (found[0] == ':' || found.compare(0, last.size(), last) == 0))
            text += found + "\n";
    }
    print(text);
}

std::string completionScript(const std::string &shell)
{
    return shell == "zsh" ? ZSH : BASH;
}

} // namespace cli
