/// Detached children.
#include "host/core/FileDescriptor.h"
#include "host/core/LastError.h"
#include "platform/core.h"
#include "platform/error.h"

#include <cerrno>
#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

using namespace norvhost;

namespace {

int cannotFork()
{
    failErrno(NORV_ERR_UNKNOWN, errno, "cannot start a worker");
    return -1;
}

/// Nobody waits for the child's outputs to end, a web server for instance, and no terminal ends it.
void detach()
{
    setsid();
    const int nothing = open("/dev/null", O_RDWR | O_CLOEXEC);
    for (int fd : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO})
        dup2(nothing, fd);
    if (nothing > STDERR_FILENO)
        close(nothing);
}

} // namespace

int NLIBCProcForkChildNoWait(void)
{
    int ends[2];
    if (pipe2(ends, O_CLOEXEC) != 0)
        return cannotFork();
    FileDescriptor read_end(ends[0]), write_end(ends[1]);

    // The child is its grandparent's, which waits for the one between only: nobody's zombie.
    const pid_t between = fork();
    if (between < 0)
        return cannotFork();
    if (between == 0) {
        const pid_t child = fork();
        if (child == 0) {
            read_end.reset();
            write_end.reset();
            detach();
            return 0;
        }
        const bool told = write(write_end.get(), &child, sizeof child) == sizeof child;
        _exit(told && child > 0 ? 0 : 1);
    }
    write_end.reset();
    pid_t child = -1;
    const bool told = read(read_end.get(), &child, sizeof child) == sizeof child;
    while (waitpid(between, nullptr, 0) < 0 && errno == EINTR)
        ;
    if (told && child > 0)
        return child;
    errno = EAGAIN;
    return cannotFork();
}
