/// What a verb does: ask the handlers, and write what they answer.
#pragma once

#include "webapi/handlers/Route.h"

#include <json/value.h>

#include <string>

namespace cli {

class Remote;

/// A request that failed: exit status 1.
struct Failure {
    int code;
    std::string reason;
};

/// Arguments that make no request: exit status 2.
struct UsageError {
    std::string reason;
};

/// Lets requests go to the appliance at a URL, "https://HOST[:PORT]", in place of this process's own. `fingerprint`,
/// unless it is empty, is the key that it must show. Throws UsageError and Failure.
void connect(const std::string &url, const std::string &fingerprint);

/// The appliance that requests go to; null: they are run in this process.
Remote *remote();

/// Runs a request, wherever.
webapi::Result perform(webapi::Method method, const std::string &path, const Json::Value &input);

/// The same; throws Failure.
Json::Value request(webapi::Method method, const std::string &path,
                    const Json::Value &input = Json::Value(Json::objectValue));

/// "/luns/NAME", "/targets/NAME" and "/snapshots/NAME", with what follows.
std::string lunPath(const std::string &selector, const std::string &rest = "");
std::string targetPath(const std::string &selector, const std::string &rest = "");
std::string snapshotPath(const std::string &selector, const std::string &rest = "");

/// Writes to standard output; throws Failure when that fails.
void print(const std::string &text);
/// A list takes a line for each element.
void printJson(const Json::Value &value);

/// Prints how far an export or import is, if one runs, as the handlers tell it under this path.
void printTransfer(const char *kind, const std::string &path);

/// Throws UsageError unless there is a terminal to confirm something at.
void requireTerminal();
bool confirmed(const std::string &question);

/// Shows the key of an appliance and asks whether it is the right one, unless `yes`; throws when it is not.
void confirmKey(const std::string &appliance, const std::string &pin, bool yes);

} // namespace cli
