/// Programs that callers run by their path. Those that the platform itself provides run in-process.
#include "host/core/LastError.h"
#include "host/core/Process.h"
#include "host/services/Epck.h"
#include "platform/core.h"
#include "platform/error.h"

using namespace norvhost;

namespace {

const struct {
    const char *path;
    int (*main)(int argc, const char *const argv[]);
} own_programs[] = {
    {epck_path, epckMain},
};

} // namespace

int NLIBCExec(const char *program, const char *arg1, const char *arg2, const char *arg3, const char *arg4)
{
    if (!program || !*program) {
        fail(NORV_ERR_NULL_POINTER, "no program to run");
        return -1;
    }
    const char *argv[] = {program, arg1, arg2, arg3, arg4, nullptr};
    int argc = 0;
    while (argv[argc])
        ++argc;
    for (const auto &own : own_programs)
        if (program == std::string_view(own.path))
            return own.main(argc, argv);

    ProgramRun run;
    run.arguments.assign(argv, argv + argc);
    ProgramResult result;
    return runProgram(run, result) == 0 ? result.status : -1;
}
