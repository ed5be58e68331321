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

// The rows of a load, one a line: historyid title filename filesize url percent status
// userid date, "-" for NULL.
std::string load(bool ready_only = false)
{
    GList *list = nullptr;
    EXPECT_EQ(ready_only ? zv_ext_db_load_ready_item_list(&list)
                         : zv_ext_db_load_full_item_list(&list),
              1);
    auto text = [](const char *s) { return s ? s : "-"; };
    std::string out;
    for (GList *l = list; l; l = l->next) {
        auto *r = static_cast<DbItem *>(l->data);
        gchar *line = g_strdup_printf(
            "%d %s %s %lld %s %d %d %s %g\n", r->historyid, text(r->title), text(r->filename),
            (long long)r->filesize, text(r->url), r->percent, r->status, text(r->userid), r->date);
        out += line;
        g_free(line);
    }
    if (list)
        zv_ext_db_free_item_list(list);
    return out;
}

class HistoryStoreTest : public ::testing::Test
{
  protected:
    void SetUp() override { g_log.mark(); }
    void TearDown() override { zv_ext_db_close(); }

    std::string db_path() const { return tmp_.file("db/.zuvo-history.db"); }

    // A row of a file past 4 GiB (a 64-bit column) at 7 percent.
    static void insert(int id, int status, double date, const char *title = "t",
                       const char *url = nullptr, const char *userid = nullptr)
    {
        DbItem item{id,       str(userid), str(title), str("/videos/a.mp4"), 5000000000LL, 7,
                    str(url), status,      date};
        ASSERT_EQ(zv_ext_db_insert_item(&item), 1);
    }
    // Only percent, status and url are to be written.
    static int update(int id, int percent, int status, const char *url = nullptr)
    {
        DbItem item{id,     str("u"), str("changed"), str("/changed"), 1, percent, str(url),
                    status, 99};
        return zv_ext_db_update_item(&item);
    }
    static char *str(const char *s) { return const_cast<char *>(s); }

    zv_test::TempDir tmp_;
};

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
    EXPECT_TRUE(g_log.logged("busy handler will be returned SQLITE_BUSY error"));
    // The store's lines stay whole; the library's message follows on a line of its own.
    for (const char *line : {"SQL error: 5", "SQL return: 5", "sqlite: database is locked"})
        EXPECT_TRUE(g_log.logged(std::string(line) + ZV_LOG_RESET "\n")) << line;
    EXPECT_EQ(load(), "5 t /videos/a.mp4 5000000000 - 7 1 - 1\n");

    g_log.mark();
    {
        LockHolder lock(db_path(), [] { return g_log.logged("busy handler called (count : 0)"); });
        EXPECT_EQ(update(5, 40, ZV_UPLOAD_STATUS_UPLOADING), 1);
    }
    EXPECT_FALSE(g_log.logged("SQLITE_BUSY"));
    EXPECT_EQ(load(), "5 t /videos/a.mp4 5000000000 - 40 3 - 1\n");
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

TEST_F(HistoryStoreTest, RowsLoadInDateOrderWithTheirNullsAndCountsByStatus)
{
    ASSERT_EQ(zv_ext_db_open(), 1);
    EXPECT_EQ(load(), "");
    EXPECT_EQ(zv_ext_db_free_item_list(nullptr), 0);
    EXPECT_EQ(zv_ext_db_insert_item(nullptr), 0);
    insert(3, ZV_UPLOAD_STATUS_READY, 30.5, "third", "http://u/3", "me");
    insert(1, ZV_UPLOAD_STATUS_COMPLETED, 10.25, nullptr);
    insert(2, ZV_UPLOAD_STATUS_READY, 20, "second", nullptr, "me");
    EXPECT_EQ(load(), "1 - /videos/a.mp4 5000000000 - 7 4 - 10.25\n"
                      "2 second /videos/a.mp4 5000000000 - 7 0 me 20\n"
                      "3 third /videos/a.mp4 5000000000 http://u/3 7 0 me 30.5\n");
    EXPECT_EQ(load(true), "2 second /videos/a.mp4 5000000000 - 7 0 me 20\n"
                          "3 third /videos/a.mp4 5000000000 http://u/3 7 0 me 30.5\n");

    // Now 2 READY, 3 WAITING, 4 PAUSED, 5 UPLOADING and 7 COMPLETED rows.
    for (int status = 1, id = 10; status < 5; ++status)
        for (int i = 0; i <= status + 1; ++i, ++id)
            insert(id, status, id);
    EXPECT_EQ(zv_ext_db_get_active_count(), 2 + 3 + 4 + 5);
    EXPECT_EQ(zv_ext_db_get_uploading_count(), 3 + 5);
    EXPECT_EQ(zv_ext_db_get_completed_count(), 7);
    EXPECT_EQ(zv_ext_db_get_full_count(), 21);
}

TEST_F(HistoryStoreTest, UpdateWritesPercentStatusAndUrlDeleteTakesEveryRowOfTheId)
{
    ASSERT_EQ(zv_ext_db_open(), 1);
    insert(8, ZV_UPLOAD_STATUS_WAITING, 2.5, "title", nullptr, "user");
    insert(9, ZV_UPLOAD_STATUS_WAITING, 3.5, "other", "http://keep", "user");
    ASSERT_EQ(update(8, 55, ZV_UPLOAD_STATUS_UPLOADING, "http://upload/8"), 1);
    const std::string nine = "9 other /videos/a.mp4 5000000000 http://keep 7 1 user 3.5\n";
    EXPECT_EQ(load(), "8 title /videos/a.mp4 5000000000 http://upload/8 55 3 user 2.5\n" + nine);
    ASSERT_EQ(update(8, 60, ZV_UPLOAD_STATUS_PAUSED), 1);
    EXPECT_EQ(load(), "8 title /videos/a.mp4 5000000000 - 60 2 user 2.5\n" + nine);

    insert(8, ZV_UPLOAD_STATUS_READY, 4);
    EXPECT_EQ(zv_ext_db_delete_item(99), 1);
    EXPECT_EQ(zv_ext_db_delete_item(8), 1);
    EXPECT_EQ(load(), nine);
}

// A file that is not a database is left as it is and every operation fails; once it is
// gone, open makes the folder and the file, whose rows outlive the connection.
TEST_F(HistoryStoreTest, OpenLeavesAForeignFileAloneAndMakesFolderAndFile)
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
    ASSERT_EQ(rmdir(tmp_.file("db").c_str()), 0);
    ASSERT_EQ(zv_ext_db_open(), 1);
    EXPECT_TRUE(g_log.logged("make default dbdir"));
    EXPECT_TRUE(g_log.logged("success make dbdir"));
    EXPECT_EQ(zv_ext_db_open(), 1);
    EXPECT_EQ(zv_ext_db_insert_item(&item), 1);
    zv_ext_db_close();
    EXPECT_EQ(zv_ext_db_get_full_count(), -1);
    ASSERT_EQ(zv_ext_db_open(), 1);
    EXPECT_EQ(zv_ext_db_get_full_count(), 1);
}

} // namespace
