/// Accounts, log-ins and sessions of the web API.
#include "HostTest.h"

#include "host/state/Database.h"
#include "iscsihost/session.h"
#include "platform/cgi_session.h"

#include <chrono>
#include <cstring>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <liboath/oath.h>
#include <sstream>
#include <unistd.h>

namespace norvhost {
namespace {

using namespace iscsihost;

const std::string password = "correct horse", here = "192.0.2.1";

struct SessionTest : HostTest {
    /// Returns the URI with the secret for one-time codes.
    static std::string addAccount(const std::string &name, AccountRole role = AccountRole::admin, bool codes = false)
    {
        std::string uri;
        EXPECT_EQ(0, iscsihost::addAccount(name, role, password, codes, uri)) << iscsi_host_last_error();
        return uri;
    }
    static int logIn(const std::string &name, const std::string &given = password, const std::string &address = here,
                     const std::string &code = "")
    {
        Session session;
        return login(name, given, code, address, session);
    }
    static std::string token(const std::string &name)
    {
        Session session;
        EXPECT_EQ(0, login(name, password, "", here, session)) << iscsi_host_last_error();
        return session.token;
    }
    static int use(const std::string &token, const std::string &address = here)
    {
        Session session;
        return authenticate(token, address, session);
    }
    static size_t countSessions()
    {
        std::vector<Session> sessions;
        EXPECT_EQ(0, listSessions(sessions));
        return sessions.size();
    }
    /// As if so many seconds had passed.
    static void age(int seconds, bool unused = true)
    {
        Query sessions("UPDATE sessions SET created = created - ?1, last_used = last_used - ?2");
        EXPECT_EQ(0, sessions.bind(seconds).bind(unused ? seconds : 0).run());
        Query failures("UPDATE login_failures SET last = last - ?1");
        EXPECT_EQ(0, failures.bind(seconds).run());
    }
    static int delay(const std::string &name, const std::string &address = here)
    {
        int seconds = -1;
        EXPECT_EQ(0, loginDelay(name, address, seconds));
        return seconds;
    }
    bool stateHolds(const std::string &text)
    {
        for (const auto &file : std::filesystem::directory_iterator(root + "/state")) {
            std::ostringstream content;
            content << std::ifstream(file.path()).rdbuf();
            if (content.str().find(text) != std::string::npos)
                return true;
        }
        return false;
    }
};

TEST_F(SessionTest, OpensForWhoProvesItAndOnlyForThem)
{
    addAccount("alice");
    addAccount("bob", AccountRole::viewer);
    Session session;
    ASSERT_EQ(0, login("bob", password, "", "::ffff:192.0.2.1", session)) << iscsi_host_last_error();
    EXPECT_EQ(64u, session.token.size());
    EXPECT_NE(session.token, token("bob"));
    EXPECT_FALSE(stateHolds(session.token) || stateHolds(password)) << "who reads the state could use it";

    Session used;
    ASSERT_EQ(0, authenticate(session.token, here, used)) << iscsi_host_last_error();
    EXPECT_EQ("bob", used.account);
    EXPECT_EQ(AccountRole::viewer, used.role);
    EXPECT_EQ(session.expires, used.expires);
    EXPECT_EQ(NORV_ERR_LOGIN, use(session.token, "192.0.2.2"));
    for (const std::string &wrong : {std::string(), session.token.substr(1), session.token + "0", std::string(64, '0')})
        EXPECT_EQ(NORV_ERR_LOGIN, use(wrong));
    EXPECT_EQ(0, logout(session.token));
    EXPECT_EQ(NORV_ERR_LOGIN, use(session.token));
    EXPECT_EQ(NORV_ERR_LOGIN, logout(session.token));

    EXPECT_EQ(NORV_ERR_LOGIN, logIn("alice", "wrong"));
    const std::string reason = iscsi_host_last_error();
    for (const auto &[name, given] : {std::pair<std::string, std::string>{"carol", password},
                                      {"alice", ""},
                                      {"Bob", password},
                                      {"alice' --", password},
                                      {std::string(100000, 'x'), password}}) {
        EXPECT_EQ(NORV_ERR_LOGIN, logIn(name, given, "198.51.100." + std::to_string(given.size())));
        EXPECT_EQ(reason, iscsi_host_last_error()) << "nothing tells which accounts there are";
    }
}

TEST_F(SessionTest, EndsUnusedAfterAWhileAndAtLastAnyway)
{
    addAccount("alice");
    std::string used = token("alice");
    age(29 * 60);
    EXPECT_EQ(0, use(used));
    age(29 * 60);
    EXPECT_EQ(0, use(used)) << "its use was not noted";
    age(30 * 60);
    EXPECT_EQ(NORV_ERR_LOGIN, use(used));
    EXPECT_EQ(0u, countSessions());

    used = token("alice");
    age(24 * 3600 - 60, false);
    EXPECT_EQ(0, use(used));
    age(60, false);
    EXPECT_EQ(NORV_ERR_LOGIN, use(used));

    used = token("alice");
    age(120);
    ASSERT_EQ(0, setSessionLimits({60, 60})) << "also for open ones";
    EXPECT_EQ(NORV_ERR_LOGIN, use(used));
    EXPECT_EQ(NORV_ERR_BAD_PARAMETER, setSessionLimits({59, 60}));
    EXPECT_EQ(NORV_ERR_BAD_PARAMETER, setSessionLimits({120, 60}));
}

TEST_F(SessionTest, EndsWithItsAccountAndItsPassword)
{
    addAccount("alice");
    const std::string of_alice = token("alice");
    EXPECT_EQ(0, setAccountPassword("alice", "another one"));
    EXPECT_EQ(NORV_ERR_LOGIN, use(of_alice));
    EXPECT_EQ(NORV_ERR_LOGIN, logIn("alice"));
    EXPECT_EQ(0, logIn("alice", "another one"));

    addAccount("bob");
    const std::string of_bob = token("bob");
    EXPECT_EQ(0, removeAccount("bob"));
    EXPECT_EQ(NORV_ERR_LOGIN, use(of_bob));
    addAccount("bob");
    EXPECT_EQ(NORV_ERR_LOGIN, use(of_bob)) << "a namesake's session";

    const std::string closed = token("bob");
    std::vector<Session> sessions;
    ASSERT_EQ(0, listSessions(sessions));
    EXPECT_EQ(0, closeSession(sessions.back().id));
    EXPECT_EQ(NORV_ERR_LOGIN, use(closed));
    EXPECT_EQ(NORV_ERR_LOGIN, closeSession(sessions.back().id));
}

TEST_F(SessionTest, RefusesAccountsThatCannotBe)
{
    addAccount("alice");
    std::string uri;
    for (const char *name : {"", "alice", "-x", ".", "a b", "a/b", "a\n", "\xc3\xa4"})
        EXPECT_EQ(NORV_ERR_ACCOUNT, iscsihost::addAccount(name, AccountRole::viewer, password, true, uri)) << name;
    EXPECT_EQ(NORV_ERR_ACCOUNT, iscsihost::addAccount(std::string(65, 'x'), AccountRole::viewer, password, true, uri));
    for (const std::string &given :
         {std::string("seven77"), std::string(512, 'x'), std::string("with\0zero", 9), std::string("two\nlines")}) {
        EXPECT_EQ(NORV_ERR_PASSWORD, iscsihost::addAccount("bob", AccountRole::viewer, given, true, uri));
        EXPECT_EQ(NORV_ERR_PASSWORD, setAccountPassword("alice", given));
        EXPECT_EQ(std::string::npos, std::string(iscsi_host_last_error()).find(given.substr(0, 3)));
    }
    EXPECT_EQ("", uri);
    EXPECT_EQ(NORV_ERR_ACCOUNT, setAccountPassword("bob", password));
    EXPECT_EQ(NORV_ERR_ACCOUNT, removeAccount("bob"));
    std::vector<Account> accounts;
    ASSERT_EQ(0, listAccounts(accounts));
    EXPECT_EQ(1u, accounts.size());
    EXPECT_EQ(0, logIn("alice"));
}

TEST_F(SessionTest, FailedLogInsDelayTheNextOne)
{
    addAccount("alice");
    for (int wait : {0, 0, 1, 2, 4, 8, 16, 32, 60, 60}) {
        const time_t begin = time(nullptr);
        EXPECT_EQ(NORV_ERR_LOGIN, logIn("alice", "wrong", "192.0.2." + std::to_string(wait)));
        const int64_t left = delay("alice");
        EXPECT_GE(wait + 1, left);
        EXPECT_LE(wait, left + 1 + time(nullptr) - begin);
        if (wait > 4) {
            EXPECT_EQ(NORV_ERR_TRY_AGAIN, logIn("alice")) << "the password was looked at";
            EXPECT_NE(std::string::npos, std::string(iscsi_host_last_error()).find(" seconds"));
        }
        age(wait);
    }
    EXPECT_EQ(0, logIn("alice", password, "192.0.2.99"));
    EXPECT_EQ(NORV_ERR_LOGIN, logIn("alice", "wrong", "192.0.2.98"));
    EXPECT_EQ(0, delay("alice")) << "the good one forgot the bad ones";
    age(3600);
    Query rows("SELECT count(*) FROM login_failures");
    EXPECT_EQ(NORV_ERR_LOGIN, logIn("carol", "wrong", "203.0.113.1"));
    ASSERT_TRUE(rows.next());
    EXPECT_EQ(2, rows.integer(0)) << "what is older than an hour stays forever";
}

TEST_F(SessionTest, FailedLogInsToManyAccountsDelayTheAddress)
{
    addAccount("alice");
    time_t begin = 0;
    for (int i = 0; i < 16; ++i) {
        EXPECT_EQ(0, delay("alice", "2001:db8::1")) << i;
        begin = time(nullptr);
        EXPECT_EQ(NORV_ERR_LOGIN, logIn("guess" + std::to_string(i), "wrong", "2001:db8::" + std::to_string(i)));
        age(i < 9 ? 0 : i < 15 ? 32 : 0);
    }
    const int64_t left = delay("alice", "2001:db8::1");
    EXPECT_GE(65, left);
    EXPECT_LE(64, left + 1 + time(nullptr) - begin);
    EXPECT_LT(0, delay("alice", "2001:0db8:0:0:ffff::1")) << "one user has all of a /64";
    EXPECT_EQ(0, delay("alice", "2001:db8:0:1::1"));
    age(64);
    EXPECT_EQ(0, logIn("alice", password, "2001:db8::1"));
    EXPECT_EQ(NORV_ERR_LOGIN, logIn("guess", "wrong", "2001:db8::1"));
    EXPECT_LT(0, delay("alice", "2001:db8::1")) << "an account of one's own would buy more guesses";
}

TEST_F(SessionTest, OneTimeCodesAreAcceptedOnce)
{
    const std::string uri = addAccount("alice", AccountRole::admin, true);
    const size_t begin = uri.find("secret=") + 7;
    const std::string secret = uri.substr(begin, uri.find('&') - begin);
    ASSERT_EQ(32u, secret.size()) << uri;
    const auto code = [&](int steps) {
        char *key;
        size_t length;
        char digits[7];
        EXPECT_EQ(OATH_OK, oath_base32_decode(secret.data(), secret.size(), &key, &length));
        EXPECT_EQ(OATH_OK, oath_totp_generate(key, length, time(nullptr) + steps * 30L, 30, 0, 6, digits));
        free(key);
        return std::string(digits);
    };
    int n = 0;
    const auto logInWith = [&](const std::string &given) {
        age(3600);
        return logIn("alice", password, "192.0.2." + std::to_string(++n), given);
    };
    // Each holds also when a time step ends in between.
    for (const std::string &wrong : {std::string(), std::string("abcdef"), code(-2), code(3), code(0) + "0"})
        EXPECT_EQ(NORV_ERR_LOGIN, logInWith(wrong)) << wrong;
    EXPECT_EQ(NORV_ERR_LOGIN, logIn("alice", "wrong", here, code(0)));
    EXPECT_EQ(0, logInWith(code(0))) << "a wrong password used the code up";
    const std::string next = code(1);
    closeDatabase();
    EXPECT_EQ(3, inChildren(4, [&](int) { return logIn("alice", password, here, next) == 0 ? 0 : 1; }))
        << "a code that was read over a shoulder opens a session";
    EXPECT_EQ(NORV_ERR_LOGIN, logInWith(code(0))) << "an older one comes back";
}

TEST_F(SessionTest, ManyLogInAndUseTheirSessionsAtOnce)
{
    addAccount("alice");
    const std::string shared = token("alice");
    closeDatabase();
    EXPECT_EQ(0, inChildren(16, [&](int) {
                  const std::string own = token("alice");
                  for (int call = 0; call < 50; ++call)
                      if (use(own) != 0 || use(shared) != 0)
                          return 1;
                  return logout(own) == 0 ? 0 : 2;
              }));
    EXPECT_EQ(1u, countSessions());

    // A call that only asks must not wait for a writer.
    int begun[2], done[2];
    ASSERT_EQ(0, pipe(begun) | pipe(done));
    const pid_t writer = inChild([&] {
        const Transaction transaction;
        char byte;
        return transaction.error() || write(begun[1], "", 1) != 1 || read(done[0], &byte, 1) != 1;
    });
    char byte;
    ASSERT_EQ(1, read(begun[0], &byte, 1));
    const auto begin = std::chrono::steady_clock::now();
    EXPECT_EQ(0, use(shared));
    EXPECT_GT(std::chrono::seconds(25), std::chrono::steady_clock::now() - begin) << "it waited for a busy state";
    ASSERT_EQ(1, write(done[1], "", 1));
    EXPECT_EQ(0, waitForChild(writer));
    for (const int end : {begun[0], begun[1], done[0], done[1]})
        close(end);
}

TEST_F(SessionTest, GuessesAtOnceAreDelayedAsThoseInTurn)
{
    addAccount("alice");
    closeDatabase();
    const time_t begin = time(nullptr);
    const int looked_at =
        inChildren(16, [](int i) { return logIn("alice", "wrong", "192.0.2." + std::to_string(i)) == NORV_ERR_LOGIN; });
    EXPECT_LE(3, looked_at);
    EXPECT_GE(3 + (time(nullptr) - begin), looked_at);
}

struct FreeCgi {
    void operator()(NORV_CGI *cgi) const { NorvCgiFree(cgi); }
};

TEST_F(SessionTest, ProgramsHaveSessionsThatDoNotEndByThemselves)
{
    NORV_CGI *made = nullptr;
    ASSERT_EQ(0, NorvCgiInit("", &made));
    const std::unique_ptr<NORV_CGI, FreeCgi> cgi(made);
    char buffer[100];
    const NORV_CGI_IDENTITY identity{"admin"};
    EXPECT_NE(1, NorvCgiLoginNoAuth(made, buffer, sizeof buffer, identity)) << "nothing says what for";
    EXPECT_NE(1, NorvCgiSetOption(made, 99, 1u));
    EXPECT_NE(1, NorvCgiSetOption(made, NORV_CGI_AUTH_TYPE, 3u));
    EXPECT_NE(1, NorvCgiSetOption(made, NORV_CGI_HOST, "peer\r\nX: y"));
    EXPECT_EQ(1, NorvCgiSetOption(made, NORV_CGI_AUTH_TYPE, unsigned{NORV_CGI_AUTH_LOCAL}));
    EXPECT_EQ(1, NorvCgiSetOption(made, NORV_CGI_HOST, "peer.example"));
    EXPECT_EQ(1, NorvCgiSetOption(made, NORV_CGI_APP, "NORV.iSCSI"));
    EXPECT_EQ(1, NorvCgiSetOption(made, NORV_CGI_DURATION, 0xFFFFFFFFu));
    EXPECT_EQ(1, NorvCgiSetOption(made, NORV_CGI_SKIP_CHECK_IP, 1u));
    EXPECT_NE(1, NorvCgiLoginNoAuth(made, buffer, 64, identity)) << "the token needs 65 bytes";
    ASSERT_EQ(1, NorvCgiLoginNoAuth(made, buffer, sizeof buffer, identity)) << iscsi_host_last_error();
    const std::string token = buffer;

    age(10 * 365 * 24 * 3600);
    addAccount("alice");
    EXPECT_EQ(0, logIn("alice")) << "which removes what has ended";
    Session session;
    ASSERT_EQ(0, authenticate(token, "203.0.113.77", session)) << iscsi_host_last_error();
    EXPECT_EQ(AccountRole::admin, session.role);
    EXPECT_EQ("NORV.iSCSI", session.app);
    EXPECT_EQ("peer.example", session.address);
    EXPECT_EQ(0, session.expires);

    EXPECT_FALSE(NorvCgiRemoveSessionByIndex(made, 1, token.c_str()));
    EXPECT_TRUE(NorvCgiRemoveSessionByIndex(made, NORV_CGI_SESSION_ID, token.c_str()));
    EXPECT_FALSE(NorvCgiRemoveSessionByIndex(made, NORV_CGI_SESSION_ID, token.c_str()));
    EXPECT_EQ(NORV_ERR_LOGIN, use(token));

    unsigned uid = 1, gid = 1;
    EXPECT_EQ(0, NORVUserGetUGID("root", &uid, &gid));
    EXPECT_EQ(0u, uid + gid);
    EXPECT_NE(0, NORVUserGetUGID("nobody@nowhere.example", &uid, &gid));
}

} // namespace
} // namespace norvhost
