#include "iscsiwebapi/ISCSILUNInfo.h"
#include "tests/unit/Library.h"

#include <utility>

namespace unit {
namespace {

using ISCSI::ISCSILUNInfo;

class ListLUN : public LibraryTest {
protected:
    std::vector<ISCSILUNInfo> luns{ISCSILUNInfo("old")};
};

TEST_F(ListLUN, ReplacesTheListInThePlatformsOrder)
{
    EXPECT_EQ(ISCSILUNInfo::ListLUN(luns, 62), 0);
    EXPECT_TRUE(luns.empty());

    addLUN(9, "nine").is_locked = true;
    addLUN(2, "two").health = "Unhealthy";
    EXPECT_EQ(ISCSILUNInfo::ListLUN(luns, 0), 0);
    ASSERT_EQ(luns.size(), 2u);
    EXPECT_EQ(luns[0].name, "two");
    EXPECT_EQ(luns[1].uuid, uuidOf(9));
    EXPECT_EQ(luns[1].extent_size, 65536u);
    EXPECT_FALSE(luns[1].is_action_locked);
    EXPECT_EQ(luns[1].status, "");
    EXPECT_EQ(called().back(), "NORViSCSILunConfigGetAll()") << "no live state without a filter";

    EXPECT_EQ(ISCSILUNInfo::ListLUN(luns, ISCSILUNInfo::LOAD_LOCKED | ISCSILUNInfo::LOAD_STATUS), 0);
    ASSERT_EQ(luns.size(), 2u);
    EXPECT_EQ(luns[0].status, "Unhealthy");
    EXPECT_TRUE(luns[1].is_action_locked);
}

class LUNLookup : public LibraryTest {
protected:
    LUNLookup()
    {
        addLUN(3, "vol1");
        addLUN(7, "lun#9");
        addLUN(8, "lun#2 ");
        addLUN(9, "UPPER");
        addLUN(10, "%s%n%d");
    }
};

TEST_F(LUNLookup, ByIDAndByName)
{
    std::string uuid;
    int lid = 0;
    EXPECT_EQ(ISCSILUNInfo::GetUUIDByLID(3, uuid), 0);
    EXPECT_EQ(uuid, uuidOf(3));
    EXPECT_EQ(ISCSILUNInfo::GetUUIDByLUNName("lun#9", uuid), 0);
    EXPECT_EQ(uuid, uuidOf(7));
    EXPECT_EQ(ISCSILUNInfo::GetLIDByLUNName("UPPER", lid), 0);
    EXPECT_EQ(lid, 9);
}

TEST_F(LUNLookup, SelectorsThatResolve)
{
    const std::string unknown = "FFFFFFFF-ffff-FFFF-ffff-00000000000a";
    const std::pair<std::string, std::string> cases[] = {
        {"", ""},
        {unknown, unknown}, // whether it exists shows when it is loaded
        {"lun#1", uuidOf(3)},
        {"LUN#1", uuidOf(3)},
        {"Lun#2", uuidOf(7)},
        {"lun#005", uuidOf(10)},
        {"vol1", uuidOf(3)},
        {"lun#2 ", uuidOf(8)}, // a character behind the number makes it a name
        {"UPPER", uuidOf(9)},
        {"%s%n%d", uuidOf(10)},
    };
    for (const auto &[selector, expected] : cases) {
        std::string uuid = "untouched";
        EXPECT_EQ(ISCSILUNInfo::GetLUNUUID(selector, uuid), 0) << selector;
        EXPECT_EQ(uuid, expected) << selector;
        EXPECT_EQ(called().empty(), selector == expected) << "only a UUID needs no lookup";
    }
    EXPECT_EQ(logged(), Lines());
}

TEST_F(LUNLookup, IndexesOutOfRangeNameNothing)
{
    const std::pair<const char *, const char *> cases[] = {
        {"lun#0", "0"},
        {"lun#6", "6"},
        {"lun#9", "9"}, // although a LUN bears this name
        {"lun#4294967295", nullptr},
        {"lun#4294967297", nullptr}, // 1, if it wrapped around
        {"lun#18446744073709551617", nullptr},
        {"lun#-1", nullptr},
        {"lun#-4294967295", nullptr},
        {"lun#-18446744073709551615", nullptr},
    };
    for (const auto &[selector, index] : cases) {
        std::string uuid = "untouched";
        EXPECT_EQ(ISCSILUNInfo::GetLUNUUID(selector, uuid), 18990505) << selector;
        EXPECT_EQ(uuid, "untouched");
        const Lines lines = logged();
        ASSERT_EQ(lines.size(), 1u) << selector;
        if (index)
            EXPECT_EQ(lines[0], std::string(": Index of LUN is out of range. index: ") + index + ", #LUNs: 5");
        else
            EXPECT_EQ(lines[0].find(": Index of LUN is out of range. index: "), 0u) << lines[0];
    }
}

TEST_F(LUNLookup, OtherTextsAreNamesOfNothing)
{
    const std::string uuid3 = uuidOf(3);
    const std::string cases[] = {
        "lun#",
        "lun#1x",
        "lun#x",
        "lun#1.0",
        "lun1",
        "sn#1",
        "xlun#1",
        "nothing",
        uuid3 + "0",
        uuid3 + "\n",
        uuid3.substr(0, 35),
        uuid3.substr(0, 35) + "g",
        std::string(36, 'a'),
        "../../etc/passwd",
        "two\nlines",
        "%s%s%s%n",
        std::string(200000, 'a'),
        "lun#" + std::string(200000, '1') + "x",
    };
    for (const auto &selector : cases) {
        std::string uuid = "untouched";
        EXPECT_EQ(ISCSILUNInfo::GetLUNUUID(selector, uuid), 18990505) << selector.substr(0, 60);
        EXPECT_EQ(uuid, "untouched");
        EXPECT_EQ(logged(), (Lines{"GetUUIDByLUNName: No such LUN. Name: " + selector,
                                   ": Invalid LUN UUID, name or index. input: " + selector}));
    }
}

} // namespace
} // namespace unit
