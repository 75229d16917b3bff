#include "HostTest.h"

#include "host/core/Lock.h"
#include "host/state/Database.h"
#include "platform/extent_pool.h"

#include <cstring>
#include <sys/stat.h>
#include <unistd.h>

namespace norvhost {
namespace {

struct LunTest : HostTest {
    std::string dataFile(const std::string &name) { return volume + "/@iSCSITrg/" + name; }

    uint64_t allocated(const std::string &path)
    {
        uint64_t size = 0;
        EXPECT_EQ(0, NORVExtentPoolMapFileMappedSizeGet(path.c_str(), volume.c_str(), &size));
        return size;
    }

    uint64_t fileSize(const std::string &path)
    {
        struct stat status = {};
        EXPECT_EQ(0, stat(path.c_str(), &status)) << path;
        return static_cast<uint64_t>(status.st_size);
    }

    void expectRefused(int code, _tag_iscsi_lun_ lun)
    {
        const _tag_iscsi_lun_ before = lun;
        EXPECT_EQ(code, NORViSCSILunCreate(&lun)) << lun.name << " " << lun.size << " " << iscsi_host_last_error();
        EXPECT_STRNE("", iscsi_host_last_error());
        EXPECT_EQ(nullptr, strchr(iscsi_host_last_error(), '\n'));
        EXPECT_EQ(0, memcmp(&before, &lun, sizeof lun)) << "the caller's record changed";
        EXPECT_EQ(namedFiles(), files());
    }
};

TEST_F(LunTest, EveryKindOfFileHasItsNameSizeAndAllocation)
{
    create("file", NORV_LUN_TYPE_FILE);
    create("thin", NORV_LUN_TYPE_THIN);
    create("adv", NORV_LUN_TYPE_ADV);
    create("sink", NORV_LUN_TYPE_SINK);
    create("k47", NORV_LUN_TYPE_47);
    create("k71", NORV_LUN_TYPE_71);
    create("k79", NORV_LUN_TYPE_79);

    const std::set<std::string> expected = {dataFile("iSCSI_1_file_000"),        dataFile("iSCSI_2_thin_000"),
                                            dataFile("iSCSI_3_Extent_adv_000"),  dataFile("iSCSI_4_Extent_sink_000"),
                                            dataFile("iSCSI_5_Extent_k47_000"),  dataFile("iSCSI_6_k71_00000"),
                                            dataFile("iSCSI_7_Extent_k79_00000")};
    EXPECT_EQ(expected, files());
    for (const std::string &path : files())
        EXPECT_EQ(4 * MiB, fileSize(path)) << path;
    EXPECT_GE(allocated(dataFile("iSCSI_1_file_000")), 4 * MiB);
    EXPECT_LT(allocated(dataFile("iSCSI_2_thin_000")), MiB);
    EXPECT_LT(allocated(dataFile("iSCSI_3_Extent_adv_000")), MiB);
    expectConsistent();
}

TEST_F(LunTest, BadNamesAreRefused)
{
    for (const char c : std::string("/\n\t'\"#,\\;$`|&<"))
        expectRefused(NORV_ERR_LUN_NAME, wanted(std::string("a") + c + "b"));
    for (const char *name : {"", ".", "..", "../../etc/passwd", "01234567-89ab-cdef-0123-456789ABCDEF"})
        expectRefused(NORV_ERR_LUN_NAME, wanted(name));
    for (const char *name : {"a*", "a?", "[a]", "{a}", "~a", "!a", "%d", " a", "a ", "\x7f", "\xff", "\xc3"})
        expectRefused(NORV_ERR_LUN_NAME, wanted(name));
    for (const char *name : {"\xc0\xaf", "\xed\xa0\x80", "\xf4\x90\x80\x80", "a\xe2\x80\xae", "a\xc2\xa0"})
        expectRefused(NORV_ERR_LUN_NAME, wanted(name));
    expectRefused(NORV_ERR_LUN_NAME, wanted("a\xe2\x80\x8b"));

    // What the library lets through but no file name can hold; a device has no file.
    expectRefused(NORV_ERR_LUN_NAME, wanted(std::string(255, 'n')));
    expectRefused(NORV_ERR_LUN_NAME, wanted(std::string(234, 'n'), NORV_LUN_TYPE_ADV));

    _tag_iscsi_lun_ endless = wanted("x");
    memset(endless.name, 'n', sizeof endless.name);
    expectRefused(NORV_ERR_BAD_PARAMETER, endless);
}

TEST_F(LunTest, GoodNamesAreKeptByteForByte)
{
    const std::string umlauts = "Gr\xc3\xb6\xc3\x9f"
                                "e \xe6\x97\xa5\xe6\x9c\xac \xf0\x90\x8d\x88";
    for (const std::string &name :
         {std::string("a"), std::string("vol1"), std::string("DB (old) a_b-c.d:e@f+g=h"), umlauts})
        EXPECT_STREQ(name.c_str(), reload(create(name)).name);
    // The longest whose path still fits into what the readers of map files reserve.
    const size_t room = map_file_path_size - 1 - (volume + "/@iSCSITrg/iSCSI_1024_Extent__000").size();
    create(std::string(std::min<size_t>(room, 233), 'n'), NORV_LUN_TYPE_ADV);
    expectConsistent();
}

TEST_F(LunTest, BadSizesKindsAndPlacesAreRefused)
{
    for (uint64_t size : {uint64_t(0), uint64_t(1), uint64_t(511), MiB - 512, MiB + 1, MiB + 511, uint64_t(1) << 63,
                          UINT64_MAX, UINT64_MAX - 511})
        for (int type : {NORV_LUN_TYPE_FILE, NORV_LUN_TYPE_THIN, NORV_LUN_TYPE_ADV})
            expectRefused(NORV_ERR_LUN_SIZE, wanted("x", type, size));
    // More than the volume holds, and more than a file of it can have.
    expectRefused(NORV_ERR_OUT_OF_SPACE, wanted("x", NORV_LUN_TYPE_FILE, uint64_t(1) << 50));
    expectRefused(NORV_ERR_LUN_SIZE, wanted("x", NORV_LUN_TYPE_THIN, uint64_t(INT64_MAX) - 511));

    for (int type : {0, 2, 4, 5, 8, 16, 63, -1, 1 << 30})
        expectRefused(NORV_ERR_LUN_TYPE, wanted("x", type));

    _tag_iscsi_lun_ lun = wanted("x");
    for (const std::string &place : {root, volume + "/", volume + "/../vol", volume + "/@iSCSITrg", std::string("vol"),
                                     std::string(""), std::string("/nowhere")}) {
        snprintf(lun.location, sizeof lun.location, "%s", place.c_str());
        expectRefused(NORV_ERR_LUN_LOCATION, lun);
    }
    for (const char *device : {"/nowhere", "/dev/null", "dev/loop0", "/dev/../dev/null", "/etc/passwd", "/dev"}) {
        lun.type = NORV_LUN_TYPE_BLOCK;
        snprintf(lun.location, sizeof lun.location, "%s", device);
        expectRefused(NORV_ERR_LUN_LOCATION, lun);
    }
    lun = wanted("x", NORV_LUN_TYPE_ADV);
    lun.extent_size = 1000;
    expectRefused(NORV_ERR_LUN_EXTENT_SIZE, lun);
    EXPECT_TRUE(files().empty());
}

TEST_F(LunTest, LetterCaseOfAUuidDoesNotMatter)
{
    const _tag_iscsi_lun_ lun = create("a");
    _tag_iscsi_lun_ found = {};
    std::string upper_case = lun.uuid;
    for (char &c : upper_case)
        c = static_cast<char>(toupper(c));
    EXPECT_EQ(0, NORViSCSILunConfigGetByUUID(upper_case.c_str(), &found, 0));
    EXPECT_EQ(0, memcmp(&lun, &found, sizeof lun));
}

TEST_F(LunTest, NoMoreThan1024)
{
    // Rows alone for all but one: making a thousand files tells nothing more.
    Query fill("WITH RECURSIVE ids (n) AS (SELECT 1 UNION ALL SELECT n + 1 FROM ids WHERE n < 1024) "
               "INSERT INTO luns (lid, uuid, name, type, location, size) "
               "SELECT n, 'uuid' || n, 'lun' || n, 7, ?1, 1048576 FROM ids WHERE n <> 777");
    ASSERT_EQ(0, fill.bind(volume).run());
    EXPECT_EQ(777, create("last").lid);
    _tag_iscsi_lun_ more = wanted("more");
    EXPECT_EQ(NORV_ERR_MAX_LUNS, NORViSCSILunCreate(&more));
    _tag_iscsi_lun_ *all = nullptr;
    size_t count = 0;
    EXPECT_EQ(0, NORViSCSILunConfigGetAll(&all, &count));
    EXPECT_EQ(1024u, count);
    free(all);
}

TEST_F(LunTest, ALockedOneIsNotChanged)
{
    _tag_iscsi_lun_ lun = create("a", NORV_LUN_TYPE_ADV);
    LunLock lock;
    ASSERT_EQ(0, lock.take(lun.lid, NORV_LUN_SNAPSHOTTING));
    EXPECT_EQ(NORV_ERR_LUN_LOCKED, NORViSCSILunDelete(&lun));
    EXPECT_EQ(NORV_ERR_LUN_LOCKED, update(lun, "b", lun.size));
    EXPECT_EQ(NORV_ERR_LUN_LOCKED, NORViSCSILunUnload(&lun));
}

TEST_F(LunTest, RenameAndGrow)
{
    for (int type : {NORV_LUN_TYPE_FILE, NORV_LUN_TYPE_THIN, NORV_LUN_TYPE_ADV}) {
        const _tag_iscsi_lun_ lun = create("old", type);
        struct stat before, after;
        ASSERT_EQ(0, stat(dataPath(lun).c_str(), &before));
        ASSERT_EQ(0, update(lun, "new", 6 * MiB)) << iscsi_host_last_error();
        EXPECT_EQ(NORV_ERR_LUN_SIZE, update(lun, "newer", 6 * MiB + 1));

        const _tag_iscsi_lun_ changed = reload(lun);
        EXPECT_STREQ("new", changed.name);
        EXPECT_EQ(6 * MiB, changed.size);
        ASSERT_EQ(0, stat(dataPath(changed).c_str(), &after));
        EXPECT_EQ(before.st_ino, after.st_ino) << "a running service keeps its data";
        EXPECT_EQ(6 * MiB, fileSize(dataPath(changed)));
        if (type == NORV_LUN_TYPE_FILE) {
            EXPECT_GE(allocated(dataPath(changed)), 6 * MiB);
        }
        expectConsistent();
        _tag_iscsi_lun_ gone = changed;
        EXPECT_EQ(0, NORViSCSILunDelete(&gone));
    }
}

TEST_F(LunTest, TrashMovesTheFileAndBack)
{
    const _tag_iscsi_lun_ lun = create("a", NORV_LUN_TYPE_ADV);
    _tag_iscsi_lun_ request = lun;
    request.options |= NORV_LUN_OPTION_TRASH;
    map(lun);
    EXPECT_EQ(NORV_ERR_LUN_MAPPED, NORViSCSILunUnload(&request));
    expectConsistent();
    Query("DELETE FROM mappings").run();

    ASSERT_EQ(0, NORViSCSILunUnload(&request)) << iscsi_host_last_error();
    EXPECT_EQ(0, NORViSCSILunUnload(&request)) << "again is no failure";
    EXPECT_TRUE(isInTrash(reload(lun)));
    EXPECT_EQ((std::set<std::string>{volume + "/@EP_trash/iSCSI_1_Extent_a_000"}), files());
    EXPECT_EQ("Healthy", health(lun));

    _tag_iscsi_lun_ plain = lun;
    EXPECT_EQ(NORV_ERR_LUN_NOT_LOADED, NORViSCSILunLoad(&plain));
    EXPECT_EQ(0, update(lun, "b", 8 * MiB)) << iscsi_host_last_error();
    expectConsistent();

    ASSERT_EQ(0, NORViSCSILunLoad(&request)) << iscsi_host_last_error();
    EXPECT_FALSE(isInTrash(reload(lun)));
    EXPECT_EQ((std::set<std::string>{volume + "/@iSCSITrg/iSCSI_1_Extent_b_000"}), files());
}

TEST_F(LunTest, MissingOrShortDataIsUnhealthyAndCanBeDeleted)
{
    _tag_iscsi_lun_ gone = create("gone"), cut = create("cut"), whole = create("whole");
    ASSERT_EQ(0, unlink(dataPath(gone).c_str()));
    ASSERT_EQ(0, truncate(dataPath(cut).c_str(), MiB));
    EXPECT_EQ("Unhealthy", health(gone));
    EXPECT_EQ("Unhealthy", health(cut));
    EXPECT_EQ("Healthy", health(whole));

    EXPECT_EQ(NORV_ERR_FILE_NOT_FOUND, update(gone, "gone", 8 * MiB));
    EXPECT_EQ(NORV_ERR_FILE_NOT_FOUND, NORViSCSILunLoad(&gone));
    EXPECT_EQ(0, NORViSCSILunDelete(&gone)) << iscsi_host_last_error();
    EXPECT_EQ(0, NORViSCSILunDelete(&cut)) << iscsi_host_last_error();
    expectConsistent();
}

TEST_F(LunTest, ManyCreatorsAndDeletersGetIdsOfTheirOwn)
{
    // Also the store's first opening is theirs: each child finds none.
    EXPECT_EQ(0, inChildren(8, [&](int worker) {
                  for (int i = 0; i < 8; ++i) {
                      _tag_iscsi_lun_ lun = wanted("lun-" + std::to_string(worker) + "-" + std::to_string(i));
                      if (NORViSCSILunCreate(&lun) != 0)
                          return 1;
                      if (i % 2 && NORViSCSILunDelete(&lun) != 0)
                          return 2;
                  }
                  return 0;
              }));
    EXPECT_EQ(32u, namedFiles().size());
    expectConsistent();
}

} // namespace
} // namespace norvhost
