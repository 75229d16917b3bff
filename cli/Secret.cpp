#include "cli/Secret.h"

#include "cli/Request.h"
#include "iscsiwebapi/ISCSIErrorCode.h"

#include <cerrno>
#include <csignal>
#include <cstdio>
#include <memory>
#include <termios.h>
#include <unistd.h>

namespace cli {
namespace {

struct CloseFile {
    void operator()(FILE *file) const { fclose(file); }
};
using File = std::unique_ptr<FILE, CloseFile>;

/// One line without its end; longer than any secret may be is cut, and refused later for its length.
std::string readLine(FILE *file, const std::string &name)
{
    char line[1024];
    if (!fgets(line, sizeof(line), file))
        throw Failure{ISCSI::ERR_FAILED_TO_READ_FILE,
                      name + ": " + (ferror(file) ? strerror(errno) : "no secret in it")};
    std::string text(line);
    text.erase(text.find_last_not_of("\r\n") + 1);
    return text;
}

termios terminal_before;
int terminal_fd = -1;

/// Gives the terminal its echo back before a signal ends the program.
void restoreAndDie(int signal)
{
    tcsetattr(terminal_fd, TCSANOW, &terminal_before);
    std::signal(signal, SIG_DFL);
    raise(signal);
}

/// A terminal without echo, for as long as this lives.
class QuietTerminal {
public:
    explicit QuietTerminal(int fd)
    {
        terminal_fd = fd;
        tcgetattr(fd, &terminal_before);
        for (int signal : SIGNALS)
            std::signal(signal, restoreAndDie);
        termios quiet = terminal_before;
        quiet.c_lflag &= ~static_cast<tcflag_t>(ECHO);
        tcsetattr(fd, TCSAFLUSH, &quiet);
    }
    QuietTerminal(const QuietTerminal &) = delete;
    ~QuietTerminal()
    {
        tcsetattr(terminal_fd, TCSANOW, &terminal_before);
        for (int signal : SIGNALS)
            std::signal(signal, SIG_DFL);
    }

private:
    static constexpr int SIGNALS[] = {SIGINT, SIGTERM, SIGQUIT, SIGHUP};
};

std::string ask(FILE *terminal, const std::string &prompt)
{
    const QuietTerminal quiet(fileno(terminal));
    fprintf(terminal, "%s: ", prompt.c_str());
    fflush(terminal);
    std::string answer = readLine(terminal, "the terminal");
    fputc('\n', terminal);
    return answer;
}

} // namespace

std::string readSecret(const std::string &file, const std::string &what, Asked asked)
{
    if (file == "-")
        return readLine(stdin, "standard input");
    if (!file.empty()) {
        const File opened(fopen(file.c_str(), "re"));
        if (!opened)
            throw Failure{ISCSI::ERR_FAILED_TO_OPEN_FILE, file + ": " + strerror(errno)};
        return readLine(opened.get(), file);
    }
    const File terminal(isatty(STDIN_FILENO) ? fopen("/dev/tty", "r+e") : nullptr);
    if (!terminal)
        throw UsageError{"no terminal to ask for the " + what + ": give a file that holds it"};
    const std::string secret = ask(terminal.get(), what);
    if (asked == Asked::Twice && ask(terminal.get(), what + ", again") != secret)
        throw Failure{ISCSI::ERR_BAD_PARAMETER, "the two answers for the " + what + " differ"};
    return secret;
}

} // namespace cli
