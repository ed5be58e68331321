// Upload list view: the list of jobs and its rows, the badge button of a row, the edit mode
// that removes jobs with its stop-uploads question, the more menu and the hardware keys.
// Rows read their UploadItem each time the list realizes them; the objects a row makes
// (badge, check box) are remembered in the job and forgotten again when they die.
// Thread safety: main loop only.
#include "zv-upload-view.h"

#include <Ecore_Input.h>
#include <app.h>
#include <app_i18n.h>
#include <efl_extension.h>
#include <stdlib.h>
#include <string.h>
#include <uxt.h>

#include <memory>
#include <string>

#include "zv-ext-db.h"
#include "zv-ext-util.h"
#include "zv-log.h"
#include "zv-upload-ctrl.h"

namespace
{

constexpr const char *SVC_EDJ = "zuvo-upload-svc.edj";
constexpr const char *THUMB_EDJ = "zuvo-upload-svc-thumbnail.edj";
constexpr const char *BADGE_UPLOAD_KEY = "zuvo_icon_badge_upload.png";
constexpr const char *BADGE_CANCEL_KEY = "core_button_cancel.png";
constexpr const char *BADGE_UPLOAD_COLOR = "AO005";
constexpr const char *BADGE_CANCEL_COLOR = "AO006";

constexpr const char *PROGRESS_STYLE = "progress.main.custom";
constexpr const char *COMPLETE_STYLE = "2line.top.custom";

constexpr const char *IDS_UPLOADS = "IDS_GALLERY_HEADER_UPLOADS";
constexpr const char *IDS_NO_UPLOADS = "IDS_MF_NPBODY_NO_UPLOADS";
constexpr const char *IDS_NO_UPLOADS_HELP =
    "IDS_GALLERY_BODY_AFTER_YOU_UPLOAD_ITEMS_THEY_WILL_BE_SHOWN_HERE";
constexpr const char *IDS_SELECT_UPLOADS = "IDS_GALLERY_HEADER_SELECT_UPLOADS_ABB";
constexpr const char *IDS_SELECTED = "IDS_VIDEO_HEADER_PD_SELECTED";
constexpr const char *IDS_SELECT_ALL = "IDS_COM_BODY_SELECT_ALL";
constexpr const char *IDS_CANCEL_ABB = "IDS_TPLATFORM_ACBUTTON_CANCEL_ABB";
constexpr const char *IDS_DONE_ABB = "IDS_TPLATFORM_ACBUTTON_DONE_ABB";
constexpr const char *IDS_STOP_TITLE = "IDS_GALLERY_HEADER_STOP_UPLOADS_ABB2";
constexpr const char *IDS_STOP_TEXT =
    "IDS_GALLERY_POP_THE_UPLOAD_WILL_STOP_BUT_THE_FILE_WILL_NOT_BE_DELETED";
constexpr const char *IDS_CANCEL = "IDS_VIDEO_BUTTON_CANCEL";
constexpr const char *IDS_STOP = "IDS_GALLERY_BUTTON_STOP_ABB2";
constexpr const char *IDS_REMOVE = "IDS_GALLERY_OPT_REMOVE";

constexpr const char *TEXT_DOMAIN = "zuvo";
constexpr const char *TITLE_DOMAIN = "zuvo-upload-svc";

// State shared by the list, the badge, the edit mode and the menu.
struct ViewState {
    Elm_Object_Item *list_navi_item = nullptr;
    bool edit_mode = false;
    Elm_Object_Item *edit_navi_item = nullptr;
    Evas_Object *done_btn = nullptr;
    Evas_Object *select_all_check = nullptr;
    bool select_all_state = false;
    // Set while the view itself pops pages. Pops it did not ask for (the toolkit's own
    // Escape binding on a desktop keyboard) are refused: the back key reaches the view
    // through the extension's back callback, so each page is left once and in order.
    bool own_pop = false;
    // Long-lived classes that switch a row to the completed look in place.
    Elm_Genlist_Item_Class complete_itc = {};
    Elm_Genlist_Item_Class complete_edit_itc = {};
};

ViewState view;

struct GFree {
    void operator()(void *p) const { g_free(p); }
};
using GCharPtr = std::unique_ptr<char, GFree>;

struct CFree {
    void operator()(void *p) const { free(p); }
};

struct ItcFree {
    void operator()(Elm_Genlist_Item_Class *itc) const { elm_genlist_item_class_free(itc); }
};
using ItcPtr = std::unique_ptr<Elm_Genlist_Item_Class, ItcFree>;

const char *tr(const char *msgid)
{
    return i18n_get_text(msgid);
}

// "<resource path>edje/<name>", or "" without a resource path.
std::string theme_path(const char *name)
{
    std::unique_ptr<char, CFree> res(app_get_resource_path());
    if (!res)
        return std::string();
    GCharPtr path(g_strdup_printf("%s%s%s", res.get(), "edje/", name));
    return path.get();
}

const char *file_or_null(const std::string &file)
{
    return file.empty() ? nullptr : file.c_str();
}

// Loads a group of one of the view's theme files into the layout; a missing file or group
// leaves the layout empty and is logged.
bool layout_file_set(Evas_Object *layout, const char *edj, const char *group)
{
    std::string file = theme_path(edj);
    if (elm_layout_file_set(layout, file_or_null(file), group))
        return true;
    ZV_LOGE("elm_layout_file_set() is failed. file: %s, group: %s", file.c_str(), group);
    return false;
}

bool is_active_status(int status)
{
    return status == ZV_UPLOAD_STATUS_WAITING || status == ZV_UPLOAD_STATUS_PAUSED ||
           status == ZV_UPLOAD_STATUS_UPLOADING;
}

// Loads a badge picture (upload when upload is true, else cancel) into img and tints it
// with its colour code. The pictures are white: without a colour table they get the
// table's usual colours, so that they stay visible on the light rows.
void set_badge_picture(Evas_Object *img, bool upload)
{
    std::string file = theme_path(SVC_EDJ);
    const char *key = upload ? BADGE_UPLOAD_KEY : BADGE_CANCEL_KEY;
    if (!elm_image_file_set(img, file_or_null(file), key))
        ZV_LOGE("elm_image_file_set() is failed. file: %s, key: %s", file.c_str(), key);
    if (uxt_theme_object_set_color(img, upload ? BADGE_UPLOAD_COLOR : BADGE_CANCEL_COLOR) !=
        UXT_ERROR_NONE) {
        if (upload)
            evas_object_color_set(img, 33, 150, 243, 255);
        else
            evas_object_color_set(img, 117, 117, 117, 255);
    }
}

// Shows the upload or the cancel picture in a badge button, in the image the button already
// shows when it has one: a redraw makes no new object.
void show_badge_picture(Evas_Object *badge, bool upload)
{
    Evas_Object *img = elm_object_part_content_get(badge, "elm.swallow.content");
    if (!img) {
        img = elm_image_add(badge);
        elm_object_part_content_set(badge, "elm.swallow.content", img);
    }
    set_badge_picture(img, upload);
}

// A row's badge, badge layout or check box is going away (the row was unrealized, restyled
// or deleted): the jobs forget it.
void row_object_del_cb(void *data, Evas *, Evas_Object *obj, void *)
{
    auto *ad = static_cast<AppData *>(data);
    for (GList *l = ad->job_list; l; l = l->next) {
        auto *job = static_cast<UploadItem *>(l->data);
        if (!job)
            continue;
        if (job->badge == obj)
            job->badge = nullptr;
        if (job->badge_layout == obj)
            job->badge_layout = nullptr;
        if (job->check == obj)
            job->check = nullptr;
    }
}

void watch_row_object(Evas_Object *obj)
{
    AppData *ad = zv_ext_util_get_appdata();
    if (ad && obj)
        evas_object_event_callback_add(obj, EVAS_CALLBACK_DEL, row_object_del_cb, ad);
}

// The upload list or the edit list is going away with its rows: the jobs forget their rows
// of that list and AppData forgets the list.
void genlist_del_cb(void *data, Evas *, Evas_Object *obj, void *)
{
    auto *ad = static_cast<AppData *>(data);
    for (GList *l = ad->job_list; l; l = l->next) {
        auto *job = static_cast<UploadItem *>(l->data);
        if (!job)
            continue;
        if (job->gen_item && elm_object_item_widget_get(job->gen_item) == obj)
            job->gen_item = nullptr;
        if (job->edit_gen_item && elm_object_item_widget_get(job->edit_gen_item) == obj)
            job->edit_gen_item = nullptr;
    }
    if (ad->pGenlist == obj)
        ad->pGenlist = nullptr;
    if (ad->pEditGenlist == obj)
        ad->pEditGenlist = nullptr;
}

void nocontent_del_cb(void *data, Evas *, Evas_Object *obj, void *)
{
    auto *ad = static_cast<AppData *>(data);
    if (ad->pNoContent == obj)
        ad->pNoContent = nullptr;
}

// The title buttons go into the item style's "title_left_btn" and "title_right_btn"; a
// naviframe theme without them gets the buttons in its own title button parts instead.
void set_title_button(Elm_Object_Item *item, const char *part, const char *stock_part,
                      Evas_Object *btn)
{
    elm_object_item_part_content_set(item, part, btn);
    if (elm_object_item_part_content_get(item, part) != btn)
        elm_object_item_part_content_set(item, stock_part, btn);
}

Evas_Object *unset_title_button(Elm_Object_Item *item, const char *part, const char *stock_part)
{
    Evas_Object *btn = elm_object_item_part_content_unset(item, part);
    if (!btn)
        btn = elm_object_item_part_content_unset(item, stock_part);
    return btn;
}

// The edit title for a selection count; with set_done the Done button is enabled exactly
// while the count is not 0.
void update_edit_title(int count, bool set_done = true)
{
    GCharPtr text;
    if (set_done && view.done_btn)
        elm_object_disabled_set(view.done_btn, count == 0 ? EINA_TRUE : EINA_FALSE);
    if (count == 0) {
        text.reset(g_strdup(tr(IDS_SELECT_UPLOADS)));
    } else {
        const char *fmt = i18n_get_text(tr(IDS_SELECTED));
        if (!fmt || !zv_ext_util_is_count_format(fmt)) {
            ZV_LOGE("bad selected format: %s", fmt ? fmt : "(null)");
            fmt = "%d";
        }
        text.reset(g_strdup_printf(fmt, count));
    }
    if (view.edit_navi_item)
        elm_object_item_domain_translatable_part_text_set(view.edit_navi_item, "elm.text.title",
                                                          TITLE_DOMAIN, text.get());
}

void pop_page(Evas_Object *navi)
{
    view.own_pop = true;
    elm_naviframe_item_pop(navi);
    view.own_pop = false;
}

void menu_dismiss_cb(void *, Evas_Object *obj, void *)
{
    elm_ctxpopup_dismiss(obj);
}

void delete_menu(AppData *ad)
{
    if (ad->pCtxPopup) {
        evas_object_del(ad->pCtxPopup);
        ad->pCtxPopup = nullptr;
    }
}

// The job of a row callback's call for the callback func: null data logs "handle is NULL", a
// null part "part is NULL".
UploadItem *row_job(void *data, const char *part, const char *func)
{
    if (!data) {
        ZV_LOGE_AS(func, "handle is NULL");
        return nullptr;
    }
    if (!part) {
        ZV_LOGE_AS(func, "part is NULL");
        return nullptr;
    }
    return static_cast<UploadItem *>(data);
}

} // namespace

