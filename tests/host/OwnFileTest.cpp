/// Files at fixed paths: section files and locks, among others who plant things there.
#include "HostTest.h"
#include "KillAt.h"

#include "host/core/OwnFile.h"
#include "platform/core.h"

#include <fstream>
#include <memory>
#include <sstream>
#include <sys/stat.h>
#include <unistd.h>

namespace norvhost {
namespace {

constexpr const char *line_format = "\t%s=%s\n";

struct OwnFileTest : HostTest {
    using Keys = std::vector<std::pair<std::string, std::string>>;
    using Hash = std::unique_ptr<NLIBC_SZ_HASH, void (*)(NLIBC_SZ_HASH *)>;

    const std::string folder = root + "/etc", path = folder + "/node.conf", lock = root + "/node.lock";

    static Hash hashOf(const Keys &keys)
    {
        Hash hash(NLIBCSzHashAlloc(16), NLIBCSzHashFree);
        for (const auto &[key, value] : keys)
            EXPECT_EQ(0, NLIBCSzHashSetValue(hash.get(), key.c_str(), value.c_str()));
        return hash;
    }
    int add(const std::string &name, const Keys &keys, const char *format = line_format)
    {
        return NLIBCFileAddSection(path.c_str(), name.c_str(), hashOf(keys).get(), format);
    }
    int set(const std::string &name, const std::string &new_name, const Keys &keys)
    {
        return NLIBCFileSetSection(path.c_str(), name.c_str(), new_name.c_str(), hashOf(keys).get(), line_format);
    }
    std::string get(const std::string &name, const std::string &key)
    {
        const Hash hash = hashOf({});
        const int found = NLIBCFileGetSection(path.c_str(), name.c_str(), hash.get());
        const char *value = NLIBCSzHashGetValue(hash.get(), key.c_str());
        return found != 1 ? "result " + std::to_string(found) : value ? value : "no key";
    }
    std::string names()
    {
        const std::unique_ptr<NLIBC_SZ_LIST, void (*)(NLIBC_SZ_LIST *)> list(NLIBCSzListAlloc(4), NLIBCSzListFree);
        const int count = NLIBCFileEnumSection(path.c_str(), list.get());
        if (count < 0)
            return "result " + std::to_string(count);
        std::string text;
        for (int i = 0; i < count; ++i)
            text += std::string(NLIBCSzListGet(list.get(), i)) + " ";
        return text;
    }
    std::string content()
    {
        std::ostringstream text;
        text << std::ifstream(path).rdbuf();
        return text.str();
    }
    void write(const std::string &text) { std::ofstream(path) << text; }
    int tryLock() { return lockWithin(0); }
    bool isHeld()
    {
        bool held = false;
        EXPECT_EQ(0, fileLockHeld(lock.c_str(), held)) << iscsi_host_last_error();
        return held;
    }
    int lockWithin(int seconds)
    {
        int fd = -1;
        const int taken = NLIBCFileLockTimeByFile(lock.c_str(), 1, seconds, &fd);
        if (taken)
            NLIBCFileUnlockByFile(fd);
        return taken;
    }
};

TEST_F(OwnFileTest, SectionsAreWrittenAsTheirReadersExpect)
{
    ASSERT_EQ(0, NLIBCFileTouch(path.c_str())) << iscsi_host_last_error();
    EXPECT_EQ(1, add("b", {{"hostname", "peer"}, {"port", "5443"}, {"empty", ""}}));
    EXPECT_EQ(1, add("a", {{"hostname", " kept = as it is "}}));
    EXPECT_EQ("[b]\n\thostname=peer\n\tport=5443\n\tempty=\n[a]\n\thostname= kept = as it is \n", content());
    EXPECT_EQ(" kept = as it is ", get("a", "hostname"));
    EXPECT_EQ("", get("b", "empty"));
    struct stat status;
    ASSERT_EQ(0, stat(path.c_str(), &status));
    EXPECT_EQ(0600u, status.st_mode & 07777) << "it holds session tokens";
}

TEST_F(OwnFileTest, NothingGetsIntoASectionFileThatWouldBeReadAsSomethingElse)
{
    ASSERT_EQ(0, NLIBCFileTouch(path.c_str()));
    ASSERT_EQ(1, add("a", {{"key", "value"}}));
    const std::string before = content();
    for (const char *name : {"", "a", "x]\n[y", "x\r"})
        EXPECT_GT(0, add(name, {{"key", "value"}})) << name;
    for (const auto &[key, value] :
         Keys{{"key", "1\n[b]"}, {"key", "1\r"}, {"k=y", "1"}, {" key", "1"}, {"[key", "1]"}, {"k\ny", "1"}})
        EXPECT_GT(0, add("b", {{key, value}})) << key << "=" << value;
    for (const char *format : {"", "%s", "%s=%s", "%s=%d\n", "%s=%s%n\n", "%s:%s\n", "%s=%s\n\n"})
        EXPECT_GT(0, add("b", {{"key", "value"}}, format)) << format;
    EXPECT_GT(0, set("missing", "b", {}));
    EXPECT_EQ(1, add("b", {}));
    EXPECT_GT(0, set("b", "a", {}));
    EXPECT_EQ(before + "[b]\n", content());
}

TEST_F(OwnFileTest, GarbageIsLeftAloneAndMeansNothing)
{
    ASSERT_EQ(0, NLIBCFileTouch(path.c_str()));
    const std::string garbage = "key=above\n\x01\x02]\n[]\n[open\n";
    write(garbage + " [a] \r\n no equals\n\tkey=1\r\n=none\n[a]\nkey=2");
    EXPECT_EQ("a a ", names());
    EXPECT_EQ("1", get("a", "key")) << "the first counts";
    ASSERT_EQ(1, add("b", {{"key", "3"}}));
    EXPECT_EQ("3", get("b", "key")) << "the line before had no end";
    ASSERT_EQ(0, NLIBCFileRemoveSection(path.c_str(), "a"));
    EXPECT_EQ(garbage + "[a]\nkey=2\n[b]\n\tkey=3\n", content());
    write(std::string(2 << 20, '\n'));
    EXPECT_EQ("result -27", names());
}

TEST_F(OwnFileTest, ChangesKilledAtEverySystemCallAreWholeOrNotMade)
{
    ASSERT_EQ(0, NLIBCFileTouch(path.c_str()));
    const std::string big(200000, 'x');
    const auto prepare = [&] { write("[a]\n\tkey=old\n[b]\n\tkey=" + big + "\n"); };
    const auto change = [&] { return set("a", "a", {{"key", "new"}}) == 1 ? 0 : 1; };
    killAtEverySystemCall(5, prepare, change, [&] {
        EXPECT_EQ("a b ", names());
        EXPECT_EQ(big, get("b", "key"));
        const std::string value = get("a", "key");
        EXPECT_TRUE(value == "old" || value == "new") << value;
        EXPECT_EQ(1, set("a", "a", {{"key", "next"}})) << iscsi_host_last_error();
        EXPECT_EQ("next", get("a", "key"));
    });
}

TEST_F(OwnFileTest, ChangesAtOnceAllLast)
{
    ASSERT_EQ(0, NLIBCFileTouch(path.c_str()));
    EXPECT_EQ(0, inChildren(8, [&](int writer) {
                  for (int i = 0; i < 10; ++i)
                      if (add(std::to_string(writer * 10 + i), {{"key", "value"}}) != 1)
                          return 1;
                  return 0;
              }));
    for (int i = 0; i < 80; ++i)
        EXPECT_EQ("value", get(std::to_string(i), "key")) << i;
}

TEST_F(OwnFileTest, PlantedThingsAreRefusedAndLeftAlone)
{
    const std::string victim = root + "/victim";
    const std::function<void(const std::string &)> plants[] = {
        [&](const std::string &place) { ASSERT_EQ(0, symlink(victim.c_str(), place.c_str())); },
        [&](const std::string &place) { ASSERT_EQ(0, symlink((root + "/nothing").c_str(), place.c_str())); },
        [&](const std::string &place) { ASSERT_EQ(0, link(victim.c_str(), place.c_str())); },
        [&](const std::string &place) { ASSERT_EQ(0, mkfifo(place.c_str(), 0600)); },
        [&](const std::string &place) { ASSERT_EQ(0, mkdir(place.c_str(), 0700)); },
    };
    ASSERT_EQ(0, NORVFSMkdirP(folder.c_str(), 0, 1, -1, -1, -1));
    for (const auto &plant : plants) {
        std::ofstream(victim) << "[a]\n\tkey=victim\n";
        for (const std::string &place : {lock, path}) {
            plant(place);
            if (place == lock)
                EXPECT_EQ(0, tryLock());
            else {
                EXPECT_GT(0, NLIBCFileTouch(path.c_str()));
                EXPECT_GT(0, add("b", {{"key", "value"}}));
                EXPECT_GT(0, set("a", "a", {{"key", "value"}}));
                EXPECT_GT(0, NLIBCFileRemoveSection(path.c_str(), "a"));
                EXPECT_NE("victim", get("a", "key"));
            }
            EXPECT_FALSE(exists(root + "/nothing"));
            ASSERT_EQ(0, ::remove(place.c_str()));
        }
        std::ostringstream left;
        left << std::ifstream(victim).rdbuf();
        EXPECT_EQ("[a]\n\tkey=victim\n", left.str());
        ASSERT_EQ(0, unlink(victim.c_str()));
    }
}

TEST_F(OwnFileTest, FoldersThatOthersCouldChangeAreRefused)
{
    const auto make = [](const std::string &place) { return NORVFSMkdirP(place.c_str(), 0, 1, -1, -1, -1); };
    EXPECT_EQ(0, make(root + "/a/b/"));
    EXPECT_EQ(0, make(root + "/a/b"));
    EXPECT_GT(0, make("a/b"));
    EXPECT_GT(0, make(""));
    std::ofstream(root + "/file") << "";
    EXPECT_GT(0, make(root + "/file"));
    EXPECT_GT(0, make(root + "/file/b"));

    const std::string linked = root + "/linked", open = root + "/open";
    ASSERT_EQ(0, symlink((root + "/a").c_str(), linked.c_str()));
    EXPECT_GT(0, make(linked));
    ASSERT_EQ(0, mkdir(open.c_str(), 0700));
    ASSERT_EQ(0, chmod(open.c_str(), 0777));
    EXPECT_GT(0, make(open));
    int fd = -1;
    for (const std::string &place : {linked + "/lock", open + "/lock", root + "/missing/lock", root + "/a/"})
        EXPECT_EQ(0, NLIBCFileLockByFile(place.c_str(), 1, &fd)) << place;
    EXPECT_EQ(-1, fd);
    EXPECT_FALSE(exists(root + "/a/lock"));
    ASSERT_EQ(0, chmod(open.c_str(), 01777)); // as /tmp is
    EXPECT_EQ(1, NLIBCFileLockByFile((open + "/lock").c_str(), 1, &fd)) << iscsi_host_last_error();
    EXPECT_EQ(1, NLIBCFileUnlockByFile(fd));
    EXPECT_EQ(0, NLIBCFileUnlockByFile(fd));
}

TEST_F(OwnFileTest, AnotherUsersFilesAreRefusedNeedsRoot)
{
    NEED_ROOT();
    std::ofstream(lock) << "";
    ASSERT_EQ(0, chown(lock.c_str(), 1000, 1000));
    EXPECT_EQ(0, tryLock());
    ASSERT_EQ(0, NLIBCFileTouch(path.c_str()));
    ASSERT_EQ(0, chown(path.c_str(), 1000, 1000));
    EXPECT_EQ("result -1", names());
    ASSERT_EQ(0, chown(folder.c_str(), 1000, 1000));
    EXPECT_GT(0, NORVFSMkdirP(folder.c_str(), 0, 1, -1, -1, -1));
}

TEST_F(OwnFileTest, ALockBelongsToAllWhoInheritedItUntilOneReleasesIt)
{
    int fd = -1;
    EXPECT_FALSE(isHeld()) << "there is no file yet";
    ASSERT_EQ(1, NLIBCFileLockByFile(lock.c_str(), 1, &fd)) << iscsi_host_last_error();
    EXPECT_EQ(0, tryLock()) << "another opening of the file";

    int go[2];
    ASSERT_EQ(0, pipe(go));
    const pid_t worker = inChild([&] {
        char byte;
        return read(go[0], &byte, 1) == 1 ? !NLIBCFileUnlockByFile(fd) : 2;
    });
    close(fd); // as a caller's end does
    EXPECT_EQ(0, tryLock()) << "the worker has it";
    EXPECT_TRUE(isHeld());
    const pid_t waiter = inChild([&] { return lockWithin(60) == 1 ? 0 : 1; });
    ASSERT_EQ(1, ::write(go[1], "", 1));
    EXPECT_EQ(0, waitForChild(worker));
    EXPECT_EQ(0, waitForChild(waiter));

    const pid_t killed = inChild([&] {
        int taken;
        if (NLIBCFileLockByFile(lock.c_str(), 1, &taken))
            raise(SIGKILL);
        return 1;
    });
    EXPECT_EQ(128 + SIGKILL, waitForChild(killed));
    EXPECT_FALSE(isHeld());
    EXPECT_EQ(1, tryLock());
    close(go[0]);
    close(go[1]);
}

} // namespace
} // namespace norvhost
