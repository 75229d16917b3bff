#include "host/transfer/Sending.h"

#include "host/core/LastError.h"
#include "host/core/LibIscsi.h"
#include "host/core/PipeSignalBlock.h"
#include "host/transfer/FileReader.h"

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstring>
#include <deque>
#include <fcntl.h>
#include <memory>
#include <poll.h>
#include <sys/mman.h>
#include <unistd.h>
#include <vector>

namespace norvhost {
namespace {

using Clock = std::chrono::steady_clock;
using namespace std::chrono_literals;

constexpr uint32_t block_size = 512;

/// Larger requests are slower: they leave the processor's cache between the steps.
constexpr size_t request_size = 256 << 10;
constexpr size_t commands_max = 64, reads_max = FileReader::most_at_once, requests_max = commands_max + reads_max;

/// Are left for a flush and for what unmaps.
constexpr size_t requests_spare = 2;

/// tgtd frees nothing for 4 GiB in one descriptor.
constexpr uint64_t unmap_max = 1 << 30;

constexpr auto login_limit = 15s, stall_limit = 60s, flush_limit = 600s, logout_limit = 2s;
constexpr auto progress_interval = 100ms;
constexpr int keepalive_seconds = 10, keepalive_count = 3;

/// What is written between two flushes, which make the unit's disk work along: the last one has little to wait for. On
/// a slow line time passes first.
constexpr uint64_t flush_step_first = 8 << 20, flush_step_max = 64 << 20;
constexpr auto flush_interval = 5s;

/// Commands that are begun before the connection is served again.
constexpr int issues_at_once = 8;
constexpr size_t planned_max = 64;

struct Destroy {
    void operator()(iscsi_context *iscsi) const { iscsi_destroy_context(iscsi); }
};

struct FreeTask {
    void operator()(scsi_task *task) const { scsi_free_scsi_task(task); }
};

class Buffers {
public:
    Buffers()
        : memory(mmap(nullptr, requests_max * request_size, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0))
    {
    }
    ~Buffers()
    {
        if (*this)
            munmap(memory, requests_max * request_size);
    }
    Buffers(const Buffers &) = delete;
    Buffers &operator=(const Buffers &) = delete;

    explicit operator bool() const { return memory != MAP_FAILED; }
    unsigned char *at(size_t i) const { return static_cast<unsigned char *>(memory) + i * request_size; }

private:
    void *memory;
};

/// A range, and the bytes of data in it: those that turn out to be zeros are data to whoever counts.
struct Piece : DataRange {
    uint64_t data = 0;
    struct Request *request = nullptr; ///< which reads it
};

class Sender;

/// A buffer's way: a part is read, then written by a command. A flush and zeros are commands alone.
struct Request {
    Sender *sender = nullptr;
    FileReader::Part part;
    Piece piece; ///< of the command
    bool flushes = false;
    bool under_way = false; ///< the command
};

bool isZero(const unsigned char *data, size_t size)
{
    return size == 0 || (data[0] == 0 && memcmp(data, data + 1, size - 1) == 0);
}

/// The errno value that says what a failed command means.
int meaning(int status, const scsi_task *task)
{
    constexpr int space_allocation_failed = 0x2707; // SPC-4, annex D
    if (status != SCSI_STATUS_CHECK_CONDITION || !task)
        return status == SCSI_STATUS_CANCELLED ? ECONNRESET : EIO;
    if (task->sense.key != SCSI_SENSE_DATA_PROTECTION)
        return EIO;
    return task->sense.ascq == space_allocation_failed ? ENOSPC : EROFS;
}

class Sender {
public:
    explicit Sender(const Sending &sending) : sending(sending), reader(sending.from) {}
    ~Sender()
    {
        ending = true;
        session.reset(); // commands under way end now, and tell us
    }
    Sender(const Sender &) = delete;
    Sender &operator=(const Sender &) = delete;

    int run();

private:
    int logIn();
    int checkUnit();
    int stream();
    int plan();
    void beginReads();
    int issue(bool &begun);
    int write(const Piece &piece);
    int unmapGathered(bool &begun);
    int beginFlush();
    uint64_t lowestOpenPlace() const;
    int began(Request *request, const scsi_task *task);
    int flush();
    void logOut();

    Request *takeIdle();
    void putBack(Request *request);
    void prepare(Request *request, const Piece &piece);
    /// Serves the connection once, for at most a tenth of a second, and not at all long when `busy`. It fails when
    /// nothing moved for the limit.
    int serve(bool busy, Clock::duration limit);
    int awaitAnswer(Clock::duration limit);
    int tell();
    int logInFailed(const std::string &text);

    static void connected(iscsi_context *, int status, void *, void *sender);
    static void answered(iscsi_context *, int status, void *task, void *sender);
    static void ended(iscsi_context *, int status, void *task, void *request);

