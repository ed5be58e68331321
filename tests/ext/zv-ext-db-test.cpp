// Tests of the upload history store on real SQLite files in fresh temporary folders, with a
// second connection standing in for the companion process.
#include "zv-ext-db.h"
#include "zv-log.h"

#include <gtest/gtest.h>
#include <sqlite3.h>
#include <sys/stat.h>
#include <unistd.h>

#include <chrono>
#include <thread>

#include "zv-test-util.h"

namespace
{

zv_test::LogFile g_log;

// The rows of a load, one a line: historyid title filename filesize url percent status
// userid date, "-" for NULL.
std::string load(bool ready_only = false)
{
    GList *list = nullptr;
    EXPECT_EQ((ready_only ? zv_ext_db_load_ready_item_list : zv_ext_db_load_full_item_list)(&list),
              1);
    auto text = [](const char *s) { return s ? s : "-"; };
    std::string out;
    for (GList *l = list; l; l = l->next) {
        auto *r = static_cast<DbItem *>(l->data);
        g_autofree gchar *line = g_strdup_printf(
            "%d %s %s %lld %s %d %d %s %g\n", r->historyid, text(r->title), text(r->filename),
            (long long)r->filesize, text(r->url), r->percent, r->status, text(r->userid), r->date);
        out += line;
    }
    zv_ext_db_free_item_list(list);
    return out;
}

// A row of a file past 4 GiB (a 64-bit column) at 7 percent.
void insert(int id, int status, double date, const char *title = "t", const char *url = nullptr,
            const char *userid = nullptr)
{
    DbItem item{id,          (char *)userid, (char *)title, (char *)"/v/a.mp4", 5000000000LL, 7,
                (char *)url, status,         date};
    ASSERT_EQ(zv_ext_db_insert_item(&item), 1);
}

// Only percent, status and url are to be written.
int update(int id, int percent, int status, const char *url = nullptr)
{
    DbItem item{id,     (char *)"u", (char *)"changed", (char *)"/changed", 1, percent, (char *)url,
                status, 99};
    return zv_ext_db_update_item(&item);
}

// A file that is not a database is left as it is and every operation fails; once it is gone,
// open makes the folder and the file. Rows load in date order with their NULLs and are
// counted by status; update writes only percent, status and url; delete takes every row of
// the id; the rows outlive the connection. A lock of the other process past the busy
// handler's waits makes statements fail (an update says so, to be stored again); a shorter
// one is waited for. Past 5000 rows an insert first deletes every completed row: at 5000 rows
// nothing goes, past them the completed rows go, and with none of them completed the table
// grows on.
TEST(HistoryStoreTest, RowsRoundTripBesideTheOtherProcessAndTrimPast5000)
{
    zv_test::TempDir tmp;
    const std::string db = tmp.file("db/.zuvo-history.db");
    const std::string junk(4096, 'x');
    ASSERT_EQ(mkdir(tmp.file("db").c_str(), 0700), 0);
    ASSERT_TRUE(zv_test::write_file(db, junk));
    EXPECT_EQ(zv_ext_db_open(), 0);
    EXPECT_TRUE(g_log.logged("file is not a database"));
    DbItem item{};
    GList *list = nullptr;
    EXPECT_EQ(zv_ext_db_insert_item(&item), 0);
    EXPECT_EQ(zv_ext_db_delete_item(1), 0);
    EXPECT_EQ(zv_ext_db_load_ready_item_list(&list), 0);
    EXPECT_EQ(zv_test::read_file(db), junk);
    ASSERT_EQ(unlink(db.c_str()), 0);
    ASSERT_EQ(rmdir(tmp.file("db").c_str()), 0);
    ASSERT_EQ(zv_ext_db_open(), 1);
    EXPECT_EQ(zv_ext_db_open(), 1);
    EXPECT_EQ(load(), "");
    EXPECT_EQ(zv_ext_db_insert_item(nullptr), 0);
    insert(3, ZV_UPLOAD_STATUS_READY, 30.5, "third", "http://u/3", "me");
    insert(1, ZV_UPLOAD_STATUS_COMPLETED, 10.25, nullptr);
    insert(2, ZV_UPLOAD_STATUS_WAITING, 20, "second", nullptr, "me");

    sqlite3 *other = nullptr;
    ASSERT_EQ(sqlite3_open(db.c_str(), &other), SQLITE_OK);
    ASSERT_EQ(sqlite3_exec(other, "BEGIN IMMEDIATE", nullptr, nullptr, nullptr), SQLITE_OK);
    EXPECT_EQ(zv_ext_db_delete_item(3), 0);
    EXPECT_EQ(update(2, 55, ZV_UPLOAD_STATUS_READY, "http://upload/2"), 0);
    // The store's lines stay whole; the library's message follows on a line of its own.
    for (const char *line : {"SQL error: 5", "SQL return: 5", "sqlite: database is locked"})
        EXPECT_TRUE(g_log.logged(std::string(line) + ZV_LOG_RESET "\n")) << line;
    g_log.mark();
    std::thread release([other] {
        for (int i = 0; i < 6000 && !g_log.logged("busy handler called (count : 0)"); i++)
            std::this_thread::sleep_for(std::chrono::milliseconds(5));
        sqlite3_exec(other, "COMMIT", nullptr, nullptr, nullptr);
    });
    EXPECT_EQ(update(2, 55, ZV_UPLOAD_STATUS_READY, "http://upload/2"), 1);
    release.join();
    sqlite3_close(other);

    const std::string one = "1 - /v/a.mp4 5000000000 - 7 4 - 10.25\n",
                      three = "3 third /v/a.mp4 5000000000 http://u/3 7 0 me 30.5\n";
    EXPECT_EQ(load(), one + "2 second /v/a.mp4 5000000000 http://upload/2 55 0 me 20\n" + three);
    ASSERT_EQ(update(2, 60, ZV_UPLOAD_STATUS_PAUSED), 1);
    EXPECT_EQ(load(true), three);
    insert(3, ZV_UPLOAD_STATUS_READY, 4);
    EXPECT_EQ(zv_ext_db_delete_item(3), 1);
    EXPECT_EQ(load(), one + "2 second /v/a.mp4 5000000000 - 60 2 me 20\n");

    // With rows 1 and 2: 2 READY, 3 WAITING, 4 PAUSED, 5 UPLOADING and 7 COMPLETED rows.
    const int more[] = {2, 3, 3, 5, 6};
    for (int status = 0, id = 10; status < 5; ++status)
        for (int i = 0; i < more[status]; ++i, ++id)
            insert(id, status, id);
    EXPECT_EQ(zv_ext_db_get_active_count(), 2 + 3 + 4 + 5);
    EXPECT_EQ(zv_ext_db_get_uploading_count(), 3 + 5);
    EXPECT_EQ(zv_ext_db_get_completed_count(), 7);
    zv_ext_db_close();
    EXPECT_EQ(zv_ext_db_get_full_count(), -1);
    ASSERT_EQ(zv_ext_db_open(), 1);
    EXPECT_EQ(zv_ext_db_get_full_count(), 21);

    // Up to 5000 rows, 7 of them completed; then one insert after another.
    for (int id = 100; id < 100 + 5000 - 21; id++)
        insert(id, ZV_UPLOAD_STATUS_READY, id);
    for (int rows : {5001, 5001 - 7 + 1, 4996, 4997, 4998, 4999, 5000, 5001, 5002}) {
        insert(1, ZV_UPLOAD_STATUS_READY, 1e9, "new");
        EXPECT_EQ(zv_ext_db_get_full_count(), rows);
    }
    zv_ext_db_close();
}

} // namespace
