// Fixtures of the end-to-end tests and of the controller's own: the development server, videos
// recorded with the companion client, the platform keys the service reads, what the server
// holds of each row, and the controller in this process with a real window, list view and
// worker thread.
#pragma once

#include <Elementary.h>
#include <app.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <random>
#include <sstream>
#include <string>
#include <vector>

#include "../upload-svc/zv-upload-test-util.h"
#include "zv-ext-network.h"
#include "zv-test-server.h"
#include "zv-upload-ctrl.h"

namespace zv_e2e
{

using namespace zv_test;
using namespace zv_upload_test;

constexpr int kLongWaitMs = 60000;

// The log of this process, in one file with marks.
inline zv_test::LogFile g_test_log;

// Records the files with the companion client; their history ids in order, empty on failure.
inline std::vector<int> record(const std::vector<std::string> &files, const std::string &title)
{
    std::vector<std::string> argv = {bin_path("zuvo-client"), "add"};
    // Under ThreadSanitizer the companion has suppressions of its own (its media libraries).
    if (const char *opts = getenv("ZV_COMPANION_TSAN_OPTIONS"))
        argv.insert(argv.begin(), {"/usr/bin/env", std::string("TSAN_OPTIONS=") + opts});
    argv.insert(argv.end(), files.begin(), files.end());
    argv.insert(argv.end(), {"--title", title});
    std::string out, line;
    std::vector<int> ids;
    std::istringstream in(run_program(argv, "", &out) == 0 ? out : "");
    while (std::getline(in, line))
        ids.push_back(atoi(line.c_str()));
    return ids;
}

// A working network and API key, the history of a temporary folder, and the server.
class E2ETest : public ::testing::Test
{
  protected:
    void SetUp() override
    {
        ASSERT_TRUE(set_network(true));
        ASSERT_EQ(run_program({bin_path("zv-keystore"), "set", "zuvo.tizen.api.key"}, "dev-key"),
                  0);
        ASSERT_TRUE(zv_ext_db_open());
        g_test_log.mark();
    }
    void TearDown() override { zv_ext_db_close(); }

    // Starts the server with these fault rules and points this process's hosts at it. It
    // takes only the token and the API key the tests give the service.
    bool start_server(const std::vector<std::string> &faults = {})
    {
        std::vector<std::string> args = {"--token", "dev-token", "--api-key", "dev-key"};
        for (const auto &f : faults)
            args.insert(args.end(), {"--fault", f});
        if (!server_.start(dir_.file("server"), args))
            return false;
        for (const auto &kv : server_.env())
            setenv(kv.first.c_str(), kv.second.c_str(), 1);
        return true;
    }
    // A file of random bytes.
    std::string video(const std::string &name, size_t bytes, unsigned seed = 1)
    {
        std::string path = dir_.file(name), data(bytes, '\0');
        std::mt19937 gen(seed);
        for (char &c : data)
            c = static_cast<char>(gen());
        EXPECT_TRUE(zv_test::write_file(path, data));
        return path;
    }
    // Whether every row of ids has this status within timeout_ms (0: now).
    bool rows_are(const std::vector<int> &ids, int status, int timeout_ms = kLongWaitMs)
    {
        return wait_for(
            [&] {
                auto rows = stored_rows();
                return std::all_of(ids.begin(), ids.end(),
                                   [&](int id) { return rows[id].status == status; });
            },
            timeout_ms);
    }
    // The server's upload of the row, once the row has its upload address.
    Upload upload_of(int historyid) { return server_.upload_of_url(stored_rows()[historyid].url); }
    bool mid_upload(int historyid)
    {
        Upload u = upload_of(historyid);
        return u.held > 0 && !u.complete;
    }
    // The server holds the row's upload complete, byte for byte the file.
    void expect_identical(int historyid, const std::string &file)
    {
        Upload u = upload_of(historyid);
        ASSERT_TRUE(u.complete) << "upload of " << historyid;
        EXPECT_EQ(run_program({"/usr/bin/cmp", "-s", file, u.path}), 0) << "bytes of " << file;
    }
    // The upload went on from the server's byte count: one status query, then one data upload
    // of the rest that the server took (it answers 416 to a range that does not start at its
    // byte count).
    void expect_continued(int historyid, long long size)
    {
        std::vector<Logged> queries, resumed;
        for (const Logged &r : server_.requests_of(upload_of(historyid).id)) {
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
    zv_test::DevServer server_;
};

// The controller in this process.
class ControllerFixture : public E2ETest
{
  protected:
    void TearDown() override
    {
        if (started_) {
            zv_upload_ctrl_finalize(&ad_);
            zv_ext_network_deregister();
        }
        E2ETest::TearDown();
    }
    // The controller with a window, and the token and category of a launch request.
    void start_controller()
    {
        ad_.access_token = const_cast<char *>("dev-token");
        ad_.category = const_cast<char *>("People");
        // The application's theme extension holds the layouts of the list and edit pages.
        char *res = app_get_resource_path();
        elm_theme_extension_add(
            nullptr, (std::string(res ? res : "") + "edje/zuvo-upload-custom-winset.edj").c_str());
        free(res);
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
        ASSERT_TRUE(zv_upload_ctrl_service(&ad_));
    }
    UploadItem *job(int historyid) { return _zv_upload_ctrl_find_item_by_id(&ad_, historyid); }
    // Whether every job of ids, and its row, has this status within timeout_ms (0: now).
    bool jobs_are(const std::vector<int> &ids, int status, int timeout_ms = kLongWaitMs)
    {
        return wait_for(
            [&] {
                for (int id : ids)
                    if (job(id)->status != status)
                        return false;
                return rows_are(ids, status, 0);
            },
            timeout_ms);
    }

    AppData &ad_ = process_appdata();
    bool started_ = false;
};

} // namespace zv_e2e
