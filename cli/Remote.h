/// Another machine's web API as the place where requests go, and what its user keeps of it.
#pragma once

#include "cli/Address.h"
#include "webapi/handlers/Route.h"

#include <string>

namespace cli {

/// What a user keeps of an appliance, in a file of their own: never a password.
struct Remembered {
    std::string pin;     ///< the key that the appliance is known by, as in iscsihost/https.h
    std::string account; ///< of the session
    std::string token;   ///< secret: the session; empty without one
};

/// The file is in $XDG_STATE_HOME/iscsictl, else ~/.local/state/iscsictl, with mode 0600. Nothing kept is empty.
/// Throws Failure.
Remembered recall(const Address &appliance);
void remember(const Address &appliance, const Remembered &remembered);

/// An appliance that is talked to over HTTPS.
class Remote {
public:
    /// Takes what is remembered of it; $ISCSICTL_TOKEN wins over a remembered session. `pin`, unless it is empty, is
    /// the appliance's key and wins over a remembered one.
    Remote(const Address &appliance, const std::string &pin);

    const Address &address() const { return appliance; }
    const Remembered &remembered() const { return kept; }

    /// As webapi::dispatch(). A session that has ended is a failure that says what to type.
    webapi::Result dispatch(webapi::Method method, const std::string &path, const Json::Value &input) const;

    /// Knows the appliance by the key that it shows now, once the user has compared it.
    void meet(bool yes);

    /// Opens a session and remembers it, or ends it.
    void login(const std::string &account, const std::string &password, const std::string &otp_code);
    void logout();

private:
    Address appliance;
    Remembered kept;
};

} // namespace cli
