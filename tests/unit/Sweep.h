/// The failure sweep: an operation is run once for every platform call that it makes, with that call
/// failing. What the caller must see each time is one line of the operation's table.
#pragma once

#include "tests/unit/Library.h"

#include <functional>
#include <ostream>
#include <string>
#include <vector>

namespace unit {

/// What one run of an operation showed.
struct Outcome {
    int code;
    std::string info = {};    ///< text of the record acted on, for {info}
    std::string outputs = {}; ///< output arguments, as text
};

/// What must be seen when a call fails. In the log lines {info} stands for the text of the record,
/// {err} for the failing call's code with its text, {code} and {text} for either alone.
struct Failure {
    std::string call; ///< the function, or "function#2" for its second call alone
    int code;         ///< INJECTED: the failing call's own
    Lines lines;
    bool goes_on = false;     ///< to further platform calls, other than unlocking
    bool has_outputs = false; ///< those of success
    std::string outputs = {}; ///< when other than the operation's `untouched`

    Failure leaving(const std::string &other_outputs) const
    {
        Failure failure = *this;
        failure.outputs = other_outputs;
        return failure;
    }
};

/// The failing call is the operation's last, and this is its code and its log lines.
template <class... Texts>
Failure stops(const std::string &call, int code, const Texts &...lines)
{
    return {call, code, {lines...}};
}

/// The operation fails, and makes further calls to clean up.
template <class... Texts>
Failure cleansUp(const std::string &call, int code, const Texts &...lines)
{
    return {call, code, {lines...}, true};
}

/// The operation goes on, and succeeds.
template <class... Texts>
Failure goesOn(const std::string &call, const Texts &...lines)
{
    return {call, 0, {lines...}, true};
}

/// The failing call is the last of the operation's detached worker; the caller has had its success.
template <class... Texts>
Failure endsWorker(const std::string &call, const Texts &...lines)
{
    return {call, 0, {lines...}, false, true};
}

/// The worker goes on.
template <class... Texts>
Failure workerGoesOn(const std::string &call, const Texts &...lines)
{
    return {call, 0, {lines...}, true, true};
}

struct Operation {
    std::string name; ///< letters and digits
    void (*set_up)(); ///< makes the fake's model, which is empty
    std::function<Outcome()> run;
    std::string untouched; ///< outputs after a failure
    std::vector<Failure> failures;
    bool codes_only = false; ///< calls without a line in the table end it with their own code; texts are not compared
};

template <class... Failures>
Operation operation(const char *name, void (*set_up)(), std::function<Outcome()> run, const std::string &untouched,
                    const Failures &...failures)
{
    return {name, set_up, run, untouched, {failures...}};
}

/// What a failing call means to an operation whose log lines need no table of their own.
enum class Then {
    STOPS,
    STOPS_SILENTLY,
    CLEANS_UP,
    GOES_ON,
    ONLY_THE_LOG_TELLS
};

struct Codes {
    const char *calls; ///< as Failure::call, several apart by blanks
    int code;
    Then then = Then::STOPS;
};

/// An operation of which the sweep sees to codes, outputs and what is left behind, and that a failure is logged at
/// all. Calls that are not listed end it with their own code. Empty `untouched`: outputs may change.
Operation sweptForCodes(const char *name, void (*set_up)(), std::function<Outcome()> run, const std::string &untouched,
                        const std::vector<Codes> &codes);

class FailureSweep : public LibraryTest, public testing::WithParamInterface<Operation> {};

inline std::string operationName(const testing::TestParamInfo<Operation> &info)
{
    return info.param.name;
}

inline std::ostream &operator<<(std::ostream &stream, const Operation &operation)
{
    return stream << operation.name;
}

/// The standard form of a failure line.
inline std::string standard(const std::string &method, const std::string &sentence, const std::string &error = "{err}")
{
    return method + ": " + sentence + ". info: {info}. error: " + error;
}

} // namespace unit
