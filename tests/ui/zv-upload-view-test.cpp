// The upload list view over jobs in every status, driven the way a user drives it: badge
// clicks, row taps, the select-all bar, the title and question buttons, and the hardware keys
// as key events. The controller is replaced by operations that record their calls. Texts are
// the English catalogue's, as a user reads them.
#include "zv-upload-view.h"

#include <Ecore_Evas.h>
#include <Ecore_Input.h>
#include <app.h>
#include <app_i18n.h>
#include <efl_extension.h>
#include <gtest/gtest.h>
#include <stdlib.h>

#include <functional>
#include <string>
#include <vector>

#include "zv-ext-db.h"
#include "zv-ext-noti.h"
#include "zv-ext-util.h"
#include "zv-test-util.h"

using zv_test::wait_for;
using Calls = std::vector<std::string>;

namespace
{

zv_test::LogFile g_log; // before anything logs
AppData g_ad;           // stored once as the process context
Calls g_calls;
bool g_transition_done = false; // the naviframe finished a push or pop

const std::string kCancel = "core_button_cancel.png", kUpload = "zuvo_icon_badge_upload.png";
const std::string kProgress = "progress.main.custom", kComplete = "2line.top.custom";

std::string str(const char *s)
{
    return s ? s : "";
}

void free_job(void *p)
{
    auto *job = static_cast<UploadItem *>(p);
    g_free(job->title);
    g_free(job->display_name);
    g_free(job->thumb_path);
    g_free(job);
}

void record(const char *op, UploadItem *job)
{
    g_calls.push_back(std::string(op) + ":" + std::to_string(job ? job->historyid : 0));
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
    return str(elm_genlist_item_item_class_get(item)->item_style);
}

std::string sub_text(Elm_Object_Item *item)
{
    return str(elm_object_item_part_text_get(item, "elm.text.sub.left.bottom"));
}

std::string badge_picture(const UploadItem *job)
{
    const char *file = nullptr, *key = nullptr;
    if (job->badge)
        elm_image_file_get(elm_object_part_content_get(job->badge, "elm.swallow.content"), &file,
                           &key);
    return str(key);
}

void click(Evas_Object *obj)
{
    evas_object_smart_callback_call(obj, "clicked", nullptr);
}

// A key as a desktop keyboard delivers it: the window's canvas gets it first (the toolkit's
// own key bindings), then the platform's key watcher (the back and more callbacks).
void feed_key(const char *keyname)
{
    Evas *evas = evas_object_evas_get(g_ad.win);
    evas_event_feed_key_down(evas, keyname, keyname, nullptr, nullptr, 0, nullptr);
    evas_event_feed_key_up(evas, keyname, keyname, nullptr, nullptr, 0, nullptr);
    auto *ev = static_cast<Ecore_Event_Key *>(calloc(1, sizeof(Ecore_Event_Key)));
    ev->keyname = ev->key = keyname;
    // No window of this process: the event is for the key watcher alone.
    ev->window = ev->event_window = ev->root_window = (Ecore_Window)-1;
    ecore_event_add(
        ECORE_EVENT_KEY_DOWN, ev, [](void *, void *e) { free(e); }, nullptr);
    for (int i = 0; i < 3; i++)
        ecore_main_loop_iterate();
}

// The first object on the window's canvas (at or below obj when given) that matches.
Evas_Object *find(const std::function<bool(Evas_Object *)> &match, Evas_Object *obj = nullptr)
{
    Evas_Object *found = obj && match(obj) ? obj : nullptr;
    if (Eina_Iterator *it = obj && !found ? evas_object_smart_iterator_new(obj) : nullptr) {
        void *child;
        EINA_ITERATOR_FOREACH(it, child)
        found = found ? found : find(match, static_cast<Evas_Object *>(child));
        eina_iterator_free(it);
    }
    for (Evas_Object *o = obj ? nullptr : evas_object_bottom_get(evas_object_evas_get(g_ad.win));
         o && !found; o = evas_object_above_get(o))
        found = find(match, o);
    return found;
}

Evas_Object *find_popup()
{
    return find([](Evas_Object *o) {
        return elm_object_widget_check(o) && str(elm_object_widget_type_get(o)) == "Elm_Popup" &&
               evas_object_visible_get(o);
    });
}

Evas_Object *find_text(const std::string &text)
{
    return find([&](Evas_Object *o) {
        return str(evas_object_type_get(o)) == "text" && str(evas_object_text_text_get(o)) == text;
    });
}

// The size a text is drawn at: its font size times the scale its theme file gives it.
double font_size(const std::string &text)
{
    Evas_Object *obj = find_text(text);
    const char *font = nullptr;
    int size = 0;
    if (obj)
        evas_object_text_font_get(obj, &font, &size);
    return obj ? size * evas_object_scale_get(obj) : 0.0;
}

class ViewTest : public ::testing::Test
{
  protected:
    static void SetUpTestSuite()
    {
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
        for (Evas_Object *obj : {ad->layout, ad->navi, ad->win})
            evas_object_show(obj);
        ad->pause_upload = [](AppData *, UploadItem *job) { record("pause", job); };
        ad->resume_upload = [](AppData *, UploadItem *job) { record("resume", job); };
        ad->exit = [](AppData *) { record("exit", nullptr); };
        // As the controller does: the rows go with the job.
        ad->delete_item = [](UploadItem *job, bool from_db) {
            record(from_db ? "delete_db" : "delete", job);
            evas_object_del(job->check);
            for (Elm_Object_Item *item : {job->gen_item, job->edit_gen_item})
                if (item)
                    elm_object_item_del(item);
            free_job(job);
        };
        g_calls.clear();
    }

