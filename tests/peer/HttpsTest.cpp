#include "PeerTest.h"

#include "host/core/FileDescriptor.h"
#include "platform/credential.h"
#include "platform/error.h"

#include <chrono>
#include <gmock/gmock.h>
#include <memory>
#include <netinet/in.h>
#include <sys/socket.h>
#include <vector>

namespace norvhost {
namespace {

using iscsihost::HttpsAnswer;
using iscsihost::HttpsRequest;
using testing::HasSubstr;
using testing::Not;

const std::string other_pin = "sha256//AAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAA=";

struct HttpsTest : PeerTest {
    HttpsAnswer answer;

    int send(const HttpsRequest &request) { return iscsihost::https(request, answer); }
    int send(const std::string &behaviour) { return send(ask(behaviour)); }
};

TEST_F(HttpsTest, SendsWhatItIsGivenAndNothingElse)
{
    setenv("https_proxy", "http://127.0.0.1:1", 1);
    setenv("ALL_PROXY", "http://127.0.0.1:1", 1);
    HttpsRequest request = ask("echo/../x%2Fy?a=b");
    request.method = "PATCH";
    request.token = "t0ken";
    request.body = "{\"a\":1}";
    EXPECT_EQ(0, send(request)) << reason();
    EXPECT_EQ(200, answer.status);
    EXPECT_EQ("application/json", answer.content_type);
    EXPECT_THAT(answer.body, HasSubstr("\"PATCH /api/v1/luns/echo/../x%2Fy?a=b HTTP/1.1\""));
    EXPECT_THAT(answer.body, HasSubstr("\"Authorization: Bearer t0ken\""));
    EXPECT_THAT(answer.body, HasSubstr("\"Content-Type: application/json\""));
    EXPECT_THAT(answer.body, HasSubstr("\"body\": \"{\\\"a\\\":1}\""));
    request = ask("echo");
    request.method = "POST";
    EXPECT_EQ(0, send(request)) << reason();
    EXPECT_THAT(answer.body, HasSubstr("Content-Length: 0"));
    EXPECT_THAT(answer.body, Not(HasSubstr("Authorization")));
    unsetenv("https_proxy");
    unsetenv("ALL_PROXY");
}

TEST_F(HttpsTest, WhatCannotBeSentAsItIsIsNotSent)
{
    const auto refuses = [this](auto change, const char *field) {
        HttpsRequest request = ask("echo");
        change(request);
        EXPECT_EQ(NORV_ERR_CREATE_REQUEST, send(request)) << field;
        EXPECT_THAT(reason(), HasSubstr(field));
    };
    using namespace std::string_literals;
    for (const std::string &host : {""s, "a b"s, "a\r\nX: y"s, "a/b"s, "user@a"s, "a\0b"s, "-a"s, "[::1]"s, "::1]/"s,
                                    "a:80"s, "::1%lo"s, "a#"s, std::string(254, 'a')})
        refuses([&](HttpsRequest &request) { request.host = host; }, "host");
    refuses([](HttpsRequest &request) { request.port = 0; }, "port");
    for (const char *protocol : {"", "file", "https://x"})
        refuses([&](HttpsRequest &request) { request.protocol = protocol; }, "protocol");
    refuses(
        [](HttpsRequest &request) {
            request.protocol = "http";
            request.host = "192.0.2.1";
        },
        "protocol");
    for (const char *method : {"", "get", "GET / HTTP/1.1\r\nX:", "CONNECT"})
        refuses([&](HttpsRequest &request) { request.method = method; }, "method");
    for (const std::string &path : {""s, "x"s, "/a b"s, "/a\r\nX: y"s, "/\xc3\xa4"s, "/a#b"s, "/a\0b"s})
        refuses([&](HttpsRequest &request) { request.path = path; }, "path");
    for (const std::string &token : {"s3cret\r\nX: y"s, "s3cret\n"s, "s3cret x"s, "s3cret\0"s}) {
        refuses([&](HttpsRequest &request) { request.token = token; }, "token");
        EXPECT_THAT(reason(), Not(HasSubstr("s3cret")));
    }
}

TEST_F(HttpsTest, OnlyThePinnedKeyIsTrusted)
{
    HttpsRequest request = ask("good");
    const std::string where = "127.0.0.1:" + std::to_string(request.port);
    request.pin.clear();
    EXPECT_EQ(NORV_ERR_SEND_REQUEST, send(request)); // no authority knows its certificate
    EXPECT_THAT(reason(), HasSubstr(where));
    EXPECT_THAT(reason(), HasSubstr("iscsictl node trust 127.0.0.1"));

    ASSERT_EQ(0, iscsihost::setPin("127.0.0.1", request.port, badServer().pin)) << reason();
    EXPECT_EQ(0, send(request)) << reason();
    ASSERT_EQ(0, iscsihost::setPin("127.0.0.1", request.port, other_pin)) << reason();
    EXPECT_EQ(NORV_ERR_SEND_REQUEST, send(request));
    for (const std::string &part : {where, other_pin, badServer().pin, std::string("iscsictl node trust 127.0.0.1")})
        EXPECT_THAT(reason(), HasSubstr(part));

    ASSERT_EQ(0, iscsihost::setPin("127.0.0.1", request.port, "")) << reason();
    EXPECT_EQ(NORV_ERR_SEND_REQUEST, send(request));
    request.pin = other_pin;
    EXPECT_EQ(NORV_ERR_SEND_REQUEST, send(request));
    EXPECT_THAT(reason(), Not(HasSubstr("node trust")));
}

TEST_F(HttpsTest, PinsAreKnownByHostAndPort)
{
    std::string pin;
    ASSERT_EQ(0, iscsihost::setPin("Peer.Example", 5443, other_pin));
    ASSERT_EQ(0, iscsihost::getPin("peer.example", 5443, pin));
    EXPECT_EQ(other_pin, pin);
    ASSERT_EQ(0, iscsihost::getPin("peer.example", 5444, pin));
    EXPECT_EQ("", pin);
    for (const char *bad : {"sha256//", "AAAA", "sha256//AAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAA=;sha256//x",
                            "sha256//AAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAAA\n="}) {
        EXPECT_EQ(NORV_ERR_BAD_PARAMETER, iscsihost::setPin("peer.example", 5443, bad)) << bad;
        HttpsRequest request = ask("good");
        request.pin = bad;
        EXPECT_EQ(NORV_ERR_CREATE_REQUEST, send(request)) << bad;
    }
    EXPECT_EQ(NORV_ERR_NODE_HOST, iscsihost::setPin("a/b", 5443, other_pin));
    ASSERT_EQ(0, iscsihost::getPin("peer.example", 5443, pin));
    EXPECT_EQ(other_pin, pin);
}

TEST_F(HttpsTest, BadAnswersAreRefused)
{
    for (const char *behaviour :
         {"half", "half-headers", "garbage", "http09", "chunk-garbage", "chunk-half", "headers"}) {
        EXPECT_EQ(NORV_ERR_BAD_RESPONSE, send(behaviour)) << behaviour << ": " << reason();
        EXPECT_THAT(reason(), HasSubstr("bad answer from 127.0.0.1"));
    }
    for (const char *behaviour : {"huge", "huge-chunks"}) {
        EXPECT_EQ(NORV_ERR_BAD_RESPONSE, send(behaviour)) << behaviour;
        EXPECT_THAT(reason(), HasSubstr("64 MiB")) << behaviour;
    }
    EXPECT_EQ(NORV_ERR_SEND_REQUEST, send("closed"));
    EXPECT_EQ(0, answer.status);      // none of them touched it
    HttpsRequest large = ask("deaf"); // hangs up while we send
    large.method = "POST";
    large.body.assign(32 << 20, ' ');
    EXPECT_EQ(NORV_ERR_SEND_REQUEST, send(large));
    EXPECT_EQ(0, send("redirect")) << reason();
    EXPECT_EQ(302, answer.status);
}

/// A listener on loopback that never accepts.
struct Listener {
    FileDescriptor socket{::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0)};
    std::vector<FileDescriptor> waiting;
    sockaddr_in name = {};

