#include "HostTest.h"

#include "host/core/Process.h"
#include "platform/core.h"

namespace norvhost {
namespace {

TEST(Program, GetsItsArgumentsAsTheyAre)
{
    ProgramRun run;
    run.arguments = {"printf", "%s|", "a b", "$(id)", "'\"", "*", ""};
    ProgramResult result;
    ASSERT_EQ(0, runProgram(run, result)) << iscsi_host_last_error();
    EXPECT_EQ(0, result.status);
    EXPECT_EQ("a b|$(id)|'\"|*||", result.output);
}

TEST(Program, TellsStatusOutputsAndEnvironmentApart)
{
    ProgramRun run;
    run.arguments = {"/bin/sh", "-c", "echo out $X $HOME; echo first >&2; echo last >&2; cat; exit 7"};
    run.environment = {"X=1", "HOME=elsewhere"};
    ProgramResult result;
    ASSERT_EQ(0, runProgram(run, result));
    EXPECT_EQ(7, result.status);
    EXPECT_EQ("out 1 elsewhere\n", result.output);
    EXPECT_EQ("last", lastLine(result.errors));

    run.arguments = {"/bin/sh", "-c", "kill -9 $$"};
    ASSERT_EQ(0, runProgram(run, result));
    EXPECT_EQ(137, result.status);
    run.arguments = {"/no/such/program"};
    EXPECT_EQ(NORV_ERR_FILE_NOT_FOUND, runProgram(run, result));
}

TEST(Program, OutputIsBoundedAndTimeIsLimited)
{
    ProgramRun run;
    run.arguments = {"/bin/sh", "-c", "head -c 3000000 /dev/zero; head -c 3000000 /dev/zero >&2; exit 3"};
    run.output_limit = 100000;
    ProgramResult result;
    ASSERT_EQ(0, runProgram(run, result));
    EXPECT_EQ(3, result.status) << "the program is read to its end, not cut off";
    EXPECT_EQ(100000u, result.output.size());
    EXPECT_EQ(100000u, result.errors.size());

    run.arguments = {"sleep", "100"};
    run.timeout_seconds = 1;
    EXPECT_EQ(NORV_ERR_TIMEOUT, runProgram(run, result));
}

TEST(Program, ExecRunsAnyProgramAndTheCheckerInProcess)
{
    EXPECT_EQ(0, NLIBCExec("/bin/true", nullptr, nullptr, nullptr, nullptr));
    EXPECT_EQ(5, NLIBCExec("/bin/sh", "-c", "exit $1", "sh", "5"));
    EXPECT_EQ(-1, NLIBCExec("/no/such/program", nullptr, nullptr, nullptr, nullptr));
    EXPECT_EQ(-1, NLIBCExec(nullptr, nullptr, nullptr, nullptr, nullptr));

    setenv("ISCSI_HOST_RUN", "/nonexistent/run", 1);
    EXPECT_EQ(1, NLIBCExec("/usr/norv/sbin/epck", "--vaaick", "nolog", nullptr, nullptr)) << "no daemon runs";
    EXPECT_EQ(2, NLIBCExec("/usr/norv/sbin/epck", "--other", nullptr, nullptr, nullptr));
}

} // namespace
} // namespace norvhost
