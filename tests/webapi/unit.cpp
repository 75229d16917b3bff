// HTTP on top of the routes, without a server and without a state: what is refused before a handler runs.
#include "iscsiwebapi/ISCSIErrorCode.h"
#include "webapi/cgi/Answer.h"
#include "webapi/cgi/Input.h"
#include "webapi/cgi/Status.h"
#include "webapi/openapi/OpenApi.h"

#include <cerrno>
#include <gtest/gtest.h>

using webapi::Field;
using webapi::HttpAnswer;
using webapi::HttpRequest;
using webapi::Type;

namespace {

constexpr Field FIELDS[] = {
    {"name", Type::Text, false, 0, 64, 1},
    {"count", Type::Unsigned, false, 0, UINT64_MAX, 1},
    {"flag", Type::Boolean, false, 0, 0, 1},
};

Json::Value readQuery(const char *query)
{
    Json::Value input;
    std::string reason;
    return webapi::readQuery(FIELDS, query, input, reason) ? input : Json::Value(reason);
}

bool readsBody(const std::string &body)
{
    Json::Value input;
    std::string reason;
    return webapi::readBody(body, input, reason);
}

HttpAnswer ask(const std::string &method, const std::string &target)
{
    HttpRequest request;
    request.method = method;
    request.target = target;
    request.address = "192.0.2.1";
    return webapi::answer(request);
}

TEST(Query, TakesTheTypesOfTheFields)
{
    const Json::Value input = readQuery("name=a%20b%2Bc+d%26&count=18446744073709551615&&flag=true");
    EXPECT_EQ(input["name"], "a b+c d&");
    EXPECT_EQ(input["count"].asUInt64(), UINT64_MAX);
    EXPECT_EQ(input["flag"], true);
    // Left as texts, for the check of the input to refuse.
    for (const char *query : {"count=", "count=-1", "count=1x", "count=%201", "count=18446744073709551616", "flag=1"})
        EXPECT_TRUE((*readQuery(query).begin()).isString()) << query;
    EXPECT_EQ(readQuery("other=1")["other"], "1");
}

TEST(Query, RefusesWhatIsAmbiguousOrBroken)
{
    for (const char *query : {"name=a&name=b", "name=%", "name=%4", "name=%zz", "name=%00", "%=1"})
        EXPECT_TRUE(readQuery(query).isString()) << query;
}

TEST(Body, IsOneStrictJsonObject)
{
    EXPECT_TRUE(readsBody(""));
    EXPECT_TRUE(readsBody(R"( {"a": [1, {"b": "\u00e4 \" / \\"}]} )"));
    const std::string deep(17, '[');
    for (const std::string &body :
         {std::string("[]"), std::string("1"), std::string("{"), std::string("{} {}"), std::string("{} x"),
          std::string(R"({"a":1,"a":2})"), std::string(R"({"a":1,})"), std::string("{/**/}"), std::string("{'a':1}"),
          std::string(R"({"a":NaN})"), std::string("{\"a\":\"\xff\"}"), std::string("{\"a\":\"\xc0\xaf\"}"),
          "{\"a\":" + deep + std::string(17, ']') + "}", std::string(1 << 20, '[')})
        EXPECT_FALSE(readsBody(body)) << body.substr(0, 40);
}

TEST(Answer, ToUnknownPathsAndMethods)
{
    for (const char *target : {"/api/v1/", "/api/v1/lun", "/api/v1/luns/a/b", "/api/v1/luns/%", "/", "/api/v1",
                               "/api/v12/luns", "/api/v1/luns/../luns", "/api/v1/LUNS", "", "?"})
        EXPECT_EQ(ask("GET", target).status, 404) << target;
    EXPECT_EQ(ask("DELETE", "/api/v1/luns").status, 405);
    EXPECT_EQ(ask("DELETE", "/api/v1/luns").allow, "GET, POST");
    EXPECT_EQ(ask("BREW", "/api/v1/luns").status, 501);
}

TEST(Answer, KeepsTextsOutOfHeaders)
{
    HttpAnswer answer = webapi::problem(422, ISCSI::ERR_BAD_LUN_NAME, "a\r\nSet-Cookie: x=1\r\n\r\n\xff");
    answer.retry_after = 7;
    const std::string text = webapi::cgiText(answer);
    const std::string headers = text.substr(0, text.find("\r\n\r\n"));
    EXPECT_EQ(headers.find("Set-Cookie"), std::string::npos);
    EXPECT_NE(headers.find("Retry-After: 7"), std::string::npos);
    EXPECT_NE(text.find(R"("detail":"a\r\nSet-Cookie: x=1\r\n\r\n\ufffd")"), std::string::npos) << text;
}

TEST(Status, SaysWhoseFaultItIs)
{
    using namespace ISCSI;
    const std::pair<int, int> expected[] = {
        {ERR_NO_SUCH_LUN, 404},         {ERR_BAD_LUN_UUID, 404},      {ERR_LUN_IS_MAPPED, 409},
        {ERR_DUPLICATED_LUN_NAME, 409}, {ERR_BAD_LUN_SIZE, 422},      {ERR_INVALID_INPUT, 400},
        {ERR_NO_PERMISSION, 403},       {ERR_OUT_OF_FREE_SPACE, 507}, {-ENOSPC, 507},
        {ERR_BAD_RESPONSE, 502},        {ERR_TRY_AGAIN, 429},         {ERR_NODE_UUID_EXISTS, 409},
        {ERR_DEFAULT_ERROR_CODE, 500},  {ERR_FAILED_TO_LOGIN, 502},   {-EIO, 500},
    };
    for (const auto &[code, status] : expected)
        EXPECT_EQ(webapi::httpStatus(code), status) << code;
    EXPECT_EQ(webapi::httpStatus(INT32_MIN), 500);
}

TEST(OpenApi, DescribesEveryRouteAndFieldAndNothingElse)
{
    for (const std::string &problem : webapi::openApiProblems())
        ADD_FAILURE() << problem;
}

} // namespace
