/// JSON that a record must refuse, made from what it takes.
#pragma once

#include "tests/unit/Library.h"

namespace unit {

struct JsonKind {
    Lines keys;
    bool is_required;
    Lines wrong; ///< values that the keys do not take
};

const Lines NO_TEXT = {"null", "3", "false", "[\"a\"]", "{\"a\": \"b\"}", "\"a\\u0000b\""};
const Lines NO_FLAG = {"null", "\"true\"", "[]", "{}"};
const Lines NO_INT = {"null", "\"3\"", "true", "[3]", "{}", "3.5", "1e99", "2147483648", "-2147483649"};
const Lines NO_SIZE = {"null", "\"3\"", "true", "[3]", "{}", "3.5", "1e99", "-1", "18446744073709551616"};

/// The record stays as it was, and the log tells.
template <class Record>
void expectBadJsonRefused(Record &record, const Json::Value &good, const Lines &told,
                          const std::vector<JsonKind> &kinds)
{
    const std::string before = record.toString();
    const auto refuses = [&](const Json::Value &in, const std::string &what) {
        EXPECT_EQ(record.loadFromJson(in), 18990201) << what;
        EXPECT_EQ(logged(), told) << what;
        EXPECT_EQ(record.toString(), before) << what;
    };
    Json::Value deep;
    for (int i = 0; i < 500; ++i) {
        Json::Value outer;
        outer["name"] = deep;
        deep = outer;
    }
    refuses(deep, "nested objects");
    for (const char *json : {"null", "[]", "[1, 2]", "\"text\"", "7", "true", "{}"})
        refuses(parsed(json), json);
    for (const JsonKind &kind : kinds) {
        for (const std::string &key : kind.keys) {
            Json::Value in = good;
            in.removeMember(key);
            if (kind.is_required)
                refuses(in, "no " + key);
            for (const std::string &value : kind.wrong) {
                in[key] = parsed(value);
                refuses(in, key + ": " + value);
            }
        }
    }
}

} // namespace unit
