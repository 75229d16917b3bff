// Sessions on another appliance, for "--host".
#include "cli/Commands.h"

#include "cli/Display.h"
#include "cli/Remote.h"
#include "cli/Request.h"
#include "cli/Secret.h"

namespace cli {
namespace {

Remote &requireRemote()
{
    if (!remote())
        throw UsageError{"--host is required: on its own machine no login is needed"};
    return *remote();
}

void addLogin(Commands &commands)
{
    struct Wish {
        std::string account, password_file, otp_code;
        bool yes = false;
    };
    auto wish = std::make_shared<Wish>();
    CLI::App &verb =
        addVerb(commands, commands.app, "login", "Open a session on the appliance of --host", [wish, &commands] {
            Remote &appliance = requireRemote();
            if (commands.fingerprint.empty())
                appliance.meet(wish->yes);
            const std::string host = addressText(appliance.address());
            const std::string password =
                readSecret(wish->password_file, "password of " + wish->account + " at " + host, Asked::Once);
            appliance.login(wish->account, password, wish->otp_code);
            print("Logged in to " + host + " as " + shown(wish->account) + "\n");
        });
    verb.footer("The session is kept in $XDG_STATE_HOME/iscsictl or ~/.local/state/iscsictl, the\n"
                "password is not. ISCSICTL_TOKEN in the environment is used in place of it.");
    verb.add_option("--account", wish->account, "Account there")->type_name("ACCOUNT")->required();
    addPasswordFile(verb, wish->password_file);
    verb.add_option("--otp", wish->otp_code, "One-time code, for an account that has them")->type_name("CODE");
    addYes(verb, wish->yes);
}

} // namespace

void addSessionVerbs(Commands &commands)
{
    addLogin(commands);
    addVerb(commands, commands.app, "logout", "End the session on the appliance of --host", [] {
        requireRemote().logout();
    }).footer("");
}

} // namespace cli
