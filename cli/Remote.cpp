#include "cli/Remote.h"

#include "cli/Request.h"
#include "iscsihost/https.h"
#include "iscsiwebapi/ISCSIErrorCode.h"
#include "webapi/handlers/JsonText.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <sys/stat.h>
#include <unistd.h>

namespace cli {

using webapi::Method;
using webapi::Result;

namespace {

namespace fs = std::filesystem;

constexpr char ROOT[] = "/api/v1";
constexpr int UNAUTHORIZED = 401;
constexpr int LONGEST_SILENCE_SECONDS = 900; ///< as long as the server waits for the program that answers

std::string variable(const char *name)
{
    const char *value = getenv(name);
    return value ? value : "";
}

/// One file for each appliance. An address has no slash in it, and its name is never "..": a port ends it.
fs::path fileOf(const Address &appliance)
{
    const std::string state = variable("XDG_STATE_HOME");
    const std::string home = variable("HOME");
    if (state.empty() && home.empty())
        throw Failure{ISCSI::ERR_FAILED_TO_GET_FILE_PATH, "neither XDG_STATE_HOME nor HOME is set"};
    const fs::path folder = state.empty() ? fs::path(home) / ".local" / "state" : fs::path(state);
    return folder / "iscsictl" / (addressText(appliance) + ".json");
}

[[noreturn]] void failedFile(int code, const fs::path &file)
{
    throw Failure{code, file.string() + ": " + strerror(errno)};
}

std::string query(const Json::Value &input)
{
    std::string text;
    for (const std::string &key : input.getMemberNames())
        text +=
            (text.empty() ? "?" : "&") + webapi::pathSegment(key) + "=" + webapi::pathSegment(input[key].asString());
    return text;
}

std::string member(const Json::Value &object, const char *key)
{
    const Json::Value &value = object[key];
    return value.isString() ? value.asString() : "";
}

/// What a problem description says; a server that is no appliance's may answer anything.
Result problemOf(const iscsihost::HttpsAnswer &answer)
{
    Json::Value problem;
    const bool good = webapi::parseJson(answer.body, problem) && problem.isObject() && problem["code"].isInt() &&
                      problem["code"].asInt() != 0;
    if (!good)
        return {ISCSI::ERR_BAD_RESPONSE, "the server answered with HTTP status " + std::to_string(answer.status), {}};
    return {problem["code"].asInt(), member(problem, "detail"), {}};
}

} // namespace

Remembered recall(const Address &appliance)
{
    const fs::path path = fileOf(appliance);
    const int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW);
    if (fd < 0 && errno == ENOENT)
        return {};
    struct stat status = {};
    if (fd < 0 || fstat(fd, &status) != 0)
        failedFile(ISCSI::ERR_FAILED_TO_OPEN_FILE, path);
    std::string text(static_cast<size_t>(status.st_size), '\0');
    const bool whole = read(fd, text.data(), text.size()) == status.st_size;
    close(fd);
    Json::Value value;
    if (!whole || !webapi::parseJson(text, value) || !value.isObject())
        throw Failure{ISCSI::ERR_FAILED_TO_READ_FILE, path.string() + " is damaged: delete it, and log in again"};
    return {member(value, "pin"), member(value, "account"), member(value, "token")};
}

void remember(const Address &appliance, const Remembered &remembered)
{
    const fs::path path = fileOf(appliance);
    std::error_code problem;
    fs::create_directories(path.parent_path(), problem);
    if (problem)
        throw Failure{ISCSI::ERR_FAILED_TO_CERATE_DIRECTORY, path.parent_path().string() + ": " + problem.message()};
    chmod(path.parent_path().c_str(), S_IRWXU);
    Json::Value value;
    value["pin"] = remembered.pin;
    value["account"] = remembered.account;
    value["token"] = remembered.token;
    const std::string text = webapi::jsonText(value) + "\n";
    std::string fresh = path.string() + ".XXXXXX";
    const int fd = mkostemp(fresh.data(), O_CLOEXEC); // mode 0600
    if (fd < 0)
        failedFile(ISCSI::ERR_FAILED_TO_WRITE_FILE, path);
    const bool written = write(fd, text.data(), text.size()) == static_cast<ssize_t>(text.size()) && fsync(fd) == 0;
    if (close(fd) != 0 || !written || rename(fresh.c_str(), path.c_str()) != 0) {
        const int err = errno;
        unlink(fresh.c_str());
        errno = err;
        failedFile(ISCSI::ERR_FAILED_TO_WRITE_FILE, path);
    }
}