// ---- List rows ----

static char *__zv_upload_list_get_item_text(void *data, Evas_Object *, const char *part)
{
    UploadItem *job = row_job(data, part, __func__);
    if (!job)
        return nullptr;
    if (!strcmp(part, "elm.text.main") && job->title)
        return strdup(job->title);
    if (!strcmp(part, "elm.text.sub.left.bottom") && job->display_name)
        return strdup(job->display_name);
    return nullptr;
}

static char *__zv_upload_list_get_complete_item_text(void *data, Evas_Object *, const char *part)
{
    UploadItem *job = row_job(data, part, __func__);
    if (!job)
        return nullptr;
    if (!strcmp(part, "elm.text.main.left.top") && job->title)
        return strdup(job->title);
    if (!strcmp(part, "elm.text.sub.left.bottom") && job->status == ZV_UPLOAD_STATUS_COMPLETED &&
        job->display_name)
        return strdup(job->display_name);
    return nullptr;
}

static Evas_Object *__zv_upload_util_create_preload_image(Evas_Object *parent, const char *path)
{
    if (!parent || !path) {
        ZV_LOGE("Invalid parent");
        return nullptr;
    }
    Evas_Object *image = elm_image_add(parent);
    elm_image_preload_disabled_set(image, EINA_FALSE);
    elm_image_smooth_set(image, EINA_FALSE);
    if (!elm_image_file_set(image, path, nullptr))
        ZV_LOGE("elm_image_file_set() is failed. file: %s", path);
    int w = 0, h = 0;
    elm_image_object_size_get(image, &w, &h);
    if (w > h)
        elm_image_aspect_fixed_set(image, EINA_FALSE);
    return image;
}

// Thumbnail frame of a row. With report_failure (the completed kinds) a missing layout or
// image gives no thumbnail at all; the progress kinds keep the frame with whatever image
// they got.
static Evas_Object *create_thumbnail(Evas_Object *parent, const UploadItem *job,
                                     bool report_failure, bool edit)
{
    Evas_Object *layout = elm_layout_add(parent);
    if (!layout) {
        if (report_failure) {
            if (edit)
                ZV_LOGE("It is failed to add new elm_layout.");
            else
                ZV_LOGE("It is failed to add new elm_layout");
        }
        return nullptr;
    }
    layout_file_set(layout, THUMB_EDJ, "listview.thumbnail.layout");
    Evas_Object *image = __zv_upload_util_create_preload_image(layout, job->thumb_path);
    if (!image && report_failure) {
        ZV_LOGE("It is failed to create preload_image.");
        evas_object_del(layout);
        return nullptr;
    }
    elm_object_part_content_set(layout, "elm.thumbnail.icon", image);
    if (image)
        evas_object_show(image);
    evas_object_show(layout);
    return layout;
}

