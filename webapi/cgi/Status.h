/// From the library's error codes to HTTP.
#pragma once

namespace webapi {

/// The HTTP status of a failure: 500 for what no client can help.
int httpStatus(int code);

} // namespace webapi