    void TearDown() override
    {
        zv_upload_view_destroy(ad);
        evas_object_del(ad->win);
        ecore_main_loop_iterate(); // the window's canvas is freed on the loop, not at once
        g_list_free_full(ad->job_list, free_job);
        *ad = AppData{};
        zv_ext_db_close();
    }

    UploadItem *add_job(int id, int status, const char *display_name = "clip.mp4",
                        const char *thumb = nullptr)
    {
        auto *job = g_new0(UploadItem, 1);
        job->historyid = id;
        job->status = status;
        job->title = g_strdup_printf("Title %d", id);
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
        ASSERT_TRUE(!n || wait_for([&] { return realized_count(ad->pGenlist) == n; }));
    }

    Elm_Object_Item *top() { return elm_naviframe_top_item_get(ad->navi); }
    std::string title() { return str(elm_object_item_part_text_get(top(), "elm.text.title")); }
    Evas_Object *button(bool done)
    {
        Evas_Object *btn =
            elm_object_item_part_content_get(top(), done ? "title_right_btn" : "title_left_btn");
        return btn ? btn : elm_object_item_part_content_get(top(), done ? "next_btn" : "prev_btn");
    }
    Evas_Object *select_all_bar()
    {
        return elm_object_part_content_get(ad->pEditLayout, "elm.swallow.content.select.all");
    }
    // The edit page as a user reads it: the title, Done on or off, the rows' check boxes and
    // the select-all check box.
    std::string edit_state()
    {
        std::string text = title() + (elm_object_disabled_get(button(true)) ? ", off, " : ", on, ");
        for (GList *l = ad->job_list; l; l = l->next)
            text += elm_check_state_get(static_cast<UploadItem *>(l->data)->check) ? '1' : '0';
        return text +
               (elm_check_state_get(elm_object_part_content_get(select_all_bar(), "elm.icon"))
                    ? ", all"
                    : "");
    }

    // More key; returns once the menu is laid out (a dismissal before that is lost).
    void open_menu()
    {
        feed_key("F2");
        ASSERT_NE(ad->pCtxPopup, nullptr);
        ASSERT_TRUE(wait_for([&] {
            return elm_ctxpopup_direction_get(ad->pCtxPopup) != ELM_CTXPOPUP_DIRECTION_UNKNOWN;
        }));
    }

    // More key (unless the menu is open), then the menu's single entry; returns once the edit
    // page is in place (the naviframe refuses to pop a page while it is still sliding in).
    void enter_edit_mode(bool menu_open = false)
    {
        if (!menu_open)
            open_menu();
        g_transition_done = false;
        Elm_Object_Item *remove = elm_ctxpopup_first_item_get(ad->pCtxPopup);
        ASSERT_EQ(str(elm_object_item_text_get(remove)), "Remove");
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
               wait_for([] { return g_transition_done; }) && title() == "Uploads";
    }

    void tap(UploadItem *job) { elm_genlist_item_selected_set(job->edit_gen_item, EINA_TRUE); }

