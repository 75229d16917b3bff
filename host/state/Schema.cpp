#include "host/state/Schema.h"

#include "host/core/LastError.h"
#include "host/state/StoreError.h"
#include "platform/error.h"

#include <iterator>
#include <sqlite3.h>
#include <string>

namespace norvhost {
namespace {

/// The n-th entry leads from version n to n + 1. A released entry never changes; append.
const char *const steps[] = {
    R"sql(
CREATE TABLE settings (
    key TEXT PRIMARY KEY,
    value TEXT NOT NULL
) STRICT, WITHOUT ROWID;
-- The store's identity: it marks the data files that belong to this store's rows.
INSERT INTO settings VALUES ('store', lower(hex(randomblob(16))));

-- The image is the file that we loop-mount at the path; empty where somebody else mounts it.
CREATE TABLE volumes (
    path TEXT PRIMARY KEY,
    mount_point TEXT NOT NULL,
    image TEXT NOT NULL DEFAULT ''
) STRICT, WITHOUT ROWID;

CREATE TABLE luns (
    lid INTEGER PRIMARY KEY CHECK (lid BETWEEN 1 AND 1024),
    uuid TEXT NOT NULL UNIQUE,
    name TEXT NOT NULL UNIQUE,
    type INTEGER NOT NULL,
    location TEXT NOT NULL,
    size INTEGER NOT NULL CHECK (size > 0),
    extent_size INTEGER NOT NULL DEFAULT 0,
    restored_time INTEGER NOT NULL DEFAULT 0,
    options INTEGER NOT NULL DEFAULT 0,
    loaded INTEGER NOT NULL DEFAULT 1 CHECK (loaded IN (0, 1))
) STRICT;

CREATE TABLE targets (
    tid INTEGER PRIMARY KEY CHECK (tid BETWEEN 1 AND 256),
    name TEXT NOT NULL UNIQUE,
    iqn TEXT NOT NULL UNIQUE,
    enabled INTEGER NOT NULL CHECK (enabled IN (0, 1)),
    header_digest INTEGER NOT NULL DEFAULT 0,
    data_digest INTEGER NOT NULL DEFAULT 0,
    max_recv_seg_bytes INTEGER NOT NULL,
    max_send_seg_bytes INTEGER NOT NULL,
    max_sessions INTEGER NOT NULL,
    auth_type INTEGER NOT NULL,
    user TEXT NOT NULL DEFAULT '',
    password TEXT NOT NULL DEFAULT '',
    mutual_user TEXT NOT NULL DEFAULT '',
    mutual_password TEXT NOT NULL DEFAULT ''
) STRICT;

CREATE TABLE mappings (
    tid INTEGER NOT NULL REFERENCES targets ON DELETE CASCADE,
    lid INTEGER NOT NULL REFERENCES luns ON DELETE RESTRICT,
    mapping_index INTEGER NOT NULL,
    PRIMARY KEY (tid, lid),
    UNIQUE (tid, mapping_index)
) STRICT, WITHOUT ROWID;
CREATE INDEX mappings_of_lun ON mappings (lid);

CREATE TABLE maskings (
    tid INTEGER NOT NULL REFERENCES targets ON DELETE CASCADE,
    iqn TEXT NOT NULL,
    permission INTEGER NOT NULL,
    PRIMARY KEY (tid, iqn)
) STRICT, WITHOUT ROWID;

-- AUTOINCREMENT: the ID of a removed job never comes back as another one's.
CREATE TABLE schedules (
    id INTEGER PRIMARY KEY AUTOINCREMENT,
    kind TEXT NOT NULL CHECK (kind IN ('backup', 'snapshot')),
    lid INTEGER NOT NULL REFERENCES luns ON DELETE CASCADE,
    rule TEXT NOT NULL,
    UNIQUE (lid, kind)
) STRICT;

CREATE TABLE retention_policies (
    kind TEXT NOT NULL,
    key TEXT NOT NULL,
    policy TEXT NOT NULL,
    PRIMARY KEY (kind, key)
) STRICT, WITHOUT ROWID;
)sql",

