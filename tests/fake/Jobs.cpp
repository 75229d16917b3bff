// Scheduled jobs, retention policies and programs on the fake's model.
#include "platform/core.h"
#include "platform/retention.h"
#include "platform/schedule.h"
#include "tests/fake/Script.h"

using namespace fake;

namespace {

constexpr long NO_JOB = -1;

template <class Test>
long findJob(Test test)
{
    for (const auto &[id, job] : model().jobs) {
        if (test(job))
            return id;
    }
    return NO_JOB;
}

} // namespace

long NORViSCSILunTaskGetSchIDByName(const char *lun_name)
{
    if (auto failure = called(__func__, lun_name))
        return *failure;
    return answerOf(__func__, findJob([&](const Job &job) { return job.lun_name == lun_name; }));
}

long ScheduleSnapshotTaskGetIDByLid(int lid)
{
    if (auto failure = called(__func__, lid))
        return *failure;
    return answerOf(__func__, findJob([&](const Job &job) { return job.lid == lid; }));
}

int NORVSchedTaskRemove(long id)
{
    if (auto failure = called(__func__, id))
        return *failure;
    return model().jobs.erase(id) == 1 ? 0 : -1;
}

int NORVRETENTIONRemovePolicy(const char *kind, const char *key)
{
    if (auto failure = called(__func__, kind, key))
        return *failure;
    model().retention_policies.erase({kind, key});
    return 0;
}

int NLIBCExec(const char *program, const char *arg1, const char *arg2, const char *arg3, const char *arg4)
{
    std::string arguments = program;
    for (const char *argument : {arg1, arg2, arg3, arg4}) {
        if (!argument)
            break;
        arguments += std::string(", ") + argument;
    }
    if (auto failure = called(__func__, arguments))
        return *failure;
    return static_cast<int>(answerOf(__func__, model().exit_status));
}
