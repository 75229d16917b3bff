#include "KillAt.h"

#include "host/state/Database.h"
#include "HostTest.h"

#include <csignal>
#include <sys/ptrace.h>
#include <sys/wait.h>
#include <unistd.h>

namespace norvhost {

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

bool killAtSystemCall(int n, const std::function<int()> &work)
{
    const pid_t child = inChild([&] {
        if (openDatabase() != 0 || ptrace(PTRACE_TRACEME, 0, nullptr, nullptr) != 0)
            return 99;
        raise(SIGSTOP);
        return work();
    });
    int status = 0;
    // A call stops the process twice, as it begins and as it ends; the work changes nothing in between two calls.
    for (int stops = 0;; ++stops) {
        EXPECT_EQ(child, waitpid(child, &status, 0));
        if (!WIFSTOPPED(status)) {
            EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << "status " << status;
            return false;
        }
        if (stops == 2 * n)
            break;
        ptrace(PTRACE_SYSCALL, child, nullptr, nullptr);
    }
    kill(child, SIGKILL);
    waitpid(child, &status, 0);
    return true;
}

} // namespace norvhost
