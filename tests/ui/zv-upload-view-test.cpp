// The upload list view over jobs in every status, driven the way a user drives it: badge
// clicks, row taps, the select-all bar, the title and question buttons, and the hardware keys
// as key events. The controller is replaced by operations that record their calls.
#include "zv-upload-view.h"

#include <Ecore_Evas.h>
#include <Ecore_Input.h>
#include <app.h>
#include <app_i18n.h>
#include <efl_extension.h>
#include <gtest/gtest.h>
#include <stdlib.h>
#include <uxt.h>

#include <algorithm>
#include <cmath>
#include <string>
#include <vector>

#include "zv-ext-db.h"
#include "zv-ext-noti.h"
#include "zv-ext-util.h"
#include "zv-test-util.h"

using zv_test::TempDir;
using zv_test::wait_for;

namespace
{

AppData g_ad; // stored once as the process context
std::vector<std::string> g_calls;
bool g_transition_done = false; // the naviframe finished a push or pop
std::string g_log_path;

// A 4 x 3 picture for a job's thumbnail.
const char kThumbPng[] =
    "\x89\x50\x4e\x47\x0d\x0a\x1a\x0a\x00\x00\x00\x0d\x49\x48\x44\x52\x00\x00\x00\x04\x00"
    "\x00\x00\x03\x08\x02\x00\x00\x00\x3b\x96\x39\x91\x00\x00\x00\x10\x49\x44\x41\x54\x78"
    "\x9c\x63\x38\x11\xa0\x01\x47\x0c\x38\x39\x00\x2c\x36\x0f\x01\xa2\xa8\x47\x5d\x00\x00"
    "\x00\x00\x49\x45\x4e\x44\xae\x42\x60\x82";

const std::string kCancel = "core_button_cancel.png";
const std::string kUpload = "zuvo_icon_badge_upload.png";

void free_job(UploadItem *job)
{
    g_free(job->title);
    g_free(job->display_name);
    g_free(job->thumb_path);
    g_free(job);
}

void record(const char *op, UploadItem *job)
{
    g_calls.push_back(std::string(op) + ":" + std::to_string(job ? job->historyid : 0));
}

void fake_meta(AppData *, UploadItem *job)
{
    record("meta", job);
}
void fake_data(AppData *, UploadItem *job)
{
    record("data", job);
}
void fake_pause(AppData *, UploadItem *job)
{
    record("pause", job);
}
void fake_resume(AppData *, UploadItem *job)
{
    record("resume", job);
}
void fake_exit(AppData *)
{
    record("exit", nullptr);
}
// As the controller does: the rows go with the job.
void fake_delete(UploadItem *job, bool from_db)
{
    record(from_db ? "delete_db" : "delete", job);
    if (job->check)
        evas_object_del(job->check);
    if (job->gen_item)
        elm_object_item_del(job->gen_item);
    if (job->edit_gen_item)
        elm_object_item_del(job->edit_gen_item);
    free_job(job);
}

std::string tr(const char *id)
{
    return i18n_get_text(id);
}

std::string str(const char *s)
{
    return s ? s : "";
}

size_t realized_count(Evas_Object *genlist)
{
    Eina_List *items = elm_genlist_realized_items_get(genlist);
    size_t n = eina_list_count(items);
    eina_list_free(items);
    return n;
}

std::string style_of(Elm_Object_Item *item)
{
    const Elm_Genlist_Item_Class *itc = elm_genlist_item_item_class_get(item);
    return itc && itc->item_style ? itc->item_style : "";
}

std::string badge_picture(const UploadItem *job)
{
    if (!job->badge)
        return "";
    Evas_Object *img = elm_object_part_content_get(job->badge, "elm.swallow.content");
    const char *file = nullptr, *key = nullptr;
    elm_image_file_get(img, &file, &key);
    return str(key);
}

// A key as a desktop keyboard delivers it: the window's canvas gets it first (the toolkit's
// own key bindings), then the platform's key watcher (the back and more callbacks).
void feed_key(const char *keyname)
{
    Evas *evas = evas_object_evas_get(g_ad.win);
    evas_event_feed_key_down(evas, keyname, keyname, nullptr, nullptr, 0, nullptr);
    evas_event_feed_key_up(evas, keyname, keyname, nullptr, nullptr, 0, nullptr);
    auto *ev = static_cast<Ecore_Event_Key *>(calloc(1, sizeof(Ecore_Event_Key)));
    ev->keyname = keyname;
    ev->key = keyname;
    // No window of this process: the event is for the key watcher alone.
    ev->window = ev->event_window = ev->root_window = (Ecore_Window)-1;
    ecore_event_add(
        ECORE_EVENT_KEY_DOWN, ev, [](void *, void *e) { free(e); }, nullptr);
    for (int i = 0; i < 3; i++)
        ecore_main_loop_iterate();
}

// The first shown widget of that type among the canvas' top-level objects.
Evas_Object *find_widget(Evas_Object *win, const char *type)
{
    for (Evas_Object *o = evas_object_bottom_get(evas_object_evas_get(win)); o;
         o = evas_object_above_get(o)) {
        if (elm_object_widget_check(o) && str(elm_object_widget_type_get(o)) == type &&
            evas_object_visible_get(o))
            return o;
    }
    return nullptr;
}

class ViewTest : public ::testing::Test
{
  protected:
    static void SetUpTestSuite()
    {
        if (g_log_path.empty()) {
            // The platform log opens its file once per process.
            char tmpl[] = "/tmp/zv-view-log-XXXXXX";
            int fd = mkstemp(tmpl);
            if (fd >= 0)
                close(fd);
            g_log_path = tmpl;
            setenv("ZV_DLOG_FILE", tmpl, 1);
            atexit([] { unlink(g_log_path.c_str()); });
        }
        zv_ext_util_set_appdata(&g_ad);
        i18n_bind_text_domain(); // before a test points ZV_RES_DIR elsewhere
        char *res = app_get_resource_path();
        std::string winset = str(res) + "edje/zuvo-upload-custom-winset.edj";
        free(res);
        elm_theme_extension_add(nullptr, winset.c_str());
        elm_theme_overlay_add(nullptr, winset.c_str());
    }

