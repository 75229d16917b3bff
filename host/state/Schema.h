/// The tables of the state store.
#pragma once

struct sqlite3;

namespace norvhost {

/// Brings a store to this version's tables, step by step, each step one transaction; a store that is
/// newer than this program is refused. 0, else an error code.
int upgradeSchema(sqlite3 *connection);

/// The version that upgradeSchema() leads to.
int schemaVersion();

} // namespace norvhost
