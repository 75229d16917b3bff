#include "cli/Request.h"

#include "iscsiwebapi/ISCSIErrorCode.h"

#include <json/writer.h>

#include <cerrno>
#include <cstdio>
#include <unistd.h>

namespace cli {

Json::Value request(webapi::Method method, const std::string &path, const Json::Value &input)
{
    webapi::Result result = webapi::dispatch(method, path, input);
    if (result.code)
        throw Failure{result.code, result.reason};
    return std::move(result.value);
}

std::string lunPath(const std::string &selector, const std::string &rest)
{
    return "/luns/" + webapi::pathSegment(selector) + rest;
}

std::string targetPath(const std::string &selector, const std::string &rest)
{
    return "/targets/" + webapi::pathSegment(selector) + rest;
}

std::string snapshotPath(const std::string &selector, const std::string &rest)
{
    return "/snapshots/" + webapi::pathSegment(selector) + rest;
}

void print(const std::string &text)
{
    if (fwrite(text.data(), 1, text.size(), stdout) != text.size() || fflush(stdout) != 0)
        throw Failure{ISCSI::ERR_FAILED_TO_WRITE_FILE, std::string("standard output: ") + strerror(errno)};
}

void printJson(const Json::Value &value)
{
    Json::StreamWriterBuilder writer;
    writer["indentation"] = "  ";
    print(Json::writeString(writer, value) + "\n");
}

void requireTerminal()
{
    if (!isatty(STDIN_FILENO))
        throw UsageError{"--yes is needed when there is no terminal to ask"};
}

bool confirmed(const std::string &question)
{
    fprintf(stderr, "%s [y/N] ", question.c_str());
    char answer[16];
    return fgets(answer, sizeof(answer), stdin) && (answer[0] == 'y' || answer[0] == 'Y');
}

} // namespace cli
