// Tests of the controller that need no server: loaders, finders, notifications, the rows it
// refuses to send, and the races of the worker's answers with the main loop, which the tests
// steer by answering in the worker's place. The upload host is a closed or silent local port.
#include "zv-upload-ctrl.h"

#include <gtest/gtest.h>
#include <sqlite3.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "app_i18n.h"
#include "zv-ext-network.h"
#include "zv-upload-list.h"
#include "zv-upload-test-util.h"

namespace
{

// A local port that takes connections and never answers: a request sent there stays in
// flight, and the test answers it in the worker's place, in the order it chooses.
struct SilentServer {
    int port = 0, fd = zv_test::listen_loopback(&port, 64);
    ~SilentServer() { close(fd); }
    std::string host() const { return "127.0.0.1:" + std::to_string(port); }
    std::string url(int id) const { return "http://" + host() + "/upload/" + std::to_string(id); }
};

using namespace zv_upload_test;

zv_test::LogFile g_log;

class UploadCtrlTest : public ::testing::Test
{
  protected:
    void SetUp() override
    {
        setenv("ZV_UPLOAD_HOST", "127.0.0.1:9", 1);
        ASSERT_TRUE(set_network(true));
        ASSERT_TRUE(zv_ext_db_open());
        ad_.access_token = g_strdup("token");
        ad_.category = g_strdup("People");
        i18n_bind_text_domain();
        g_log.mark();
    }
    void TearDown() override
    {
        if (started_) {
            zv_upload_ctrl_finalize(&ad_);
            zv_ext_network_deregister();
        }
        zv_ext_db_close();
        g_free(ad_.access_token);
        g_free(ad_.category);
    }

    std::string run_dir() const { return dir_.file("run"); }
    void start()
    {
        zv_upload_ctrl_initialize(&ad_);
        started_ = true;
    }
    void launch()
    {
        zv_upload_ctrl_init_value(&ad_);
        ASSERT_TRUE(zv_upload_ctrl_service(&ad_));
    }
    UploadItem *job(int historyid) { return _zv_upload_ctrl_find_item_by_id(&ad_, historyid); }
    std::vector<int> job_ids()
    {
        std::vector<int> ids;
        for (GList *l = ad_.job_list; l; l = l->next)
            ids.push_back(static_cast<UploadItem *>(l->data)->historyid);
        return ids;
    }
    std::string video(const std::string &name, size_t bytes)
    {
        std::string path = dir_.file(name);
        EXPECT_TRUE(zv_test::write_file(path, std::string(bytes, 'v')));
        return path;
    }
    // True once every job of `ids` is PAUSED, in the list and in its row.
    bool all_paused(const std::vector<int> &ids)
    {
        auto rows = stored_rows();
        for (int id : ids)
            if (job(id)->status != ZV_UPLOAD_STATUS_PAUSED ||
                rows[id].status != ZV_UPLOAD_STATUS_PAUSED)
                return false;
        return true;
    }
    // Metadata uploads go to the silent server.
    void use_silent_server()
    {
        setenv("ZV_UPLOAD_HOST", silent_.host().c_str(), 1);
        ASSERT_EQ(zv_test::run_program(
                      {zv_test::bin_path("zv-keystore"), "set", "zuvo.tizen.api.key"}, "key"),
                  0);
    }
    // The answer of the job's current request, as the worker reports it.
    void answer(UploadItem *job_item, int type, int result, const char *value = nullptr)
    {
        ServiceResponse resp = {job_item->handle, result == ZV_ERROR_NONE ? 201 : 500, type,
                                const_cast<char *>(value)};
        _zv_upload_ctrl_resp_cb(result, &resp, &ad_);
    }
    void deliver(Ecore_Pipe_Cb handler, int historyid)
    {
        PipeMessage msg = {historyid, 0};
        handler(&ad_, &msg, sizeof msg);
    }
    // Hands every message already in the pipes to its handler, and runs the idlers added
    // so far.
    void drain()
    {
        bool idled = false;
        ecore_idler_add(
            [](void *data) -> Eina_Bool {
                *static_cast<bool *>(data) = true;
                return ECORE_CALLBACK_CANCEL;
            },
            &idled);
        ASSERT_TRUE(zv_test::wait_for([&] { return idled; }));
        for (int i = 0; i < 3; i++)
            ecore_main_loop_iterate();
    }
    // A PAUSED row whose upload again is under way, its status query out to the silent
    // server; with `sent`, answered with the server's count: its data upload is out, and running.
    UploadItem *resumed(int historyid, bool sent)
    {
        std::string file = video("v" + std::to_string(historyid) + ".mp4", 1000);
        EXPECT_TRUE(add_row(historyid, ZV_UPLOAD_STATUS_PAUSED, historyid, file.c_str(), "Clip",
                            silent_.url(historyid).c_str()));
        zv_upload_list_load_full_item(&ad_); // takes only the rows that are not jobs yet
        UploadItem *j = job(historyid);
        ad_.resume_upload(&ad_, j);
        drain();
        if (sent) {
            answer(j, ZV_RESP_TYPE_UPLOAD_QUERY, ZV_ERROR_NONE, "99");
            drain();
            _zv_upload_ctrl_progress_cb(j->handle, 10, &ad_);
            drain();
        }
        return j;
    }