    void SetUp() override
    {
        ad = &g_ad;
        *ad = AppData{};
        ad->win = elm_win_add(nullptr, "zuvo-upload-svc", ELM_WIN_BASIC);
        evas_object_resize(ad->win, 360, 640);
        ad->layout = elm_layout_add(ad->win);
        elm_layout_theme_set(ad->layout, "layout", "application", "default");
        evas_object_size_hint_weight_set(ad->layout, EVAS_HINT_EXPAND, EVAS_HINT_EXPAND);
        elm_win_resize_object_add(ad->win, ad->layout);
        ad->navi = elm_naviframe_add(ad->layout);
        elm_naviframe_prev_btn_auto_pushed_set(ad->navi, EINA_FALSE);
        eext_object_event_callback_add(ad->navi, EEXT_CALLBACK_BACK, zv_upload_view_back_cb, ad);
        eext_object_event_callback_add(ad->navi, EEXT_CALLBACK_MORE, zv_upload_view_morekey_cb, ad);
        evas_object_smart_callback_add(
            ad->navi, "transition,finished",
            [](void *, Evas_Object *, void *) { g_transition_done = true; }, nullptr);
        elm_object_part_content_set(ad->layout, "elm.swallow.content", ad->navi);
        evas_object_show(ad->layout);
        evas_object_show(ad->navi);
        evas_object_show(ad->win);
        ad->meta_data_upload = fake_meta;
        ad->data_upload = fake_data;
        ad->pause_upload = fake_pause;
        ad->resume_upload = fake_resume;
        ad->delete_item = fake_delete;
        ad->exit = fake_exit;
        g_calls.clear();
    }

    void TearDown() override
    {
        zv_upload_view_destroy(ad);
        evas_object_del(ad->win);
        ecore_main_loop_iterate(); // the window's canvas is freed on the loop, not at once
        g_list_free_full(ad->job_list, [](void *job) { free_job(static_cast<UploadItem *>(job)); });
        *ad = AppData{};
        zv_ext_db_close();
    }

    UploadItem *add_job(int id, int status, int percent, const char *title,
                        const char *display_name = "clip.mp4", const char *thumb = nullptr)
    {
        auto *job = g_new0(UploadItem, 1);
        job->historyid = id;
        job->status = status;
        job->percent = percent;
        job->title = g_strdup(title);
        job->display_name = g_strdup(display_name);
        job->thumb_path = g_strdup(thumb);
        ad->job_list = g_list_append(ad->job_list, job);
        return job;
    }

    // Builds the view and waits until every row is realized.
    void show_list()
    {
        zv_upload_view_init(ad);
        size_t n = g_list_length(ad->job_list);
        if (n) {
            ASSERT_TRUE(wait_for([&] { return realized_count(ad->pGenlist) == n; }));
        }
    }

    Elm_Object_Item *top() { return elm_naviframe_top_item_get(ad->navi); }
    std::string title() { return str(elm_object_item_part_text_get(top(), "elm.text.title")); }
    Evas_Object *title_button(const char *part, const char *stock_part)
    {
        Evas_Object *btn = elm_object_item_part_content_get(top(), part);
        return btn ? btn : elm_object_item_part_content_get(top(), stock_part);
    }
    Evas_Object *done_button() { return title_button("title_right_btn", "next_btn"); }
    Evas_Object *cancel_button() { return title_button("title_left_btn", "prev_btn"); }

