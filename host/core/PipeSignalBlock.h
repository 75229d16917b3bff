/// libiscsi and libcurl write to their sockets without regard to SIGPIPE, which would end a caller that knows of no
/// socket.
#pragma once

#include <csignal>
#include <ctime>

namespace norvhost {

/// Holds SIGPIPE back in this thread while the object lives, and takes away what came meanwhile.
class PipeSignalBlock {
public:
    PipeSignalBlock()
    {
        sigset_t waiting;
        sigemptyset(&pipe_signal);
        sigaddset(&pipe_signal, SIGPIPE);
        sigpending(&waiting);
        was_waiting = sigismember(&waiting, SIGPIPE);
        pthread_sigmask(SIG_BLOCK, &pipe_signal, &before);
    }
    ~PipeSignalBlock()
    {
        const timespec now = {};
        if (!was_waiting)
            sigtimedwait(&pipe_signal, nullptr, &now);
        pthread_sigmask(SIG_SETMASK, &before, nullptr);
    }
    PipeSignalBlock(const PipeSignalBlock &) = delete;
    PipeSignalBlock &operator=(const PipeSignalBlock &) = delete;

private:
    sigset_t pipe_signal, before;
    bool was_waiting;
};

} // namespace norvhost
