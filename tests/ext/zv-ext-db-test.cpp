// Tests of the upload history store on real SQLite files in fresh temporary folders, with a
// second connection on another thread standing in for the companion process.
#include "zv-ext-db.h"
#include "zv-log.h"

#include <gtest/gtest.h>
#include <sqlite3.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <functional>
#include <future>
#include <string>
#include <thread>

#include "zv-test-util.h"

namespace
{

zv_test::LogFile g_log;

// A connection of the test's own, as the companion process would hold one.
class RawDb
{
  public:
    explicit RawDb(const std::string &path) { sqlite3_open(path.c_str(), &db_); }
    ~RawDb() { sqlite3_close(db_); }
    RawDb(const RawDb &) = delete;
    RawDb &operator=(const RawDb &) = delete;

    int exec(const std::string &sql)
    {
        return sqlite3_exec(db_, sql.c_str(), nullptr, nullptr, nullptr);
    }
    std::string text(const std::string &sql)
    {
        sqlite3_stmt *stmt = nullptr;
        std::string out = "<none>";
        if (sqlite3_prepare_v2(db_, sql.c_str(), -1, &stmt, nullptr) == SQLITE_OK &&
            sqlite3_step(stmt) == SQLITE_ROW && sqlite3_column_text(stmt, 0))
            out = reinterpret_cast<const char *>(sqlite3_column_text(stmt, 0));
        sqlite3_finalize(stmt);
        return out;
    }
    // n rows with ids from 1000; every completed_every-th one (from the first) completed.
    void fill(int n, int completed_every)
    {
        exec("BEGIN");
        sqlite3_stmt *stmt = nullptr;
        sqlite3_prepare_v2(db_, "insert into history (historyid, status, date) values(?, ?, ?)", -1,
                           &stmt, nullptr);
        for (int i = 0; i < n; ++i) {
            bool completed = completed_every > 0 && i % completed_every == 0;
            sqlite3_bind_int(stmt, 1, 1000 + i);
            sqlite3_bind_int(stmt, 2,
                             completed ? ZV_UPLOAD_STATUS_COMPLETED : ZV_UPLOAD_STATUS_READY);
            sqlite3_bind_double(stmt, 3, i);
            sqlite3_step(stmt);
            sqlite3_reset(stmt);
        }
        sqlite3_finalize(stmt);
        exec("COMMIT");
    }

  private:
    sqlite3 *db_ = nullptr;
};

// Holds the write lock of the history file from another thread on its own connection, from
// construction until release() holds (bounded), then commits.
class LockHolder
{
  public:
    LockHolder(const std::string &path, std::function<bool()> release)
    {
        std::promise<bool> locked;
        std::future<bool> taken = locked.get_future();
        thread_ = std::thread([path, release, &locked] {
            RawDb db(path);
            locked.set_value(db.exec("BEGIN IMMEDIATE") == SQLITE_OK);
            auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(60);
            while (!release() && std::chrono::steady_clock::now() < deadline)
                std::this_thread::sleep_for(std::chrono::milliseconds(5));
            db.exec("COMMIT");
        });
        held_ = taken.get();
    }
    ~LockHolder() { thread_.join(); }
    bool held() const { return held_; }

  private:
    std::thread thread_;
    bool held_ = false;
};

struct Row {
    int historyid;
    int status;
    double date;
    const char *title;
    const char *url;
    const char *userid;
};

// The rows of one load, released with their list.
class Loaded
{
  public:
    explicit Loaded(bool ready_only = false)
    {
        EXPECT_EQ(ready_only ? zv_ext_db_load_ready_item_list(&list_)
                             : zv_ext_db_load_full_item_list(&list_),
                  1);
    }
    ~Loaded()
    {
        if (list_)
            zv_ext_db_free_item_list(list_);
    }
    Loaded(const Loaded &) = delete;
    Loaded &operator=(const Loaded &) = delete;
    size_t size() const { return g_list_length(list_); }
    const DbItem &operator[](unsigned i) const
    {
        return *static_cast<DbItem *>(g_list_nth_data(list_, i));
    }

