// End-to-end tests of the controller in this process, against the development server: the
// network event written with zv-vconf, upload-again from the badge's operation, and the end
// of the process in the background. The controller runs with a real window and list view,
// the service client and its worker thread, and the history file of a temporary folder.
#include <Elementary.h>
#include <gtest/gtest.h>

#include <map>
#include <string>
#include <vector>

#include "../upload-svc/zv-upload-test-util.h"
#include "zv-e2e-util.h"
#include "zv-ext-network.h"
#include "zv-upload-ctrl.h"

namespace
{

using zv_e2e::DevServer;
using zv_e2e::LoggedRequest;
using zv_e2e::Upload;
using zv_upload_test::run_until;
using zv_upload_test::stored_rows;

constexpr int kLongWaitMs = 60000;

zv_upload_test::LogFile g_log;

class CtrlE2ETest : public ::testing::Test
{
  protected:
    void SetUp() override
    {
        ASSERT_TRUE(zv_e2e::set_network(true));
        ASSERT_TRUE(zv_e2e::set_api_key("dev-key"));
        ASSERT_TRUE(zv_ext_db_open());
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

    bool start_server(const std::vector<std::string> &faults)
    {
        std::vector<std::string> args;
        for (const auto &f : faults) {
            args.push_back("--fault");
            args.push_back(f);
        }
        if (!server_.start(dir_.path(), args))
            return false;
        for (const auto &kv : server_.env())
            setenv(kv.first.c_str(), kv.second.c_str(), 1);
        return true;
    }
    void start_controller()
    {
        ad_.win = elm_win_add(nullptr, "zv-e2e", ELM_WIN_BASIC);
        ad_.navi = elm_naviframe_add(ad_.win);
        evas_object_resize(ad_.win, 480, 800);
        evas_object_show(ad_.navi);
        evas_object_show(ad_.win);
        zv_upload_ctrl_initialize(&ad_);
        started_ = true;
    }
    // A launch request as the shell makes it.
    void launch()
    {
        zv_upload_ctrl_init_value(&ad_);
        g_free(ad_.access_token);
        g_free(ad_.category);
        ad_.access_token = g_strdup("dev-token");
        ad_.category = g_strdup("People");
        ASSERT_TRUE(zv_upload_ctrl_service(&ad_));
    }
    UploadItem *job(int historyid) { return _zv_upload_ctrl_find_item_by_id(&ad_, historyid); }
    std::string video(const std::string &name, size_t bytes, unsigned seed)
    {
        std::string path = dir_.file(name);
        contents_[path] = zv_e2e::make_video(path, bytes, seed);
        return path;
    }
    bool rows_are(const std::vector<int> &ids, int status, int timeout_ms = kLongWaitMs)
    {
        return run_until(
            [&] {
                auto rows = stored_rows();
                for (int id : ids)
                    if (rows[id].status != status)
                        return false;
                return true;
            },
            timeout_ms);
    }
    Upload upload_of(int historyid) { return server_.upload_of_url(stored_rows()[historyid].url); }
    bool mid_upload(int historyid)
    {
        Upload u = upload_of(historyid);
        return u.held > 0 && !u.complete;
    }
    void expect_identical(int historyid, const std::string &file)
    {
        Upload u = upload_of(historyid);
        ASSERT_TRUE(u.complete) << "upload of " << historyid;
        EXPECT_TRUE(zv_test::read_file(u.path) == contents_[file]) << "bytes of " << file;
    }
    // The upload went on from the server's byte count: one status query, then one data upload
    // of the rest that the server took (it answers 416 to a range that does not start at its
    // byte count).
    void expect_continued(int historyid, long long size)
    {
        std::vector<LoggedRequest> queries, resumed;
        for (const LoggedRequest &r : server_.requests_of(upload_of(historyid).id)) {
            EXPECT_NE(r.status, 416) << "a data upload sent bytes the server held";
            if (r.kind == "status")
                queries.push_back(r);
            if (r.kind == "data" && r.range_start() > 0)
                resumed.push_back(r);
        }
        ASSERT_EQ(queries.size(), 1u);
        ASSERT_EQ(resumed.size(), 1u);
        EXPECT_GT(resumed[0].seq, queries[0].seq);
        EXPECT_EQ(resumed[0].status, 201);
        EXPECT_EQ(resumed[0].range_start() + resumed[0].body_length, size);
    }

    zv_test::TempDir dir_;
    DevServer server_;
    AppData ad_ = {};
    bool started_ = false;
    std::map<std::string, std::string> contents_;
};

TEST_F(CtrlE2ETest, NetworkEventPausesRunningUploadsAndUploadAgainContinues)
{
    // The third metadata upload stalls: its job is still waiting at the network event.
    ASSERT_TRUE(start_server({"kind=data,action=throttle,rate=300000,times=0",
                              "kind=meta,action=stall,seconds=60,nth=3"}));
    std::string a = video("a.mp4", 3000000, 11);
    std::string b = video("b.mp4", 2500000, 12);
    std::vector<int> ids = zv_e2e::record({a, b}, "Running");
    ASSERT_EQ(ids.size(), 2u);
    start_controller();
    launch();
    ASSERT_TRUE(run_until([&] { return mid_upload(ids[0]) && mid_upload(ids[1]); }, kLongWaitMs));
    ASSERT_TRUE(rows_are(ids, ZV_UPLOAD_STATUS_UPLOADING));

    int waiting = zv_e2e::record({video("c.mp4", 100000, 13)}, "Waiting").at(0);
    launch();
    ASSERT_TRUE(run_until([&] { return server_.fired("stall") == 1; }, kLongWaitMs));

    ASSERT_TRUE(zv_e2e::set_int_key("memory/dnet/status", 2));
    ASSERT_TRUE(rows_are(ids, ZV_UPLOAD_STATUS_PAUSED));
    EXPECT_EQ(job(ids[0])->status, ZV_UPLOAD_STATUS_PAUSED);
    EXPECT_EQ(job(ids[1])->status, ZV_UPLOAD_STATUS_PAUSED);
    EXPECT_EQ(job(waiting)->status, ZV_UPLOAD_STATUS_WAITING);
    EXPECT_EQ(stored_rows()[waiting].status, ZV_UPLOAD_STATUS_WAITING);
    EXPECT_FALSE(g_log.logged("zv_request_upload_pause fail"));

    ASSERT_TRUE(server_.clear_faults());
    for (int id : ids)
        ad_.resume_upload(&ad_, job(id));
    ASSERT_TRUE(rows_are(ids, ZV_UPLOAD_STATUS_COMPLETED));
    expect_identical(ids[0], a);
    expect_identical(ids[1], b);
    expect_continued(ids[0], 3000000);
    expect_continued(ids[1], 2500000);
    EXPECT_EQ(stored_rows()[ids[0]].percent, 100);
}

TEST_F(CtrlE2ETest, BackgroundCompletionOfTheLastJobEndsTheProcess)
{
    ASSERT_TRUE(start_server({"kind=data,action=throttle,rate=400000,times=0"}));
    std::string a = video("a.mp4", 1200000, 21);
    std::string b = video("b.mp4", 1600000, 22);
    std::vector<int> ids = zv_e2e::record({a, b}, "Background");
    ASSERT_EQ(ids.size(), 2u);
    start_controller();
    launch();
    ASSERT_TRUE(run_until([&] { return mid_upload(ids[0]) && mid_upload(ids[1]); }, kLongWaitMs));

    ad_.exit(&ad_);
    EXPECT_TRUE(ad_.is_paused) << "uploads go on in the background";
    bool ended = false;
    run_until([] { return false; }, kLongWaitMs, &ended);
    ASSERT_TRUE(ended) << "the last completion ends the main loop";
    auto rows = stored_rows();
    EXPECT_EQ(rows[ids[0]].status, ZV_UPLOAD_STATUS_COMPLETED);
    EXPECT_EQ(rows[ids[1]].status, ZV_UPLOAD_STATUS_COMPLETED);
    EXPECT_TRUE(g_log.logged("Not exist running job"));
    expect_identical(ids[0], a);
    expect_identical(ids[1], b);
}

} // namespace