    R"sql(
-- The snapshot that an unfinished restore sets the LUN's data back to; empty for none.
ALTER TABLE luns ADD COLUMN restoring_uuid TEXT NOT NULL DEFAULT '';

-- The loaded number is the LUN number of a snapshot that initiators may read, NULL while they may not.
CREATE TABLE snapshots (
    lid INTEGER NOT NULL REFERENCES luns ON DELETE RESTRICT,
    snap_id INTEGER NOT NULL CHECK (snap_id BETWEEN 1 AND 256),
    uuid TEXT NOT NULL UNIQUE,
    name TEXT NOT NULL,
    description TEXT NOT NULL,
    taken_by TEXT NOT NULL,
    version TEXT NOT NULL,
    create_time INTEGER NOT NULL,
    snap_time INTEGER NOT NULL,
    flags INTEGER NOT NULL,
    app_consistent INTEGER NOT NULL CHECK (app_consistent IN (0, 1)),
    user_locked INTEGER NOT NULL CHECK (user_locked IN (0, 1)),
    total_size INTEGER NOT NULL,
    mapped_size INTEGER NOT NULL,
    loaded_number INTEGER UNIQUE,
    PRIMARY KEY (lid, snap_id),
    UNIQUE (lid, name)
) STRICT;

CREATE TABLE snapshot_app_keys (
    uuid TEXT NOT NULL REFERENCES snapshots (uuid) ON DELETE CASCADE,
    key TEXT NOT NULL,
    PRIMARY KEY (uuid, key)
) STRICT, WITHOUT ROWID;

CREATE TABLE events (
    id INTEGER PRIMARY KEY AUTOINCREMENT,
    time INTEGER NOT NULL,
    scope INTEGER NOT NULL,
    level INTEGER NOT NULL,
    number INTEGER NOT NULL,
    text1 TEXT NOT NULL DEFAULT '',
    text2 TEXT NOT NULL DEFAULT '',
    text3 TEXT NOT NULL DEFAULT '',
    text4 TEXT NOT NULL DEFAULT ''
) STRICT;

-- Times in seconds since the epoch, 0 = not yet; the options are a JSON object.
ALTER TABLE schedules ADD COLUMN next_run INTEGER NOT NULL DEFAULT 0;
ALTER TABLE schedules ADD COLUMN last_run INTEGER NOT NULL DEFAULT 0;
ALTER TABLE schedules ADD COLUMN options TEXT NOT NULL DEFAULT '{}';
)sql",

    R"sql(
-- Exports and imports under way; the number is 0 for an import into the LUN. A row outlives the worker that was killed,
-- and its snapshot, so that what the worker left is found. State 0: runs, 1: is to stop, 2: cannot be stopped any more.
CREATE TABLE transfers (
    lid INTEGER NOT NULL,
    snap_id INTEGER NOT NULL,
    folder TEXT NOT NULL,
    made_folder INTEGER NOT NULL CHECK (made_folder IN (0, 1)),
    state INTEGER NOT NULL DEFAULT 0 CHECK (state IN (0, 1, 2)),
    PRIMARY KEY (lid, snap_id)
) STRICT, WITHOUT ROWID;
CREATE UNIQUE INDEX folders_of_exports ON transfers (folder) WHERE snap_id > 0;
)sql",

    R"sql(
-- Nodes, accounts, virtual LUNs, replication.
-- The password as crypt(5) has it; the one-time secret in base32, empty for none, with the time step of the code that
-- was accepted last.
CREATE TABLE accounts (
    name TEXT PRIMARY KEY,
    role TEXT NOT NULL CHECK (role IN ('viewer', 'admin')),
    password TEXT NOT NULL,
    otp_secret TEXT NOT NULL DEFAULT '',
    otp_step INTEGER NOT NULL DEFAULT 0,
    created INTEGER NOT NULL
) STRICT, WITHOUT ROWID;