Remote::Remote(const Address &appliance, const std::string &pin) : appliance(appliance), kept(recall(appliance))
{
    if (!pin.empty())
        kept.pin = pin;
    const std::string token = variable("ISCSICTL_TOKEN");
    if (!token.empty())
        kept.token = token;
}

Result Remote::dispatch(Method method, const std::string &path, const Json::Value &input) const
{
    const std::string name = "iscsictl --host https://" + addressText(appliance);
    if (kept.pin.empty())
        return {ISCSI::ERR_FAILED_TO_SEND_THE_REQUEST,
                "this appliance is not known yet: type '" + name + " login --account ACCOUNT', or give --fingerprint",
                {}};
    iscsihost::HttpsRequest request;
    request.host = appliance.host;
    request.port = appliance.port;
    request.protocol = "https";
    request.method = webapi::methodName(method);
    request.path = ROOT + path;
    if (method == Method::Get)
        request.path += query(input);
    else
        request.body = webapi::jsonText(input);
    request.token = kept.token;
    request.pin = kept.pin;
    request.stall_seconds = LONGEST_SILENCE_SECONDS;
    iscsihost::HttpsAnswer answer;
    if (int err = iscsihost::https(request, answer))
        return {err, iscsi_host_last_error(), {}};
    if (answer.status == UNAUTHORIZED && path != "/session") {
        const std::string state = kept.token.empty() ? "there is no session" : "the session has ended";
        return {ISCSI::ERR_FAILED_TO_LOGIN,
                state + ": type '" + name + " login --account " + (kept.account.empty() ? "ACCOUNT" : kept.account) +
                    "'",
                {}};
    }
    if (answer.status < 200 || answer.status > 299)
        return problemOf(answer);
    Result result;
    if (answer.status != 204 && !webapi::parseJson(answer.body, result.value))
        return {ISCSI::ERR_BAD_RESPONSE, "", {}};
    return result;
}

void Remote::meet(bool yes)
{
    std::string pin;
    if (int err = iscsihost::fetchPin(appliance.host, appliance.port, pin))
        throw Failure{err, iscsi_host_last_error()};
    if (pin == kept.pin)
        return;
    if (!kept.pin.empty())
        fprintf(stderr, "The key of %s has changed; it was %s\n", addressText(appliance).c_str(), kept.pin.c_str());
    confirmKey(addressText(appliance), pin, yes);
    kept.pin = pin;
}

void Remote::login(const std::string &account, const std::string &password, const std::string &otp_code)
{
    Json::Value input;
    input["account"] = account;
    input["password"] = password;
    if (!otp_code.empty())
        input["otp_code"] = otp_code;
    kept.token.clear();
    const Result result = dispatch(Method::Post, "/session", input);
    if (result.code)
        throw Failure{result.code, result.reason};
    kept.token = member(result.value, "token");
    if (kept.token.empty())
        throw Failure{ISCSI::ERR_BAD_RESPONSE, "the answer has no token"};
    kept.account = account;
    remember(appliance, kept);
}

void Remote::logout()
{
    if (kept.token.empty())
        return;
    const Result result = dispatch(Method::Delete, "/session", Json::Value(Json::objectValue));
    // A session that is not there any more has ended, too.
    if (result.code && result.code != ISCSI::ERR_FAILED_TO_LOGIN)
        throw Failure{result.code, result.reason};
    kept.token.clear();
    remember(appliance, kept);
}

} // namespace cli
