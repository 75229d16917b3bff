/// Failure lines in the system log: one line per failing step, written where the step is.
///
/// Every function here returns the code it was given, so that a step reads
///
///     if (int err = info.loadFromConfig(record, 0))
///         return fail(err, info, "Failed to load LUN config");
///
/// The line's source file, line and method are the caller's. Texts are built only when something
/// failed. A secret is never an argument of these functions.
#pragma once

#include "iscsiwebapi/ISCSIErrorCode.h"

#include <string>

namespace ISCSI {

class ISCSINodeInfo;

/// A place in the source, as it stands at the head of a log line.
struct Site {
    const char *file; ///< relative to the source root
    int line;
    const char *method; ///< unqualified
};

/// The place of the call.
constexpr Site here(const char *file = __builtin_FILE(), int line = __builtin_LINE(),
                    const char *method = __builtin_FUNCTION())
{
    return {file, line, method};
}

/// "file:line:method " and the formatted text.
int failText(Site site, int code, const char *format, ...) __attribute__((format(printf, 3, 4)));

/// The same head without the method: "file:line ".
int failShort(Site site, int code, const char *format, ...) __attribute__((format(printf, 3, 4)));

/// "[E] iSCSIWebAPI:file:line:method error code: ..." with the code's text and a detail in brackets.
int failTagged(Site site, int code, const std::string &detail);

int failStandard(Site site, int code, const char *sentence, const std::string &info);

/// A record as it stands in a log line: its text form, of a node with its secrets as "***".
template <class Record>
std::string logText(const Record &record)
{
    return record.toString();
}
std::string logText(const ISCSINodeInfo &node);

/// The standard form: the sentence, then ". info: %s. error: %d (%s)" of the record and the code.
template <class Record>
int fail(int code, const Record &record, const char *sentence, Site site = here())
{
    return failStandard(site, code, sentence, logText(record));
}

} // namespace ISCSI