  private:
    GList *list_ = nullptr;
};

class HistoryStoreTest : public ::testing::Test
{
  protected:
    void SetUp() override { g_log.mark(); }
    void TearDown() override { zv_ext_db_close(); }

    std::string db_path() const { return tmp_.file("db/.zuvo-history.db"); }

    void insert(const Row &r)
    {
        DbItem item{};
        item.historyid = r.historyid;
        item.status = r.status;
        item.date = r.date;
        item.title = const_cast<char *>(r.title);
        item.url = const_cast<char *>(r.url);
        item.userid = const_cast<char *>(r.userid);
        item.filename = const_cast<char *>("/videos/a.mp4");
        item.filesize = 5000000000LL; // past 4 GiB: a 64-bit column
        item.percent = 7;
        ASSERT_EQ(zv_ext_db_insert_item(&item), 1);
    }

    zv_test::TempDir tmp_;
};

TEST_F(HistoryStoreTest, OpenMakesDirectorySchemaAndKeepsRows)
{
    struct stat st;
    ASSERT_NE(stat(tmp_.file("db").c_str(), &st), 0);
    ASSERT_EQ(zv_ext_db_open(), 1);
    EXPECT_TRUE(g_log.logged("make default dbdir"));
    EXPECT_TRUE(g_log.logged("success make dbdir"));
    EXPECT_EQ(zv_ext_db_open(), 1);
    insert({1, ZV_UPLOAD_STATUS_READY, 1, "t", nullptr, nullptr});

    {
        RawDb raw(db_path());
        EXPECT_EQ(raw.text("select sql from sqlite_master where type='table' and name='history'"),
                  "CREATE TABLE history(id integer primary key autoincrement, historyid integer "
                  ",title,  filename, filesize integer, url, percent integer, status integer, "
                  "userid, date datetime)");
        EXPECT_EQ(
            raw.text("select sql from sqlite_master where type='index' and tbl_name='history'"),
            "CREATE INDEX history_historyid on history(historyid)");
        EXPECT_EQ(raw.text("PRAGMA journal_mode"), "wal");
    }

    zv_ext_db_close();
    EXPECT_EQ(zv_ext_db_get_full_count(), -1);
    ASSERT_EQ(zv_ext_db_open(), 1);
    EXPECT_EQ(zv_ext_db_get_full_count(), 1);
}

TEST_F(HistoryStoreTest, ShortLockIsWaitedFor)
{
    ASSERT_EQ(zv_ext_db_open(), 1);
    insert({5, ZV_UPLOAD_STATUS_WAITING, 1, "t", nullptr, nullptr});
    g_log.mark();
    DbItem update{};
    update.historyid = 5;
    update.percent = 40;
    update.status = ZV_UPLOAD_STATUS_UPLOADING;
    {
        LockHolder lock(db_path(), [] { return g_log.logged("busy handler called (count : 0)"); });
        ASSERT_TRUE(lock.held());
        EXPECT_EQ(zv_ext_db_update_item(&update), 1);
    }
    EXPECT_FALSE(g_log.logged("busy handler will be returned SQLITE_BUSY error"));
    Loaded rows;
    ASSERT_EQ(rows.size(), 1u);
    EXPECT_EQ(rows[0].percent, 40);
    EXPECT_EQ(rows[0].status, ZV_UPLOAD_STATUS_UPLOADING);
}

TEST_F(HistoryStoreTest, LongLockMakesStatementsFail)
{
    ASSERT_EQ(zv_ext_db_open(), 1);
    insert({5, ZV_UPLOAD_STATUS_WAITING, 1, "t", nullptr, nullptr});
    g_log.mark();
    std::atomic<bool> done{false};
    DbItem update{};
    update.historyid = 5;
    update.percent = 40;
    {
        LockHolder lock(db_path(), [&done] { return done.load(); });
        ASSERT_TRUE(lock.held());
        EXPECT_EQ(zv_ext_db_delete_item(5), 0);
        EXPECT_EQ(zv_ext_db_update_item(&update), 0) << "a failed step is reported";
        done = true;
    }
    for (int count = 0; count < 5; ++count)
        EXPECT_TRUE(g_log.logged("busy handler called (count : " + std::to_string(count) + ")"));
    EXPECT_FALSE(g_log.logged("busy handler called (count : 5)"));
    EXPECT_TRUE(g_log.logged("busy handler will be returned SQLITE_BUSY error"));
    // The store's lines are whole; the library's message follows on a line of its own.
    for (const char *line : {"SQL error: 5", "SQL return: 5"})
        EXPECT_TRUE(g_log.logged(std::string(line) + ZV_LOG_RESET "\n")) << line;
    EXPECT_TRUE(g_log.logged("sqlite: database is locked" ZV_LOG_RESET "\n"));
    Loaded rows;
    ASSERT_EQ(rows.size(), 1u);
    EXPECT_EQ(rows[0].percent, 7);
}

TEST_F(HistoryStoreTest, InsertTrimsCompletedRowsPast5000)
{
    struct Case {
        int rows;
        int completed_every; // 0: none completed
        int expected_after;
    };
    const Case cases[] = {
        {5000, 2, 5001},            // exactly 5000: no trim
        {5001, 2, 5001 - 2501 + 1}, // every completed row goes, then the insert
        {5001, 0, 5002},            // nothing completed: the table grows on
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.rows);
        zv_test::TempDir dir;
        ASSERT_EQ(zv_ext_db_open(), 1);
        RawDb(dir.file("db/.zuvo-history.db")).fill(c.rows, c.completed_every);
        insert({1, ZV_UPLOAD_STATUS_READY, 1e9, "new", nullptr, nullptr});
        EXPECT_EQ(zv_ext_db_get_full_count(), c.expected_after);
        zv_ext_db_close();
    }
}