    // More key; returns once the menu is laid out (a dismissal before that is lost).
    void open_menu()
    {
        feed_key("F2");
        ASSERT_NE(ad->pCtxPopup, nullptr);
        ASSERT_TRUE(wait_for([&] {
            return elm_ctxpopup_direction_get(ad->pCtxPopup) != ELM_CTXPOPUP_DIRECTION_UNKNOWN;
        }));
    }

    // More key, then the menu's single entry; returns once the edit page is in place (the
    // naviframe refuses to pop a page while it is still sliding in).
    void enter_edit_mode()
    {
        g_transition_done = false;
        feed_key("F2");
        ASSERT_NE(ad->pCtxPopup, nullptr);
        Elm_Object_Item *remove = elm_ctxpopup_first_item_get(ad->pCtxPopup);
        ASSERT_EQ(str(elm_object_item_text_get(remove)), tr("IDS_GALLERY_OPT_REMOVE"));
        elm_ctxpopup_item_selected_set(remove, EINA_TRUE);
        ASSERT_NE(ad->pEditGenlist, nullptr);
        size_t n = g_list_length(ad->job_list);
        ASSERT_TRUE(wait_for([&] { return realized_count(ad->pEditGenlist) == n; }));
        ASSERT_TRUE(wait_for([] { return g_transition_done; }));
    }

    // Waits until the edit page is popped and the list is back in place.
    bool edit_page_gone()
    {
        g_transition_done = false;
        return wait_for([&] { return ad->pEditLayout == nullptr; }) &&
               wait_for([] { return g_transition_done; });
    }

    void tap_edit_row(UploadItem *job)
    {
        elm_genlist_item_selected_set(job->edit_gen_item, EINA_TRUE);
    }

    void press_select_all()
    {
        Evas_Object *bar =
            elm_object_part_content_get(ad->pEditLayout, "elm.swallow.content.select.all");
        ASSERT_TRUE(wait_for([&] {
            int x, y, w, h;
            evas_object_geometry_get(bar, &x, &y, &w, &h);
            return w > 0 && h > 0 && x == 0;
        }));
        int x, y, w, h;
        evas_object_geometry_get(bar, &x, &y, &w, &h);
        Evas *evas = evas_object_evas_get(bar);
        evas_event_feed_mouse_move(evas, x + w / 3, y + h / 2, 0, nullptr);
        evas_event_feed_mouse_down(evas, 1, EVAS_BUTTON_NONE, 0, nullptr);
        evas_event_feed_mouse_up(evas, 1, EVAS_BUTTON_NONE, 0, nullptr);
    }

    std::string selected_title(int count)
    {
        char *text = g_strdup_printf(tr("IDS_VIDEO_HEADER_PD_SELECTED").c_str(), count);
        std::string s = text;
        g_free(text);
        return s;
    }