    const Sending &sending;
    const Buffers buffers;
    std::vector<Request> requests;
    std::vector<Request *> idle;
    size_t commands = 0; ///< under way

    DataRange rest; ///< of the range that the source gave last
    bool source_ended = false;
    std::deque<Piece> planned; ///< what comes next
    size_t reads_begun = 0;    ///< of these; zeros need none
    Piece gathered;            ///< adjoining zeros, to be unmapped
    FileReader reader;

    uint64_t moved = 0, capacity = 0;
    uint64_t written = 0; ///< since the latest flush began
    uint64_t flush_step = flush_step_first;
    bool flushing = false;
    Clock::time_point last_movement, last_flush, last_told;
    bool answer_came = false, ending = false;
    int answer_status = 0, failure = 0;
    std::string answer_text;
    std::unique_ptr<iscsi_context, Destroy> session;
};

int Sender::run()
{
    if (!buffers)
        return fail(-ENOMEM, "no memory for sending");
    requests.resize(requests_max);
    for (size_t i = 0; i < requests_max; ++i) {
        requests[i].sender = this;
        requests[i].part.buffer = buffers.at(i);
        idle.push_back(&requests[i]);
    }
    for (const auto step : {&Sender::logIn, &Sender::checkUnit, &Sender::stream, &Sender::flush})
        if (int err = (this->*step)())
            return err;
    logOut();
    return sending.progress ? sending.progress(moved) : 0;
}

int Sender::logIn()
{
    const IscsiUnit &to = sending.to;
    session.reset(iscsi_create_context(to.initiator.c_str()));
    iscsi_context *const iscsi = session.get();
    if (!iscsi)
        return fail(-ENOMEM, "no memory for an iSCSI session");
    iscsi_set_session_type(iscsi, ISCSI_SESSION_NORMAL);
    iscsi_set_targetname(iscsi, to.target.c_str());
    iscsi_set_header_digest(iscsi, ISCSI_HEADER_DIGEST_NONE);
    // A request's data goes along with it, without asking.
    iscsi_set_initial_r2t(iscsi, ISCSI_INITIAL_R2T_NO);
    iscsi_set_immediate_data(iscsi, ISCSI_IMMEDIATE_DATA_YES);
    iscsi_set_noautoreconnect(iscsi, 1);
    iscsi_set_tcp_keepalive(iscsi, keepalive_seconds, keepalive_count, keepalive_seconds);
    iscsi_set_timeout(iscsi, 0); // a slow line is no failure: serve() sees when nothing moves
    if (!to.user.empty())
        iscsi_set_initiator_username_pwd(iscsi, to.user.c_str(), to.secret.c_str());
    if (!to.mutual_user.empty())
        iscsi_set_target_username_pwd(iscsi, to.mutual_user.c_str(), to.mutual_secret.c_str());

    answer_came = false;
    if (iscsi_full_connect_async(iscsi, to.portal.c_str(), to.lun, connected, this) != 0)
        return logInFailed(iscsi_get_error(iscsi));
    const int err = awaitAnswer(login_limit);
    if (answer_came && answer_status != SCSI_STATUS_GOOD)
        return logInFailed(answer_text);
    return err == -ECONNRESET ? logInFailed(iscsi_get_error(iscsi)) : err;
}

/// Which step failed is told by its text only.
int Sender::logInFailed(const std::string &text)
{
    const bool refused = text.find("log in to target") != text.npos;
    return fail(refused ? -EACCES : -ECONNREFUSED, "cannot log in to %s at %s: %s", sending.to.target.c_str(),
                sending.to.portal.c_str(), text.c_str());
}

int Sender::checkUnit()
{
    // The first answers after a log-in may be unit attentions.
    for (int tries = 0; tries < 3 && capacity == 0; ++tries) {
        answer_came = false;
        if (!iscsi_readcapacity16_task(session.get(), sending.to.lun, answered, this))
            return fail(-ENOMEM, "no memory for an iSCSI command");
        if (int err = awaitAnswer(login_limit))
            return err;
    }
    if (capacity == 0)
        return fail(-ENXIO, "the unit %d of %s tells no size: %s", sending.to.lun, sending.to.target.c_str(),
                    iscsi_get_error(session.get()));
    return 0;
}

int Sender::stream()
{
    last_movement = last_flush = Clock::now();
    for (;;) {
        if (int err = plan())
            return err;
        beginReads();
        if (planned.empty() && gathered.length == 0 && commands == 0)
            return 0;
        const bool flush_due = written >= flush_step || (written > 0 && Clock::now() - last_flush > flush_interval);
        if (!flushing && flush_due && !idle.empty())
            if (int err = beginFlush())
                return err;
        // In small portions: the connection is to be served meanwhile.
        bool busy = false, begun = true;
        for (int i = 0; i < issues_at_once && begun; ++i) {
            if (int err = issue(begun))
                return err;
            busy = busy || begun;
        }
        if (commands == 0)
            last_movement = Clock::now(); // the unit has nothing to answer
        if (int err = serve(busy, stall_limit))
            return err;
    }
}

int Sender::plan()
{
    while (planned.size() < planned_max) {
        if (rest.length == 0) {
            if (source_ended)
                return 0;
            DataRange range;
            if (int err = sending.next(range))
                return err;
            source_ended = range.length == 0;
            if (source_ended)
                return 0;
            rest = range;
            if (rest.offset % block_size || rest.length % block_size || rest.offset + rest.length > capacity)
                return fail(-ENXIO, "the unit %d of %s has %llu bytes: it is too small", sending.to.lun,
                            sending.to.target.c_str(), static_cast<unsigned long long>(capacity));
            continue;
        }
        Piece piece;
        piece.offset = rest.offset;
        piece.zeros = rest.zeros;
        piece.length = std::min<uint64_t>(rest.length, rest.zeros ? unmap_max : request_size);
        piece.data = rest.zeros ? 0 : piece.length;
        rest.offset += piece.length;
        rest.length -= piece.length;
        planned.push_back(piece);
    }
    return 0;
}

void Sender::beginReads()
{
    for (; reads_begun < planned.size(); ++reads_begun) {
        Piece &piece = planned[reads_begun];
        if (piece.zeros)
            continue;
        if (requests_max - idle.size() - commands >= reads_max || idle.size() <= requests_spare)
            return;
        piece.request = takeIdle();
        piece.request->part.offset = piece.offset;
        piece.request->part.length = piece.length;
        reader.begin(piece.request->part);
    }
}

/// Goes on with the next piece, which may begin a command. Nothing has `begun` when it has to wait for something.
int Sender::issue(bool &begun)
{
    begun = false;
    if (commands >= commands_max)
        return 0;
    if (planned.empty())
        return unmapGathered(begun);
    Piece &piece = planned.front();
    if (piece.request) {
        FileReader::Part &part = piece.request->part;
        if (FileReader::isUnderWay(part))
            return 0;
        if (int error = reader.take(part))
            return failErrno(-EIO, error, "cannot read what is to be sent");
        if (isZero(static_cast<unsigned char *>(part.buffer), part.length)) {
            piece.zeros = true;
            putBack(piece.request);
            piece.request = nullptr;
        }
    } else if (!piece.zeros) {
        return 0; // no buffer to read it into yet
    }
    if (piece.zeros && sending.to_zeros) {
        moved += piece.data;
    } else if (piece.zeros) {
        const bool adjoins = gathered.offset + gathered.length == piece.offset;
        if (gathered.length > 0 && (!adjoins || gathered.length + piece.length > unmap_max))
            return unmapGathered(begun);
        if (gathered.length == 0)
            gathered.offset = piece.offset;
        gathered.length += piece.length;
        gathered.data += piece.data;
    } else if (int err = write(piece)) {
        return err;
    }
    planned.pop_front();
    --reads_begun;
    begun = true;
    return 0;
}

int Sender::write(const Piece &piece)
{
    Request *const request = piece.request;
    prepare(request, piece);
    return began(request,
                 iscsi_write16_task(session.get(), sending.to.lun, piece.offset / block_size,
                                    static_cast<unsigned char *>(request->part.buffer),
                                    static_cast<uint32_t>(piece.length), block_size, 0, 0, 0, 0, 0, ended, request));
}

int Sender::unmapGathered(bool &begun)
{
    if (gathered.length == 0 || idle.empty())
        return 0;
    begun = true;
    unmap_list blocks = {};
    blocks.lba = gathered.offset / block_size;
    blocks.num = static_cast<uint32_t>(gathered.length / block_size);
    Request *const request = takeIdle();
    prepare(request, gathered);
    gathered = Piece();
    return began(request, iscsi_unmap_task(session.get(), sending.to.lun, 0, 0, &blocks, 1, ended, request));
}

Request *Sender::takeIdle()
{
    Request *const request = idle.back();
    idle.pop_back();
    return request;
}

void Sender::putBack(Request *request)
{
    idle.push_back(request);
}

/// For a command.
void Sender::prepare(Request *request, const Piece &piece)
{
    request->piece = piece;
    request->flushes = false;
    request->under_way = true;
    ++commands;
    written += piece.data;
}

int Sender::began(Request *request, const scsi_task *task)
{
    if (task)
        return 0;
    request->under_way = false;
    --commands;
    putBack(request);
    return fail(-ENOMEM, "cannot begin an iSCSI command: %s", iscsi_get_error(session.get()));
}

/// Below it everything was acknowledged.
uint64_t Sender::lowestOpenPlace() const
{
    uint64_t lowest = planned.empty() ? rest.offset : planned.front().offset;
    if (gathered.length > 0)
        lowest = std::min(lowest, gathered.offset);
    for (const Request &request : requests)
        if (request.under_way)
            lowest = std::min(lowest, request.piece.offset);
    return lowest;
}

int Sender::beginFlush()
{
    Piece place;
    place.offset = lowestOpenPlace();
    Request *const request = takeIdle();
    prepare(request, place);
    request->flushes = true;
    flushing = true;
    last_flush = Clock::now();
    flush_step = std::min(2 * flush_step, flush_step_max);
    written = 0;
    return began(request, iscsi_synchronizecache16_task(session.get(), sending.to.lun, 0, 0, 0, 0, ended, request));
}

int Sender::flush()
{
    answer_came = false;
    if (!iscsi_synchronizecache16_task(session.get(), sending.to.lun, 0, 0, 0, 0, answered, this))
        return fail(-ENOMEM, "cannot begin an iSCSI command: %s", iscsi_get_error(session.get()));
    if (int err = awaitAnswer(flush_limit))
        return err;
    return answer_status == SCSI_STATUS_GOOD ? 0
                                             : fail(-EIO, "%s could not flush what it got: %s",
                                                    sending.to.target.c_str(), iscsi_get_error(session.get()));
}

/// What was sent is safe: nothing that goes wrong here matters.
void Sender::logOut()
{
    answer_came = false;
    last_movement = Clock::now();
    if (iscsi_logout_async(session.get(), connected, this) == 0)
        while (!answer_came && serve(false, logout_limit) == 0)
            ;
}

int Sender::awaitAnswer(Clock::duration limit)
{
    last_movement = Clock::now();
    while (!answer_came)
        if (int err = serve(false, limit))
            return err;
    return 0;
}

int Sender::serve(bool busy, Clock::duration limit)
{
    iscsi_context *const iscsi = session.get();
    pollfd events[] = {{iscsi_get_fd(iscsi), static_cast<short>(iscsi_which_events(iscsi)), 0},
                       {reader.event(), POLLIN, 0}};
    poll(events, 2, busy ? 0 : static_cast<int>(progress_interval / 1ms));
    reader.collect();
    if (iscsi_service(iscsi, events[0].revents) != 0)
        return failure ? failure
                       : fail(-ECONNRESET, "the connection to %s broke: %s", sending.to.portal.c_str(),
                              iscsi_get_error(iscsi));
    if (failure)
        return failure;
    const auto now = Clock::now();
    if (now - last_movement > limit)
        return fail(-ETIMEDOUT, "%s does not answer", sending.to.portal.c_str());
    if (!sending.progress || now - last_told < progress_interval)
        return 0;
    last_told = now;
    return sending.progress(moved);
}

void Sender::connected(iscsi_context *iscsi, int status, void *, void *sender)
{
    Sender &self = *static_cast<Sender *>(sender);
    self.answer_came = true;
    self.answer_status = status;
    self.answer_text = iscsi_get_error(iscsi); // of now: what follows brings texts of its own
}

void Sender::answered(iscsi_context *, int status, void *data, void *sender)
{
    Sender &self = *static_cast<Sender *>(sender);
    const std::unique_ptr<scsi_task, FreeTask> task(static_cast<scsi_task *>(data));
    self.answer_came = true;
    self.answer_status = status;
    if (status != SCSI_STATUS_GOOD || !task || task->cdb[0] != SCSI_OPCODE_SERVICE_ACTION_IN)
        return;
    const auto *size = static_cast<const scsi_readcapacity16 *>(scsi_datain_unmarshall(task.get()));
    if (size && size->block_length == block_size)
        self.capacity = (size->returned_lba + 1) * block_size;
}

void Sender::ended(iscsi_context *iscsi, int status, void *data, void *request)
{
    Request &mine = *static_cast<Request *>(request);
    Sender &self = *mine.sender;
    const std::unique_ptr<scsi_task, FreeTask> task(static_cast<scsi_task *>(data));
    self.putBack(&mine);
    --self.commands;
    mine.under_way = false;
    self.last_movement = Clock::now();
    if (mine.flushes)
        self.flushing = false;
    if (status == SCSI_STATUS_GOOD) {
        self.moved += mine.piece.data;
        if (mine.flushes && self.sending.flushed)
            self.sending.flushed(mine.piece.offset);
    } else if (!self.ending && !self.failure) {
        self.failure =
            fail(-meaning(status, task.get()), "%s failed a write at %llu: %s", self.sending.to.target.c_str(),
                 static_cast<unsigned long long>(mine.piece.offset), iscsi_get_error(iscsi));
    }
}

} // namespace

int sendRanges(const Sending &sending)
{
    const PipeSignalBlock no_signal;
    return Sender(sending).run();
}

} // namespace norvhost