static Evas_Object *create_progressbar(Evas_Object *parent, const UploadItem *job)
{
    Evas_Object *progress = elm_progressbar_add(parent);
    elm_object_style_set(progress, "list_progress_custom");
    elm_progressbar_horizontal_set(progress, EINA_TRUE);
    evas_object_size_hint_align_set(progress, EVAS_HINT_FILL, EVAS_HINT_FILL);
    evas_object_size_hint_weight_set(progress, EVAS_HINT_EXPAND, EVAS_HINT_EXPAND);
    elm_progressbar_value_set(progress, (double)job->percent / 100.0);
    elm_object_signal_emit(progress, "elm,units,show", "elm");
    evas_object_show(progress);
    return progress;
}

// ---- Badge ----

static void __zv_upload_item_badge_btn_clicked_cb(void *data, Evas_Object *obj, void *event_info)
{
    (void)obj;
    (void)event_info;
    ZV_LOGI("Badge button clicked.");
    auto *job = static_cast<UploadItem *>(data);
    if (!job) {
        ZV_LOGE("pUserData is NULL");
        return;
    }
    AppData *ad = zv_ext_util_get_appdata();
    if (!job->badge) {
        ZV_LOGE("Badge button is NULL.");
        return;
    }
    ZV_LOGI("item->status : %d", job->status);
    if (job->status == ZV_UPLOAD_STATUS_UPLOADING) {
        ZV_LOGI("current uploading state. do cancel and showed upload image ");
        show_badge_picture(job->badge, true);
        if (ad && ad->pause_upload)
            ad->pause_upload(ad, job);
        else
            ZV_LOGE("pause_upload is NULL");
    } else if (job->status == ZV_UPLOAD_STATUS_PAUSED) {
        ZV_LOGI("current pause state. do upload again and showed cancel image ");
        show_badge_picture(job->badge, false);
        if (ad && ad->resume_upload)
            ad->resume_upload(ad, job);
        else
            ZV_LOGE("resume_upload is NULL");
    }
}

static Evas_Object *create_badge(Evas_Object *parent, UploadItem *job)
{
    Evas_Object *layout = elm_layout_add(parent);
    layout_file_set(layout, SVC_EDJ, "zv_upload_badge");
    job->badge_layout = layout;
    job->checked = false;
    elm_object_signal_emit(layout, "elm,event,repeat,disabled", "elm");
    evas_object_propagate_events_set(layout, EINA_FALSE);

    Evas_Object *button = uxt_button_add(layout);
    if (!button) {
        ZV_LOGE("button is null.");
        evas_object_del(layout);
        job->badge_layout = nullptr;
        return nullptr;
    }
    elm_object_style_set(button, "circle/badge/custom");
    evas_object_size_hint_weight_set(button, EVAS_HINT_EXPAND, EVAS_HINT_EXPAND);
    evas_object_size_hint_align_set(button, EVAS_HINT_FILL, EVAS_HINT_FILL);
    evas_object_smart_callback_add(button, "clicked", __zv_upload_item_badge_btn_clicked_cb, job);

    ZV_LOGI("item->status : %d", job->status);
    if (job->status == ZV_UPLOAD_STATUS_PAUSED) {
        ZV_LOGI("show upload image");
        show_badge_picture(button, true);
    } else {
        ZV_LOGI("show cancel image");
        show_badge_picture(button, false);
    }
    elm_object_part_content_set(layout, "elm.swallow.content", button);
    job->badge = button;
    watch_row_object(layout);
    watch_row_object(button);
    evas_object_show(layout);
    return layout;
}

void zv_upload_view_update_badge_button(UploadItem *job_item)
{
    ZV_LOGI("Update badge button >>> BEGIN");
    if (!job_item) {
        ZV_LOGE("userp is NULL");
        return;
    }
    if (!job_item->badge) {
        ZV_LOGE("Badge button is NULL.");
        return;
    }
    ZV_LOGI("item->status : %d", job_item->status);
    if (job_item->status == ZV_UPLOAD_STATUS_UPLOADING) {
        ZV_LOGI("current pause state. do upload again and showed cancel image ");
        show_badge_picture(job_item->badge, false);
    } else if (job_item->status == ZV_UPLOAD_STATUS_PAUSED) {
        ZV_LOGI("current uploading state. do cancel and showed upload image ");
        show_badge_picture(job_item->badge, true);
    } else {
        // A waiting job shows the cancel picture, as the row build does.
        ZV_LOGI("show cancel image");
        show_badge_picture(job_item->badge, false);
    }
}

// ---- Row content ----

// Selection box of an edit row: a check mirroring the job's checked flag; taps go through
// it to the row.
static Evas_Object *create_edit_check(Evas_Object *parent, UploadItem *job)
{
    Evas_Object *layout = elm_layout_add(parent);
    if (!layout) {
        ZV_LOGE("It is failed to add new elm_layout.");
        return nullptr;
    }
    if (!elm_layout_theme_set(layout, "layout", "list/C/type.2", "default"))
        ZV_LOGE("elm_layout_theme_set() is failed.");
    Evas_Object *check = elm_check_add(layout);
    if (!check) {
        ZV_LOGE("It is failed to add new elm_check.");
        evas_object_del(layout);
        return nullptr;
    }
    elm_object_style_set(check, "default");
    elm_check_state_set(check, job->checked ? EINA_TRUE : EINA_FALSE);
    job->check = check;
    elm_object_signal_emit(check, "elm,event,pass,enabled", "elm");
    evas_object_pass_events_set(check, EINA_TRUE);
    watch_row_object(check);
    elm_object_part_content_set(layout, "elm.swallow.content", check);
    evas_object_show(check);
    evas_object_show(layout);
    return layout;
}

// The contents of a row: the thumbnail; the check box of an edit row, or the badge of a row
// of the upload list; the progress bar of a job under way. The completed kinds report a
// thumbnail they could not make (see create_thumbnail).
static Evas_Object *row_content(Evas_Object *obj, UploadItem *job, const char *part,
                                bool complete, bool edit)
{
    if (!strcmp(part, "elm.icon.1"))
        return create_thumbnail(obj, job, complete, edit);
    if (edit && !strcmp(part, "elm.icon.2"))
        return create_edit_check(obj, job);
    if (!edit && !complete && !strcmp(part, "elm.icon.badge"))
        return create_badge(obj, job);
    if (!complete && !strcmp(part, "elm.icon") && is_active_status(job->status))
        return create_progressbar(obj, job);
    return nullptr;
}

static Evas_Object *__zv_upload_list_get_item_content(void *data, Evas_Object *obj,
                                                      const char *part)
{
    UploadItem *job = row_job(data, part, __func__);
    return job ? row_content(obj, job, part, false, false) : nullptr;
}

