#include "tests/unit/Sweep.h"

#include <algorithm>
#include <cstring>
#include <filesystem>
#include <set>
#include <sstream>

#ifdef __SANITIZE_ADDRESS__
#include <sanitizer/lsan_interface.h>
#endif

namespace unit {
namespace {

/// Functions do not share one way to fail.
long failureOf(const std::string &call)
{
    static const std::pair<long, const char *> others[] = {
        {-1, " NORViSCSILunTaskGetSchIDByName ScheduleSnapshotTaskGetIDByLid "},
        {1, " NLIBCExec "},
        {-77,
         " NORVSchedTaskRemove NORVRETENTIONRemovePolicy NORVRETENTIONRunPolicy NORVLogSet1 NLIBCProcForkChildNoWait "
         "NLIBCFileGetKeyValue NLIBCFileCheckKeyValue NLIBCFileTouch NLIBCSzHashSetValue NLIBCFileGetSection "
         "NLIBCFileRemoveSection NLIBCFileEnumSection NORVFSMkdirP NORVCredItemSetHost NORVCredItemSetPort "
         "NORVCredItemSetProtocol NORVCredItemSetRemoteAccount NORVCredItemSetRemotePasswd "},
        {0, " NLIBCSzListAlloc NLIBCSzListGet NLIBCFileExist NLIBCSzHashAlloc NLIBCSzHashGetValue NLIBCFileAddSection "
            "NLIBCFileSetSection NLIBCFileLockByFile NLIBCFileLockTimeByFile NLIBCFileUnlockByFile DRNodeDB::Get "
            "DRNodeDB::List DRNodeDB::ListAttr DRNodeDB::SetAttr NORVCredAlloc NORVCredSessAlloc "
            "CredRequestUtil::LoginWithOTP CredRequestUtil::Logout NorvCgiSetOption NorvCgiRemoveSessionByIndex "},
    };
    for (const auto &[value, names] : others) {
        if (strstr(names, (" " + call + " ").c_str()))
            return value;
    }
    return INJECTED;
}

const char *const UNLOCK = "NLIBCFileUnlockByFile";

/// Whether none of the lines tells of a failure.
bool areNotes(const Lines &lines)
{
    return std::all_of(lines.begin(), lines.end(), [](const std::string &line) {
        return line.rfind("[info]", 0) == 0 || line.find("error: 0 (Success)") != std::string::npos;
    });
}

std::vector<std::string> callNames()
{
    std::vector<std::string> names;
    for (const auto &call : fake::calls())
        names.push_back(call.name);
    return names;
}

void start(const Operation &operation)
{
    fake::reset();
    operation.set_up();
    fake::forgetLogLines();
}

/// What a run without failures showed.
struct Clean {
    std::vector<std::string> calls; ///< the caller's, then those of its workers
    std::string outputs;
};

/// The operation's table by call, and what became of it.
class Table {
public:
    explicit Table(const Failures &failures)
    {
        for (const Failure &failure : failures) {
            std::istringstream calls(failure.calls);
            for (std::string call; calls >> call;)
                lines.emplace(call, &failure);
        }
    }

    /// The line for the n-th of the calls.
    Failure find(const std::vector<std::string> &calls, size_t n)
    {
        const std::string &call = calls[n - 1];
        const auto nth = std::count(calls.begin(), calls.begin() + static_cast<long>(n), call);
        for (const std::string &key : {call + "#" + std::to_string(nth), call}) {
            const auto found = lines.find(key);
            if (found == lines.end())
                continue;
            seen.insert(key);
            return *found->second;
        }
        return {call, INJECTED};
    }

