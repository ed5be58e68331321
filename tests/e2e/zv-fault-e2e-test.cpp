// Faults injected end to end: the development server cuts, refuses, stalls and floods its
// answers; another connection holds the history locked; the history file and a video go away
// under the running service. Each fault must leave the job paused (or going on), and the
// upload again must complete with the server's copy byte-identical: nothing lost.
#include <algorithm>
#include <random>
#include <set>

#include <sqlite3.h>

#include "zv-e2e-util.h"

namespace
{

using namespace zv_e2e;

class FaultE2ETest : public ControllerFixture
{
  protected:
    // One recorded job of `bytes` random bytes (file_), started by a launch request.
    int start_one(size_t bytes, const std::string &name = "fault.mp4")
    {
        file_ = video(name, bytes, static_cast<unsigned>(bytes));
        std::vector<int> ids = record({file_}, "Fault");
        EXPECT_EQ(ids.size(), 1u);
        if (!started_)
            start_controller();
        launch();
        return ids.empty() ? 0 : ids[0];
    }
    bool paused(int id) { return rows_are({id}, ZV_UPLOAD_STATUS_PAUSED); }
    // Watches the bar the job's row shows now: every value set on it goes to values_.
    void watch_bar(int id)
    {
        UploadItem *j = job(id);
        Evas_Object *bar =
            j && j->gen_item ? elm_object_item_part_content_get(j->gen_item, "elm.icon") : nullptr;
        if (bar && watched_.insert(bar).second)
            evas_object_smart_callback_add(
                bar, "changed",
                [](void *data, Evas_Object *obj, void *) {
                    static_cast<std::vector<double> *>(data)->push_back(
                        elm_progressbar_value_get(obj));
                },
                &values_);
    }
    // Upload again until the job completes: the server's copy is identical, no data upload sent
    // a byte the server held, and the bar of a paused job, set back first, was drawn to its end
    // (even with less than one read of the file left, when the first report only makes the job
    // UPLOADING).
    void finish(int id)
    {
        ASSERT_TRUE(server_.clear_faults());
        const bool was_paused = job(id)->status == ZV_UPLOAD_STATUS_PAUSED;
        watched_.clear();
        watch_bar(id);
        for (Evas_Object *bar : watched_)
            elm_progressbar_value_set(bar, 0.0);
        values_.clear();
        ad_.resume_upload(&ad_, job(id));
        ASSERT_TRUE(wait_for(
            [&] {
                watch_bar(id);
                return rows_in({id}, ZV_UPLOAD_STATUS_COMPLETED);
            },
            kLongWaitMs));
        expect_identical(id, file_);
        for (const Logged &r : server_.requests())
            EXPECT_NE(r.status, 416) << "a data upload sent bytes the server held";
        EXPECT_EQ(stored_rows()[id].percent, 100);
        if (was_paused) {
            ASSERT_FALSE(values_.empty()) << "the bar never moved after the upload again";
            EXPECT_DOUBLE_EQ(values_.back(), 1.0);
        }
    }

