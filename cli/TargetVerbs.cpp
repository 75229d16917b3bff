#include "cli/Commands.h"

#include "cli/Display.h"
#include "cli/Request.h"
#include "cli/Secret.h"
#include "cli/Size.h"

namespace cli {

using webapi::Method;

namespace {

std::string authText(const Json::Value &type)
{
    static const char *const names[] = {"none", "CHAP", "mutual CHAP"};
    const unsigned number = type.asUInt();
    return number < 3 ? names[number] : "unknown";
}

std::string digestText(const Json::Value &target)
{
    const bool header = target["has_header_checksum"].asBool();
    const bool data = target["has_data_checksum"].asBool();
    return header && data ? "header, data" : header ? "header" : data ? "data" : "none";
}

void addSelector(CLI::App &verb, Arguments &arguments)
{
    addPositional(verb, "TARGET", arguments.selector, "Name, ID or place in the list of the target");
}

/// CHAP options: who logs in, and where the secret comes from.
struct Chap {
    std::string secret_file;
    std::string mutual_secret_file;

    void readInto(Json::Value &input) const
    {
        if (input.isMember("user"))
            input["password"] = readSecret(secret_file, "CHAP secret");
        if (input.isMember("mutual_user"))
            input["mutual_password"] = readSecret(mutual_secret_file, "mutual CHAP secret");
    }
};

void addChap(CLI::App &verb, Json::Value &input, Chap &chap)
{
    CLI::Option &user =
        addText(verb, "--chap-user", "USER", input, "user", "User that initiators log in as, with CHAP");
    verb.add_option("--chap-secret-file", chap.secret_file,
                    "File whose first line is the CHAP secret, - for standard input; without it, you are asked")
        ->type_name("FILE")
        ->needs(&user);
    CLI::Option &mutual = addText(verb, "--mutual-chap-user", "USER", input, "mutual_user",
                                  "User that the target proves itself as to initiators");
    mutual.needs(&user);
    verb.add_option("--mutual-chap-secret-file", chap.mutual_secret_file, "The same for the mutual CHAP secret")
        ->type_name("FILE")
        ->needs(&mutual);
}

void addCreate(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    auto chap = std::make_shared<Chap>();
    CLI::App &verb = addVerb(commands, noun, "create", "Create a target that every initiator may use", [a, chap] {
        chap->readInto(a->input);
        const Json::Value target = request(Method::Post, "/targets", a->input);
        if (a->json)
            return printJson(target);
        print("Created target " + shown(target["name"].asString()) + ": ID " + target["target_id"].asString() + ", " +
              shown(target["iqn"].asString()) + "\n");
    });
    addText(verb, "NAME", "", a->input, "name", "Name of the target").required();
    addText(verb, "--iqn", "IQN", a->input, "iqn", "iSCSI name; made from the names of host and target by default");
    addFlag(verb, "--header-digest", a->input, "has_header_checksum", "Protect headers by a checksum");
    addFlag(verb, "--data-digest", a->input, "has_data_checksum", "Protect data by a checksum");
    addSize(verb, "--max-recv-seg", a->input, "max_recv_seq_bytes", "Longest data segment it receives (256K)");
    addSize(verb, "--max-send-seg", a->input, "max_send_seq_bytes", "Longest data segment it sends (256K)");
    verb.add_option_function<unsigned>(
            "--max-sessions", [a](const unsigned &number) { a->input["max_sessions"] = number; },
            "Sessions at a time; 0, the default, is no limit")
        ->type_name("NUMBER");
    addChap(verb, a->input, *chap);
    addJson(verb, a->json);
}

void printList(const Json::Value &targets, bool of_lun)
{
    std::vector<std::pair<std::string, Align>> columns = {{"ID", Align::Right},     {"NAME", Align::Left},
                                                          {"ENABLED", Align::Left}, {"AUTH", Align::Left},
                                                          {"DIGESTS", Align::Left}, {"IQN", Align::Left}};
    if (of_lun)
        columns.emplace_back("LUN", Align::Right);
    Table table(columns);
    for (const Json::Value &target : targets) {
        std::vector<std::string> cells = {
            target["target_id"].asString(), target["name"].asString(), target["is_enabled"].asBool() ? "yes" : "no",
            authText(target["auth_type"]),  digestText(target),        target["iqn"].asString()};
        if (of_lun)
            cells.push_back(target["mapping_index"].asString());
        table.add(std::move(cells));
    }
    print(table.text());
}

void addList(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    CLI::App &verb = addVerb(commands, noun, "list", "List the targets", [a] {
        const Json::Value targets = request(Method::Get, "/targets", a->input);
        if (a->json)
            return printJson(targets);
        printList(targets, a->input.isMember("lun"));
    });
    addText(verb, "--lun", "LUN", a->input, "lun", "Only those that this LUN is mapped to, with its number there");
    addJson(verb, a->json);
}

std::string masksText(const Json::Value &masks)
{
    Table table({{"INITIATOR", Align::Left}, {"PERMISSION", Align::Left}});
    for (const Json::Value &mask : masks)
        table.add({mask["iqn"].asString(), mask["permission"].asString()});
    return table.text();
}

void printTargetDetails(const Json::Value &target)
{
    const unsigned sessions = target["max_sessions"].asUInt();
    std::vector<std::pair<std::string, std::string>> pairs = {
        {"Name", target["name"].asString()},
        {"IQN", target["iqn"].asString()},
        {"Target ID", target["target_id"].asString()},
        {"Enabled", target["is_enabled"].asBool() ? "yes" : "no"},
        {"Digests", digestText(target)},
        {"Max receive segment", shownSize(target["max_recv_seq_bytes"].asUInt64())},
        {"Max send segment", shownSize(target["max_send_seq_bytes"].asUInt64())},
        {"Max sessions", sessions ? std::to_string(sessions) : "no limit"},
        {"Authentication", authText(target["auth_type"])},
    };
    if (!target["user"].asString().empty())
        pairs.emplace_back("CHAP user", target["user"].asString());
    if (!target["mutual_user"].asString().empty())
        pairs.emplace_back("Mutual CHAP user", target["mutual_user"].asString());
    print(keyValues(pairs));
    if (!target["luns"].empty()) {
        Table table({{"LUN", Align::Right}, {"NAME", Align::Left}, {"SIZE", Align::Right}, {"UUID", Align::Left}});
        for (const Json::Value &lun : target["luns"])
            table.add({lun["mapping_index"].asString(), lun["name"].asString(), shownSize(lun["size"].asUInt64()),
                       lun["uuid"].asString()});
        print("\n" + table.text());
    }
    print("\n" + masksText(target["masks"]));
}

void addShow(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    CLI::App &verb = addVerb(commands, noun, "show", "Show one target with its LUNs and its masking", [a] {
        const Json::Value target = request(Method::Get, targetPath(a->selector));
        if (a->json)
            return printJson(target);
        printTargetDetails(target);
    });
    addSelector(verb, *a);
    addJson(verb, a->json);
}

void addDelete(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    CLI::App &verb = addVerb(commands, noun, "delete", "Delete a target and end its sessions; its LUNs stay", [a] {
        std::string path = targetPath(a->selector);
        if (!a->yes) {
            requireTerminal();
            const Json::Value target = request(Method::Get, path);
            const std::string luns = std::to_string(target["luns"].size());
            const std::string name = shown(target["name"].asString());
            if (!confirmed("Delete target " + name + ", which shows " + luns + " LUN(s), and end its sessions?"))
                return;
            path = targetPath(target["target_id"].asString());
        }
        request(Method::Delete, path);
    });
    addSelector(verb, *a);
    addYes(verb, a->yes);
}

constexpr char MASKS_HELP[] = "Permissions are rw (read and write), r (read only) and - (no access). An\n"
                              "initiator is named by its IQN; the IQN 'default' stands for all initiators\n"
                              "without an entry of their own, which are refused when there is none.";

/// "IQN=rw" as the handlers take it. Only the last '=' separates.
Json::Value mask(const char *flags, const std::string &text)
{
    const size_t at = text.rfind('=');
    if (at == std::string::npos || at == 0)
        throw CLI::ValidationError(flags, "'" + text + "' is not IQN=rw, IQN=r or IQN=-");
    Json::Value mask;
    mask["iqn"] = text.substr(0, at);
    mask["permission"] = text.substr(at + 1);
    return mask;
}

CLI::Option &addMasks(CLI::App &verb, const char *flags, Json::Value &input, const char *key, const char *description)
{
    const auto set = [&input, key, flags](const std::vector<std::string> &texts) {
        for (const std::string &text : texts)
            input[key].append(mask(flags, text));
    };
    return *verb.add_option_function<std::vector<std::string>>(flags, set, description)
                ->type_name("IQN=rw|r|-")
                ->allow_extra_args(false);
}

void addMasks(Commands &commands, CLI::App &noun)
{
    auto a = std::make_shared<Arguments>();
    CLI::App &verb = addVerb(commands, noun, "masks", "Show or change which initiators may use a target", [a] {
        const Method method = a->input.isMember("masks") ? Method::Put : a->input.empty() ? Method::Get : Method::Patch;
        const Json::Value masks = request(method, targetPath(a->selector, "/masks"), a->input);
        if (a->json)
            return printJson(masks);
        print(masksText(masks));
    });
    addSelector(verb, *a);
    CLI::Option &set = addMasks(verb, "--set", a->input, "masks", "Replace the whole masking; once for each entry");
    CLI::Option &add = addMasks(verb, "--add", a->input, "add", "Add an entry, or change its permission");
    CLI::Option &remove = *verb.add_option_function<std::vector<std::string>>(
                                   "--remove",
                                   [a](const std::vector<std::string> &iqns) {
                                       for (const std::string &iqn : iqns)
                                           a->input["remove"].append(iqn);
                                   },
                                   "Remove an entry")
                               ->type_name("IQN")
                               ->allow_extra_args(false);
    CLI::Option &clear = *verb.add_flag_callback(
        "--clear", [a] { a->input["masks"] = Json::arrayValue; }, "Remove every entry: nobody may use the target");
    for (CLI::Option *whole : {&set, &clear})
        whole->excludes(&add)->excludes(&remove);
    set.excludes(&clear);
    addJson(verb, a->json);
    verb.footer(MASKS_HELP);
}

} // namespace

void addTargetVerbs(Commands &commands)
{
    CLI::App &noun = addNoun(commands, "target", "Targets: create, delete, list, say who may use them");
    addCreate(commands, noun);
    addList(commands, noun);
    addShow(commands, noun);
    addDelete(commands, noun);
    addMasks(commands, noun);
}

} // namespace cli
