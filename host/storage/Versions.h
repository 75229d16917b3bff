/// Versions of a map file, kept in extended attributes of the file so that they travel with it.
#pragma once

#include "platform/extent_pool.h"

#include <cstdint>
#include <string>

namespace norvhost {

/// UUID texts. A file that was never synchronised has the all-zero UUID as both.
struct Versions {
    std::string base;    ///< the last state received in full
    std::string current; ///< the state now
};

/// Work of a transfer into or out of the file, in the transfer's own units.
struct TransferCount {
    uint64_t done = 0;
    uint64_t total = 0;
};

/// Which transfer a count belongs to; each is an attribute of its own.
enum class Transfer {
    sending, ///< sending to or from a peer
    copying, ///< the copy that fills the file
};

// Every function returns 0 or an error code: NORV_ERR_FILE_NOT_FOUND, NORV_ERR_BAD_MAP_FILE for what is
// no regular file or holds attributes that nobody here wrote.

/// After a write that no synchronisation made, `current` differs from `base`: it is then a UUID made
/// from the file's size and modification time, the same until the next write.
int readVersions(const std::string &path, Versions &versions);

/// The state `incoming` begins to arrive: from now on the current version differs from the base.
int beginSynchronisation(const std::string &path, const std::string &incoming);

/// The file is being made anew: it holds nothing of its base any more, and has none.
int forgetBase(const std::string &path);

/// Flushes the file; then the state that arrived is its base.
int finishSynchronisation(const std::string &path);

/// Gives `to`, which holds a copy of `from`'s data, the versions of `from`. Without `quiet` somebody may be writing to
/// `to`: its current version differs from the base then, as it does when `from`'s does. The caller flushes `to`.
int copyVersions(int from, int to, bool quiet);

/// Whether the file holds exactly the state that a synchronisation brought.
inline bool isSynchronised(const Versions &versions)
{
    return versions.base == versions.current && versions.base != NORV_ZERO_UUID;
}

/// Zeros when nothing was ever transferred.
int readTransferCount(const std::string &path, Transfer transfer, TransferCount &count);
int writeTransferCount(const std::string &path, Transfer transfer, const TransferCount &count);

} // namespace norvhost