TEST_F(HistoryStoreTest, LoadsInDateOrderAndKeepNulls)
{
    ASSERT_EQ(zv_ext_db_open(), 1);
    insert({3, ZV_UPLOAD_STATUS_READY, 30.5, "third", "http://u/3", "me"});
    insert({1, ZV_UPLOAD_STATUS_COMPLETED, 10.25, nullptr, nullptr, nullptr});
    insert({2, ZV_UPLOAD_STATUS_READY, 20, "second", nullptr, "me"});

    Loaded rows;
    ASSERT_EQ(rows.size(), 3u);
    EXPECT_EQ(rows[0].historyid, 1);
    EXPECT_EQ(rows[1].historyid, 2);
    EXPECT_EQ(rows[2].historyid, 3);
    EXPECT_DOUBLE_EQ(rows[0].date, 10.25);
    EXPECT_EQ(rows[0].title, nullptr);
    EXPECT_EQ(rows[0].url, nullptr);
    EXPECT_EQ(rows[0].userid, nullptr);
    EXPECT_STREQ(rows[2].title, "third");
    EXPECT_STREQ(rows[2].url, "http://u/3");
    EXPECT_STREQ(rows[2].filename, "/videos/a.mp4");
    EXPECT_EQ(rows[2].filesize, 5000000000LL);
    EXPECT_EQ(rows[2].percent, 7);

    Loaded ready(true);
    ASSERT_EQ(ready.size(), 2u);
    EXPECT_EQ(ready[0].historyid, 2);
    EXPECT_EQ(ready[1].historyid, 3);
}

TEST_F(HistoryStoreTest, EmptyLoadAndDeletes)
{
    ASSERT_EQ(zv_ext_db_open(), 1);
    GList *list = nullptr;
    EXPECT_EQ(zv_ext_db_load_full_item_list(&list), 1);
    EXPECT_EQ(list, nullptr);
    EXPECT_EQ(zv_ext_db_free_item_list(list), 0);
    EXPECT_TRUE(g_log.logged("handle is NULL"));
    EXPECT_EQ(zv_ext_db_insert_item(nullptr), 0);
    EXPECT_TRUE(g_log.logged("item handle is NULL"));

    insert({4, ZV_UPLOAD_STATUS_READY, 1, "a", nullptr, nullptr});
    insert({4, ZV_UPLOAD_STATUS_READY, 2, "b", nullptr, nullptr});
    insert({5, ZV_UPLOAD_STATUS_READY, 3, "c", nullptr, nullptr});
    EXPECT_EQ(zv_ext_db_delete_item(99), 1);
    EXPECT_EQ(zv_ext_db_delete_item(4), 1);
    Loaded rows;
    ASSERT_EQ(rows.size(), 1u);
    EXPECT_EQ(rows[0].historyid, 5);
}

