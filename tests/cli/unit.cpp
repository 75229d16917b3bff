// What the command line and the handlers compute without a platform.
#include "cli/Display.h"
#include "cli/Size.h"
#include "iscsiwebapi/ISCSIErrorCode.h"
#include "webapi/handlers/Route.h"
#include "webapi/handlers/TargetIqn.h"

#include <gtest/gtest.h>
#include <json/reader.h>

#include <set>

namespace {

using namespace ISCSI;
using cli::parseSize;
using webapi::Field;
using webapi::Method;
using webapi::Type;

constexpr uint64_t K = 1024;
constexpr uint64_t M = K * K;
constexpr uint64_t G = K * M;
constexpr uint64_t T = K * G;

TEST(Size, ReadsNumbersWithBinaryUnits)
{
    const std::pair<const char *, uint64_t> sizes[] = {
        {"0", 0},
        {"513", 513},
        {"4096b", 4096},
        {"10G", 10 * G},
        {"10g", 10 * G},
        {"10GB", 10 * G},
        {"10GiB", 10 * G},
        {"1T", T},
        {"0.5K", 512},
        {"1.5G", G + 512 * M},
        {"1.50T", T + 512 * G},
        {"0.0009765625T", G},
        {"1.3G", 1395864064}, // 1395864371.2 down to a block
        {"0.1K", 0},
        {"15E", 15ull << 60},
        {"15.9999999999999999E", UINT64_MAX - 511}, // a float of 32 or 64 bits would make it 2^64
        {"18446744073709551615", UINT64_MAX},
        {"9223372036854775808", 1ull << 63},
    };
    for (const auto &[text, bytes] : sizes)
        EXPECT_EQ(parseSize(text), bytes) << text;
}

TEST(Size, RefusesEverythingElse)
{
    for (const char *text : {"", "G", ".5G", "1.G", "-1G", "+1G", " 1G", "1 G", "1,5G", "1.5", "1Q", "1GG", "1iB",
                             "0x10", "1e9", "nan", "16E", "1.5.5G", "\xc2\xb9G"})
        EXPECT_FALSE(parseSize(text)) << text;
    for (const char *text : {"18446744073709551616", "18014398509481984K", "1.0000000000000000001G"})
        EXPECT_FALSE(parseSize(text)) << text;
}

TEST(Size, IsShownAsItCanBeReadAgain)
{
    const std::pair<uint64_t, const char *> sizes[] = {
        {0, "0"},           {1023, "1023"},         {K, "1K"},
        {1536, "1.5K"},     {10 * G, "10G"},        {10 * G - 1, "9.99G"},
        {T, "1T"},          {G + G / 4, "1.25G"},   {1023 * M, "1023M"},
        {1ull << 60, "1E"}, {UINT64_MAX, "15.99E"},
    };
    for (const auto &[bytes, text] : sizes) {
        EXPECT_EQ(cli::shownSize(bytes), text);
        ASSERT_TRUE(parseSize(text)) << text;
        EXPECT_LE(*parseSize(text), bytes);
    }
}

TEST(Display, LeavesNothingForTheTerminalToObey)
{
    const std::pair<std::string, const char *> texts[] = {
        {"vol 1", "vol 1"},
        {"größe-数据", "größe-数据"},
        {"a\nb\tc", "a\\nb\\tc"},
        {"\x1b[2Jx", "\\x1b[2Jx"},
        {"a\\nb", "a\\\\nb"},
        {"\xc2\x9b"
         "2J",
         "\\u009b2J"},                   // a control sequence in one character
        {"x\xe2\x80\xaey", "x\\u202ey"}, // right to left
        {"\xff\xc3", "\\xff\\xc3"},
        {std::string("a\0b", 3), "a\\x00b"},
    };
    for (const auto &[text, expected] : texts)
        EXPECT_EQ(cli::shown(text), expected);
}

TEST(Display, AlignsColumnsByWidthOnTheTerminal)
{
    cli::Table table({{"NAME", cli::Align::Left}, {"SIZE", cli::Align::Right}, {"X", cli::Align::Left}});
    table.add({"数据", "10G", "a"});          // two columns each
    table.add({"cafe\xcc\x81", "512M", "b"}); // e and a combining accent
    table.add({"a\nb", "1", ""});
    EXPECT_EQ(table.text(), "NAME  SIZE  X\n"
                            "数据   10G  a\n"
                            "cafe\xcc\x81  512M  b\n"
                            "a\\nb     1\n");
    EXPECT_EQ(cli::keyValues({{"Name", "数据"}, {"Größe", "1"}}), "Name:   数据\nGröße:  1\n");
}

constexpr Field MASK[] = {
    {"iqn", Type::Text, true, 1, 10, ERR_BAD_TARGET_IQN},
    {"permission", Type::Text, false, 1, 2, ERR_BAD_TARGET_AUTH_INFO, "rw|r|-"},
};
constexpr Field ELEMENT[] = {{"", Type::Object, true, 0, 0, 0, nullptr, MASK}};
constexpr Field FIELDS[] = {
    {"name", Type::Text, true, 1, 4, ERR_BAD_LUN_NAME},
    {"size", Type::Unsigned, false, 1, INT64_MAX, ERR_BAD_LUN_SIZE},
    {"on", Type::Boolean, false, 0, 0, 0},
    {"masks", Type::List, false, 1, 2, ERR_BAD_TARGET_ACL, nullptr, ELEMENT},
};

Json::Value json(const std::string &text)
{
    Json::Value value;
    std::string errors;
    const Json::CharReaderBuilder builder;
    const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
    EXPECT_TRUE(reader->parse(text.data(), text.data() + text.size(), &value, &errors)) << errors << text;
    return value;
}

TEST(Input, IsRefusedByTheNameOfTheFieldAndNeverRepeated)
{
    const struct {
        const char *input;
        int code;
        const char *reason;
    } cases[] = {
        {R"({"name":"a"})", 0, ""},
        {R"({"name":"abcd","size":9223372036854775807,"on":false,"masks":[{"iqn":"i","permission":"-"}]})", 0, ""},
        {R"([])", ERR_INVALID_INPUT, "the input: must be an object"},
        {R"(null)", ERR_INVALID_INPUT, "the input: must be an object"},
        {R"({})", ERR_INVALID_INPUT, "name: is missing"},
        {R"({"name":"a","nam":1})", ERR_INVALID_INPUT, "nam: no such field"},
        {R"({"name":7})", ERR_INVALID_INPUT, "name: must be a text"},
        {R"({"name":null})", ERR_INVALID_INPUT, "name: must be a text"},
        {R"({"name":""})", ERR_BAD_LUN_NAME, "name: must have 1 to 4 bytes"},
        {R"({"name":"äää"})", ERR_BAD_LUN_NAME, "name: must have 1 to 4 bytes"},
        {R"({"name":"a\u0000b"})", ERR_BAD_LUN_NAME, "name: must not hold a NUL"},
        {"{\"name\":\"\xed\xa0\x80\"}", ERR_BAD_LUN_NAME, "name: must be UTF-8"},
        {"{\"name\":\"\xc0\xaf\"}", ERR_BAD_LUN_NAME, "name: must be UTF-8"},
        {R"({"name":"a","size":"1"})", ERR_INVALID_INPUT, "size: must be a whole number"},
        {R"({"name":"a","size":1.5})", ERR_INVALID_INPUT, "size: must be a whole number"},
        {R"({"name":"a","size":1e3})", ERR_INVALID_INPUT, "size: must be a whole number"},
        {R"({"name":"a","size":true})", ERR_INVALID_INPUT, "size: must be a whole number"},
        {R"({"name":"a","size":0})", ERR_BAD_LUN_SIZE, "size: must be from 1 to 9223372036854775807"},
        {R"({"name":"a","size":-1})", ERR_BAD_LUN_SIZE, "size: must be from 1 to 9223372036854775807"},
        {R"({"name":"a","size":9223372036854775808})", ERR_BAD_LUN_SIZE, "size: must be from 1 to 9223372036854775807"},
        {R"({"name":"a","on":1})", ERR_INVALID_INPUT, "on: must be true or false"},
        {R"({"name":"a","masks":{}})", ERR_INVALID_INPUT, "masks: must be a list"},
        {R"({"name":"a","masks":[]})", ERR_BAD_TARGET_ACL, "masks: must have 1 to 2 elements"},
        {R"({"name":"a","masks":[{"iqn":"i"},null]})", ERR_INVALID_INPUT, "masks[1]: must be an object"},
        {R"({"name":"a","masks":[{"iqn":"i"},{}]})", ERR_INVALID_INPUT, "masks[1].iqn: is missing"},
        {R"({"name":"a","masks":[{"iqn":"i","permission":"RW"}]})", ERR_BAD_TARGET_AUTH_INFO,
         "masks[0].permission: must be one of rw, r, -"},
        {R"({"name":"a","masks":[{"iqn":"i","permission":"r|"}]})", ERR_BAD_TARGET_AUTH_INFO,
         "masks[0].permission: must be one of rw, r, -"},
    };
    for (const auto &c : cases) {
        std::string reason;
        EXPECT_EQ(webapi::checkInput(FIELDS, json(c.input), reason), c.code) << c.input;
        EXPECT_EQ(reason, c.reason) << c.input;
    }
}

TEST(Routes, AnswerWhatTheTableHoldsAndNothingElse)
{
    std::set<std::pair<Method, std::string>> seen;
    for (const auto &route : webapi::routes()) {
        EXPECT_TRUE(seen.insert({route.method, route.path}).second) << route.path;
        // Changes take an administrator; but a session is opened and ended by anybody.
        const bool own_session = std::string(route.path) == "/session";
        EXPECT_TRUE(route.method == Method::Get || own_session || route.role == webapi::Role::Admin) << route.path;
    }
    const Json::Value empty(Json::objectValue);
    for (const char *path : {"", "/", "/lun", "/luns/a/b/c", "/luns/a/map", "luns", "/luns/%", "/luns/%4", "/luns/%zz",
                             "/luns/a%00b", "/luns/../targets"})
        EXPECT_EQ(webapi::dispatch(Method::Get, path, empty).code, ERR_NO_SUCH_API) << path;

    const auto refused =
        webapi::dispatch(Method::Post, "/luns", json(R"({"name":"a","type":15,"location":"/v","mode":1})"));
    EXPECT_EQ(refused.code, ERR_INVALID_INPUT);
    EXPECT_EQ(refused.reason, "mode: no such field");
    EXPECT_EQ(webapi::pathSegment("a/..%ä~"), "a%2F..%25%C3%A4~");
}

TEST(TargetIqn, IsValidWhateverHostAndNameAre)
{
    const struct {
        const char *host, *name, *iqn;
    } cases[] = {
        {"box.example.com", "web", "iqn.2001-01.com.example.box:web"},
        {"box", "Web Server_1", "iqn.2001-01.box:web-server-1"},
        {"BOX.", "a..b", "iqn.2001-01.box:a..b"},
        {"", "web", "iqn.2001-01.localhost:web"},
        {"a_b.-c-.d", "x", "iqn.2001-01.d.c.a-b:x"},
        {"box", "größe", "iqn.2001-01.box:gr-e"},
        {"box", "-x-", "iqn.2001-01.box:x"},
        {"box", "数据", ""},
        {"box", "", ""},
    };
    for (const auto &c : cases)
        EXPECT_EQ(webapi::targetIqn(c.host, c.name), c.iqn) << c.name;
    EXPECT_EQ(webapi::targetIqn("box", std::string(223, 'a')), "");
}

} // namespace
