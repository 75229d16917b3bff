#include "AccountVerbs.h"

#include "iscsihost/account.h"
#include "iscsihost/session.h"
#include "Output.h"

#include <bsd/readpassphrase.h>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <fstream>
#include <iostream>
#include <json/json.h>
#include <memory>
#include <sys/stat.h>

namespace {

using iscsihost::AccountRole;

const char *roleText(AccountRole role)
{
    return role == AccountRole::admin ? "admin" : "viewer";
}

std::string timeText(int64_t seconds)
{
    if (seconds == 0)
        return "never";
    const time_t time = seconds;
    tm local = {};
    char text[32];
    strftime(text, sizeof text, "%Y-%m-%d %H:%M:%S", localtime_r(&time, &local));
    return text;
}

/// Longer than any password may be: a longer one is refused, not cut.
using Line = char[1024];

int readFirstLine(const std::string &path, std::string &password)
{
    std::ifstream file;
    if (path != "-")
        file.open(path);
    std::istream &input = path == "-" ? std::cin : file;
    if (!std::getline(input, password))
        return refuse(path + ": there is no password to read");
    if (!password.empty() && password.back() == '\r')
        password.pop_back();
    return 0;
}

int ask(std::string &password)
{
    Line first, again;
    if (!readpassphrase("password: ", first, sizeof first, RPP_REQUIRE_TTY))
        return refuse("no terminal to ask for the password: give a file that holds it with --password-file");
    if (!readpassphrase("password, again: ", again, sizeof again, RPP_REQUIRE_TTY) || strcmp(first, again) != 0)
        return refuse("the two passwords differ");
    password = first;
    explicit_bzero(first, sizeof first);
    explicit_bzero(again, sizeof again);
    return 0;
}

/// Passwords never come from the command line, which every user of the machine can read.
int readPassword(const std::string &file, std::string &password)
{
    return file.empty() ? ask(password) : readFirstLine(file, password);
}

int addAccount(const std::string &name, const std::string &role, bool one_time_codes, const std::string &file)
{
    std::string password, otp_uri;
    if (int failed = readPassword(file, password))
        return failed;
    const AccountRole granted = role == "admin" ? AccountRole::admin : AccountRole::viewer;
    if (int failed = check("account add", iscsihost::addAccount(name, granted, password, one_time_codes, otp_uri)))
        return failed;
    if (!otp_uri.empty())
        printf("%s\nThis is the secret for the device that makes the one-time codes. It is not shown again.\n",
               otp_uri.c_str());
    return 0;
}

int listAccounts(bool as_json)
{
    std::vector<iscsihost::Account> accounts;
    if (int failed = check("account list", iscsihost::listAccounts(accounts)))
        return failed;
    Json::Value json(Json::arrayValue);
    for (const iscsihost::Account &account : accounts) {
        Json::Value entry;
        entry["name"] = account.name;
        entry["role"] = roleText(account.role);
        entry["one_time_codes"] = account.one_time_codes;
        entry["created"] = Json::Int64(account.created);
        json.append(entry);
    }
    if (as_json) {
        printJson(json);
        return 0;
    }
    printf("%-24s  %-6s  %-14s  %s\n", "ACCOUNT", "ROLE", "ONE-TIME CODES", "CREATED");
    for (const iscsihost::Account &account : accounts)
        printf("%-24s  %-6s  %-14s  %s\n", account.name.c_str(), roleText(account.role),
               account.one_time_codes ? "yes" : "no", timeText(account.created).c_str());
    return 0;
}

int setPassword(const std::string &name, const std::string &file)
{
    std::string password;
    if (int failed = readPassword(file, password))
        return failed;
    return check("account passwd", iscsihost::setAccountPassword(name, password));
}

int listSessions(bool as_json)
{
    std::vector<iscsihost::Session> sessions;
    if (int failed = check("session list", iscsihost::listSessions(sessions)))
        return failed;
    Json::Value json(Json::arrayValue);
    for (const iscsihost::Session &session : sessions) {
        Json::Value entry;
        entry["id"] = Json::Int64(session.id);
        entry["account"] = session.account;
        entry["role"] = roleText(session.role);
        entry["app"] = session.app;
        entry["address"] = session.address;
        entry["created"] = Json::Int64(session.created);
        entry["last_used"] = Json::Int64(session.last_used);
        entry["expires"] = Json::Int64(session.expires);
        json.append(entry);
    }
    if (as_json) {
        printJson(json);
        return 0;
    }
    printf("%6s  %-16s  %-6s  %-12s  %-24s  %-19s  %s\n", "ID", "ACCOUNT", "ROLE", "FOR", "FROM", "LAST USED", "ENDS");
    for (const iscsihost::Session &session : sessions)
        printf("%6lld  %-16s  %-6s  %-12s  %-24s  %-19s  %s\n", static_cast<long long>(session.id),
               session.account.c_str(), roleText(session.role), session.app.empty() ? "-" : session.app.c_str(),
               session.address.c_str(), timeText(session.last_used).c_str(), timeText(session.expires).c_str());
    return 0;
}

int setLimits(int64_t idle_minutes, int64_t absolute_minutes)
{
    iscsihost::SessionLimits limits;
    if (int failed = check("session limits", iscsihost::getSessionLimits(limits)))
        return failed;
    if (idle_minutes > 0)
        limits.idle = idle_minutes * 60;
    if (absolute_minutes > 0)
        limits.absolute = absolute_minutes * 60;
    const bool change = idle_minutes > 0 || absolute_minutes > 0;
    if (int failed = change ? check("session limits", iscsihost::setSessionLimits(limits)) : 0)
        return failed;
    printf("unused: %lld minutes, in all: %lld minutes\n", static_cast<long long>(limits.idle / 60),
           static_cast<long long>(limits.absolute / 60));
    return 0;
}

/// The words of a command line; they live as long as the verbs.
struct Words {
    std::string name, role = "viewer", password_file;
    bool one_time_codes = false, as_json = false;
    int64_t id = 0, idle = 0, absolute = 0;
};

void addAccountVerb(CLI::App &app, int &status, const std::shared_ptr<Words> &words)
{
    CLI::App *account = app.add_subcommand("account", "Who may use the web API");
    account->require_subcommand(1);
    const auto named = [&](const char *verb, const char *what) {
        CLI::App *made = account->add_subcommand(verb, what);
        made->add_option("NAME", words->name, "The account")->required();
        return made;
    };
    const auto with_password = [&](CLI::App *verb) {
        verb->add_option("--password-file", words->password_file,
                         "File with the password in its first line, '-' for standard input (default: ask)");
    };

    CLI::App *add = named("add", "Add an account");
    add->add_option("--role", words->role, "'viewer' reads, 'admin' does everything")
        ->check(CLI::IsMember({"admin", "viewer"}))
        ->capture_default_str();
    add->add_flag("--otp", words->one_time_codes, "A log-in needs a one-time code too; prints the secret, once");
    with_password(add);
    add->callback([&status, words] {
        status = addAccount(words->name, words->role, words->one_time_codes, words->password_file);
    });
    CLI::App *list = account->add_subcommand("list", "Show the accounts");
    list->add_flag("--json", words->as_json, "For programs");
    list->callback([&status, words] { status = listAccounts(words->as_json); });
    named("remove", "Remove an account and end its sessions")->callback([&status, words] {
        status = check("account remove", iscsihost::removeAccount(words->name));
    });
    CLI::App *passwd = named("passwd", "Set a new password and end the account's sessions");
    with_password(passwd);
    passwd->callback([&status, words] { status = setPassword(words->name, words->password_file); });
}

void addSessionVerb(CLI::App &app, int &status, const std::shared_ptr<Words> &words)
{
    CLI::App *session = app.add_subcommand("session", "Sessions of the web API: people's and peers'");
    session->require_subcommand(1);
    CLI::App *list = session->add_subcommand("list", "Show the open sessions");
    list->add_flag("--json", words->as_json, "For programs");
    list->callback([&status, words] { status = listSessions(words->as_json); });
    CLI::App *close = session->add_subcommand("close", "End a session; a peer appliance can ask nothing then");
    close->add_option("ID", words->id, "As 'session list' shows it")->required();
    close->callback([&status, words] { status = check("session close", iscsihost::closeSession(words->id)); });
    CLI::App *limits = session->add_subcommand("limits", "Show or set how long people's sessions last");
    const CLI::Range minutes(1, 366 * 24 * 60);
    limits->add_option("--idle", words->idle, "Minutes after its last use")->check(minutes);
    limits->add_option("--absolute", words->absolute, "Minutes in all")->check(minutes);
    limits->callback([&status, words] { status = setLimits(words->idle, words->absolute); });
}

} // namespace

void addAccountVerbs(CLI::App &app, int &status)
{
    const auto words = std::make_shared<Words>();
    addAccountVerb(app, status, words);
    addSessionVerb(app, status, words);
}