    zv_test::TempDir dir_;
    SilentServer silent_;
    AppData &ad_ = process_appdata();
    bool started_ = false;
};

// The full load (the later loads add READY rows through the same path: the end-to-end tests
// launch again, and a row loaded twice is one job below).
TEST_F(UploadCtrlTest, LoadsPutNewestFirstAndTakeReadyRowsAsWaiting)
{
    ASSERT_TRUE(add_row(1, ZV_UPLOAD_STATUS_READY, 1.0, "/v/one.mp4", "One"));
    ASSERT_TRUE(
        add_row(3, ZV_UPLOAD_STATUS_COMPLETED, 3.0, "/v/three.mp4", "Three", "http://up/3", 100));
    ASSERT_TRUE(add_row(2, ZV_UPLOAD_STATUS_PAUSED, 2.0, "/v/two.mp4", "Two", "http://up/2", 40));
    // The full load, before the media database is connected: the rows load without thumbnails.
    zv_upload_list_load_full_item(&ad_);
    start();
    EXPECT_EQ(job_ids(), (std::vector<int>{3, 2, 1}));
    auto rows = stored_rows();
    EXPECT_EQ(rows[1].status, ZV_UPLOAD_STATUS_WAITING);
    EXPECT_EQ(rows[2].status, ZV_UPLOAD_STATUS_PAUSED);
    EXPECT_EQ(rows[3].status, ZV_UPLOAD_STATUS_COMPLETED);
    const UploadItem *paused = job(2);
    EXPECT_STREQ(paused->title, "Two");
    EXPECT_STREQ(paused->url, "http://up/2");
    EXPECT_STREQ(paused->userid, "user@example.com");
    EXPECT_EQ(paused->percent, 40);
    EXPECT_EQ(paused->status, ZV_UPLOAD_STATUS_PAUSED);
    EXPECT_EQ(paused->handle, nullptr);
    EXPECT_EQ(job(1)->status, ZV_UPLOAD_STATUS_WAITING);
    EXPECT_EQ(job(1)->url, nullptr);
}

TEST_F(UploadCtrlTest, FindersTakeTheFirstMatchAndSkipNullEntries)
{
    UploadItem first = {}, second = {}, other = {};
    first.historyid = second.historyid = 5;
    other.historyid = 6;
    ServiceRequest *request = zv_request_new();
    second.handle = request;
    for (UploadItem *item : {(UploadItem *)nullptr, &first, &second, &other})
        ad_.job_list = g_list_append(ad_.job_list, item);

    EXPECT_EQ(_zv_upload_ctrl_find_item_by_id(&ad_, 5), &first);
    EXPECT_EQ(_zv_upload_ctrl_find_item_by_id(&ad_, 6), &other);
    EXPECT_EQ(_zv_upload_ctrl_find_item_by_id(&ad_, 7), nullptr);
    EXPECT_EQ(_zv_upload_ctrl_find_item(&ad_, request), &second);
    EXPECT_EQ(_zv_upload_ctrl_find_item(&ad_, nullptr), nullptr);
    EXPECT_TRUE(g_log.logged("Skip NULL item : 0"));
    g_list_free(ad_.job_list);
    ad_.job_list = nullptr;
    EXPECT_EQ(_zv_upload_ctrl_find_item_by_id(&ad_, 5), nullptr);
    EXPECT_TRUE(g_log.logged("list is NULL"));
    zv_request_free(request);
}

TEST_F(UploadCtrlTest, NotificationsFollowTheCounters)
{
    const struct {
        const char *what;
        int completed, total;
        bool with_job;
        int status, percent;
        const char *ongoing_count; // null: no ongoing notification
        double progress;
        const char *complete_title_part; // null: no completion notification
        const char *complete_title_not;
        int completed_after;
    } cases[] = {
        {"one of three done", 1, 3, false, 0, 0, "[1/3]", 1.0 / 3, nullptr, nullptr, 1},
        {"single job follows its percent", 0, 1, true, ZV_UPLOAD_STATUS_UPLOADING, 40, "", 0.4,
         nullptr, nullptr, 0},
        {"failed job beside one completed", 1, 1, true, ZV_UPLOAD_STATUS_PAUSED, 20, nullptr, 0,
         "1", "Sunset", 0},
        {"nothing to upload", 0, 0, false, 0, 0, nullptr, 0, nullptr, nullptr, 0},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.what);
        unlink((run_dir() + "/notifications/zuvo_complete_noti.ini").c_str());
        UploadItem job_item = {};
        job_item.title = const_cast<char *>("Sunset");
        job_item.status = c.status;
        job_item.percent = c.percent;
        ad_.completed_count = c.completed;
        ad_.total_count = c.total;

        zv_upload_ctrl_post_notification(&ad_, c.with_job ? &job_item : nullptr);

        auto ongoing = notification("zuvo_ongoing_noti");
        auto complete = notification("zuvo_complete_noti");
        ASSERT_EQ(ongoing.empty(), !c.ongoing_count);
        if (c.ongoing_count) {
            EXPECT_EQ(ongoing["event_count"], c.ongoing_count);
            EXPECT_NEAR(g_ascii_strtod(ongoing["progress"].c_str(), nullptr), c.progress, 1e-6);
        }
        ASSERT_EQ(complete.empty(), !c.complete_title_part);
        if (c.complete_title_part) {
            EXPECT_NE(complete["title"].find(c.complete_title_part), std::string::npos)
                << complete["title"];
        }
        if (c.complete_title_not) {
            EXPECT_EQ(complete["title"].find(c.complete_title_not), std::string::npos);
        }
        EXPECT_EQ(ad_.completed_count, c.completed_after);
    }
}