TEST_F(HistoryStoreTest, CountsByStatusGroup)
{
    ASSERT_EQ(zv_ext_db_open(), 1);
    // Rows per status READY..COMPLETED.
    const int per_status[] = {1, 2, 3, 4, 5};
    int id = 0;
    for (int status = 0; status < 5; ++status)
        for (int i = 0; i < per_status[status]; ++i)
            insert({++id, status, (double)id, "t", nullptr, nullptr});
    EXPECT_EQ(zv_ext_db_get_active_count(), 1 + 2 + 3 + 4);
    EXPECT_EQ(zv_ext_db_get_uploading_count(), 2 + 4);
    EXPECT_EQ(zv_ext_db_get_completed_count(), 5);
    EXPECT_EQ(zv_ext_db_get_full_count(), 15);
}

TEST_F(HistoryStoreTest, UpdateWritesOnlyPercentStatusAndUrl)
{
    ASSERT_EQ(zv_ext_db_open(), 1);
    insert({8, ZV_UPLOAD_STATUS_WAITING, 2.5, "title", nullptr, "user"});
    insert({9, ZV_UPLOAD_STATUS_WAITING, 3.5, "other", "http://keep", "user"});

    DbItem update{};
    update.historyid = 8;
    update.percent = 55;
    update.status = ZV_UPLOAD_STATUS_UPLOADING;
    update.url = const_cast<char *>("http://upload/8");
    update.title = const_cast<char *>("changed");
    update.filename = const_cast<char *>("/changed");
    update.filesize = 1;
    update.date = 99;
    ASSERT_EQ(zv_ext_db_update_item(&update), 1);

    {
        Loaded rows;
        ASSERT_EQ(rows.size(), 2u);
        EXPECT_EQ(rows[0].percent, 55);
        EXPECT_EQ(rows[0].status, ZV_UPLOAD_STATUS_UPLOADING);
        EXPECT_STREQ(rows[0].url, "http://upload/8");
        EXPECT_STREQ(rows[0].title, "title");
        EXPECT_STREQ(rows[0].filename, "/videos/a.mp4");
        EXPECT_STREQ(rows[0].userid, "user");
        EXPECT_EQ(rows[0].filesize, 5000000000LL);
        EXPECT_DOUBLE_EQ(rows[0].date, 2.5);
        EXPECT_STREQ(rows[1].url, "http://keep");
        EXPECT_EQ(rows[1].percent, 7);
    }
    update.url = nullptr;
    ASSERT_EQ(zv_ext_db_update_item(&update), 1);
    EXPECT_EQ(Loaded()[0].url, nullptr);
}

TEST_F(HistoryStoreTest, FileThatIsNotADatabase)
{
    ASSERT_EQ(mkdir(tmp_.file("db").c_str(), 0700), 0);
    ASSERT_TRUE(zv_test::write_file(db_path(), std::string(4096, 'x')));

    EXPECT_EQ(zv_ext_db_open(), 0);
    EXPECT_TRUE(g_log.logged("file is not a database"));
    DbItem item{};
    EXPECT_EQ(zv_ext_db_insert_item(&item), 0);
    EXPECT_EQ(zv_ext_db_delete_item(1), 0);
    EXPECT_EQ(zv_ext_db_get_active_count(), -1);
    GList *list = nullptr;
    EXPECT_EQ(zv_ext_db_load_ready_item_list(&list), 0);
    EXPECT_EQ(zv_test::read_file(db_path()), std::string(4096, 'x'));

    ASSERT_EQ(unlink(db_path().c_str()), 0);
    ASSERT_EQ(zv_ext_db_open(), 1);
    EXPECT_EQ(zv_ext_db_insert_item(&item), 1);
    EXPECT_EQ(zv_ext_db_get_full_count(), 1);
}

} // namespace
