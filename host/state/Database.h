/// The state store: one SQLite database, a connection per thread, every change one transaction.
///
///     Transaction transaction;
///     if (transaction.error())
///         return transaction.error();
///     Query query("UPDATE luns SET size = ?1 WHERE lid = ?2");
///     if (int err = query.bind(size).bind(lid).run())
///         return err;
///     return transaction.commit();
///
/// What commit() acknowledged survives a power loss. Failures are error codes with their reason
/// recorded; nothing throws.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <type_traits>

struct sqlite3_stmt;

namespace norvhost {

/// Opens the store of $ISCSI_HOST_STATE, creating or upgrading it where needed. Every Query and
/// Transaction does so by itself. fork() closes the forking thread's connection first: parent and
/// child each open one of their own when they need it.
int openDatabase();

/// Closes this thread's connection; the next use opens it again. No Query or Transaction may live.
void closeDatabase();

/// One statement. Prepared once per connection and kept: the text must be a literal. Bindings go to
/// ?1, ?2, ... in turn. A failure of any step is kept and returned by the later ones.
class Query {
public:
    explicit Query(const char *sql);
    ~Query();
    Query(const Query &) = delete;
    Query &operator=(const Query &) = delete;

    template <class Number, class = std::enable_if_t<std::is_integral_v<Number>>>
    Query &bind(Number value)
    {
        return bindNumber(static_cast<int64_t>(value));
    }
    /// The text must stay until the query ran.
    Query &bind(std::string_view text);
    Query &bindNull();

    /// Goes to the next row: false after the last one and on failure, which error() tells apart.
    bool next();

    /// Runs a statement without rows to its end.
    int run();

    int error() const { return code; }

    /// Whether the failure is that another row has this value in a unique column ("luns.name").
    bool violates(const char *column) const;
    /// Whether the failure is a row that others refer to, or a reference to a missing row.
    bool violatesReference() const;

    int64_t number(int column) const;
    int integer(int column) const { return static_cast<int>(number(column)); }
    /// Empty for NULL. Valid until the next step.
    std::string_view text(int column) const;
    bool isNull(int column) const;

private:
    Query &bindNumber(int64_t value);
    void failed(int sqlite_code);

    sqlite3_stmt *statement = nullptr;
    bool *kept = nullptr; ///< the cache's in-use mark, null for a statement of our own
    int bound = 0;
    int code = 0;
    int extended_code = 0;
    std::string detail;
};

/// A change: begun at once as the only writer, undone when the object ends without commit().
class Transaction {
public:
    Transaction();
    ~Transaction();
    Transaction(const Transaction &) = delete;
    Transaction &operator=(const Transaction &) = delete;

    int error() const { return code; }
    int commit();

private:
    int code;
    bool open = false;
};

/// Row ID of the last insert on this thread's connection, and rows that the last statement changed.
int64_t lastInsertId();
int changedRows();

/// Values of the `settings` table; an unset key is the fallback.
int getSetting(const char *key, const char *fallback, std::string &value);
int setSetting(const char *key, std::string_view value);

} // namespace norvhost
