#include "HostTest.h"

#include "host/core/Process.h"

#include <fstream>
#include <json/json.h>

namespace norvhost {
namespace {

struct ToolTest : HostTest {
    ProgramResult run(std::vector<std::string> arguments)
    {
        ProgramRun program;
        program.arguments = std::move(arguments);
        program.arguments.insert(program.arguments.begin(), ISCSI_HOST_TOOL);
        ProgramResult result;
        EXPECT_EQ(0, runProgram(program, result)) << iscsi_host_last_error();
        return result;
    }

    Json::Value json(std::vector<std::string> arguments)
    {
        const ProgramResult result = run(std::move(arguments));
        EXPECT_EQ(0, result.status) << result.errors;
        Json::Value value;
        std::string errors;
        const std::unique_ptr<Json::CharReader> reader(Json::CharReaderBuilder().newCharReader());
        const char *begin = result.output.data();
        EXPECT_TRUE(reader->parse(begin, begin + result.output.size(), &value, &errors)) << errors;
        return value;
    }
};

TEST_F(ToolTest, ShowsVolumesAndStatusForPrograms)
{
    create("a");
    const _tag_iscsi_lun_ gone = create("gone");
    ASSERT_EQ(0, unlink(dataPath(gone).c_str()));
    const Json::Value volumes = json({"volume", "list", "--json"});
    ASSERT_EQ(1u, volumes.size());
    EXPECT_EQ(volume, volumes[0]["path"].asString());
    EXPECT_EQ(2, volumes[0]["luns"].asInt());

    EXPECT_EQ(0, run({"portal", "set", "127.0.0.1", "::1"}).status);
    const Json::Value status = json({"status", "--json"});
    EXPECT_FALSE(status["service_alive"].asBool());
    EXPECT_EQ("127.0.0.1 ::1", status["portal"].asString());
    ASSERT_EQ(1u, status["unhealthy"].size());
    EXPECT_EQ("gone", status["unhealthy"][0]["name"].asString());
}

TEST_F(ToolTest, KeepsAccountsAndTakesNoPasswordFromTheCommandLine)
{
    const std::string secret = "a good password", file = root + "/password";
    std::ofstream(file) << secret << "\nanother line\n";
    const ProgramResult added = run({"account", "add", "alice", "--role", "admin", "--otp", "--password-file", file});
    EXPECT_EQ(0, added.status) << added.errors;
    EXPECT_EQ(0u, added.output.find("otpauth://totp/"));
    EXPECT_EQ(std::string::npos, (added.output + added.errors).find(secret));
    EXPECT_EQ(0, run({"account", "add", "bob", "--password-file", file}).status);
    EXPECT_EQ(1, run({"account", "add", "bob", "--password-file", file}).status);
    EXPECT_EQ(1, run({"account", "add", "carol", "--password-file", root + "/missing"}).status);
    EXPECT_EQ(2, run({"account", "add", "carol", secret}).status);
    EXPECT_EQ(2, run({"account", "add", "carol", "--role", "boss", "--password-file", file}).status);
    EXPECT_EQ(0, run({"account", "passwd", "bob", "--password-file", file}).status);

    const Json::Value accounts = json({"account", "list", "--json"});
    ASSERT_EQ(2u, accounts.size());
    EXPECT_EQ("admin", accounts[0]["role"].asString());
    EXPECT_TRUE(accounts[0]["one_time_codes"].asBool());
    EXPECT_EQ("viewer", accounts[1]["role"].asString());
    EXPECT_FALSE(accounts[1]["one_time_codes"].asBool());
    EXPECT_EQ(0u, json({"session", "list", "--json"}).size());
    EXPECT_EQ(0, run({"account", "remove", "bob"}).status);
    EXPECT_EQ(1, run({"account", "remove", "bob"}).status);
}

TEST_F(ToolTest, TellsFailureFromWrongUsage)
{
    create("a");
    for (const std::vector<std::string> &arguments :
         std::vector<std::vector<std::string>>{{"volume", "add", root + "/nothing"},
                                               {"volume", "remove", volume},
                                               {"volume", "create", root + "/small", "--size", "10M"},
                                               {"portal", "set", "nowhere"}}) {
        const ProgramResult result = run(arguments);
        EXPECT_EQ(1, result.status);
        EXPECT_EQ("", result.output);
        EXPECT_NE(std::string::npos, result.errors.find("failed: error 1899")) << result.errors;
    }
    for (const std::vector<std::string> &arguments :
         std::vector<std::vector<std::string>>{{},
                                               {"volume"},
                                               {"volume", "add"},
                                               {"portal", "set"},
                                               {"boot", "now"},
                                               {"volume", "create", root + "/v", "--size", "big"},
                                               {"volume", "create", root + "/v"}})
        EXPECT_EQ(2, run(arguments).status);
    EXPECT_FALSE(exists(root + "/v"));
    EXPECT_EQ(0, run({"--help"}).status);
}

} // namespace
} // namespace norvhost
