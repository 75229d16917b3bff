/// Who this appliance is, and what it says of its own state.
#include "HostTest.h"

#include "host/core/BootMark.h"
#include "host/services/Identity.h"
#include "host/state/Database.h"
#include "platform/extent_pool.h"
#include "platform/system.h"

#include <cstring>
#include <filesystem>
#include <fstream>

namespace norvhost {
namespace {

using IdentityTest = HostTest;

TEST_F(IdentityTest, IsMadeOnceByWhoeverComesFirst)
{
    std::string id;
    EXPECT_EQ(0, localNodeId(id));
    EXPECT_EQ("", id);
    char key[64] = {};
    EXPECT_NE(0, NORVExtentPoolRODKeyGet(key, sizeof key));
    EXPECT_EQ(0, NORVCheckModule("iscsi_rodsp"));

    closeDatabase();
    EXPECT_EQ(0, inChildren(8, [&](int i) {
                  std::string made, rod_key;
                  if (iscsihost::init(made) || localRodKey(rod_key))
                      return 1;
                  std::ofstream(root + "/made-" + std::to_string(i)) << made << rod_key;
                  return 0;
              }));
    ASSERT_EQ(0, iscsihost::init(id));
    ASSERT_EQ(0, NORVExtentPoolRODKeyGet(key, sizeof key)) << iscsi_host_last_error();
    EXPECT_EQ(36u, id.size());
    EXPECT_EQ(43u, strlen(key));
    EXPECT_NE(0, NORVExtentPoolRODKeyGet(key, 43));
    for (int i = 0; i < 8; ++i) {
        std::string made;
        std::getline(std::ifstream(root + "/made-" + std::to_string(i)), made);
        EXPECT_EQ(id + key, made);
    }
}

TEST_F(IdentityTest, WithoutTheServiceItSaysSo)
{
    ASSERT_EQ(0, makeIdentity());
    for (const char *module : {"iscsi_target_mod", "target_core_mod", "configfs", "no_such_module"})
        EXPECT_EQ(0, NORVCheckModule(module)) << module;
    EXPECT_NE(NORV_BOOT_DONE, NORVSystemGetBootStep());
    std::filesystem::create_directory(root + "/run");
    ASSERT_EQ(0, markBooted());
    EXPECT_EQ(NORV_BOOT_DONE, NORVSystemGetBootStep());
    std::ofstream(root + "/run/booted") << "11111111-2222-3333-4444-555555555555\n";
    EXPECT_NE(NORV_BOOT_DONE, NORVSystemGetBootStep()) << "the mark is of another boot of the machine";
}

} // namespace
} // namespace norvhost