static Evas_Object *__zv_upload_list_get_complete_item_content(void *data, Evas_Object *obj,
                                                               const char *part)
{
    UploadItem *job = row_job(data, part, __func__);
    return job ? row_content(obj, job, part, true, false) : nullptr;
}

static Evas_Object *__zv_upload_list_get_item_content_of_edit_mode(void *data, Evas_Object *obj,
                                                                   const char *part)
{
    UploadItem *job = row_job(data, part, __func__);
    return job ? row_content(obj, job, part, false, true) : nullptr;
}

static Evas_Object *__zv_upload_list_get_complete_item_content_of_edit_mode(void *data,
                                                                            Evas_Object *obj,
                                                                            const char *part)
{
    UploadItem *job = row_job(data, part, __func__);
    return job ? row_content(obj, job, part, true, true) : nullptr;
}

static void __zv_upload_list_item_select_cb(void *data, Evas_Object *obj, void *event_info)
{
    (void)data;
    (void)obj;
    if (event_info)
        elm_genlist_item_selected_set(static_cast<Elm_Object_Item *>(event_info), EINA_FALSE);
}

// ---- List view ----

static Eina_Bool __zv_upload_list_btn_quit_cb(void *data, Elm_Object_Item *it)
{
    (void)it;
    ZV_LOG_ENTER();
    if (!view.own_pop) {
        ZV_LOGI("Refuse a pop of the list page the view did not ask for.");
        return EINA_FALSE;
    }
    auto *ad = static_cast<AppData *>(data);
    if (ad && ad->exit)
        ad->exit(ad);
    return EINA_TRUE;
}

static void _zv_upload_listlayout_del_cb(void *data, Evas *e, Evas_Object *obj, void *event_info)
{
    (void)e;
    (void)event_info;
    ZV_LOG_ENTER();
    auto *ad = static_cast<AppData *>(data);
    if (ad && ad->pListLayout == obj)
        ad->pListLayout = nullptr;
}

static Evas_Object *_zv_upload_list_create_genlist(Evas_Object *parent)
{
    if (!parent) {
        ZV_LOGE("parent is NULL");
        return nullptr;
    }
    Evas_Object *genlist = elm_genlist_add(parent);
    evas_object_size_hint_weight_set(genlist, EVAS_HINT_EXPAND, EVAS_HINT_EXPAND);
    evas_object_size_hint_align_set(genlist, EVAS_HINT_FILL, EVAS_HINT_FILL);
    elm_genlist_mode_set(genlist, ELM_LIST_COMPRESS);
    elm_genlist_homogeneous_set(genlist, EINA_TRUE);
    elm_scroller_single_direction_set(genlist, ELM_SCROLLER_SINGLE_DIRECTION_HARD);
    AppData *ad = zv_ext_util_get_appdata();
    if (ad)
        evas_object_event_callback_add(genlist, EVAS_CALLBACK_DEL, genlist_del_cb, ad);
    evas_object_show(genlist);
    return genlist;
}

static Evas_Object *_zv_upload_list_create_nocontent_layout(Evas_Object *parent)
{
    if (!parent) {
        ZV_LOGE("parent is NULL");
        return nullptr;
    }
    Evas_Object *outer = elm_layout_add(parent);
    layout_file_set(outer, SVC_EDJ, "nocontents_layout");
    evas_object_size_hint_weight_set(outer, EVAS_HINT_EXPAND, EVAS_HINT_EXPAND);
    evas_object_size_hint_align_set(outer, EVAS_HINT_FILL, EVAS_HINT_FILL);

    Evas_Object *inner = elm_layout_add(outer);
    if (!elm_layout_theme_set(inner, "layout", "nocontents", "default"))
        ZV_LOGE("elm_layout_theme_set() is failed.");
    evas_object_size_hint_weight_set(inner, EVAS_HINT_EXPAND, EVAS_HINT_EXPAND);
    evas_object_size_hint_align_set(inner, EVAS_HINT_FILL, EVAS_HINT_FILL);
    elm_object_part_text_set(inner, "elm.text", tr(IDS_NO_UPLOADS));
    elm_object_part_text_set(inner, "elm.help.text", tr(IDS_NO_UPLOADS_HELP));
    elm_object_signal_emit(inner, "text,disabled", "");
    elm_object_signal_emit(inner, "align.center", "elm");
    elm_object_part_content_set(outer, "contents", inner);

    AppData *ad = zv_ext_util_get_appdata();
    if (ad)
        evas_object_event_callback_add(outer, EVAS_CALLBACK_DEL, nocontent_del_cb, ad);
    evas_object_show(outer);
    return outer;
}

// Appends a row for every job to a list: the progress style for the jobs under way, the
// complete style for the completed ones. Every row starts unchecked; the job keeps its row
// in `slot` (its upload-list row or its edit-list row).
static void append_job_rows(AppData *ad, Evas_Object *genlist, Elm_Gen_Item_Content_Get_Cb content_get,
                            Elm_Gen_Item_Content_Get_Cb complete_content_get, Evas_Smart_Cb select_cb,
                            Elm_Object_Item *UploadItem::*slot)
{
    ItcPtr itc(elm_genlist_item_class_new());
    itc->item_style = PROGRESS_STYLE;
    itc->func.text_get = __zv_upload_list_get_item_text;
    itc->func.content_get = content_get;
    ItcPtr complete_itc(elm_genlist_item_class_new());
    complete_itc->item_style = COMPLETE_STYLE;
    complete_itc->func.text_get = __zv_upload_list_get_complete_item_text;
    complete_itc->func.content_get = complete_content_get;

    int index = 0;
    for (GList *l = ad->job_list; l; l = l->next, index++) {
        auto *job = static_cast<UploadItem *>(l->data);
        if (!job) {
            ZV_LOGE("%d item is NULL", index);
            continue;
        }
        job->checked = false;
        Elm_Genlist_Item_Class *cls =
            job->status == ZV_UPLOAD_STATUS_COMPLETED ? complete_itc.get() : itc.get();
        job->*slot = elm_genlist_item_append(genlist, cls, job, nullptr, ELM_GENLIST_ITEM_NONE,
                                             select_cb, job);
    }
}

static void _zv_upload_list_append_item_data(AppData *ad)
{
    append_job_rows(ad, ad->pGenlist, __zv_upload_list_get_item_content,
                    __zv_upload_list_get_complete_item_content, __zv_upload_list_item_select_cb,
                    &UploadItem::gen_item);
}

// Deletes the naviframe item that shows the list layout, and with it the layout.
static void delete_list_page(AppData *ad)
{
    Eina_List *items = elm_naviframe_items_get(ad->navi);
    Eina_List *l;
    void *it;
    Elm_Object_Item *page = nullptr;
    EINA_LIST_FOREACH(items, l, it)
    {
        auto *item = static_cast<Elm_Object_Item *>(it);
        if (elm_object_item_content_get(item) == ad->pListLayout)
            page = item;
    }
    eina_list_free(items);
    if (page)
        elm_object_item_del(page);
    if (ad->pListLayout)
        evas_object_del(ad->pListLayout);
    ad->pListLayout = nullptr;
}

