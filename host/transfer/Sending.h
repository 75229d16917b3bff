/// Sending parts of a file to a unit of an iSCSI target.
#pragma once

#include "host/transfer/Ranges.h"

#include <cstdint>
#include <functional>
#include <string>

namespace norvhost {

/// Where a unit is, and the log-in to it. The secrets are in no reason and in no log.
struct IscsiUnit {
    std::string portal; ///< "host", "host:port", "[address]:port"; a redirection is followed
    std::string target;
    int lun = 0;
    std::string initiator;
    std::string user, secret;               ///< CHAP, empty for none
    std::string mutual_user, mutual_secret; ///< what the target proves itself with, empty for none
};

struct Sending {
    IscsiUnit to;
    int from = -1;  ///< the file, which must not change meanwhile
    NextRange next; ///< what of it
    /// The unit reads as zeros: zeros are left out. Otherwise they are unmapped.
    bool to_zeros = false;
    /// Hears the bytes of data that the unit has acknowledged or needs not to be told, ten times a second also when
    /// nothing moves. A code other than 0 stops the sending and is its result.
    std::function<int(uint64_t moved)> progress;
    /// Hears from time to time up to which place the unit has it all, flushed; may be empty.
    std::function<void(uint64_t place)> flushed;
};

/// Sends it all and flushes the unit. One connection, which is not made again: whoever wants to go on after a failure
/// begins anew with the ranges that are left, from where it was flushed to. Takes 24 MiB of memory, whatever the size.
/// The calling thread does everything; a process may fork before and after.
///
/// 0, the code of `next` or `progress`, or a negative errno value with its reason recorded:
/// -ECONNREFUSED (no portal there), -EACCES (the log-in was refused), -ECONNRESET (the connection broke), -ETIMEDOUT
/// (nothing moved for a minute), -ENXIO (the unit is missing or too small), -EROFS, -ENOSPC, -EIO (the unit failed a
/// write), or what reading the file said. Anything up to the whole may have been written then.
int sendRanges(const Sending &sending);

} // namespace norvhost
