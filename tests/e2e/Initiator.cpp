#include "tests/e2e/Initiator.h"

#include <arpa/inet.h>
#include <iscsi/scsi-lowlevel.h>
#include <sys/socket.h>

namespace e2e {
namespace {

struct FreeTask {
    void operator()(scsi_task *task) const { scsi_free_scsi_task(task); }
};
using Task = std::unique_ptr<scsi_task, FreeTask>;

bool isGood(const Task &task)
{
    return task && task->status == SCSI_STATUS_GOOD;
}

} // namespace

void clearAttention(iscsi_context *iscsi, int lun)
{
    for (int i = 0; i < 5; ++i)
        if (isGood(Task(iscsi_testunitready_sync(iscsi, lun))))
            return;
}

void Initiator::setChap(const Chap &chap)
{
    iscsi_set_initiator_username_pwd(context.get(), chap.user.c_str(), chap.secret.c_str());
    if (!chap.mutual_user.empty())
        iscsi_set_target_username_pwd(context.get(), chap.mutual_user.c_str(), chap.mutual_secret.c_str());
}

std::map<std::string, std::string> Initiator::discover(int port)
{
    std::map<std::string, std::string> found;
    iscsi_context *const iscsi = context.get();
    iscsi_set_session_type(iscsi, ISCSI_SESSION_DISCOVERY);
    if (iscsi_connect_sync(iscsi, (address + ":" + std::to_string(port)).c_str()) != 0 || iscsi_login_sync(iscsi) != 0)
        return {{"!", error()}};
    iscsi_discovery_address *list = iscsi_discovery_sync(iscsi);
    for (auto *entry = list; entry; entry = entry->next)
        found[entry->target_name] = entry->portals ? entry->portals->portal : "";
    iscsi_free_discovery_data(iscsi, list);
    iscsi_logout_sync(iscsi);
    return found;
}

bool Initiator::logIn(const std::string &target, int port)
{
    iscsi_context *const iscsi = context.get();
    iscsi_set_session_type(iscsi, ISCSI_SESSION_NORMAL);
    iscsi_set_targetname(iscsi, target.c_str());
    if (iscsi_full_connect_sync(iscsi, (address + ":" + std::to_string(port)).c_str(), 0) != 0)
        return false;
    for (int lun : luns())
        clearAttention(iscsi, lun);
    return true;
}

uint64_t Initiator::capacity(int lun)
{
    const Task task(iscsi_readcapacity16_sync(context.get(), lun));
    const auto *answer =
        isGood(task) ? static_cast<scsi_readcapacity16 *>(scsi_datain_unmarshall(task.get())) : nullptr;
    return answer ? (answer->returned_lba + 1) * answer->block_length : 0;
}

bool Initiator::write(uint64_t block, uint8_t fill, int lun, uint32_t blocks)
{
    std::vector<unsigned char> data(size_t{blocks} * block_size, fill);
    return isGood(Task(iscsi_write16_sync(context.get(), lun, block, data.data(), static_cast<uint32_t>(data.size()),
                                          block_size, 0, 0, 0, 0, 0)));
}

bool Initiator::holds(uint64_t block, uint8_t fill, int lun, uint32_t blocks)
{
    const Task task(iscsi_read16_sync(context.get(), lun, block, blocks * block_size, block_size, 0, 0, 0, 0, 0));
    if (!isGood(task) || task->datain.size != static_cast<int>(blocks) * block_size)
        return false;
    for (int i = 0; i < task->datain.size; ++i)
        if (task->datain.data[i] != fill)
            return false;
    return true;
}

std::vector<int> Initiator::luns()
{
    std::vector<int> found;
    const Task task(iscsi_reportluns_sync(context.get(), 0, 16384));
    const auto *answer =
        isGood(task) ? static_cast<scsi_reportluns_list *>(scsi_datain_unmarshall(task.get())) : nullptr;
    for (uint32_t i = 0; answer && i < answer->num; ++i)
        if (answer->luns[i] != 0)
            found.push_back(answer->luns[i]);
    return found;
}

std::string Initiator::page(int lun, int code)
{
    const Task task(iscsi_inquiry_sync(context.get(), lun, 1, code, 255));
    if (!isGood(task) || task->datain.size < 4)
        return "";
    return {reinterpret_cast<const char *>(task->datain.data) + 4, static_cast<size_t>(task->datain.size) - 4};
}

std::string Initiator::serial(int lun)
{
    return page(lun, 0x80);
}

std::string Initiator::identification(int lun)
{
    return page(lun, 0x83);
}

int Initiator::port() const
{
    sockaddr_storage peer = {};
    socklen_t size = sizeof peer;
    if (getpeername(iscsi_get_fd(context.get()), reinterpret_cast<sockaddr *>(&peer), &size) != 0)
        return 0;
    return ntohs(peer.ss_family == AF_INET ? reinterpret_cast<sockaddr_in *>(&peer)->sin_port
                                           : reinterpret_cast<sockaddr_in6 *>(&peer)->sin6_port);
}

} // namespace e2e
