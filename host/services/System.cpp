/// The appliance itself, by the names that its parts have on the appliance.
#include "platform/system.h"
#include "host/core/BootMark.h"
#include "host/core/LastError.h"
#include "host/services/Identity.h"
#include "host/storage/Volumes.h"
#include "host/target/Service.h"
#include "host/target/Tgtd.h"
#include "platform/error.h"

#include <algorithm>
#include <string_view>
#include <vector>

using namespace norvhost;

namespace {

constexpr int answer_ms = 2000;

bool daemonsRun()
{
    return Tgtd(Access::read_write).processId() > 0 && Tgtd(Access::read).processId() > 0;
}

bool daemonsAnswer()
{
    return Tgtd(Access::read_write, answer_ms).ping() == 0 && Tgtd(Access::read, answer_ms).ping() == 0;
}

/// LUNs can be found and have a place; a machine without volumes is fine until its first one.
bool storeIsUsable()
{
    std::vector<VolumeRow> volumes;
    if (loadVolumes(volumes) != 0)
        return false;
    return volumes.empty() ||
           std::any_of(volumes.begin(), volumes.end(), [](const VolumeRow &row) { return checkMounted(row) == 0; });
}

bool keyIsThere()
{
    std::string key;
    return localRodKey(key) == 0;
}

/// What does here what the kernel's module does there.
constexpr struct {
    std::string_view module;
    bool (*is_up)();
} modules[] = {
    {"iscsi_target_mod", iscsiServiceAlive}, {"target_core_mod", daemonsRun}, {"configfs", daemonsAnswer},
    {"iscsi_extent_pool", storeIsUsable},    {"iscsi_rodsp", keyIsThere},
};

constexpr int boot_step_not_done = 1;

} // namespace

int NORVCheckModule(const char *name)
{
    for (const auto &[module, is_up] : modules)
        if (name && module == name)
            return is_up() ? 1 : 0;
    fail(NORV_ERR_BAD_PARAMETER, "there is no such module");
    return 0;
}

int NORVSystemGetBootStep(void)
{
    return isMarkedBooted() ? NORV_BOOT_DONE : boot_step_not_done;
}
