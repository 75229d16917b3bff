#include "tests/unit/Library.h"

#include <json/reader.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <memory>
#include <set>
#include <stdexcept>

#include <syslog.h>
#include <unistd.h>

namespace unit {
namespace {

/// Takes what stands before `delimiter` off the front of the text.
std::string takeUntil(std::string &text, char delimiter)
{
    const size_t end = text.find(delimiter);
    const std::string taken = text.substr(0, end);
    text.erase(0, end == std::string::npos ? end : end + 1);
    return taken;
}

std::string withoutPlace(const fake::LogLine &line)
{
    const std::string tag = "[E] iSCSIWebAPI:";
    EXPECT_TRUE(line.priority == LOG_ERR || line.priority == LOG_INFO) << line.priority;
    for (const std::string &secret : {std::string(SECRET), std::string(MUTUAL_SECRET), fake::model().peer.password,
                                      std::string(KEPT_ROD_KEY), std::string(PEER_SESSION)})
        EXPECT_EQ(line.text.find(secret), std::string::npos) << line.text;

    std::string text = line.text;
    const bool is_tagged = text.compare(0, tag.size(), tag) == 0;
    if (is_tagged)
        text.erase(0, tag.size());
    const std::string file = takeUntil(text, ':');
    EXPECT_TRUE(std::filesystem::path(file).is_relative() && std::filesystem::exists(ISCSIWEBAPI_SOURCE_DIR "/" + file))
        << line.text;
    const size_t digits = text.find_first_not_of("0123456789");
    EXPECT_TRUE(digits != 0 && digits != std::string::npos) << line.text;
    const char behind_number = text[digits];
    text.erase(0, digits + 1);
    const std::string method = behind_number == ':' ? takeUntil(text, ' ') : "";
    return (is_tagged ? "[E] " : line.priority == LOG_INFO ? "[info] " : "") + method + ": " + text;
}

std::set<std::string> written;

void waitForWorkers()
{
    for (int status : fake::waitForChildren())
        EXPECT_EQ(status, 0) << "of a worker";
}

} // namespace

LibraryTest::LibraryTest()
{
    setenv("TZ", "UTC0", 1);
    tzset();
    fake::reset();
    fake::forgetLogLines();
    fake::forgetSleep();
}

LibraryTest::~LibraryTest()
{
    logged(); // for its checks, on what the test did not look at
    EXPECT_EQ(fake::unfreedAnswers(), 0);
    for (const auto &path : written)
        std::filesystem::remove(path);
    written.clear();
}

Lines logged()
{
    waitForWorkers();
    Lines lines;
    for (const auto &line : fake::logLines())
        lines.push_back(withoutPlace(line));
    fake::forgetLogLines();
    return lines;
}

Lines called(const Lines &prefixes)
{
    waitForWorkers();
    Lines lines;
    for (const auto &call : fake::calls()) {
        const auto begins = [&](const std::string &prefix) { return call.name.rfind(prefix, 0) == 0; };
        if (std::any_of(prefixes.begin(), prefixes.end(), begins))
            lines.push_back(call.name + "(" + call.arguments + ")");
    }
    fake::forgetCalls();
    return lines;
}

std::string uuidOf(int lid)
{
    char uuid[37];
    snprintf(uuid, sizeof(uuid), "1a2b3c4d-0000-4000-8000-%012d", lid);
    return uuid;
}

fake::LUN &addLUN(int lid, const std::string &name, int type)
{
    fake::LUN lun;
    lun.record.lid = lid;
    lun.record.type = type;
    lun.record.size = GIB;
    lun.record.extent_size = 65536;
    uuidOf(lid).copy(lun.record.uuid, sizeof(lun.record.uuid) - 1);
    name.copy(lun.record.name, sizeof(lun.record.name) - 1);
    std::string("/volume1").copy(lun.record.location, sizeof(lun.record.location) - 1);
    return fake::model().luns[lid] = lun;
}

_tag_iscsi_lun_ recordOf(int lid)
{
    return fake::model().luns.at(lid).record;
}

std::string snapshotUUIDOf(int lid, int number)
{
    char uuid[37];
    snprintf(uuid, sizeof(uuid), "5e4d3c2b-%04d-4000-8000-%012d", number, lid);
    return uuid;
}

fake::Snapshot &addSnapshot(int lid, int number, const std::string &name)
{
    fake::Snapshot snapshot;
    auto &record = snapshot.record;
    record.lid = lid;
    record.snap_id = number;
    record.total_size = GIB;
    record.mapped_size = 65536;
    record.create_time = EPOCH + 60;
    record.snap_time = EPOCH + number;
    record.app_consistent = 1;
    name.copy(record.name, sizeof(record.name) - 1);
    std::string("Healthy").copy(record.status, sizeof(record.status) - 1);
    std::string("before the move").copy(record.desc, sizeof(record.desc) - 1);
    std::string("/volume1").copy(record.root_path, sizeof(record.root_path) - 1);
    std::string("alice").copy(record.taken_by, sizeof(record.taken_by) - 1);
    snapshotUUIDOf(lid, number).copy(record.uuid, sizeof(record.uuid) - 1);
    snapshotUUIDOf(lid, 9999).copy(record.version, sizeof(record.version) - 1);
    return fake::model().snapshots[{lid, number}] = snapshot;
}

void writeFile(const std::string &path, const std::string &text)
{
    std::filesystem::create_directories(std::filesystem::path(path).parent_path());
    std::ofstream(path) << text;
    written.insert(path);
}

int privateLUNID()
{
    return 1000000 + getpid();
}

fake::Target &addTarget(int tid, const std::string &name)
{
    fake::Target target;
    auto &record = target.record;
    record.tid = tid;
    record.enabled = 1;
    record.header_digest = 1;
    record.max_recv_seg_bytes = 262144;
    record.max_send_seg_bytes = 4096;
    record.max_sessions = 2;
    record.auth_type = NORV_TARGET_AUTH_MUTUAL_CHAP;
    name.copy(record.name, sizeof(record.name) - 1);
    ("iqn.2000-01.example:" + name).copy(record.iqn, sizeof(record.iqn) - 1);
    std::string("alice").copy(record.user, sizeof(record.user) - 1);
    std::string(SECRET).copy(record.password, sizeof(record.password) - 1);
    std::string("bob").copy(record.mutual_user, sizeof(record.mutual_user) - 1);
    std::string(MUTUAL_SECRET).copy(record.mutual_password, sizeof(record.mutual_password) - 1);
    return fake::model().targets[tid] = target;
}

void addMapping(int tid, int lid, int mapping_index)
{
    fake::model().mappings.push_back({tid, lid, mapping_index, nullptr});
}

void addNodes()
{
    NorvDRNode::DRNode local, peer;
    local.id = LOCAL_NODE;
    local.host = "local.example";
    peer.id = PEER_NODE;
    peer.host = "peer.example";
    peer.port = 5443;
    peer.protocol = "https";
    peer.cred_session = PEER_SESSION;
    fake::model().nodes = {peer, local};
    fake::model().node_attributes = {{PEER_NODE, "NORV.iSCSI", "rod_key", KEPT_ROD_KEY}};
}

Json::Value parsed(const std::string &json)
{
    const std::unique_ptr<Json::CharReader> reader(Json::CharReaderBuilder().newCharReader());
    Json::Value value;
    std::string errors;
    if (!reader->parse(json.data(), json.data() + json.size(), &value, &errors))
        throw std::invalid_argument(json + ": " + errors);
    return value;
}

} // namespace unit