// The first frame that shows the job list is logged once per process, with the number of
// jobs: the moment a user sees the list (start-up is measured to this line).
static void first_list_frame_cb(void *data, Evas *e, void *)
{
    evas_event_callback_del_full(e, EVAS_CALLBACK_RENDER_POST, first_list_frame_cb, data);
    auto *ad = static_cast<AppData *>(data);
    ZV_LOGI("job list drawn: %u jobs", ad->job_list ? g_list_length(ad->job_list) : 0u);
}

static void watch_first_list_frame(AppData *ad, Evas_Object *genlist)
{
    static bool watched = false;
    if (watched || !genlist)
        return;
    watched = true;
    evas_event_callback_add(evas_object_evas_get(genlist), EVAS_CALLBACK_RENDER_POST,
                            first_list_frame_cb, ad);
}

int zv_upload_view_init(AppData *ad)
{
    ZV_LOG_ENTER();
    if (!ad) {
        ZV_LOGE("handle is NULL");
        return 0;
    }
    if (!ad->navi) {
        ZV_LOGE("parent is NULL");
        return 0;
    }
    if (ad->pListLayout) {
        // A rebuild follows zv_upload_view_destroy; without one, the pages go first here.
        if (view.list_navi_item)
            zv_upload_view_destroy(ad);
        delete_list_page(ad);
    }
    ad->pListLayout = elm_layout_add(ad->navi);
    if (!ad->pListLayout) {
        ZV_LOGE("ad->pListLayout is not existed.");
        return 0;
    }
    if (!elm_layout_theme_set(ad->pListLayout, "layout", "application", "default"))
        ZV_LOGE("elm_layout_theme_set() is failed.");
    evas_object_size_hint_weight_set(ad->pListLayout, EVAS_HINT_EXPAND, EVAS_HINT_EXPAND);
    evas_object_event_callback_add(ad->pListLayout, EVAS_CALLBACK_DEL, _zv_upload_listlayout_del_cb,
                                   ad);
    evas_object_show(ad->pListLayout);

    if (ad->pNoContent) {
        ZV_LOGI("[view init] Delete nocontents layout.");
        evas_object_del(ad->pNoContent);
        ad->pNoContent = nullptr;
    }
    if (ad->pGenlist) {
        ZV_LOGI("[view init] Delete items genlist.");
        evas_object_del(ad->pGenlist);
        ad->pGenlist = nullptr;
    }

    if (ad->job_list && g_list_length(ad->job_list) > 0) {
        ZV_LOGI("[view init] Create items genlist.");
        ad->pGenlist = _zv_upload_list_create_genlist(ad->navi);
        elm_object_part_content_set(ad->pListLayout, "elm.swallow.content", ad->pGenlist);
        _zv_upload_list_append_item_data(ad);
        watch_first_list_frame(ad, ad->pGenlist);
    } else {
        ZV_LOGI("[view init] Create nocontents layout.");
        ad->pNoContent = _zv_upload_list_create_nocontent_layout(ad->pListLayout);
        elm_object_part_content_set(ad->pListLayout, "elm.swallow.content", ad->pNoContent);
    }

    if (!view.list_navi_item) {
        view.list_navi_item = elm_naviframe_item_push(ad->navi, tr(IDS_UPLOADS), nullptr, nullptr,
                                                      ad->pListLayout, nullptr);
        elm_naviframe_item_pop_cb_set(view.list_navi_item, __zv_upload_list_btn_quit_cb, ad);
    }
    return 0;
}

void zv_upload_view_destroy(AppData *ad)
{
    ZV_LOG_ENTER();
    if (!ad) {
        ZV_LOGE("handle is NULL");
        return;
    }
    if (view.list_navi_item) {
        view.own_pop = true;
        elm_naviframe_item_pop_to(view.list_navi_item);
        view.own_pop = false;
        view.list_navi_item = nullptr;
        view.edit_navi_item = nullptr;
        view.select_all_check = nullptr;
        view.done_btn = nullptr;
        view.edit_mode = false;
        view.select_all_state = false;
    }
}

void zv_upload_list_complete_item(UploadItem *job_item)
{
    ZV_LOG_ENTER();
    if (!job_item) {
        ZV_LOGE("handle is NULL");
        return;
    }
    AppData *ad = zv_ext_util_get_appdata();
    if (!ad)
        ad = job_item->ad;

    if (view.complete_itc.version != ELM_GENLIST_ITEM_CLASS_VERSION) {
        for (Elm_Genlist_Item_Class *itc : {&view.complete_itc, &view.complete_edit_itc}) {
            itc->version = ELM_GENLIST_ITEM_CLASS_VERSION;
            itc->item_style = COMPLETE_STYLE;
            itc->func.text_get = __zv_upload_list_get_complete_item_text;
            itc->func.state_get = nullptr;
            itc->func.del = nullptr;
        }
        view.complete_itc.func.content_get = __zv_upload_list_get_complete_item_content;
        view.complete_edit_itc.func.content_get =
            __zv_upload_list_get_complete_item_content_of_edit_mode;
    }

    if (job_item->gen_item)
        elm_genlist_item_item_class_update(job_item->gen_item, &view.complete_itc);
    else
        ZV_LOGE("gen_item of %d is NULL", job_item->historyid);
    if (ad && ad->pGenlist)
        elm_genlist_realized_items_update(ad->pGenlist);

    if (view.edit_mode && ad && ad->pEditGenlist) {
        ZV_LOGI("Edit mode is enabled. Update Genlist Item of edit mode.");
        if (job_item->edit_gen_item)
            elm_genlist_item_item_class_update(job_item->edit_gen_item, &view.complete_edit_itc);
        elm_genlist_realized_items_update(ad->pEditGenlist);
    }
}

// ---- Edit mode ----

static void _zv_upload_edit_cancel_btn_cb(void *data, Evas_Object *obj, void *event_info);
static void _zv_upload_delete_done_btn_cb(void *data, Evas_Object *obj, void *event_info);

static void __zv_upload_list_item_of_edit_mode_select_cb(void *data, Evas_Object *obj,
                                                         void *event_info)
{
    (void)obj;
    ZV_LOG_ENTER();
    auto *job = static_cast<UploadItem *>(data);
    if (!job) {
        ZV_LOGE("handle is NULL");
        return;
    }
    if (event_info)
        elm_genlist_item_selected_set(static_cast<Elm_Object_Item *>(event_info), EINA_FALSE);
    if (job->check) {
        job->checked = !job->checked;
        elm_check_state_set(job->check, job->checked ? EINA_TRUE : EINA_FALSE);
    }
    AppData *ad = zv_ext_util_get_appdata();
    if (!ad)
        return;
    int count = 0;
    int index = 0;
    for (GList *l = ad->job_list; l; l = l->next, index++) {
        auto *item = static_cast<UploadItem *>(l->data);
        if (!item) {
            ZV_LOGE("item is null:%d", index);
            continue;
        }
        if (item->checked)
            count++;
    }
    view.select_all_state = count == (int)g_list_length(ad->job_list);
    if (view.select_all_check)
        elm_check_state_set(view.select_all_check, view.select_all_state ? EINA_TRUE : EINA_FALSE);
    update_edit_title(count);
}