TEST_F(UploadCtrlTest, RowsThatCannotBeSentEndPausedAndSayWhy)
{
    std::string empty = video("empty.mp4", 0), good = video("good.mp4", 100);
    std::string huge = dir_.file("huge.mp4"), missing = dir_.file("missing.mp4");
    ASSERT_TRUE(zv_test::write_file(huge, ""));
    ASSERT_EQ(truncate(huge.c_str(), 5000000000LL), 0); // sparse: takes no room
    ASSERT_TRUE(add_row(1, ZV_UPLOAD_STATUS_READY, 1, missing.c_str()));
    ASSERT_TRUE(add_row(2, ZV_UPLOAD_STATUS_READY, 2, empty.c_str()));
    ASSERT_TRUE(add_row(3, ZV_UPLOAD_STATUS_READY, 3, huge.c_str()));
    ASSERT_TRUE(add_row(4, ZV_UPLOAD_STATUS_READY, 4, nullptr));
    ASSERT_TRUE(add_row(5, ZV_UPLOAD_STATUS_READY, 5, good.c_str(), nullptr));
    ASSERT_TRUE(add_row(6, ZV_UPLOAD_STATUS_READY, 6, dir_.path().c_str()));
    // The good rows, the one past 4 GiB among them, go on to their metadata upload, which
    // fails for want of an API key.
    ASSERT_TRUE(add_row(7, ZV_UPLOAD_STATUS_READY, 7, good.c_str()));
    ASSERT_TRUE(add_row(8, ZV_UPLOAD_STATUS_PAUSED, 8, good.c_str(), "Never sent"));
    start();
    launch();
    ASSERT_TRUE(zv_test::wait_for([&] { return all_paused({1, 2, 3, 4, 5, 6, 7}); }));
    // A row without a title or file name fails at its setter, with the setter's message; a
    // file that cannot be sent is named with the reason. Only the good rows send anything.
    EXPECT_TRUE(g_log.logged("file of 1 is missing: " + missing));
    EXPECT_TRUE(g_log.logged("file of 2 is empty, nothing to upload: " + empty));
    EXPECT_TRUE(g_log.logged("zv_set_attr_file_path fail: -988"));
    EXPECT_TRUE(g_log.logged("zv_set_attr_title fail: -993"));
    EXPECT_TRUE(g_log.logged("file of 6 is not a regular file"));
    std::string log = g_log.since_mark(), sent = "zv_request_meta_upload fail: -982";
    size_t first = log.find(sent), second = log.find(sent, first + 1);
    EXPECT_NE(second, std::string::npos) << "the rows past 4 GiB and the good one send";
    EXPECT_EQ(log.find(sent, second + 1), std::string::npos) << "no other row sends";

    // Upload again on the empty file says why again and sends nothing.
    g_log.mark();
    ad_.resume_upload(&ad_, job(2));
    EXPECT_TRUE(g_log.logged("file of 2 is empty, nothing to upload: " + empty));
    EXPECT_FALSE(g_log.logged("zv_request_upload_query"));
    EXPECT_EQ(job(2)->status, ZV_UPLOAD_STATUS_PAUSED);
    // Upload again on a row that never got its address stays paused.
    g_log.mark();
    ad_.resume_upload(&ad_, job(8));
    ASSERT_TRUE(zv_test::wait_for([] { return g_log.logged("It need to update notification"); }));
    EXPECT_TRUE(g_log.logged("zv_set_attr_upload_url fail: -983"));
    EXPECT_TRUE(all_paused({8}));
}

