#include "host/services/Retention.h"

#include "host/core/LastError.h"
#include "host/state/Database.h"
#include "platform/error.h"
#include "platform/retention.h"

namespace norvhost {

int setRetentionPolicy(std::string_view kind, std::string_view key, std::string_view policy)
{
    if (kind.empty() || key.empty() || policy.empty())
        return fail(NORV_ERR_BAD_PARAMETER, "a retention policy has a kind, a key and a rule");
    Query query("INSERT INTO retention_policies (kind, key, policy) VALUES (?1, ?2, ?3) "
                "ON CONFLICT (kind, key) DO UPDATE SET policy = excluded.policy");
    return query.bind(kind).bind(key).bind(policy).run();
}

int removeRetentionPolicy(std::string_view kind, std::string_view key)
{
    Query query("DELETE FROM retention_policies WHERE kind = ?1 AND key = ?2");
    return query.bind(kind).bind(key).run();
}

} // namespace norvhost

int NORVRETENTIONRemovePolicy(const char *kind, const char *key)
{
    return kind && key && norvhost::removeRetentionPolicy(kind, key) == 0 ? 0 : -1;
}
