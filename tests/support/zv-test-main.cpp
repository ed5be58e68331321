// Test entry: EFL is initialised once (headless under ELM_ENGINE=buffer) for every test
// program, so tests that build objects and those that only spin the main loop share it.
//
// With ZV_TEST_HOLD_HISTORY_LOCK_MS set, the program is instead "another process" of the
// history database: it takes the write lock of $ZV_HISTORY_DB, says "locked" on standard
// output, holds the lock that many milliseconds and exits.
#include <Elementary.h>
#include <gtest/gtest.h>
#include <sqlite3.h>
#include <stdio.h>
#include <stdlib.h>
#include <unistd.h>

static int hold_history_lock(long ms)
{
    sqlite3 *db = nullptr;
    if (sqlite3_open(getenv("ZV_HISTORY_DB"), &db) != SQLITE_OK ||
        sqlite3_exec(db, "BEGIN EXCLUSIVE", nullptr, nullptr, nullptr) != SQLITE_OK)
        return 1;
    printf("locked\n");
    fflush(stdout);
    usleep(static_cast<useconds_t>(ms) * 1000);
    sqlite3_exec(db, "COMMIT", nullptr, nullptr, nullptr);
    sqlite3_close(db);
    return 0;
}

int main(int argc, char **argv)
{
    if (const char *ms = getenv("ZV_TEST_HOLD_HISTORY_LOCK_MS"))
        return hold_history_lock(atol(ms));
    ::testing::InitGoogleTest(&argc, argv);
    // Listing the tests (CTest does it to find them) needs no toolkit.
    if (::testing::GTEST_FLAG(list_tests))
        return RUN_ALL_TESTS();
    elm_init(argc, argv);
    int rc = RUN_ALL_TESTS();
    elm_shutdown();
    return rc;
}
