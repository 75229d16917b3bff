/// Exports and imports. Their workers are processes of their own, which the tests hold, look at and kill.
#include "KillAt.h"
#include "SnapshotTest.h"

#include "host/state/Database.h"
#include "host/state/Fields.h"
#include "host/storage/Transfers.h"
#include "platform/core.h"

#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <random>
#include <sched.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <sys/wait.h>
#include <unistd.h>

namespace norvhost {
namespace {

namespace fs = std::filesystem;

struct TransferTest : SnapshotTest {
    /// On another file system than the volume: what goes there is copied.
    std::string elsewhere(const std::string &name) { return memory + "/" + name; }

    int startExport(const _tag_iscsi_snapshot_ &snapshot, const std::string &folder)
    {
        return NORViSCSISnapshotExport(&snapshot, folder.c_str());
    }
    void waitFor(const _tag_iscsi_snapshot_ &snapshot)
    {
        EXPECT_EQ(0, NORViSCSISnapshotWaitUntilUnlock(&snapshot, 120)) << iscsi_host_last_error();
    }
    void waitFor(const _tag_iscsi_lun_ &lun)
    {
        EXPECT_EQ(0, NORViSCSILunWaitUntilUnlock(&lun, 120)) << iscsi_host_last_error();
    }
    void exportTo(const _tag_iscsi_snapshot_ &snapshot, const std::string &folder)
    {
        EXPECT_EQ(0, startExport(snapshot, folder)) << iscsi_host_last_error();
        waitFor(snapshot);
        EXPECT_TRUE(exists(folder + "/export.record"));
        EXPECT_EQ(0u, progress(snapshot).find("0 ")) << progress(snapshot);
    }
    void importInto(const _tag_iscsi_lun_ &lun, const std::string &folder)
    {
        EXPECT_EQ(0, NORViSCSILunImport(&lun, folder.c_str())) << iscsi_host_last_error();
        waitFor(lun);
        EXPECT_EQ(0u, progress(lun).find("0 ")) << progress(lun);
    }

    /// "<step> <done> <total>" of the progress file, or "none".
    std::string progress(const TransferId &id)
    {
        const std::string path = root + "/progress/" + progressFileName(id);
        std::string text;
        char value[32];
        if (!NLIBCFileExist(path.c_str()))
            return "none";
        for (const char *key : {"step", "done_bytes", "total_bytes"}) {
            EXPECT_EQ(1, NLIBCFileGetKeyValue(path.c_str(), key, value, sizeof value)) << key;
            text += (text.empty() ? "" : " ") + std::string(value);
        }
        return text;
    }
    std::string progress(const _tag_iscsi_snapshot_ &snapshot)
    {
        return progress(TransferId{snapshot.lid, snapshot.snap_id});
    }
    std::string progress(const _tag_iscsi_lun_ &lun) { return progress(TransferId{lun.lid, 0}); }

    bool isLocked(const _tag_iscsi_snapshot_ &snapshot)
    {
        bool locked = true;
        EXPECT_EQ(0, NORViSCSIIsSnapshotLocked(&snapshot, &locked));
        return locked;
    }
    bool isLocked(const _tag_iscsi_lun_ &lun)
    {
        bool locked = true;
        EXPECT_EQ(0, NORViSCSILunIsLocked(&lun, &locked));
        return locked;
    }

    /// Our workers are children of nobody, so they become ours.
    TransferTest() { prctl(PR_SET_CHILD_SUBREAPER, 1); }

    /// The worker that runs, 0 for none.
    static pid_t worker()
    {
        while (waitpid(-1, nullptr, WNOHANG) > 0)
            ;
        pid_t pid = 0;
        std::ifstream("/proc/thread-self/children") >> pid;
        return pid;
    }

    /// On one processor with the worker, we are not late to hold it: on a quick machine it would have ended.
    class OneProcessor {
    public:
        OneProcessor()
        {
            cpu_set_t one;
            CPU_ZERO(&one);
            sched_getaffinity(0, sizeof all, &all);
            for (size_t cpu = 0; CPU_COUNT(&one) == 0 && cpu < CPU_SETSIZE; ++cpu)
                if (CPU_ISSET(cpu, &all))
                    CPU_SET(cpu, &one);
            sched_setaffinity(0, sizeof one, &one);
        }
        ~OneProcessor() { sched_setaffinity(0, sizeof all, &all); }

