/// stunnel, which carries connections inside TLS 1.3 to the appliance whose ROD key both ends know.
#pragma once

#include "host/core/FileDescriptor.h"

#include <string>
#include <sys/types.h>
#include <vector>

namespace norvhost {

/// Connections that come to a listening socket, and where they go.
struct StunnelWay {
    FileDescriptor listener;
    std::string to; ///< "address:port", "name:port"; an IPv6 address without brackets
};

struct StunnelRun {
    /// TLS is spoken with where connections go, and the process ends with the calling thread. Otherwise it is spoken
    /// with whoever connects.
    bool client = false;
    std::string rod_key; ///< of the appliance that data goes to
    std::vector<StunnelWay> ways;
    std::string options; ///< more lines for its configuration, in front of the ways
    std::string lock;    ///< of the file whose process lock (ProcessLock.h) it holds, empty for none
    int messages = -1;   ///< descriptor that it writes to
};

/// NORV_ERR_FILE_NOT_FOUND when the program is not there.
int requireStunnel();

/// Starts it as a child, which takes the sockets over. The key goes to it through memory: it is in no file, no argument
/// and no environment. 0, NORV_ERR_FILE_NOT_FOUND or another error code; what stunnel does not like it says in its
/// messages, and ends.
int startStunnel(StunnelRun &run, pid_t &pid);

/// Why it ended or gave a connection up, of its messages: the latest reason, empty for none.
std::string stunnelComplaint(const std::string &messages);

} // namespace norvhost