    explicit Listener(int clients)
    {
        name.sin_family = AF_INET;
        name.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
        socklen_t size = sizeof name;
        auto *address = reinterpret_cast<sockaddr *>(&name);
        EXPECT_EQ(0, bind(socket.get(), address, size));
        EXPECT_EQ(0, listen(socket.get(), 0));
        EXPECT_EQ(0, getsockname(socket.get(), address, &size));
        for (int i = 0; i < clients; ++i) {
            waiting.emplace_back(::socket(AF_INET, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0));
            connect(waiting.back().get(), address, size);
        }
    }
};

TEST_F(HttpsTest, NothingIsWaitedForLongerThanItsLimit)
{
    const auto timesOut = [this](HttpsRequest request, const char *what) {
        request.connect_seconds = 1;
        request.stall_seconds = 1;
        const auto begin = std::chrono::steady_clock::now();
        EXPECT_EQ(NORV_ERR_SEND_REQUEST, send(request)) << what;
        EXPECT_THAT(reason(), HasSubstr("no answer from 127.0.0.1")) << what;
        EXPECT_LT(std::chrono::steady_clock::now() - begin, std::chrono::seconds(9)) << what; // below the default
    };
    HttpsRequest request = ask("good");
    const Listener full(4), mute(0);
    request.port = ntohs(full.name.sin_port);
    timesOut(request, "backlog full");
    request.port = ntohs(mute.name.sin_port);
    timesOut(request, "no TLS answer");
    timesOut(ask("silent"), "no HTTP answer");
    timesOut(ask("stalled"), "half an answer");
}

TEST_F(HttpsTest, WhoIsNotThereIsNamed)
{
    HttpsRequest request = ask("good");
    {
        const Listener gone(0);
        request.port = ntohs(gone.name.sin_port);
    }
    EXPECT_EQ(NORV_ERR_SEND_REQUEST, send(request));
    EXPECT_THAT(reason(), HasSubstr("127.0.0.1:" + std::to_string(request.port)));
    std::string pin = "untouched";
    EXPECT_EQ(NORV_ERR_SEND_REQUEST, iscsihost::fetchPin("127.0.0.1", request.port, pin));
    EXPECT_EQ(NORV_ERR_CREATE_REQUEST, iscsihost::fetchPin("a\r\nb", request.port, pin));
    EXPECT_EQ("untouched", pin);
    request = ask("good");
    request.protocol = "http"; // plain text to a TLS port
    EXPECT_NE(0, send(request));
}

struct CredentialTest : PeerTest {
    std::unique_ptr<NORV_CRED, decltype(&NORVCredFree)> cred{NORVCredAlloc(), NORVCredFree};
    std::unique_ptr<NORV_CRED_SESS, decltype(&NORVCredSessFree)> session{NORVCredSessAlloc(), NORVCredSessFree};
    char token[16] = "untouched";

