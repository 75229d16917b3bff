/// Where the host platform keeps what it knows and what it runs with.
#pragma once

#include <string>

namespace norvhost {

/// $ISCSI_HOST_STATE, else /var/lib/iscsi-host: what must survive a restart.
std::string stateFolder();

/// $ISCSI_HOST_RUN, else /run/iscsi-host: sockets, process IDs and locks.
std::string runFolder();

/// $ISCSI_HOST_PROGRESS, else /tmp/iscsi, where readers look: the progress files of exports and imports.
std::string progressFolder();

/// Makes a folder and its missing parents with mode 0700: a parent may be the state folder itself. An existing folder
/// is left as it is. 0, else an error code.
int makeFolder(const std::string &path);

} // namespace norvhost
