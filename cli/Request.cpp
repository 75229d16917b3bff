#include "cli/Request.h"

#include "iscsiwebapi/ISCSIErrorCode.h"

#include <json/writer.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <memory>
#include <sstream>
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
    Json::StreamWriterBuilder builder;
    if (!value.isArray()) {
        builder["indentation"] = "  ";
        return print(Json::writeString(builder, value) + "\n");
    }
    builder["indentation"] = "";
    const std::unique_ptr<Json::StreamWriter> writer(builder.newStreamWriter());
    std::ostringstream text;
    const char *before = "[\n";
    for (const Json::Value &element : value) {
        text << before;
        writer->write(element, &text);
        before = ",\n";
    }
    print(value.empty() ? "[]\n" : text.str() + "\n]\n");
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