    void SetUp() override
    {
        ASSERT_EQ(0, iscsihost::setPin("127.0.0.1", badServer().port, badServer().pin));
        EXPECT_EQ(0, NORVCredItemSetHost(cred.get(), "127.0.0.1"));
        EXPECT_EQ(0, NORVCredItemSetPort(cred.get(), badServer().port));
        EXPECT_EQ(0, NORVCredItemSetProtocol(cred.get(), "https"));
        EXPECT_EQ(0, NORVCredItemSetRemoteAccount(cred.get(), "a\"lice"));
        EXPECT_EQ(0, NORVCredItemSetRemotePasswd(cred.get(), "s3cret"));
    }
};

TEST_F(CredentialTest, LogsInAndOut)
{
    Json::Value response;
    EXPECT_NE(0, NORVCredSessItemGetAccessToken(token, sizeof token, session.get()));
    ASSERT_TRUE(NORV::CredRequestUtil::LoginWithOTP(cred.get(), "123456", session.get(), &response)) << reason();
    EXPECT_NE(0, NORVCredSessItemGetAccessToken(token, 5, session.get())); // no room for its NUL
    EXPECT_STREQ("untouched", token);
    ASSERT_EQ(0, NORVCredSessItemGetAccessToken(token, 6, session.get())) << reason();
    EXPECT_STREQ("t0ken", token);
    EXPECT_EQ("t0ken", response["token"].asString());
    EXPECT_TRUE(NORV::CredRequestUtil::Logout(cred.get(), token)) << reason();
    EXPECT_FALSE(NORV::CredRequestUtil::Logout(cred.get(), "0ther"));
}

TEST_F(CredentialTest, FailuresLeaveNothingAndTellNoSecret)
{
    EXPECT_FALSE(NORV::CredRequestUtil::LoginWithOTP(cred.get(), "654321", session.get(), nullptr));
    EXPECT_THAT(reason(), HasSubstr("127.0.0.1"));
    EXPECT_THAT(reason(), Not(HasSubstr("s3cret")));
    EXPECT_NE(0, NORVCredSessItemGetAccessToken(token, sizeof token, session.get()));
    EXPECT_GT(0, NORVCredItemSetPort(cred.get(), 65536));
    EXPECT_GT(0, NORVCredItemSetHost(cred.get(), nullptr));
    EXPECT_GT(0, NORVCredItemSetRemotePasswd(nullptr, "x"));
    EXPECT_EQ(0, NORVCredItemSetHost(cred.get(), "a\r\nb"));
    EXPECT_FALSE(NORV::CredRequestUtil::LoginWithOTP(cred.get(), "123456", session.get(), nullptr));
    NORVCredFree(nullptr);
    NORVCredSessFree(nullptr);
}

} // namespace
} // namespace norvhost
