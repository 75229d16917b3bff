/// What is to be sent: ascending ranges of a file.
#pragma once

#include <cstdint>
#include <functional>

namespace norvhost {

/// Bytes of a file and of the unit that it is sent to, in multiples of 512.
struct DataRange {
    uint64_t offset = 0;
    uint64_t length = 0;
    bool zeros = false; ///< reads as zeros in the file, and is to in the unit
};

/// Gives the next range, behind the one before; one of length 0 is the end. A code other than 0 ends the sending.
using NextRange = std::function<int(DataRange &range)>;

/// A whole file from `begin` to `end`: its data, and its holes as zeros. The file must not change meanwhile.
NextRange fileRanges(int fd, uint64_t begin, uint64_t end);

} // namespace norvhost
