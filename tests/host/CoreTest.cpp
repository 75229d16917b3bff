/// The small helpers that the platform gives its callers: key-value files and lists of texts.
#include "platform/core.h"

#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <gtest/gtest.h>
#include <sys/stat.h>

namespace {

struct KeyValueFileTest : testing::Test {
    KeyValueFileTest()
    {
        char name[] = "/tmp/host-tests-XXXXXX";
        folder = mkdtemp(name);
        path = folder + "/file.conf";
    }
    ~KeyValueFileTest() override { std::filesystem::remove_all(folder); }

    void write(const std::string &text) { std::ofstream(path) << text; }

    std::string get(const char *key)
    {
        char value[32];
        const int found = NLIBCFileGetKeyValue(path.c_str(), key, value, sizeof value);
        return found == 1 ? value : "result " + std::to_string(found);
    }

    std::string folder, path;
};

TEST_F(KeyValueFileTest, Values)
{
    write("# comment=1\n"
          "plain=1\n"
          "  spaced key\t=\t two words \n"
          "double=\" kept \"\r\n"
          "single='it=s'\n"
          "empty=\n"
          "quote=\"\n"
          "half=\"open\n"
          "plain=2\n"
          "no equals sign\n"
          "=no key\n"
          "#hidden=1\n"
          "last=no newline");
    const struct {
        const char *key, *value;
    } cases[] = {
        {"plain", "1"},          {"spaced key", "two words"},
        {"double", " kept "},    {"single", "it=s"},
        {"empty", ""},           {"quote", "\""},
        {"half", "\"open"},      {"last", "no newline"},
        {"Plain", "result 0"},   {"hidden", "result 0"},
        {"comment", "result 0"}, {"no equals sign", "result 0"},
    };
    for (const auto &c : cases)
        EXPECT_EQ(c.value, get(c.key)) << c.key;
}

TEST_F(KeyValueFileTest, WhatCannotBeRead)
{
    EXPECT_EQ("result -2", get("key")) << "no such file";
    EXPECT_EQ(-EINVAL, NLIBCFileGetKeyValue(path.c_str(), "key", nullptr, 4));
    EXPECT_EQ("result -22", get(""));
    write("key=" + std::string(31, 'x') + "\nlong=" + std::string(32, 'x') + "\n");
    EXPECT_EQ(std::string(31, 'x'), get("key"));
    EXPECT_EQ("result -34", get("long")) << "a value that is cut would be another one";
    write(std::string(2 << 20, '\n'));
    EXPECT_EQ("result -27", get("key"));
    path = folder;
    EXPECT_EQ("result -21", get("key"));
    path = folder + "/pipe";
    ASSERT_EQ(0, mkfifo(path.c_str(), 0600));
    EXPECT_EQ("result -22", get("key")) << "a pipe is not waited for";
}

TEST_F(KeyValueFileTest, Comparing)
{
    const auto check = [this](const char *key, const char *value, int case_sensitive) {
        return NLIBCFileCheckKeyValue(path.c_str(), key, value, case_sensitive);
    };
    EXPECT_GT(0, check("key", "yes", 0));
    EXPECT_EQ(0, NLIBCFileExist(path.c_str()));
    write("key=\"Yes\"\n");
    EXPECT_EQ(1, NLIBCFileExist(path.c_str()));
    EXPECT_EQ(1, check("key", "yes", 0));
    EXPECT_EQ(0, check("key", "yes", 1));
    EXPECT_EQ(1, check("key", "Yes", 1));
    EXPECT_EQ(0, check("key", "ye", 0));
    EXPECT_EQ(0, check("other", "yes", 0));
}

TEST(StringListTest, GrowsBeyondItsCapacityAndOwnsItsTexts)
{
    for (const int capacity : {0, 2}) {
        NLIBC_SZ_LIST *list = NLIBCSzListAlloc(capacity);
        ASSERT_NE(nullptr, list);
        for (int i = 1; i <= 1000; ++i) {
            std::string text = std::to_string(i);
            EXPECT_EQ(i, NLIBCSzListPush(list, text.c_str()));
            text.assign(text.size(), '-');
        }
        EXPECT_EQ(1000, list->count);
        EXPECT_STREQ("1", NLIBCSzListGet(list, 0));
        EXPECT_STREQ("1000", NLIBCSzListGet(list, 999));
        EXPECT_EQ(nullptr, NLIBCSzListGet(list, 1000));
        EXPECT_EQ(nullptr, NLIBCSzListGet(list, -1));
        EXPECT_GT(0, NLIBCSzListPush(list, nullptr));
        NLIBCSzListFree(list);
    }
    EXPECT_EQ(nullptr, NLIBCSzListAlloc(-1));
    NLIBCSzListFree(nullptr);
}

} // namespace