    void press_select_all()
    {
        Evas_Object *bar = select_all_bar();
        int x, y, w, h;
        ASSERT_TRUE(wait_for([&] {
            evas_object_geometry_get(bar, &x, &y, &w, &h);
            return w > 0 && h > 0 && x == 0;
        }));
        Evas *evas = evas_object_evas_get(bar);
        evas_event_feed_mouse_move(evas, x + w / 3, y + h / 2, 0, nullptr);
        evas_event_feed_mouse_down(evas, 1, EVAS_BUTTON_NONE, 0, nullptr);
        evas_event_feed_mouse_up(evas, 1, EVAS_BUTTON_NONE, 0, nullptr);
    }

    zv_test::TempDir tmp;
    AppData *ad = &g_ad;
};

// The badge pauses a running job and resumes a paused one, a waiting job's badge does
// nothing, and a redraw shows the picture of the job's status; a tap on a row only unselects
// it; a thumbnail is drawn where the job has one. The one-entry menu hangs from the bottom
// middle whichever the rotation and the more key and the back key close it without reaching
// the list; the raw key handlers only log. A row redrawn as completed for a job that is not
// shows no file name.
TEST_F(ViewTest, BadgesMenuAndKeys)
{
    // A picture wider than tall, as video frames are.
    const std::string thumb = zv_test::source_path("res/edje/images/zv_nocontents_uploads.png");
    UploadItem *job = add_job(1, ZV_UPLOAD_STATUS_UPLOADING, "a.mp4", thumb.c_str());
    UploadItem *waiting = add_job(2, ZV_UPLOAD_STATUS_WAITING);
    show_list();
    for (UploadItem *j : {job, waiting})
        EXPECT_EQ(
            elm_object_part_content_get(elm_object_item_part_content_get(j->gen_item, "elm.icon.1"),
                                        "elm.thumbnail.icon") != nullptr,
            j == job);
    click(job->badge);
    EXPECT_EQ(badge_picture(job), kUpload);
    job->status = ZV_UPLOAD_STATUS_PAUSED; // what the pause operation does
    click(job->badge);
    EXPECT_EQ(badge_picture(job), kCancel);
    click(waiting->badge);
    EXPECT_EQ(badge_picture(waiting), kCancel);
    for (int status : {ZV_UPLOAD_STATUS_PAUSED, ZV_UPLOAD_STATUS_WAITING, ZV_UPLOAD_STATUS_PAUSED,
                       ZV_UPLOAD_STATUS_UPLOADING}) {
        job->status = status;
        zv_upload_view_update_badge_button(job);
        EXPECT_EQ(badge_picture(job), status == ZV_UPLOAD_STATUS_PAUSED ? kUpload : kCancel);
    }
    elm_genlist_item_selected_set(job->gen_item, EINA_TRUE);
    EXPECT_FALSE(elm_genlist_item_selected_get(job->gen_item));
    // A row class called without a job or a part answers nothing.
    auto answers_nothing = [&](Elm_Object_Item *item) {
        const Elm_Genlist_Item_Class *itc = elm_genlist_item_item_class_get(item);
        Evas_Object *list = elm_object_item_widget_get(item);
        for (const char *part : {"elm.text.main", "elm.icon.1"}) {
            EXPECT_EQ(itc->func.text_get(nullptr, list, part), nullptr);
            EXPECT_EQ(itc->func.content_get(nullptr, list, part), nullptr);
        }
        EXPECT_EQ(itc->func.text_get(job, list, nullptr), nullptr);
        EXPECT_EQ(itc->func.content_get(job, list, nullptr), nullptr);
    };
    answers_nothing(job->gen_item);

    int w = 0, h = 0;
    elm_win_screen_size_get(ad->win, nullptr, nullptr, &w, &h);
    for (int rotation : {0, 90}) {
        elm_win_rotation_set(ad->win, rotation);
        open_menu();
        EXPECT_EQ(elm_ctxpopup_first_item_get(ad->pCtxPopup),
                  elm_ctxpopup_last_item_get(ad->pCtxPopup));
        int x = -1, y = -1;
        evas_object_geometry_get(ad->pCtxPopup, &x, &y, nullptr, nullptr);
        EXPECT_EQ(x, rotation ? h / 2 : w / 2) << rotation;
        EXPECT_EQ(y, rotation ? w : h) << rotation;
        feed_key(rotation ? "Escape" : "F2");
        ASSERT_TRUE(wait_for([&] { return ad->pCtxPopup == nullptr; }));
    }
    Ecore_Event_Key ev = {};
    ev.keyname = "XF86Back";
    g_log.mark();
    EXPECT_EQ(zv_upload_view_event_key_down_cb(ad, ECORE_EVENT_KEY_DOWN, &ev), ECORE_CALLBACK_DONE);
    for (AppData *data : {ad, (AppData *)nullptr})
        EXPECT_EQ(zv_upload_view_event_key_up_cb(data, ECORE_EVENT_KEY_UP, &ev),
                  ECORE_CALLBACK_DONE);
    EXPECT_TRUE(g_log.logged("HW EVENT KEY UP:XF86Back"));
    EXPECT_EQ(g_calls, (Calls{"pause:1", "resume:1"}));

    job->status = ZV_UPLOAD_STATUS_PAUSED;
    zv_upload_list_complete_item(job);
    EXPECT_EQ(style_of(job->gen_item), kComplete);
    EXPECT_TRUE(wait_for([&] { return sub_text(job->gen_item).empty(); }));
    answers_nothing(job->gen_item);
}

// Edit mode as a user goes through it: Cancel and the back key leave it without deleting;
// the selection counts in the title and enables Done; select-all follows the rows and sets
// them all; a job completing meanwhile switches its rows in place in both lists. Done
// deletes completed jobs at once; a selection with an unfinished job asks first (back
// answers Cancel), and deleting a waiting or running job refreshes the ongoing notification,
// which goes with the last job; the placeholder follows, where the more key opens no menu and
// the back key leaves. At scale 1 every control met on the way is a touch target of at least
// 48 x 48 px, and the titles are at least as large as a row's title.
TEST_F(ViewTest, EditModeSelectsAndDeletes)
{
    std::string ongoing = tmp.file("run/notifications/zuvo_ongoing_noti.ini");
    ASSERT_EQ(zv_ext_db_open(), 1);
    ASSERT_EQ(zuvo_ext_noti_ongoing_noti_create("ZuVo", "Uploading", 0, 2, 0.1), 1);
    UploadItem *a = add_job(1, ZV_UPLOAD_STATUS_COMPLETED);
    UploadItem *b = add_job(2, ZV_UPLOAD_STATUS_PAUSED);
    UploadItem *c = add_job(3, ZV_UPLOAD_STATUS_UPLOADING);
    UploadItem *d = add_job(4, ZV_UPLOAD_STATUS_WAITING);
    ad->completed_count = 1;
    ad->total_count = 3;
    show_list();
    ASSERT_EQ(elm_config_scale_get(), 1.0);
    auto touch_target = [](Evas_Object *obj) {
        int w = 0, h = 0;
        EXPECT_TRUE(wait_for([&] {
            evas_object_geometry_get(obj, nullptr, nullptr, &w, &h);
            return w >= 48 && h >= 48;
        })) << w
            << " x " << h;
    };
    touch_target(b->badge);
    double row_size = font_size(b->title);
    EXPECT_GT(row_size, 0);
    EXPECT_GE(font_size("Uploads"), row_size);

    for (bool back_key : {false, true}) {
        enter_edit_mode();
        tap(a);
        EXPECT_TRUE(elm_check_state_get(a->check));
        back_key ? feed_key("Escape") : click(button(false)); // Escape leaves edit mode only
        EXPECT_FALSE(a->checked);
        ASSERT_TRUE(edit_page_gone()) << back_key;
    }

    open_menu();
    touch_target(evas_object_smart_parent_get(find_text("Remove")));
    enter_edit_mode(true);
    EXPECT_EQ(ad->pCtxPopup, nullptr);
    EXPECT_EQ(edit_state(), "Select uploads, off, 0000");
    EXPECT_EQ(str(elm_object_text_get(button(true))), "Done");
    EXPECT_EQ(str(elm_object_text_get(button(false))), "Cancel");
    EXPECT_EQ(str(elm_object_part_text_get(select_all_bar(), "elm.text.main")), "Select all");
    for (Evas_Object *obj : {button(false), button(true), a->check,
                             elm_object_part_content_get(select_all_bar(), "elm.icon")})
        touch_target(obj);
    tap(a);
    tap(c);
    EXPECT_EQ(edit_state(), "2 selected, on, 1010");
    tap(b);
    tap(d);
    EXPECT_EQ(edit_state(), "4 selected, on, 1111, all");
    for (UploadItem *job : {a, b, c, d})
        tap(job);
    EXPECT_EQ(edit_state(), "Select uploads, off, 0000");
    press_select_all();
    EXPECT_EQ(edit_state(), "4 selected, on, 1111, all");
    press_select_all();
    EXPECT_EQ(edit_state(), "Select uploads, off, 0000");

    Evas_Object *genlist = ad->pGenlist;
    c->status = ZV_UPLOAD_STATUS_COMPLETED;
    zv_upload_list_complete_item(c);
    EXPECT_EQ(ad->pGenlist, genlist);
    EXPECT_EQ(style_of(c->gen_item), kComplete);
    EXPECT_EQ(style_of(c->edit_gen_item), kComplete);
    EXPECT_EQ(style_of(b->edit_gen_item), kProgress);
    EXPECT_TRUE(wait_for([&] { return sub_text(c->edit_gen_item) == "clip.mp4"; }));

    tap(a);
    click(button(true));
    EXPECT_EQ(g_calls, (Calls{"delete_db:1"}));
    EXPECT_EQ(find_popup(), nullptr);
    ASSERT_TRUE(edit_page_gone());

    enter_edit_mode();
    tap(b);
    tap(c);
    click(button(true));
    Evas_Object *popup = find_popup();
    ASSERT_NE(popup, nullptr);
    EXPECT_EQ(str(elm_object_part_text_get(popup, "title,text")), "Stop uploads");
    EXPECT_EQ(str(elm_object_text_get(popup)),
              "The upload will stop, but the file will not be deleted.");
    touch_target(elm_object_part_content_get(popup, "button1"));
    feed_key("Escape");
    EXPECT_EQ(find_popup(), nullptr);
    EXPECT_EQ(edit_state(), "2 selected, on, 110");
    EXPECT_GE(font_size("2 selected"), row_size);
    click(button(true));
    ASSERT_NE(popup = find_popup(), nullptr);
    Evas_Object *stop = elm_object_part_content_get(popup, "button2");
    EXPECT_EQ(str(elm_object_text_get(stop)), "Stop");
    touch_target(stop);
    click(stop);
    EXPECT_EQ(g_calls, (Calls{"delete_db:1", "delete_db:2", "delete_db:3"}));
    EXPECT_EQ(access(ongoing.c_str(), F_OK), 0); // paused and completed jobs are not counted
    ASSERT_TRUE(edit_page_gone());

    enter_edit_mode();
    press_select_all();
    click(button(true));
    click(elm_object_part_content_get(find_popup(), "button2"));
    EXPECT_EQ(ad->job_list, nullptr);
    EXPECT_EQ(ad->total_count, 0);
    EXPECT_NE(access(ongoing.c_str(), F_OK), 0);
    EXPECT_EQ(ad->pGenlist, nullptr);
    ASSERT_NE(ad->pNoContent, nullptr);
    EXPECT_EQ(elm_object_part_content_get(ad->pListLayout, "elm.swallow.content"), ad->pNoContent);
    Evas_Object *inner = elm_object_part_content_get(ad->pNoContent, "contents");
    EXPECT_EQ(str(elm_object_part_text_get(inner, "elm.text")), "No uploads");
    EXPECT_EQ(str(elm_object_part_text_get(inner, "elm.help.text")),
              "After you upload items, they will be shown here.");
    ASSERT_TRUE(edit_page_gone());
    feed_key("Menu");
    EXPECT_EQ(ad->pCtxPopup, nullptr);
    feed_key("Escape");
    EXPECT_EQ(g_calls,
              (Calls{"delete_db:1", "delete_db:2", "delete_db:3", "delete_db:4", "exit:0"}));
}

TEST_F(ViewTest, MissingThemeFilesKeepTheDefaultLook)
{
    std::string saved = str(getenv("ZV_RES_DIR"));
    setenv("ZV_RES_DIR", (tmp.path() + "/").c_str(), 1);
    UploadItem *job = add_job(1, ZV_UPLOAD_STATUS_PAUSED);
    add_job(2, ZV_UPLOAD_STATUS_COMPLETED);
    g_log.mark();
    show_list();
    click(job->badge);
    setenv("ZV_RES_DIR", saved.c_str(), 1);
    EXPECT_EQ(g_calls, (Calls{"resume:1"}));
    EXPECT_TRUE(g_log.logged("elm_layout_file_set() is failed."));
}

} // namespace
