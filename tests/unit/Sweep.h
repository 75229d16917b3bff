/// The failure sweep: an operation is run once for every platform call that it makes, with that call
/// failing. What must be seen each time is one line of the operation's table.
#pragma once

#include "tests/unit/Library.h"

#include <functional>
#include <ostream>
#include <string>
#include <vector>

namespace unit {

/// What a failing call means to its operation, or to the worker that made it.
enum class Then {
    STOPS,          ///< no further call is made, other than unlocking
    STOPS_SILENTLY, ///< nor is anything logged
    CLEANS_UP,      ///< further calls are made
    GOES_ON,        ///< nothing is logged
    ONLY_THE_LOG_TELLS
};

struct Failure {
    std::string calls; ///< functions, apart by blanks; "function#2" is its second call alone
    int code;          ///< INJECTED: the failing call's own
    Then then;
    std::string sentence;     ///< that the last log line begins with
    std::string outputs = {}; ///< when other than the operation's `untouched`

    Failure(std::string calls, int code, Then then = Then::STOPS, std::string sentence = "");
    Failure(std::string calls, int code, std::string sentence);

    Failure leaving(const std::string &other_outputs) const;
};

using Failures = std::vector<Failure>;
Failures operator+(Failures some, const Failures &more);

/// Calls that are not in the table end the operation with their own code.
struct Operation {
    std::string name;                      ///< letters and digits
    void (*set_up)();                      ///< makes the fake's model, which is empty
    std::function<int(std::string &)> run; ///< changes the outputs, as text; returns the code
    std::string untouched;                 ///< outputs before, and after a failure; empty: they may change
    Failures failures = {};
    std::string done = {}; ///< outputs of success, where no other test sees to them
};

/// The same, for an operation on an object that `make` makes.
template <class Make, class Act>
Operation on(Make make, const char *name, void (*set_up)(), Act act, const std::string &untouched,
             const Failures &failures, const std::string &done = "")
{
    const auto run = [make, act](std::string &outputs) {
        auto subject = make();
        return act(subject, outputs);
    };
    return {name, set_up, run, untouched, failures, done};
}

class FailureSweep : public LibraryTest, public testing::WithParamInterface<Operation> {};

inline std::string operationName(const testing::TestParamInfo<Operation> &info)
{
    return info.param.name;
}

inline std::ostream &operator<<(std::ostream &stream, const Operation &operation)
{
    return stream << operation.name;
}

} // namespace unit