    std::set<Evas_Object *> watched_;
    std::vector<double> values_;
    std::string file_;
};

TEST_F(FaultE2ETest, DataUploadCutAtTwentyOffsets)
{
    const char *seed_env = getenv("ZV_FAULT_SEED");
    const unsigned seed = seed_env ? static_cast<unsigned>(strtoul(seed_env, nullptr, 10)) : 7u;
    printf("fault seed %u (ZV_FAULT_SEED replays it)\n", seed);
    std::mt19937 rng(seed);
    const long long size = 3000000;
    // Every data upload is cut after a random share of what is left; the job pauses, and
    // the upload again asks the server what it holds and sends the rest from there.
    auto cut_rule = [&](long long left) {
        long long k = std::uniform_int_distribution<long long>(1, std::max(1LL, left / 4))(rng);
        return "kind=data&action=cut&bytes=" + std::to_string(k);
    };
    ASSERT_TRUE(start_server());
    ASSERT_TRUE(server_.add_fault(cut_rule(size)));
    int id = start_one(size);
    long long held = 0;
    for (int cut = 0; cut < 20; ++cut) {
        ASSERT_TRUE(paused(id)) << "cut " << cut;
        Upload u = upload_of(id);
        ASSERT_GE(u.held, held) << "the server lost bytes at cut " << cut;
        held = u.held;
        if (cut == 19)
            break;
        ASSERT_TRUE(server_.add_fault(cut_rule(size - held)));
        ad_.resume_upload(&ad_, job(id));
        ASSERT_TRUE(wait_for([&] { return server_.fired("cut") == cut + 2; }, kLongWaitMs));
    }
    finish(id);
}

// The status query of an upload again meets a fault: the job stays paused, and the next
// upload again completes it.
TEST_F(FaultE2ETest, StatusQueryFaultsLeaveTheJobPaused)
{
    const struct {
        const char *rule, *action;
        int wait_ms;
    } faults[] = {
        {"kind=status&action=status&status=500", "status", kLongWaitMs},
        {"kind=status&action=status&status=503", "status", kLongWaitMs},
        // The status query's own limit (30 s) ends the wait, not the server.
        {"kind=status&action=stall&seconds=45", "stall", 2 * kLongWaitMs},
        // An answer header over 5,242,880 bytes fails the request.
        {"kind=status&action=bigheader", "bigheader", kLongWaitMs},
    };
    ASSERT_TRUE(start_server());
    for (const auto &f : faults) {
        SCOPED_TRACE(f.rule);
        ASSERT_TRUE(server_.add_fault("kind=data&action=cut&bytes=100000"));
        int id = start_one(500000, std::string(f.action) + std::to_string(f.wait_ms) + ".mp4");
        ASSERT_TRUE(paused(id));
        ASSERT_TRUE(server_.add_fault(f.rule));
        ad_.resume_upload(&ad_, job(id));
        ASSERT_EQ(job(id)->status, ZV_UPLOAD_STATUS_UPLOADING);
        ASSERT_TRUE(wait_for([&] { return server_.fired(f.action) == 1; }, kLongWaitMs));
        // The stored row said PAUSED all along: the job itself must pause again.
        ASSERT_TRUE(wait_for(
            [&] {
                return job(id)->status == ZV_UPLOAD_STATUS_PAUSED &&
                       rows_in({id}, ZV_UPLOAD_STATUS_PAUSED);
            },
            f.wait_ms));
        finish(id);
    }
}

TEST_F(FaultE2ETest, HistoryLockedLongerThanTheBusyHandlerWaits)
{
    // Progress is reported (and stored) once per 512 KiB read: a slow 12 MB upload stores
    // several times a second.
    ASSERT_TRUE(start_server({"kind=data,action=throttle,rate=1500000,times=0"}));
    int id = start_one(12000000);
    ASSERT_TRUE(wait_for([&] { return stored_rows()[id].percent > 0; }, kLongWaitMs));
    // Another connection takes the write lock until the store has met it and given up
    // (the busy handler waits 1.5 s).
    sqlite3 *other = nullptr;
    ASSERT_EQ(sqlite3_open(getenv("ZV_HISTORY_DB"), &other), SQLITE_OK);
    ASSERT_EQ(sqlite3_exec(other, "BEGIN EXCLUSIVE", nullptr, nullptr, nullptr), SQLITE_OK);
    g_test_log.mark();
    EXPECT_TRUE(wait_for(
        [] { return g_test_log.logged("busy handler will be returned SQLITE_BUSY error"); },
        kLongWaitMs));
    sqlite3_exec(other, "COMMIT", nullptr, nullptr, nullptr);
    sqlite3_close(other);
    // Once the lock is gone the next store writes the job's current state.
    ASSERT_TRUE(
        wait_for([&] { return stored_rows()[id].percent == job(id)->percent; }, kLongWaitMs));
    finish(id);
}

TEST_F(FaultE2ETest, HistoryReplacedByAFileThatIsNotADatabase)
{
    ASSERT_TRUE(start_server({"kind=data,action=throttle,rate=400000,times=0"}));
    int id = start_one(1000000);
    ASSERT_TRUE(wait_for([&] { return stored_rows()[id].percent > 0; }, kLongWaitMs));
    std::string history = getenv("ZV_HISTORY_DB");
    zv_test::write_file(history + ".junk", std::string(4096, 'x'));
    ASSERT_EQ(rename((history + ".junk").c_str(), history.c_str()), 0);
    ASSERT_TRUE(server_.clear_faults());
    // The upload itself goes on to the end; the service neither stops nor loses the bytes.
    ASSERT_TRUE(
        wait_for([&] { return job(id)->status == ZV_UPLOAD_STATUS_COMPLETED; }, kLongWaitMs));
    expect_identical(id, file_);
}

TEST_F(FaultE2ETest, VideoDisappearsMidUpload)
{
    ASSERT_TRUE(start_server({"kind=data,action=throttle,rate=300000,times=0"}));
    std::string gone = video("gone.mp4", 1200000, 31);
    file_ = video("stays.mp4", 900000, 32);
    std::vector<int> ids = record({gone, file_}, "Fault");
    ASSERT_EQ(ids.size(), 2u);
    start_controller();
    launch();
    ASSERT_TRUE(wait_for([&] { return mid_upload(ids[0]); }, kLongWaitMs));
    ASSERT_EQ(unlink(gone.c_str()), 0);
    // Paused from its badge and uploaded again, the job has to open its file anew: it is gone,
    // so the job stays paused and says why, while the other job goes on.
    ad_.pause_upload(&ad_, job(ids[0]));
    ASSERT_TRUE(rows_are({ids[0]}, ZV_UPLOAD_STATUS_PAUSED));
    ad_.resume_upload(&ad_, job(ids[0]));
    std::string why = "file of " + std::to_string(ids[0]) + " is missing";
    ASSERT_TRUE(wait_for([&] { return g_test_log.logged(why); }, kLongWaitMs));
    EXPECT_EQ(job(ids[0])->status, ZV_UPLOAD_STATUS_PAUSED);
    EXPECT_FALSE(upload_of(ids[0]).complete);
    finish(ids[1]);
}

} // namespace
