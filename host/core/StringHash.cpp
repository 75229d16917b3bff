/// The hash of texts that callers of the platform exchange sections with.
#include "host/core/StringHash.h"

#include "host/core/LastError.h"
#include "platform/error.h"

#include <algorithm>
#include <cerrno>
#include <new>

using norvhost::fail;

namespace {

/// Sections have a handful of keys: looking at each is as quick as an index.
template <class Hash>
auto *findValue(Hash &hash, const char *key)
{
    const auto found =
        std::find_if(hash.entries.begin(), hash.entries.end(), [key](const auto &entry) { return entry.first == key; });
    return found == hash.entries.end() ? nullptr : &found->second;
}

} // namespace

NLIBC_SZ_HASH *NLIBCSzHashAlloc(int capacity)
{
    if (capacity < 0) {
        fail(NORV_ERR_BAD_PARAMETER, "a hash cannot have room for %d texts", capacity);
        return nullptr;
    }
    auto *hash = new (std::nothrow) NLIBC_SZ_HASH;
    if (!hash)
        fail(NORV_ERR_OUT_OF_MEMORY, "no memory for a hash");
    return hash;
}

void NLIBCSzHashFree(NLIBC_SZ_HASH *hash)
{
    delete hash;
}

int NLIBCSzHashSetValue(NLIBC_SZ_HASH *hash, const char *key, const char *value)
{
    if (!hash || !key || !*key || !value) {
        fail(NORV_ERR_NULL_POINTER, "no hash, no key or no value to set");
        return -EINVAL;
    }
    try {
        if (std::string *present = findValue(*hash, key))
            *present = value;
        else
            hash->entries.emplace_back(key, value);
    } catch (const std::bad_alloc &) {
        fail(NORV_ERR_OUT_OF_MEMORY, "no memory for another text of a hash");
        return -ENOMEM;
    }
    return 0;
}

const char *NLIBCSzHashGetValue(const NLIBC_SZ_HASH *hash, const char *key)
{
    if (!hash || !key)
        return nullptr;
    const std::string *value = findValue(*hash, key);
    return value ? value->c_str() : nullptr;
}
