#include "host/transfer/Ranges.h"

#include "host/storage/FileClone.h"

#include <algorithm>

namespace norvhost {

NextRange fileRanges(int fd, uint64_t begin, uint64_t end)
{
    return [=, at = begin](DataRange &range) mutable {
        uint64_t data = end, hole = end;
        if (at < end)
            if (int err = findData(fd, at, end, data, hole))
                return err;
        range.zeros = at < data;
        range.offset = at;
        range.length = (range.zeros ? data : hole) - at;
        at += range.length;
        return 0;
    };
}

} // namespace norvhost
