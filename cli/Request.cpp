#include "cli/Request.h"

#include "cli/Display.h"
#include "cli/Remote.h"
#include "iscsiwebapi/ISCSIErrorCode.h"

#include <json/writer.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <memory>
#include <sstream>
#include <unistd.h>

namespace cli {
namespace {

std::unique_ptr<Remote> appliance;

} // namespace

void connect(const std::string &url, const std::string &fingerprint)
{
    const auto address = parseUrl(url);
    if (!address)
        throw UsageError{"--host: '" + url + "' is not https://HOST or https://HOST:PORT"};
    appliance = std::make_unique<Remote>(*address, fingerprint);
}

Remote *remote()
{
    return appliance.get();
}

webapi::Result perform(webapi::Method method, const std::string &path, const Json::Value &input)
{
    return appliance ? appliance->dispatch(method, path, input) : webapi::dispatch(method, path, input);
}

Json::Value request(webapi::Method method, const std::string &path, const Json::Value &input)
{
    webapi::Result result = perform(method, path, input);
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

void confirmKey(const std::string &appliance, const std::string &pin, bool yes)
{
    fprintf(stderr, "%s shows the key %s\n", shown(appliance).c_str(), shown(pin).c_str());
    if (yes)
        return;
    if (!isatty(STDIN_FILENO))
        throw UsageError{"--fingerprint or --yes is needed when there is no terminal to ask"};
    if (!confirmed("Does 'iscsi-host certificate show' print the same there?"))
        throw Failure{ISCSI::ERR_NO_PERMISSION, "its key is not trusted"};
}

} // namespace cli
