/// Making one file's data that of another.
#pragma once

#include "host/storage/LunStore.h"

#include <cstdint>
#include <functional>

namespace norvhost {

/// Makes `to` begin with all of `from`'s data, in blocks that both share until either is written: at one point in time,
/// whoever is writing to `from`, and without copying. A longer `to` keeps its size and what it has behind. `shared` is
/// false, and nothing changed, where the file system cannot. After a failure `to` may hold parts of both.
int shareBlocks(int from, int to, bool &shared);

/// Hears how far a copy is, 0 to 100; a code other than 0 ends it.
using CopyProgress = std::function<int(int percent)>;

/// The same by copying what is not a hole.
int copySparsely(int from, int to, const CopyProgress &progress);

/// Where the next data begins and ends, from `at` on; both `size` behind the last.
int findData(int fd, uint64_t at, uint64_t size, uint64_t &begin, uint64_t &end);

/// Whether it is nothing but holes: never written to, or all of it given back.
int isBlank(int fd, uint64_t size, bool &blank);

/// Bytes of a file that are not in holes.
int countData(int fd, uint64_t &bytes);

/// Hears how many bytes were copied; a code other than 0 ends the copy.
using BytesProgress = std::function<int(uint64_t done)>;

/// Copies what is not a hole to the same places of a file that has its size and nothing but zeros yet; what it has
/// allocated stays so. Little is left for the fsync() that follows: the disk writes along.
int copyData(int from, int to, const BytesProgress &progress);

/// shareBlocks() between a LUN's data and a file of the same volume, in either direction, or copySparsely() where that
/// cannot be; then it is refused while initiators may use the LUN, with NORV_ERR_LUN_MAPPED and nothing changed.
int cloneLunData(const LunRow &lun, int from, int to, const CopyProgress &progress);

} // namespace norvhost
