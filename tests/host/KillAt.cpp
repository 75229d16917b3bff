#include "KillAt.h"

#include "host/state/Database.h"
#include "HostTest.h"

#include <csignal>
#include <sys/ptrace.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

namespace norvhost {
namespace {

/// Whether the child stopped at the beginning of a call that may change something that others see: killing it before
/// any other call is the same as killing it before the next one of these.
bool beginsAChange(pid_t child)
{
    __ptrace_syscall_info call = {};
    if (ptrace(PTRACE_GET_SYSCALL_INFO, child, sizeof call, &call) < 0 || call.op != PTRACE_SYSCALL_INFO_ENTRY)
        return false;
    switch (call.entry.nr) {
    case SYS_read:
    case SYS_pread64:
    case SYS_lseek:
    case SYS_fstat:
    case SYS_newfstatat:
    case SYS_statfs:
    case SYS_fstatfs:
    case SYS_statx:
    case SYS_faccessat2:
    case SYS_readlinkat:
    case SYS_getdents64:
    case SYS_fgetxattr:
    case SYS_lgetxattr:
    case SYS_mmap:
    case SYS_munmap:
    case SYS_mprotect:
    case SYS_madvise:
    case SYS_brk:
    case SYS_futex:
    case SYS_getpid:
    case SYS_geteuid:
    case SYS_getrandom:
    case SYS_clock_gettime:
    case SYS_rt_sigprocmask:
        return false;
    default:
        return true;
    }
}

/// Kills a process of its own before the n-th such call of the work; false when the work ended before.
bool killAtSystemCall(int n, const std::function<int()> &work)
{
    const pid_t child = inChild([&] {
        if (openDatabase() != 0 || ptrace(PTRACE_TRACEME, 0, nullptr, nullptr) != 0)
            return 99;
        raise(SIGSTOP);
        return work();
    });
    int status = 0;
    for (int calls = 0;;) {
        EXPECT_EQ(child, waitpid(child, &status, 0));
        if (!WIFSTOPPED(status)) {
            EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << "status " << status;
            return false;
        }
        ptrace(PTRACE_SETOPTIONS, child, nullptr, PTRACE_O_TRACESYSGOOD); // for what call it is to be told
        if (beginsAChange(child) && calls++ == n)
            break;
        ptrace(PTRACE_SYSCALL, child, nullptr, nullptr);
    }
    kill(child, SIGKILL);
    waitpid(child, &status, 0);
    return true;
}

} // namespace

StateKeeper::StateKeeper()
    : process(inChild([] {
          openDatabase();
          return pause();
      }))
{
}

StateKeeper::~StateKeeper()
{
    kill(process, SIGKILL);
    waitpid(process, nullptr, 0);
}

void killAtEverySystemCall(int least, const std::function<void()> &prepare, const std::function<int()> &work,
                           const std::function<void()> &check)
{
    int n = 0;
    for (bool killed = true; killed && !testing::Test::HasFailure(); ++n) {
        SCOPED_TRACE("killed before call " + std::to_string(n));
        prepare();
        killed = killAtSystemCall(n, work);
        check();
    }
    EXPECT_LT(least, n) << "the work was not followed";
}

} // namespace norvhost
