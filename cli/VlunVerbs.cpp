// Virtual LUNs, and clones of LUNs to other appliances, which are made with them.
#include "cli/Commands.h"

#include "cli/Display.h"
#include "cli/Request.h"
#include "cli/Values.h"
#include "cli/Watch.h"
#include "iscsiwebapi/ISCSIErrorCode.h"

namespace cli {

using webapi::Method;

namespace {

constexpr char LUN_HELP[] = "Name, UUID or place in the list of the LUN";

std::string vlunPath(const std::string &uuid, const std::string &rest = "")
{
    return "/vluns/" + webapi::pathSegment(uuid) + rest;
}

std::string movedText(const Json::Value &vlun)
{
    return vlun["second"].asUInt64() == 0 ? "" : sizeText(vlun["first"]) + " of " + sizeText(vlun["second"]);
}

void printVlun(const Json::Value &vlun)
{
    std::vector<std::pair<std::string, std::string>> pairs = {
        {"UUID", vlun["uuid"].asString()},
        {"Source LUN", vlun["src_lun_uuid"].asString()},
        {"Node", vlun["node_uuid"].asString()},
        {"Destination LUN", vlun["dst_lun_uuid"].asString()},
        {"Portal", vlun["portal"].asString()},
        {"Status", vlun["status"].asString()},
        {"Moved", movedText(vlun)},
    };
    if (!vlun["reason"].asString().empty())
        pairs.emplace_back("Reason", vlun["reason"].asString());
    print(keyValues(pairs));
}

void printList(const Json::Value &vluns)
{
    Table table({{"UUID", Align::Left},
                 {"STATUS", Align::Left},
                 {"MOVED", Align::Left},
                 {"SOURCE LUN", Align::Left},
                 {"DESTINATION LUN", Align::Left}});
    for (const Json::Value &vlun : vluns)
        table.add({vlun["uuid"].asString(), vlun["status"].asString(), movedText(vlun), vlun["src_lun_uuid"].asString(),
                   vlun["dst_lun_uuid"].asString()});
    print(table.text());
}

void addList(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    CLI::App &verb = addVerb(commands, noun, "list", "List the virtual LUNs", [a] {
        const Json::Value vluns = request(Method::Get, "/vluns");
        if (a->json)
            return printJson(vluns);
        printList(vluns);
    });
    addJson(verb, a->json);
}

void addSelector(CLI::App &verb, Arguments &arguments)
{
    addPositional(verb, "VLUN", arguments.selector, "UUID of the virtual LUN");
}

void show(const Arguments &a, const Json::Value &vlun)
{
    if (a.json)
        return printJson(vlun);
    printVlun(vlun);
}

void addPortals(CLI::App &verb, Json::Value &input)
{
    const auto set = [&input](const std::vector<std::string> &portals) {
        for (const std::string &portal : portals)
            input["portals"].append(portal);
    };
    verb.add_option_function<std::vector<std::string>>("--portal", set,
                                                       "Address of the node's iSCSI service (the node's own)")
        ->type_name("PORTAL")
        ->allow_extra_args(false);
}

/// How far the clone to another node is that this virtual LUN makes.
Progress askRemoteClone(const std::string &lun, const Json::Value &vlun_uuid)
{
    if (vlun_uuid.isNull())
        return {};
    Json::Value input;
    input["vlun_uuid"] = vlun_uuid;
    const Json::Value told = request(Method::Get, lunPath(lun, "/remote-clone"), input);
    Progress progress;
    progress.running = told["is_running"].asBool();
    progress.done = told["first"].asUInt64();
    progress.total = told["second"].asUInt64();
    const std::string status = told["status"].asString();
    if (!progress.running && status != "complete")
        throw Failure{ISCSI::ERR_FAILED_TO_CLONE_LUN,
                      status == "failed" ? told["reason"].asString() : "it was stopped before its end"};
    return progress;
}

void addRemoteClone(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    CLI::App &verb = addVerb(commands, noun, "remote-clone", "Copy a LUN as it is now to another appliance", [a] {
        if (!a->input.isMember("dst_lun_uuid") && !(a->input.isMember("name") && a->input.isMember("location")))
            throw UsageError{"--name and --location are required, or --dst-lun"};
        const std::string node = a->input["node"].asString();
        Action action;
        action.path = lunPath(a->selector, "/remote-clone");
        action.input = a->input;
        action.title = "Cloning " + a->selector + " to " + node;
        action.later = "'iscsictl vlun list' tells how far it is";
        Json::Value vlun_uuid;
        action.ask = [&] { return askRemoteClone(a->selector, vlun_uuid); };
        action.started = [&](const Json::Value &answer) { vlun_uuid = answer["vlun_uuid"]; };
        const Json::Value answer = a->watch ? watch(action) : request(Method::Post, action.path, action.input);
        if (a->json)
            return printJson(answer);
        const std::string copy = answer["dst_lun_uuid"].asString();
        print(shown(a->watch ? "Cloned " + a->selector + " to " + node + ": LUN " + copy
                             : action.title + " as LUN " + copy + "; " + action.later) +
              "\n");
    });
    addPositional(verb, "LUN", a->selector, LUN_HELP);
    addText(verb, "--node", "NODE", a->input, "node", "The other appliance").required();
    CLI::Option &name = addText(verb, "--name", "NAME", a->input, "name", "Name of the new LUN there");
    CLI::Option &location = addText(verb, "--location", "VOLUME", a->input, "location", "Volume there that holds it");
    addText(verb, "--dst-lun", "UUID", a->input, "dst_lun_uuid", "Overwrite this sink LUN there in place of a new one")
        .excludes(&name)
        ->excludes(&location);
    addPortals(verb, a->input);
    addWatch(verb, a->watch);
    addJson(verb, a->json);
}

void addVluns(Commands &commands)
{
    CLI::App &noun = addNoun(commands, "vlun", "Virtual LUNs: send a LUN to a sink LUN of another appliance by hand");
    addList(commands, noun);

    auto shown_one = std::make_shared<Arguments>();
    CLI::App &show_verb = addVerb(commands, noun, "show", "Show one virtual LUN with its transfer",
                                  [a = shown_one] { show(*a, request(Method::Get, vlunPath(a->selector))); });
    addSelector(show_verb, *shown_one);
    addJson(show_verb, shown_one->json);

    auto created = std::make_shared<Arguments>();
    CLI::App &create_verb = addVerb(commands, noun, "create", "Put a virtual LUN over a LUN",
                                    [a = created] { show(*a, request(Method::Post, "/vluns", a->input)); });
    addText(create_verb, "LUN", "", created->input, "lun", LUN_HELP).required();
    addJson(create_verb, created->json);

    auto bound = std::make_shared<Arguments>();
    CLI::App &bind_verb =
        addVerb(commands, noun, "bind", "Attach it to a sink LUN of another appliance, and so send the data",
                [a = bound] { show(*a, request(Method::Post, vlunPath(a->selector, "/bind"), a->input)); });
    addSelector(bind_verb, *bound);
    addText(bind_verb, "--node", "NODE", bound->input, "node", "The other appliance").required();
    addText(bind_verb, "--dst-lun", "UUID", bound->input, "dst_lun_uuid", "The sink LUN there").required();
    addPortals(bind_verb, bound->input);
    addJson(bind_verb, bound->json);

    auto deleted = std::make_shared<Arguments>();
    CLI::App &delete_verb =
        addVerb(commands, noun, "delete", "Remove a virtual LUN and end its transfer; the LUNs stay",
                [a = deleted] { request(Method::Delete, vlunPath(a->selector)); });
    addSelector(delete_verb, *deleted);
}

} // namespace

void addVlunVerbs(Commands &commands)
{
    addRemoteClone(commands, *commands.app.get_subcommand("lun"));
    addVluns(commands);
}

} // namespace cli
