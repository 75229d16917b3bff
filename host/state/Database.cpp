#include "host/state/Database.h"

#include "host/core/LastError.h"
#include "host/core/Paths.h"
#include "host/state/Schema.h"
#include "host/state/StoreError.h"
#include "platform/error.h"

#include <algorithm>
#include <cassert>
#include <cerrno>
#include <chrono>
#include <fcntl.h>
#include <poll.h>
#include <pthread.h>
#include <sqlite3.h>
#include <unistd.h>
#include <unordered_map>

namespace norvhost {
namespace {

/// Writers do not queue: who is out of luck waits for many of the others' turns, each with its flush.
constexpr auto busy_limit = std::chrono::seconds(90);
constexpr int longest_pause_ms = 10;

/// For sqlite3_busy_handler(). SQLite's own pauses for up to a tenth of a second, in which those who just came take
/// turn after turn.
int waitForOthers(void *, int calls)
{
    using Clock = std::chrono::steady_clock;
    thread_local Clock::time_point begin;
    const auto now = Clock::now();
    if (calls == 0)
        begin = now;
    if (now - begin >= busy_limit)
        return 0;
    poll(nullptr, 0, std::min(calls + 1, longest_pause_ms));
    return 1;
}

struct KeptStatement {
    sqlite3_stmt *statement = nullptr;
    bool in_use = false;
};

struct Connection {
    sqlite3 *handle = nullptr;
    std::unordered_map<const char *, KeptStatement> statements; // by the address of the literal

    ~Connection() { close(); }

