#include "host/core/Process.h"

#include "host/core/FileDescriptor.h"
#include "host/core/LastError.h"
#include "platform/error.h"

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <fcntl.h>
#include <poll.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

extern char **environ;

namespace norvhost {
namespace {

using Clock = std::chrono::steady_clock;

std::string variableName(const std::string &entry)
{
    return entry.substr(0, entry.find('='));
}

std::vector<std::string> mergedEnvironment(const std::vector<std::string> &changes)
{
    std::vector<std::string> merged = changes;
    for (char **entry = environ; *entry; ++entry) {
        const std::string name = variableName(*entry);
        if (std::none_of(changes.begin(), changes.end(),
                         [&](const std::string &change) { return variableName(change) == name; }))
            merged.push_back(*entry);
    }
    return merged;
}

struct Pipe {
    FileDescriptor read_end, write_end;

    bool open()
    {
        int ends[2];
        if (pipe2(ends, O_CLOEXEC) != 0)
            return false;
        read_end.reset(ends[0]);
        write_end.reset(ends[1]);
        return true;
    }
};

int spawn(const ProgramRun &run, const Pipe &output, const Pipe &errors, pid_t &pid)
{
    std::vector<std::string> arguments = run.arguments;
    std::vector<std::string> environment = mergedEnvironment(run.environment);

    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, STDIN_FILENO, "/dev/null", O_RDONLY, 0);
    posix_spawn_file_actions_adddup2(&actions, output.write_end.get(), STDOUT_FILENO);
    posix_spawn_file_actions_adddup2(&actions, errors.write_end.get(), STDERR_FILENO);

    const SpawnAttributes attributes;
    const int errnum = posix_spawnp(&pid, arguments[0].c_str(), &actions, attributes.get(), pointers(arguments).data(),
                                    pointers(environment).data());
    posix_spawn_file_actions_destroy(&actions);
    return errnum;
}

/// Reads what is there; false at the end of the stream.
bool readSome(int fd, std::string &text, size_t limit)
{
    char buffer[16384];
    const ssize_t count = read(fd, buffer, sizeof buffer);
    if (count < 0)
        return errno == EINTR || errno == EAGAIN;
    text.append(buffer, std::min(static_cast<size_t>(count), limit - std::min(limit, text.size())));
    return count > 0;
}

/// Reads both streams to their ends; false when the deadline came first.
bool readOutputs(const ProgramRun &run, Pipe &output, Pipe &errors, ProgramResult &result)
{
    const Clock::time_point deadline = Clock::now() + std::chrono::seconds(run.timeout_seconds);
    pollfd streams[] = {{output.read_end.get(), POLLIN, 0}, {errors.read_end.get(), POLLIN, 0}};
    std::string *texts[] = {&result.output, &result.errors};
    while (streams[0].fd >= 0 || streams[1].fd >= 0) {
        int wait_ms = -1;
        if (run.timeout_seconds > 0) {
            const auto left = std::chrono::ceil<std::chrono::milliseconds>(deadline - Clock::now()).count();
            if (left <= 0)
                return false;
            wait_ms = static_cast<int>(std::min<long long>(left, 60000));
        }
        if (poll(streams, 2, wait_ms) < 0)
            continue;
        for (int i = 0; i < 2; ++i)
            if (streams[i].revents && !readSome(streams[i].fd, *texts[i], run.output_limit))
                streams[i].fd = -1;
    }
    return true;
}

} // namespace

SpawnAttributes::SpawnAttributes(int flags)
{
    sigset_t all, none;
    sigfillset(&all);
    sigemptyset(&none);
    posix_spawnattr_init(&attributes);
    posix_spawnattr_setsigdefault(&attributes, &all);
    posix_spawnattr_setsigmask(&attributes, &none);
    posix_spawnattr_setflags(&attributes, static_cast<short>(flags | POSIX_SPAWN_SETSIGDEF | POSIX_SPAWN_SETSIGMASK));
}

std::vector<char *> pointers(std::vector<std::string> &texts)
{
    std::vector<char *> result;
    for (std::string &text : texts)
        result.push_back(text.data());
    result.push_back(nullptr);
    return result;
}

int runProgram(const ProgramRun &run, ProgramResult &result)
{
    const char *program = run.arguments.at(0).c_str();
    Pipe output, errors;
    if (!output.open() || !errors.open())
        return failErrno(NORV_ERR_UNKNOWN, errno, "cannot make a pipe to run %s", program);

    pid_t pid;
    if (int errnum = spawn(run, output, errors, pid))
        return failErrno(errnum == ENOENT ? NORV_ERR_FILE_NOT_FOUND : NORV_ERR_UNKNOWN, errnum, "cannot run %s",
                         program);
    output.write_end.reset();
    errors.write_end.reset();

    result = ProgramResult();
    const bool in_time = readOutputs(run, output, errors, result);
    if (!in_time)
        kill(pid, SIGKILL);
    int status;
    while (waitpid(pid, &status, 0) < 0)
        if (errno != EINTR)
            return failErrno(NORV_ERR_UNKNOWN, errno, "cannot wait for %s", program);
    if (!in_time)
        return fail(NORV_ERR_TIMEOUT, "%s did not end within %d seconds", program, run.timeout_seconds);

    result.status = WIFSIGNALED(status) ? 128 + WTERMSIG(status) : WEXITSTATUS(status);
    return 0;
}

std::string lastLine(const std::string &text)
{
    const size_t end = text.find_last_not_of("\r\n");
    if (end == std::string::npos)
        return "";
    const size_t before = text.find_last_of("\r\n", end);
    const size_t begin = before == std::string::npos ? 0 : before + 1;
    return text.substr(begin, end + 1 - begin);
}

} // namespace norvhost
