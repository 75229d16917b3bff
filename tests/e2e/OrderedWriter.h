/// A writer by whose traces one sees of which time a copy of its LUN is.
#pragma once

#include "tests/e2e/Initiator.h"

#include <atomic>
#include <cstring>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <iscsi/scsi-lowlevel.h>
#include <string>
#include <thread>
#include <unistd.h>

namespace e2e {

/// Writes ascending numbers, each to the first block and, when that was acknowledged, to the last one.
class OrderedWriter {
public:
    OrderedWriter(const std::string &target, uint64_t size) : initiator(alice), last_block(size / block_size - 1)
    {
        iscsi_set_noautoreconnect(initiator.get(), 1);
        connected = initiator.logIn(target);
        thread = std::thread([this] {
            while (connected && !stopping && !failed && write(0, number + 1) && write(last_block, number + 1))
                ++number;
        });
    }
    ~OrderedWriter()
    {
        stopping = true;
        thread.join();
    }

    std::atomic<bool> connected{false}, failed{false};
    std::atomic<uint64_t> number{0};

private:
    bool write(uint64_t block, uint64_t value)
    {
        unsigned char data[block_size] = {};
        memcpy(data, &value, sizeof value);
        scsi_task *const task =
            iscsi_write16_sync(initiator.get(), 1, block, data, sizeof data, block_size, 0, 0, 0, 0, 0);
        failed = !task || task->status != SCSI_STATUS_GOOD;
        if (task)
            scsi_free_scsi_task(task);
        return !failed;
    }

    Initiator initiator;
    const uint64_t last_block;
    std::atomic<bool> stopping{false};
    std::thread thread;
};

/// The number that such a writer left at a place of the LUN's file.
inline uint64_t numberAt(const std::string &path, uint64_t at)
{
    uint64_t number = 0;
    const int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
    EXPECT_EQ(pread(fd, &number, sizeof number, static_cast<off_t>(at)), static_cast<ssize_t>(sizeof number));
    close(fd);
    return number;
}

} // namespace e2e
