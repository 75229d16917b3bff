// Section files, hashes and file locks.
#include "platform/core.h"
#include "tests/contract/Platform.h"

#include <gtest/gtest.h>

#include <memory>
#include <string>
#include <utility>
#include <vector>

#include <sys/wait.h>
#include <unistd.h>

namespace contract {
namespace {

using Keys = std::vector<std::pair<std::string, std::string>>;
using Hash = std::unique_ptr<NLIBC_SZ_HASH, decltype(&NLIBCSzHashFree)>;

class FileContract : public testing::Test, protected Platform {
protected:
    const std::string path = folder + "/node.conf", lock = folder + "/node.lock";

    static Hash hashOf(const Keys &keys)
    {
        Hash hash(NLIBCSzHashAlloc(16), NLIBCSzHashFree);
        for (const auto &[key, value] : keys)
            EXPECT_GE(NLIBCSzHashSetValue(hash.get(), key.c_str(), value.c_str()), 0);
        return hash;
    }

    bool add(const std::string &section, const Keys &keys) const
    {
        return NLIBCFileAddSection(path.c_str(), section.c_str(), hashOf(keys).get(), "\t%s=%s\n") > 0;
    }

    bool replace(const std::string &section, const std::string &new_name, const Keys &keys) const
    {
        return NLIBCFileSetSection(path.c_str(), section.c_str(), new_name.c_str(), hashOf(keys).get(), "\t%s=%s\n") >
               0;
    }

    std::string read(const std::string &section, const std::string &key) const
    {
        const Hash hash = hashOf({});
        const int found = NLIBCFileGetSection(path.c_str(), section.c_str(), hash.get());
        const char *value = NLIBCSzHashGetValue(hash.get(), key.c_str());
        return found < 1 ? (found < 0 ? "failure" : "no section") : value ? value : "no key";
    }

    std::string names() const
    {
        const std::unique_ptr<NLIBC_SZ_LIST, decltype(&NLIBCSzListFree)> list(NLIBCSzListAlloc(8), NLIBCSzListFree);
        EXPECT_EQ(NLIBCFileEnumSection(path.c_str(), list.get()), list->count);
        std::string text;
        for (int i = 0; i < list->count; ++i)
            text.append(NLIBCSzListGet(list.get(), i)).append(" ");
        return text;
    }
};

TEST_F(FileContract, SectionsAreAddedReplacedAndRemoved)
{
    EXPECT_EQ(NLIBCFileExist(path.c_str()), 0);
    EXPECT_EQ(read("b", "key"), "failure") << "no file";
    EXPECT_FALSE(add("b", {}));
    EXPECT_GE(NLIBCFileTouch(path.c_str()), 0);
    EXPECT_EQ(NLIBCFileExist(path.c_str()), 1);
    EXPECT_EQ(names(), "");
    EXPECT_TRUE(add("b", {{"key", "1"}, {"empty", ""}, {"key", "2"}}));
    EXPECT_TRUE(add("a", {{"key", "has = and spaces"}}));
    EXPECT_FALSE(add("a", {{"key", "again"}}));
    EXPECT_FALSE(add("c", {{"key", "two\n[lines]"}}));
    EXPECT_FALSE(add("", {}));
    EXPECT_GE(NLIBCFileTouch(path.c_str()), 0);
    EXPECT_EQ(names(), "b a ");
    EXPECT_EQ(read("b", "key") + read("b", "empty") + read("a", "key"), "2has = and spaces");
    EXPECT_EQ(read("a", "other") + ", " + read("c", "key"), "no key, no section");
    EXPECT_TRUE(replace("b", "c", {{"other", "3"}}));
    EXPECT_FALSE(replace("b", "d", {}));
    EXPECT_FALSE(replace("c", "a", {}));
    EXPECT_EQ(names() + read("c", "other") + read("c", "key"), "c a 3no key");
    for (int time = 0; time < 2; ++time)
        EXPECT_GE(NLIBCFileRemoveSection(path.c_str(), "c"), 0);
    EXPECT_EQ(names(), "a ");
}

TEST_F(FileContract, ALockIsHeldByOneAndInheritedByChildren)
{
    int fd = -1, other = -1;
    ASSERT_NE(NLIBCFileLockByFile(lock.c_str(), 1, &fd), 0);
    EXPECT_EQ(NLIBCFileLockByFile(lock.c_str(), 1, &other), 0);
    EXPECT_EQ(NLIBCFileLockTimeByFile(lock.c_str(), 1, 0, &other), 0);
    const pid_t child = fork();
    if (child == 0)
        _exit(NLIBCFileUnlockByFile(fd) == 0);
    int status = -1;
    EXPECT_EQ(waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
    EXPECT_EQ(NLIBCFileLockTimeByFile(lock.c_str(), 1, 1, &other), 1) << "a child unlocks for its parent too";
    EXPECT_NE(NLIBCFileUnlockByFile(other), 0);
    EXPECT_EQ(NLIBCFileUnlockByFile(-1), 0);
    close(fd);
}

} // namespace
} // namespace contract