    void close()
    {
        for (auto &entry : statements)
            sqlite3_finalize(entry.second.statement);
        statements.clear();
        sqlite3_close(handle);
        handle = nullptr;
    }
};

thread_local Connection connection;

/// SQLite creates files as the umask says; this one holds passwords. Its companions take its mode.
int createPrivateFile(const std::string &path)
{
    // O_EXCL: opening an existing file and closing it again would drop SQLite's locks on it.
    const int fd = open(path.c_str(), O_RDWR | O_CREAT | O_EXCL | O_CLOEXEC, 0600);
    if (fd < 0)
        return errno == EEXIST ? 0 : failErrno(NORV_ERR_OPEN_FILE, errno, "cannot create the state %s", path.c_str());
    close(fd);
    return 0;
}

int openConnection()
{
    const std::string folder = stateFolder();
    const std::string path = folder + "/state.db";
    if (int err = makeFolder(folder))
        return err;
    if (int err = createPrivateFile(path))
        return err;

    sqlite3 *&handle = connection.handle;
    const int flags = SQLITE_OPEN_READWRITE | SQLITE_OPEN_NOMUTEX;
    if (int result = sqlite3_open_v2(path.c_str(), &handle, flags, nullptr))
        return storeError(handle, result, ("cannot open the state " + path).c_str());
    sqlite3_extended_result_codes(handle, 1);
    sqlite3_busy_handler(handle, waitForOthers, nullptr);
    const char *const settings = "PRAGMA journal_mode = WAL; PRAGMA synchronous = FULL; PRAGMA foreign_keys = ON";
    if (int result = sqlite3_exec(handle, settings, nullptr, nullptr, nullptr))
        return storeError(handle, result, ("cannot open the state " + path).c_str());
    return upgradeSchema(handle);
}

} // namespace

int storeError(sqlite3 *handle, int sqlite_code, const char *step)
{
    const char *text = handle ? sqlite3_errmsg(handle) : sqlite3_errstr(sqlite_code);
    switch (sqlite_code & 0xff) {
    case SQLITE_BUSY:
    case SQLITE_LOCKED:
        return fail(NORV_ERR_TIMEOUT, "%s: other processes kept the state busy: %s", step, text);
    case SQLITE_FULL:
        return fail(NORV_ERR_OUT_OF_SPACE, "%s: %s", step, text);
    case SQLITE_NOMEM:
        return fail(NORV_ERR_OUT_OF_MEMORY, "%s: %s", step, text);
    case SQLITE_READONLY:
    case SQLITE_PERM:
    case SQLITE_AUTH:
        return fail(NORV_ERR_NO_PERMISSION, "%s: %s", step, text);
    case SQLITE_CANTOPEN:
        return fail(NORV_ERR_OPEN_FILE, "%s: %s", step, text);
    case SQLITE_IOERR:
        return fail(NORV_ERR_IO, "%s: %s", step, text);
    case SQLITE_CORRUPT:
    case SQLITE_NOTADB:
        return fail(NORV_ERR_GET_CONFIG, "%s: %s", step, text);
    default:
        return fail(NORV_ERR_SET_CONFIG, "%s: %s", step, text);
    }
}

int openDatabase()
{
    if (connection.handle)
        return 0;

    // SQLite's view of its locks does not survive fork(): a child that opens the file while it carries
    // a copy of an open connection believes to hold locks that only the parent holds.
    static const int at_fork = pthread_atfork(closeDatabase, nullptr, nullptr);
    (void)at_fork;

    if (int err = openConnection()) {
        closeDatabase();
        return err;
    }
    return 0;
}

void closeDatabase()
{
    connection.close();
}

Query::Query(const char *sql)
{
    if ((code = openDatabase()))
        return;
    KeptStatement &entry = connection.statements[sql];
    const bool nested = entry.in_use;
    sqlite3_stmt *&prepared = nested ? statement : entry.statement;
    if (!prepared) {
        const unsigned flags = nested ? 0 : SQLITE_PREPARE_PERSISTENT;
        if (int result = sqlite3_prepare_v3(connection.handle, sql, -1, flags, &prepared, nullptr)) {
            failed(result);
            return;
        }
    }
    if (nested)
        return;
    statement = entry.statement;
    entry.in_use = true;
    kept = &entry.in_use;
}

Query::~Query()
{
    if (!kept) {
        sqlite3_finalize(statement);
        return;
    }
    sqlite3_reset(statement);
    sqlite3_clear_bindings(statement);
    *kept = false;
}

void Query::failed(int sqlite_code)
{
    extended_code = sqlite_code;
    detail = sqlite3_errmsg(connection.handle);
    code = storeError(connection.handle, sqlite_code, "state");
}

Query &Query::bindNumber(int64_t value)
{
    if (!code)
        if (int result = sqlite3_bind_int64(statement, ++bound, value))
            failed(result);
    return *this;
}

Query &Query::bind(std::string_view text)
{
    // A null pointer would bind NULL.
    const char *data = text.data() ? text.data() : "";
    if (!code)
        if (int result = sqlite3_bind_text64(statement, ++bound, data, text.size(), SQLITE_STATIC, SQLITE_UTF8))
            failed(result);
    return *this;
}

Query &Query::bindNull()
{
    ++bound; // what is not bound is NULL
    return *this;
}

bool Query::next()
{
    if (code)
        return false;
    const int result = sqlite3_step(statement);
    if (result != SQLITE_ROW && result != SQLITE_DONE)
        failed(result);
    return result == SQLITE_ROW;
}

int Query::run()
{
    while (next())
        ;
    return code;
}

bool Query::violates(const char *column) const
{
    return (extended_code == SQLITE_CONSTRAINT_UNIQUE || extended_code == SQLITE_CONSTRAINT_PRIMARYKEY ||
            extended_code == SQLITE_CONSTRAINT_ROWID) &&
           detail.find(column) != std::string::npos;
}

bool Query::violatesReference() const
{
    return extended_code == SQLITE_CONSTRAINT_FOREIGNKEY;
}

int64_t Query::number(int column) const
{
    return sqlite3_column_int64(statement, column);
}

std::string_view Query::text(int column) const
{
    const unsigned char *data = sqlite3_column_text(statement, column);
    if (!data)
        return {};
    return {reinterpret_cast<const char *>(data), static_cast<size_t>(sqlite3_column_bytes(statement, column))};
}

bool Query::isNull(int column) const
{
    return sqlite3_column_type(statement, column) == SQLITE_NULL;
}

Transaction::Transaction()
{
    Query begin("BEGIN IMMEDIATE");
    code = begin.run();
    open = !code;
}

Transaction::~Transaction()
{
    if (open && !sqlite3_get_autocommit(connection.handle)) {
        Query rollback("ROLLBACK");
        rollback.run();
    }
}

int Transaction::commit()
{
    if (code)
        return code;
    Query query("COMMIT");
    code = query.run();
    open = code != 0; // a refused commit leaves the transaction for the destructor to undo
    return code;
}

int64_t lastInsertId()
{
    return sqlite3_last_insert_rowid(connection.handle);
}

int changedRows()
{
    return sqlite3_changes(connection.handle);
}

int getSetting(const char *key, const char *fallback, std::string &value)
{
    Query query("SELECT value FROM settings WHERE key = ?1");
    const bool found = query.bind(key).next();
    if (query.error())
        return query.error();
    value = found ? query.text(0) : std::string_view(fallback);
    return 0;
}

int setSetting(const char *key, std::string_view value)
{
    Query query("INSERT INTO settings VALUES (?1, ?2) ON CONFLICT (key) DO UPDATE SET value = excluded.value");
    return query.bind(key).bind(value).run();
}

} // namespace norvhost
