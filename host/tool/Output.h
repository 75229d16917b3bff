/// What the verbs share to answer people and programs.
#pragma once

#include <string>

namespace Json {
class Value;
}

/// The exit status for a result of the host's functions; a failure is told on standard error.
int check(const char *what, int code);

/// Tells a failure of the program itself. Returns its exit status.
int refuse(const std::string &why);

void printJson(const Json::Value &value);
