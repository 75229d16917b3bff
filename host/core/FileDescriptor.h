/// A file descriptor that closes itself.
#pragma once

#include <unistd.h>
#include <utility>

namespace norvhost {

class FileDescriptor {
public:
    FileDescriptor() = default;
    explicit FileDescriptor(int fd) : fd(fd) {}
    FileDescriptor(FileDescriptor &&other) noexcept : fd(std::exchange(other.fd, -1)) {}
    FileDescriptor &operator=(FileDescriptor &&other) noexcept
    {
        reset(std::exchange(other.fd, -1));
        return *this;
    }
    ~FileDescriptor() { reset(); }

    void reset(int other = -1)
    {
        if (fd >= 0)
            close(fd);
        fd = other;
    }
    int get() const { return fd; }
    /// The caller closes it.
    int release() { return std::exchange(fd, -1); }
    explicit operator bool() const { return fd >= 0; }

private:
    int fd = -1;
};

} // namespace norvhost