-- The token's SHA-256 in hexadecimal. The address is empty when the session may be used from any. The duration is in
-- seconds, 0 for no end; NULL for a person's session, which has the role of its account and the limits of the settings.
CREATE TABLE sessions (
    id INTEGER PRIMARY KEY AUTOINCREMENT,
    token_hash TEXT NOT NULL UNIQUE,
    account TEXT NOT NULL,
    app TEXT NOT NULL DEFAULT '',
    opened_from TEXT NOT NULL,
    address TEXT NOT NULL,
    duration INTEGER,
    created INTEGER NOT NULL,
    last_used INTEGER NOT NULL
) STRICT;

-- Failed log-ins, and when the last was.
CREATE TABLE login_failures (
    kind TEXT NOT NULL CHECK (kind IN ('account', 'address')),
    key TEXT NOT NULL,
    failures INTEGER NOT NULL,
    last INTEGER NOT NULL,
    PRIMARY KEY (kind, key)
) STRICT, WITHOUT ROWID;

-- Other appliances, in the order in which they were met. A session that was opened on one is kept before the two are
-- paired. Attributes may also be the local node's.
CREATE TABLE nodes (
    id INTEGER PRIMARY KEY AUTOINCREMENT,
    uuid TEXT NOT NULL UNIQUE,
    host TEXT NOT NULL,
    port INTEGER NOT NULL CHECK (port BETWEEN 1 AND 65535),
    protocol TEXT NOT NULL,
    token TEXT NOT NULL,
    paired INTEGER NOT NULL CHECK (paired IN (0, 1))
) STRICT;

CREATE TABLE node_attributes (
    uuid TEXT NOT NULL,
    app TEXT NOT NULL,
    key TEXT NOT NULL,
    value TEXT NOT NULL,
    PRIMARY KEY (uuid, app, key)
) STRICT, WITHOUT ROWID;

-- The keys that web servers are known by, as "sha256//" and base64.
CREATE TABLE pins (
    host TEXT NOT NULL,
    port INTEGER NOT NULL CHECK (port BETWEEN 1 AND 65535),
    pin TEXT NOT NULL,
    PRIMARY KEY (host, port)
) STRICT, WITHOUT ROWID;

-- Halves of replications. The latest sending from here; what arrives here: which state on which base, what the LUN held
-- before, its snapshot's name on the peer, and below which place it is flushed; the latest count of unsynchronised bytes.
CREATE TABLE replication_tasks (
    id INTEGER PRIMARY KEY,
    uuid TEXT NOT NULL UNIQUE,
    is_source INTEGER NOT NULL CHECK (is_source IN (0, 1)),
    src_lun TEXT NOT NULL,
    dst_lun TEXT NOT NULL,
    src_node TEXT NOT NULL,
    dst_node TEXT NOT NULL,
    root_path TEXT NOT NULL,
    parent_task TEXT NOT NULL,
    sent INTEGER NOT NULL DEFAULT 0,
    total INTEGER NOT NULL DEFAULT 0,
    progress INTEGER NOT NULL DEFAULT 0,
    error INTEGER NOT NULL DEFAULT 0,
    reason TEXT NOT NULL DEFAULT '',
    stop INTEGER NOT NULL DEFAULT 0,
    arriving TEXT NOT NULL DEFAULT '',
    arriving_base TEXT NOT NULL DEFAULT '',
    arriving_on TEXT NOT NULL DEFAULT '',
    arriving_name TEXT NOT NULL DEFAULT '',
    arrived INTEGER NOT NULL DEFAULT 0,
    unsync_bytes INTEGER NOT NULL DEFAULT 0,
    unsync_completed INTEGER NOT NULL DEFAULT 0,
    unsync_error INTEGER NOT NULL DEFAULT 0
) STRICT;
CREATE UNIQUE INDEX sinks_of_tasks ON replication_tasks (dst_lun) WHERE NOT is_source;

-- Sink LUNs that a peer may write now, through a target that bears a new name each time, and when a session of its was
-- last seen there.
CREATE TABLE sinks (
    lid INTEGER PRIMARY KEY REFERENCES luns ON DELETE RESTRICT,
    iqn TEXT NOT NULL UNIQUE,
    seen INTEGER NOT NULL
) STRICT;

