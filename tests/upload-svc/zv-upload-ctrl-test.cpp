// Tests of the controller that need no server: finders, counters, notifications, the rows it
// refuses to send, and the operations that must change nothing. The controller runs
// in-process on a real history file with the network keys in a temporary folder; the upload
// host points at a closed local port, so nothing leaves the machine.
#include "zv-upload-ctrl.h"

#include <arpa/inet.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>

#include "app_i18n.h"
#include "zv-ext-network.h"
#include "zv-upload-list.h"
#include "zv-upload-test-util.h"

namespace
{

using zv_upload_test::add_row;
using zv_upload_test::notification;
using zv_upload_test::set_key;
using zv_upload_test::stored_rows;

zv_upload_test::LogFile g_log;

class UploadCtrlTest : public ::testing::Test
{
  protected:
    void SetUp() override
    {
        setenv("ZV_UPLOAD_HOST", "127.0.0.1:9", 1);
        set_network(2);
        ASSERT_TRUE(set_key(run_dir(), "memory/dnet/network_config", "1"));
        ASSERT_TRUE(set_key(run_dir(), "memory/dnet/ip", "127.0.0.1"));
        ASSERT_TRUE(set_key(run_dir(), "memory/dnet/proxy", ""));
        ASSERT_TRUE(zv_ext_db_open());
        ad_.access_token = g_strdup("token");
        ad_.category = g_strdup("People");
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
    void set_network(int status)
    {
        ASSERT_TRUE(set_key(run_dir(), "memory/dnet/status", std::to_string(status)));
    }
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
    std::string video(const std::string &name, size_t bytes)
    {
        std::string path = dir_.file(name);
        EXPECT_TRUE(zv_test::write_file(path, std::string(bytes, 'v')));
        return path;
    }

    zv_test::TempDir dir_;
    AppData ad_ = {};
    bool started_ = false;
};

TEST_F(UploadCtrlTest, FindersTakeTheFirstMatchAndSkipNullEntries)
{
    UploadItem first = {}, second = {}, other = {};
    first.historyid = 5;
    second.historyid = 5;
    other.historyid = 6;
    ServiceRequest *request = zv_request_new();
    second.handle = request;
    GList *list = nullptr;
    list = g_list_append(list, nullptr);
    list = g_list_append(list, &first);
    list = g_list_append(list, &second);
    list = g_list_append(list, &other);
    ad_.job_list = list;

    EXPECT_EQ(_zv_upload_ctrl_find_item_by_id(&ad_, 5), &first);
    EXPECT_EQ(_zv_upload_ctrl_find_item_by_id(&ad_, 6), &other);
    EXPECT_EQ(_zv_upload_ctrl_find_item_by_id(&ad_, 7), nullptr);
    EXPECT_EQ(_zv_upload_ctrl_find_item(&ad_, request), &second);
    EXPECT_EQ(_zv_upload_ctrl_find_item(&ad_, nullptr), nullptr);
    EXPECT_TRUE(g_log.logged("Skip NULL item : 0"));

    ad_.job_list = nullptr;
    EXPECT_EQ(_zv_upload_ctrl_find_item_by_id(&ad_, 5), nullptr);
    EXPECT_TRUE(g_log.logged("list is NULL"));
    g_list_free(list);
    zv_request_free(request);
}

TEST_F(UploadCtrlTest, InitValueRecountsTheBatch)
{
    ASSERT_TRUE(add_row(1, ZV_UPLOAD_STATUS_WAITING, 1, "/v/1"));
    ASSERT_TRUE(add_row(2, ZV_UPLOAD_STATUS_UPLOADING, 2, "/v/2"));
    ASSERT_TRUE(add_row(3, ZV_UPLOAD_STATUS_PAUSED, 3, "/v/3"));
    ASSERT_TRUE(add_row(4, ZV_UPLOAD_STATUS_COMPLETED, 4, "/v/4"));
    ad_.is_paused = true;

    ad_.completed_count = -3;
    zv_upload_ctrl_init_value(&ad_);
    EXPECT_FALSE(ad_.is_paused);
    EXPECT_EQ(ad_.completed_count, 0);
    EXPECT_EQ(ad_.total_count, 2);

    ad_.completed_count = 4;
    zv_upload_ctrl_init_value(&ad_);
    EXPECT_EQ(ad_.total_count, 6);
}

TEST_F(UploadCtrlTest, NotificationsFollowTheCounters)
{
    i18n_bind_text_domain();
    struct Case {
        const char *what;
        int completed, total;
        bool with_job;
        int status, percent;
        const char *ongoing_count; // null: no ongoing notification
        double progress;
        const char *complete_title_part; // null: no completion notification
        const char *complete_title_not;
        int completed_after;
    };
    const Case cases[] = {
        {"one of three done", 1, 3, false, 0, 0, "[1/3]", 1.0 / 3, nullptr, nullptr, 1},
        {"single job follows its percent", 0, 1, true, ZV_UPLOAD_STATUS_UPLOADING, 40, "", 0.4,
         nullptr, nullptr, 0},
        {"three of three", 3, 3, true, ZV_UPLOAD_STATUS_COMPLETED, 100, nullptr, 0, "3", nullptr,
         0},
        {"single job done names it", 1, 1, true, ZV_UPLOAD_STATUS_COMPLETED, 100, nullptr, 0,
         "Sunset", nullptr, 0},
        {"failed job beside one completed", 1, 1, true, ZV_UPLOAD_STATUS_PAUSED, 20, nullptr, 0,
         "1", "Sunset", 0},
        {"nothing to upload", 0, 0, false, 0, 0, nullptr, 0, nullptr, nullptr, 0},
    };
    const std::string complete_file = run_dir() + "/notifications/zuvo_complete_noti.ini";
    for (const Case &c : cases) {
        SCOPED_TRACE(c.what);
        unlink(complete_file.c_str());
        UploadItem job_item = {};
        job_item.title = const_cast<char *>("Sunset");
        job_item.status = c.status;
        job_item.percent = c.percent;
        ad_.completed_count = c.completed;
        ad_.total_count = c.total;

        zv_upload_ctrl_post_notification(&ad_, c.with_job ? &job_item : nullptr);

        auto ongoing = notification(run_dir(), "zuvo_ongoing_noti");
        auto complete = notification(run_dir(), "zuvo_complete_noti");
        if (c.ongoing_count) {
            ASSERT_FALSE(ongoing.empty());
            EXPECT_EQ(ongoing["event_count"], c.ongoing_count);
            EXPECT_NEAR(g_ascii_strtod(ongoing["progress"].c_str(), nullptr), c.progress, 1e-6);
        } else {
            EXPECT_TRUE(ongoing.empty());
        }
        if (c.complete_title_part) {
            ASSERT_FALSE(complete.empty());
            EXPECT_NE(complete["title"].find(c.complete_title_part), std::string::npos)
                << complete["title"];
            if (c.complete_title_not) {
                EXPECT_EQ(complete["title"].find(c.complete_title_not), std::string::npos);
            }
        } else {
            EXPECT_TRUE(complete.empty());
        }
        EXPECT_EQ(ad_.completed_count, c.completed_after);
    }
}

TEST_F(UploadCtrlTest, RowsThatCannotBeSentEndPausedAndSayWhy)
{
    std::string empty = video("empty.mp4", 0);
    std::string huge = dir_.file("huge.mp4");
    int fd = open(huge.c_str(), O_CREAT | O_WRONLY, 0600);
    ASSERT_GE(fd, 0);
    ASSERT_EQ(ftruncate(fd, 5000000000LL), 0); // sparse: takes no room
    close(fd);
    std::string good = video("good.mp4", 100);
    std::string missing = dir_.file("missing.mp4");

    ASSERT_TRUE(add_row(1, ZV_UPLOAD_STATUS_READY, 1, missing.c_str()));
    ASSERT_TRUE(add_row(2, ZV_UPLOAD_STATUS_READY, 2, empty.c_str()));
    ASSERT_TRUE(add_row(3, ZV_UPLOAD_STATUS_READY, 3, huge.c_str()));
    ASSERT_TRUE(add_row(4, ZV_UPLOAD_STATUS_READY, 4, nullptr));
    ASSERT_TRUE(add_row(5, ZV_UPLOAD_STATUS_READY, 5, good.c_str(), nullptr));
    ASSERT_TRUE(add_row(6, ZV_UPLOAD_STATUS_READY, 6, dir_.path().c_str()));
    // The good rows, the one past 4 GiB among them, go on to their metadata upload, which
    // fails for want of an API key.
    ASSERT_TRUE(add_row(7, ZV_UPLOAD_STATUS_READY, 7, good.c_str()));
    start();
    launch();

    ASSERT_TRUE(zv_upload_test::run_until([&] {
        auto rows = stored_rows();
        for (int id = 1; id <= 7; id++)
            if (rows[id].status != ZV_UPLOAD_STATUS_PAUSED)
                return false;
        return true;
    }));
    EXPECT_TRUE(g_log.logged("file of 1 is missing: " + missing));
    EXPECT_TRUE(g_log.logged("file of 2 is empty: " + empty));
    EXPECT_TRUE(g_log.logged("file name of 4 is NULL"));
    EXPECT_TRUE(g_log.logged("title of 5 is NULL"));
    EXPECT_TRUE(g_log.logged("file of 6 is not a regular file"));
    EXPECT_TRUE(g_log.logged("zv_request_meta_upload fail: -982"));
    for (int id : {1, 2, 4, 5, 6})
        EXPECT_EQ(job(id)->handle, nullptr) << "no request was made for " << id;
    EXPECT_NE(job(3)->handle, nullptr);
    EXPECT_NE(job(7)->handle, nullptr);
}

TEST_F(UploadCtrlTest, StatusAnswerNamingNoByteOfTheFilePausesWithoutDataUpload)
{
    // A server that takes the status queries and never answers: only the answers below arrive.
    int silent = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
    sockaddr_in addr{};
    addr.sin_family = AF_INET;
    addr.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    socklen_t len = sizeof addr;
    ASSERT_EQ(bind(silent, reinterpret_cast<sockaddr *>(&addr), len), 0);
    ASSERT_EQ(listen(silent, 8), 0);
    ASSERT_EQ(getsockname(silent, reinterpret_cast<sockaddr *>(&addr), &len), 0);
    std::string url = "http://127.0.0.1:" + std::to_string(ntohs(addr.sin_port)) + "/up";
    std::string clip = video("clip.mp4", 100); // last byte index 99
    const char *ranges[] = {"100", "5000000000", "-1", "12abc", "99999999999999999999"};
    for (int id = 1; id <= 5; id++)
        ASSERT_TRUE(add_row(id, ZV_UPLOAD_STATUS_PAUSED, id, clip.c_str(), "Clip", url.c_str()));
    start();
    for (int id = 1; id <= 5; id++) {
        ad_.resume_upload(&ad_, job(id));
        ServiceResponse resp = {job(id)->handle, 308, ZV_RESP_TYPE_UPLOAD_QUERY,
                                const_cast<char *>(ranges[id - 1])};
        _zv_upload_ctrl_resp_cb(ZV_ERROR_NONE, &resp, &ad_);
    }
    ASSERT_TRUE(zv_upload_test::run_until([&] {
        for (int id = 1; id <= 5; id++)
            if (job(id)->status != ZV_UPLOAD_STATUS_PAUSED)
                return false;
        return true;
    }));
    for (int id = 1; id <= 5; id++) {
        EXPECT_TRUE(g_log.logged("Range of " + std::to_string(id) + " names no byte of its file " +
                                 "(100 bytes): \"" + ranges[id - 1] + "\""));
        EXPECT_EQ(stored_rows()[id].status, ZV_UPLOAD_STATUS_PAUSED);
        EXPECT_EQ(job(id)->handle->resp_type, ZV_RESP_TYPE_UPLOAD_QUERY) << "no data upload";
    }
    close(silent);
}

TEST_F(UploadCtrlTest, CompletedJobsIgnorePauseAndResume)
{
    ASSERT_TRUE(add_row(1, ZV_UPLOAD_STATUS_COMPLETED, 1, "/v/1", "Done", "http://up/1", 100));
    start();
    UploadItem *done = job(1);
    ad_.pause_upload(&ad_, done);
    ad_.resume_upload(&ad_, done);
    EXPECT_TRUE(g_log.logged("Skip for complete item"));
    EXPECT_EQ(done->status, ZV_UPLOAD_STATUS_COMPLETED);
    EXPECT_EQ(done->handle, nullptr);
    EXPECT_EQ(stored_rows()[1].status, ZV_UPLOAD_STATUS_COMPLETED);
}

TEST_F(UploadCtrlTest, UploadAgainWithoutAddressStaysPaused)
{
    ASSERT_TRUE(add_row(1, ZV_UPLOAD_STATUS_PAUSED, 1, "/v/1", "Never sent", nullptr, 0));
    start();
    UploadItem *paused = job(1);
    ad_.resume_upload(&ad_, paused);
    ASSERT_TRUE(
        zv_upload_test::run_until([] { return g_log.logged("It need to update notification"); }));
    EXPECT_TRUE(g_log.logged("zv_set_attr_upload_url fail: -983"));
    EXPECT_EQ(paused->status, ZV_UPLOAD_STATUS_PAUSED);
    EXPECT_EQ(stored_rows()[1].status, ZV_UPLOAD_STATUS_PAUSED);
}

TEST_F(UploadCtrlTest, DeleteRemovesTheJobAndOnRequestItsRow)
{
    ASSERT_TRUE(add_row(1, ZV_UPLOAD_STATUS_PAUSED, 1, "/v/1"));
    ASSERT_TRUE(add_row(2, ZV_UPLOAD_STATUS_PAUSED, 2, "/v/2"));
    start();
    UploadItem *one = job(1);
    UploadItem *two = job(2);
    ad_.job_list = g_list_remove(ad_.job_list, one);
    ad_.job_list = g_list_remove(ad_.job_list, two);
    ad_.delete_item(one, true);
    ad_.delete_item(two, false);
    auto rows = stored_rows();
    EXPECT_EQ(rows.count(1), 0u);
    EXPECT_EQ(rows.count(2), 1u);
}

} // namespace
