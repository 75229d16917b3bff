#include "HostTest.h"

#include "host/core/Lock.h"
#include "host/core/Process.h"
#include "host/state/Database.h"
#include "host/storage/DataFile.h"

#include <cstdio>
#include <cstdlib>
#include <fcntl.h>
#include <filesystem>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace norvhost {

HostTest::HostTest()
{
    char name[] = "/tmp/host-tests-XXXXXX";
    root = mkdtemp(name);
    volume = root + "/vol";
    mkdir(volume.c_str(), 0700);
    setenv("ISCSI_HOST_STATE", (root + "/state").c_str(), 1);
    setenv("ISCSI_HOST_RUN", (root + "/run").c_str(), 1);
    setenv("ISCSI_HOST_PROGRESS", (root + "/progress").c_str(), 1);
    EXPECT_EQ(0, iscsihost::addVolume(volume)) << iscsi_host_last_error();
}

HostTest::~HostTest()
{
    closeDatabase();
    std::error_code ignored;
    std::filesystem::remove_all(root, ignored);
}

_tag_iscsi_lun_ HostTest::wanted(const std::string &name, int type, uint64_t size)
{
    _tag_iscsi_lun_ lun = {};
    setName(lun, name);
    snprintf(lun.location, sizeof lun.location, "%s", volume.c_str());
    lun.type = type;
    lun.size = size;
    return lun;
}

_tag_iscsi_lun_ HostTest::create(const std::string &name, int type, uint64_t size)
{
    _tag_iscsi_lun_ lun = wanted(name, type, size);
    EXPECT_EQ(0, NORViSCSILunCreate(&lun)) << iscsi_host_last_error();
    return lun;
}

_tag_iscsi_lun_ HostTest::reload(const _tag_iscsi_lun_ &lun)
{
    _tag_iscsi_lun_ loaded = {};
    EXPECT_EQ(0, NORViSCSILunConfigGetByUUID(lun.uuid, &loaded, 0)) << iscsi_host_last_error();
    return loaded;
}

int HostTest::update(const _tag_iscsi_lun_ &lun, const std::string &name, uint64_t size)
{
    _tag_iscsi_lun_ changed = lun;
    setName(changed, name);
    changed.size = size;
    return NORViSCSILunUpdate(&changed);
}

std::string HostTest::health(const _tag_iscsi_lun_ &lun)
{
    _tag_iscsi_family_ family = {};
    EXPECT_EQ(0, NORViSCSIFamilyConfGetByLID(lun.lid, &family)) << iscsi_host_last_error();
    return family.status;
}

void HostTest::map(const _tag_iscsi_lun_ &lun)
{
    // The row alone: no daemon runs here.
    Query target("INSERT INTO targets (tid, name, iqn, enabled, max_recv_seg_bytes, max_send_seg_bytes, max_sessions, "
                 "auth_type) VALUES (1, 't', 'iqn.2020-01.test:t', 0, 262144, 262144, 1, 0)");
    EXPECT_EQ(0, target.run());
    Query mapping("INSERT INTO mappings VALUES (1, ?1, 1)");
    EXPECT_EQ(0, mapping.bind(lun.lid).run());
}

std::string HostTest::run(std::vector<std::string> arguments)
{
    ProgramRun program;
    program.arguments = std::move(arguments);
    ProgramResult result;
    EXPECT_EQ(0, runProgram(program, result)) << iscsi_host_last_error();
    EXPECT_EQ(0, result.status) << result.errors;
    return lastLine(result.output);
}

void HostTest::fillDisk(const std::string &folder)
{
    const int fd = open((folder + "/fill").c_str(), O_CREAT | O_WRONLY, 0600);
    ASSERT_LE(0, fd);
    for (off_t at = 0, length = off_t(MiB); length >= 4096;)
        if (fallocate(fd, 0, at, length) == 0)
            at += length;
        else
            length /= 2;
    close(fd);
    for (int i = 0;; ++i) {
        const int file = open((folder + "/inode" + std::to_string(i)).c_str(), O_CREAT | O_WRONLY | O_EXCL, 0600);
        if (file < 0)
            break;
        close(file);
    }
}

std::set<std::string> HostTest::files()
{
    std::set<std::string> found;
    for (const char *folder : {data_folder, trash_folder})
        if (exists(volume + "/" + folder))
            for (const auto &entry : std::filesystem::directory_iterator(volume + "/" + folder))
                if (!entry.is_directory())
                    found.insert(entry.path());
    return found;
}

std::set<std::string> HostTest::namedFiles()
{
    std::set<std::string> named;
    EXPECT_EQ(0, forEachLun([&](const LunRow &row) { named.insert(dataPath(row.record)); }));
    return named;
}

void HostTest::expectConsistent()
{
    EXPECT_EQ(namedFiles(), files());
    EXPECT_EQ(0, forEachLun([&](const LunRow &row) {
                  EXPECT_EQ(0, checkData(row.record)) << iscsi_host_last_error();
                  bool locked = true;
                  EXPECT_EQ(0, NORViSCSILunIsLocked(&row.record, &locked));
                  EXPECT_FALSE(locked) << row.record.lid;
              }));
}

pid_t inChild(const std::function<int()> &work)
{
    const pid_t child = fork();
    if (child == 0)
        _exit(work());
    return child;
}

int waitForChild(pid_t child)
{
    int status = 0;
    EXPECT_EQ(child, waitpid(child, &status, 0));
    return WIFSIGNALED(status) ? 128 + WTERMSIG(status) : WEXITSTATUS(status);
}

int inChildren(int count, const std::function<int(int)> &work)
{
    std::vector<pid_t> children;
    for (int number = 0; number < count; ++number)
        children.push_back(inChild([&] { return work(number); }));
    int sum = 0;
    for (const pid_t child : children)
        sum += waitForChild(child);
    return sum;
}

bool exists(const std::string &path)
{
    return access(path.c_str(), F_OK) == 0;
}

void setName(_tag_iscsi_lun_ &lun, const std::string &name)
{
    ASSERT_LT(name.size(), sizeof lun.name);
    snprintf(lun.name, sizeof lun.name, "%s", name.c_str());
}

} // namespace norvhost
