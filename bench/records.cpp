// What the library costs above the platform's answer: listings, and one record as text and as JSON.
#include "iscsiwebapi/ISCSILUNInfo.h"
#include "iscsiwebapi/ISCSISnapshotInfo.h"
#include "platform/iscsi_lun.h"
#include "tests/fake/Fake.h"

#include <benchmark/benchmark.h>
#include <json/value.h>
#include <malloc.h>

#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <memory>
#include <string>
#include <utility>
#include <vector>

namespace {

constexpr int LUN_COUNT = 1024;
constexpr int SNAPSHOT_COUNT = 65536;

/// What a program without this library would keep of a LUN.
struct PlainLUN {
    int lun_id;
    int type;
    long restored_time;
    unsigned long long size;
    unsigned int extent_size;
    std::string uuid, name, location;
};

struct FreeRecords {
    void operator()(_tag_iscsi_lun_ *records) const { std::free(records); }
};

void fillPlatform()
{
    fake::reset();
    for (int lid = 1; lid <= LUN_COUNT; ++lid) {
        _tag_iscsi_lun_ &record = fake::model().luns[lid].record;
        record.lid = lid;
        record.type = NORV_LUN_TYPE_ADV;
        record.size = 10ULL << 30;
        record.extent_size = 4096;
        std::snprintf(record.uuid, sizeof(record.uuid), "%08x-0000-4000-8000-000000000000", lid);
        std::snprintf(record.name, sizeof(record.name), "production-database-%d", lid);
        std::snprintf(record.location, sizeof(record.location), "/volume1");
    }
}

std::unique_ptr<_tag_iscsi_lun_, FreeRecords> fetch(size_t &count)
{
    _tag_iscsi_lun_ *records = nullptr;
    if (NORViSCSILunConfigGetAll(&records, &count) || count != LUN_COUNT)
        std::abort();
    fake::forgetCalls();
    return std::unique_ptr<_tag_iscsi_lun_, FreeRecords>(records);
}

void platformAnswer(benchmark::State &state)
{
    fillPlatform();
    for (auto _ : state) {
        size_t count = 0;
        auto records = fetch(count);
        benchmark::DoNotOptimize(records.get());
    }
}
BENCHMARK(platformAnswer);

void plainLoop(benchmark::State &state)
{
    fillPlatform();
    std::vector<PlainLUN> out;
    for (auto _ : state) {
        size_t count = 0;
        const auto records = fetch(count);
        out.clear();
        out.reserve(count);
        for (size_t i = 0; i < count; ++i) {
            const _tag_iscsi_lun_ &record = records.get()[i];
            out.push_back({record.lid, record.type, record.restored_time, record.size, record.extent_size,
                           std::string(record.uuid), std::string(record.name), std::string(record.location)});
        }
        benchmark::DoNotOptimize(out.data());
    }
}
BENCHMARK(plainLoop);

void listLUN(benchmark::State &state)
{
    fillPlatform();
    std::vector<ISCSI::ISCSILUNInfo> out;
    for (auto _ : state) {
        if (ISCSI::ISCSILUNInfo::ListLUN(out, 0) || out.size() != LUN_COUNT)
            state.SkipWithError("ListLUN failed");
        fake::forgetCalls();
        benchmark::DoNotOptimize(out.data());
    }
}
BENCHMARK(listLUN);

/// What a program without this library would keep of a snapshot.
struct PlainSnapshot {
    int snapshot_id;
    int parent_lun_id;
    unsigned long long total_size;
    unsigned long long mapped_size;
    long create_time;
    long snapshot_time;
    bool is_app_consistent;
    bool is_user_locked;
    std::string name, status, description, root_path, taken_by, uuid, version;
};

void fillSnapshots()
{
    fake::reset();
    for (int lid = 1; lid <= SNAPSHOT_COUNT / NORV_SNAPSHOT_ID_MAX; ++lid) {
        for (int number = 1; number <= NORV_SNAPSHOT_ID_MAX; ++number) {
            _tag_iscsi_snapshot_ &record = fake::model().snapshots[{lid, number}].record;
            record.lid = lid;
            record.snap_id = number;
            record.total_size = 10ULL << 30;
            record.snap_time = record.create_time = 1700000000 + number;
            std::snprintf(record.uuid, sizeof(record.uuid), "%08x-%04x-4000-8000-000000000000", lid, number);
            std::snprintf(record.version, sizeof(record.version), "%s", record.uuid);
            std::snprintf(record.name, sizeof(record.name), "production-database-%d-%d", lid, number);
            std::snprintf(record.status, sizeof(record.status), "Healthy");
            std::snprintf(record.desc, sizeof(record.desc), "before the update of the accounting of department %d",
                          lid);
            std::snprintf(record.root_path, sizeof(record.root_path), "/volume1");
            std::snprintf(record.taken_by, sizeof(record.taken_by), "schedule");
        }
    }
}

struct SnapshotList : _tag_iscsi_snapshot_list_ {
    SnapshotList() : _tag_iscsi_snapshot_list_{}
    {
        const _tag_iscsi_snapshot_query_ all{};
        if (NORViSCSISnapshotConfLoad(&all, this) || count != SNAPSHOT_COUNT)
            std::abort();
        fake::forgetCalls();
    }
    SnapshotList(const SnapshotList &) = delete;
    SnapshotList &operator=(const SnapshotList &) = delete;
    ~SnapshotList()
    {
        while (first)
            std::free(std::exchange(first, first->next));
    }
};

void snapshotAnswer(benchmark::State &state)
{
    fillSnapshots();
    for (auto _ : state)
        benchmark::DoNotOptimize(SnapshotList().first);
}
BENCHMARK(snapshotAnswer)->Unit(benchmark::kMillisecond);

void plainSnapshotWalk(benchmark::State &state)
{
    fillSnapshots();
    for (auto _ : state) {
        const SnapshotList list;
        std::vector<PlainSnapshot> out;
        out.reserve(static_cast<size_t>(list.count));
        for (const _tag_iscsi_snapshot_ *record = list.first; record; record = record->next)
            out.push_back({record->snap_id, record->lid, record->total_size, record->mapped_size, record->create_time,
                           record->snap_time, record->app_consistent != 0, record->user_locked != 0, record->name,
                           record->status, record->desc, record->root_path, record->taken_by, record->uuid,
                           record->version});
        benchmark::DoNotOptimize(out.data());
    }
}
BENCHMARK(plainSnapshotWalk)->Unit(benchmark::kMillisecond);

void listSnapshot(benchmark::State &state)
{
    fillSnapshots();
    for (auto _ : state) {
        std::vector<ISCSI::ISCSISnapshotInfo> out;
        if (ISCSI::ISCSISnapshotInfo::ListSnapshot(-1, out, 0, 0) || out.size() != SNAPSHOT_COUNT)
            state.SkipWithError("ListSnapshot failed");
        fake::forgetCalls();
        benchmark::DoNotOptimize(out.data());
    }
}
BENCHMARK(listSnapshot)->Unit(benchmark::kMillisecond);

/// A line of /proc/self/status, in bytes.
double memory(const std::string &key)
{
    std::ifstream status("/proc/self/status");
    for (std::string word; status >> word;)
        if (word == key + ":") {
            double kibibytes = 0;
            status >> kibibytes;
            return kibibytes * 1024;
        }
    std::abort();
}

size_t heapBytes(const std::string &text)
{
    constexpr size_t longest_inside = 15;
    return text.size() <= longest_inside ? 0 : malloc_usable_size(const_cast<char *>(text.data()));
}

/// Not a matter of time: the counters say what the SDK's list, our records, and the whole listing at its peak take, in
/// bytes. To be run in a process of its own, whose heap has no holes yet.
void listSnapshotMemory(benchmark::State &state)
{
    fillSnapshots();
    std::vector<ISCSI::ISCSISnapshotInfo> out;
    for (auto _ : state) {
        std::ofstream("/proc/self/clear_refs") << 5; // the peak begins anew
        const double before = memory("VmRSS");
        if (ISCSI::ISCSISnapshotInfo::ListSnapshot(-1, out, 0, 0))
            state.SkipWithError("ListSnapshot failed");
        state.counters["peak"] = memory("VmHWM") - before;
    }
    size_t records = 0;
    for (const ISCSI::ISCSISnapshotInfo &snapshot : out) {
        records += sizeof(snapshot);
        for (const std::string *text : {&snapshot.name, &snapshot.status, &snapshot.description, &snapshot.root_path,
                                        &snapshot.taken_by, &snapshot.uuid, &snapshot.version})
            records += heapBytes(*text);
    }
    state.counters["records"] = static_cast<double>(records);
    state.counters["list"] = static_cast<double>(SNAPSHOT_COUNT * sizeof(_tag_iscsi_snapshot_));
}
BENCHMARK(listSnapshotMemory)->Iterations(1);

ISCSI::ISCSILUNInfo oneLUN()
{
    return {7,
            NORV_LUN_TYPE_ADV,
            1700000000,
            10ULL << 30,
            "00000007-0000-4000-8000-000000000000",
            "production-database-7",
            "/volume1",
            false,
            true,
            4096,
            5ULL << 30,
            "normal"};
}

void recordToString(benchmark::State &state)
{
    const ISCSI::ISCSILUNInfo lun = oneLUN();
    for (auto _ : state)
        benchmark::DoNotOptimize(lun.toString());
}
BENCHMARK(recordToString);

/// The same fields through one snprintf into a string.
void plainToString(benchmark::State &state)
{
    const ISCSI::ISCSILUNInfo lun = oneLUN();
    for (auto _ : state) {
        char text[1024];
        std::snprintf(text, sizeof(text), "%d %d %ld %llu %s %s %s %d %d %u %llu %s", lun.lun_id, lun.type,
                      lun.restored_time, lun.size, lun.uuid.c_str(), lun.name.c_str(), lun.location.c_str(),
                      lun.is_action_locked, lun.is_mapped, lun.extent_size, lun.allocated_size, lun.status.c_str());
        benchmark::DoNotOptimize(std::string(text));
    }
}
BENCHMARK(plainToString);

void recordToJson(benchmark::State &state)
{
    const ISCSI::ISCSILUNInfo lun = oneLUN();
    for (auto _ : state) {
        Json::Value value;
        if (lun.toJsonFormat(value))
            state.SkipWithError("toJsonFormat failed");
        benchmark::DoNotOptimize(value);
    }
}
BENCHMARK(recordToJson);

/// The same number of keys set by hand.
void plainToJson(benchmark::State &state)
{
    const ISCSI::ISCSILUNInfo lun = oneLUN();
    for (auto _ : state) {
        Json::Value value;
        value["lun_id"] = lun.lun_id;
        value["uuid"] = lun.uuid;
        value["name"] = lun.name;
        value["location"] = lun.location;
        value["type"] = static_cast<int>(lun.type);
        value["size"] = static_cast<Json::UInt64>(lun.size);
        value["extent_size"] = lun.extent_size;
        value["is_mapped"] = lun.is_mapped;
        value["is_action_locked"] = lun.is_action_locked;
        value["allocated_size"] = static_cast<Json::UInt64>(lun.allocated_size);
        value["restored_time"] = static_cast<Json::Int64>(lun.restored_time);
        value["status"] = lun.status;
        benchmark::DoNotOptimize(value);
    }
}
BENCHMARK(plainToJson);

} // namespace
