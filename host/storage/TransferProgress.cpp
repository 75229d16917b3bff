#include "host/storage/TransferProgress.h"

#include "host/core/LastError.h"
#include "host/core/Paths.h"
#include "platform/error.h"
#include "platform/iscsi_snapshot.h"

#include <cerrno>
#include <cstdio>
#include <fcntl.h>
#include <sys/stat.h>
#include <syslog.h>

namespace norvhost {
namespace {

constexpr auto telling_interval = std::chrono::milliseconds(200);

} // namespace

std::string progressFileName(const TransferId &id)
{
    const std::string lun = "L" + std::to_string(id.lid);
    return id.isExport() ? lun + "_S" + std::to_string(id.snap_id) + ".export_progress" : lun + ".import_progress";
}

bool parseProgressFileName(std::string_view name, TransferId &id)
{
    TransferId parsed;
    const std::string text(name);
    if (sscanf(text.c_str(), "L%4d_S%3d", &parsed.lid, &parsed.snap_id) < 1 || progressFileName(parsed) != name ||
        parsed.lid < 1 || parsed.snap_id < 0)
        return false;
    id = parsed;
    return true;
}

int openProgressFolder(FileDescriptor &folder)
{
    const std::string path = progressFolder();
    if (mkdir(path.c_str(), 0755) != 0 && errno != EEXIST)
        return failErrno(NORV_ERR_MAKE_DIRECTORY, errno, "cannot make the folder %s", path.c_str());
    FileDescriptor opened(open(path.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    if (!opened && (errno == ELOOP || errno == ENOTDIR))
        return fail(NORV_ERR_NO_PERMISSION, "%s is no folder of ours", path.c_str());
    struct stat status;
    if (!opened || fstat(opened.get(), &status) != 0)
        return failErrno(NORV_ERR_OPEN_FILE, errno, "cannot open the folder %s", path.c_str());
    if (status.st_uid != geteuid() || status.st_mode & (S_IWGRP | S_IWOTH))
        return fail(NORV_ERR_NO_PERMISSION, "%s is not ours alone: others could put progress files into it",
                    path.c_str());
    folder = std::move(opened);
    return 0;
}

int TransferProgress::begin(const TransferId &id, uint64_t total)
{
    if (int err = openProgressFolder(folder))
        return err;
    name = progressFileName(id);
    running_step = id.isExport() ? NORV_ERR_EXPORTING : NORV_ERR_IMPORTING;
    total_bytes = total;
    return write(running_step);
}

void TransferProgress::tell(uint64_t done)
{
    done_bytes = done;
    const auto now = std::chrono::steady_clock::now();
    if (now - told < telling_interval)
        return;
    told = now;
    write(running_step); // display only
}

void TransferProgress::finish(int code)
{
    if (code == 0)
        done_bytes = total_bytes;
    if (write(code) != 0)
        syslog(LOG_WARNING, "%s", lastError());
}

void TransferProgress::remove()
{
    if (folder)
        unlinkat(folder.get(), name.c_str(), 0);
}

int TransferProgress::write(int step)
{
    char text[128];
    const int length =
        snprintf(text, sizeof text, "step=%d\ndone_bytes=%llu\ntotal_bytes=%llu\n", step,
                 static_cast<unsigned long long>(done_bytes), static_cast<unsigned long long>(total_bytes));
    const std::string next = "." + name + ".next";
    unlinkat(folder.get(), next.c_str(), 0);
    const FileDescriptor file(
        openat(folder.get(), next.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0644));
    if (!file || ::write(file.get(), text, static_cast<size_t>(length)) != length ||
        renameat(folder.get(), next.c_str(), folder.get(), name.c_str()) != 0)
        return failErrno(NORV_ERR_WRITE_FILE, errno, "cannot write the progress file %s", name.c_str());
    return 0;
}

} // namespace norvhost
