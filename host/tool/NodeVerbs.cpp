#include "NodeVerbs.h"

#include "iscsihost/node.h"
#include "Output.h"

#include <cstdio>
#include <memory>

namespace {

int showAddress()
{
    std::string address;
    if (int err = iscsihost::getNodeAddress(address))
        return check("address show", err);
    printf("%s\n", address.c_str());
    return 0;
}

} // namespace

void addNodeVerbs(CLI::App &app, int &status)
{
    const auto wish = std::make_shared<std::string>();
    CLI::App *address = app.add_subcommand("address", "Where other appliances are told to reach this one's web API");
    address->require_subcommand(1);
    CLI::App *set = address->add_subcommand("set", "Set it, for appliances that join from now on");
    set->add_option("ADDRESS", *wish,
                    "HOST, HOST:PORT or [IPV6]:PORT; 'auto' (the default): the local address towards the other one")
        ->required();
    set->callback([=, &status] { status = check("address set", iscsihost::setNodeAddress(*wish)); });
    address->add_subcommand("show", "Show it")->callback([&status] { status = showAddress(); });
}
