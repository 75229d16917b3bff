/// Sinks, and sending to them.
#include "tests/e2e/Appliance.h"
#include "tests/e2e/Initiator.h"

#include "host/core/FileDescriptor.h"
#include "host/core/Process.h"
#include "host/services/Identity.h"
#include "host/state/Database.h"
#include "host/storage/LunStore.h"
#include "host/storage/MapFile.h"
#include "host/target/Service.h"
#include "host/target/Sinks.h"
#include "host/target/Wait.h"
#include "host/transfer/Sending.h"
#include "iscsihost/sink.h"
#include "platform/error.h"
#include "platform/extent_pool.h"

#include <csignal>
#include <cstring>
#include <fcntl.h>
#include <fstream>
#include <random>
#include <sys/stat.h>
#include <unistd.h>

namespace e2e {
namespace {

using namespace std::chrono_literals;
using norvhost::IscsiUnit;

std::string readFile(const std::string &path)
{
    std::ifstream file(path, std::ios::binary | std::ios::ate);
    std::string text(static_cast<size_t>(std::max<std::streamoff>(file.tellg(), 0)), '\0');
    file.seekg(0).read(text.data(), static_cast<std::streamsize>(text.size()));
    return text;
}

std::string randomText(size_t size, unsigned seed)
{
    std::mt19937_64 engine(seed);
    std::string text(size, '\0');
    for (size_t at = 0; at < size; at += sizeof(uint64_t)) {
        const uint64_t number = engine();
        memcpy(&text[at], &number, sizeof number);
    }
    return text;
}

/// Bytes that a file takes on its volume.
uint64_t allocated(const std::string &path)
{
    struct stat status = {};
    EXPECT_EQ(stat(path.c_str(), &status), 0) << path;
    return static_cast<uint64_t>(status.st_blocks) * 512;
}

class SinkTest : public Appliance {
protected:
    void SetUp() override
    {
        Appliance::SetUp();
        ASSERT_EQ(norvhost::makeIdentity(), 0) << iscsi_host_last_error();
        ASSERT_EQ(iscsihost::createVolume(root + "/xfs", 2000 * MiB, root + "/image"), 0) << iscsi_host_last_error();
        source = create("source", NORV_LUN_TYPE_ADV);
        sink = create("sink", NORV_LUN_TYPE_SINK);
    }

    void TearDown() override
    {
        EXPECT_EQ(norvhost::stopService(), 0) << iscsi_host_last_error();
        norvhost::ProgramResult result;
        EXPECT_EQ(norvhost::runProgram({{"umount", root + "/xfs"}, {}, 10}, result), 0);
        EXPECT_EQ(result.status, 0) << result.errors;
    }

    _tag_iscsi_lun_ create(const std::string &name, int type, uint64_t size = 256 * MiB)
    {
        _tag_iscsi_lun_ lun = {};
        lun.type = type;
        lun.size = size;
        setText(lun.name, name);
        setText(lun.location, root + "/xfs");
        EXPECT_EQ(NORViSCSILunCreate(&lun), 0) << iscsi_host_last_error();
        return lun;
    }

    static void put(const _tag_iscsi_lun_ &lun, uint64_t at, const std::string &data)
    {
        const int fd = open(norvhost::dataPath(lun).c_str(), O_WRONLY | O_CLOEXEC);
        EXPECT_EQ(pwrite(fd, data.data(), data.size(), static_cast<off_t>(at)), static_cast<ssize_t>(data.size()));
        EXPECT_EQ(fsync(fd), 0);
        close(fd);
    }

    static std::string contents(const _tag_iscsi_lun_ &lun) { return readFile(norvhost::dataPath(lun)); }

    iscsihost::Sink openSink()
    {
        iscsihost::Sink opened;
        EXPECT_EQ(iscsihost::openSink(sink.uuid, opened), 0) << iscsi_host_last_error();
        return opened;
    }

    static int type(const _tag_iscsi_lun_ &lun)
    {
        norvhost::LunRow row;
        EXPECT_EQ(norvhost::loadLunByLid(lun.lid, row), 0);
        return row.record.type;
    }

    norvhost::SinkLogIn logIn() const
    {
        char key[256] = {};
        EXPECT_EQ(NORVExtentPoolRODKeyGet(key, sizeof key), 0);
        return norvhost::sinkLogIn(key, sink.uuid);
    }

    IscsiUnit unit(const iscsihost::Sink &opened) const
    {
        const norvhost::SinkLogIn log_in = logIn();
        return {"127.0.0.1:3261", opened.iqn,    opened.lun,         log_in.initiator,
                log_in.user,      log_in.secret, log_in.mutual_user, log_in.mutual_secret};
    }

    /// Sends the whole source.
    int send(const IscsiUnit &to, bool to_zeros, const std::function<int(uint64_t)> &progress = nullptr)
    {
        const norvhost::FileDescriptor from(open(norvhost::dataPath(source).c_str(), O_RDONLY | O_CLOEXEC));
        norvhost::Sending sending;
        sending.to = to;
        sending.from = from.get();
        sending.next = norvhost::fileRanges(from.get(), 0, source.size);
        sending.to_zeros = to_zeros;
        sending.progress = progress;
        return norvhost::sendRanges(sending);
    }

    _tag_iscsi_lun_ source = {}, sink = {};
};

TEST_F(SinkTest, TakesAllDataAndKeepsHoles)
{
    put(source, 0, randomText(3 * MiB, 1));
    put(source, 64 * MiB + 512, randomText(MiB + 1024, 2));
    put(source, 100 * MiB, std::string(2 * MiB, '\0'));
    put(source, source.size - 512, randomText(512, 3));
    const iscsihost::Sink opened = openSink();
    EXPECT_TRUE(opened.blank);
    EXPECT_EQ(opened.size, sink.size);
    uint64_t moved = 0;
    ASSERT_EQ(send(unit(opened), opened.blank, [&](uint64_t now) { return moved = now, 0; }), 0)
        << iscsi_host_last_error();
    EXPECT_GE(moved, 6 * MiB);
    EXPECT_LT(moved, 7 * MiB);
    EXPECT_EQ(contents(sink), contents(source));
    EXPECT_LE(allocated(norvhost::dataPath(sink)), 5 * MiB) << "zeros take no space";

    // Into a sink that holds something else: what is a hole here becomes one there.
    put(sink, 32 * MiB, randomText(8 * MiB, 4));
    put(sink, 200 * MiB, randomText(8 * MiB, 5));
    const iscsihost::Sink again = openSink();
    EXPECT_FALSE(again.blank);
    ASSERT_EQ(send(unit(again), again.blank), 0) << iscsi_host_last_error();
    EXPECT_EQ(contents(sink), contents(source));
    EXPECT_LE(allocated(norvhost::dataPath(sink)), 5 * MiB);

    EXPECT_EQ(iscsihost::closeSink(sink.uuid, again.iqn, true), 0) << iscsi_host_last_error();
    EXPECT_EQ(type(sink), NORV_LUN_TYPE_ADV);
}

} // namespace
} // namespace e2e
