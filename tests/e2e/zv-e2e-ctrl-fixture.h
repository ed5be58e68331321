// The fixture of the end-to-end tests that run the controller in this process.
#pragma once

#include <Elementary.h>
#include <app.h>
#include <gtest/gtest.h>

#include <map>
#include <string>
#include <vector>

#include "../upload-svc/zv-upload-test-util.h"
#include "zv-e2e-util.h"
#include "zv-ext-network.h"
#include "zv-upload-ctrl.h"

namespace zv_e2e
{

constexpr int kLongWaitMs = 60000;

using zv_upload_test::run_until;
using zv_upload_test::stored_rows;

// The log of this process, in one file with marks.
inline zv_test::LogFile g_log;

// The controller in this process with a real window, list view, service client and worker
// thread, against the development server, with the history file of a temporary folder.
class ControllerFixture : public ::testing::Test
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
        // The application's theme extension holds the layouts of the list and edit pages.
        char *res = app_get_resource_path();
        std::string edj = std::string(res ? res : "") + "edje/zuvo-upload-custom-winset.edj";
        free(res);
        elm_theme_extension_add(nullptr, edj.c_str());
        ad_.win = elm_win_add(nullptr, "zv-e2e", ELM_WIN_BASIC);
        ad_.navi = elm_naviframe_add(ad_.win);
        evas_object_size_hint_weight_set(ad_.navi, EVAS_HINT_EXPAND, EVAS_HINT_EXPAND);
        elm_win_resize_object_add(ad_.win, ad_.navi);
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

} // namespace zv_e2e
