// A caller's selector: it resolves to an object that is there, or to an error with the output untouched.
#include "iscsiwebapi/ISCSIErrorCode.h"
#include "iscsiwebapi/ISCSILUNInfo.h"
#include "iscsiwebapi/ISCSITargetInfo.h"
#include "tests/fake/Fake.h"
#include "tests/fake/Process.h"
#include "tests/fuzz/Expect.h"

#include <cstdio>

namespace {

void fillPlatform()
{
    fake::reset();
    for (int id = 1; id <= 3; ++id) {
        _tag_iscsi_lun_ &lun = fake::model().luns[id].record;
        lun.lid = id;
        std::snprintf(lun.uuid, sizeof(lun.uuid), "0000000%d-0000-4000-8000-000000000000", id);
        std::snprintf(lun.name, sizeof(lun.name), "disk-%d", id);
        _tag_iscsi_target_ &target = fake::model().targets[id].record;
        target.tid = id;
        std::snprintf(target.name, sizeof(target.name), "target-%d", id);
    }
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size)
{
    const std::string selector(reinterpret_cast<const char *>(data), size);
    fillPlatform();

    std::string uuid = "untouched";
    if (const int code = ISCSI::ISCSILUNInfo::GetLUNUUID(selector, uuid)) {
        EXPECT_ALWAYS(code == ISCSI::ERR_BAD_LUN_UUID);
        EXPECT_ALWAYS(uuid == "untouched");
    } else {
        EXPECT_ALWAYS(uuid.empty() == selector.empty());
    }

    int tid = -7;
    if (const int code = ISCSI::ISCSITargetInfo::GetTID(selector, tid)) {
        EXPECT_ALWAYS(code == ISCSI::ERR_BAD_TARGET_ID);
        EXPECT_ALWAYS(tid == -7);
    } else {
        EXPECT_ALWAYS(tid >= 1 && tid <= 256);
    }
    fake::forgetLogLines();
    return 0;
}
