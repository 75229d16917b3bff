/// LUNs with known data on a file system that shares blocks between files.
#pragma once

#include "HostTest.h"

#include "platform/iscsi_snapshot.h"

#include <string>
#include <vector>

namespace norvhost {

class SnapshotTest : public HostTest {
protected:
    /// Mounts an XFS made by the code under test, as `volume`.
    void SetUp() override;
    void TearDown() override;

    std::string memory; ///< a folder that costs no waiting for a disk

    /// An extent-pool LUN with writeData().
    _tag_iscsi_lun_ filled(const std::string &name, int seed, uint64_t size = 4 * MiB, uint64_t distance = 65536);

    /// Takes a snapshot; the test fails when that fails.
    _tag_iscsi_snapshot_ take(const _tag_iscsi_lun_ &lun, const std::string &name);
    int tryTake(const _tag_iscsi_lun_ &lun, const std::string &name);
    _tag_iscsi_snapshot_ reload(const _tag_iscsi_snapshot_ &snapshot);
    using HostTest::reload;

    /// By the platform's listing; lid 0 for all LUNs.
    std::vector<_tag_iscsi_snapshot_> list(int lid = 0);

    int cloneSnapshot(const _tag_iscsi_snapshot_ &snapshot, const std::string &name, _tag_iscsi_lun_ &clone);
    int cloneLun(const _tag_iscsi_lun_ &source, const std::string &name, _tag_iscsi_lun_ &clone);

    /// The snapshot folders of the volume and those that the store's rows name.
    std::set<std::string> snapshotFolders();
    std::set<std::string> namedSnapshotFolders();

    /// As HostTest's, and the same of snapshots.
    void expectConsistent();
};

/// 4 KiB that the seed decides, in such distances.
void writeData(const std::string &path, int seed, uint64_t size, uint64_t distance = 65536);
/// Of everything in the file.
size_t digest(const std::string &path);
std::string read(const std::string &path, off_t at, size_t length);
void write(const std::string &path, off_t at, const std::string &text);

} // namespace norvhost