static void _zv_upload_select_all_layout_mouse_down_cb(void *data, Evas *e, Evas_Object *obj,
                                                       void *event_info)
{
    (void)e;
    (void)obj;
    (void)event_info;
    ZV_LOG_ENTER();
    auto *bar = static_cast<Evas_Object *>(data);
    Evas_Object *check = bar ? elm_object_part_content_get(bar, "elm.icon") : nullptr;
    Eina_Bool state = check ? !elm_check_state_get(check) : EINA_TRUE;
    if (check)
        elm_check_state_set(check, state);
    view.select_all_state = state;

    AppData *ad = zv_ext_util_get_appdata();
    if (!ad)
        return;
    int count = 0;
    int index = 0;
    for (GList *l = ad->job_list; l; l = l->next, index++) {
        auto *job = static_cast<UploadItem *>(l->data);
        if (!job) {
            ZV_LOGE("item is null:%d", index);
            continue;
        }
        job->checked = state;
        if (job->check)
            elm_check_state_set(job->check, state);
        if (job->checked)
            count++;
        if (view.done_btn)
            elm_object_disabled_set(view.done_btn, state ? EINA_FALSE : EINA_TRUE);
    }
    update_edit_title(count, ad->job_list != nullptr);
}

static void _zv_upload_editlayout_del_cb(void *data, Evas *e, Evas_Object *obj, void *event_info)
{
    (void)e;
    (void)event_info;
    ZV_LOG_ENTER();
    auto *ad = static_cast<AppData *>(data);
    if (ad && ad->pEditLayout == obj)
        ad->pEditLayout = nullptr;
}

static Eina_Bool _zv_upload_edit_pop_cb(void *data, Elm_Object_Item *it)
{
    ZV_LOG_ENTER();
    if (!it) {
        ZV_LOGE("naviframe item is NULL");
        return EINA_FALSE;
    }
    auto *ad = static_cast<AppData *>(data);
    if (!ad) {
        ZV_LOGE("userp is NULL");
        return EINA_FALSE;
    }
    if (!view.own_pop) {
        ZV_LOGI("Refuse a pop of the edit page the view did not ask for.");
        return EINA_FALSE;
    }
    view.edit_mode = false;
    if (view.edit_navi_item == it)
        view.edit_navi_item = nullptr;
    ad->pEditGenlist = nullptr;
    ad->pEditLayout = nullptr;
    return EINA_TRUE;
}

static void _zv_upload_list_append_item_of_edit_mode_data(AppData *ad)
{
    if (!ad->job_list) {
        ZV_LOGE("job_list is NULL");
        return;
    }
    append_job_rows(ad, ad->pEditGenlist, __zv_upload_list_get_item_content_of_edit_mode,
                    __zv_upload_list_get_complete_item_content_of_edit_mode,
                    __zv_upload_list_item_of_edit_mode_select_cb, &UploadItem::edit_gen_item);
}

static void _zv_upload_list_edit_mode(AppData *ad)
{
    if (ad->pEditLayout) {
        evas_object_del(ad->pEditLayout);
        ad->pEditLayout = nullptr;
    }
    ad->pEditLayout = elm_layout_add(ad->navi);
    if (!ad->pEditLayout) {
        ZV_LOGE("ad->pEditLayout is null.");
        return;
    }
    if (!elm_layout_theme_set(ad->pEditLayout, "layout", "application", "zv_upload_edit_view"))
        ZV_LOGE("elm_layout_theme_set() is failed.");
    evas_object_size_hint_align_set(ad->pEditLayout, EVAS_HINT_FILL, EVAS_HINT_FILL);
    evas_object_size_hint_weight_set(ad->pEditLayout, EVAS_HINT_EXPAND, EVAS_HINT_EXPAND);
    evas_object_event_callback_add(ad->pEditLayout, EVAS_CALLBACK_DEL, _zv_upload_editlayout_del_cb,
                                   ad);
    evas_object_show(ad->pEditLayout);

    Evas_Object *bar = elm_layout_add(ad->pEditLayout);
    layout_file_set(bar, SVC_EDJ, "zv_select_all");
    evas_object_event_callback_add(bar, EVAS_CALLBACK_MOUSE_DOWN,
                                   _zv_upload_select_all_layout_mouse_down_cb, bar);
    Evas_Object *check = elm_check_add(bar);
    evas_object_propagate_events_set(check, EINA_FALSE);
    // A tap on the check itself counts as a press on the bar.
    evas_object_pass_events_set(check, EINA_TRUE);
    elm_object_part_content_set(bar, "elm.icon", check);
    elm_object_domain_translatable_part_text_set(bar, "elm.text.main", TEXT_DOMAIN, IDS_SELECT_ALL);
    evas_object_show(bar);
    view.select_all_check = check;
    view.select_all_state = false;
    elm_object_part_content_set(ad->pEditLayout, "elm.swallow.content.select.all", bar);

    if (ad->pEditGenlist) {
        evas_object_del(ad->pEditGenlist);
        ad->pEditGenlist = nullptr;
    }
    ad->pEditGenlist = _zv_upload_list_create_genlist(ad->pEditLayout);
    elm_object_part_content_set(ad->pEditLayout, "elm.swallow.content", ad->pEditGenlist);
    _zv_upload_list_append_item_of_edit_mode_data(ad);

    Evas_Object *cancel_btn = elm_button_add(ad->navi);
    elm_object_style_set(cancel_btn, "naviframe/title_left");
    elm_object_text_set(cancel_btn, tr(IDS_CANCEL_ABB));
    evas_object_smart_callback_add(cancel_btn, "clicked", _zv_upload_edit_cancel_btn_cb, ad);
    Evas_Object *done_btn = elm_button_add(ad->navi);
    elm_object_style_set(done_btn, "naviframe/title_right");
    elm_object_text_set(done_btn, tr(IDS_DONE_ABB));
    evas_object_smart_callback_add(done_btn, "clicked", _zv_upload_delete_done_btn_cb, ad);
    elm_object_disabled_set(done_btn, EINA_TRUE);
    view.done_btn = done_btn;

    GCharPtr title(g_strdup(tr(IDS_SELECT_UPLOADS)));
    Elm_Object_Item *item =
        elm_naviframe_item_push(ad->navi, title.get(), nullptr, nullptr, ad->pEditLayout, nullptr);
    elm_naviframe_item_pop_cb_set(item, _zv_upload_edit_pop_cb, ad);
    view.edit_navi_item = item;
    set_title_button(item, "title_left_btn", "prev_btn", cancel_btn);
    set_title_button(item, "title_right_btn", "next_btn", done_btn);

    elm_genlist_realized_items_update(ad->pEditGenlist);
}

static void _zv_upload_edit_btn_click(void *data, Evas_Object *obj, void *event_info)
{
    (void)obj;
    (void)event_info;
    ZV_LOG_ENTER();
    auto *ad = static_cast<AppData *>(data);
    if (!ad) {
        ZV_LOGE("handle is NULL");
        return;
    }
    delete_menu(ad);
    view.edit_mode = true;
    _zv_upload_list_edit_mode(ad);
}