    TempDir tmp;
    AppData *ad = nullptr;
};

TEST_F(ViewTest, EveryIdHasAText)
{
    for (const char *id :
         {"IDS_GALLERY_HEADER_UPLOADS", "IDS_MF_NPBODY_NO_UPLOADS",
          "IDS_GALLERY_BODY_AFTER_YOU_UPLOAD_ITEMS_THEY_WILL_BE_SHOWN_HERE",
          "IDS_GALLERY_HEADER_SELECT_UPLOADS_ABB", "IDS_VIDEO_HEADER_PD_SELECTED",
          "IDS_COM_BODY_SELECT_ALL", "IDS_TPLATFORM_ACBUTTON_CANCEL_ABB",
          "IDS_TPLATFORM_ACBUTTON_DONE_ABB", "IDS_GALLERY_HEADER_STOP_UPLOADS_ABB2",
          "IDS_GALLERY_POP_THE_UPLOAD_WILL_STOP_BUT_THE_FILE_WILL_NOT_BE_DELETED",
          "IDS_VIDEO_BUTTON_CANCEL", "IDS_GALLERY_BUTTON_STOP_ABB2", "IDS_GALLERY_OPT_REMOVE"})
        EXPECT_NE(tr(id), id);
}

TEST_F(ViewTest, RowsFollowTheStatus)
{
    struct Row {
        int status;
        int percent;
        const char *style;
        double bar; // -1: no progress bar
        std::string badge;
    };
    const Row rows[] = {
        {ZV_UPLOAD_STATUS_READY, 0, "progress.main.custom", -1, kCancel},
        {ZV_UPLOAD_STATUS_WAITING, 0, "progress.main.custom", 0.0, kCancel},
        {ZV_UPLOAD_STATUS_PAUSED, 60, "progress.main.custom", 0.60, kUpload},
        {ZV_UPLOAD_STATUS_UPLOADING, 37, "progress.main.custom", 0.37, kCancel},
        {ZV_UPLOAD_STATUS_COMPLETED, 100, "2line.top.custom", -1, ""},
    };
    std::vector<UploadItem *> jobs;
    for (const Row &r : rows)
        jobs.push_back(add_job(r.status + 1, r.status, r.percent, "Title"));
    show_list();
    EXPECT_EQ(title(), tr("IDS_GALLERY_HEADER_UPLOADS"));

    for (size_t i = 0; i < jobs.size(); i++) {
        SCOPED_TRACE(rows[i].status);
        Elm_Object_Item *it = jobs[i]->gen_item;
        EXPECT_EQ(style_of(it), rows[i].style);
        bool completed = rows[i].status == ZV_UPLOAD_STATUS_COMPLETED;
        EXPECT_EQ(str(elm_object_item_part_text_get(it, completed ? "elm.text.main.left.top"
                                                                  : "elm.text.main")),
                  "Title");
        EXPECT_EQ(str(elm_object_item_part_text_get(it, "elm.text.sub.left.bottom")), "clip.mp4");
        Evas_Object *bar = elm_object_item_part_content_get(it, "elm.icon");
        if (rows[i].bar < 0)
            EXPECT_EQ(bar, nullptr);
        else
            EXPECT_DOUBLE_EQ(elm_progressbar_value_get(bar), rows[i].bar);
        EXPECT_EQ(badge_picture(jobs[i]), rows[i].badge);
    }
}

TEST_F(ViewTest, MissingThumbnailNameOrCompletedStatus)
{
    std::string thumb = tmp.file("thumb.png");
    ASSERT_TRUE(zv_test::write_file(thumb, std::string(kThumbPng, sizeof kThumbPng - 1)));
    UploadItem *with_thumb = add_job(1, ZV_UPLOAD_STATUS_UPLOADING, 5, "A", "a.mp4", thumb.c_str());
    UploadItem *bare = add_job(2, ZV_UPLOAD_STATUS_WAITING, 0, "B", nullptr, nullptr);
    UploadItem *bare_done = add_job(3, ZV_UPLOAD_STATUS_COMPLETED, 100, "C", "c.mp4", nullptr);
    show_list();

    Evas_Object *frame = elm_object_item_part_content_get(with_thumb->gen_item, "elm.icon.1");
    ASSERT_NE(frame, nullptr);
    EXPECT_NE(elm_object_part_content_get(frame, "elm.thumbnail.icon"), nullptr);

    frame = elm_object_item_part_content_get(bare->gen_item, "elm.icon.1");
    ASSERT_NE(frame, nullptr);
    EXPECT_EQ(elm_object_part_content_get(frame, "elm.thumbnail.icon"), nullptr);
    EXPECT_EQ(str(elm_object_item_part_text_get(bare->gen_item, "elm.text.sub.left.bottom")), "");

    EXPECT_EQ(elm_object_item_part_content_get(bare_done->gen_item, "elm.icon.1"), nullptr);

    // A completed-look row of a job that is not completed shows no sub text.
    with_thumb->status = ZV_UPLOAD_STATUS_PAUSED;
    zv_upload_list_complete_item(with_thumb);
    EXPECT_EQ(style_of(with_thumb->gen_item), "2line.top.custom");
    EXPECT_TRUE(wait_for([&] {
        return str(elm_object_item_part_text_get(with_thumb->gen_item,
                                                 "elm.text.sub.left.bottom")) == "";
    }));
}

TEST_F(ViewTest, EmptyListShowsThePlaceholder)
{
    show_list();
    EXPECT_EQ(ad->pGenlist, nullptr);
    ASSERT_NE(ad->pNoContent, nullptr);
    Evas_Object *inner = elm_object_part_content_get(ad->pNoContent, "contents");
    EXPECT_EQ(str(elm_object_part_text_get(inner, "elm.text")), tr("IDS_MF_NPBODY_NO_UPLOADS"));
    EXPECT_EQ(str(elm_object_part_text_get(inner, "elm.help.text")),
              tr("IDS_GALLERY_BODY_AFTER_YOU_UPLOAD_ITEMS_THEY_WILL_BE_SHOWN_HERE"));

    // A rebuild with jobs replaces the placeholder by the list, on one page.
    add_job(1, ZV_UPLOAD_STATUS_WAITING, 0, "A");
    zv_upload_view_destroy(ad);
    show_list();
    EXPECT_EQ(ad->pNoContent, nullptr);
    EXPECT_NE(ad->pGenlist, nullptr);
    Eina_List *pages = elm_naviframe_items_get(ad->navi);
    EXPECT_EQ(eina_list_count(pages), 1u);
    eina_list_free(pages);
}

TEST_F(ViewTest, BadgeClicksPauseAndResume)
{
    UploadItem *job = add_job(7, ZV_UPLOAD_STATUS_UPLOADING, 40, "A");
    UploadItem *waiting = add_job(8, ZV_UPLOAD_STATUS_WAITING, 0, "B");
    show_list();

    evas_object_smart_callback_call(job->badge, "clicked", nullptr);
    EXPECT_EQ(badge_picture(job), kUpload);
    job->status = ZV_UPLOAD_STATUS_PAUSED; // what the pause operation does
    evas_object_smart_callback_call(job->badge, "clicked", nullptr);
    EXPECT_EQ(badge_picture(job), kCancel);

    evas_object_smart_callback_call(waiting->badge, "clicked", nullptr);
    EXPECT_EQ(badge_picture(waiting), kCancel);
    EXPECT_EQ(g_calls, (std::vector<std::string>{"pause:7", "resume:7"}));

    // A tap on a row only leaves it unselected.
    elm_genlist_item_selected_set(job->gen_item, EINA_TRUE);
    EXPECT_FALSE(elm_genlist_item_selected_get(job->gen_item));
    EXPECT_EQ(g_calls.size(), 2u);
}

TEST_F(ViewTest, BadgeRedrawFollowsTheStatus)
{
    UploadItem *job = add_job(1, ZV_UPLOAD_STATUS_UPLOADING, 10, "A");
    show_list();
    const std::pair<int, std::string> steps[] = {
        {ZV_UPLOAD_STATUS_PAUSED, kUpload},
        {ZV_UPLOAD_STATUS_WAITING, kCancel},
        {ZV_UPLOAD_STATUS_PAUSED, kUpload},
        {ZV_UPLOAD_STATUS_UPLOADING, kCancel},
    };
    for (const auto &step : steps) {
        job->status = step.first;
        zv_upload_view_update_badge_button(job);
        EXPECT_EQ(badge_picture(job), step.second) << step.first;
    }
    EXPECT_TRUE(g_calls.empty());
}

TEST_F(ViewTest, CompletedJobSwitchesInPlaceInBothLists)
{
    UploadItem *a = add_job(1, ZV_UPLOAD_STATUS_UPLOADING, 90, "A");
    UploadItem *b = add_job(2, ZV_UPLOAD_STATUS_UPLOADING, 20, "B");
    show_list();
    Evas_Object *genlist = ad->pGenlist;
    enter_edit_mode();

    a->status = ZV_UPLOAD_STATUS_COMPLETED;
    zv_upload_list_complete_item(a);
    EXPECT_EQ(ad->pGenlist, genlist);
    EXPECT_EQ(style_of(a->gen_item), "2line.top.custom");
    EXPECT_EQ(style_of(a->edit_gen_item), "2line.top.custom");
    EXPECT_EQ(style_of(b->edit_gen_item), "progress.main.custom");
    ASSERT_TRUE(wait_for([&] { return a->check != nullptr; }));
    EXPECT_TRUE(wait_for([&] {
        return str(elm_object_item_part_text_get(a->edit_gen_item, "elm.text.sub.left.bottom")) ==
               "clip.mp4";
    }));
}

TEST_F(ViewTest, SelectionCountsInTheTitleAndDoneButton)
{
    UploadItem *a = add_job(1, ZV_UPLOAD_STATUS_COMPLETED, 100, "A");
    UploadItem *b = add_job(2, ZV_UPLOAD_STATUS_PAUSED, 50, "B");
    UploadItem *c = add_job(3, ZV_UPLOAD_STATUS_UPLOADING, 20, "C");
    show_list();
    enter_edit_mode();
    EXPECT_EQ(ad->pCtxPopup, nullptr);
    EXPECT_EQ(title(), tr("IDS_GALLERY_HEADER_SELECT_UPLOADS_ABB"));
    ASSERT_NE(done_button(), nullptr);
    EXPECT_TRUE(elm_object_disabled_get(done_button()));

    tap_edit_row(a);
    tap_edit_row(c);
    EXPECT_EQ(title(), selected_title(2));
    EXPECT_FALSE(elm_object_disabled_get(done_button()));
    EXPECT_TRUE(elm_check_state_get(a->check));
    EXPECT_FALSE(elm_check_state_get(b->check));

    Evas_Object *all = elm_object_part_content_get(
        elm_object_part_content_get(ad->pEditLayout, "elm.swallow.content.select.all"), "elm.icon");
    EXPECT_FALSE(elm_check_state_get(all));
    tap_edit_row(b);
    EXPECT_TRUE(elm_check_state_get(all));

    for (UploadItem *job : {a, b, c})
        tap_edit_row(job);
    EXPECT_TRUE(elm_object_disabled_get(done_button()));
    EXPECT_EQ(title(), tr("IDS_GALLERY_HEADER_SELECT_UPLOADS_ABB"));

    press_select_all();
    EXPECT_TRUE(a->checked && b->checked && c->checked);
    EXPECT_EQ(title(), selected_title(3));
    EXPECT_FALSE(elm_object_disabled_get(done_button()));
    press_select_all();
    EXPECT_FALSE(a->checked || b->checked || c->checked);
    EXPECT_TRUE(elm_object_disabled_get(done_button()));
    EXPECT_TRUE(g_calls.empty());
}

TEST_F(ViewTest, CancelAndBackLeaveEditModeWithoutDeleting)
{
    UploadItem *a = add_job(1, ZV_UPLOAD_STATUS_PAUSED, 10, "A");
    add_job(2, ZV_UPLOAD_STATUS_COMPLETED, 100, "B");
    show_list();

    enter_edit_mode();
    tap_edit_row(a);
    evas_object_smart_callback_call(cancel_button(), "clicked", nullptr);
    EXPECT_FALSE(a->checked);
    ASSERT_TRUE(edit_page_gone());
    EXPECT_EQ(title(), tr("IDS_GALLERY_HEADER_UPLOADS"));

    enter_edit_mode();
    tap_edit_row(a);
    feed_key("Escape");
    EXPECT_FALSE(a->checked);
    ASSERT_TRUE(edit_page_gone());
    EXPECT_EQ(title(), tr("IDS_GALLERY_HEADER_UPLOADS"));
    // The back key left edit mode only; it did not leave the list.
    EXPECT_TRUE(g_calls.empty());
    EXPECT_EQ(g_list_length(ad->job_list), 2u);
}

TEST_F(ViewTest, DoneDeletesCompletedJobsAtOnce)
{
    UploadItem *a = add_job(1, ZV_UPLOAD_STATUS_COMPLETED, 100, "A");
    UploadItem *b = add_job(2, ZV_UPLOAD_STATUS_PAUSED, 30, "B");
    show_list();
    enter_edit_mode();
    tap_edit_row(a);
    evas_object_smart_callback_call(done_button(), "clicked", nullptr);

    EXPECT_EQ(g_calls, (std::vector<std::string>{"delete_db:1"}));
    ASSERT_EQ(g_list_length(ad->job_list), 1u);
    EXPECT_EQ(ad->job_list->data, b);
    EXPECT_EQ(find_widget(ad->win, "Elm_Popup"), nullptr);
    ASSERT_TRUE(edit_page_gone());
    EXPECT_EQ(title(), tr("IDS_GALLERY_HEADER_UPLOADS"));
    EXPECT_NE(ad->pGenlist, nullptr);
}

TEST_F(ViewTest, UnfinishedSelectionAsksBeforeStopping)
{
    UploadItem *a = add_job(1, ZV_UPLOAD_STATUS_COMPLETED, 100, "A");
    UploadItem *b = add_job(2, ZV_UPLOAD_STATUS_PAUSED, 30, "B");
    add_job(3, ZV_UPLOAD_STATUS_COMPLETED, 100, "C");
    show_list();
    enter_edit_mode();
    tap_edit_row(a);
    tap_edit_row(b);

    evas_object_smart_callback_call(done_button(), "clicked", nullptr);
    Evas_Object *popup = find_widget(ad->win, "Elm_Popup");
    ASSERT_NE(popup, nullptr);
    EXPECT_EQ(str(elm_object_part_text_get(popup, "title,text")),
              tr("IDS_GALLERY_HEADER_STOP_UPLOADS_ABB2"));
    EXPECT_EQ(str(elm_object_text_get(popup)),
              tr("IDS_GALLERY_POP_THE_UPLOAD_WILL_STOP_BUT_THE_FILE_WILL_NOT_BE_DELETED"));

    // Back on the question answers Cancel: edit mode and the selection stay.
    feed_key("Escape");
    EXPECT_EQ(find_widget(ad->win, "Elm_Popup"), nullptr);
    EXPECT_TRUE(a->checked && b->checked);
    EXPECT_EQ(title(), selected_title(2));
    EXPECT_TRUE(g_calls.empty());

    evas_object_smart_callback_call(done_button(), "clicked", nullptr);
    popup = find_widget(ad->win, "Elm_Popup");
    ASSERT_NE(popup, nullptr);
    Evas_Object *stop = elm_object_part_content_get(popup, "button2");
    EXPECT_EQ(str(elm_object_text_get(stop)), tr("IDS_GALLERY_BUTTON_STOP_ABB2"));
    evas_object_smart_callback_call(stop, "clicked", nullptr);
    EXPECT_EQ(g_calls, (std::vector<std::string>{"delete_db:1", "delete_db:2"}));
    EXPECT_EQ(g_list_length(ad->job_list), 1u);
}

TEST_F(ViewTest, DeletingActiveJobsRefreshesTheOngoingNotification)
{
    std::string ongoing = tmp.file("run/notifications/zuvo_ongoing_noti.ini");
    ASSERT_EQ(zv_ext_db_open(), 1);
    ASSERT_EQ(zuvo_ext_noti_ongoing_noti_create("ZuVo", "Uploading", 0, 2, 0.1), 1);
    ASSERT_EQ(access(ongoing.c_str(), F_OK), 0);

    UploadItem *paused = add_job(1, ZV_UPLOAD_STATUS_PAUSED, 30, "A");
    add_job(2, ZV_UPLOAD_STATUS_WAITING, 0, "B");
    add_job(3, ZV_UPLOAD_STATUS_COMPLETED, 100, "C");
    ad->completed_count = 1;
    ad->total_count = 2;
    show_list();

    // Paused jobs are not counted: the notification stays as it was.
    enter_edit_mode();
    tap_edit_row(paused);
    evas_object_smart_callback_call(done_button(), "clicked", nullptr);
    evas_object_smart_callback_call(
        elm_object_part_content_get(find_widget(ad->win, "Elm_Popup"), "button2"), "clicked",
        nullptr);
    EXPECT_EQ(access(ongoing.c_str(), F_OK), 0);
    ASSERT_TRUE(edit_page_gone());

    // Every job, a waiting one among them: the placeholder, and the notification is gone.
    enter_edit_mode();
    press_select_all();
    evas_object_smart_callback_call(done_button(), "clicked", nullptr);
    evas_object_smart_callback_call(
        elm_object_part_content_get(find_widget(ad->win, "Elm_Popup"), "button2"), "clicked",
        nullptr);
    EXPECT_EQ(ad->job_list, nullptr);
    EXPECT_EQ(ad->total_count, 0);
    EXPECT_EQ(ad->pGenlist, nullptr);
    ASSERT_NE(ad->pNoContent, nullptr);
    EXPECT_EQ(elm_object_part_content_get(ad->pListLayout, "elm.swallow.content"), ad->pNoContent);
    EXPECT_NE(access(ongoing.c_str(), F_OK), 0);
    EXPECT_EQ(g_calls, (std::vector<std::string>{"delete_db:1", "delete_db:2", "delete_db:3"}));
}

TEST_F(ViewTest, BackAndMoreKeys)
{
    show_list();
    feed_key("Menu");
    EXPECT_EQ(ad->pCtxPopup, nullptr); // no jobs, no menu
    feed_key("Escape");
    EXPECT_EQ(g_calls, (std::vector<std::string>{"exit:0"}));

    g_calls.clear();
    add_job(1, ZV_UPLOAD_STATUS_UPLOADING, 20, "A");
    zv_upload_view_destroy(ad);
    show_list();
    open_menu();
    EXPECT_EQ(elm_ctxpopup_first_item_get(ad->pCtxPopup),
              elm_ctxpopup_last_item_get(ad->pCtxPopup));
    feed_key("F2");
    ASSERT_TRUE(wait_for([&] { return ad->pCtxPopup == nullptr; }));

    open_menu();
    feed_key("Escape"); // goes to the menu, not to the list
    ASSERT_TRUE(wait_for([&] { return ad->pCtxPopup == nullptr; }));
    EXPECT_TRUE(g_calls.empty());

    // The raw key handlers only log.
    Ecore_Event_Key ev = {};
    ev.keyname = "XF86Back";
    EXPECT_EQ(zv_upload_view_event_key_down_cb(ad, ECORE_EVENT_KEY_DOWN, &ev), ECORE_CALLBACK_DONE);
    EXPECT_EQ(zv_upload_view_event_key_up_cb(ad, ECORE_EVENT_KEY_UP, &ev), ECORE_CALLBACK_DONE);
    EXPECT_EQ(zv_upload_view_event_key_up_cb(nullptr, ECORE_EVENT_KEY_UP, &ev),
              ECORE_CALLBACK_DONE);
    EXPECT_TRUE(g_calls.empty());
    EXPECT_NE(zv_test::read_file(g_log_path).find("HW EVENT KEY UP:XF86Back"), std::string::npos);
}

TEST_F(ViewTest, MenuHangsFromTheBottomMiddle)
{
    add_job(1, ZV_UPLOAD_STATUS_UPLOADING, 20, "A");
    show_list();
    int w = 0, h = 0;
    elm_win_screen_size_get(ad->win, nullptr, nullptr, &w, &h);
    for (int rotation : {0, 90}) {
        SCOPED_TRACE(rotation);
        elm_win_rotation_set(ad->win, rotation);
        open_menu();
        int x = -1, y = -1;
        evas_object_geometry_get(ad->pCtxPopup, &x, &y, nullptr, nullptr);
        EXPECT_EQ(x, rotation ? h / 2 : w / 2);
        EXPECT_EQ(y, rotation ? w : h);
        feed_key("F2");
        ASSERT_TRUE(wait_for([&] { return ad->pCtxPopup == nullptr; }));
    }
}

// The evas text object below obj that shows text (a part of a row or of the title bar).
Evas_Object *find_text_below(Evas_Object *obj, const std::string &text)
{
    const char *type = evas_object_type_get(obj);
    if (type && !strcmp(type, "text") && str(evas_object_text_text_get(obj)) == text)
        return obj;
    Evas_Object *found = nullptr;
    Eina_Iterator *it = evas_object_smart_iterator_new(obj);
    void *child;
    if (it) {
        EINA_ITERATOR_FOREACH(it, child)
        if (!found)
            found = find_text_below(static_cast<Evas_Object *>(child), text);
        eina_iterator_free(it);
    }
    return found;
}

// The evas text object on the window's canvas that shows text.
Evas_Object *find_text(Evas_Object *win, const std::string &text)
{
    Evas_Object *found = nullptr;
    for (Evas_Object *o = evas_object_bottom_get(evas_object_evas_get(win)); o && !found;
         o = evas_object_above_get(o))
        found = find_text_below(o, text);
    return found;
}

// The size a text is drawn at: its font size times the scale its theme file gives it.
double font_size(Evas_Object *text)
{
    const char *font = nullptr;
    int size = 0;
    if (text)
        evas_object_text_font_get(text, &font, &size);
    return text ? size * evas_object_scale_get(text) : 0.0;
}

// At scale 1 every control is a touch target of at least 48 x 48 px (badge, title buttons,
// check boxes, the menu entry, the question's buttons) and the title is at least as large as
// a row's title.
TEST_F(ViewTest, TouchTargetsAndTitleSizeAtScale1)
{
    ASSERT_EQ(elm_config_scale_get(), 1.0);
    UploadItem *job = add_job(1, ZV_UPLOAD_STATUS_PAUSED, 50, "Row title");
    add_job(2, ZV_UPLOAD_STATUS_COMPLETED, 100, "B");
    show_list();
    auto touch_target = [](Evas_Object *obj, const char *what) {
        int w = 0, h = 0;
        ASSERT_TRUE(wait_for(
            [&] {
                evas_object_geometry_get(obj, nullptr, nullptr, &w, &h);
                return w >= 48 && h >= 48;
            },
            1000))
            << what << " is " << w << " x " << h;
    };
    touch_target(job->badge, "badge");
    double row_size = font_size(find_text(ad->win, "Row title"));
    EXPECT_GT(row_size, 0);
    EXPECT_GE(font_size(find_text(ad->win, tr("IDS_GALLERY_HEADER_UPLOADS"))), row_size);

    open_menu();
    // The entry's text sits in the entry's own theme object.
    Evas_Object *remove = find_text(ad->win, tr("IDS_GALLERY_OPT_REMOVE"));
    ASSERT_NE(remove, nullptr);
    touch_target(evas_object_smart_parent_get(remove), "menu entry");
    elm_ctxpopup_dismiss(ad->pCtxPopup);
    ASSERT_TRUE(wait_for([&] { return ad->pCtxPopup == nullptr; }));

    enter_edit_mode();
    touch_target(cancel_button(), "Cancel");
    touch_target(done_button(), "Done");
    touch_target(job->check, "row check box");
    Evas_Object *bar =
        elm_object_part_content_get(ad->pEditLayout, "elm.swallow.content.select.all");
    touch_target(elm_object_part_content_get(bar, "elm.icon"), "select-all check box");
    tap_edit_row(job);
    evas_object_smart_callback_call(done_button(), "clicked", nullptr);
    Evas_Object *popup = find_widget(ad->win, "Elm_Popup");
    ASSERT_NE(popup, nullptr);
    touch_target(elm_object_part_content_get(popup, "button1"), "question's Cancel");
    touch_target(elm_object_part_content_get(popup, "button2"), "question's Stop");
    EXPECT_GE(font_size(find_text(ad->win, selected_title(1))), row_size);
}

TEST_F(ViewTest, MissingThemeFilesKeepTheDefaultLook)
{
    const char *env = getenv("ZV_RES_DIR");
    std::string saved = str(env);
    setenv("ZV_RES_DIR", (tmp.path() + "/").c_str(), 1);
    UploadItem *job = add_job(1, ZV_UPLOAD_STATUS_PAUSED, 50, "A");
    add_job(2, ZV_UPLOAD_STATUS_COMPLETED, 100, "B");
    zv_upload_view_init(ad);
    ASSERT_TRUE(wait_for([&] { return realized_count(ad->pGenlist) == 2; }));
    evas_object_smart_callback_call(job->badge, "clicked", nullptr);
    if (env)
        setenv("ZV_RES_DIR", saved.c_str(), 1);
    else
        unsetenv("ZV_RES_DIR");

    EXPECT_EQ(g_calls, (std::vector<std::string>{"resume:1"}));
    EXPECT_NE(zv_test::read_file(g_log_path).find("elm_layout_file_set() is failed."),
              std::string::npos);
}

} // namespace
