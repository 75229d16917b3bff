/// A way to another appliance inside TLS.
#pragma once

#include "host/core/FileDescriptor.h"

#include <cstdint>
#include <string>
#include <sys/types.h>

namespace norvhost {

/// A port of this machine that leads into the TLS port of an appliance as long as the object lives, carried by a
/// stunnel of its own. That ends with the thread that made it, however that ends.
class Tunnel {
public:
    Tunnel() = default;
    Tunnel(const Tunnel &) = delete;
    ~Tunnel();

    /// `rod_key` is that appliance's. Nothing is connected yet.
    /// NORV_ERR_TASK_ADDRESS for what is no host, NORV_ERR_FILE_NOT_FOUND without stunnel.
    int open(const std::string &host, uint16_t port, const std::string &rod_key);

    /// "127.0.0.1:port"
    const std::string &portal() const { return entry; }

    /// Who connects to the portal sees only that the connection ends when there is nothing behind it. After such a
    /// failure: the code and reason that stunnel has for it, -ECONNREFUSED, NORV_ERR_ROD_KEY or the one given.
    int explain(int failure) const;

private:
    std::string entry, exit;
    FileDescriptor messages;
    pid_t process = 0;
};

} // namespace norvhost
