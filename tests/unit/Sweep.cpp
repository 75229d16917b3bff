#include "tests/unit/Sweep.h"

#include <algorithm>
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
    static const std::map<std::string, long> others = {
        {"NORViSCSILunTaskGetSchIDByName", -1},
        {"ScheduleSnapshotTaskGetIDByLid", -1},
        {"NORVSchedTaskRemove", -77},
        {"NORVRETENTIONRemovePolicy", -77},
        {"NORVRETENTIONRunPolicy", -77},
        {"NORVLogSet1", -77},
        {"NLIBCExec", 1},
        {"NLIBCProcForkChildNoWait", -77},
        {"NLIBCSzListAlloc", 0},
        {"NLIBCSzListGet", 0},
        {"NLIBCFileExist", 0},
        {"NLIBCFileGetKeyValue", -77},
        {"NLIBCFileCheckKeyValue", -77},
        {"NLIBCFileTouch", -77},
        {"NLIBCSzHashAlloc", 0},
        {"NLIBCSzHashSetValue", -77},
        {"NLIBCSzHashGetValue", 0},
        {"NLIBCFileGetSection", -77},
        {"NLIBCFileAddSection", 0},
        {"NLIBCFileSetSection", 0},
        {"NLIBCFileRemoveSection", -77},
        {"NLIBCFileEnumSection", -77},
        {"NLIBCFileLockByFile", 0},
        {"NLIBCFileLockTimeByFile", 0},
        {"NLIBCFileUnlockByFile", 0},
        {"NORVFSMkdirP", -77},
        {"DRNodeDB::Get", 0},
        {"DRNodeDB::List", 0},
        {"DRNodeDB::ListAttr", 0},
        {"DRNodeDB::SetAttr", 0},
        {"NORVCredAlloc", 0},
        {"NORVCredSessAlloc", 0},
        {"NORVCredItemSetHost", -77},
        {"NORVCredItemSetPort", -77},
        {"NORVCredItemSetProtocol", -77},
        {"NORVCredItemSetRemoteAccount", -77},
        {"NORVCredItemSetRemotePasswd", -77},
        {"CredRequestUtil::LoginWithOTP", 0},
        {"CredRequestUtil::Logout", 0},
        {"NorvCgiSetOption", 0},
        {"NorvCgiRemoveSessionByIndex", 0},
    };
    const auto found = others.find(call);
    return found == others.end() ? INJECTED : found->second;
}

const char *const UNLOCK = "NLIBCFileUnlockByFile";

