#include "SnapshotTest.h"

#include "host/core/Lock.h"
#include "host/state/Database.h"
#include "host/storage/SnapshotStore.h"
#include "host/storage/Versions.h"
#include "host/storage/Volumes.h"
#include "platform/core.h"
#include "platform/extent_pool.h"

#include <chrono>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <poll.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace norvhost {

void SnapshotTest::SetUp()
{
    NEED_ROOT();
    // In memory: a killed process, unlike a power cut, does not ask what the disk has.
    char name[] = "/dev/shm/host-tests-XXXXXX";
    memory = mkdtemp(name);
    closeDatabase();
    setenv("ISCSI_HOST_STATE", (memory + "/state").c_str(), 1);
    EXPECT_EQ(0, iscsihost::addVolume(volume)) << iscsi_host_last_error();
    volume = root + "/xfs";
    ASSERT_EQ(0, iscsihost::createVolume(volume, 300 * MiB, "")) << iscsi_host_last_error();
}

void SnapshotTest::TearDown()
{
    VolumeRow row;
    if (loadVolume(root + "/xfs", row) == 0 && checkMounted(row) == 0)
        run({"umount", root + "/xfs"});
    closeDatabase();
    std::filesystem::remove_all(memory);
}

_tag_iscsi_lun_ SnapshotTest::filled(const std::string &name, int seed, uint64_t size, uint64_t distance)
{
    const _tag_iscsi_lun_ lun = create(name, NORV_LUN_TYPE_ADV, size);
    writeData(dataPath(lun), seed, size, distance);
    return lun;
}

_tag_iscsi_snapshot_ SnapshotTest::take(const _tag_iscsi_lun_ &lun, const std::string &name)
{
    _tag_iscsi_snapshot_ snapshot = {};
    snprintf(snapshot.name, sizeof snapshot.name, "%s", name.c_str());
    snprintf(snapshot.taken_by, sizeof snapshot.taken_by, "test");
    EXPECT_EQ(0, NORViSCSISnapshotCreate(&lun, &snapshot)) << iscsi_host_last_error();
    return snapshot;
}

int SnapshotTest::tryTake(const _tag_iscsi_lun_ &lun, const std::string &name)
{
    _tag_iscsi_snapshot_ snapshot = {};
    snprintf(snapshot.name, sizeof snapshot.name, "%s", name.c_str());
    return NORViSCSISnapshotCreate(&lun, &snapshot);
}

_tag_iscsi_snapshot_ SnapshotTest::reload(const _tag_iscsi_snapshot_ &snapshot)
{
    _tag_iscsi_snapshot_ loaded = {};
    EXPECT_EQ(0, NORViSCSISnapshotConfGetByUUID(snapshot.uuid, &loaded)) << iscsi_host_last_error();
    return loaded;
}

std::vector<_tag_iscsi_snapshot_> SnapshotTest::list(int lid)
{
    _tag_iscsi_snapshot_query_ query = {};
    query.query_flags = lid ? NORV_SNAPSHOT_QUERY_LID : 0;
    query.query_lid = lid;
    _tag_iscsi_snapshot_list_ found = {};
    EXPECT_EQ(0, NORViSCSISnapshotConfLoad(&query, &found)) << iscsi_host_last_error();
    std::vector<_tag_iscsi_snapshot_> snapshots;
    for (_tag_iscsi_snapshot_ *snapshot = found.first, *previous = nullptr, *next; snapshot; snapshot = next) {
        EXPECT_EQ(previous, snapshot->previous);
        EXPECT_EQ(snapshot->next == nullptr, snapshot == found.last);
        previous = snapshot;
        snapshots.push_back(*snapshot);
        next = snapshot->next;
    }
    for (_tag_iscsi_snapshot_ *snapshot = found.first, *next; snapshot; snapshot = next) {
        next = snapshot->next;
        free(snapshot);
    }
    EXPECT_EQ(static_cast<size_t>(found.count), snapshots.size());
    return snapshots;
}

int SnapshotTest::cloneSnapshot(const _tag_iscsi_snapshot_ &snapshot, const std::string &name, _tag_iscsi_lun_ &clone)
{
    EXPECT_EQ(0, NORViSCSILunGetByLunId(snapshot.lid, &clone));
    setName(clone, name);
    return NORViSCSISnapshotClone(&snapshot, &clone);
}

int SnapshotTest::cloneLun(const _tag_iscsi_lun_ &source, const std::string &name, _tag_iscsi_lun_ &clone)
{
    clone = source;
    setName(clone, name);
    return NORViSCSILunClone(&source, &clone);
}

std::set<std::string> SnapshotTest::snapshotFolders()
{
    std::set<std::string> found;
    for (const char *folder : {snapshot_folder, trash_folder})
        if (exists(volume + "/" + folder))
            for (const auto &entry : std::filesystem::directory_iterator(volume + "/" + folder))
                if (entry.is_directory())
                    found.insert(entry.path());
    return found;
}

std::set<std::string> SnapshotTest::namedSnapshotFolders()
{
    std::set<std::string> named;
    for (const _tag_iscsi_snapshot_ &snapshot : list())
        named.insert(snapshotFolder(snapshot));
    return named;
}

