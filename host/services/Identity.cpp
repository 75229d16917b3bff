#include "host/services/Identity.h"

#include "host/core/Crypto.h"
#include "host/core/LastError.h"
#include "host/state/Database.h"
#include "host/storage/LunStore.h"
#include "platform/error.h"
#include "platform/extent_pool.h"

#include <cstring>

namespace norvhost {
namespace {

constexpr const char *id_setting = "node_id";
constexpr const char *rod_key_setting = "rod_key";
constexpr size_t rod_key_bytes = 32;

/// Inside a transaction: two that make it at once agree.
int setOnce(const char *key, const std::string &value)
{
    std::string present;
    if (int err = getSetting(key, "", present))
        return err;
    return present.empty() ? setSetting(key, value) : 0;
}

} // namespace

int makeIdentity()
{
    Transaction transaction;
    if (transaction.error())
        return transaction.error();
    if (int err = setOnce(id_setting, newUuid()))
        return err;
    if (int err = setOnce(rod_key_setting, toBase64Url(randomBytes(rod_key_bytes))))
        return err;
    return transaction.commit();
}

int localNodeId(std::string &uuid)
{
    return getSetting(id_setting, "", uuid);
}

int localRodKey(std::string &key)
{
    std::string found;
    if (int err = getSetting(rod_key_setting, "", found))
        return err;
    if (found.empty())
        return fail(NORV_ERR_GET_CONFIG, "this appliance has no identity yet: iscsi-host init makes one");
    key = found;
    return 0;
}

} // namespace norvhost

int NORVExtentPoolRODKeyGet(char *key, int size)
{
    using namespace norvhost;
    if (!key || size < 1)
        return fail(NORV_ERR_NULL_POINTER, "no room for the ROD key");
    std::string found;
    if (int err = localRodKey(found))
        return err;
    if (found.size() >= static_cast<size_t>(size))
        return fail(NORV_ERR_BAD_PARAMETER, "the ROD key has %zu bytes, there is room for %d", found.size(), size - 1);
    memcpy(key, found.c_str(), found.size() + 1);
    return 0;
}
