#include "tests/fake/Fake.h"

#include "tests/fake/Script.h"
#include "tests/fake/SharedList.h"

#include <algorithm>
#include <cstdio>
#include <unordered_set>

namespace fake {
namespace {

/// An entry of the journal is the name, a NUL, and the arguments.
SharedList &journal()
{
    static SharedList list;
    return list;
}

uint32_t callsOf(const std::string &name)
{
    const auto all = calls();
    return static_cast<uint32_t>(
        std::count_if(all.begin(), all.end(), [&](const Call &call) { return call.name == name; }));
}

struct Failure {
    std::string name; ///< empty: any function
    uint32_t number;  ///< of the call in the journal, among those of the name
    long value;
};

struct Sequence {
    uint32_t before; ///< calls of the name that came before the first value
    std::vector<long> values;
};

struct Script {
    std::vector<Failure> failures;
    std::map<std::string, Sequence> answers;
};

Script &script()
{
    static Script the_script;
    return the_script;
}

std::unordered_set<const void *> &unfreed()
{
    static auto *answers = new std::unordered_set<const void *>; // outlives whoever frees late
    return *answers;
}

} // namespace

void noteAllocated(const void *memory)
{
    unfreed().insert(memory);
}

void noteFreed(const void *memory)
{
    unfreed().erase(memory);
}

int unfreedAnswers()
{
    return static_cast<int>(unfreed().size());
}

Model &model()
{
    static Model the_model;
    return the_model;
}

void reset()
{
    model() = Model();
    script() = Script();
    journal().clear();
    forgetLocks();
}

std::vector<Call> calls()
{
    std::vector<Call> result;
    for (const auto &text : journal().texts()) {
        const size_t end = text.find('\0');
        result.push_back({text.substr(0, end), text.substr(end + 1)});
    }
    return result;
}

void forgetCalls()
{
    journal().clear();
    script() = Script();
}

void failCall(uint32_t n, long value)
{
    script().failures.push_back({"", journal().count() + n, value});
}

void failCall(const std::string &name, uint32_t n, long value)
{
    script().failures.push_back({name, callsOf(name) + n, value});
}

void answer(const std::string &name, const std::vector<long> &values)
{
    script().answers[name] = {callsOf(name), values};
}

std::optional<long> noteCall(const char *name, const std::string &arguments)
{
    std::string entry(name);
    entry += '\0';
    entry += arguments;
    const uint32_t number = journal().append(entry);
    for (const auto &failure : script().failures) {
        const bool is_meant =
            failure.name.empty() ? failure.number == number : failure.name == name && failure.number == callsOf(name);
        if (is_meant)
            return failure.value;
    }
    return std::nullopt;
}

long answerOf(const char *name, long otherwise)
{
    const auto found = script().answers.find(name);
    if (found == script().answers.end())
        return otherwise;
    const uint32_t index = callsOf(name) - found->second.before - 1;
    return index < found->second.values.size() ? found->second.values[index] : otherwise;
}

bool isName(const std::string &text, size_t longest)
{
    const auto is_bad = [](unsigned char c) { return c < ' ' || c == 0x7F || c == '/'; };
    return !text.empty() && text != "." && text != ".." && text.size() <= longest &&
           std::none_of(text.begin(), text.end(), is_bad);
}

void makeUUID(char (&uuid)[37])
{
    snprintf(uuid, sizeof(uuid), "00000000-0000-4000-8000-%012x", ++model().uuids_made);
}

} // namespace fake