void SnapshotTest::expectConsistent()
{
    HostTest::expectConsistent();
    EXPECT_EQ(namedSnapshotFolders(), snapshotFolders());
    for (const _tag_iscsi_snapshot_ &snapshot : list()) {
        EXPECT_STREQ("Healthy", snapshot.status);
        bool locked = true;
        EXPECT_EQ(0, NORViSCSIIsSnapshotLocked(&snapshot, &locked));
        EXPECT_FALSE(locked) << snapshot.name;
    }
}

void write(const std::string &path, off_t at, const std::string &text)
{
    const int fd = open(path.c_str(), O_WRONLY | O_CLOEXEC);
    EXPECT_EQ(static_cast<ssize_t>(text.size()), pwrite(fd, text.data(), text.size(), at)) << path;
    close(fd);
}

void writeData(const std::string &path, int seed, uint64_t size, uint64_t distance)
{
    for (uint64_t at = 0; at < size; at += distance) {
        std::string block = std::to_string(seed) + " " + std::to_string(at) + " ";
        block.resize(std::min<uint64_t>(4096, size - at), static_cast<char>(seed));
        write(path, static_cast<off_t>(at), block);
    }
}

std::string read(const std::string &path, off_t at, size_t length)
{
    std::string text(length, '\0');
    const int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
    const ssize_t count = pread(fd, text.data(), length, at);
    close(fd);
    text.resize(count < 0 ? 0 : static_cast<size_t>(count));
    return text;
}

size_t digest(const std::string &path)
{
    struct stat status = {};
    EXPECT_EQ(0, stat(path.c_str(), &status)) << path;
    return std::hash<std::string>()(read(path, 0, static_cast<size_t>(status.st_size)));
}

