// sequential_write URL FILE: writes the file to the unit as dd would, through libiscsi: 256 KiB at a time, 64 under way
// at once, a flush at the end. The session is set up as the sender of a remote clone sets up its own. Prints the
// seconds from log-in to flush.
#include <chrono>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <fcntl.h>
#include <iscsi/iscsi.h>
#include <iscsi/scsi-lowlevel.h>
#include <poll.h>
#include <unistd.h>
#include <vector>

namespace {

constexpr size_t request_size = 256 << 10, requests_max = 64, block_size = 512;

[[noreturn]] void die(const char *what, iscsi_context *iscsi)
{
    fprintf(stderr, "sequential_write: %s: %s\n", what, iscsi ? iscsi_get_error(iscsi) : "");
    exit(1);
}

struct Writer {
    iscsi_context *iscsi;
    int lun, file;
    off_t offset = 0;
    size_t under_way = 0;
    bool at_end = false;
};

struct Request {
    Writer *writer;
    std::vector<unsigned char> data;
};

void next(Request &request);

void written(iscsi_context *iscsi, int status, void *task, void *data)
{
    Request &request = *static_cast<Request *>(data);
    if (status != SCSI_STATUS_GOOD)
        die("write", iscsi);
    scsi_free_scsi_task(static_cast<scsi_task *>(task));
    --request.writer->under_way;
    next(request);
}

void next(Request &request)
{
    Writer &writer = *request.writer;
    const ssize_t got = pread(writer.file, request.data.data(), request_size, writer.offset);
    if (got <= 0) {
        writer.at_end = true;
        return;
    }
    if (!iscsi_write16_task(writer.iscsi, writer.lun, static_cast<uint64_t>(writer.offset) / block_size,
                            request.data.data(), static_cast<uint32_t>(got), block_size, 0, 0, 0, 0, 0, written,
                            &request))
        die("write", writer.iscsi);
    writer.offset += got;
    ++writer.under_way;
}

} // namespace

int main(int argc, char **argv)
{
    if (argc != 3)
        return fprintf(stderr, "usage: sequential_write URL FILE\n"), 2;
    const auto start = std::chrono::steady_clock::now();
    iscsi_context *iscsi = iscsi_create_context("iqn.2026-01.com.example:bench");
    const iscsi_url *url = iscsi_parse_full_url(iscsi, argv[1]);
    Writer writer = {iscsi, url ? url->lun : 0, open(argv[2], O_RDONLY | O_CLOEXEC)};
    if (!url || writer.file < 0)
        die("no such URL or file", iscsi);
    posix_fadvise(writer.file, 0, 0, POSIX_FADV_SEQUENTIAL);
    iscsi_set_session_type(iscsi, ISCSI_SESSION_NORMAL);
    iscsi_set_targetname(iscsi, url->target);
    iscsi_set_header_digest(iscsi, ISCSI_HEADER_DIGEST_NONE);
    iscsi_set_initial_r2t(iscsi, ISCSI_INITIAL_R2T_NO);
    iscsi_set_immediate_data(iscsi, ISCSI_IMMEDIATE_DATA_YES);
    if (iscsi_full_connect_sync(iscsi, url->portal, url->lun) != 0)
        die("log-in", iscsi);

    std::vector<Request> requests(requests_max);
    for (Request &request : requests) {
        request.writer = &writer;
        request.data.resize(request_size);
        next(request);
    }
    while (!writer.at_end || writer.under_way) {
        pollfd connection = {iscsi_get_fd(iscsi), static_cast<short>(iscsi_which_events(iscsi)), 0};
        poll(&connection, 1, 1000);
        if (iscsi_service(iscsi, connection.revents) != 0)
            die("connection", iscsi);
    }
    scsi_task *flushed = iscsi_synchronizecache16_sync(iscsi, writer.lun, 0, 0, 0, 0);
    if (!flushed || flushed->status != SCSI_STATUS_GOOD)
        die("flush", iscsi);
    scsi_free_scsi_task(flushed);
    printf("%f\n", std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count());
    iscsi_logout_sync(iscsi);
    iscsi_destroy_context(iscsi);
    return 0;
}