-- LUNs on their way to a sink of a node. The sink's target is empty while none is open for us; the state is the errno
-- value of a transfer that ended otherwise than complete, and the bytes are those of an ended transfer.
CREATE TABLE virtual_luns (
    id INTEGER PRIMARY KEY AUTOINCREMENT,
    uuid TEXT NOT NULL UNIQUE,
    lid INTEGER NOT NULL REFERENCES luns ON DELETE RESTRICT,
    kind INTEGER NOT NULL,
    node TEXT NOT NULL DEFAULT '',
    portal TEXT NOT NULL DEFAULT '',
    sink TEXT NOT NULL DEFAULT '',
    sink_iqn TEXT NOT NULL DEFAULT '',
    moved INTEGER NOT NULL DEFAULT 0,
    total INTEGER NOT NULL DEFAULT 0,
    ended INTEGER NOT NULL DEFAULT 0 CHECK (ended IN (0, 1)),
    state INTEGER NOT NULL DEFAULT 0
) STRICT;

-- What transfers had become whose virtual LUNs were removed: the latest 16 of each LUN.
CREATE TABLE removed_transfers (
    id INTEGER PRIMARY KEY, -- the virtual LUN's
    lid INTEGER NOT NULL REFERENCES luns ON DELETE CASCADE,
    uuid TEXT NOT NULL,
    node TEXT NOT NULL,
    portal TEXT NOT NULL,
    sink TEXT NOT NULL,
    moved INTEGER NOT NULL,
    total INTEGER NOT NULL,
    ended INTEGER NOT NULL,
    state INTEGER NOT NULL
) STRICT;
CREATE TRIGGER keep_removed_transfer AFTER DELETE ON virtual_luns WHEN OLD.sink <> '' BEGIN
    INSERT INTO removed_transfers VALUES
        (OLD.id, OLD.lid, OLD.uuid, OLD.node, OLD.portal, OLD.sink, OLD.moved, OLD.total, OLD.ended, OLD.state);
    DELETE FROM removed_transfers WHERE lid = OLD.lid AND id NOT IN
        (SELECT id FROM removed_transfers WHERE lid = OLD.lid ORDER BY id DESC LIMIT 16);
END;
)sql",
};

constexpr int latest = static_cast<int>(std::size(steps));

int execute(sqlite3 *connection, const char *sql, const char *step)
{
    const int result = sqlite3_exec(connection, sql, nullptr, nullptr, nullptr);
    return result == SQLITE_OK ? 0 : storeError(connection, result, step);
}

int readVersion(sqlite3 *connection, int &version)
{
    sqlite3_stmt *statement = nullptr;
    int result = sqlite3_prepare_v2(connection, "PRAGMA user_version", -1, &statement, nullptr);
    if (result == SQLITE_OK)
        result = sqlite3_step(statement);
    if (result == SQLITE_ROW)
        version = sqlite3_column_int(statement, 0);
    sqlite3_finalize(statement);
    return result == SQLITE_ROW ? 0 : storeError(connection, result, "cannot read the state's version");
}

/// One step, inside a transaction.
int takeStep(sqlite3 *connection)
{
    int version = 0;
    if (int err = readVersion(connection, version))
        return err;
    if (version >= latest)
        return 0; // another process took it while we waited
    if (int err = execute(connection, steps[version], "cannot upgrade the state"))
        return err;
    const std::string set_version = "PRAGMA user_version = " + std::to_string(version + 1);
    return execute(connection, set_version.c_str(), "cannot set the state's version");
}

} // namespace

int schemaVersion()
{
    return latest;
}

int upgradeSchema(sqlite3 *connection)
{
    for (;;) {
        int version = 0;
        if (int err = readVersion(connection, version))
            return err;
        if (version > latest)
            return fail(NORV_ERR_GET_CONFIG, "the state was written by a newer version (its format is %d, we know %d)",
                        version, latest);
        if (version == latest)
            return 0;

        if (int err = execute(connection, "BEGIN IMMEDIATE", "cannot begin to upgrade the state"))
            return err;
        int err = takeStep(connection);
        if (!err)
            err = execute(connection, "COMMIT", "cannot upgrade the state");
        if (err) {
            sqlite3_exec(connection, "ROLLBACK", nullptr, nullptr, nullptr);
            return err;
        }
    }
}

} // namespace norvhost
