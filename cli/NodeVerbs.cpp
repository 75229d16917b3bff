// Nodes: the appliances that this one is paired with.
#include "cli/Commands.h"

#include "cli/Address.h"
#include "cli/Display.h"
#include "cli/Request.h"
#include "cli/Secret.h"
#include "cli/Values.h"

namespace cli {

using webapi::Method;

namespace {

constexpr char FINGERPRINT_HELP[] = "Its key, as 'iscsi-host certificate show' prints it there; else you are asked";

std::string nodePath(const std::string &selector, const std::string &rest = "")
{
    return "/nodes/" + webapi::pathSegment(selector) + rest;
}

void addSelector(CLI::App &verb, Arguments &arguments)
{
    addPositional(verb, "NODE", arguments.selector, "Host name, UUID or place in the list of the node");
}

std::string nameOf(const Json::Value &node)
{
    return node["is_local_node"].asBool() ? "this appliance" : node["hostname"].asString();
}

void printList(const Json::Value &nodes)
{
    Table table({{"#", Align::Right},
                 {"NODE", Align::Left},
                 {"PORT", Align::Right},
                 {"LOGGED IN", Align::Left},
                 {"UUID", Align::Left}});
    size_t index = 0;
    for (const Json::Value &node : nodes) {
        const bool local = node["is_local_node"].asBool();
        table.add({std::to_string(++index), nameOf(node), local ? "" : node["port"].asString(),
                   local ? "" : yesNo(node["is_logged_in"]), node["uuid"].asString()});
    }
    print(table.text());
}

void printNode(const Json::Value &node)
{
    std::vector<std::pair<std::string, std::string>> pairs = {{"Node", nameOf(node)},
                                                              {"UUID", node["uuid"].asString()}};
    if (!node["is_local_node"].asBool()) {
        pairs.emplace_back("Port", node["port"].asString());
        pairs.emplace_back("Protocol", node["protocol"].asString());
        pairs.emplace_back("Fingerprint", node["pin"].asString());
        pairs.emplace_back("Logged in", node["is_logged_in"].asBool() ? "yes, as " + node["account"].asString() : "no");
    }
    print(keyValues(pairs));
}

void addList(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    CLI::App &verb = addVerb(commands, noun, "list", "List this appliance and those it is paired with", [a] {
        const Json::Value nodes = request(Method::Get, "/nodes");
        if (a->json)
            return printJson(nodes);
        printList(nodes);
    });
    addJson(verb, a->json);
}

void addShow(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    CLI::App &verb = addVerb(commands, noun, "show", "Show one node", [a] {
        const Json::Value node = request(Method::Get, nodePath(a->selector));
        if (a->json)
            return printJson(node);
        printNode(node);
    });
    addSelector(verb, *a);
    addJson(verb, a->json);
}

void addStatus(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    CLI::App &verb = addVerb(commands, noun, "status", "Tell whether this appliance is ready to copy LUNs", [a] {
        const Json::Value status = request(Method::Get, "/nodes/local/status");
        if (a->json)
            return printJson(status);
        for (const Json::Value &text : status["texts"])
            print(shown(text.asString()) + "\n");
    });
    addJson(verb, a->json);
}

/// Options of an account at another appliance.
struct Account {
    std::string password_file;

