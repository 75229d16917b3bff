#include "cli/Watch.h"

#include "cli/Display.h"
#include "cli/Request.h"
#include "cli/Size.h"
#include "iscsiwebapi/ISCSIErrorCode.h"

#include <json/reader.h>
#include <json/writer.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstdio>
#include <cstring>
#include <fcntl.h>
#include <memory>
#include <optional>
#include <poll.h>
#include <sys/wait.h>
#include <unistd.h>

namespace cli {
namespace {

using Clock = std::chrono::steady_clock;

// Short actions are seen to end soon, long ones are not asked about all the time.
constexpr long FIRST_LOOK_NS = 5'000'000;
constexpr long LOOK_INTERVAL_NS = 200'000'000;

volatile sig_atomic_t interrupted = 0;

/// While it lives, Ctrl-C comes only in pause(), and ends nothing by itself.
class HeldInterrupt {
public:
    HeldInterrupt()
    {
        sigset_t interrupt;
        sigemptyset(&interrupt);
        sigaddset(&interrupt, SIGINT);
        sigprocmask(SIG_BLOCK, &interrupt, &before_mask);
        struct sigaction note = {};
        note.sa_handler = [](int) { interrupted = 1; };
        sigaction(SIGINT, &note, &before_action);
    }
    HeldInterrupt(const HeldInterrupt &) = delete;
    ~HeldInterrupt() { giveBack(); }

    void giveBack() const
    {
        sigaction(SIGINT, &before_action, nullptr);
        sigprocmask(SIG_SETMASK, &before_mask, nullptr);
    }

    /// Waits a moment, or until there is something to read; true when there is.
    bool pause(int fd)
    {
        pollfd readable = {fd, POLLIN, 0}; // a negative one is none
        const timespec moment = {0, interval};
        interval = std::min(interval + interval / 2, LOOK_INTERVAL_NS);
        return ppoll(&readable, 1, &moment, &before_mask) > 0;
    }

    /// Something new began: the next pauses are short again.
    void beginAnew() { interval = FIRST_LOOK_NS; }

private:
    long interval = FIRST_LOOK_NS;
    sigset_t before_mask;
    struct sigaction before_action;
};

/// Shows progress on standard error.
class Meter {
public:
    explicit Meter(const std::string &title) : title(shown(title)), terminal(isatty(STDERR_FILENO)) {}
    Meter(const Meter &) = delete;
    ~Meter()
    {
        if (terminal)
            fputs("\r\033[K", stderr);
    }

    void show(const Progress &progress)
    {
        const auto now = Clock::now();
        if (progress.total && !counted_from)
            counted_from = {now, progress.done};
        if (terminal)
            fprintf(stderr, "\r\033[K%s", line(progress, now).c_str());
        else if (worthALine(progress, now))
            fprintf(stderr, "%s\n", line(progress, now).c_str());
    }

private:
    struct Count {
        Clock::time_point time;
        uint64_t done;
    };

    static double seconds(Clock::duration duration) { return std::chrono::duration<double>(duration).count(); }

    static std::string clockText(double seconds)
    {
        const auto whole = static_cast<unsigned long long>(seconds);
        char text[48];
        if (whole >= 3600)
            snprintf(text, sizeof(text), "%llu:%02llu:%02llu", whole / 3600, whole / 60 % 60, whole % 60);
        else
            snprintf(text, sizeof(text), "%llu:%02llu", whole / 60, whole % 60);
        return text;
    }

    static int percentOf(const Progress &progress)
    {
        const double part = static_cast<double>(progress.done) / static_cast<double>(progress.total);
        return part >= 1 ? 100 : static_cast<int>(part * 100);
    }

    /// Without a terminal: the first, each tenth of the way, and a sign of life now and then.
    bool worthALine(const Progress &progress, Clock::time_point now)
    {
        constexpr auto SIGN_OF_LIFE = std::chrono::seconds(10);
        const int tenth = progress.total ? percentOf(progress) / 10 : 0;
        if (last_line && tenth == last_tenth && now - *last_line < SIGN_OF_LIFE)
            return false;
        last_line = now;
        last_tenth = tenth;
        return true;
    }

    std::string line(const Progress &progress, Clock::time_point now) const
    {
        if (!progress.total)
            return title + ": " + clockText(seconds(now - begun));
        constexpr int WIDTH = 30;
        const int percent = percentOf(progress);
        std::string text = title + ": ";
        if (terminal) {
            const auto filled = static_cast<size_t>(percent * WIDTH / 100);
            text += "[" + std::string(filled, '#') + std::string(WIDTH - filled, '.') + "] ";
        }
        text += std::to_string(percent) + "% of " + shownSize(progress.total);
        const double elapsed = seconds(now - counted_from->time);
        const double rate = static_cast<double>(progress.done - std::min(progress.done, counted_from->done)) / elapsed;
        if (elapsed > 0 && rate >= 1 && progress.done <= progress.total)
            text += ", " + shownSize(static_cast<uint64_t>(rate)) + "/s, " +
                    clockText(static_cast<double>(progress.total - progress.done) / rate) + " left";
        return text;
    }