static void _zv_upload_edit_cancel_btn_cb(void *data, Evas_Object *obj, void *event_info)
{
    (void)obj;
    (void)event_info;
    ZV_LOG_ENTER();
    auto *ad = static_cast<AppData *>(data);
    if (!ad) {
        ZV_LOGE("userp is NULL");
        return;
    }
    view.edit_mode = false;

    if (!ad->pListLayout) {
        pop_page(ad->navi);
        if (ad->pGenlist) {
            ZV_LOGI("update realized genlist items.");
            elm_genlist_realized_items_update(ad->pGenlist);
        }
        return;
    }

    if (ad->job_list) {
        if (view.edit_navi_item) {
            Evas_Object *btn =
                unset_title_button(view.edit_navi_item, "title_left_btn", "prev_btn");
            if (btn) {
                ZV_LOGI("Delete title_left_btn.");
                evas_object_del(btn);
            }
            btn = unset_title_button(view.edit_navi_item, "title_right_btn", "next_btn");
            if (btn) {
                ZV_LOGI("Delete title_right_btn.");
                evas_object_del(btn);
            }
            view.done_btn = nullptr;
            ZV_LOGI("Delete \"N select\" title.");
            elm_object_item_part_text_set(view.edit_navi_item, "elm.text.title", tr(IDS_UPLOADS));
        }
        int index = 0;
        for (GList *l = ad->job_list; l; l = l->next, index++) {
            auto *job = static_cast<UploadItem *>(l->data);
            if (!job) {
                ZV_LOGE("%d item is NULL", index);
                continue;
            }
            job->checked = false;
        }
        pop_page(ad->navi);
        if (ad->pGenlist) {
            ZV_LOGI("update realized genlist items.");
            elm_genlist_realized_items_update(ad->pGenlist);
        }
        return;
    }

    if (ad->pGenlist) {
        if (elm_object_part_content_get(ad->pListLayout, "elm.swallow.content") == ad->pGenlist)
            elm_object_part_content_unset(ad->pListLayout, "elm.swallow.content");
        evas_object_del(ad->pGenlist);
        ad->pGenlist = nullptr;
    }
    if (!ad->pNoContent)
        ad->pNoContent = _zv_upload_list_create_nocontent_layout(ad->pListLayout);
    elm_object_part_content_set(ad->pListLayout, "elm.swallow.content", ad->pNoContent);
    pop_page(ad->navi);
}

static void _zv_upload_edit_done_btn_cb(AppData *ad)
{
    ZV_LOG_ENTER();
    if (!ad) {
        ZV_LOGE("userp is NULL");
        return;
    }
    if (!ad->job_list) {
        ZV_LOGE("job list is NULL");
        return;
    }
    if (!view.edit_mode)
        return;

    GList *selected = nullptr;
    int active_count = 0;
    int index = 0;
    for (GList *l = ad->job_list; l; l = l->next, index++) {
        auto *job = static_cast<UploadItem *>(l->data);
        if (!job) {
            ZV_LOGE("item is null:%d", index);
            continue;
        }
        if (!job->checked)
            continue;
        selected = g_list_append(selected, job);
        if (job->status == ZV_UPLOAD_STATUS_WAITING || job->status == ZV_UPLOAD_STATUS_UPLOADING)
            active_count++;
    }
    for (GList *l = selected; l; l = l->next) {
        auto *job = static_cast<UploadItem *>(l->data);
        ad->job_list = g_list_remove(ad->job_list, job);
        if (ad->delete_item)
            ad->delete_item(job, true);
        else
            ZV_LOGE("delete_item is NULL");
    }
    g_list_free(selected);

    if (!ad->job_list) {
        ZV_LOGI("Job list is empty. Need to destroy ongoing notification.");
        ad->completed_count = 0;
        ad->total_count = 0;
    }
    if (active_count != 0) {
        ad->total_count = ad->completed_count + zv_ext_db_get_uploading_count();
        zv_upload_ctrl_post_notification(ad, nullptr);
    }
    _zv_upload_edit_cancel_btn_cb(ad, nullptr, nullptr);
}

static void _zuvo_view_cancelupload_cancel_cb(void *data, Evas_Object *obj, void *event_info)
{
    (void)obj;
    (void)event_info;
    ZV_LOG_ENTER();
    auto *popup = static_cast<Evas_Object *>(data);
    if (!popup) {
        ZV_LOGE("userp is NULL");
        return;
    }
    evas_object_del(popup);
}

static void _zuvo_view_cancelupload_ok_cb(void *data, Evas_Object *obj, void *event_info)
{
    (void)obj;
    (void)event_info;
    ZV_LOG_ENTER();
    auto *popup = static_cast<Evas_Object *>(data);
    if (!popup) {
        ZV_LOGE("userp is NULL");
        return;
    }
    evas_object_del(popup);
    _zv_upload_edit_done_btn_cb(zv_ext_util_get_appdata());
}

static void show_stop_question(AppData *ad)
{
    Evas_Object *popup = elm_popup_add(ad->navi);
    elm_popup_align_set(popup, ELM_NOTIFY_ALIGN_FILL, 1.0);
    elm_object_style_set(popup, "default");
    evas_object_size_hint_weight_set(popup, EVAS_HINT_EXPAND, EVAS_HINT_EXPAND);
    elm_object_part_text_set(popup, "title,text", tr(IDS_STOP_TITLE));
    elm_object_part_text_set(popup, "default", tr(IDS_STOP_TEXT));

    Evas_Object *cancel = elm_button_add(popup);
    elm_object_style_set(cancel, "popup");
    elm_object_text_set(cancel, tr(IDS_CANCEL));
    evas_object_smart_callback_add(cancel, "clicked", _zuvo_view_cancelupload_cancel_cb, popup);
    elm_object_part_content_set(popup, "button1", cancel);

    Evas_Object *stop = elm_button_add(popup);
    elm_object_style_set(stop, "popup");
    elm_object_text_set(stop, tr(IDS_STOP));
    evas_object_smart_callback_add(stop, "clicked", _zuvo_view_cancelupload_ok_cb, popup);
    elm_object_part_content_set(popup, "button2", stop);

    eext_object_event_callback_add(popup, EEXT_CALLBACK_BACK, _zuvo_view_cancelupload_cancel_cb,
                                   popup);
    evas_object_show(popup);
}

static void _zv_upload_delete_done_btn_cb(void *data, Evas_Object *obj, void *event_info)
{
    (void)obj;
    (void)event_info;
    ZV_LOG_ENTER();
    auto *ad = static_cast<AppData *>(data);
    if (!ad) {
        ZV_LOGE("userp is NULL");
        return;
    }
    if (view.edit_mode && ad->job_list) {
        int index = 0;
        for (GList *l = ad->job_list; l; l = l->next, index++) {
            auto *job = static_cast<UploadItem *>(l->data);
            if (!job) {
                ZV_LOGE("item is null:%d", index);
                continue;
            }
            if (job->checked && job->status != ZV_UPLOAD_STATUS_COMPLETED) {
                ZV_LOGI("Not completed item is exist.");
                ZV_LOGI("Not completed item is exist. Need question popup.");
                show_stop_question(ad);
                return;
            }
        }
    }
    ZV_LOGI("All selected items are completed item. Not need question popup.");
    _zv_upload_edit_done_btn_cb(ad);
}

