#include "host/transfer/FileReader.h"

#include <cerrno>
#include <cstring>
#include <fcntl.h>
#include <string>
#include <sys/eventfd.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace norvhost {
namespace {

// The kernel's own interface (io_submit(2)): a library for four calls would make every start of a program longer.

/// 0 when there is none. Giving one back takes the kernel 40 ms: it stays until the process ends. A child has none of
/// its parent's.
aio_context_t contextOfProcess()
{
    static pid_t owner = 0;
    static aio_context_t context = 0;
    if (owner == getpid())
        return context;
    owner = getpid();
    context = 0;
    return syscall(SYS_io_setup, FileReader::most_at_once, &context) == 0 ? context : context = 0;
}

} // namespace

FileReader::FileReader(int file) : file(file)
{
    const std::string path = "/proc/self/fd/" + std::to_string(file);
    direct.reset(open(path.c_str(), O_RDONLY | O_DIRECT | O_CLOEXEC));
    ended_event.reset(eventfd(0, EFD_NONBLOCK | EFD_CLOEXEC));
    if (direct && ended_event)
        context = contextOfProcess();
}

FileReader::~FileReader()
{
    while (under_way > 0)
        takeEnded(true);
}

void FileReader::begin(Part &part)
{
    void *const self = &part;
    part.request = {};
    memcpy(&part.request.aio_data, &self, sizeof self);
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
    if (part.under_way)
        ++under_way;
    else
        posix_fadvise(file, static_cast<off_t>(part.offset), static_cast<off_t>(part.length), POSIX_FADV_WILLNEED);
}

void FileReader::collect()
{
    uint64_t count = 0;
    if (under_way > 0 && ::read(ended_event.get(), &count, sizeof count) == sizeof count)
        takeEnded(false);
}

void FileReader::takeEnded(bool wait)
{
    io_event events[most_at_once];
    timespec none = {};
    const long ended = syscall(SYS_io_getevents, context, wait ? 1L : 0L, static_cast<long>(most_at_once), events,
                               wait ? nullptr : &none);
    for (long i = 0; i < ended; ++i) {
        void *ended_part = nullptr;
        memcpy(&ended_part, &events[i].data, sizeof ended_part);
        Part &part = *static_cast<Part *>(ended_part);
        part.result = events[i].res;
        part.under_way = false;
        --under_way;
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