TEST_F(UploadCtrlTest, StatusAnswerNamingNoByteOfTheFilePausesWithoutDataUpload)
{
    // The status queries go to the silent server: only the answers below arrive.
    std::string clip = video("clip.mp4", 100); // last byte index 99
    const char *ranges[] = {"100", "5000000000", "-1", "12abc", "99999999999999999999"};
    for (int id = 1; id <= 5; id++)
        ASSERT_TRUE(
            add_row(id, ZV_UPLOAD_STATUS_PAUSED, id, clip.c_str(), "Clip", silent_.url(1).c_str()));
    start();
    for (int id = 1; id <= 5; id++) {
        ad_.resume_upload(&ad_, job(id));
        answer(job(id), ZV_RESP_TYPE_UPLOAD_QUERY, ZV_ERROR_NONE, ranges[id - 1]);
    }
    ASSERT_TRUE(zv_test::wait_for([&] { return all_paused({1, 2, 3, 4, 5}); }));
    for (int id = 1; id <= 5; id++) {
        EXPECT_TRUE(g_log.logged("Range of " + std::to_string(id) + " names no byte of its file " +
                                 "(100 bytes): \"" + ranges[id - 1] + "\""));
        EXPECT_EQ(job(id)->handle->resp_type, ZV_RESP_TYPE_UPLOAD_QUERY) << "no data upload";
    }
}

