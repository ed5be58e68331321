// End-to-end tests of the controller in this process, against the development server: the
// network event written with zv-vconf, upload-again from the badge's operation, the end of
// the process in the background, and all of it at random moments.
#include <random>
#include <set>

#include "zv-e2e-util.h"
#include "zv-upload-view.h"

namespace
{

using namespace zv_e2e;

class CtrlE2ETest : public ControllerFixture
{
};

TEST_F(CtrlE2ETest, NetworkEventPausesRunningUploadsAndUploadAgainContinues)
{
    // The third metadata upload stalls: its job is still waiting at the network event.
    ASSERT_TRUE(start_server({"kind=data,action=throttle,rate=100000,times=0",
                              "kind=meta,action=stall,seconds=60,nth=3"}));
    std::string a = video("a.mp4", 3000000, 11), b = video("b.mp4", 2500000, 12);
    std::vector<int> ids = record({a, b}, "Running");
    ASSERT_EQ(ids.size(), 2u);
    start_controller();
    launch();
    ASSERT_TRUE(wait_for([&] { return mid_upload(ids[0]) && mid_upload(ids[1]); }, kLongWaitMs));
    ASSERT_TRUE(rows_are(ids, ZV_UPLOAD_STATUS_UPLOADING));

    int waiting = record({video("c.mp4", 100000, 13)}, "Waiting").at(0);
    launch();
    ASSERT_TRUE(wait_for([&] { return server_.fired("stall") == 1; }, kLongWaitMs));

    ASSERT_TRUE(set_key("int", "memory/dnet/status", "2"));
    ASSERT_TRUE(rows_are(ids, ZV_UPLOAD_STATUS_PAUSED));
    EXPECT_EQ(job(ids[0])->status, ZV_UPLOAD_STATUS_PAUSED);
    EXPECT_EQ(job(ids[1])->status, ZV_UPLOAD_STATUS_PAUSED);
    EXPECT_EQ(job(waiting)->status, ZV_UPLOAD_STATUS_WAITING);
    EXPECT_EQ(stored_rows()[waiting].status, ZV_UPLOAD_STATUS_WAITING);
    EXPECT_FALSE(g_test_log.logged("zv_request_upload_pause fail"));

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
    std::string a = video("a.mp4", 1200000, 21), b = video("b.mp4", 1600000, 22);
    std::vector<int> ids = record({a, b}, "Background");
    ASSERT_EQ(ids.size(), 2u);
    start_controller();
    launch();
    ASSERT_TRUE(wait_for([&] { return mid_upload(ids[0]) && mid_upload(ids[1]); }, kLongWaitMs));

    ad_.exit(&ad_);
    EXPECT_TRUE(ad_.is_paused) << "uploads go on in the background";
    bool ended = false;
    wait_for([] { return false; }, kLongWaitMs, &ended);
    ASSERT_TRUE(ended) << "the last completion ends the main loop";
    EXPECT_TRUE(rows_in(ids, ZV_UPLOAD_STATUS_COMPLETED));
    EXPECT_TRUE(g_test_log.logged("Not exist running job"));
    expect_identical(ids[0], a);
    expect_identical(ids[1], b);
}

void on_transition(void *data, Evas_Object *, void *)
{
    *static_cast<bool *>(data) = true;
}

// The first visible widget of a type on the window's canvas.
Evas_Object *find_widget(Evas_Object *win, const char *type)
{
    for (Evas_Object *o = evas_object_bottom_get(evas_object_evas_get(win)); o;
         o = evas_object_above_get(o)) {
        const char *t = elm_object_widget_check(o) ? elm_object_widget_type_get(o) : nullptr;
        if (t && strcmp(t, type) == 0 && evas_object_visible_get(o))
            return o;
    }
    return nullptr;
}

// Thirty uploads side by side while network events, pauses and resumes from the badge,
// deletions in edit mode and a second launch request arrive at moments chosen by a seeded
// generator (ZV_STRESS_SEED replays a run). Afterwards every job that was not deleted is
// completed with the server's copy byte-identical and the deleted jobs have no row left.
TEST_F(CtrlE2ETest, StressOfThirtyJobsWithEventsAtRandomMoments)
{
    const char *seed_env = getenv("ZV_STRESS_SEED");
    const unsigned seed = seed_env ? unsigned(strtoul(seed_env, nullptr, 10)) : 20261123u;
    printf("stress seed %u (ZV_STRESS_SEED=%u replays this run)\n", seed, seed);
    std::mt19937 rng(seed);
    ASSERT_TRUE(start_server({"kind=data,action=throttle,rate=250000,times=0"}));
    std::vector<std::string> files;
    for (int i = 0; i < 30; ++i)
        files.push_back(video("v" + std::to_string(i) + ".mp4", 150000 + 7919 * i, 100 + i));
    std::vector<int> ids = record({files.begin(), files.begin() + 20}, "Stress");
    ASSERT_EQ(ids.size(), 20u);
    start_controller();
    launch();

    // The jobs in a status (every job for -1), and one of them at random.
    auto jobs_in = [&](int status) {
        std::vector<UploadItem *> found;
        for (GList *l = ad_.job_list; l; l = l->next) {
            auto *job = static_cast<UploadItem *>(l->data);
            if (job && (status < 0 || job->status == status))
                found.push_back(job);
        }
        return found;
    };
    auto pick = [&](const std::vector<UploadItem *> &from) {
        return from[std::uniform_int_distribution<size_t>(0, from.size() - 1)(rng)];
    };
    // Removes one job the way a user does: the more key's menu, its row, Done, and Stop when
    // the question comes. What went wrong, or nothing.
    std::set<int> deleted;
    auto delete_in_edit_mode = [&](UploadItem *job) -> std::string {
        int historyid = job->historyid;
        // The naviframe pops no page while it is still sliding in.
        static bool slid_in;
        slid_in = false;
        evas_object_smart_callback_del(ad_.navi, "transition,finished", on_transition);
        evas_object_smart_callback_add(ad_.navi, "transition,finished", on_transition, &slid_in);
        zv_upload_view_morekey_cb(&ad_, nullptr, nullptr);
        if (!ad_.pCtxPopup)
            return "no menu";
        elm_ctxpopup_item_selected_set(elm_ctxpopup_first_item_get(ad_.pCtxPopup), EINA_TRUE);
        if (!wait_for([&] { return ad_.pEditGenlist && job->edit_gen_item && slid_in; }, 5000))
            return "no edit list";
        // A tap reaches a row on the screen: the list is scrolled to it first.
        elm_genlist_item_show(job->edit_gen_item, ELM_GENLIST_ITEM_SCROLLTO_IN);
        if (!wait_for([&] { return job->check != nullptr; }, 5000))
            return "the row is not shown";
        elm_genlist_item_selected_set(job->edit_gen_item, EINA_TRUE);
        if (!job->checked)
            return "the row is not checked";
        Elm_Object_Item *page = elm_naviframe_top_item_get(ad_.navi);
        Evas_Object *done = elm_object_item_part_content_get(page, "title_right_btn");
        if (!done)
            done = elm_object_item_part_content_get(page, "next_btn");
        if (!done)
            return "no Done button";
        evas_object_smart_callback_call(done, "clicked", nullptr);
        if (Evas_Object *popup = find_widget(ad_.win, "Elm_Popup"))
            evas_object_smart_callback_call(elm_object_part_content_get(popup, "button2"),
                                            "clicked", nullptr);
        deleted.insert(historyid);
        if (!wait_for([&] { return ad_.pEditLayout == nullptr; }, 5000))
            return "the edit page stays";
        return "";
    };
    std::vector<int> more;
    auto launch_the_rest = [&] {
        more = record({files.begin() + 20, files.end()}, "Stress");
        ids.insert(ids.end(), more.begin(), more.end());
        launch();
    };

    std::uniform_int_distribution<int> pause_ms(20, 150), kind(0, 11);
    for (int step = 0; step < 60; ++step) {
        wait_for([] { return false; }, pause_ms(rng));
        int k = kind(rng);
        if (k <= 1) {
            ASSERT_TRUE(set_key("int", "memory/dnet/status", "2"));
        } else if (k == 10 && !jobs_in(ZV_UPLOAD_STATUS_PAUSED).empty()) {
            // A tap on the badge while the status query of upload again is out.
            UploadItem *job = pick(jobs_in(ZV_UPLOAD_STATUS_PAUSED));
            ad_.resume_upload(&ad_, job);
            ad_.pause_upload(&ad_, job);
        } else if (k == 11) {
            launch();
        } else if (k <= 4 && !jobs_in(ZV_UPLOAD_STATUS_UPLOADING).empty()) {
            ad_.pause_upload(&ad_, pick(jobs_in(ZV_UPLOAD_STATUS_UPLOADING)));
        } else if (k <= 7 && !jobs_in(ZV_UPLOAD_STATUS_PAUSED).empty()) {
            ad_.resume_upload(&ad_, pick(jobs_in(ZV_UPLOAD_STATUS_PAUSED)));
        } else if (k == 8 && deleted.size() < 4 && jobs_in(-1).size() > 1) {
            ASSERT_EQ(delete_in_edit_mode(pick(jobs_in(-1))), "");
        } else if (k == 9 && more.empty()) {
            launch_the_rest();
            ASSERT_EQ(more.size(), 10u);
            // A network event at the moment the metadata answers of the new jobs arrive: the
            // first of them turns its job UPLOADING, and the event comes before any upload
            // message is read.
            wait_for(
                [&] {
                    for (int id : more)
                        if (job(id) && job(id)->status == ZV_UPLOAD_STATUS_UPLOADING)
                            return true;
                    return false;
                },
                5000);
            _zv_upload_ctrl_net_status_cb(1, &ad_);
        }
    }
    if (more.empty())
        launch_the_rest();

    // The rest at full speed: paused jobs are resumed until every remaining one completes.
    ASSERT_TRUE(server_.clear_faults());
    std::vector<int> kept;
    for (int id : ids)
        if (!deleted.count(id))
            kept.push_back(id);
    ASSERT_TRUE(wait_for(
        [&] {
            for (UploadItem *job : jobs_in(ZV_UPLOAD_STATUS_PAUSED))
                ad_.resume_upload(&ad_, job);
            return rows_in(kept, ZV_UPLOAD_STATUS_COMPLETED);
        },
        3 * kLongWaitMs));
    auto rows = stored_rows();
    for (int id : deleted)
        EXPECT_EQ(rows.count(id), 0u) << "row " << id << " was deleted in edit mode";
    for (size_t i = 0; i < ids.size(); ++i)
        if (!deleted.count(ids[i]))
            expect_identical(ids[i], files[i]);
    // The server refuses (416) a data upload that starts elsewhere than its byte count: two
    // requests of one job crossed, or a data upload went out from an old offset.
    for (const Logged &r : server_.requests()) {
        if (r.status != 416)
            continue;
        std::string history;
        for (const Logged &q : server_.requests_of(r.upload_id))
            history += q.line + "\n";
        ADD_FAILURE() << "a data upload was refused for its range; the upload's requests:\n"
                      << history;
    }
}

} // namespace
