// What the library costs above the platform's answer: listing, and one record as text and as JSON.
#include "iscsiwebapi/ISCSILUNInfo.h"
#include "platform/iscsi_lun.h"
#include "tests/fake/Fake.h"

#include <benchmark/benchmark.h>
#include <json/value.h>

#include <cstdio>
#include <cstdlib>
#include <memory>
#include <string>
#include <vector>

namespace {

constexpr int LUN_COUNT = 1024;

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