namespace {

uint64_t inodeOf(const std::string &path)
{
    struct stat status = {};
    EXPECT_EQ(0, stat(path.c_str(), &status)) << path;
    return status.st_ino;
}

TEST_F(SnapshotTest, HoldsThePointInTimeAndRestoresIntoTheSameFile)
{
    const _tag_iscsi_lun_ lun = filled("a", 1);
    const std::string path = dataPath(lun);
    const size_t first = digest(path);
    const uint64_t inode = inodeOf(path);

    _tag_iscsi_snapshot_ snapshot = {};
    snprintf(snapshot.name, sizeof snapshot.name, "daily");
    snapshot.flags = NORV_SNAPSHOT_SCHEDULED | NORV_SNAPSHOT_TRASH;
    const time_t begin = time(nullptr);
    ASSERT_EQ(0, NORViSCSISnapshotCreate(&lun, &snapshot)) << iscsi_host_last_error();
    _tag_iscsi_snapshot_ upper = snapshot;
    for (char &c : upper.uuid)
        c = static_cast<char>(toupper(c));
    const _tag_iscsi_snapshot_ stored = reload(upper);
    EXPECT_LE(begin, stored.create_time);
    EXPECT_GE(time(nullptr), stored.create_time);
    EXPECT_EQ(static_cast<uint32_t>(NORV_SNAPSHOT_SCHEDULED), stored.flags) << "a new one is not in the trash";
    EXPECT_LE(64u * 4096, stored.mapped_size);
    EXPECT_GE(66u * 4096, stored.mapped_size) << "more than the data and the list of its extents";
    EXPECT_EQ(volume + "/@Snapshot/SNAPSHOT_L1_S1_daily", snapshotFolder(stored));

    writeData(path, 2, lun.size);
    const size_t second = digest(path);
    const _tag_iscsi_snapshot_ later = take(lun, "later");
    EXPECT_EQ(2, later.snap_id);
    write(path, 100, "written after both");

    ASSERT_EQ(0, NORViSCSISnapshotRestore(&snapshot, &lun)) << iscsi_host_last_error();
    EXPECT_EQ(first, digest(path));
    EXPECT_EQ(inode, inodeOf(path)) << "a mapped LUN would be lost";
    EXPECT_LE(begin, reload(lun).restored_time);
    EXPECT_GE(time(nullptr), reload(lun).restored_time);
    ASSERT_EQ(0, NORViSCSISnapshotRestore(&later, &lun));
    EXPECT_EQ(second, digest(path));
    EXPECT_EQ(first, digest(snapshotDataPath(snapshot)));

    ASSERT_EQ(0, NORViSCSISnapshotDelete(&snapshot, "test")) << iscsi_host_last_error();
    EXPECT_EQ(second, digest(path));
    EXPECT_EQ(second, digest(snapshotDataPath(later)));
    expectConsistent();

    _tag_iscsi_lun_ gone = lun;
    EXPECT_EQ(0, NORViSCSILunDelete(&gone)) << iscsi_host_last_error();
    EXPECT_TRUE(list().empty());
    EXPECT_TRUE(snapshotFolders().empty()) << "they go with their LUN";
}

/// A size that is no multiple of the file system's blocks: part of a block is the LUN's after it grew.
TEST_F(SnapshotTest, RestoreKeepsTheSizeOfALunThatGrew)
{
    const uint64_t size = 4 * MiB + 512;
    _tag_iscsi_lun_ lun = filled("a", 1, size);
    const std::string path = dataPath(lun);
    write(path, off_t(4 * MiB), std::string(512, 'e'));
    const size_t before = digest(path);
    const _tag_iscsi_snapshot_ snapshot = take(lun, "small");
    EXPECT_EQ(before, digest(snapshotDataPath(snapshot)));

    ASSERT_EQ(0, update(lun, "a", 8 * MiB));
    write(path, off_t(4 * MiB), std::string(70000, 'x'));
    write(path, off_t(7 * MiB), "behind");
    ASSERT_EQ(0, NORViSCSISnapshotRestore(&snapshot, &lun)) << iscsi_host_last_error();
    EXPECT_EQ(8 * MiB, reload(lun).size);
    EXPECT_EQ(std::string(512, 'e'), read(path, off_t(4 * MiB), 512));
    EXPECT_EQ(std::string(4 * MiB - 512, '\0'), read(path, off_t(size), 8 * MiB));
    ASSERT_EQ(0, truncate(path.c_str(), off_t(size)));
    EXPECT_EQ(before, digest(path));
}

TEST_F(SnapshotTest, NamesAreCheckedAndChosen)
{
    const _tag_iscsi_lun_ lun = filled("vol", 1);
    char name[256];
    ASSERT_EQ(0, NORViSCSIUnusedSnapshotNameFind(lun.lid, name, sizeof name));
    EXPECT_STREQ("vol-1", name);
    const _tag_iscsi_snapshot_ snapshot = take(lun, name);
    take(lun, "vol-3");
    ASSERT_EQ(0, NORViSCSIUnusedSnapshotNameFind(lun.lid, name, sizeof name));
    EXPECT_STREQ("vol-4", name);
    ASSERT_EQ(0, NORViSCSIUnusedSnapshotNameFind(lun.lid, name, 7));
    EXPECT_STREQ("vo-3", name);

    for (const char *bad : {"", ".", "..", "a/b", "../x", "a\nb", "a%s", " a", "01234567-89ab-cdef-0123-456789ABCDEF"})
        EXPECT_EQ(NORV_ERR_SNAPSHOT_NAME, tryTake(lun, bad)) << bad;
    EXPECT_EQ(NORV_ERR_SNAPSHOT_NAME, tryTake(lun, "vol-1"));
    const size_t room = 319 - (volume + "/@Snapshot/SNAPSHOT_L1024_S256_").size();
    EXPECT_EQ(NORV_ERR_SNAPSHOT_NAME, tryTake(lun, std::string(std::min<size_t>(room, 235) + 1, 'n')));
    take(lun, std::string(std::min<size_t>(room, 235), 'n'));
    EXPECT_EQ(3u, list().size());

    EXPECT_EQ(NORV_ERR_SNAPSHOT_NAME, iscsihost::renameSnapshot(snapshot.uuid, "vol-3"));
    EXPECT_EQ(NORV_ERR_SNAPSHOT_NAME, iscsihost::renameSnapshot(snapshot.uuid, "a/b"));
    EXPECT_EQ(0, iscsihost::renameSnapshot(snapshot.uuid, "renamed")) << iscsi_host_last_error();
    EXPECT_EQ(0, iscsihost::setSnapshotNote(snapshot.uuid, "note"));
    EXPECT_EQ(NORV_ERR_SNAPSHOT_NOTE, iscsihost::setSnapshotNote(snapshot.uuid, std::string(1024, 'n')));
    EXPECT_STREQ("renamed", reload(snapshot).name);
    EXPECT_STREQ("note", reload(snapshot).desc);
    expectConsistent();

    // A name of the LUN's own length fits too.
    const std::string longest = std::string(100, 'l') + "\xc3\xa4\xc3\xa4\xc3\xa4";
    const _tag_iscsi_lun_ other = filled(longest, 2);
    ASSERT_EQ(0, NORViSCSIUnusedSnapshotNameFind(other.lid, name, 106));
    EXPECT_EQ(std::string(100, 'l') + "-1", name) << "never half a character";
    take(other, name);
}

TEST_F(SnapshotTest, AtMost256)
{
    const _tag_iscsi_lun_ lun = filled("a", 1);
    for (int n = 1; n <= NORV_SNAPSHOT_ID_MAX; ++n)
        ASSERT_EQ(n, take(lun, "s" + std::to_string(n)).snap_id);
    EXPECT_EQ(NORV_ERR_MAX_SNAPSHOTS, tryTake(lun, "more"));
    const _tag_iscsi_snapshot_ middle = list(lun.lid)[99];
    EXPECT_EQ(0, NORViSCSISnapshotDelete(&middle, "test"));
    EXPECT_EQ(100, take(lun, "more").snap_id);
    _tag_iscsi_lun_ gone = lun;
    EXPECT_EQ(0, NORViSCSILunDelete(&gone)) << iscsi_host_last_error();
    expectConsistent();
}

TEST_F(SnapshotTest, LocksKeepThem)
{
    _tag_iscsi_lun_ lun = filled("a", 1);
    const _tag_iscsi_snapshot_ snapshot = take(lun, "s");
    const auto expectKept = [&](int code) {
        EXPECT_EQ(code, NORViSCSISnapshotDelete(&snapshot, "test")) << iscsi_host_last_error();
        EXPECT_EQ(code, NORViSCSILunDelete(&lun)) << iscsi_host_last_error();
        expectConsistent();
        EXPECT_EQ(1u, list().size());
    };
    ASSERT_EQ(0, iscsihost::setSnapshotUserLock(snapshot.uuid, true));
    EXPECT_EQ(1, reload(snapshot).user_locked);
    expectKept(NORV_ERR_SNAPSHOT_USER_LOCKED);
    ASSERT_EQ(0, iscsihost::setSnapshotUserLock(snapshot.uuid, false));

    ASSERT_EQ(0, NORViSCSISnapshotLockByAppKey(&snapshot, "b"));
    expectKept(NORV_ERR_SNAPSHOT_LOCKED);
    for (int i = 1; i < 512; ++i)
        ASSERT_EQ(0, NORViSCSISnapshotLockByAppKey(&snapshot, std::to_string(i).c_str()));
    EXPECT_EQ(NORV_ERR_APP_KEY, NORViSCSISnapshotLockByAppKey(&snapshot, "one more"));
    EXPECT_EQ(0, NORViSCSISnapshotLockByAppKey(&snapshot, "b")) << "not a new one";
    for (const std::string &key : {std::string(), std::string(128, 'k'), std::string("a\nb")})
        EXPECT_EQ(NORV_ERR_APP_KEY, NORViSCSISnapshotLockByAppKey(&snapshot, key.c_str()));
    Query all("DELETE FROM snapshot_app_keys");
    ASSERT_EQ(0, all.run());

    {
        SnapshotLock action;
        ASSERT_EQ(0, action.take(snapshot.lid, snapshot.snap_id, NORV_LUN_PROCESSING));
        bool locked = false;
        EXPECT_EQ(0, NORViSCSIIsSnapshotLocked(&snapshot, &locked));
        EXPECT_TRUE(locked);
        EXPECT_EQ(NORV_ERR_SNAPSHOT_LOCKED, NORViSCSISnapshotDelete(&snapshot, "test"));
        EXPECT_EQ(NORV_ERR_SNAPSHOT_LOCKED, NORViSCSILunDelete(&lun));
        EXPECT_EQ(NORV_ERR_SNAPSHOT_LOCKED, NORViSCSISnapshotRestore(&snapshot, &lun));
    }
    EXPECT_EQ(0, NORViSCSILunDelete(&lun)) << iscsi_host_last_error();
}

TEST_F(SnapshotTest, TrashIsAnotherFolder)
{
    const _tag_iscsi_lun_ lun = filled("a", 1);
    _tag_iscsi_snapshot_ snapshot = take(lun, "s");
    snapshot.flags |= NORV_SNAPSHOT_TRASH;
    ASSERT_EQ(0, NORViSCSISnapshotUnload(&snapshot)) << iscsi_host_last_error();
    EXPECT_EQ(volume + "/@EP_trash/SNAPSHOT_L1_S1_s", snapshotFolder(reload(snapshot)));
    expectConsistent();
    ASSERT_EQ(0, NORViSCSISnapshotLoad(&snapshot)) << iscsi_host_last_error();
    EXPECT_EQ(volume + "/@Snapshot/SNAPSHOT_L1_S1_s", snapshotFolder(reload(snapshot)));
    expectConsistent();
    ASSERT_EQ(0, NORViSCSISnapshotUnload(&snapshot));
    const size_t before = digest(dataPath(lun));
    write(dataPath(lun), 0, "changed");
    EXPECT_EQ(0, NORViSCSISnapshotRestore(&snapshot, &lun)) << iscsi_host_last_error();
    EXPECT_EQ(before, digest(dataPath(lun)));
    ASSERT_EQ(0, NORViSCSISnapshotDelete(&snapshot, "test")) << iscsi_host_last_error();
    expectConsistent();
}

TEST_F(SnapshotTest, ClonesAreLunsOfTheirOwn)
{
    const _tag_iscsi_lun_ lun = filled("a", 1);
    const size_t first = digest(dataPath(lun));
    const _tag_iscsi_snapshot_ snapshot = take(lun, "s");
    writeData(dataPath(lun), 2, lun.size);
    const size_t second = digest(dataPath(lun));

    _tag_iscsi_lun_ of_snapshot, of_lun, refused;
    ASSERT_EQ(0, cloneSnapshot(snapshot, "of snapshot", of_snapshot)) << iscsi_host_last_error();
    ASSERT_EQ(0, cloneLun(lun, "of LUN", of_lun)) << iscsi_host_last_error();
    EXPECT_EQ(first, digest(dataPath(of_snapshot)));
    EXPECT_EQ(second, digest(dataPath(of_lun)));
    writeData(dataPath(of_snapshot), 3, lun.size);
    EXPECT_EQ(first, digest(snapshotDataPath(snapshot)));
    EXPECT_EQ(second, digest(dataPath(lun)));

    EXPECT_EQ(NORV_ERR_LUN_NAME, cloneLun(lun, "a/b", refused));
    EXPECT_EQ(NORV_ERR_LUN_TYPE, cloneLun(create("file", NORV_LUN_TYPE_FILE), "b", refused));
    _tag_iscsi_lun_ clone;
    ASSERT_EQ(0, cloneLun(create("sink", NORV_LUN_TYPE_SINK), "of sink", clone)) << iscsi_host_last_error();
    EXPECT_EQ(NORV_LUN_TYPE_ADV, reload(clone).type);

    // To a volume of another file system.
    ASSERT_EQ(0, NORViSCSILunGetByLunId(lun.lid, &clone));
    snprintf(clone.location, sizeof clone.location, "%s/vol", root.c_str());
    setName(clone, "far");
    ASSERT_EQ(0, NORViSCSISnapshotClone(&snapshot, &clone)) << iscsi_host_last_error();
    EXPECT_EQ(first, digest(dataPath(clone)));
    ASSERT_EQ(0, NORViSCSILunDelete(&clone));
    expectConsistent();
}

TEST_F(SnapshotTest, VersionsTravelWithTheData)
{
    const _tag_iscsi_lun_ lun = create("sink", NORV_LUN_TYPE_SINK);
    const std::string path = dataPath(lun), received = newUuid();
    writeData(path, 1, lun.size);
    const _tag_iscsi_snapshot_ local = take(lun, "local");
    EXPECT_STREQ(local.uuid, local.version);
    ASSERT_EQ(0, beginSynchronisation(path, received));
    ASSERT_EQ(0, finishSynchronisation(path));
    const _tag_iscsi_snapshot_ snapshot = take(lun, "received");
    EXPECT_STREQ(received.c_str(), snapshot.version);

    Versions versions;
    write(path, 0, "local write");
    const _tag_iscsi_snapshot_ changed = take(lun, "changed");
    EXPECT_STREQ(changed.uuid, changed.version);
    ASSERT_EQ(0, NORViSCSISnapshotRestore(&snapshot, &lun)) << iscsi_host_last_error();
    ASSERT_EQ(0, readVersions(path, versions));
    EXPECT_EQ(received, versions.base);
    EXPECT_EQ(received, versions.current) << "it is what the peer sent again";
    ASSERT_EQ(0, NORViSCSISnapshotRestore(&changed, &lun));
    ASSERT_EQ(0, readVersions(path, versions));
    EXPECT_EQ(received, versions.base);
    EXPECT_NE(received, versions.current);
    write(path, 0, "again");
    ASSERT_EQ(0, readVersions(path, versions));
    EXPECT_NE(received, versions.current);

    uint64_t done = 1, total = 1;
    const std::string folder = snapshotFolder(snapshot);
    EXPECT_EQ(0, NORViSCSIChildLunSyncProgressGet(folder.c_str(), &done, &total)) << iscsi_host_last_error();
    EXPECT_EQ(0u, done + total) << "nothing was sent into it";
}

TEST_F(SnapshotTest, DataRemovedByHandIsToldAndNothingIsForgotten)
{
    _tag_iscsi_lun_ lun = filled("a", 1);
    const _tag_iscsi_snapshot_ lost = take(lun, "lost"), kept = take(lun, "kept");
    const size_t before = digest(dataPath(lun));
    std::filesystem::remove_all(snapshotFolder(lost));

    EXPECT_STREQ("Unhealthy", reload(lost).status);
    EXPECT_STREQ("Unhealthy", list()[0].status);
    EXPECT_STREQ("Healthy", list()[1].status);
    EXPECT_EQ("Unhealthy", health(lun));
    _tag_iscsi_lun_ clone;
    EXPECT_EQ(NORV_ERR_FILE_NOT_FOUND, NORViSCSISnapshotRestore(&lost, &lun));
    EXPECT_EQ(NORV_ERR_FILE_NOT_FOUND, cloneSnapshot(lost, "clone", clone));
    EXPECT_EQ(NORV_ERR_FILE_NOT_FOUND, NORViSCSISnapshotLoad(&lost));
    iscsihost::SweepReport report;
    ASSERT_EQ(0, iscsihost::sweep(report));
    EXPECT_EQ(2u, list().size()) << "a row is never removed by itself";
    EXPECT_EQ(before, digest(dataPath(lun)));

    // Somebody's file in a snapshot's folder stays, and so does its folder.
    std::ofstream(snapshotFolder(kept) + "/notes") << "somebody's";
    EXPECT_EQ(0, NORViSCSISnapshotDelete(&kept, "test"));
    EXPECT_EQ(0, NORViSCSISnapshotDelete(&lost, "test")) << iscsi_host_last_error();
    EXPECT_TRUE(exists(snapshotFolder(kept) + "/notes"));
    EXPECT_EQ("Healthy", health(lun));
}

TEST_F(SnapshotTest, TheSweepRemovesWhatIsProvablyOursAndNobodys)
{
    const _tag_iscsi_lun_ lun = filled("a", 1);
    const _tag_iscsi_snapshot_ kept = take(lun, "kept"), orphan = take(lun, "orphan"), moved = take(lun, "moved");
    Query forget("DELETE FROM snapshots WHERE name = 'orphan'");
    ASSERT_EQ(0, forget.run());
    const std::string folder = volume + "/@Snapshot/";
    std::filesystem::rename(snapshotFolder(moved), folder + "SNAPSHOT_L1_S3_elsewhere");
    std::filesystem::create_directory(folder + "SNAPSHOT_L1_S9_begun");
    for (const char *name : {"SNAPSHOT_L1_S7_foreign", "SNAPSHOT_L1_S257_x", "others"}) {
        std::filesystem::create_directory(folder + name);
        std::ofstream(folder + name + "/data") << "somebody's";
    }
    std::filesystem::create_directory_symlink(snapshotFolder(kept), folder + "SNAPSHOT_L1_S8_link");

    iscsihost::SweepReport report;
    ASSERT_EQ(0, iscsihost::sweep(report)) << iscsi_host_last_error();
    EXPECT_EQ((std::set<std::string>{snapshotFolder(orphan), folder + "SNAPSHOT_L1_S9_begun"}),
              std::set<std::string>(report.removed.begin(), report.removed.end()));
    EXPECT_EQ(std::vector<std::string>{snapshotFolder(moved)}, report.mended);
    EXPECT_EQ((std::set<std::string>{folder + "SNAPSHOT_L1_S7_foreign", folder + "SNAPSHOT_L1_S8_link"}),
              std::set<std::string>(report.foreign.begin(), report.foreign.end()));
    EXPECT_TRUE(report.failed.empty());
    EXPECT_TRUE(exists(folder + "others/data"));
    EXPECT_STREQ("Healthy", reload(kept).status);
    EXPECT_STREQ("Healthy", reload(moved).status);

    // Where the next snapshot would lie, a leftover makes room and somebody's folder does not.
    std::filesystem::create_directory(folder + "SNAPSHOT_L1_S2_next");
    take(lun, "next");
    std::filesystem::create_directory(folder + "SNAPSHOT_L1_S4_next2");
    std::ofstream(folder + "SNAPSHOT_L1_S4_next2/data") << "somebody's";
    EXPECT_EQ(NORV_ERR_FILE_EXISTS, tryTake(lun, "next2"));
}

TEST_F(SnapshotTest, OfTwoRestoresAtOnceTheSecondIsRefused)
{
    const _tag_iscsi_lun_ lun = filled("a", 1, 16 * MiB, 8192);
    const _tag_iscsi_snapshot_ snapshot = take(lun, "s");
    const size_t before = digest(dataPath(lun));
    int refused = 0;
    for (int round = 0; round < 8 || (refused == 0 && round < 400); ++round) { // until they have met
        write(dataPath(lun), 0, "changed");
        closeDatabase();
        const int locked = inChildren(3, [&](int) {
            const int err = NORViSCSISnapshotRestore(&snapshot, &lun);
            return err == 0 ? 0 : err == NORV_ERR_LUN_LOCKED ? 1 : 100;
        });
        EXPECT_GT(3, locked) << "none was made, or one failed";
        refused += locked;
        EXPECT_EQ(before, digest(dataPath(lun)));
    }
    EXPECT_LT(0, refused) << "they never met";
    expectConsistent();
}

TEST_F(SnapshotTest, AnInterruptedRestoreIsCompletedByWhoeverComesNext)
{
    const _tag_iscsi_lun_ lun = filled("a", 1);
    const _tag_iscsi_snapshot_ snapshot = take(lun, "s");
    const size_t whole = digest(dataPath(lun));
    const auto interrupt = [&] {
        ASSERT_EQ(0, markRestore(lun.lid, snapshot.uuid));
        writeData(dataPath(lun), 7, 2 * MiB);
    };
    _tag_iscsi_lun_ found, *all = nullptr;
    size_t count;
    iscsihost::SweepReport report;
    const std::vector<std::function<int()>> ways = {
        [&] { return NORViSCSILunConfigGetByUUID(lun.uuid, &found, 0); },
        [&] { return NORViSCSILunGetByLunId(lun.lid, &found); },
        [&] { return NORViSCSILunGetByLunName("a", &found); },
        [&] { return NORViSCSILunConfigGetAll(&all, &count); },
        [&] { return iscsihost::sweep(report); },
        [&] { return update(lun, "a", lun.size); },
        [&] { return tryTake(lun, "t"); },
        [&] { return cloneLun(lun, "clone", found); },
    };
    for (size_t i = 0; i < ways.size(); ++i) {
        SCOPED_TRACE(i);
        interrupt();
        EXPECT_EQ(0, ways[i]()) << iscsi_host_last_error();
        EXPECT_EQ(whole, digest(dataPath(lun)));
    }
    free(all);
    EXPECT_EQ(whole, digest(snapshotDataPath(list()[1]))) << "not of the half restored LUN";
    EXPECT_EQ(whole, digest(dataPath(found)));

    // An action that holds the LUN may be the restore itself.
    interrupt();
    {
        LunLock busy;
        ASSERT_EQ(0, busy.take(lun.lid, NORV_LUN_RESTORING));
        EXPECT_NE(whole, digest(dataPath(reload(lun))));
    }
    // Where the snapshot is lost, the LUN can be looked at, set back to another one and deleted; not copied.
    const std::string folder = snapshotFolder(snapshot), away = volume + "/away";
    ASSERT_EQ(0, rename(folder.c_str(), away.c_str()));
    EXPECT_NE(whole, digest(dataPath(reload(lun))));
    EXPECT_EQ(NORV_ERR_FILE_NOT_FOUND, tryTake(lun, "u"));
    EXPECT_EQ(NORV_ERR_FILE_NOT_FOUND, cloneLun(lun, "copy", found));
    EXPECT_EQ(NORV_ERR_SNAPSHOT_LOCKED, NORViSCSISnapshotDelete(&snapshot, "test"));
    const _tag_iscsi_snapshot_ other = list()[1];
    EXPECT_EQ(0, NORViSCSISnapshotRestore(&other, &lun)) << iscsi_host_last_error();
    EXPECT_EQ(0, NORViSCSISnapshotDelete(&snapshot, "test")) << iscsi_host_last_error();
    expectConsistent();
}

TEST_F(SnapshotTest, AFullDiskRefusesAndKeepsNothing)
{
    const _tag_iscsi_lun_ lun = filled("a", 1);
    const _tag_iscsi_snapshot_ snapshot = take(lun, "s"), unwanted = take(lun, "t");
    const size_t before = digest(dataPath(lun));
    fillDisk(volume);
    _tag_iscsi_lun_ clone;
    EXPECT_EQ(NORV_ERR_OUT_OF_SPACE, tryTake(lun, "more")) << iscsi_host_last_error();
    EXPECT_EQ(NORV_ERR_OUT_OF_SPACE, cloneLun(lun, "clone", clone)) << iscsi_host_last_error();
    EXPECT_EQ(NORV_ERR_OUT_OF_SPACE, cloneSnapshot(snapshot, "clone", clone)) << iscsi_host_last_error();
    EXPECT_EQ(before, digest(dataPath(lun)));
    const int restored = NORViSCSISnapshotRestore(&snapshot, &lun);
    EXPECT_TRUE(restored == 0 || restored == NORV_ERR_OUT_OF_SPACE) << restored;
    expectConsistent();
    EXPECT_EQ(0, NORViSCSISnapshotDelete(&unwanted, "test")) << "a full disk can be emptied";
    ASSERT_EQ(0, unlink((volume + "/fill").c_str()));
    EXPECT_EQ(before, digest(dataPath(reload(lun)))) << "begun means done once there is space";
    EXPECT_EQ(0, NORViSCSISnapshotDelete(&snapshot, "test")) << iscsi_host_last_error();
    expectConsistent();
}

TEST_F(SnapshotTest, AReadOnlyVolumeRefusesAndChangesNothing)
{
    const _tag_iscsi_lun_ lun = filled("a", 1);
    _tag_iscsi_snapshot_ snapshot = take(lun, "s");
    write(dataPath(lun), 0, "changed");
    const size_t before = digest(dataPath(lun));
    run({"mount", "-o", "remount,ro", volume});
    _tag_iscsi_lun_ clone;
    EXPECT_EQ(NORV_ERR_NO_PERMISSION, tryTake(lun, "more")) << iscsi_host_last_error();
    EXPECT_EQ(NORV_ERR_NO_PERMISSION, NORViSCSISnapshotRestore(&snapshot, &lun)) << iscsi_host_last_error();
    EXPECT_EQ(NORV_ERR_NO_PERMISSION, NORViSCSISnapshotDelete(&snapshot, "test")) << iscsi_host_last_error();
    EXPECT_EQ(NORV_ERR_NO_PERMISSION, cloneSnapshot(snapshot, "clone", clone)) << iscsi_host_last_error();
    snapshot.flags = NORV_SNAPSHOT_TRASH;
    EXPECT_EQ(NORV_ERR_NO_PERMISSION, NORViSCSISnapshotUnload(&snapshot)) << iscsi_host_last_error();
    expectConsistent();
    run({"mount", "-o", "remount,rw", volume});
    EXPECT_EQ(before, digest(dataPath(reload(lun)))) << "no restore was begun";
    expectConsistent();
}

/// The folder that all tests have lies on a file system without shared blocks, or on one with: both are served.
TEST_F(HostTest, WithoutSharedBlocksDataIsCopiedUnlessInitiatorsUseIt)
{
    const _tag_iscsi_lun_ lun = create("a", NORV_LUN_TYPE_ADV, 64 * MiB);
    writeData(dataPath(lun), 1, 4 * MiB);
    const size_t before = digest(dataPath(lun));
    _tag_iscsi_snapshot_ snapshot = {}, second = {};
    snprintf(snapshot.name, sizeof snapshot.name, "s");
    snprintf(second.name, sizeof second.name, "t");
    ASSERT_EQ(0, NORViSCSISnapshotCreate(&lun, &snapshot)) << iscsi_host_last_error();
    EXPECT_EQ(before, digest(snapshotDataPath(snapshot)));
    EXPECT_GT(2 * MiB, snapshot.mapped_size) << "holes stay holes";
    write(dataPath(lun), off_t(60 * MiB), "behind all data of the snapshot");
    ASSERT_EQ(0, NORViSCSISnapshotRestore(&snapshot, &lun)) << iscsi_host_last_error();
    EXPECT_EQ(before, digest(dataPath(lun)));

    map(lun);
    write(dataPath(lun), 0, "changed");
    const size_t changed = digest(dataPath(lun));
    _tag_iscsi_lun_ clone = lun;
    setName(clone, "b");
    const int taken = NORViSCSISnapshotCreate(&lun, &second);
    if (taken == 0)
        GTEST_SUCCEED() << "this file system shares blocks";
    else {
        EXPECT_EQ(NORV_ERR_LUN_MAPPED, taken);
        EXPECT_EQ(NORV_ERR_LUN_MAPPED, NORViSCSILunClone(&lun, &clone));
        EXPECT_EQ(NORV_ERR_LUN_MAPPED, NORViSCSISnapshotRestore(&snapshot, &lun));
        EXPECT_EQ(changed, digest(dataPath(reload(lun)))) << "no restore was begun";
    }
    EXPECT_EQ(0, NORViSCSISnapshotClone(&snapshot, &clone)) << iscsi_host_last_error();
    EXPECT_EQ(before, digest(dataPath(clone)));
}

TEST_F(HostTest, WaitsAndProgressEndWithTheActionOrTheLimit)
{
    using Clock = std::chrono::steady_clock;
    const _tag_iscsi_lun_ lun = create("a");
    EXPECT_EQ(0, NORViSCSILunWaitUntilUnlock(&lun, 0));
    int ready[2];
    ASSERT_EQ(0, pipe(ready));
    const pid_t holder = inChild([&] {
        LunLock lock;
        const char taken = lock.take(lun.lid, NORV_LUN_CLONING) == 0;
        lock.tell(42);
        if (::write(ready[1], &taken, 1) != 1)
            return 1;
        pause();
        return 0;
    });
    char taken = 0;
    ASSERT_EQ(1, ::read(ready[0], &taken, 1));
    ASSERT_EQ(1, taken);
    bool locked = false;
    _tag_iscsi_lun_progress_ progress = {};
    EXPECT_EQ(0, NORViSCSILunIsLocked(&lun, &locked));
    EXPECT_TRUE(locked);
    EXPECT_EQ(0, NORViSCSILunProgressGet(&lun, &progress));
    EXPECT_EQ(NORV_LUN_CLONING, progress.st);
    EXPECT_EQ(42, progress.percent);
    const auto begin = Clock::now();
    EXPECT_EQ(NORV_ERR_TIMEOUT, NORViSCSILunWaitUntilUnlock(&lun, 1));
    EXPECT_LE(std::chrono::seconds(1), Clock::now() - begin);
    const pid_t waiter = inChild([&] { return NORViSCSILunWaitUntilUnlock(&lun, 0); });
    kill(holder, SIGKILL);
    EXPECT_EQ(128 + SIGKILL, waitForChild(holder));
    EXPECT_EQ(0, waitForChild(waiter)) << "a killed holder holds nothing";
    EXPECT_EQ(0, NORViSCSILunProgressGet(&lun, &progress));
    EXPECT_EQ(NORV_LUN_IDLE, progress.st);
    LunLock next;
    ASSERT_EQ(0, next.take(lun.lid, NORV_LUN_PROCESSING));
    EXPECT_TRUE(next.foundUnfinished());
    next.release();
    ASSERT_EQ(0, next.take(lun.lid, NORV_LUN_PROCESSING));
    EXPECT_FALSE(next.foundUnfinished());
    close(ready[0]);
    close(ready[1]);
}

TEST_F(HostTest, AStopReachesTheActionThatHoldsTheLockAndNoOther)
{
    SnapshotLock lock;
    ASSERT_EQ(0, requestSnapshotStop(1, 1));
    ASSERT_EQ(0, lock.take(1, 1, NORV_LUN_PROCESSING));
    EXPECT_FALSE(lock.stopRequested());
    ASSERT_EQ(0, requestSnapshotStop(1, 2));
    EXPECT_FALSE(lock.stopRequested());
    ASSERT_EQ(0, requestSnapshotStop(1, 1));
    EXPECT_TRUE(lock.stopRequested());
    lock.release();
    ASSERT_EQ(0, lock.take(1, 1, NORV_LUN_PROCESSING));
    EXPECT_FALSE(lock.stopRequested());
}

TEST_F(HostTest, ADetachedChildIsNobodysZombieAndHoldsNoOutput)
{
    int lifeline[2], output[2];
    ASSERT_EQ(0, pipe(lifeline));
    ASSERT_EQ(0, pipe(output));
    const pid_t caller = inChild([&] {
        dup2(output[1], STDOUT_FILENO);
        close(output[0]);
        close(output[1]);
        const int child = NLIBCProcForkChildNoWait();
        if (child == 0) {
            // Lives until the test lets go.
            close(lifeline[1]);
            char byte;
            _exit(::read(lifeline[0], &byte, 1) == 0 && getsid(0) == getpid() ? 0 : 1);
        }
        dprintf(STDOUT_FILENO, "%d", child);
        return waitpid(-1, nullptr, WNOHANG) == -1 ? 0 : 1; // no child is ours
    });
    close(output[1]);
    EXPECT_EQ(0, waitForChild(caller));
    std::string said;
    char byte;
    while (::read(output[0], &byte, 1) == 1)
        said += byte;
    const pid_t child = std::stoi(said);
    EXPECT_EQ(0, kill(child, 0)) << "it lives on, and the output ended all the same";
    close(lifeline[0]);
    close(lifeline[1]);
    close(output[0]);
    for (int i = 0; i < 1000 && kill(child, 0) == 0; ++i)
        poll(nullptr, 0, 5);
}

} // namespace
} // namespace norvhost
