/// SQLite's results as error codes.
#pragma once

struct sqlite3;

namespace norvhost {

/// The error code for a failed SQLite call, its reason recorded: "<step>: <SQLite's message>".
int storeError(sqlite3 *connection, int sqlite_code, const char *step);

} // namespace norvhost
