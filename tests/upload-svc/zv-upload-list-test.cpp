// Tests of the job loaders and the shutdown write-back on a real history file.
#include "zv-upload-list.h"

#include <gtest/gtest.h>

#include <vector>

#include "zv-upload-ctrl.h"
#include "zv-upload-main.h"
#include "zv-upload-test-util.h"

namespace
{

using namespace zv_upload_test;

class UploadListTest : public ::testing::Test
{
  protected:
    void SetUp() override { ASSERT_TRUE(zv_ext_db_open()); }
    void TearDown() override
    {
        for (GList *l = ad_.job_list; l; l = l->next)
            _zv_upload_ctrl_delete_item(static_cast<UploadItem *>(l->data), false);
        g_list_free(ad_.job_list);
        zv_ext_db_close();
    }

    UploadItem *job(int index)
    {
        return static_cast<UploadItem *>(g_list_nth_data(ad_.job_list, index));
    }
    std::vector<int> job_ids()
    {
        std::vector<int> ids;
        for (int i = 0; job(i); i++)
            ids.push_back(job(i)->historyid);
        return ids;
    }

    zv_test::TempDir dir_;
    AppData ad_ = {};
};

TEST_F(UploadListTest, LoadsPutNewestFirstAndTakeReadyRowsAsWaiting)
{
    ASSERT_TRUE(add_row(1, ZV_UPLOAD_STATUS_READY, 1.0, "/v/one.mp4", "One"));
    ASSERT_TRUE(
        add_row(3, ZV_UPLOAD_STATUS_COMPLETED, 3.0, "/v/three.mp4", "Three", "http://up/3", 100));
    ASSERT_TRUE(add_row(2, ZV_UPLOAD_STATUS_PAUSED, 2.0, "/v/two.mp4", "Two", "http://up/2", 40));
    zv_upload_list_load_full_item(&ad_);
    EXPECT_EQ(job_ids(), (std::vector<int>{3, 2, 1}));
    auto rows = stored_rows();
    EXPECT_EQ(rows[1].status, ZV_UPLOAD_STATUS_WAITING);
    EXPECT_EQ(rows[2].status, ZV_UPLOAD_STATUS_PAUSED);
    EXPECT_EQ(rows[3].status, ZV_UPLOAD_STATUS_COMPLETED);
    const UploadItem *paused = job(1);
    EXPECT_STREQ(paused->title, "Two");
    EXPECT_STREQ(paused->filename, "/v/two.mp4");
    EXPECT_STREQ(paused->url, "http://up/2");
    EXPECT_STREQ(paused->userid, "user@example.com");
    EXPECT_EQ(paused->percent, 40);
    EXPECT_EQ(paused->status, ZV_UPLOAD_STATUS_PAUSED);
    EXPECT_EQ(paused->offset, 0);
    EXPECT_EQ(paused->handle, nullptr);
    EXPECT_EQ(job(2)->status, ZV_UPLOAD_STATUS_WAITING);
    EXPECT_EQ(job(2)->url, nullptr);

    // The first ready load finds nothing new; a later one adds only the READY rows since.
    zv_upload_list_load_ready_item(&ad_);
    EXPECT_EQ(job_ids(), (std::vector<int>{3, 2, 1}));
    ASSERT_TRUE(add_row(5, ZV_UPLOAD_STATUS_UPLOADING, 5.0, "/v/five.mp4"));
    ASSERT_TRUE(add_row(4, ZV_UPLOAD_STATUS_READY, 4.0, "/v/four.mp4"));
    ASSERT_TRUE(add_row(6, ZV_UPLOAD_STATUS_READY, 6.0, "/v/six.mp4"));
    zv_upload_list_load_ready_item(&ad_);
    EXPECT_EQ(job_ids(), (std::vector<int>{6, 4, 3, 2, 1}));
    EXPECT_EQ(stored_rows()[4].status, ZV_UPLOAD_STATUS_WAITING);
    EXPECT_EQ(stored_rows()[5].status, ZV_UPLOAD_STATUS_UPLOADING);
}

TEST_F(UploadListTest, ResetWritesUnfinishedRowsBack)
{
    const std::pair<int, int> cases[] = {
        // status before, after
        {ZV_UPLOAD_STATUS_READY, ZV_UPLOAD_STATUS_READY},
        {ZV_UPLOAD_STATUS_WAITING, ZV_UPLOAD_STATUS_READY},
        {ZV_UPLOAD_STATUS_PAUSED, ZV_UPLOAD_STATUS_PAUSED},
        {ZV_UPLOAD_STATUS_UPLOADING, ZV_UPLOAD_STATUS_PAUSED},
        {ZV_UPLOAD_STATUS_COMPLETED, ZV_UPLOAD_STATUS_COMPLETED},
    };
    for (auto [before, after] : cases)
        ASSERT_TRUE(add_row(10 + before, before, before, "/v/x.mp4", "X", "http://up/x", 30));
    zv_upload_list_reset_full_item(&ad_);
    auto rows = stored_rows();
    for (auto [before, after] : cases) {
        EXPECT_EQ(rows[10 + before].status, after) << "status before: " << before;
        EXPECT_EQ(rows[10 + before].percent, 30);
        EXPECT_EQ(rows[10 + before].url, "http://up/x");
    }
}

} // namespace
