// How long one action of the library on a snapshot takes, in seconds, on standard output.
#include "iscsiwebapi/ISCSIErrorCode.h"
#include "iscsiwebapi/ISCSILIBLUN.h"
#include "iscsiwebapi/ISCSILIBReplication.h"

#include <chrono>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <functional>
#include <unistd.h>

using ISCSI::ISCSISnapshotInfo;
using ISCSI::LIB::LIBLUN::ISCSILIBLUN;
using ISCSI::LIB::LIBReplication::ISCSILIBReplication;

namespace {

/// Until the call returns: the snapshot's point in time is fixed then.
int take(const std::string &lun_name)
{
    std::string lun_uuid, uuid;
    int id = 0;
    if (int err = ISCSI::ISCSILUNInfo::GetUUIDByLUNName(lun_name, lun_uuid))
        return err;
    return ISCSILIBLUN(lun_uuid).takeSnapshot(false, false, "", "", "bench", time(nullptr), false, uuid, id);
}

/// Until the export is complete and flushed.
int exportTo(const std::string &selector, const std::string &folder)
{
    std::string uuid;
    if (int err = ISCSISnapshotInfo::GetSnapshotUUID(selector, uuid))
        return err;
    if (int err = ISCSILIBLUN().exportLUN(uuid, folder))
        return err;
    _tag_iscsi_snapshot_ snapshot{};
    if (int err = NORViSCSISnapshotConfGetByUUID(uuid.c_str(), &snapshot))
        return err;
    return NORViSCSISnapshotWaitUntilUnlock(&snapshot, 0);
}

/// Until it is known how much of the second snapshot a peer lacks that has the first.
int countUnsynced(const std::string &task, const std::string &base, const std::string &snapshot)
{
    ISCSILIBReplication replication(task);
    if (int err = replication.startToComputeUnsyncSize(base, snapshot))
        return err;
    unsigned long long size = 0;
    for (bool completed = false; !completed; usleep(1000))
        if (int err = replication.getCurrentUnsyncSize(size, completed))
            return err;
    return size > 0 ? 0 : ISCSI::ERR_DEFAULT_ERROR_CODE;
}

} // namespace

int main(int argc, char **argv)
{
    std::function<int()> work;
    if (argc == 3 && strcmp(argv[1], "take") == 0)
        work = [&] { return take(argv[2]); };
    else if (argc == 4 && strcmp(argv[1], "export") == 0)
        work = [&] { return exportTo(argv[2], argv[3]); };
    else if (argc == 5 && strcmp(argv[1], "count") == 0)
        work = [&] { return countUnsynced(argv[2], argv[3], argv[4]); };
    else
        return 2;
    const auto start = std::chrono::steady_clock::now();
    const int err = work();
    const std::chrono::duration<double> taken = std::chrono::steady_clock::now() - start;
    if (err) {
        fprintf(stderr, "error %d: %s\n", err, ISCSI::ErrorCodeToString(err));
        return 1;
    }
    printf("%.6f\n", taken.count());
}