// ---- More menu ----

static void _move_ctx(AppData *ad)
{
    if (!ad) {
        ZV_LOGE("userp is NULL");
        return;
    }
    if (!ad->pCtxPopup) {
        ZV_LOGE("ad->pCtxPopup is NULL");
        return;
    }
    Evas_Object *win = elm_object_top_widget_get(ad->pCtxPopup);
    int w = 0, h = 0;
    elm_win_screen_size_get(win, nullptr, nullptr, &w, &h);
    int rotation = elm_win_rotation_get(win);
    switch (rotation) {
    case 0:
    case 180:
        evas_object_move(ad->pCtxPopup, w / 2, h);
        break;
    case 90:
    case 270:
        evas_object_move(ad->pCtxPopup, h / 2, w);
        break;
    default:
        break;
    }
}

static void _rotate_cb(void *data, Evas_Object *obj, void *event_info)
{
    (void)obj;
    (void)event_info;
    auto *ad = static_cast<AppData *>(data);
    if (!ad) {
        ZV_LOGE("handle is NULL");
        return;
    }
    _move_ctx(ad);
    if (ad->pCtxPopup)
        evas_object_show(ad->pCtxPopup);
}

static void _resize_cb(void *data, Evas *e, Evas_Object *obj, void *event_info)
{
    (void)e;
    (void)obj;
    (void)event_info;
    auto *ad = static_cast<AppData *>(data);
    if (!ad) {
        ZV_LOGE("handle is NULL");
        return;
    }
    _move_ctx(ad);
}

static void _dismissed_cb(void *data, Evas_Object *obj, void *event_info)
{
    (void)obj;
    (void)event_info;
    auto *ad = static_cast<AppData *>(data);
    if (!ad) {
        ZV_LOGE("handle is NULL");
        return;
    }
    delete_menu(ad);
}

static void _delete_cb(void *data, Evas *e, Evas_Object *obj, void *event_info)
{
    (void)e;
    (void)event_info;
    auto *ad = static_cast<AppData *>(data);
    if (!ad) {
        ZV_LOGE("handle is NULL");
        return;
    }
    if (ad->navi)
        evas_object_event_callback_del(ad->navi, EVAS_CALLBACK_RESIZE, _resize_cb);
    Evas_Object *win = elm_object_top_widget_get(obj);
    if (win)
        evas_object_smart_callback_del(win, "rotation,changed", _rotate_cb);
    evas_object_smart_callback_del(obj, "dismissed", _dismissed_cb);
    evas_object_event_callback_del(obj, EVAS_CALLBACK_DEL, _delete_cb);
    if (ad->pCtxPopup == obj)
        ad->pCtxPopup = nullptr;
}

static void _menu_btn_clicked_cb(AppData *ad)
{
    ZV_LOG_ENTER();
    if (ad->pCtxPopup) {
        evas_object_hide(ad->pCtxPopup);
        delete_menu(ad);
        return;
    }
    if (!ad->job_list)
        return;

    Evas_Object *ctx = elm_ctxpopup_add(ad->win);
    ad->pCtxPopup = ctx;
    elm_ctxpopup_auto_hide_disabled_set(ctx, EINA_TRUE);
    elm_object_style_set(ctx, "more/default");
    eext_object_event_callback_add(ctx, EEXT_CALLBACK_BACK, menu_dismiss_cb, nullptr);
    eext_object_event_callback_add(ctx, EEXT_CALLBACK_MORE, menu_dismiss_cb, nullptr);
    evas_object_event_callback_add(ad->navi, EVAS_CALLBACK_RESIZE, _resize_cb, ad);
    evas_object_smart_callback_add(ad->win, "rotation,changed", _rotate_cb, ad);
    elm_ctxpopup_direction_priority_set(ctx, ELM_CTXPOPUP_DIRECTION_DOWN, ELM_CTXPOPUP_DIRECTION_UP,
                                        ELM_CTXPOPUP_DIRECTION_UNKNOWN,
                                        ELM_CTXPOPUP_DIRECTION_UNKNOWN);
    evas_object_event_callback_add(ctx, EVAS_CALLBACK_DEL, _delete_cb, ad);
    evas_object_smart_callback_add(ctx, "dismissed", _dismissed_cb, ad);
    evas_object_smart_callback_add(ctx, "language,changed", _dismissed_cb, ad);
    elm_ctxpopup_item_append(ctx, tr(IDS_REMOVE), nullptr, _zv_upload_edit_btn_click, ad);
    _move_ctx(ad);
    evas_object_show(ctx);
}

// ---- Keys ----

void zv_upload_view_back_cb(void *data, Evas_Object *obj, void *event_info)
{
    (void)obj;
    (void)event_info;
    ZV_LOG_ENTER();
    auto *ad = static_cast<AppData *>(data);
    if (!ad) {
        ZV_LOGE("data is NULL");
        return;
    }
    if (view.edit_mode) {
        view.edit_mode = false;
        delete_menu(ad);
        _zv_upload_edit_cancel_btn_cb(ad, nullptr, nullptr);
        return;
    }
    delete_menu(ad);
    if (ad->exit)
        ad->exit(ad);
    else
        ZV_LOGE("exit is NULL");
}

void zv_upload_view_morekey_cb(void *data, Evas_Object *obj, void *event_info)
{
    (void)obj;
    (void)event_info;
    ZV_LOG_ENTER();
    auto *ad = static_cast<AppData *>(data);
    if (!ad) {
        ZV_LOGE("data is NULL");
        return;
    }
    if (view.edit_mode)
        return;
    _menu_btn_clicked_cb(ad);
}

Eina_Bool zv_upload_view_event_key_down_cb(void *data, int type, void *event)
{
    (void)type;
    (void)event;
    ZV_LOG_ENTER();
    if (!data)
        ZV_LOGE("handle is NULL");
    return ECORE_CALLBACK_DONE;
}

Eina_Bool zv_upload_view_event_key_up_cb(void *data, int type, void *event)
{
    (void)type;
    ZV_LOG_ENTER();
    if (!data) {
        ZV_LOGE("handle is NULL");
        return ECORE_CALLBACK_DONE;
    }
    auto *ev = static_cast<Ecore_Event_Key *>(event);
    const char *keyname = ev && ev->keyname ? ev->keyname : "";
    ZV_LOGI("HW EVENT KEY UP:%s", keyname);
    if (!strcmp(keyname, "XF86Menu"))
        ZV_LOGI("menu key");
    else if (!strcmp(keyname, "XF86Back"))
        ZV_LOGI("back key");
    return ECORE_CALLBACK_DONE;
}
