// Tests of the upload history store on real SQLite files in fresh temporary folders, with a
// second connection on another thread standing in for the companion process.
#include "zv-ext-db.h"
#include "zv-log.h"

#include <gtest/gtest.h>
#include <sqlite3.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <functional>
#include <future>
#include <string>
#include <thread>

#include "zv-test-util.h"

namespace
{

zv_test::LogFile g_log;

// Holds the write lock of the history file on a connection of its own, on another thread,
// from construction until release() holds (60 s at most), then commits.
class LockHolder
{
  public:
    LockHolder(const std::string &path, std::function<bool()> release)
    {
        std::promise<bool> locked;
        std::future<bool> taken = locked.get_future();
        thread_ = std::thread([path, release, &locked] {
            sqlite3 *db = nullptr;
            sqlite3_open(path.c_str(), &db);
            locked.set_value(sqlite3_exec(db, "BEGIN IMMEDIATE", nullptr, nullptr, nullptr) ==
                             SQLITE_OK);
            auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(60);
            while (!release() && std::chrono::steady_clock::now() < deadline)
                std::this_thread::sleep_for(std::chrono::milliseconds(5));
            sqlite3_exec(db, "COMMIT", nullptr, nullptr, nullptr);
            sqlite3_close(db);
        });
        EXPECT_TRUE(taken.get());
    }
    ~LockHolder() { thread_.join(); }

  private:
    std::thread thread_;
};

// The rows of one load, released with it.
class Loaded
{
  public:
    explicit Loaded(bool ready_only = false)
    {
        EXPECT_EQ(ready_only ? zv_ext_db_load_ready_item_list(&list_)
                             : zv_ext_db_load_full_item_list(&list_),
                  1);
    }
    ~Loaded() { zv_ext_db_free_item_list(list_); }
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

    // A row of a file past 4 GiB (a 64-bit column) at 7 percent.
    static void insert(int historyid, int status, double date, const char *title = "t",
                       const char *url = nullptr, const char *userid = nullptr)
    {
        DbItem item{};
        item.historyid = historyid;
        item.status = status;
        item.date = date;
        item.title = const_cast<char *>(title);
        item.url = const_cast<char *>(url);
        item.userid = const_cast<char *>(userid);
        item.filename = const_cast<char *>("/videos/a.mp4");
        item.filesize = 5000000000LL;
        item.percent = 7;
        ASSERT_EQ(zv_ext_db_insert_item(&item), 1);
    }
    static int update(int historyid, int percent, int status, const char *url = nullptr)
    {
        DbItem item{};
        item.historyid = historyid;
        item.percent = percent;
        item.status = status;
        item.url = const_cast<char *>(url);
        item.title = const_cast<char *>("changed");
        item.filename = const_cast<char *>("/changed");
        item.filesize = 1;
        item.date = 99;
        return zv_ext_db_update_item(&item);
    }

    zv_test::TempDir tmp_;
};

TEST_F(HistoryStoreTest, OpenMakesTheFolderAndRowsOutliveTheConnection)
{
    struct stat st;
    ASSERT_NE(stat(tmp_.file("db").c_str(), &st), 0);
    ASSERT_EQ(zv_ext_db_open(), 1);
    EXPECT_TRUE(g_log.logged("make default dbdir"));
    EXPECT_TRUE(g_log.logged("success make dbdir"));
    EXPECT_EQ(zv_ext_db_open(), 1);
    insert(1, ZV_UPLOAD_STATUS_READY, 1);
    zv_ext_db_close();
    EXPECT_EQ(zv_ext_db_get_full_count(), -1);
    ASSERT_EQ(zv_ext_db_open(), 1);
    EXPECT_EQ(zv_ext_db_get_full_count(), 1);
}

// A lock of the other process past the busy handler's five waits makes statements fail (an
// update says so, to be stored again); a shorter one is waited for.
TEST_F(HistoryStoreTest, LockOfTheOtherProcess)
{
    ASSERT_EQ(zv_ext_db_open(), 1);
    insert(5, ZV_UPLOAD_STATUS_WAITING, 1);
    g_log.mark();
    {
        std::atomic<bool> done{false};
        LockHolder lock(db_path(), [&done] { return done.load(); });
        EXPECT_EQ(zv_ext_db_delete_item(5), 0);
        EXPECT_EQ(update(5, 40, ZV_UPLOAD_STATUS_UPLOADING), 0);
        done = true;
    }
    for (int count = 0; count < 5; ++count)
        EXPECT_TRUE(g_log.logged("busy handler called (count : " + std::to_string(count) + ")"));
    EXPECT_FALSE(g_log.logged("busy handler called (count : 5)"));
    EXPECT_TRUE(g_log.logged("busy handler will be returned SQLITE_BUSY error"));
    // The store's lines stay whole; the library's message follows on a line of its own.
    for (const char *line : {"SQL error: 5", "SQL return: 5", "sqlite: database is locked"})
        EXPECT_TRUE(g_log.logged(std::string(line) + ZV_LOG_RESET "\n")) << line;
    EXPECT_EQ(Loaded()[0].percent, 7);

    g_log.mark();
    {
        LockHolder lock(db_path(), [] { return g_log.logged("busy handler called (count : 0)"); });
        EXPECT_EQ(update(5, 40, ZV_UPLOAD_STATUS_UPLOADING), 1);
    }
    EXPECT_FALSE(g_log.logged("SQLITE_BUSY"));
    Loaded rows;
    ASSERT_EQ(rows.size(), 1u);
    EXPECT_EQ(rows[0].percent, 40);
    EXPECT_EQ(rows[0].status, ZV_UPLOAD_STATUS_UPLOADING);
}

TEST_F(HistoryStoreTest, InsertTrimsCompletedRowsPast5000)
{
    struct Case {
        int rows;
        const char *completed; // which rows are completed, as a condition on their number i
        int expected_after;
    };
    const Case cases[] = {
        {5000, "i % 2 = 0", 5001},            // exactly 5000: no trim
        {5001, "i % 2 = 0", 5001 - 2501 + 1}, // every completed row goes, then the insert
        {5001, "0", 5002},                    // nothing completed: the table grows on
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.rows);
        zv_test::TempDir dir;
        ASSERT_EQ(zv_ext_db_open(), 1);
        const std::string fill =
            "insert into history (historyid, status, date) with recursive n(i) as (select 0 "
            "union all select i + 1 from n where i + 1 < " +
            std::to_string(c.rows) + ") select 1000 + i, case when " + c.completed + " then " +
            std::to_string(ZV_UPLOAD_STATUS_COMPLETED) + " else " +
            std::to_string(ZV_UPLOAD_STATUS_READY) + " end, i from n";
        sqlite3 *raw = nullptr;
        ASSERT_EQ(sqlite3_open(dir.file("db/.zuvo-history.db").c_str(), &raw), SQLITE_OK);
        EXPECT_EQ(sqlite3_exec(raw, fill.c_str(), nullptr, nullptr, nullptr), SQLITE_OK);
        sqlite3_close(raw);
        insert(1, ZV_UPLOAD_STATUS_READY, 1e9, "new");
        EXPECT_EQ(zv_ext_db_get_full_count(), c.expected_after);
        zv_ext_db_close();
    }
}

