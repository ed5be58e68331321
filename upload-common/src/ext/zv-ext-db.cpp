// Upload history store: one process-wide SQLite connection to the history file that the
// service and the companion client share, the statements both run on it, the row-count trim
// on insert and the busy handler through which the two processes wait for each other's lock.
#include "zv-ext-db.h"

#include <Ecore_File.h>
#include <sqlite3.h>
#include <stdarg.h>
#include <stdlib.h>

#include <chrono>
#include <memory>
#include <string>
#include <thread>

#include "zv-log.h"

// Warning-level note in green, placed like the red of an error line.
#define ZV_DB_LOGW_GREEN(fmt, ...)                                                                 \
    dlog_print(DLOG_WARN, ZV_LOG_TAG, "%s: %s(%d) > " ZV_LOG_GREEN "[TID:%d] " fmt ZV_LOG_RESET,   \
               __FILE_NAME__, __func__, __LINE__, (int)gettid(), ##__VA_ARGS__)

// The store's own line for a failed statement, then the library's message on a line of its
// own.
#define ZV_DB_LOGE_SQL(fmt, rc, db)                                                                \
    do {                                                                                           \
        ZV_LOGE(fmt, rc);                                                                          \
        log_library_message(db);                                                                   \
    } while (0)

namespace
{

constexpr const char *kDefaultDbPath = "/opt/usr/apps/zuvo-client/data/db/.zuvo-history.db";
// More rows than this make an insert drop the completed ones first.
constexpr int kTrimRowCount = 5000;
// The busy handler refuses from this retry on.
constexpr int kBusyRetries = 5;

constexpr const char *kCreateSql =
    "create table if not exists history(id integer primary key autoincrement, historyid integer "
    ",title,  filename, filesize integer, url, percent integer, status integer, userid, date "
    "datetime)";
// Every update and delete selects by historyid, and the service updates a row for each
// progress report: the index keeps those statements from scanning the table.
constexpr const char *kIndexSql =
    "create index if not exists history_historyid on history(historyid)";
constexpr const char *kInsertSql =
    "insert into history (historyid, title, \t\t\tfilename, filesize, url, percent, status, "
    "userid, date) \t\t\tvalues(?, ?, ?, ?, ?, ?, ?, ?, ?)";
constexpr const char *kDeleteSql = "delete from history where historyid=?";
constexpr const char *kUpdateSql =
    "update history set percent = ?, status = ?, url = ? \t\t\twhere historyid = ? ";
constexpr const char *kLoadColumns = "select historyid, title, filename, filesize, url, "
                                     "percent, status, userid, date ";
constexpr const char *kCountPrefix = "select COUNT(*) from history ";

struct DbCloser {
    void operator()(sqlite3 *db) const { sqlite3_close_v2(db); }
};
using DbPtr = std::unique_ptr<sqlite3, DbCloser>;

struct StmtFinalizer {
    void operator()(sqlite3_stmt *stmt) const { sqlite3_finalize(stmt); }
};
using StmtPtr = std::unique_ptr<sqlite3_stmt, StmtFinalizer>;

struct GStringFree {
    void operator()(GString *s) const { g_string_free(s, TRUE); }
};
using GStringPtr = std::unique_ptr<GString, GStringFree>;

struct GFree {
    void operator()(gchar *p) const { g_free(p); }
};

// The module's state: the connection, NULL while closed, and the update statement, prepared
// once per connection (the service updates a row for every progress report). The statement
// is declared after the connection, so it is finalized first.
struct StoreState {
    DbPtr db;
    StmtPtr update;
};

StoreState g_store;

std::string history_db_path()
{
    const char *env = getenv("ZV_HISTORY_DB");
    return (env && *env) ? env : kDefaultDbPath;
}

// The open connection, or NULL (logged) when open has not succeeded: no statement runs on a
// handle that failed to open.
sqlite3 *connection()
{
    if (!g_store.db)
        ZV_LOGE("db is not open");
    return g_store.db.get();
}

// Builds a statement text from printf-style pieces; NULL (logged) when GLib cannot.
GStringPtr build_statement(const char *fmt, ...) G_GNUC_PRINTF(1, 2);
GStringPtr build_statement(const char *fmt, ...)
{
    GStringPtr sql(g_string_new(nullptr));
    if (!sql) {
        ZV_LOGE("g_string_new is failed.");
        return nullptr;
    }
    va_list ap;
    va_start(ap, fmt);
    g_string_append_vprintf(sql.get(), fmt, ap);
    va_end(ap);
    if (!sql->str || sql->len == 0) {
        ZV_LOGE("g_string_append_printf() failed.");
        return nullptr;
    }
    return sql;
}

// The library's message about the last failure on db, on a line of its own: it follows the
// store's own line ("SQL error: %d", ...), which stays whole.
void log_library_message(sqlite3 *db)
{
    ZV_LOGE("sqlite: %s", db ? sqlite3_errmsg(db) : "no connection");
}

// Prepares sql on db; on failure logs "SQL error" and the library's message and returns NULL.
StmtPtr prepare(sqlite3 *db, const char *sql, unsigned int flags = 0)
{
    sqlite3_stmt *raw = nullptr;
    int rc = sqlite3_prepare_v3(db, sql, -1, flags, &raw, nullptr);
    StmtPtr stmt(raw);
    if (rc != SQLITE_OK) {
        ZV_LOGE("SQL error: %d", rc);
        log_library_message(db);
        return nullptr;
    }
    return stmt;
}

// Finalizes the statement now; a failure is logged and changes no result.
void finalize(StmtPtr &stmt)
{
    sqlite3 *db = sqlite3_db_handle(stmt.get());
    if (sqlite3_finalize(stmt.release()) != SQLITE_OK) {
        ZV_LOGE("sqlite3_finalize is failed.");
        log_library_message(db);
    }
}

bool step_succeeded(int rc)
{
    return rc == SQLITE_DONE || rc == SQLITE_ROW || rc == SQLITE_OK;
}

void bind_int(sqlite3_stmt *stmt, int index, int value)
{
    if (sqlite3_bind_int(stmt, index, value) != SQLITE_OK) {
        ZV_LOGE("sqlite3_bind_int is failed.");
        log_library_message(sqlite3_db_handle(stmt));
    }
}

// A size column: 64-bit, since videos pass 2 GiB. Logged as an int bind.
void bind_int64(sqlite3_stmt *stmt, int index, int64_t value)
{
    if (sqlite3_bind_int64(stmt, index, value) != SQLITE_OK)
        ZV_LOGE("sqlite3_bind_int is failed. (%s)", sqlite3_errmsg(sqlite3_db_handle(stmt)));
}

// The text is not copied: it must live until the statement has been stepped.
void bind_text(sqlite3_stmt *stmt, int index, const char *value)
{
    if (sqlite3_bind_text(stmt, index, value, -1, SQLITE_STATIC) != SQLITE_OK) {
        ZV_LOGE("sqlite3_bind_text is failed.");
        log_library_message(sqlite3_db_handle(stmt));
    }
}

void bind_double(sqlite3_stmt *stmt, int index, double value)
{
    if (sqlite3_bind_double(stmt, index, value) != SQLITE_OK) {
        ZV_LOGE("sqlite3_bind_double is failed.");
        log_library_message(sqlite3_db_handle(stmt));
    }
}

char *column_text_copy(sqlite3_stmt *stmt, int column)
{
    return g_strdup(reinterpret_cast<const char *>(sqlite3_column_text(stmt, column)));
}

// Speed settings chosen for a file that two processes write at once: write-ahead logging
// lets the companion read while the service writes progress, synchronous NORMAL spares an
// fsync per progress row (a commit may be lost at power failure, the file stays sound), and
// the index serves the lookups by historyid. None of them is needed for correctness, so a
// failure is logged and the store goes on.
void tune_connection(sqlite3 *db)
{
    if (StmtPtr stmt = prepare(db, "PRAGMA journal_mode=WAL")) {
        int rc = sqlite3_step(stmt.get());
        const char *mode = rc == SQLITE_ROW
                               ? reinterpret_cast<const char *>(sqlite3_column_text(stmt.get(), 0))
                               : nullptr;
        if (!mode || g_ascii_strcasecmp(mode, "wal") != 0)
            ZV_LOGE("journal_mode WAL not set (%d: %s)", rc, sqlite3_errmsg(db));
        finalize(stmt);
    }
    for (const char *sql : {"PRAGMA synchronous=NORMAL", kIndexSql}) {
        if (StmtPtr stmt = prepare(db, sql)) {
            int rc = sqlite3_step(stmt.get());
            if (!step_succeeded(rc))
                ZV_DB_LOGE_SQL("SQL error: %d", rc, db);
            finalize(stmt);
        }
    }
}

// Appends to *list one record per row, all rows or the READY ones, oldest date first.
int load_items(GList **list, bool ready_only)
{
    if (!list) {
        ZV_LOGE("handle is NULL");
        return 0;
    }
    sqlite3 *db = connection();
    if (!db)
        return 0;
    GStringPtr sql = ready_only
                         ? build_statement("%sfrom history where status = %d order by date ASC",
                                           kLoadColumns, (int)ZV_UPLOAD_STATUS_READY)
                         : build_statement("%sfrom history order by date ASC", kLoadColumns);
    if (!sql)
        return 0;
    StmtPtr stmt = prepare(db, sql->str);
    if (!stmt)
        return 0;

    GList *rows = nullptr;
    while (sqlite3_step(stmt.get()) == SQLITE_ROW) {
        DbItem *item = g_try_new0(DbItem, 1);
        if (!item)
            continue;
        sqlite3_stmt *s = stmt.get();
        item->historyid = sqlite3_column_int(s, 0);
        item->title = column_text_copy(s, 1);
        item->filename = column_text_copy(s, 2);
        item->filesize = sqlite3_column_int64(s, 3);
        item->url = column_text_copy(s, 4);
        item->percent = sqlite3_column_int(s, 5);
        item->status = sqlite3_column_int(s, 6);
        item->userid = column_text_copy(s, 7);
        item->date = sqlite3_column_double(s, 8);
        rows = g_list_prepend(rows, item);
    }
    finalize(stmt);
    *list = g_list_concat(*list, g_list_reverse(rows));
    return 1;
}

// Runs a COUNT statement: the count, 0 when the step fails, -1 when it cannot be prepared.
int step_count(sqlite3 *db, const char *sql)
{
    StmtPtr stmt = prepare(db, sql);
    if (!stmt)
        return -1;
    int count = 0;
    int rc = sqlite3_step(stmt.get());
    if (rc == SQLITE_ROW) {
        ZV_LOGI("SQL step success");
        count = sqlite3_column_int(stmt.get(), 0);
    } else {
        ZV_DB_LOGE_SQL("SQL return: %d", rc, db);
    }
    finalize(stmt);
    return count;
}

// Number of rows whose status matches the condition built from where_fmt; -1 when the
// statement cannot be prepared (or no connection is open), 0 on the other failures.
int count_rows(const char *where_fmt, ...) G_GNUC_PRINTF(1, 2);
int count_rows(const char *where_fmt, ...)
{
    sqlite3 *db = connection();
    if (!db)
        return -1;
    GStringPtr sql(g_string_new(kCountPrefix));
    if (!sql) {
        ZV_LOGE("g_string_new is failed.");
        return 0;
    }
    va_list ap;
    va_start(ap, where_fmt);
    g_string_append_vprintf(sql.get(), where_fmt, ap);
    va_end(ap);
    if (!sql->str || sql->len == 0) {
        ZV_LOGE("g_string_append_printf() failed.");
        return 0;
    }
    return step_count(db, sql->str);
}

} // namespace

// Called by SQLite while another connection holds the lock that a statement needs; count is
// how often it was already called for this lock. Waits 100, 200, 300, 400 and 500 ms, then
// gives up so that the statement fails with SQLITE_BUSY.
static int _zv_ext_db_busyhandler(void *, int count)
{
    if (count >= kBusyRetries) {
        ZV_LOGE("busy handler will be returned SQLITE_BUSY error");
        return 0;
    }
    std::this_thread::sleep_for(std::chrono::milliseconds((count + 1) * 100));
    ZV_LOGI("busy handler called (count : %d)", count);
    return 1;
}

// Trim, first step: the number of rows, 0 when the step fails, -1 when the statement cannot
// be prepared.
static int _zv_ext_db_get_count(sqlite3 *db)
{
    GStringPtr sql = build_statement("%s", "select COUNT(*) from history");
    if (!sql)
        return 0;
    return step_count(db, sql->str);
}

// Trim, second step: drops every completed row.
static int _zv_ext_db_delete_all_item(sqlite3 *db)
{
    GStringPtr sql =
        build_statement("delete from history where status = %d", (int)ZV_UPLOAD_STATUS_COMPLETED);
    if (!sql)
        return 0;
    StmtPtr stmt = prepare(db, sql->str);
    if (!stmt)
        return 0;
    int rc = sqlite3_step(stmt.get());
    bool ok = step_succeeded(rc);
    if (!ok)
        ZV_DB_LOGE_SQL("SQL error: %d", rc, db);
    finalize(stmt);
    return ok ? 1 : 0;
}

int zv_ext_db_open(void)
{
    ZV_LOG_ENTER();
    if (g_store.db)
        return 1;

    const std::string path = history_db_path();
    std::unique_ptr<gchar, GFree> dir(g_path_get_dirname(path.c_str()));
    if (!ecore_file_is_dir(dir.get())) {
        ZV_DB_LOGW_GREEN("make default dbdir");
        if (ecore_file_mkdir(dir.get()))
            ZV_LOGI("success make dbdir");
        else
            ZV_LOGE("fail make dbdir");
    }

    sqlite3 *raw = nullptr;
    int rc = sqlite3_open(path.c_str(), &raw);
    DbPtr db(raw);
    if (rc != SQLITE_OK) {
        ZV_LOGE("db open fail.[%s]", raw ? sqlite3_errmsg(raw) : sqlite3_errstr(rc));
        return 0;
    }

    GStringPtr sql = build_statement("%s", kCreateSql);
    if (!sql)
        return 0;
    StmtPtr stmt = prepare(db.get(), sql->str);
    if (!stmt)
        return 0;
    rc = sqlite3_step(stmt.get());
    if (rc != SQLITE_DONE && rc != SQLITE_OK) {
        ZV_DB_LOGE_SQL("SQL error: %d", rc, db.get());
        finalize(stmt);
        return 0;
    }
    finalize(stmt);

    rc = sqlite3_busy_handler(db.get(), _zv_ext_db_busyhandler, nullptr);
    if (rc != SQLITE_OK) {
        ZV_LOGE("Fail to register busy handler. ret = %d", rc);
        log_library_message(db.get());
        return 0;
    }
    tune_connection(db.get());

    g_store.db = std::move(db);
    return 1;
}

void zv_ext_db_close(void)
{
    ZV_LOG_ENTER();
    g_store.update.reset();
    g_store.db.reset();
}

int zv_ext_db_insert_item(DbItem *item)
{
    ZV_LOG_ENTER();
    if (!item) {
        ZV_LOGE("item handle is NULL");
        return 0;
    }
    sqlite3 *db = connection();
    if (!db)
        return 0;

    if (_zv_ext_db_get_count(db) > kTrimRowCount)
        _zv_ext_db_delete_all_item(db);

    GStringPtr sql = build_statement("%s", kInsertSql);
    if (!sql)
        return 0;
    StmtPtr stmt = prepare(db, sql->str);
    if (!stmt)
        return 0;
    sqlite3_stmt *s = stmt.get();
    bind_int(s, 1, item->historyid);
    bind_text(s, 2, item->title);
    bind_text(s, 3, item->filename);
    bind_int64(s, 4, item->filesize);
    bind_text(s, 5, item->url);
    bind_int(s, 6, item->percent);
    bind_int(s, 7, item->status);
    bind_text(s, 8, item->userid);
    bind_double(s, 9, item->date);

    int rc = sqlite3_step(s);
    if (step_succeeded(rc))
        ZV_LOGI("SQL step success");
    else
        ZV_DB_LOGE_SQL("SQL return: %d", rc, db);
    finalize(stmt);
    return 1;
}

int zv_ext_db_delete_item(int historyid)
{
    ZV_LOG_ENTER();
    sqlite3 *db = connection();
    if (!db)
        return 0;
    StmtPtr stmt = prepare(db, kDeleteSql);
    if (!stmt)
        return 0;
    bind_int(stmt.get(), 1, historyid);
    int rc = sqlite3_step(stmt.get());
    bool ok = step_succeeded(rc);
    if (ok)
        ZV_LOGI("SQL step success");
    else
        ZV_DB_LOGE_SQL("SQL error: %d", rc, db);
    finalize(stmt);
    return ok ? 1 : 0;
}

int zv_ext_db_update_item(DbItem *item)
{
    ZV_LOG_ENTER();
    if (!item) {
        ZV_LOGE("item handle is NULL");
        return 0;
    }
    sqlite3 *db = connection();
    if (!db)
        return 0;
    if (!g_store.update) {
        g_store.update = prepare(db, kUpdateSql, SQLITE_PREPARE_PERSISTENT);
        if (!g_store.update)
            return 0;
    }
    sqlite3_stmt *s = g_store.update.get();
    bind_int(s, 1, item->percent);
    bind_int(s, 2, item->status);
    // Left unbound, the url parameter is NULL and clears the column.
    if (item->url)
        bind_text(s, 3, item->url);
    bind_int(s, 4, item->historyid);

    int rc = sqlite3_step(s);
    const bool stored = step_succeeded(rc);
    if (!stored)
        ZV_DB_LOGE_SQL("SQL return: %d", rc, db);
    // Ready for the next update: no lock or text of this one is kept.
    sqlite3_reset(s);
    sqlite3_clear_bindings(s);
    // A step that failed (history locked past the busy handler, disk full) is reported, so
    // that the caller can store the row again later.
    return stored ? 1 : 0;
}

int zv_ext_db_load_full_item_list(GList **list)
{
    ZV_LOG_ENTER();
    return load_items(list, false);
}

int zv_ext_db_load_ready_item_list(GList **list)
{
    ZV_LOG_ENTER();
    return load_items(list, true);
}

int zv_ext_db_free_item_list(GList *list)
{
    ZV_LOG_ENTER();
    if (!list) {
        ZV_LOGE("handle is NULL");
        return 0;
    }
    int index = 0;
    for (GList *l = list; l; l = l->next, ++index) {
        DbItem *item = static_cast<DbItem *>(l->data);
        if (!item) {
            ZV_LOGE("item is null:%d", index);
            continue;
        }
        item->historyid = 0;
        g_free(item->title);
        g_free(item->filename);
        g_free(item->url);
        g_free(item->userid);
        g_free(item);
    }
    g_list_free(list);
    return 1;
}

int zv_ext_db_get_active_count(void)
{
    ZV_LOG_ENTER();
    return count_rows("where status = %d OR status = %d OR status = %d OR status = %d",
                      ZV_UPLOAD_STATUS_READY, ZV_UPLOAD_STATUS_WAITING, ZV_UPLOAD_STATUS_PAUSED,
                      ZV_UPLOAD_STATUS_UPLOADING);
}

int zv_ext_db_get_completed_count(void)
{
    ZV_LOG_ENTER();
    return count_rows("where status = %d", ZV_UPLOAD_STATUS_COMPLETED);
}

int zv_ext_db_get_full_count(void)
{
    ZV_LOG_ENTER();
    return count_rows(
        "where status = %d OR status = %d OR status = %d OR status = %d OR status = %d",
        ZV_UPLOAD_STATUS_READY, ZV_UPLOAD_STATUS_WAITING, ZV_UPLOAD_STATUS_PAUSED,
        ZV_UPLOAD_STATUS_UPLOADING, ZV_UPLOAD_STATUS_COMPLETED);
}

int zv_ext_db_get_uploading_count(void)
{
    ZV_LOG_ENTER();
    return count_rows("where status = %d OR status = %d", ZV_UPLOAD_STATUS_WAITING,
                      ZV_UPLOAD_STATUS_UPLOADING);
}