    const std::string title;
    const bool terminal;
    const Clock::time_point begun = Clock::now();
    std::optional<Count> counted_from;
    std::optional<Clock::time_point> last_line;
    int last_tenth = 0;
};

[[noreturn]] void runInBackground(int answer_fd, const Action &action)
{
    setsid();
    const int nothing = open("/dev/null", O_RDWR | O_CLOEXEC);
    for (int fd : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO})
        dup2(nothing, fd);
    const webapi::Result result = perform(webapi::Method::Post, action.path, action.input);
    Json::Value answer;
    answer["code"] = result.code;
    answer["reason"] = result.reason;
    answer["value"] = result.value;
    Json::StreamWriterBuilder writer;
    writer["indentation"] = "";
    const std::string text = Json::writeString(writer, answer) + "\n";
    size_t at = 0;
    while (at < text.size()) {
        const ssize_t written = write(answer_fd, text.data() + at, text.size() - at);
        if (written <= 0)
            break; // nobody watches any more
        at += static_cast<size_t>(written);
    }
    _exit(0);
}

/// A request that runs in a session of its own, out of reach of the terminal.
class BackgroundRequest {
public:
    BackgroundRequest(const Action &action, const HeldInterrupt &interrupt)
    {
        std::array<int, 2> ends{};
        if (pipe2(ends.data(), O_CLOEXEC) != 0)
            throw Failure{ISCSI::ERR_FAILED_TO_FORK, strerror(errno)};
        child = fork();
        if (child == 0) {
            close(ends[0]);
            interrupt.giveBack();
            runInBackground(ends[1], action);
        }
        const int err = errno;
        close(ends[1]);
        answer_fd = ends[0];
        if (child < 0) {
            close(answer_fd);
            throw Failure{ISCSI::ERR_FAILED_TO_FORK, strerror(err)};
        }
    }
    BackgroundRequest(const BackgroundRequest &) = delete;
    ~BackgroundRequest() { close(answer_fd); }

    int fd() const { return answer_fd; }

    /// Takes what there is to read; true when the answer, a line, is complete. The end of the pipe says nothing:
    /// workers that the request leaves behind hold it too.
    bool read()
    {
        char part[4096];
        const ssize_t length = ::read(answer_fd, part, sizeof(part));
        if (length > 0)
            text.append(part, static_cast<size_t>(length));
        if (!text.empty() && text.back() == '\n') {
            if (!gone)
                waitpid(child, nullptr, 0);
            return true;
        }
        if (length <= 0)
            throw Failure{ISCSI::ERR_DEFAULT_ERROR_CODE, ENDED_EARLY};
        return false;
    }

    /// After a pause without an answer; throws when the child was gone before that pause.
    void checkAlive()
    {
        if (gone)
            throw Failure{ISCSI::ERR_DEFAULT_ERROR_CODE, ENDED_EARLY};
        gone = waitpid(child, nullptr, WNOHANG) == child;
    }

    Json::Value answer() const
    {
        Json::Value parsed;
        std::string problems;
        const std::unique_ptr<Json::CharReader> reader(Json::CharReaderBuilder().newCharReader());
        if (!reader->parse(text.data(), text.data() + text.size(), &parsed, &problems))
            throw Failure{ISCSI::ERR_DEFAULT_ERROR_CODE, problems};
        if (const int code = parsed["code"].asInt())
            throw Failure{code, parsed["reason"].asString()};
        return parsed["value"];
    }

private:
    static constexpr char ENDED_EARLY[] = "what was started ended without an answer";

    pid_t child = -1;
    bool gone = false;
    int answer_fd = -1;
    std::string text;
};

/// As a program that Ctrl-C ends, so that a script ends with it.
[[noreturn]] void endByInterrupt(const Action &action)
{
    if (isatty(STDERR_FILENO))
        fputs("\r\033[K", stderr);
    fprintf(stderr, "%s goes on; %s\n", shown(action.title).c_str(), shown(action.later).c_str());
    signal(SIGINT, SIG_DFL);
    sigset_t none;
    sigemptyset(&none);
    sigprocmask(SIG_SETMASK, &none, nullptr);
    raise(SIGINT);
    _exit(128 + SIGINT);
}

/// How far it is while its request still runs: what there is to ask about may not be there yet.
Progress askEarly(const Action &action)
{
    try {
        const Progress progress = action.ask();
        return progress.running ? progress : Progress{};
    } catch (const Failure &) {
        return {};
    }
}

} // namespace

Json::Value watch(const Action &action)
{
    HeldInterrupt interrupt;
    Meter meter(action.title);
    meter.show({});
    BackgroundRequest request(action, interrupt);
    while (true) {
        if (interrupt.pause(request.fd())) {
            if (request.read())
                break;
            continue;
        }
        if (interrupted)
            endByInterrupt(action);
        request.checkAlive();
        meter.show(askEarly(action));
    }
    Json::Value answer = request.answer();
    if (action.started)
        action.started(answer);
    interrupt.beginAnew();
    for (Progress progress = action.ask();; progress = action.ask()) {
        if (progress.running || progress.total)
            meter.show(progress);
        if (!progress.running)
            return answer;
        interrupt.pause(-1);
        if (interrupted)
            endByInterrupt(action);
    }
}

} // namespace cli
