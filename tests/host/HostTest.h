/// A state store, a run folder and a volume of its own for each test, all below one temporary folder.
#pragma once

#include "host/storage/LunStore.h"
#include "host/storage/MapFile.h"
#include "iscsihost/host.h"
#include "platform/error.h"
#include "platform/iscsi_lun.h"

#include <cstdlib>
#include <ctime>
#include <functional>
#include <gtest/gtest.h>
#include <set>
#include <string>
#include <sys/types.h>
#include <vector>

namespace norvhost {

constexpr uint64_t MiB = 1 << 20;

class HostTest : public testing::Test {
protected:
    HostTest();
    ~HostTest() override;

    std::string root;   ///< the temporary folder
    std::string volume; ///< root + "/vol", registered

    /// A creation request.
    _tag_iscsi_lun_ wanted(const std::string &name, int type = NORV_LUN_TYPE_THIN, uint64_t size = 4 * MiB);

    /// Creates the LUN; the test fails when that fails.
    _tag_iscsi_lun_ create(const std::string &name, int type = NORV_LUN_TYPE_THIN, uint64_t size = 4 * MiB);

    /// The LUN as the store has it.
    _tag_iscsi_lun_ reload(const _tag_iscsi_lun_ &lun);
    int update(const _tag_iscsi_lun_ &lun, const std::string &name, uint64_t size);
    std::string health(const _tag_iscsi_lun_ &lun);
    void map(const _tag_iscsi_lun_ &lun);

    /// Runs a program that must succeed; returns the last line of its output.
    static std::string run(std::vector<std::string> arguments);
    /// Leaves no block for data and none for another file; the blocks are those of the file "fill".
    static void fillDisk(const std::string &folder);

    /// Every file of the volume, in its LUN folders.
    std::set<std::string> files();
    /// Those that the store's rows name.
    std::set<std::string> namedFiles();
    /// The files are those that the rows name, every LUN is healthy and nothing is locked.
    void expectConsistent();
};

/// A time zone, as long as it lives.
struct Zone {
    explicit Zone(const char *name)
    {
        setenv("TZ", name, 1);
        tzset();
    }
    ~Zone()
    {
        unsetenv("TZ");
        tzset();
    }
};

/// Runs the function in a process of its own, which exits with its result.
pid_t inChild(const std::function<int()> &work);
/// Its exit status, 128 + n when signal n ended it.
int waitForChild(pid_t child);
/// Runs the function, which gets its number, in so many processes at once; returns the sum of their exit statuses.
int inChildren(int count, const std::function<int(int)> &work);

bool exists(const std::string &path);
void setName(_tag_iscsi_lun_ &lun, const std::string &name);

/// Fails the test that needs root instead of skipping it.
#define NEED_ROOT() ASSERT_EQ(0u, geteuid()) << "this test mounts loop devices or changes owners: run it as root"

} // namespace norvhost
