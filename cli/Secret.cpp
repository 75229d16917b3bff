#include "cli/Secret.h"

#include "cli/Request.h"
#include "iscsiwebapi/ISCSIErrorCode.h"

#include <bsd/readpassphrase.h>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <memory>
#include <unistd.h>

namespace cli {
namespace {

struct CloseFile {
    void operator()(FILE *file) const { fclose(file); }
};
using File = std::unique_ptr<FILE, CloseFile>;

constexpr size_t LONGEST_LINE = 1024;

/// One line without its end; longer than any secret may be is cut, and refused later for its length.
std::string readLine(FILE *file, const std::string &name)
{
    char line[LONGEST_LINE];
    if (!fgets(line, sizeof(line), file))
        throw Failure{ISCSI::ERR_FAILED_TO_READ_FILE,
                      name + ": " + (ferror(file) ? strerror(errno) : "no secret in it")};
    std::string text(line);
    text.erase(text.find_last_not_of("\r\n") + 1);
    return text;
}

std::string ask(const std::string &what)
{
    char answer[LONGEST_LINE];
    const bool is_there =
        isatty(STDIN_FILENO) && readpassphrase((what + ": ").c_str(), answer, sizeof answer, RPP_REQUIRE_TTY);
    const std::string text = is_there ? answer : "";
    explicit_bzero(answer, sizeof answer);
    if (!is_there)
        throw UsageError{"no terminal to ask for the " + what + ": give a file that holds it"};
    return text;
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
    const std::string secret = ask(what);
    if (asked == Asked::Twice && ask(what + ", again") != secret)
        throw Failure{ISCSI::ERR_BAD_PARAMETER, "the two answers for the " + what + " differ"};
    return secret;
}

} // namespace cli