    size_t unseen() const { return lines.size() - seen.size(); }

private:
    std::map<std::string, const Failure *> lines;
    std::set<std::string> seen;
};

long openDescriptors()
{
    const std::filesystem::directory_iterator entries("/proc/self/fd");
    return std::distance(begin(entries), end(entries));
}

bool hasLeaks()
{
#ifdef __SANITIZE_ADDRESS__
    return __lsan_do_recoverable_leak_check() != 0;
#else
    return false;
#endif
}

void expectLog(const Failure &failure, const Lines &lines)
{
    if (failure.then == Then::STOPS_SILENTLY || failure.then == Then::GOES_ON) {
        EXPECT_TRUE(areNotes(lines)) << testing::PrintToString(lines);
        return;
    }
    ASSERT_FALSE(lines.empty());
    EXPECT_EQ(lines.back().substr(0, failure.sentence.size()), failure.sentence) << lines.back();
}

void expectOutputs(const Operation &operation, const Clean &clean, const Failure &failure, const std::string &outputs)
{
    const bool is_worker = failure.code == 0 && failure.then == Then::STOPS;
    const std::string &otherwise = is_worker ? clean.outputs : failure.code ? operation.untouched : "";
    const std::string &expected = failure.outputs.empty() ? otherwise : failure.outputs;
    EXPECT_TRUE(expected.empty() || outputs == expected) << outputs;
}

void runWithFailure(const Operation &operation, const Clean &clean, size_t n, const Failure &failure)
{
    const auto &calls = clean.calls;
    start(operation);
    fake::failCall(static_cast<uint32_t>(n), failureOf(calls[n - 1]));
    std::string outputs = operation.untouched;
    EXPECT_EQ(operation.run(outputs), failure.code);
    expectLog(failure, logged()); // waits for workers
    expectOutputs(operation, clean, failure, outputs);
    EXPECT_EQ(fake::unfreedAnswers(), 0);
    const auto names = callNames();
    ASSERT_GE(names.size(), n);
    const auto failed = names.begin() + static_cast<long>(n);
    EXPECT_TRUE(std::equal(names.begin(), failed, calls.begin()));
    const bool goes_on = std::any_of(failed, names.end(), [](const auto &name) { return name != UNLOCK; });
    if (failure.then == Then::STOPS || failure.then == Then::CLEANS_UP || failure.code != 0) {
        EXPECT_EQ(goes_on, failure.then == Then::CLEANS_UP);
    }
    EXPECT_TRUE(calls[n - 1] == UNLOCK || fake::lockedFiles().empty());
}

} // namespace

Failure::Failure(std::string calls, int code, Then then, std::string sentence)
    : calls(std::move(calls)), code(code), then(then), sentence(std::move(sentence))
{
}

Failure::Failure(std::string calls, int code, std::string sentence)
    : Failure(std::move(calls), code, Then::STOPS, std::move(sentence))
{
}

Failure Failure::leaving(const std::string &other_outputs) const
{
    Failure failure = *this;
    failure.outputs = other_outputs;
    return failure;
}

Failures operator+(Failures some, const Failures &more)
{
    some.insert(some.end(), more.begin(), more.end());
    return some;
}

TEST_P(FailureSweep, EveryFailingCallIsReported)
{
    const Operation &operation = GetParam();
    start(operation);
    Clean clean{{}, operation.untouched};
    ASSERT_EQ(operation.run(clean.outputs), 0);
    EXPECT_TRUE(operation.done.empty() || clean.outputs == operation.done) << clean.outputs;
    const Lines lines = logged();
    EXPECT_TRUE(areNotes(lines)) << testing::PrintToString(lines);
    EXPECT_EQ(fake::lockedFiles(), Lines());
    clean.calls = callNames();
    ASSERT_FALSE(clean.calls.empty());

    fake::reset();
    const long descriptors = openDescriptors();
    Table table(operation.failures);
    for (size_t n = 1; n <= clean.calls.size(); ++n) {
        SCOPED_TRACE("call " + std::to_string(n) + " fails: " + clean.calls[n - 1]);
        runWithFailure(operation, clean, n, table.find(clean.calls, n));
    }
    EXPECT_EQ(table.unseen(), 0u) << "the table has lines for calls that are not made";
    fake::reset();
    EXPECT_EQ(openDescriptors(), descriptors);
    EXPECT_FALSE(hasLeaks());
}

} // namespace unit