TEST_F(UploadCtrlTest, PauseBeforeTheUploadMessageKeepsTheJobPausedAndOneAnswerStartsOneUpload)
{
    use_silent_server();
    std::string file = video("a.mp4", 1000);
    ASSERT_TRUE(add_row(1, ZV_UPLOAD_STATUS_READY, 1, file.c_str()));
    start();
    launch();
    drain();
    UploadItem *a = job(1);
    ASSERT_EQ(a->status, ZV_UPLOAD_STATUS_WAITING);
    ServiceRequest *meta = a->handle;
    ASSERT_NE(meta, nullptr);

    // The metadata answer, then a network event before the upload message is read.
    answer(a, ZV_RESP_TYPE_META_UPLOAD, ZV_ERROR_NONE, silent_.url(1).c_str());
    _zv_upload_ctrl_net_status_cb(2, &ad_);
    drain();
    EXPECT_EQ(a->status, ZV_UPLOAD_STATUS_PAUSED);
    EXPECT_EQ(a->handle, meta) << "no data upload was started";
    EXPECT_EQ(stored_rows()[1].status, ZV_UPLOAD_STATUS_PAUSED);
    EXPECT_EQ(stored_rows()[1].url, silent_.url(1)) << "the address is kept";

    // A launch request leaves a paused job alone.
    launch();
    drain();
    EXPECT_EQ(a->handle, meta);

    // Upload again: the query's answer starts one data upload from its count, however many
    // upload messages are read.
    ad_.resume_upload(&ad_, a);
    drain();
    ServiceRequest *query = a->handle;
    ASSERT_NE(query, meta);
    answer(a, ZV_RESP_TYPE_UPLOAD_QUERY, ZV_ERROR_NONE, "99");
    deliver(_zv_upload_ctrl_pipe_upload_cb, 1);
    ServiceRequest *data = a->handle;
    EXPECT_NE(data, query);
    EXPECT_EQ(a->offset, 99);
    deliver(_zv_upload_ctrl_pipe_upload_cb, 1);
    drain();
    EXPECT_EQ(a->handle, data) << "a second upload message crossed the running upload";

    // A launch request leaves the running upload alone too.
    launch();
    drain();
    EXPECT_EQ(a->handle, data);
}

TEST_F(UploadCtrlTest, CompletionIsCountedOnceWhicheverPipeIsReadFirst)
{
    use_silent_server();
    start();
    launch();
    // The first progress report (change pipe) and the completion (complete pipe) of a one-job
    // batch, read in both orders.
    for (int complete_first : {0, 1}) {
        SCOPED_TRACE(complete_first ? "complete pipe first" : "change pipe first");
        int id = 10 + complete_first;
        unlink((run_dir() + "/notifications/zuvo_complete_noti.ini").c_str());
        UploadItem *j = resumed(id, false);
        answer(j, ZV_RESP_TYPE_UPLOAD_QUERY, ZV_ERROR_NONE, "99");
        drain();
        _zv_upload_ctrl_progress_cb(j->handle, 100, &ad_);
        answer(j, ZV_RESP_TYPE_DATA_UPLOAD, ZV_ERROR_NONE);
        deliver(complete_first ? _zv_upload_ctrl_pipe_complete_cb : _zv_upload_ctrl_pipe_change_cb,
                id);
        deliver(complete_first ? _zv_upload_ctrl_pipe_change_cb : _zv_upload_ctrl_pipe_complete_cb,
                id);
        drain(); // the pipes' own copies of both messages

        EXPECT_EQ(j->status, ZV_UPLOAD_STATUS_COMPLETED);
        EXPECT_EQ(stored_rows()[id].status, ZV_UPLOAD_STATUS_COMPLETED);
        EXPECT_EQ(notification("zuvo_complete_noti")["title"], "Clip");
        EXPECT_TRUE(notification("zuvo_ongoing_noti").empty());
        EXPECT_EQ(ad_.completed_count, 0);
    }
}

// Pause and upload again leave a completed job alone: one completed while running, and one
// loaded completed.
TEST_F(UploadCtrlTest, CompletedJobsIgnorePauseAndResume)
{
    use_silent_server();
    ASSERT_TRUE(add_row(1, ZV_UPLOAD_STATUS_COMPLETED, 1, "/v/1", "Done", "http://up/1", 100));
    start();
    launch();
    UploadItem *j = resumed(2, true);
    ASSERT_EQ(j->status, ZV_UPLOAD_STATUS_UPLOADING);
    answer(j, ZV_RESP_TYPE_DATA_UPLOAD, ZV_ERROR_NONE);
    ad_.pause_upload(&ad_, j);
    EXPECT_TRUE(g_log.logged("Skip for complete item"));
    drain();
    EXPECT_FALSE(notification("zuvo_complete_noti").empty());
    for (int id : {1, 2}) {
        ServiceRequest *handle = job(id)->handle;
        ad_.pause_upload(&ad_, job(id));
        ad_.resume_upload(&ad_, job(id));
        EXPECT_EQ(job(id)->handle, handle);
        EXPECT_EQ(job(id)->status, ZV_UPLOAD_STATUS_COMPLETED);
        EXPECT_EQ(stored_rows()[id].status, ZV_UPLOAD_STATUS_COMPLETED);
    }
}

