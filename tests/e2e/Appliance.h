/// One appliance in namespaces of its own, driven through the platform's functions.
#pragma once

#include "host/target/Tgtd.h"
#include "platform/iscsi_lun.h"
#include "platform/iscsi_masking.h"
#include "platform/iscsi_target.h"

#include <chrono>
#include <cstring>
#include <functional>
#include <gtest/gtest.h>
#include <string>
#include <sys/types.h>
#include <vector>

namespace e2e {

constexpr uint64_t MiB = 1 << 20;

/// What takes longer hangs: a busy machine may take its time.
constexpr std::chrono::seconds hang_limit(60);

/// Initiator names.
extern const std::string alice, bob, mallory;

/// Fills a text field of a record.
template <size_t size>
void setText(char (&field)[size], const std::string &text)
{
    memset(field, 0, size);
    text.copy(field, size - 1);
}

/// A test's appliance: empty, its service running, gone at the test's end.
class Appliance : public testing::Test {
protected:
    Appliance();
    ~Appliance() override;
    void SetUp() override;

    std::string root;   ///< the temporary folder with state, run folder and volumes
    std::string volume; ///< where LUNs are made

    /// LUNs are made on an XFS from now on, which shares blocks.
    void useXfs(uint64_t size);

    _tag_iscsi_lun_ createLun(const std::string &name, uint64_t size = 16 * MiB, int type = NORV_LUN_TYPE_THIN) const;
    /// "iqn.2026-01.example:" and the name.
    static std::string iqn(const std::string &name);
    static _tag_iscsi_target_ request(const std::string &name);
    /// Created and enabled, with no masking.
    static _tag_iscsi_target_ createTarget(const std::string &name);
    static void map(const _tag_iscsi_lun_ &lun, const std::vector<int> &tids);
    static int unmap(const _tag_iscsi_lun_ &lun, const std::vector<int> &tids);
    static void mask(int tid, const std::string &initiator, int permission);
    static void unmask(int tid, const std::string &initiator);
    static void setDefault(const _tag_iscsi_target_ &target, int permission);
    static int grow(const _tag_iscsi_lun_ &lun, uint64_t size);

    /// A target with one LUN, number 1, that alice may write and bob may read.
    struct Store {
        _tag_iscsi_target_ target;
        _tag_iscsi_lun_ lun;
    };
    Store createStore(uint64_t size = 16 * MiB, int type = NORV_LUN_TYPE_THIN) const;

    static const norvhost::Tgtd rw, ro;
    static norvhost::TgtdTarget shown(const norvhost::Tgtd &daemon, int tid);

    /// Kills a process and waits until it is gone.
    static void killProcess(pid_t pid);
    static pid_t portalProcess();

    /// Runs the function in a process of its own, which exits with its result.
    static pid_t inChild(const std::function<int()> &work);
    static int waitForChild(pid_t child);
};

} // namespace e2e
