/// The handlers that the table names, and what they share.
#pragma once

#include "webapi/handlers/Route.h"

namespace webapi {

/// The IQN text that stands for the default masking entry, in input and in answers.
constexpr char DEFAULT_MASKING[] = "default";

/// A failure with the platform's reason for it.
Result failed(int code);
Result failed(int code, const std::string &reason);

Result listLuns(const Request &request);
Result createLun(const Request &request);
Result showLun(const Request &request);
Result updateLun(const Request &request);
Result deleteLun(const Request &request);
Result mapLun(const Request &request);
Result unmapLun(const Request &request);
Result loadLun(const Request &request);
Result unloadLun(const Request &request);

Result listTargets(const Request &request);
Result createTarget(const Request &request);
Result showTarget(const Request &request);
Result deleteTarget(const Request &request);
Result showMasks(const Request &request);
Result setMasks(const Request &request);
Result changeMasks(const Request &request);

/// Resolves a LUN selector to a UUID (which may name no LUN), or a target selector to a target ID
/// (which may name no target).
Result selectLun(const std::string &selector, std::string &uuid);
Result selectTarget(const std::string &selector, int &tid);

} // namespace webapi
