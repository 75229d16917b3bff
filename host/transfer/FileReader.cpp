#include "host/transfer/FileReader.h"

#include <cerrno>
#include <fcntl.h>
#include <string>
#include <sys/eventfd.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace norvhost {

// The kernel's own interface (io_submit(2)): a library for four calls would make every start of a program longer.

FileReader::FileReader(int file, unsigned at_once) : file(file)
{
    const std::string path = "/proc/self/fd/" + std::to_string(file);
    direct.reset(open(path.c_str(), O_RDONLY | O_DIRECT | O_CLOEXEC));
    ended_event.reset(eventfd(0, EFD_NONBLOCK | EFD_CLOEXEC));
    if (!direct || !ended_event || syscall(SYS_io_setup, at_once, &context) != 0)
        context = 0;
}

FileReader::~FileReader()
{
    if (context)
        syscall(SYS_io_destroy, context);
}

void FileReader::begin(Part &part)
{
    part.request = {};
    part.request.aio_data = reinterpret_cast<uintptr_t>(&part);
    part.request.aio_lio_opcode = IOCB_CMD_PREAD;
    part.request.aio_fildes = static_cast<uint32_t>(direct.get());
    part.request.aio_buf = reinterpret_cast<uintptr_t>(part.buffer);
    part.request.aio_nbytes = part.length;
    part.request.aio_offset = static_cast<int64_t>(part.offset);
    part.request.aio_flags = IOCB_FLAG_RESFD;
    part.request.aio_resfd = static_cast<uint32_t>(ended_event.get());
    iocb *requests[] = {&part.request};
    part.under_way = context && syscall(SYS_io_submit, context, 1L, requests) == 1;
    part.cached = !part.under_way;
    if (part.cached)
        posix_fadvise(file, static_cast<off_t>(part.offset), static_cast<off_t>(part.length), POSIX_FADV_WILLNEED);
}

void FileReader::collect()
{
    if (!context)
        return;
    uint64_t count = 0;
    if (read(ended_event.get(), &count, sizeof count) != sizeof count)
        return;
    io_event events[32];
    timespec at_once = {};
    for (long i, ended = 1; ended > 0;) {
        ended = syscall(SYS_io_getevents, context, 0L, 32L, events, &at_once);
        for (i = 0; i < ended; ++i) {
            Part &part = *reinterpret_cast<Part *>(static_cast<uintptr_t>(events[i].data));
            part.result = events[i].res;
            part.under_way = false;
        }
    }
}

int FileReader::take(Part &part)
{
    if (!part.cached && part.result == static_cast<int64_t>(part.length))
        return 0;
    // A place that direct reading cannot have, or a disk that fails: reading again tells.
    return readCached(part);
}

int FileReader::readCached(const Part &part) const
{
    const off_t offset = static_cast<off_t>(part.offset);
    const ssize_t count = pread(file, part.buffer, part.length, offset);
    if (count < 0)
        return errno;
    posix_fadvise(file, offset, static_cast<off_t>(part.length), POSIX_FADV_DONTNEED);
    return count == static_cast<ssize_t>(part.length) ? 0 : EIO;
}

} // namespace norvhost
