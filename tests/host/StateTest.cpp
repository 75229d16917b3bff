#include "HostTest.h"

#include "host/state/Database.h"
#include "host/state/Schema.h"
#include "iscsihost/read_view.h"

#include <filesystem>
#include <fstream>
#include <sqlite3.h>
#include <sys/stat.h>
#include <thread>
#include <unistd.h>

namespace norvhost {
namespace {

struct StateTest : HostTest {
    std::string path() { return root + "/state/state.db"; }

    std::string setting(const char *key)
    {
        std::string value;
        EXPECT_EQ(0, getSetting(key, "none", value)) << iscsi_host_last_error();
        return value;
    }
};

TEST_F(StateTest, IsPrivateAndSurvivesReopening)
{
    struct stat status;
    ASSERT_EQ(0, stat((root + "/state").c_str(), &status));
    EXPECT_EQ(0700u, status.st_mode & 0777);
    for (const auto &entry : std::filesystem::directory_iterator(root + "/state")) {
        ASSERT_EQ(0, stat(entry.path().c_str(), &status));
        EXPECT_EQ(0600u, status.st_mode & 0777) << entry.path();
    }
    ASSERT_EQ(0, setSetting("key", "value 'quoted' \xc3\xb6"));
    closeDatabase();
    EXPECT_EQ("value 'quoted' \xc3\xb6", setting("key"));
    Query version("PRAGMA user_version");
    ASSERT_TRUE(version.next());
    EXPECT_EQ(schemaVersion(), version.integer(0));
}

TEST_F(StateTest, NewerOrForeignStateIsRefusedAndLeftAlone)
{
    {
        Query newer("PRAGMA user_version = 9999");
        ASSERT_EQ(0, newer.run());
    }
    closeDatabase();
    std::string value;
    EXPECT_EQ(NORV_ERR_GET_CONFIG, getSetting("key", "", value));
    EXPECT_NE(nullptr, strstr(iscsi_host_last_error(), "newer"));

    std::filesystem::remove_all(root + "/state");
    std::filesystem::create_directory(root + "/state");
    std::ofstream(path()) << "this is no database, whatever its name says; it is long enough to have a header........."
                             "........................................................................................";
    EXPECT_EQ(NORV_ERR_GET_CONFIG, getSetting("key", "", value)) << iscsi_host_last_error();
}

TEST_F(StateTest, UncommittedChangesAreUndone)
{
    {
        Transaction transaction;
        ASSERT_EQ(0, transaction.error());
        ASSERT_EQ(0, setSetting("key", "value"));
    }
    EXPECT_EQ("none", setting("key"));
    {
        Transaction transaction;
        ASSERT_EQ(0, setSetting("key", "value"));
        ASSERT_EQ(0, transaction.commit());
    }
    EXPECT_EQ("value", setting("key"));
}

TEST_F(StateTest, ParentAndChildUseItAfterAFork)
{
    ASSERT_EQ(0, setSetting("key", "parent"));
    EXPECT_EQ(0, waitForChild(inChild([] { return setSetting("key", "child"); })));
    EXPECT_EQ("child", setting("key"));
    ASSERT_EQ(0, setSetting("key", "parent"));
}

TEST_F(StateTest, ManyProcessesOpenAndWriteAtOnce)
{
    closeDatabase();
    std::filesystem::remove_all(root + "/state");
    EXPECT_EQ(0, inChildren(12, [](int writer) {
                  for (int i = 0; i < 10; ++i) {
                      Transaction transaction;
                      std::string value;
                      if (transaction.error() || getSetting("sum", "0", value) ||
                          setSetting("sum", std::to_string(std::stoi(value) + 1)) || transaction.commit())
                          return 1;
                      if (i == writer % 10)
                          closeDatabase();
                  }
                  return 0;
              }));
    EXPECT_EQ("120", setting("sum"));
}

TEST_F(StateTest, AViewShowsOneMoment)
{
    const auto setElsewhere = [](const char *value) {
        std::thread([=] { EXPECT_EQ(0, setSetting("key", value)); }).join();
    };
    setElsewhere("1");
    {
        const iscsihost::ReadView view;
        EXPECT_EQ("1", setting("key"));
        setElsewhere("2");
        EXPECT_EQ("1", setting("key"));
    }
    EXPECT_EQ("2", setting("key"));
}

TEST_F(StateTest, CommittedIsThereAfterKill)
{
    for (int i = 0; i < 20; ++i) {
        const pid_t child = inChild([i] {
            if (setSetting("key", std::to_string(i)) == 0)
                kill(getpid(), SIGKILL);
            return 1;
        });
        EXPECT_EQ(128 + SIGKILL, waitForChild(child));
        EXPECT_EQ(std::to_string(i), setting("key"));
        closeDatabase();
    }
}

TEST_F(StateTest, StateThatCannotBeMadeIsAClearError)
{
    closeDatabase();
    setenv("ISCSI_HOST_STATE", "/dev/null/state", 1);
    std::string value;
    EXPECT_EQ(NORV_ERR_MAKE_DIRECTORY, getSetting("key", "", value));
    EXPECT_NE(nullptr, strstr(iscsi_host_last_error(), "/dev/null/state"));
    _tag_iscsi_lun_ lun = wanted("a");
    EXPECT_EQ(NORV_ERR_MAKE_DIRECTORY, NORViSCSILunCreate(&lun));
    EXPECT_TRUE(files().empty());
}

} // namespace
} // namespace norvhost
