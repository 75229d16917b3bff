/// Reading a file ahead of what is done with it.
#pragma once

#include "host/core/FileDescriptor.h"

#include <cstddef>
#include <cstdint>
#include <linux/aio_abi.h>

namespace norvhost {

/// Reads parts of a file into its caller's buffers, several at once, past the page cache: what is sent is read but
/// once. Where the file system cannot do that it reads through the cache, which it asks for the part in advance and
/// which gives the memory back afterwards. Not for several threads.
class FileReader {
public:
    struct Part {
        void *buffer = nullptr; ///< page-aligned; it must stay until the part was taken or the reader is gone
        uint64_t offset = 0;
        size_t length = 0;

        bool under_way = false, cached = false;
        int64_t result = 0;
        iocb request = {};
    };

    static constexpr unsigned most_at_once = 32;

    /// The file stays the caller's.
    explicit FileReader(int file);
    /// Waits for what is under way.
    ~FileReader();
    FileReader(const FileReader &) = delete;
    FileReader &operator=(const FileReader &) = delete;

    void begin(Part &part);

    /// To be polled for input; -1 when there is no need to.
    int event() const { return ended_event.get(); }
    /// Looks at what has ended.
    void collect();

    static bool isUnderWay(const Part &part) { return part.under_way; }
    /// Of a part that is not under way any more. 0, or an errno value: EIO also when the file ends in the part.
    int take(Part &part);

private:
    void takeEnded(bool wait);
    int readCached(const Part &part) const;

    const int file;
    FileDescriptor direct, ended_event;
    aio_context_t context = 0;
    unsigned under_way = 0;
};

} // namespace norvhost
