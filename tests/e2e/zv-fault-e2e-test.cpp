// Faults injected end to end: the development server cuts, refuses, stalls and floods its
// answers; another process holds the history locked; the history file and a video go away
// under the running service. Each fault must leave the job paused (or going on), and the
// upload again must complete with the server's copy byte-identical: nothing lost.
#include <gtest/gtest.h>
#include <sqlite3.h>
#include <sys/wait.h>

#include <algorithm>
#include <fstream>
#include <random>
#include <string>
#include <vector>

#include "zv-e2e-util.h"

namespace
{

using zv_e2e::g_log;
using zv_e2e::kLongWaitMs;
using zv_e2e::Logged;
using zv_e2e::Upload;
using zv_upload_test::run_until;
using zv_upload_test::stored_rows;

class FaultE2ETest : public zv_e2e::ControllerFixture
{
  protected:
    // One recorded job of `bytes` random bytes, started by a launch request.
    int start_one(size_t bytes, const std::vector<std::string> &faults = {})
    {
        EXPECT_TRUE(start_server(faults));
        file_ = video("fault.mp4", bytes, 7);
        std::vector<int> ids = zv_e2e::record({file_}, "Fault");
        EXPECT_EQ(ids.size(), 1u);
        start_controller();
        launch();
        return ids.empty() ? 0 : ids[0];
    }
    bool paused(int id) { return rows_are({id}, ZV_UPLOAD_STATUS_PAUSED); }
    // Upload again until the job completes; then the server's copy is checked and no data
    // upload may have sent a byte the server held.
    void finish(int id, const char *kind)
    {
        ASSERT_TRUE(server_.clear_faults());
        ad_.resume_upload(&ad_, job(id));
        ASSERT_TRUE(rows_are({id}, ZV_UPLOAD_STATUS_COMPLETED)) << kind;
        expect_identical(id, file_);
        for (const Logged &r : server_.requests())
            EXPECT_NE(r.status, 416) << kind << ": a data upload sent bytes the server held";
    }

    // The status query of the upload again is refused: the job stays paused; the next upload
    // again completes it.
    void refused_status_query(int status)
    {
        int id = start_one(600000, {"kind=data,action=cut,bytes=200000"});
        ASSERT_TRUE(paused(id));
        ASSERT_TRUE(
            server_.add_fault("kind=status&action=status&status=" + std::to_string(status)));
        ad_.resume_upload(&ad_, job(id));
        ASSERT_TRUE(run_until([&] { return server_.fired("status") == 1; }, kLongWaitMs));
        ASSERT_TRUE(paused(id)) << "a refused status query leaves the job paused";
        finish(id, ("status query answered " + std::to_string(status)).c_str());
    }