    void readInto(Json::Value &input, const std::string &where) const
    {
        input["password"] =
            readSecret(password_file, "password of " + input["account"].asString() + " at " + where, Asked::Once);
    }
};

void addAccount(CLI::App &verb, Json::Value &input, Account &account)
{
    addText(verb, "--account", "ACCOUNT", input, "account", "Administrator's account there").required();
    addPasswordFile(verb, account.password_file);
    addText(verb, "--otp", "CODE", input, "otp_code", "One-time code, for an account that has them");
}

/// The key that an appliance shows to ours, once somebody has compared it.
std::string confirmedPin(const Address &address, const Arguments &a)
{
    Json::Value input;
    input["hostname"] = address.host;
    input["port"] = address.port;
    const std::string pin = request(Method::Get, "/peer-key", input)["pin"].asString();
    confirmKey(addressText(address), pin, a.yes);
    return pin;
}

void addJoin(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    auto account = std::make_shared<Account>();
    CLI::App &verb = addVerb(commands, noun, "join", "Take another appliance into the group of this one", [a, account] {
        const auto address = parseAddress(a->selector);
        if (!address)
            throw UsageError{"'" + a->selector + "' is not HOST or HOST:PORT"};
        a->input["hostname"] = address->host;
        a->input["port"] = address->port;
        if (!a->input.isMember("pin"))
            a->input["pin"] = confirmedPin(*address, *a);
        account->readInto(a->input, address->host);
        const Json::Value node = request(Method::Post, "/nodes/join", a->input);
        if (a->json)
            return printJson(node);
        print("Paired with " + shown(node["hostname"].asString()) + ": " + node["uuid"].asString() + "\n");
    });
    addPositional(verb, "HOST", a->selector,
                  "Host name or address of the other appliance, with :PORT unless that is 5443");
    addAccount(verb, a->input, *account);
    addText(verb, "--fingerprint", "FINGERPRINT", a->input, "pin", FINGERPRINT_HELP);
    addYes(verb, a->yes);
    addJson(verb, a->json);
    verb.footer("All appliances that this one is paired with come to know the new one, too.");
}

void addRemove(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    CLI::App &verb = addVerb(commands, noun, "remove", "Forget a node; it still lists this appliance", [a] {
        std::string path = nodePath(a->selector);
        if (!a->yes) {
            requireTerminal();
            const Json::Value node = request(Method::Get, path);
            if (!confirmed("Forget " + shown(nameOf(node)) + " and end the sessions with it?"))
                return;
            path = nodePath(node["uuid"].asString());
        }
        request(Method::Delete, path);
    });
    addSelector(verb, *a);
    addYes(verb, a->yes);
    verb.footer("Remove this appliance on the other one, too.");
}

void addTrust(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    CLI::App &verb = addVerb(commands, noun, "trust", "Accept the changed key of a node", [a] {
        if (!a->input.isMember("pin")) {
            const Json::Value node = request(Method::Get, nodePath(a->selector));
            const Address address{node["hostname"].asString(), static_cast<uint16_t>(node["port"].asUInt())};
            a->input["pin"] = confirmedPin(address, *a);
        }
        const Json::Value node = request(Method::Post, nodePath(a->selector, "/trust"), a->input);
        if (a->json)
            return printJson(node);
        print("Trusting " + shown(node["hostname"].asString()) + ": " + shown(node["pin"].asString()) + "\n");
    });
    addSelector(verb, *a);
    addText(verb, "--fingerprint", "FINGERPRINT", a->input, "pin", FINGERPRINT_HELP);
    addYes(verb, a->yes);
    addJson(verb, a->json);
}

void addLogin(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    auto account = std::make_shared<Account>();
    CLI::App &verb = addVerb(commands, noun, "login", "Open a session of this appliance's on a node", [a, account] {
        account->readInto(a->input, a->selector);
        const Json::Value node = request(Method::Post, nodePath(a->selector, "/login"), a->input);
        if (a->json)
            return printJson(node);
        printNode(node);
    });
    addSelector(verb, *a);
    addAccount(verb, a->input, *account);
    addJson(verb, a->json);
    verb.footer("The session is kept in the node configuration file; the password is not.");
}

void addLogout(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    CLI::App &verb = addVerb(commands, noun, "logout", "End that session",
                             [a] { request(Method::Post, nodePath(a->selector, "/logout")); });
    addSelector(verb, *a);
}

void addCheck(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    CLI::App &verb = addVerb(commands, noun, "check", "Tell whether a node can be reached to replicate to it", [a] {
        request(Method::Post, nodePath(a->selector, "/check"), a->input);
        print(shown(a->input["address"].asString()) + " can be reached\n");
    });
    addSelector(verb, *a);
    addText(verb, "--address", "ADDRESS", a->input, "address", "Data address of the node").required();
    addNumber(verb, "--port", a->input, "port",
              "Port of the data address, 3261 unless given; 3263 is that of encrypted sendings");
}

} // namespace

void addNodeVerbs(Commands &commands)
{
    CLI::App &noun = addNoun(commands, "node", "Other appliances: pair with them, list, forget");
    addList(commands, noun);
    addShow(commands, noun);
    addStatus(commands, noun);
    addCheck(commands, noun);
    addJoin(commands, noun);
    addRemove(commands, noun);
    addTrust(commands, noun);
    addLogin(commands, noun);
    addLogout(commands, noun);
}

} // namespace cli