TEST_F(HistoryStoreTest, RowsLoadInDateOrderWithTheirNulls)
{
    ASSERT_EQ(zv_ext_db_open(), 1);
    GList *list = nullptr;
    EXPECT_EQ(zv_ext_db_load_full_item_list(&list), 1);
    EXPECT_EQ(list, nullptr);
    EXPECT_EQ(zv_ext_db_free_item_list(list), 0);
    EXPECT_EQ(zv_ext_db_insert_item(nullptr), 0);

    insert(3, ZV_UPLOAD_STATUS_READY, 30.5, "third", "http://u/3", "me");
    insert(1, ZV_UPLOAD_STATUS_COMPLETED, 10.25, nullptr);
    insert(2, ZV_UPLOAD_STATUS_READY, 20, "second", nullptr, "me");
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
    EXPECT_STREQ(rows[2].userid, "me");
    EXPECT_STREQ(rows[2].filename, "/videos/a.mp4");
    EXPECT_EQ(rows[2].filesize, 5000000000LL);
    EXPECT_EQ(rows[2].percent, 7);
    Loaded ready(true);
    ASSERT_EQ(ready.size(), 2u);
    EXPECT_EQ(ready[0].historyid, 2);
    EXPECT_EQ(ready[1].historyid, 3);
}

TEST_F(HistoryStoreTest, CountsByStatusGroup)
{
    ASSERT_EQ(zv_ext_db_open(), 1);
    // 1 READY, 2 WAITING, 3 PAUSED, 4 UPLOADING and 5 COMPLETED rows.
    for (int status = 0, id = 0; status < 5; ++status)
        for (int i = 0; i <= status; ++i, ++id)
            insert(id, status, id);
    EXPECT_EQ(zv_ext_db_get_active_count(), 1 + 2 + 3 + 4);
    EXPECT_EQ(zv_ext_db_get_uploading_count(), 2 + 4);
    EXPECT_EQ(zv_ext_db_get_completed_count(), 5);
    EXPECT_EQ(zv_ext_db_get_full_count(), 15);
}

TEST_F(HistoryStoreTest, UpdateWritesPercentStatusAndUrlDeleteTakesEveryRowOfTheId)
{
    ASSERT_EQ(zv_ext_db_open(), 1);
    insert(8, ZV_UPLOAD_STATUS_WAITING, 2.5, "title", nullptr, "user");
    insert(9, ZV_UPLOAD_STATUS_WAITING, 3.5, "other", "http://keep", "user");
    ASSERT_EQ(update(8, 55, ZV_UPLOAD_STATUS_UPLOADING, "http://upload/8"), 1);
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
    ASSERT_EQ(update(8, 55, ZV_UPLOAD_STATUS_UPLOADING), 1);
    EXPECT_EQ(Loaded()[0].url, nullptr);

    insert(8, ZV_UPLOAD_STATUS_READY, 4);
    EXPECT_EQ(zv_ext_db_delete_item(99), 1);
    EXPECT_EQ(zv_ext_db_delete_item(8), 1);
    Loaded rows;
    ASSERT_EQ(rows.size(), 1u);
    EXPECT_EQ(rows[0].historyid, 9);
}

TEST_F(HistoryStoreTest, FileThatIsNotADatabaseIsLeftAloneUntilItIsGone)
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