    private:
        cpu_set_t all;
    };

    /// Starts a transfer of a lot of data and holds its worker on the way; 0 when it always ended before.
    pid_t hold(const std::function<int()> &start, const std::function<bool()> &ended)
    {
        const OneProcessor with_worker;
        for (int attempt = 0; attempt < 50; ++attempt) {
            EXPECT_EQ(0, start()) << iscsi_host_last_error();
            const pid_t pid = worker();
            if (pid && kill(pid, SIGSTOP) == 0 && !ended())
                return pid;
            if (pid)
                kill(pid, SIGCONT);
            while (worker())
                usleep(1000);
        }
        ADD_FAILURE() << "the worker was never found before its end";
        return 0;
    }
    pid_t heldExport(const _tag_iscsi_snapshot_ &snapshot, const std::string &folder)
    {
        const bool was_there = exists(folder);
        const auto start = [&] {
            for (const char *name : {"export.record", "export.lun", "export.data"})
                fs::remove(folder + "/" + name);
            if (!was_there)
                fs::remove(folder);
            return startExport(snapshot, folder);
        };
        return hold(start, [&] { return exists(folder + "/export.record"); });
    }
    pid_t heldImport(const _tag_iscsi_lun_ &lun, const std::string &folder)
    {
        return hold([&] { return NORViSCSILunImport(&lun, folder.c_str()); },
                    [&] { return progress(lun).rfind("0 ", 0) == 0; });
    }
    void goOn(pid_t pid) { EXPECT_TRUE(pid && kill(pid, SIGCONT) == 0); }

    uint64_t allocated(const std::string &path)
    {
        struct stat status = {};
        EXPECT_EQ(0, stat(path.c_str(), &status)) << path;
        return static_cast<uint64_t>(status.st_blocks) * 512;
    }
    /// Of the beginning of a file.
    size_t digestOf(const std::string &path, uint64_t size)
    {
        std::string text(size, '\0');
        std::ifstream(path, std::ios::binary).read(text.data(), static_cast<std::streamsize>(size));
        return std::hash<std::string>()(text);
    }