/// Log lines less those that tell of no failure.
Lines failuresLogged()
{
    Lines lines = logged();
    lines.erase(
        std::remove_if(lines.begin(), lines.end(), [](const auto &line) { return line.rfind("[info]", 0) == 0; }),
        lines.end());
    return lines;
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

/// The line of the table for the n-th call, which is the `occurrence`-th of its name.
const Failure *find(const Operation &operation, const std::string &call, long occurrence)
{
    const std::string numbered = call + "#" + std::to_string(occurrence);
    const Failure *result = nullptr;
    for (const auto &failure : operation.failures) {
        if (failure.call == numbered)
            return &failure;
        if (failure.call == call)
            result = &failure;
    }
    return result;
}

void replace(std::string &text, const std::string &what, const std::string &with)
{
    for (size_t at = text.find(what); at != std::string::npos; at = text.find(what, at + with.size()))
        text.replace(at, what.size(), with);
}

Lines filledIn(Lines lines, const std::string &info)
{
    for (auto &line : lines) {
        replace(line, "{err}", INJECTED_ERROR);
        replace(line, "{code}", std::to_string(INJECTED));
        replace(line, "{text}", INJECTED_TEXT);
        replace(line, "{info}", info);
    }
    return lines;
}

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

/// What a run without failures showed.
struct Clean {
    std::vector<std::string> calls; ///< the caller's, then those of its workers
    std::string outputs;
};

const std::string &expectedOutputs(const Operation &operation, const Clean &clean, const Failure &failure)
{
    if (!failure.outputs.empty())
        return failure.outputs;
    return failure.has_outputs ? clean.outputs : operation.untouched;
}

const char *const SOME_LINE = "*";

/// The table's line for a call that is not in it.
Failure endsWithItsOwnCode(const std::string &call)
{
    return {call, INJECTED, {SOME_LINE}};
}

/// What a run showed beside its table: whether anything was logged, outputs of a failure, further calls.
void expectRoughly(const Operation &operation, const Failure &failure, const Outcome &outcome, const Lines &lines,
                   bool goes_on)
{
    if (failure.code == 0 && failure.lines.empty())
        return;
    EXPECT_EQ(lines.empty(), failure.lines.empty());
    if (failure.code == 0)
        return;
    EXPECT_TRUE(operation.untouched.empty() || outcome.outputs == operation.untouched) << outcome.outputs;
    EXPECT_EQ(goes_on, failure.goes_on);
}

void runWithFailure(const Operation &operation, const Clean &clean, size_t n, const Failure &failure)
{
    const auto &calls = clean.calls;
    start(operation);
    fake::failCall(static_cast<uint32_t>(n), failureOf(calls[n - 1]));
    const Outcome outcome = operation.run();
    EXPECT_EQ(outcome.code, failure.code);
    const Lines lines = failuresLogged(); // waits for workers
    EXPECT_EQ(fake::unfreedAnswers(), 0);
    const auto names = callNames();
    ASSERT_GE(names.size(), n);
    EXPECT_TRUE(std::equal(calls.begin(), calls.begin() + static_cast<long>(n), names.begin()));
    const bool goes_on =
        std::any_of(names.begin() + static_cast<long>(n), names.end(), [](const auto &name) { return name != UNLOCK; });
    EXPECT_TRUE(calls[n - 1] == UNLOCK || fake::lockedFiles().empty());
    if (operation.codes_only) {
        expectRoughly(operation, failure, outcome, lines, goes_on);
        return;
    }
    EXPECT_EQ(lines, filledIn(failure.lines, outcome.info));
    EXPECT_EQ(outcome.outputs, expectedOutputs(operation, clean, failure));
    EXPECT_EQ(goes_on, failure.goes_on);
}

} // namespace

Operation sweptForCodes(const char *name, void (*set_up)(), std::function<Outcome()> run, const std::string &untouched,
                        const std::vector<Codes> &codes)
{
    Operation result = {name, set_up, std::move(run), untouched, {}, true};
    for (const Codes &same : codes) {
        std::istringstream calls(same.calls);
        for (std::string call; calls >> call;) {
            Failure failure = {call, same.code, {}, same.then == Then::CLEANS_UP};
            if (same.then != Then::STOPS_SILENTLY && same.then != Then::GOES_ON)
                failure.lines = {SOME_LINE};
            result.failures.push_back(failure);
        }
    }
    return result;
}

TEST_P(FailureSweep, EveryFailingCallIsReported)
{
    const Operation &operation = GetParam();
    start(operation);
    const Outcome outcome = operation.run();
    ASSERT_EQ(outcome.code, 0);
    const Lines lines = failuresLogged();
    EXPECT_TRUE(operation.codes_only || lines.empty()) << testing::PrintToString(lines);
    EXPECT_EQ(fake::lockedFiles(), Lines());
    const Clean clean{callNames(), outcome.outputs};
    const auto &calls = clean.calls;
    ASSERT_FALSE(calls.empty());

    fake::reset();
    const long descriptors = openDescriptors();
    std::set<const Failure *> seen;
    for (size_t n = 1; n <= calls.size(); ++n) {
        const std::string &call = calls[n - 1];
        SCOPED_TRACE("call " + std::to_string(n) + " fails: " + call);
        const auto occurrence = std::count(calls.begin(), calls.begin() + static_cast<long>(n), call);
        const Failure *failure = find(operation, call, occurrence);
        EXPECT_TRUE(failure || operation.codes_only) << "the table has no line for this call";
        if (failure)
            seen.insert(failure);
        runWithFailure(operation, clean, n, failure ? *failure : endsWithItsOwnCode(call));
    }
    EXPECT_EQ(seen.size(), operation.failures.size()) << "the table has lines for calls that are not made";
    fake::reset();
    EXPECT_EQ(openDescriptors(), descriptors);
    EXPECT_FALSE(hasLeaks());
}

} // namespace unit