    std::string file_;
};

TEST_F(FaultE2ETest, DataUploadCutAtTwentyOffsets)
{
    const char *seed_env = getenv("ZV_FAULT_SEED");
    const unsigned seed = seed_env ? static_cast<unsigned>(strtoul(seed_env, nullptr, 10)) : 7u;
    printf("fault seed %u (ZV_FAULT_SEED replays it)\n", seed);
    std::mt19937 rng(seed);
    const size_t size = 3000000;
    // Every data upload is cut after a random share of what is left; the job pauses, and
    // the upload again asks the server what it holds and sends the rest from there.
    auto cut_rule = [&](long long left) {
        long long k = std::uniform_int_distribution<long long>(1, std::max(1LL, left / 4))(rng);
        return "kind=data&action=cut&bytes=" + std::to_string(k);
    };
    std::string first = cut_rule(size);
    std::replace(first.begin(), first.end(), '&', ',');
    int id = start_one(size, {first});
    long long held = 0;
    for (int cut = 0; cut < 20; ++cut) {
        ASSERT_TRUE(paused(id)) << "cut " << cut;
        Upload u = upload_of(id);
        ASSERT_GE(u.held, held) << "the server lost bytes at cut " << cut;
        held = u.held;
        if (cut == 19)
            break;
        ASSERT_TRUE(server_.add_fault(cut_rule(static_cast<long long>(size) - held)));
        ad_.resume_upload(&ad_, job(id));
        ASSERT_TRUE(run_until([&] { return server_.fired("cut") == cut + 2; }, kLongWaitMs));
    }
    EXPECT_GE(server_.fired("cut"), 20);
    finish(id, ("20 cuts of the data upload, seed " + std::to_string(seed)).c_str());
}

TEST_F(FaultE2ETest, StatusQueryRefusedWith500)
{
    refused_status_query(500);
}

TEST_F(FaultE2ETest, StatusQueryRefusedWith503)
{
    refused_status_query(503);
}

TEST_F(FaultE2ETest, StalledStatusAnswerEndsAtItsTimeLimit)
{
    int id = start_one(500000, {"kind=data,action=cut,bytes=100000"});
    ASSERT_TRUE(paused(id));
    ASSERT_TRUE(server_.add_fault("kind=status&action=stall&seconds=45"));
    ad_.resume_upload(&ad_, job(id));
    // The status query's own limit (30 s) ends the wait, not the server.
    ASSERT_TRUE(run_until([&] { return server_.fired("stall") == 1; }, kLongWaitMs));
    ASSERT_TRUE(rows_are({id}, ZV_UPLOAD_STATUS_PAUSED, 2 * kLongWaitMs));
    finish(id, "stalled status answer");
}

TEST_F(FaultE2ETest, AnswerHeaderOverTheLimit)
{
    int id = start_one(500000, {"kind=data,action=cut,bytes=100000"});
    ASSERT_TRUE(paused(id));
    ASSERT_TRUE(server_.add_fault("kind=status&action=bigheader"));
    ad_.resume_upload(&ad_, job(id));
    ASSERT_TRUE(run_until([&] { return server_.fired("bigheader") == 1; }, kLongWaitMs));
    ASSERT_TRUE(paused(id)) << "an answer over the header limit fails the request";
    finish(id, "answer header over 5,242,880 bytes");
}

TEST_F(FaultE2ETest, HistoryLockedLongerThanTheBusyHandlerWaits)
{
    // Progress is reported (and stored) once per 512 KiB read: a slow 12 MB upload stores
    // several times a second.
    int id = start_one(12000000, {"kind=data,action=throttle,rate=1500000,times=0"});
    ASSERT_TRUE(run_until([&] { return stored_rows()[id].percent > 0; }, kLongWaitMs));
    g_log.mark();
    // Another process holds the write lock for 5 s; the busy handler gives up after 1.5 s.
    zv_test::Child holder;
    std::string said = dir_.file("holder.out");
    ASSERT_TRUE(holder.start({"/proc/self/exe"}, said, {{"ZV_TEST_HOLD_HISTORY_LOCK_MS", "5000"}}));
    ASSERT_TRUE(run_until([&] { return zv_test::read_file(said) == "locked\n"; }, kLongWaitMs));
    ASSERT_TRUE(run_until([&] { return !holder.running(); }, kLongWaitMs));
    EXPECT_TRUE(g_log.logged("busy handler will be returned SQLITE_BUSY error"))
        << "the store met the lock and gave up";
    // Once the lock is gone the next store writes the job's current state.
    ASSERT_TRUE(
        run_until([&] { return stored_rows()[id].percent == job(id)->percent; }, kLongWaitMs));
    finish(id, "history locked by another process");
}

TEST_F(FaultE2ETest, HistoryReplacedByAFileThatIsNotADatabase)
{
    int id = start_one(1000000, {"kind=data,action=throttle,rate=400000,times=0"});
    ASSERT_TRUE(run_until([&] { return stored_rows()[id].percent > 0; }, kLongWaitMs));
    std::string history = getenv("ZV_HISTORY_DB");
    std::string junk = history + ".junk";
    zv_test::write_file(junk, std::string(4096, 'x'));
    ASSERT_EQ(rename(junk.c_str(), history.c_str()), 0);
    ASSERT_TRUE(server_.clear_faults());
    // The upload itself goes on to the end; the service neither stops nor loses the bytes.
    ASSERT_TRUE(
        run_until([&] { return job(id)->status == ZV_UPLOAD_STATUS_COMPLETED; }, kLongWaitMs));
    expect_identical(id, file_);
}

TEST_F(FaultE2ETest, VideoDisappearsMidUpload)
{
    ASSERT_TRUE(start_server({"kind=data,action=throttle,rate=300000,times=0"}));
    std::string gone = video("gone.mp4", 1200000, 31);
    file_ = video("stays.mp4", 900000, 32);
    std::vector<int> ids = zv_e2e::record({gone, file_}, "Fault");
    ASSERT_EQ(ids.size(), 2u);
    start_controller();
    launch();
    ASSERT_TRUE(run_until([&] { return mid_upload(ids[0]); }, kLongWaitMs));
    ASSERT_EQ(unlink(gone.c_str()), 0);
    // Paused from its badge and uploaded again, the job has to open its file anew: it is gone,
    // so the job stays paused and says why, while the other job goes on.
    g_log.mark();
    ad_.pause_upload(&ad_, job(ids[0]));
    ASSERT_TRUE(rows_are({ids[0]}, ZV_UPLOAD_STATUS_PAUSED));
    ad_.resume_upload(&ad_, job(ids[0]));
    run_until([] { return false; }, 1500);
    EXPECT_EQ(job(ids[0])->status, ZV_UPLOAD_STATUS_PAUSED);
    EXPECT_FALSE(upload_of(ids[0]).complete);
    ASSERT_TRUE(server_.clear_faults());
    ad_.resume_upload(&ad_, job(ids[1]));
    ASSERT_TRUE(rows_are({ids[1]}, ZV_UPLOAD_STATUS_COMPLETED));
    expect_identical(ids[1], file_);
}

} // namespace