TEST_F(UploadCtrlTest, RequestsThatFailAtOnceLeaveTheirJobsPaused)
{
    // Upload again against a closed port: each status query is refused at once, however
    // soon after it was queued, and its job ends PAUSED with nothing in flight.
    use_silent_server();
    std::vector<int> ids;
    for (int id = 1; id <= 8; id++) {
        std::string file = video("v" + std::to_string(id) + ".mp4", 100);
        ASSERT_TRUE(add_row(id, ZV_UPLOAD_STATUS_PAUSED, id, file.c_str(), "Clip",
                            "http://127.0.0.1:9/upload/1"));
        ids.push_back(id);
    }
    start();
    for (int id : ids)
        ad_.resume_upload(&ad_, job(id));
    ASSERT_TRUE(zv_test::wait_for([&] { return all_paused(ids); }));

    // With the engine stopped, every request is refused when it is made.
    zv_finalize_service();
    std::string file = video("late.mp4", 100);
    ASSERT_TRUE(add_row(20, ZV_UPLOAD_STATUS_READY, 20, file.c_str()));
    g_log.mark();
    launch();
    ASSERT_TRUE(
        zv_test::wait_for([&] { return stored_rows()[20].status == ZV_UPLOAD_STATUS_PAUSED; }));
    EXPECT_TRUE(g_log.logged("zv_request_meta_upload fail: -998"));
    ad_.resume_upload(&ad_, job(1));
    EXPECT_TRUE(g_log.logged("zv_request_upload_query fail: -998"));
    EXPECT_EQ(job(1)->status, ZV_UPLOAD_STATUS_PAUSED);
}

TEST_F(UploadCtrlTest, StoresThatFailAreMadeAgainAndARowIsOneJob)
{
    use_silent_server();
    ASSERT_TRUE(set_network(false));
    std::string file = video("a.mp4", 100);
    ASSERT_TRUE(add_row(1, ZV_UPLOAD_STATUS_READY, 1, file.c_str()));
    start();
    // Another process holds the history past the store's patience: the row stays READY.
    sqlite3 *other = nullptr;
    ASSERT_EQ(sqlite3_open(getenv("ZV_HISTORY_DB"), &other), SQLITE_OK);
    ASSERT_EQ(sqlite3_exec(other, "BEGIN EXCLUSIVE", nullptr, nullptr, nullptr), SQLITE_OK);
    launch();
    launch();
    EXPECT_EQ(g_list_length(ad_.job_list), 1u) << "the READY row was loaded once";
    sqlite3_exec(other, "COMMIT", nullptr, nullptr, nullptr);
    EXPECT_TRUE(
        zv_test::wait_for([] { return stored_rows()[1].status == ZV_UPLOAD_STATUS_WAITING; }));

    // A completion stored while the history is held reaches the row once it is free.
    ASSERT_TRUE(set_network(true));
    UploadItem *j = resumed(2, true);
    answer(j, ZV_RESP_TYPE_DATA_UPLOAD, ZV_ERROR_NONE);
    ASSERT_EQ(sqlite3_exec(other, "BEGIN EXCLUSIVE", nullptr, nullptr, nullptr), SQLITE_OK);
    drain();
    EXPECT_EQ(j->status, ZV_UPLOAD_STATUS_COMPLETED);
    sqlite3_exec(other, "COMMIT", nullptr, nullptr, nullptr);
    sqlite3_close(other);
    EXPECT_TRUE(
        zv_test::wait_for([] { return stored_rows()[2].status == ZV_UPLOAD_STATUS_COMPLETED; }));
}

} // namespace
