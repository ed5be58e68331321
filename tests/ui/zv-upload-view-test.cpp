// The upload list view over jobs in every status, in the service's own window stack, driven
// the way a user drives it: badge clicks, row taps, the select-all bar, the title and question
// buttons, and the hardware keys as key events. The controller is replaced by operations that
// record their calls. Texts are the English catalogue's, as a user reads them.
#include <Ecore_Input.h>
#include <app_i18n.h>
#include <gtest/gtest.h>

#include "zv-ext-noti.h"
#include "zv-ext-util.h"
#include "zv-test-util.h"

// The window stack is built by the entry's own (file-local) function: the test compiles the
// file in.
#define main zv_upload_main_entry
#include "../../upload-svc/src/zv-upload-main.cpp"
#undef main

using zv_test::wait_for;

namespace
{

zv_test::LogFile g_log;          // before anything logs
AppData g_ad, *const ad = &g_ad; // stored once as the process context
std::string g_calls;             // the controller's operations as called, " op:historyid" each
bool g_transition_done = false;  // the naviframe finished a push or pop
const std::string kUpload = "zuvo_icon_badge_upload.png", kCancel = "core_button_cancel.png";

auto str = [](const char *s) { return std::string(s ? s : ""); };
auto click = [](Evas_Object *obj) { evas_object_smart_callback_call(obj, "clicked", nullptr); };
auto record = [](const char *op, const UploadItem *job) {
    g_calls += op + std::to_string(job->historyid);
};
auto transition_done = [](void *, Evas_Object *, void *) { g_transition_done = true; };

// Every job has its row realized in the list.
bool all_realized(Evas_Object *genlist)
{
    Eina_List *items = elm_genlist_realized_items_get(genlist);
    size_t n = eina_list_count(items);
    eina_list_free(items);
    return n == g_list_length(ad->job_list);
}

// A row as drawn: its style, its file name line and whether it has a thumbnail.
std::string row(Elm_Object_Item *item)
{
    Evas_Object *thumbnail = elm_object_item_part_content_get(item, "elm.icon.1");
    return str(elm_genlist_item_item_class_get(item)->item_style) + " " +
           str(elm_object_item_part_text_get(item, "elm.text.sub.left.bottom")) +
           (elm_object_part_content_get(thumbnail, "elm.thumbnail.icon") ? " thumbnail" : "");
}

std::string badge_picture(const UploadItem *job)
{
    const char *key = nullptr;
    elm_image_file_get(elm_object_part_content_get(job->badge, "elm.swallow.content"), nullptr,
                       &key);
    return str(key);
}

// A key as a desktop keyboard delivers it: the window's canvas gets it first (the toolkit's
// own key bindings), then the platform's key watcher (the back and more callbacks).
void feed_key(const char *keyname)
{
    Evas *evas = evas_object_evas_get(ad->win);
    evas_event_feed_key_down(evas, keyname, keyname, nullptr, nullptr, 0, nullptr);
    evas_event_feed_key_up(evas, keyname, keyname, nullptr, nullptr, 0, nullptr);
    auto *ev = static_cast<Ecore_Event_Key *>(calloc(1, sizeof(Ecore_Event_Key)));
    ev->keyname = ev->key = keyname;
    // No window of this process: the event is for the key watcher alone.
    ev->window = ev->event_window = ev->root_window = (Ecore_Window)-1;
    ecore_event_add(ECORE_EVENT_KEY_DOWN, ev, nullptr, nullptr); // freed with free()
    for (int i = 0; i < 3; i++)
        ecore_main_loop_iterate();
}

// The first object on the window's canvas (at or below obj when given) that is a visible
// widget of the type what, or a text object that shows what.
Evas_Object *find(const std::string &what, Evas_Object *obj = nullptr)
{
    if (obj && (elm_object_widget_check(obj)
                    ? evas_object_visible_get(obj) && str(elm_object_widget_type_get(obj)) == what
                    : str(evas_object_type_get(obj)) == "text" &&
                          str(evas_object_text_text_get(obj)) == what))
        return obj;
    Evas_Object *found = nullptr;
    if (Eina_Iterator *it = obj ? evas_object_smart_iterator_new(obj) : nullptr) {
        void *child;
        EINA_ITERATOR_FOREACH(it, child)
        found = found ? found : find(what, static_cast<Evas_Object *>(child));
        eina_iterator_free(it);
    }
    for (Evas_Object *o = obj ? nullptr : evas_object_bottom_get(evas_object_evas_get(ad->win));
         o && !found; o = evas_object_above_get(o))
        found = find(what, o);
    return found;
}

// The size a drawn text is drawn at: its font size times the scale its theme file gives it.
double font_size(const std::string &text)
{
    Evas_Object *obj = find(text);
    int size = 0;
    evas_object_text_font_get(obj, nullptr, &size); // none found: the toolkit logs, size stays 0
    return size * evas_object_scale_get(obj);
}

// At scale 1 a control is a touch target of at least 48 x 48 px.
void touch_target(Evas_Object *obj)
{
    int w = 0, h = 0;
    EXPECT_TRUE(wait_for([&] {
        evas_object_geometry_get(obj, nullptr, nullptr, &w, &h);
        return w >= 48 && h >= 48;
    })) << w
        << " x " << h;
}

// Builds the view and waits until every row is realized.
void show_list()
{
    zv_upload_view_init(ad);
    ASSERT_TRUE(wait_for([] { return all_realized(ad->pGenlist); }));
}

// The top page: its title, its title buttons (Done or Cancel) and its select-all bar.
auto title = [] {
    return str(
        elm_object_item_part_text_get(elm_naviframe_top_item_get(ad->navi), "elm.text.title"));
};
auto button = [](bool done) {
    return elm_object_item_part_content_get(elm_naviframe_top_item_get(ad->navi),
                                            done ? "title_right_btn" : "title_left_btn");
};
auto select_all_bar = [] {
    return elm_object_part_content_get(ad->pEditLayout, "elm.swallow.content.select.all");
};

// The edit page as a user reads it: the title, Done on or off, the rows' check boxes, the
// select-all check box, the stop-uploads question and the more menu.
std::string edit_state()
{
    std::string text = title() + (elm_object_disabled_get(button(true)) ? ", off, " : ", on, ");
    for (GList *l = ad->job_list; l; l = l->next)
        text += elm_check_state_get(static_cast<UploadItem *>(l->data)->check) ? '1' : '0';
    if (elm_check_state_get(elm_object_part_content_get(select_all_bar(), "elm.icon")))
        text += ", all";
    return text + (find("Elm_Popup") ? ", asking" : "") + (ad->pCtxPopup ? ", menu" : "");
}

// More key; returns once the menu is laid out (a dismissal before that is lost).
void open_menu()
{
    feed_key("F2");
    ASSERT_TRUE(wait_for([] {
        return elm_ctxpopup_direction_get(ad->pCtxPopup) != ELM_CTXPOPUP_DIRECTION_UNKNOWN;
    }));
}

// More key, then the menu's single entry; returns once the edit page is in place (the
// naviframe refuses to pop a page while it is still sliding in).
void enter_edit_mode()
{
    open_menu();
    g_transition_done = false;
    elm_ctxpopup_item_selected_set(elm_ctxpopup_first_item_get(ad->pCtxPopup), EINA_TRUE);
    ASSERT_TRUE(wait_for([] { return all_realized(ad->pEditGenlist) && g_transition_done; }));
}

// Waits until the edit page is popped and the list is back in place.
bool edit_page_gone()
{
    g_transition_done = false;
    return wait_for([] { return !ad->pEditLayout && g_transition_done; }) && title() == "Uploads";
}

// Taps the rows of the jobs in turn: the edit page afterwards.
std::string tap(std::initializer_list<UploadItem *> jobs)
{
    for (UploadItem *job : jobs)
        elm_genlist_item_selected_set(job->edit_gen_item, EINA_TRUE);
    return edit_state();
}

// A press on the select-all bar: the edit page afterwards.
std::string press_select_all()
{
    int x, y, w, h;
    EXPECT_TRUE(wait_for([&] {
        evas_object_geometry_get(select_all_bar(), &x, &y, &w, &h);
        return w > 0 && h > 0 && x == 0;
    }));
    Evas *evas = evas_object_evas_get(ad->win);
    evas_event_feed_mouse_move(evas, x + w / 3, y + h / 2, 0, nullptr);
    evas_event_feed_mouse_down(evas, 1, EVAS_BUTTON_NONE, 0, nullptr);
    evas_event_feed_mouse_up(evas, 1, EVAS_BUTTON_NONE, 0, nullptr);
    return edit_state();
}

// One session over a completed (a), a paused (b), an uploading (c, with a thumbnail wider
// than tall, as video frames are) and a waiting job (d).
//
// Without the theme files the list keeps the toolkit's look and its badges work; it is then
// rebuilt with them. The badge pauses a running job and resumes a paused one, a waiting job's
// badge does nothing, and a redraw shows the picture of the job's status; a tap on a row only
// unselects it. The one-entry menu hangs from the bottom middle whichever the rotation, and
// the more key and the back key close it without reaching the list; the raw key handlers only
// log.
//
// Edit mode: Cancel and the back key leave it without deleting; the selection counts in the
// title and enables Done; select-all follows the rows and sets them all; a job completing
// meanwhile switches its rows in place in both lists (a row redrawn as completed for a job
// that is not shows no file name), a thumbnail drawn where the job has one; a row class
// called without a job or a part answers nothing. Done deletes completed jobs at once; a
// selection with an unfinished job asks first (back answers Cancel), and deleting a waiting
// or running job refreshes the ongoing notification, which goes with the last job; the
// placeholder follows, where the more key opens no menu and the back key leaves. At scale 1
// every control met on the way is a touch target of at least 48 x 48 px, and the list's title
// is at least as large as a row's title.
TEST(ViewTest, ListBadgesMenuAndEditMode)
{
    zv_test::TempDir tmp;
    const std::string res_dir = str(getenv("ZV_RES_DIR"));
    zv_ext_util_set_appdata(ad);
    i18n_bind_text_domain();
    ASSERT_TRUE(create_base_gui(ad));
    evas_object_smart_callback_add(ad->navi, "transition,finished", transition_done, nullptr);
    ad->pause_upload = [](AppData *, UploadItem *job) { record(" pause:", job); };
    ad->resume_upload = [](AppData *, UploadItem *job) { record(" resume:", job); };
    ad->exit = [](AppData *) { g_calls += " exit"; };
    // As the controller does: the rows go with the job.
    ad->delete_item = [](UploadItem *job, bool from_db) {
        record(from_db ? " delete_db:" : " delete:", job);
        evas_object_del(job->check);
        for (Elm_Object_Item *item : {job->gen_item, job->edit_gen_item})
            elm_object_item_del(item); // a row the job lacks: the toolkit only logs
    };
    // Static: rows made for them outlive the test when it stops early.
    static std::string thumb = zv_test::source_path("res/edje/images/zv_nocontents_uploads.png");
    const int statuses[] = {ZV_UPLOAD_STATUS_COMPLETED, ZV_UPLOAD_STATUS_PAUSED,
                            ZV_UPLOAD_STATUS_UPLOADING, ZV_UPLOAD_STATUS_WAITING};
    static UploadItem jobs[4] = {};
    for (int i = 0; i < 4; i++) {
        jobs[i].historyid = i + 1;
        jobs[i].status = statuses[i];
        jobs[i].title = const_cast<char *>("Sunset");
        jobs[i].display_name = const_cast<char *>("clip.mp4");
        ad->job_list = g_list_append(ad->job_list, &jobs[i]);
    }
    UploadItem *a = &jobs[0], *b = &jobs[1], *c = &jobs[2], *d = &jobs[3];
    c->thumb_path = const_cast<char *>(thumb.c_str());
    ASSERT_EQ(zv_ext_db_open(), 1);
    ASSERT_EQ(zuvo_ext_noti_ongoing_noti_create("ZuVo", "Uploading", 0, 2, 0.1), 1);
    const std::string ongoing = tmp.file("run/notifications/zuvo_ongoing_noti.ini");

    setenv("ZV_RES_DIR", (tmp.path() + "/").c_str(), 1);
    show_list();
    click(c->badge);
    setenv("ZV_RES_DIR", res_dir.c_str(), 1);
    EXPECT_TRUE(g_log.logged("elm_layout_file_set() is failed."));
    show_list(); // rebuilt, as at a launch request
    ASSERT_EQ(elm_config_scale_get(), 1.0);
    touch_target(b->badge);
    const double row_size = font_size("Sunset");
    EXPECT_TRUE(row_size > 0 && font_size("Uploads") >= row_size) << row_size;

    click(c->badge);
    EXPECT_EQ(badge_picture(c), kUpload);
    c->status = ZV_UPLOAD_STATUS_PAUSED; // what the pause operation does
    click(c->badge);
    EXPECT_EQ(badge_picture(c), kCancel);
    click(d->badge);
    EXPECT_EQ(badge_picture(d), kCancel);
    for (int status : {ZV_UPLOAD_STATUS_PAUSED, ZV_UPLOAD_STATUS_WAITING, ZV_UPLOAD_STATUS_PAUSED,
                       ZV_UPLOAD_STATUS_UPLOADING}) {
        c->status = status;
        zv_upload_view_update_badge_button(c);
        EXPECT_EQ(badge_picture(c), status == ZV_UPLOAD_STATUS_PAUSED ? kUpload : kCancel);
    }
    elm_genlist_item_selected_set(c->gen_item, EINA_TRUE);
    EXPECT_FALSE(elm_genlist_item_selected_get(c->gen_item));

    int w = 0, h = 0;
    elm_win_screen_size_get(ad->win, nullptr, nullptr, &w, &h);
    for (int rotation : {90, 0}) {
        elm_win_rotation_set(ad->win, rotation);
        open_menu();
        EXPECT_EQ(elm_ctxpopup_first_item_get(ad->pCtxPopup),
                  elm_ctxpopup_last_item_get(ad->pCtxPopup));
        touch_target(evas_object_smart_parent_get(find("Remove")));
        int x = -1, y = -1;
        evas_object_geometry_get(ad->pCtxPopup, &x, &y, nullptr, nullptr);
        EXPECT_EQ(x, rotation ? h / 2 : w / 2) << rotation;
        EXPECT_EQ(y, rotation ? w : h) << rotation;
        feed_key(rotation ? "Escape" : "F2");
        ASSERT_TRUE(wait_for([&] { return ad->pCtxPopup == nullptr; }));
    }
    Ecore_Event_Key ev = {};
    ev.keyname = "XF86Back";
    EXPECT_EQ(zv_upload_view_event_key_down_cb(ad, ECORE_EVENT_KEY_DOWN, &ev), ECORE_CALLBACK_DONE);
    for (AppData *data : {ad, (AppData *)nullptr})
        EXPECT_EQ(zv_upload_view_event_key_up_cb(data, 0, &ev), ECORE_CALLBACK_DONE);
    EXPECT_TRUE(g_log.logged("HW EVENT KEY UP:XF86Back"));

    for (bool back_key : {false, true}) {
        enter_edit_mode();
        EXPECT_EQ(tap({a}), "1 selected, on, 1000");
        back_key ? feed_key("Escape") : click(button(false)); // Escape leaves edit mode only
        ASSERT_TRUE(edit_page_gone()) << back_key;
    }
    enter_edit_mode();
    EXPECT_EQ(edit_state(), "Select uploads, off, 0000");
    for (const char *text : {"Cancel", "Done", "Select all"})
        touch_target(evas_object_smart_parent_get(find(text)));
    touch_target(a->check);
    EXPECT_EQ(tap({a, c}), "2 selected, on, 1010");
    EXPECT_EQ(tap({b, d}), "4 selected, on, 1111, all");
    EXPECT_EQ(tap({a, b, c, d}), "Select uploads, off, 0000");
    EXPECT_EQ(press_select_all(), "4 selected, on, 1111, all");
    EXPECT_EQ(press_select_all(), "Select uploads, off, 0000");

    Evas_Object *genlist = ad->pGenlist;
    c->status = ZV_UPLOAD_STATUS_COMPLETED;
    for (UploadItem *job : {c, d})
        zv_upload_list_complete_item(job);
    EXPECT_EQ(ad->pGenlist, genlist);
    // Both lists switch the rows in place: the hidden list's row is restyled, the edit list
    // shows its rows' texts, and a thumbnail where the job has one.
    auto rows = [&] {
        return str(elm_genlist_item_item_class_get(c->gen_item)->item_style) + "|" +
               row(c->edit_gen_item) + "|" + row(d->edit_gen_item) + "|" + row(b->edit_gen_item);
    };
    const std::string expected = "2line.top.custom|2line.top.custom clip.mp4 thumbnail|"
                                 "2line.top.custom |progress.main.custom clip.mp4";
    EXPECT_TRUE(wait_for([&] { return rows() == expected; })) << rows();
    // A row class called without a job or a part answers nothing: b's and d's are the two.
    for (Elm_Object_Item *item : {b->gen_item, d->gen_item}) {
        const Elm_Genlist_Item_Class *itc = elm_genlist_item_item_class_get(item);
        EXPECT_EQ(itc->func.text_get(nullptr, nullptr, "elm.text.main"), nullptr);
        EXPECT_EQ(itc->func.content_get(b, nullptr, nullptr), nullptr);
    }

    EXPECT_EQ(tap({a}), "1 selected, on, 1000");
    click(button(true)); // without a question
    ASSERT_TRUE(edit_page_gone());

    enter_edit_mode();
    EXPECT_EQ(tap({b, c}), "2 selected, on, 110");
    click(button(true));
    EXPECT_EQ(edit_state(), "2 selected, on, 110, asking");
    Evas_Object *popup = find("Elm_Popup");
    EXPECT_EQ(str(elm_object_part_text_get(popup, "title,text")), "Stop uploads");
    EXPECT_EQ(str(elm_object_text_get(popup)),
              "The upload will stop, but the file will not be deleted.");
    feed_key("Escape");
    EXPECT_EQ(edit_state(), "2 selected, on, 110");
    click(button(true));
    Evas_Object *stop = elm_object_part_content_get(find("Elm_Popup"), "button2");
    EXPECT_EQ(str(elm_object_text_get(stop)), "Stop");
    touch_target(stop);
    click(stop);
    EXPECT_EQ(access(ongoing.c_str(), F_OK), 0); // paused and completed jobs are not counted
    ASSERT_TRUE(edit_page_gone());

    enter_edit_mode();
    EXPECT_EQ(press_select_all(), "1 selected, on, 1, all");
    click(button(true));
    click(elm_object_part_content_get(find("Elm_Popup"), "button2"));
    EXPECT_NE(access(ongoing.c_str(), F_OK), 0);
    EXPECT_EQ(ad->pGenlist, nullptr);
    Evas_Object *inner = elm_object_part_content_get(
        elm_object_part_content_get(ad->pListLayout, "elm.swallow.content"), "contents");
    EXPECT_EQ(str(elm_object_part_text_get(inner, "elm.text")), "No uploads");
    EXPECT_EQ(str(elm_object_part_text_get(inner, "elm.help.text")),
              "After you upload items, they will be shown here.");
    ASSERT_TRUE(edit_page_gone());
    feed_key("Menu");
    EXPECT_EQ(ad->pCtxPopup, nullptr);
    feed_key("Escape");
    EXPECT_EQ(g_calls,
              " pause:3 pause:3 resume:3 delete_db:1 delete_db:2 delete_db:3 delete_db:4 exit");
}

} // namespace
