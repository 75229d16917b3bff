/// Selectors: a caller's text that names one object by UUID, by name, or by kind prefix, "#" and a
/// 1-based index into the kind's list.
#pragma once

#include "etc/Failure.h"

#include <string>
#include <vector>

namespace ISCSI {

/// What differs from kind to kind. The texts are whole log sentences.
struct SelectorKind {
    const char *index_pattern; ///< "lun#%u%c"
    const char *list_failed;
    const char *out_of_range; ///< takes the index (%d) and the count (%zu)
    const char *invalid;      ///< takes the selector (%s)
    int bad_code;             ///< for a selector that names nothing
};

/// 32 hexadecimal digits in the 8-4-4-4-12 pattern and nothing behind them.
bool isUUID(const std::string &text);

/// Whether the selector is of the kind's index form, in either case; a number too large for
/// `index` is read as the largest.
bool isIndex(const SelectorKind &kind, const std::string &selector, unsigned int &index);

int failOutOfRange(const SelectorKind &kind, unsigned int index, size_t count, Site site);
int failInvalid(const SelectorKind &kind, const std::string &selector, Site site = here());

/// Resolves the index form, and leaves anything else to `lookup`. `list` fills a vector of records,
/// `found` takes the record that the index names, `lookup` the selector; it logs its own failure.
/// Returns the listing's code when that fails, the kind's bad code for an index out of range.
template <class Record, class List, class Found, class Lookup>
int resolveSelector(const SelectorKind &kind, const std::string &selector, List list, Found found, Lookup lookup,
                    Site site = here())
{
    unsigned int index = 0;
    if (!isIndex(kind, selector, index))
        return lookup(selector);
    std::vector<Record> records;
    if (int err = list(records))
        return failShort(site, err, "%s", kind.list_failed);
    if (index < 1 || index > records.size())
        return failOutOfRange(kind, index, records.size(), site);
    found(records[index - 1]);
    return 0;
}

} // namespace ISCSI
