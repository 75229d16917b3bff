#include "cli/Commands.h"

#include "cli/Display.h"
#include "cli/Request.h"
#include "cli/Values.h"

namespace cli {

using webapi::Method;

namespace {

constexpr char KINDS[] = "adv|file|thin|sink|block";
constexpr int BLOCK_TYPE = 1;
constexpr char KINDS_HELP[] = "Kinds of LUN:\n"
                              "  adv    sparse, with snapshots\n"
                              "  file   allocated in full\n"
                              "  thin   sparse\n"
                              "  sink   like adv, written by a peer\n"
                              "  block  a block device, which the location names; its size is the LUN's";
constexpr struct {
    const char *name;
    int type;
} LUN_TYPES[] = {{"adv", 15}, {"file", 3}, {"thin", 7}, {"sink", 31}, {"block", BLOCK_TYPE}};

int typeNumber(const std::string &name)
{
    for (const auto &known : LUN_TYPES) {
        if (name == known.name)
            return known.type;
    }
    throw CLI::ValidationError("--type", "'" + name + "' is none of " + KINDS);
}

std::string typeName(const Json::Value &number)
{
    for (const auto &known : LUN_TYPES) {
        if (number.asInt() == known.type)
            return known.name;
    }
    return number.asString();
}

/// One line on what became of the LUN, or its JSON form.
void printLun(const Json::Value &lun, bool json, const char *done)
{
    if (json)
        return printJson(lun);
    print(std::string(done) + " LUN " + shown(lun["name"].asString()) + ": " + typeName(lun["type"]) + ", " +
          sizeText(lun["size"]) + ", " + lun["uuid"].asString() + "\n");
}

void printMappings(const Json::Value &lun)
{
    std::string text = "LUN " + shown(lun["name"].asString());
    const char *before = " is mapped to ";
    for (const Json::Value &target : lun["targets"]) {
        text += before + shown(target["name"].asString()) + " as LUN " + target["mapping_index"].asString();
        before = ", ";
    }
    if (lun["targets"].empty())
        text += " is mapped to no target";
    print(text + "\n");
}

void addSelector(CLI::App &verb, Arguments &arguments)
{
    addPositional(verb, "LUN", arguments.selector, "Name, UUID or place in the list of the LUN");
}

void addCreate(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    a->input["type"] = typeNumber("adv");
    CLI::App &verb = addVerb(commands, noun, "create", "Create a LUN", [a] {
        if (a->input["type"] != BLOCK_TYPE && !a->input.isMember("size"))
            throw UsageError{"--size is required"};
        printLun(request(Method::Post, "/luns", a->input), a->json, "Created");
    });
    addText(verb, "NAME", "", a->input, "name", "Name of the LUN").required();
    addText(verb, "--location", "DIR", a->input, "location", "Volume that holds it, or block device").required();
    addSize(verb, "--size", a->input, "size", "Size, for all kinds but block");
    verb.add_option_function<std::string>(
            "--type", [a](const std::string &name) { a->input["type"] = typeNumber(name); }, "Kind of LUN (adv)")
        ->type_name(KINDS);
    addSize(verb, "--extent-size", a->input, "extent_size", "Extent size of an adv or sink LUN");
    addJson(verb, a->json);
    verb.footer(KINDS_HELP);
}

void printList(const Json::Value &luns, bool status)
{
    std::vector<std::pair<std::string, Align>> columns = {
        {"#", Align::Right}, {"NAME", Align::Left}, {"TYPE", Align::Left}, {"SIZE", Align::Right}};
    if (status) {
        columns.emplace_back("ALLOCATED", Align::Right);
        columns.emplace_back("STATUS", Align::Left);
        columns.emplace_back("LOCKED", Align::Left);
    }
    for (const char *title : {"MAPPED", "LOCATION", "UUID"})
        columns.emplace_back(title, Align::Left);
    Table table(columns);
    size_t index = 0;
    for (const Json::Value &lun : luns) {
        std::vector<std::string> cells = {std::to_string(++index), lun["name"].asString(), typeName(lun["type"]),
                                          sizeText(lun["size"])};
        if (status) {
            cells.push_back(sizeText(lun["allocated_size"]));
            cells.push_back(lun["status"].asString());
            cells.push_back(yesNo(lun["is_action_locked"]));
        }
        cells.push_back(yesNo(lun["is_mapped"]));
        cells.push_back(lun["location"].asString());
        cells.push_back(lun["uuid"].asString());
        table.add(std::move(cells));
    }
    print(table.text());
}

void addList(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    CLI::App &verb = addVerb(commands, noun, "list", "List the LUNs", [a] {
        const Json::Value luns = request(Method::Get, "/luns", a->input);
        if (a->json)
            return printJson(luns);
        printList(luns, a->input["status"].asBool());
    });
    addFlag(verb, "--status", a->input, "status", "Show status, allocated size and locks too, which takes longer");
    addJson(verb, a->json);
}

void printLunDetails(const Json::Value &lun)
{
    print(keyValues({
        {"Name", lun["name"].asString()},
        {"UUID", lun["uuid"].asString()},
        {"LUN ID", lun["lun_id"].asString()},
        {"Type", typeName(lun["type"])},
        {"Location", lun["location"].asString()},
        {"Size", exactSizeText(lun["size"])},
        {"Allocated", exactSizeText(lun["allocated_size"])},
        {"Extent size", exactSizeText(lun["extent_size"])},
        {"Status", lun["status"].asString()},
        {"Locked", yesNo(lun["is_action_locked"])},
        {"Restored", timeText(lun["restored_time"])},
        {"Mapped", yesNo(lun["is_mapped"])},
    }));
    if (lun["targets"].empty())
        return;
    Table table({{"TARGET", Align::Left}, {"LUN", Align::Right}, {"IQN", Align::Left}});
    for (const Json::Value &target : lun["targets"])
        table.add({target["name"].asString(), target["mapping_index"].asString(), target["iqn"].asString()});
    print("\n" + table.text());
}

void addShow(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    CLI::App &verb = addVerb(commands, noun, "show", "Show one LUN with its status and mappings", [a] {
        const Json::Value lun = request(Method::Get, lunPath(a->selector));
        if (a->json)
            return printJson(lun);
        printLunDetails(lun);
        printTransfer("Import", lunPath(lun["uuid"].asString(), "/import"));
    });
    addSelector(verb, *a);
    addJson(verb, a->json);
}

void addUpdate(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    CLI::App &verb = addVerb(commands, noun, "update", "Rename or grow a LUN, also while it is in use", [a] {
        printLun(request(Method::Patch, lunPath(a->selector), a->input), a->json, "Updated");
    });
    addSelector(verb, *a);
    addText(verb, "--name", "NAME", a->input, "name", "New name");
    addSize(verb, "--size", a->input, "size", "New size, not smaller than the present one");
    addJson(verb, a->json);
}

void addDelete(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    CLI::App &verb = addVerb(commands, noun, "delete", "Delete a LUN and its data", [a] {
        std::string path = lunPath(a->selector);
        if (!a->yes) {
            requireTerminal();
            const Json::Value lun = request(Method::Get, path);
            const std::string name = shown(lun["name"].asString());
            if (!confirmed("Delete LUN " + name + " (" + sizeText(lun["size"]) + ") and all its data?"))
                return;
            path = lunPath(lun["uuid"].asString()); // what was asked about, whatever the selector means by now
        }
        request(Method::Delete, path);
    });
    addSelector(verb, *a);
    addYes(verb, a->yes);
}

void addMapping(Commands &commands, CLI::App &noun, const char *name, const char *description)
{
    auto a = std::make_shared<Arguments>();
    auto targets = std::make_shared<std::vector<std::string>>();
    CLI::App &verb = addVerb(commands, noun, name, description, [a, targets, name] {
        for (const std::string &target : *targets)
            a->input["targets"].append(target);
        const Json::Value lun = request(Method::Post, lunPath(a->selector, std::string("/") + name), a->input);
        if (a->json)
            return printJson(lun);
        printMappings(lun);
    });
    addSelector(verb, *a);
    addPositionals(verb, "TARGET", *targets, "Names, IDs or places in the list of the targets");
    addJson(verb, a->json);
}

void addLoading(Commands &commands, CLI::App &noun, const char *name, const char *description, const char *trash)
{
    auto a = std::make_shared<Arguments>();
    CLI::App &verb = addVerb(commands, noun, name, description, [a, name] {
        request(Method::Post, lunPath(a->selector, std::string("/") + name), a->input);
    });
    addSelector(verb, *a);
    addFlag(verb, "--trash", a->input, "is_for_trash", trash);
}

} // namespace

void addLunVerbs(Commands &commands)
{
    CLI::App &noun = addNoun(commands, "lun", "LUNs: create, delete, list, change, map to targets");
    addCreate(commands, noun);
    addList(commands, noun);
    addShow(commands, noun);
    addUpdate(commands, noun);
    addDelete(commands, noun);
    addMapping(commands, noun, "map", "Map a LUN to targets");
    addMapping(commands, noun, "unmap", "Remove a LUN from targets");
    addLoading(commands, noun, "load", "Put a LUN into the running iSCSI service", "Take it out of the trash first");
    addLoading(commands, noun, "unload", "Take a LUN out of the running iSCSI service", "Put it into the trash too");
}

} // namespace cli
