/// The list of texts that callers of the platform get answers in.
#include "host/core/LastError.h"
#include "platform/core.h"
#include "platform/error.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>

using norvhost::fail;

namespace {

/// Makes room for one more text.
bool reserveOne(NLIBC_SZ_LIST &list)
{
    if (list.count < list.capacity)
        return true;
    const int capacity = list.capacity < 8 ? 8 : list.capacity * 2;
    void *texts = realloc(list.texts, static_cast<size_t>(capacity) * sizeof *list.texts);
    if (!texts)
        return false;
    list.texts = static_cast<char **>(texts);
    list.capacity = capacity;
    return true;
}

} // namespace

NLIBC_SZ_LIST *NLIBCSzListAlloc(int capacity)
{
    if (capacity < 0) {
        fail(NORV_ERR_BAD_PARAMETER, "a list cannot have room for %d texts", capacity);
        return nullptr;
    }
    auto *list = static_cast<NLIBC_SZ_LIST *>(calloc(1, sizeof(NLIBC_SZ_LIST)));
    if (list && capacity > 0)
        list->texts = static_cast<char **>(calloc(static_cast<size_t>(capacity), sizeof *list->texts));
    if (!list || (capacity > 0 && !list->texts)) {
        free(list);
        fail(NORV_ERR_OUT_OF_MEMORY, "no memory for a list of %d texts", capacity);
        return nullptr;
    }
    list->capacity = capacity;
    return list;
}

void NLIBCSzListFree(NLIBC_SZ_LIST *list)
{
    if (!list)
        return;
    for (int i = 0; i < list->count; ++i)
        free(list->texts[i]);
    free(list->texts);
    free(list);
}

int NLIBCSzListPush(NLIBC_SZ_LIST *list, const char *text)
{
    if (!list || !text) {
        fail(NORV_ERR_NULL_POINTER, "no list or no text to add to it");
        return -EINVAL;
    }
    char *copy = strdup(text);
    if (!copy || !reserveOne(*list)) {
        free(copy);
        fail(NORV_ERR_OUT_OF_MEMORY, "no memory for another text of a list");
        return -ENOMEM;
    }
    list->texts[list->count] = copy;
    return ++list->count;
}

const char *NLIBCSzListGet(const NLIBC_SZ_LIST *list, int index)
{
    return list && index >= 0 && index < list->count ? list->texts[index] : nullptr;
}
