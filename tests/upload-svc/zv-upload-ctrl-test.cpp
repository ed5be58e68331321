// Tests of the controller that need no server: loaders, finders, notifications, the rows it
// refuses to send, and the races of the worker's answers with the main loop, which the tests
// steer by answering in the worker's place. The upload host is a silent local port.
#include <sqlite3.h>
#include <unistd.h>

#include "../e2e/zv-e2e-util.h"
#include "zv-upload-list.h"

namespace
{

using namespace zv_e2e;

class UploadCtrlTest : public ControllerFixture
{
  protected:
    void SetUp() override
    {
        ControllerFixture::SetUp();
        setenv("ZV_UPLOAD_HOST", ("127.0.0.1:" + std::to_string(port_)).c_str(), 1);
    }
    // The answer of the job's current request, as the worker reports it.
    void answer(UploadItem *j, int type, int result, const char *value = nullptr)
    {
        ServiceResponse resp = {j->handle, result == ZV_ERROR_NONE ? 201 : 500, type,
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
        ASSERT_TRUE(wait_for([&] { return idled; }));
        for (int i = 0; i < 3; i++)
            ecore_main_loop_iterate();
    }
    // A PAUSED row of 1000 bytes uploaded again: its status query is answered with the
    // server's count, and its data upload is out.
    UploadItem *resumed(int historyid)
    {
        std::string file = video("v" + std::to_string(historyid) + ".mp4", 1000);
        EXPECT_TRUE(add_row(historyid, ZV_UPLOAD_STATUS_PAUSED, historyid, file.c_str(), "Clip",
                            url_.c_str()));
        zv_upload_list_load_full_item(&ad_); // takes only the rows that are not jobs yet
        UploadItem *j = job(historyid);
        ad_.resume_upload(&ad_, j);
        drain();
        answer(j, ZV_RESP_TYPE_UPLOAD_QUERY, ZV_ERROR_NONE, "99");
        drain();
        return j;
    }

    // A local port, open for the whole run, that takes connections and never answers: a
    // request sent there stays in flight, and the test answers it in the worker's place, in
    // the order it chooses.
    static inline int port_ = 0, silent_ = zv_test::listen_loopback(&port_, 64);
    static inline const std::string url_ =
        "http://127.0.0.1:" + std::to_string(port_) + "/upload/1";
};

// The full load (the later loads add READY rows through the same path: the end-to-end tests
// launch again, and a row loaded twice is one job below).
TEST_F(UploadCtrlTest, LoadsPutNewestFirstAndTakeReadyRowsAsWaiting)
{
    EXPECT_EQ(job(1), nullptr);
    EXPECT_TRUE(g_test_log.logged("list is NULL"));
    ASSERT_TRUE(add_row(1, ZV_UPLOAD_STATUS_READY, 1.0, "/v/one.mp4", "One"));
    ASSERT_TRUE(
        add_row(3, ZV_UPLOAD_STATUS_COMPLETED, 3.0, "/v/three.mp4", "Three", "http://up/3", 100));
    ASSERT_TRUE(add_row(2, ZV_UPLOAD_STATUS_PAUSED, 2.0, "/v/two.mp4", "Two", "http://up/2", 40));
    // The full load, before the media database is connected: the rows load without thumbnails.
    zv_upload_list_load_full_item(&ad_);
    start_controller();
    std::vector<int> ids;
    for (GList *l = ad_.job_list; l; l = l->next)
        ids.push_back(static_cast<UploadItem *>(l->data)->historyid);
    EXPECT_EQ(ids, (std::vector<int>{3, 2, 1}));
    EXPECT_TRUE(jobs_are({1}, ZV_UPLOAD_STATUS_WAITING, 0) &&
                jobs_are({2}, ZV_UPLOAD_STATUS_PAUSED, 0) &&
                jobs_are({3}, ZV_UPLOAD_STATUS_COMPLETED, 0));
    EXPECT_STREQ(job(2)->userid, "user@example.com");
    EXPECT_EQ(job(2)->percent, 40);
    EXPECT_EQ(job(2)->handle, nullptr);
}

TEST_F(UploadCtrlTest, NotificationsFollowTheCounters)
{
    const struct {
        int completed, total, status, percent; // status 0: no job is given
        const char *ongoing_count;             // null: no ongoing notification
        double progress;
        const char *complete_title; // null: no completion notification
    } cases[] = {
        {1, 3, 0, 0, "[1/3]", 1.0 / 3, nullptr},                    // one of three done
        {0, 1, ZV_UPLOAD_STATUS_UPLOADING, 40, "", 0.4, nullptr},   // one job: its percent
        {0, 0, 0, 0, nullptr, 0, nullptr},                          // nothing to upload
        {1, 1, ZV_UPLOAD_STATUS_PAUSED, 20, nullptr, 0, "1 files"}, // failed beside completed
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(&c - cases);
        UploadItem sunset = {};
        sunset.title = const_cast<char *>("Sunset");
        sunset.status = c.status;
        sunset.percent = c.percent;
        ad_.completed_count = c.completed;
        ad_.total_count = c.total;
        zv_upload_ctrl_post_notification(&ad_, c.status ? &sunset : nullptr);

        auto ongoing = notification("zuvo_ongoing_noti");
        ASSERT_EQ(ongoing.empty(), !c.ongoing_count);
        if (c.ongoing_count) {
            EXPECT_EQ(ongoing["event_count"], c.ongoing_count);
            EXPECT_NEAR(g_ascii_strtod(ongoing["progress"].c_str(), nullptr), c.progress, 1e-6);
        }
        EXPECT_EQ(notification("zuvo_complete_noti")["title"],
                  c.complete_title ? c.complete_title : "");
        EXPECT_EQ(ad_.completed_count, c.complete_title ? 0 : c.completed);
    }
}

// Rows whose file cannot be sent, rows that cannot be sent at all, answers that name no byte
// of the file, and requests that fail at once.
TEST_F(UploadCtrlTest, RowsThatCannotBeSentEndPausedAndSayWhy)
{
    ASSERT_EQ(unlink(dir_.file("keys/zuvo.tizen.api.key").c_str()), 0); // no key, no key folder
    ASSERT_EQ(rmdir(dir_.file("keys").c_str()), 0);
    std::string empty = video("empty.mp4", 0), good = video("good.mp4", 100);
    std::string huge = dir_.file("huge.mp4"), missing = dir_.file("missing.mp4");
    ASSERT_TRUE(zv_test::write_file(huge, ""));
    ASSERT_EQ(truncate(huge.c_str(), 5000000000LL), 0); // sparse: takes no room
    const char *files[] = {missing.c_str(), empty.c_str(),       huge.c_str(), nullptr,
                           good.c_str(),    dir_.path().c_str(), good.c_str()};
    for (int id = 1; id <= 7; id++)
        ASSERT_TRUE(
            add_row(id, ZV_UPLOAD_STATUS_READY, id, files[id - 1], id == 5 ? nullptr : "C"));
    ASSERT_TRUE(add_row(8, ZV_UPLOAD_STATUS_PAUSED, 8, good.c_str(), "Never sent"));
    ASSERT_TRUE(add_row(9, ZV_UPLOAD_STATUS_PAUSED, 9, missing.c_str(), "Gone", url_.c_str()));
    start_controller();
    launch();
    ASSERT_TRUE(jobs_are({1, 2, 3, 4, 5, 6, 7}, ZV_UPLOAD_STATUS_PAUSED));
    // A row without a title or file name fails at its setter, with the setter's message; a
    // file that cannot be sent is named with the reason. The good rows, the one past 4 GiB
    // among them, go on to their metadata upload, which fails for want of an API key.
    for (const std::string &why :
         {"file of 1 is missing: " + missing, "file of 2 is empty, nothing to upload: " + empty,
          std::string("zv_set_attr_file_path fail: -988"),
          std::string("zv_set_attr_title fail: -993"),
          std::string("file of 6 is not a regular file")})
        EXPECT_TRUE(g_test_log.logged(why)) << why;
    std::string log = g_test_log.since_mark(), sent = "zv_request_meta_upload fail: -982";
    size_t first = log.find(sent), second = log.find(sent, first + 1);
    EXPECT_NE(second, std::string::npos) << "the rows past 4 GiB and the good one send";
    EXPECT_EQ(log.find(sent, second + 1), std::string::npos) << "no other row sends";

    // Upload again on a row that never got its address, or whose file is gone, stays paused
    // (the file is looked at anew).
    g_test_log.mark();
    ad_.resume_upload(&ad_, job(9));
    EXPECT_TRUE(g_test_log.logged("file of 9 is missing: " + missing));
    ad_.resume_upload(&ad_, job(8));
    ASSERT_TRUE(wait_for([] { return g_test_log.logged("It need to update notification"); }));
    EXPECT_TRUE(g_test_log.logged("zv_set_attr_upload_url fail: -983"));
    EXPECT_TRUE(jobs_are({8, 9}, ZV_UPLOAD_STATUS_PAUSED, 0));

    // A status answer that names no byte of the file (last byte index 99: past it, signed,
    // not a number, past 64 bits) pauses the job without a data upload.
    ASSERT_TRUE(add_row(11, ZV_UPLOAD_STATUS_PAUSED, 11, good.c_str(), "Clip", url_.c_str()));
    zv_upload_list_load_full_item(&ad_); // takes only the rows that are not jobs yet
    for (std::string range : {"100", "-1", "12abc", "99999999999999999999"}) {
        ad_.resume_upload(&ad_, job(11));
        answer(job(11), ZV_RESP_TYPE_UPLOAD_QUERY, ZV_ERROR_NONE, range.c_str());
        ASSERT_TRUE(jobs_are({11}, ZV_UPLOAD_STATUS_PAUSED)) << range;
        EXPECT_TRUE(g_test_log.logged("Range of 11 names no byte of its file (100 bytes): \"" +
                                      range + "\""));
        EXPECT_EQ(job(11)->handle->resp_type, ZV_RESP_TYPE_UPLOAD_QUERY) << "no data upload";
    }

    // Upload again against a closed port: each status query is refused at once, however
    // soon after it was queued, and its job ends PAUSED with nothing in flight.
    std::vector<int> ids = {21, 22, 23, 24, 25, 26, 27, 28};
    for (int id : ids)
        ASSERT_TRUE(add_row(id, ZV_UPLOAD_STATUS_PAUSED, id, good.c_str(), "Clip",
                            "http://127.0.0.1:9/upload/1"));
    zv_upload_list_load_full_item(&ad_);
    for (int id : ids)
        ad_.resume_upload(&ad_, job(id));
    ASSERT_TRUE(jobs_are(ids, ZV_UPLOAD_STATUS_PAUSED));

    // With the engine stopped, every request is refused when it is made.
    ASSERT_EQ(run_program({bin_path("zv-keystore"), "set", "zuvo.tizen.api.key"}, "dev-key"), 0);
    zv_finalize_service();
    ASSERT_TRUE(add_row(30, ZV_UPLOAD_STATUS_READY, 30, good.c_str()));
    g_test_log.mark();
    launch();
    ASSERT_TRUE(rows_are({30}, ZV_UPLOAD_STATUS_PAUSED));
    EXPECT_TRUE(g_test_log.logged("zv_request_meta_upload fail: -998"));
    ad_.resume_upload(&ad_, job(21));
    EXPECT_TRUE(g_test_log.logged("zv_request_upload_query fail: -998"));
    EXPECT_EQ(job(21)->status, ZV_UPLOAD_STATUS_PAUSED);
}

TEST_F(UploadCtrlTest, PauseBeforeTheUploadMessageHoldsAndUploadsAndCompletionsAreTakenOnce)
{
    std::string file = video("a.mp4", 1000);
    ASSERT_TRUE(add_row(1, ZV_UPLOAD_STATUS_READY, 1, file.c_str()));
    ASSERT_TRUE(add_row(2, ZV_UPLOAD_STATUS_READY, 2, file.c_str()));
    start_controller();
    launch();
    drain();
    // A metadata answer without an upload address pauses its job and says so.
    answer(job(2), ZV_RESP_TYPE_META_UPLOAD, ZV_ERROR_NONE, nullptr);
    drain();
    EXPECT_TRUE(jobs_are({2}, ZV_UPLOAD_STATUS_PAUSED, 0));
    EXPECT_TRUE(g_test_log.logged("META UPLOAD FAIL : Clip"));
    UploadItem *a = job(1);
    ASSERT_EQ(a->status, ZV_UPLOAD_STATUS_WAITING);
    ServiceRequest *meta = a->handle;
    ASSERT_NE(meta, nullptr);
    // The finders skip an empty entry of the list; an unknown id or a null handle finds no
    // job.
    ad_.job_list = g_list_prepend(ad_.job_list, nullptr);
    EXPECT_EQ(_zv_upload_ctrl_find_item(&ad_, meta), a);
    EXPECT_TRUE(g_test_log.logged("Skip NULL item : 0"));
    EXPECT_EQ(job(7), nullptr);
    EXPECT_EQ(_zv_upload_ctrl_find_item(&ad_, nullptr), nullptr);
    ad_.job_list = g_list_delete_link(ad_.job_list, ad_.job_list);
    // A network event while the metadata upload is out leaves the job waiting.
    _zv_upload_ctrl_net_status_cb(2, &ad_);
    drain();
    EXPECT_TRUE(jobs_are({1}, ZV_UPLOAD_STATUS_WAITING, 0));
    EXPECT_EQ(a->handle, meta);

    // The metadata answer, then a network event before the upload message is read.
    answer(a, ZV_RESP_TYPE_META_UPLOAD, ZV_ERROR_NONE, url_.c_str());
    _zv_upload_ctrl_net_status_cb(2, &ad_);
    drain();
    EXPECT_TRUE(jobs_are({1}, ZV_UPLOAD_STATUS_PAUSED, 0));
    EXPECT_EQ(a->handle, meta) << "no data upload was started";
    EXPECT_EQ(stored_rows()[1].url, url_) << "the address is kept";

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

    // The first progress report (change pipe) and the completion (complete pipe) of a one-job
    // batch, read in both orders: this job's, then another's. Pause and upload again leave
    // the job alone once it completed, even before its completion is read.
    for (int complete_first : {0, 1}) {
        SCOPED_TRACE(complete_first ? "complete pipe first" : "change pipe first");
        int id = complete_first ? 11 : 1;
        unlink(dir_.file("run/notifications/zuvo_complete_noti.ini").c_str());
        UploadItem *j = complete_first ? resumed(id) : a;
        _zv_upload_ctrl_progress_cb(j->handle, 100, &ad_);
        answer(j, ZV_RESP_TYPE_DATA_UPLOAD, ZV_ERROR_NONE);
        _zv_upload_ctrl_progress_cb(j->handle, 50, &ad_); // a late report moves nothing
        ad_.pause_upload(&ad_, j);
        deliver(complete_first ? _zv_upload_ctrl_pipe_complete_cb : _zv_upload_ctrl_pipe_change_cb,
                id);
        deliver(complete_first ? _zv_upload_ctrl_pipe_change_cb : _zv_upload_ctrl_pipe_complete_cb,
                id);
        drain(); // the pipes' own copies of both messages

        EXPECT_EQ(notification("zuvo_complete_noti")["title"], "Clip");
        EXPECT_TRUE(notification("zuvo_ongoing_noti").empty());
        EXPECT_EQ(ad_.completed_count, 0);
        EXPECT_EQ(j->percent, 100);
        ServiceRequest *handle = j->handle;
        ad_.pause_upload(&ad_, j);
        ad_.resume_upload(&ad_, j);
        EXPECT_EQ(j->handle, handle);
        EXPECT_TRUE(jobs_are({id}, ZV_UPLOAD_STATUS_COMPLETED, 0));
    }
}

TEST_F(UploadCtrlTest, StoresThatFailAreMadeAgainAndARowIsOneJob)
{
    ASSERT_TRUE(set_network(false));
    ASSERT_TRUE(add_row(1, ZV_UPLOAD_STATUS_READY, 1, video("a.mp4", 100).c_str()));
    // Another process holds the history past the store's patience: the row taken as a job
    // stays READY, and the launch requests that read it again leave it one job.
    sqlite3 *other = nullptr;
    ASSERT_EQ(sqlite3_open(getenv("ZV_HISTORY_DB"), &other), SQLITE_OK);
    ASSERT_EQ(sqlite3_exec(other, "BEGIN EXCLUSIVE", nullptr, nullptr, nullptr), SQLITE_OK);
    zv_upload_ctrl_initialize(&ad_); // without a window: the launches build no list
    started_ = true;
    launch();
    EXPECT_EQ(g_list_length(ad_.job_list), 1u) << "the READY row was loaded once";
    EXPECT_TRUE(g_test_log.logged("row 1 is already a job"));
    EXPECT_TRUE(g_test_log.logged("NETWORK_OFF"));
    EXPECT_EQ(job(1)->handle, nullptr) << "nothing is sent without a network";
    sqlite3_exec(other, "COMMIT", nullptr, nullptr, nullptr);
    EXPECT_TRUE(rows_are({1}, ZV_UPLOAD_STATUS_WAITING));

    // A completion stored while the history is held, and stored again by the timer while it
    // is still held, reaches the row once it is free.
    ASSERT_TRUE(set_network(true));
    UploadItem *j = resumed(2);
    answer(j, ZV_RESP_TYPE_DATA_UPLOAD, ZV_ERROR_NONE);
    ASSERT_EQ(sqlite3_exec(other, "BEGIN EXCLUSIVE", nullptr, nullptr, nullptr), SQLITE_OK);
    drain();
    EXPECT_EQ(j->status, ZV_UPLOAD_STATUS_COMPLETED);
    g_test_log.mark();
    ASSERT_TRUE(wait_for([] { return g_test_log.logged("busy handler will be returned"); }));
    sqlite3_exec(other, "COMMIT", nullptr, nullptr, nullptr);
    sqlite3_close(other);
    EXPECT_TRUE(rows_are({2}, ZV_UPLOAD_STATUS_COMPLETED));
}

} // namespace