    static std::string text(const std::string &path)
    {
        std::ifstream file(path, std::ios::binary);
        return std::string(std::istreambuf_iterator<char>(file), {});
    }
    static void store(const std::string &path, const std::string &text)
    {
        std::ofstream(path, std::ios::binary | std::ios::trunc) << text;
    }
};

constexpr uint64_t size = 16 * MiB, distance = MiB;
constexpr uint64_t data_bytes = size / distance * 4096;
/// All of it data.
constexpr uint64_t much = 48 * MiB, dense = 4096;

TEST_F(TransferTest, ExportAndImportKeepDataHolesAndWhatTheSnapshotSays)
{
    const _tag_iscsi_lun_ lun = filled("lun A", 1, size, distance);
    _tag_iscsi_snapshot_ snapshot = {};
    copyText(snapshot.name, "s");
    copyText(snapshot.desc, "a note\nof two lines");
    copyText(snapshot.taken_by, "somebody");
    snapshot.snap_time = 1234567890;
    snapshot.app_consistent = snapshot.user_locked = 1;
    ASSERT_EQ(0, NORViSCSISnapshotCreate(&lun, &snapshot)) << iscsi_host_last_error();
    writeData(dataPath(lun), 2, size, distance);

    const std::string folders[] = {elsewhere("copied"), volume + "/shared"};
    fs::create_directory(folders[1]); // an existing empty folder will do
    for (const std::string &folder : folders) {
        SCOPED_TRACE(folder);
        exportTo(snapshot, folder + "/");
        EXPECT_EQ(digest(snapshotDataPath(snapshot)), digest(folder + "/export.data"));
        EXPECT_GE(data_bytes + 4096, allocated(folder + "/export.data")) << "holes stay holes";
        EXPECT_FALSE(exists(folder + "/export.record.part"));

        const std::string record = text(folder + "/export.record");
        ASSERT_EQ(1104u, record.size());
        EXPECT_EQ(snapshot.uuid, record.substr(0, 36));
        EXPECT_STREQ("a note\nof two lines", &record[36]);
        EXPECT_STREQ("somebody", &record[1060]);
        _tag_iscsi_export_config_ config;
        ASSERT_EQ(0, NORViSCSISnapshotExportConfigGet(folder.c_str(), &config)) << iscsi_host_last_error();
        EXPECT_EQ(0, memcmp(&config, record.data(), sizeof config));
        EXPECT_EQ(1234567890, config.snap_time);
        EXPECT_EQ(1, config.app_consistent);
        EXPECT_EQ(1, config.user_locked);
    }

    int number = 0;
    for (const std::string &folder : folders)
        for (const int type : {NORV_LUN_TYPE_ADV, NORV_LUN_TYPE_THIN, NORV_LUN_TYPE_FILE}) {
            SCOPED_TRACE(folder + " into type " + std::to_string(type));
            const _tag_iscsi_lun_ target = create("t" + std::to_string(++number), type, size + MiB);
            write(dataPath(target), static_cast<off_t>(size + 4096), "what was there goes");
            importInto(target, folder);
            EXPECT_EQ("0 " + std::to_string(data_bytes) + " " + std::to_string(data_bytes), progress(target));
            EXPECT_EQ(size + MiB, fs::file_size(dataPath(target)));
            EXPECT_EQ(digest(snapshotDataPath(snapshot)), digestOf(dataPath(target), size));
            EXPECT_EQ(std::string(8, '\0'), read(dataPath(target), static_cast<off_t>(size + 4096), 8));
            if (type == NORV_LUN_TYPE_FILE)
                EXPECT_LE(size + MiB, allocated(dataPath(target))) << "its space stays its own";
            else
                EXPECT_GE(data_bytes + 4096, allocated(dataPath(target)));
            EXPECT_EQ("Healthy", health(target));
        }
    expectConsistent();
    EXPECT_EQ(0, iscsihost::setSnapshotUserLock(snapshot.uuid, false));
}

TEST_F(TransferTest, FoldersThatAreNotExportedTo)
{
    const _tag_iscsi_snapshot_ snapshot = take(filled("a", 1), "s"), other = take(filled("b", 1), "s");
    exportTo(other, elsewhere("export"));
    fs::create_directory(elsewhere("record"));
    store(elsewhere("record/export.data"), "somebody's");
    store(elsewhere("file"), "somebody's");
    fs::create_directory_symlink(volume + "/@iSCSITrg", elsewhere("link"));
    fs::create_directory_symlink(elsewhere("nowhere"), elsewhere("dangling"));
    const struct {
        std::string folder;
        int code;
    } cases[] = {
        {"", NORV_ERR_EXPORT_LOCATION},
        {"relative", NORV_ERR_EXPORT_LOCATION},
        {elsewhere("no/such/parent"), NORV_ERR_EXPORT_LOCATION},
        {elsewhere("missing/.."), NORV_ERR_EXPORT_LOCATION},
        {elsewhere("file"), NORV_ERR_EXPORT_LOCATION},
        {elsewhere("file/below"), NORV_ERR_EXPORT_LOCATION},
        {elsewhere("dangling"), NORV_ERR_EXPORT_LOCATION},
        {volume + "/@iSCSITrg/x", NORV_ERR_EXPORT_LOCATION},
        {volume + "/@Snapshot", NORV_ERR_EXPORT_LOCATION},
        {volume + "/x/../@Snapshot/x", NORV_ERR_EXPORT_LOCATION},
        {volume + "/@EP_trash", NORV_ERR_EXPORT_LOCATION},
        {elsewhere("link/x"), NORV_ERR_EXPORT_LOCATION},
        {elsewhere("export"), NORV_ERR_FILE_EXISTS},
        {elsewhere("record"), NORV_ERR_FILE_EXISTS},
        {"/proc/x", NORV_ERR_MAKE_DIRECTORY},
    };
    const std::string record = text(elsewhere("export/export.record"));
    for (const auto &c : cases) {
        EXPECT_EQ(c.code, startExport(snapshot, c.folder)) << c.folder << ": " << iscsi_host_last_error();
        EXPECT_FALSE(isLocked(snapshot));
        EXPECT_EQ("none", progress(snapshot));
    }
    EXPECT_EQ(NORV_ERR_NULL_POINTER, NORViSCSISnapshotExport(&snapshot, nullptr));
    EXPECT_EQ(record, text(elsewhere("export/export.record")));
    EXPECT_EQ("somebody's", text(elsewhere("record/export.data")));
    EXPECT_FALSE(exists(elsewhere("nowhere")));
    EXPECT_FALSE(exists(elsewhere("missing")));
    expectConsistent();
}

TEST_F(TransferTest, AReadOnlyVolumeIsExportedFromAndTakesNothing)
{
    const _tag_iscsi_lun_ lun = filled("a", 1);
    const _tag_iscsi_snapshot_ snapshot = take(lun, "s");
    writeData(dataPath(lun), 2, lun.size);
    const size_t before = digest(dataPath(lun));
    run({"mount", "-o", "remount,ro", volume});
    exportTo(snapshot, elsewhere("export"));
    EXPECT_EQ(digest(snapshotDataPath(snapshot)), digest(elsewhere("export/export.data")));
    EXPECT_EQ(NORV_ERR_NO_PERMISSION, startExport(snapshot, volume + "/export")) << iscsi_host_last_error();
    EXPECT_EQ(NORV_ERR_NO_PERMISSION, NORViSCSILunImport(&lun, elsewhere("export").c_str())) << iscsi_host_last_error();
    run({"mount", "-o", "remount,rw", volume});
    EXPECT_EQ(before, digest(dataPath(lun)));
    EXPECT_FALSE(isLocked(lun));
    expectConsistent();
}

TEST_F(TransferTest, ProgressIsNotWrittenWhereOthersCouldLeadIt)
{
    const _tag_iscsi_snapshot_ snapshot = take(filled("a", 1), "s");
    const std::string folder = root + "/progress";
    fs::remove_all(folder);
    fs::create_directory(root + "/victim");
    fs::create_directory_symlink(root + "/victim", folder);
    EXPECT_EQ(NORV_ERR_NO_PERMISSION, startExport(snapshot, elsewhere("out")));
    fs::remove(folder);
    fs::create_directory(folder);
    ASSERT_EQ(0, chmod(folder.c_str(), 0777));
    EXPECT_EQ(NORV_ERR_NO_PERMISSION, startExport(snapshot, elsewhere("out")));
    ASSERT_EQ(0, chmod(folder.c_str(), 0700));
    ASSERT_EQ(0, chown(folder.c_str(), 12345, 12345));
    EXPECT_EQ(NORV_ERR_NO_PERMISSION, startExport(snapshot, elsewhere("out")));
    ASSERT_EQ(0, chown(folder.c_str(), 0, 0));
    EXPECT_FALSE(exists(elsewhere("out")));

    // Links under the files' names are replaced, not followed.
    store(root + "/precious", "precious");
    for (const char *name : {"/L1_S1.export_progress", "/.L1_S1.export_progress.next"})
        fs::create_symlink(root + "/precious", folder + name);
    exportTo(snapshot, elsewhere("out"));
    EXPECT_EQ("precious", text(root + "/precious"));
}

TEST_F(TransferTest, FoldersThatAreNotImported)
{
    const _tag_iscsi_snapshot_ snapshot = take(filled("a", 1), "s");
    const std::string whole = elsewhere("whole"), broken = elsewhere("broken");
    exportTo(snapshot, whole);
    const _tag_iscsi_lun_ target = filled("target", 2), small = filled("small", 2, 2 * MiB);
    const size_t before = digest(dataPath(target));

    const std::string record = text(whole + "/export.record"), facts = text(whole + "/export.lun");
    std::string not_ended = record;
    not_ended.replace(36, 1024, 1024, 'x');
    const struct {
        const char *file;
        std::string content;
        int code;
    } cases[] = {
        {"export.record", record.substr(0, 1103), NORV_ERR_BAD_FILE_SIZE},
        {"export.record", record + "x", NORV_ERR_BAD_FILE_SIZE},
        {"export.record", "", NORV_ERR_BAD_FILE_SIZE},
        {"export.record", std::string(1104, 'x'), NORV_ERR_BAD_FILE_TYPE},
        {"export.record", not_ended, NORV_ERR_BAD_FILE_TYPE},
        {"export.record", "missing", NORV_ERR_FILE_NOT_FOUND},
        {"export.record", "link", NORV_ERR_BAD_FILE_TYPE},
        {"export.record", "folder", NORV_ERR_BAD_FILE_TYPE},
        {"export.lun", "missing", NORV_ERR_FILE_NOT_FOUND},
        {"export.lun", "somebody's", NORV_ERR_BAD_FILE_TYPE},
        {"export.lun", "format=2\nsize=4194304\ntype=15\n", NORV_ERR_BAD_FILE_TYPE},
        {"export.lun", "format=1\nsize=-1\ntype=15\n", NORV_ERR_BAD_FILE_TYPE},
        {"export.lun", "format=1\nsize=4194305\ntype=15\n", NORV_ERR_BAD_FILE_TYPE},
        {"export.lun", "format=1\nsize=8388608\ntype=15\n", NORV_ERR_BAD_FILE_SIZE},
        {"export.lun", std::string(5000, '\n'), NORV_ERR_BAD_FILE_SIZE},
        {"export.data", "missing", NORV_ERR_FILE_NOT_FOUND},
        {"export.data", "short", NORV_ERR_BAD_FILE_SIZE},
        {"export.data", "link", NORV_ERR_BAD_FILE_TYPE},
        {"export.data", "folder", NORV_ERR_BAD_FILE_TYPE},
    };
    for (const auto &c : cases) {
        fs::remove_all(broken);
        fs::copy(whole, broken);
        const std::string path = broken + "/" + c.file;
        fs::remove(path);
        if (c.content == "link")
            fs::create_symlink(whole + "/" + c.file, path);
        else if (c.content == "folder")
            fs::create_directory(path);
        else if (c.content != "missing")
            store(path, c.content);
        EXPECT_EQ(c.code, NORViSCSILunImport(&target, broken.c_str()))
            << c.file << " " << c.content.substr(0, 40) << ": " << iscsi_host_last_error();
        _tag_iscsi_export_config_ config = {};
        EXPECT_EQ(c.file == std::string("export.record") ? c.code : 0,
                  NORViSCSISnapshotExportConfigGet(broken.c_str(), &config));
    }
    EXPECT_EQ(NORV_ERR_EXPORT_LOCATION, NORViSCSILunImport(&target, "relative"));
    EXPECT_EQ(NORV_ERR_FILE_NOT_FOUND, NORViSCSILunImport(&target, elsewhere("none").c_str()));
    EXPECT_EQ(NORV_ERR_NULL_POINTER, NORViSCSILunImport(&target, nullptr));
    EXPECT_EQ(NORV_ERR_LUN_SIZE, NORViSCSILunImport(&small, whole.c_str()));
    map(target);
    EXPECT_EQ(NORV_ERR_LUN_MAPPED, NORViSCSILunImport(&target, whole.c_str()));
    Query("DELETE FROM mappings").run();
    _tag_iscsi_lun_ trashed = target;
    trashed.options = NORV_LUN_OPTION_TRASH;
    ASSERT_EQ(0, NORViSCSILunUnload(&trashed));
    EXPECT_EQ(NORV_ERR_LUN_NOT_LOADED, NORViSCSILunImport(&target, whole.c_str()));
    ASSERT_EQ(0, NORViSCSILunLoad(&trashed));

    EXPECT_EQ(before, digest(dataPath(target)));
    EXPECT_EQ("none", progress(target));
    EXPECT_FALSE(isLocked(target));
    expectConsistent();
}

TEST_F(TransferTest, CancelStopsAndLeavesNothing)
{
    const _tag_iscsi_lun_ lun = filled("a", 1, much, dense);
    const _tag_iscsi_snapshot_ snapshot = take(lun, "s");
    const std::string folder = elsewhere("out");
    EXPECT_EQ(NORV_ERR_NOT_EXPORTING, NORViSCSISnapshotExportCancel(&snapshot));
    EXPECT_EQ(NORV_ERR_NOT_IMPORTING, NORViSCSILunImportCancel(&lun));

    const pid_t pid = heldExport(snapshot, folder);
    EXPECT_TRUE(isLocked(snapshot));
    EXPECT_EQ(0u, progress(snapshot).find("18990590 ")) << progress(snapshot);
    EXPECT_NE(std::string::npos, progress(snapshot).find(" " + std::to_string(much)));
    EXPECT_EQ(NORV_ERR_SNAPSHOT_LOCKED, startExport(snapshot, elsewhere("second")));
    EXPECT_EQ(NORV_ERR_SNAPSHOT_LOCKED, NORViSCSISnapshotDelete(&snapshot, "test"));
    _tag_iscsi_lun_ deleted = lun;
    EXPECT_EQ(NORV_ERR_SNAPSHOT_LOCKED, NORViSCSILunDelete(&deleted)) << iscsi_host_last_error();
    EXPECT_EQ(0, NORViSCSISnapshotExportCancel(&snapshot)) << iscsi_host_last_error();
    goOn(pid);
    waitFor(snapshot);
    EXPECT_FALSE(exists(folder));
    EXPECT_EQ(0u, progress(snapshot).find("18990588 ")) << progress(snapshot);
    EXPECT_EQ(NORV_ERR_NOT_EXPORTING, NORViSCSISnapshotExportCancel(&snapshot));

    // Unloading stops it as well; a folder that was there stays.
    fs::create_directory(folder);
    goOn(heldExport(snapshot, folder));
    EXPECT_EQ(0, NORViSCSISnapshotUnload(&snapshot)) << iscsi_host_last_error();
    EXPECT_EQ(exists(folder + "/export.record"), !fs::is_empty(folder)) << "all of it, or nothing";
    fs::remove_all(folder);

    exportTo(snapshot, folder);
    EXPECT_EQ(NORV_ERR_NOT_EXPORTING, NORViSCSISnapshotExportCancel(&snapshot)) << "after the last byte";
    EXPECT_EQ(digest(snapshotDataPath(snapshot)), digest(folder + "/export.data"));

    const _tag_iscsi_lun_ target = filled("target", 2, much);
    const pid_t importing = heldImport(target, folder);
    const size_t before = digest(dataPath(target));
    EXPECT_EQ(0u, progress(target).find("18990591 ")) << progress(target);
    EXPECT_EQ(NORV_ERR_LUN_LOCKED, NORViSCSILunImport(&target, folder.c_str()));
    EXPECT_EQ(0, NORViSCSILunImportCancel(&target)) << iscsi_host_last_error();
    goOn(importing);
    waitFor(target);
    EXPECT_EQ(0u, progress(target).find("18990589 ")) << progress(target);
    EXPECT_EQ(before, digest(dataPath(target)));
    EXPECT_EQ(NORV_ERR_NOT_IMPORTING, NORViSCSILunImportCancel(&target));
    expectConsistent();
}

/// Either the canceller or the worker is first; both never believe it.
TEST_F(TransferTest, CancelAndCompletionExcludeEachOther)
{
    const TransferId id = {1, 2};
    const auto accept = [] { return 0; };
    {
        TransferJob job;
        ASSERT_EQ(0, job.begin(id, "/folder", false, 5)) << iscsi_host_last_error();
        TransferJob other;
        EXPECT_EQ(NORV_ERR_FILE_EXISTS, other.begin({1, 3}, "/folder", false, 5)) << "one export in a folder";
        EXPECT_EQ(0, sweepTransfers());
        EXPECT_EQ("18990590 0 5", progress(id)) << "what is alive is not swept";
        EXPECT_EQ(0, cancelTransfer(id));
        EXPECT_EQ(-ECANCELED, job.finishing(accept));
        job.end(-ECANCELED);
        EXPECT_EQ("18990588 0 5", progress(id));
    }
    {
        TransferJob job;
        ASSERT_EQ(0, job.begin(id, "/folder", false, 5)) << iscsi_host_last_error();
        EXPECT_EQ(NORV_ERR_LUN_MAPPED, job.finishing([] { return NORV_ERR_LUN_MAPPED; })) << "undone";
        EXPECT_EQ(0, job.finishing(accept));
        EXPECT_EQ(NORV_ERR_NOT_EXPORTING, cancelTransfer(id)) << "too late";
        job.end(NORV_ERR_IO);
        EXPECT_EQ("18990594 0 5", progress(id)) << "a failure can be read";
        EXPECT_EQ(0, sweepTransfers());
        EXPECT_EQ("18990594 0 5", progress(id));
    }
    TransferJob gone;
    ASSERT_EQ(0, gone.begin({4, 0}, "/folder", false, 5));
    gone.end(0);
    EXPECT_EQ("0 5 5", progress(TransferId{4, 0}));
    fs::last_write_time(root + "/progress/L4.import_progress",
                        fs::file_time_type::clock::now() - std::chrono::hours(1));
    gone = TransferJob();
    EXPECT_EQ(0, sweepTransfers());
    EXPECT_EQ("none", progress(TransferId{4, 0})) << "an old outcome goes";
    EXPECT_NE("none", progress(id));
    const _tag_iscsi_lun_ lun = filled("a", 1);
    take(lun, "s");
    const _tag_iscsi_snapshot_ snapshot = take(lun, "t");
    ASSERT_NE("none", progress(snapshot));
    EXPECT_EQ(0, NORViSCSISnapshotDelete(&snapshot, "test")) << iscsi_host_last_error();
    EXPECT_EQ("none", progress(snapshot)) << "the next snapshot with this number has no outcome";
}

TEST_F(TransferTest, DiskFull)
{
    const _tag_iscsi_lun_ lun = filled("a", 1, much, dense);
    const _tag_iscsi_snapshot_ snapshot = take(lun, "s");
    const std::string disk = root + "/small", folder = disk + "/out";
    fs::create_directory(disk);
    run({"mount", "-t", "tmpfs", "-o", "size=40m", "none", disk});
    EXPECT_EQ(NORV_ERR_OUT_OF_SPACE, startExport(snapshot, folder)) << "known before";
    EXPECT_FALSE(exists(folder));

    run({"mount", "-o", "remount,size=60m", disk});
    const pid_t pid = heldExport(snapshot, folder);
    run({"fallocate", "-l", "12M", disk + "/filler"});
    goOn(pid);
    waitFor(snapshot);
    EXPECT_EQ(0u, progress(snapshot).find("18990002 ")) << progress(snapshot);
    EXPECT_FALSE(exists(folder));
    run({"umount", disk});

    exportTo(snapshot, elsewhere("out"));
    const _tag_iscsi_lun_ thin = filled("thin", 2, much);
    const size_t before = digest(dataPath(thin));
    struct statvfs volume_status;
    ASSERT_EQ(0, statvfs(volume.c_str(), &volume_status));
    const uint64_t room = volume_status.f_bavail * volume_status.f_bsize;
    run({"fallocate", "-l", std::to_string(room - 20 * MiB), volume + "/filler"});
    ASSERT_EQ(0, NORViSCSILunImport(&thin, elsewhere("out").c_str())) << iscsi_host_last_error();
    waitFor(thin);
    EXPECT_EQ(0u, progress(thin).find("18990002 ")) << progress(thin);
    EXPECT_EQ(before, digest(dataPath(thin)));
    fs::remove(volume + "/filler");
    expectConsistent();
}

TEST_F(TransferTest, KilledWorkersLeaveNothingThatTheNextCommandDoesNotPutRight)
{
    constexpr uint64_t lun_size = 48 * MiB;
    const _tag_iscsi_lun_ lun = filled("a", 1, lun_size, dense);
    const _tag_iscsi_snapshot_ snapshot = take(lun, "s");
    const _tag_iscsi_lun_ target = filled("target", 2, lun_size);
    const std::string source = elsewhere("source"), folder = elsewhere("out");
    exportTo(snapshot, source);
    const size_t exported = digest(source + "/export.data"), old = digest(dataPath(target));

    std::mt19937 random(std::random_device{}());
    int interrupted = 0;
    unsigned longest_us = 10000; // finds the time that a worker takes
    for (int round = 0; interrupted < 40 && round < 400 && !HasFailure(); ++round) {
        SCOPED_TRACE("round " + std::to_string(round));
        const bool exports = round % 2 == 0;
        const pid_t pid = exports ? heldExport(snapshot, folder) : heldImport(target, source);
        ASSERT_LT(0, pid); // 0 would be all of us
        goOn(pid);
        usleep(static_cast<useconds_t>(random() % longest_us));
        kill(pid, SIGKILL);
        waitFor(snapshot);
        waitFor(target);
        const bool was_interrupted =
            exports ? !exists(folder + "/export.record") : progress(target).rfind("0 ", 0) != 0;
        interrupted += was_interrupted;
        longest_us = std::max(100u, longest_us * (was_interrupted ? 11 : 9) / 10);
        if (exports) {
            EXPECT_EQ(NORV_ERR_NOT_EXPORTING, NORViSCSISnapshotExportCancel(&snapshot)) << "a next command";
            EXPECT_EQ(exists(folder), exists(folder + "/export.record"));
            EXPECT_EQ(std::string::npos, progress(snapshot).find("18990590")) << progress(snapshot);
            if (exists(folder)) {
                EXPECT_EQ(exported, digest(folder + "/export.data"));
            }
            fs::remove_all(folder);
        } else {
            EXPECT_EQ(0, update(target, "target", lun_size)) << iscsi_host_last_error();
            const size_t now = digest(dataPath(target));
            EXPECT_TRUE(now == old || now == exported);
            EXPECT_EQ(std::string::npos, progress(target).find("18990591")) << progress(target);
        }
        expectConsistent();
    }
    EXPECT_LT(0, interrupted);
    exportTo(snapshot, folder);
    importInto(target, folder);
    EXPECT_EQ(exported, digest(dataPath(target)));
}

/// The caller is killed while it prepares, so that there is a worker already or never will be.
TEST_F(TransferTest, CallersKilledAtEverySystemCall)
{
    const _tag_iscsi_lun_ lun = filled("a", 1, MiB);
    const _tag_iscsi_snapshot_ snapshot = take(lun, "s");
    const std::string source = elsewhere("source"), folder = elsewhere("out");
    exportTo(snapshot, source);
    for (const bool exports : {true, false}) {
        SCOPED_TRACE(exports ? "export" : "import");
        const auto start = [&] {
            return exports ? startExport(snapshot, folder) : NORViSCSILunImport(&lun, source.c_str());
        };
        killAtEverySystemCall(50, closeDatabase, start, [&] {
            waitFor(snapshot);
            waitFor(lun);
            EXPECT_EQ(exports ? NORV_ERR_NOT_EXPORTING : NORV_ERR_NOT_IMPORTING,
                      exports ? NORViSCSISnapshotExportCancel(&snapshot) : NORViSCSILunImportCancel(&lun));
            EXPECT_EQ(std::string::npos, progress(snapshot).find("18990590")) << progress(snapshot);
            EXPECT_EQ(std::string::npos, progress(lun).find("18990591")) << progress(lun);
            EXPECT_TRUE(!exists(folder) || exists(folder + "/export.record") || fs::is_empty(folder));
            EXPECT_EQ(digest(snapshotDataPath(snapshot)), digest(dataPath(lun)));
            expectConsistent();
            fs::remove_all(folder);
        });
    }
}

/// The boot sweep does it where no next command comes, and touches nothing else.
TEST_F(TransferTest, TheSweepRemovesHalfExports)
{
    const _tag_iscsi_snapshot_ snapshot = take(filled("a", 1, much, dense), "s");
    const std::string folder = elsewhere("out");
    fs::create_directory(folder);
    store(folder + "/notes", "somebody's");
    const pid_t pid = heldExport(snapshot, folder);
    ASSERT_LT(0, pid);
    EXPECT_EQ(0, kill(pid, SIGKILL));
    waitFor(snapshot);
    EXPECT_TRUE(exists(folder + "/export.data"));
    _tag_iscsi_export_config_ config;
    EXPECT_EQ(NORV_ERR_FILE_NOT_FOUND, NORViSCSISnapshotExportConfigGet(folder.c_str(), &config));
    iscsihost::SweepReport report;
    EXPECT_EQ(0, iscsihost::sweep(report)) << iscsi_host_last_error();
    EXPECT_FALSE(exists(folder + "/export.data"));
    EXPECT_EQ("somebody's", text(folder + "/notes"));
    EXPECT_EQ("none", progress(snapshot));
    exportTo(snapshot, folder);
}

} // namespace
} // namespace norvhost
