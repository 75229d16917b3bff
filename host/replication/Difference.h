/// What differs between two files of which one began as a clone of the other.
#pragma once

#include "host/transfer/Ranges.h"

#include <cstdint>
#include <vector>

namespace norvhost {

/// What has to be written to a copy of `base` to make it a copy of `file`, ascending, without overlaps, up to `size`.
/// Blocks that both files share are equal and not read; where the file system cannot tell (encoded, inline or unknown
/// extents, no extent map at all) the contents are compared. A `base` of -1 is all zeros. Both files are flushed and
/// not written to meanwhile.
int findDifference(int base, int file, uint64_t size, std::vector<DataRange> &ranges);

/// As findDifference() from a base that nobody knows: everything, holes included.
int describeWhole(int file, uint64_t size, std::vector<DataRange> &ranges);

/// Bytes of data in them.
uint64_t dataBytes(const std::vector<DataRange> &ranges);

/// The same of what lies below a place.
uint64_t dataBelow(const std::vector<DataRange> &ranges, uint64_t place);

/// What of them lies behind it.
std::vector<DataRange> rangesFrom(const std::vector<DataRange> &ranges, uint64_t place);

} // namespace norvhost
