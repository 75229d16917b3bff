/// What a verb does: ask the handlers, and write what they answer.
#pragma once

#include "webapi/handlers/Route.h"

#include <json/value.h>

#include <string>

namespace cli {

/// A request that failed: exit status 1.
struct Failure {
    int code;
    std::string reason;
};

/// Arguments that make no request: exit status 2.
struct UsageError {
    std::string reason;
};

/// Runs a request in this process; throws Failure.
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

} // namespace cli
