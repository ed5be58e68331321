// Process entry of the upload service: the lifecycle callbacks of the UI application loop,
// the launch request's extras read into the batch settings, and the main window with its
// stack of background, conformant, main layout and naviframe.
// Thread safety: main loop only.
#include "zv-upload-main.h"

#include <Elementary.h>
#include <app.h>
#include <efl_extension.h>
#include <errno.h>
#include <glib.h>
#include <stdlib.h>
#include <string.h>
#include <sys/resource.h>
#include <uxt.h>

#include <memory>

#include "zv-ext-db.h"
#include "zv-log.h"
#include "zv-upload-ctrl.h"
#include "zv-upload-view.h"

namespace {

constexpr const char kWinName[] = "zuvo-upload-svc";
constexpr double kBaseScale = 2.6;
// A new window asks for a phone's size (logical pixels at scale 1); a window manager that
// sizes its windows itself (full screen, a tile) has the last word.
constexpr int kPhoneWidth = 360;
constexpr int kPhoneHeight = 640;

struct FreeDeleter {
    void operator()(char *p) const { free(p); }
};
using CharPtr = std::unique_ptr<char, FreeDeleter>;

void replace_string(char **field, const char *value)
{
    free(*field);
    *field = value ? strdup(value) : nullptr;
}

// Every job of a batch runs at once, each with a connection and, while it sends, its file: the
// soft open-file limit goes up to the hard limit, so that the transfer engine holds jobs back
// only when even the hard limit cannot hold them all.
void raise_open_file_limit()
{
    struct rlimit rl;
    if (getrlimit(RLIMIT_NOFILE, &rl) != 0 || rl.rlim_cur >= rl.rlim_max)
        return;
    unsigned long long soft = rl.rlim_cur;
    rl.rlim_cur = rl.rlim_max;
    if (setrlimit(RLIMIT_NOFILE, &rl) != 0) {
        ZV_LOGE("cannot raise the open-file limit from %llu: %s", soft, strerror(errno));
        return;
    }
    ZV_LOGI("open-file limit raised from %llu to %llu", soft, (unsigned long long)rl.rlim_cur);
}

// "1" or "true" turns the position on for the batch.
bool truthy(const char *value)
{
    return value && (strcmp(value, "1") == 0 || strcmp(value, "true") == 0);
}

} // namespace

static void _zv_upload_main_win_del(void *data, Evas_Object *obj, void *event_info)
{
    (void)data;
    (void)obj;
    (void)event_info;
    ZV_LOG_ENTER();
    elm_exit();
}

static void _zv_upload_win_rot_changed_cb(void *data, Evas_Object *obj, void *event_info)
{
    (void)data;
    (void)event_info;
    ZV_LOG_ENTER();
    if (!obj) {
        ZV_LOGE("obj is NULL");
        return;
    }
    ZV_LOGI("angle: %d", elm_win_rotation_get(obj));
}

static Evas_Object *_zv_upload_main_create_win(Evas_Object *parent)
{
    ZV_LOG_ENTER();
    Evas_Object *win = app_get_preinitialized_window(kWinName);
    if (!win) {
        win = elm_win_add(parent, kWinName, ELM_WIN_BASIC);
        if (win) {
            double scale = elm_config_scale_get();
            evas_object_resize(win, (int)(kPhoneWidth * scale), (int)(kPhoneHeight * scale));
        }
    }
    if (!win) {
        ZV_LOGE("window is NULL");
        return nullptr;
    }
    if (elm_win_wm_rotation_supported_get(win)) {
        const int rotations[3] = {0, 90, 270};
        elm_win_wm_rotation_available_rotations_set(win, rotations, 3);
        elm_win_wm_rotation_preferred_rotation_set(win, -1);
    }
    elm_win_conformant_set(win, EINA_TRUE);
    elm_win_title_set(win, kWinName);
    evas_object_smart_callback_add(win, "delete,request", _zv_upload_main_win_del, nullptr);
    evas_object_smart_callback_add(win, "wm,rotation,changed", _zv_upload_win_rot_changed_cb,
                                   nullptr);
    elm_win_indicator_mode_set(win, ELM_WIN_INDICATOR_SHOW);
    elm_win_indicator_opacity_set(win, ELM_WIN_INDICATOR_TRANSPARENT);
    return win;
}

static Evas_Object *_zv_upload_main_create_bg(Evas_Object *parent)
{
    ZV_LOG_ENTER();
    if (!parent) {
        ZV_LOGE("parent is NULL");
        return nullptr;
    }
    Evas_Object *bg = app_get_preinitialized_background();
    if (!bg)
        bg = elm_bg_add(parent);
    if (!bg) {
        ZV_LOGE("bg is NULL");
        return nullptr;
    }
    evas_object_size_hint_weight_set(bg, EVAS_HINT_EXPAND, EVAS_HINT_EXPAND);
    elm_win_resize_object_add(parent, bg);
    evas_object_show(bg);
    return bg;
}

static Evas_Object *_zv_upload_main_create_conform(Evas_Object *parent)
{
    ZV_LOG_ENTER();
    if (!parent) {
        ZV_LOGE("parent is NULL");
        return nullptr;
    }
    Evas_Object *conform = app_get_preinitialized_conformant();
    if (!conform)
        conform = elm_conformant_add(parent);
    if (!conform) {
        ZV_LOGE("conform is NULL");
        return nullptr;
    }
    evas_object_size_hint_weight_set(conform, EVAS_HINT_EXPAND, EVAS_HINT_EXPAND);
    elm_win_resize_object_add(parent, conform);
    evas_object_show(conform);

    Evas_Object *indicator_bg = elm_bg_add(conform);
    elm_object_style_set(indicator_bg, "indicator/headerbg");
    elm_object_part_content_set(conform, "elm.swallow.indicator_bg", indicator_bg);
    evas_object_show(indicator_bg);

    elm_win_conformant_set(parent, EINA_TRUE);
    return conform;
}

// The caller puts the window's background into the layout's "elm.swallow.bg".
static Evas_Object *_zv_upload_main_create_layout(Evas_Object *parent)
{
    ZV_LOG_ENTER();
    if (!parent) {
        ZV_LOGE("parent is NULL");
        return nullptr;
    }
    Evas_Object *layout = elm_layout_add(parent);
    if (!layout) {
        ZV_LOGE("Layout is NULL : %p", (void *)layout);
        return nullptr;
    }
    elm_layout_theme_set(layout, "layout", "application", "default");
    evas_object_size_hint_weight_set(layout, EVAS_HINT_EXPAND, EVAS_HINT_EXPAND);
    evas_object_show(layout);
    return layout;
}

// The naviframe in the layout's content part; the caller adds its key callbacks.
static Evas_Object *_zv_upload_main_create_navi(Evas_Object *parent)
{
    ZV_LOG_ENTER();
    if (!parent) {
        ZV_LOGE("parent is NULL");
        return nullptr;
    }
    Evas_Object *navi = elm_naviframe_add(parent);
    if (!navi) {
        ZV_LOGE("navigation is NULL");
        return nullptr;
    }
    elm_naviframe_prev_btn_auto_pushed_set(navi, EINA_FALSE);
    elm_object_part_content_set(parent, "elm.swallow.content", navi);
    evas_object_show(navi);
    return navi;
}

namespace {

// Loads a table of the shared resource folder's "tables/"; null when it cannot be loaded.
template <typename Handle>
Handle load_table(Handle (*add)(const char *), const char *file)
{
    CharPtr shared(app_get_shared_resource_path());
    if (!shared)
        return add(nullptr);
    std::unique_ptr<char, decltype(&g_free)> path(
        g_strdup_printf("%s%s%s", shared.get(), "tables/", file), g_free);
    return add(path.get());
}

// The window and its stack, theme extension and tables, in this order (false: create fails).
bool create_base_gui(AppData *ad)
{
    CharPtr res(app_get_resource_path());
    if (res) {
        std::unique_ptr<char, decltype(&g_free)> edj(
            g_strdup_printf("%s%s%s", res.get(), "edje/", "zuvo-upload-custom-winset.edj"),
            g_free);
        elm_theme_extension_add(nullptr, edj.get());
        // The same file also replaces the stock styles it restyles (page, check box, popups).
        elm_theme_overlay_add(nullptr, edj.get());
    } else {
        elm_theme_extension_add(nullptr, nullptr);
    }
    elm_app_base_scale_set(kBaseScale);
    elm_config_accel_preference_set("gl");

    ad->win = _zv_upload_main_create_win(nullptr);
    if (!ad->win)
        return false;
    uxt_theme_set_changeable_ui_enabled(true);

    ad->bg = _zv_upload_main_create_bg(ad->win);
    if (!ad->bg)
        return false;
    ad->conform = _zv_upload_main_create_conform(ad->win);
    if (!ad->conform)
        return false;
    ad->layout = _zv_upload_main_create_layout(ad->conform);
    if (!ad->layout) {
        ZV_LOGE("layout is NULL");
        return false;
    }
    elm_object_part_content_set(ad->layout, "elm.swallow.bg", ad->bg);
    elm_object_content_set(ad->conform, ad->layout);
    ad->navi = _zv_upload_main_create_navi(ad->layout);
    if (!ad->navi)
        return false;
    eext_object_event_callback_add(ad->navi, EEXT_CALLBACK_BACK, zv_upload_view_back_cb, ad);
    eext_object_event_callback_add(ad->navi, EEXT_CALLBACK_MORE, zv_upload_view_morekey_cb, ad);

    evas_object_show(ad->bg);
    evas_object_show(ad->conform);
    evas_object_show(ad->layout);
    evas_object_show(ad->navi);
    evas_object_show(ad->win);

    ad->color_table = load_table(uxt_theme_add_color_table,
                                                 "zuvo-upload-svc_ChangeableColorInfo.xml");
    if (ad->color_table)
        uxt_theme_set_color_table(ad->color_table);
    else
        ZV_LOGE("[ERR] color table create fail");
    ad->font_table = load_table(uxt_theme_add_font_table,
                                                "zuvo-upload-svc_ChangeableFontInfo.xml");
    if (ad->font_table)
        uxt_theme_set_font_table(ad->font_table);
    else
        ZV_LOGE("[ERR] font table create fail");
    return true;
}

} // namespace

// Reads the extras into the batch settings, all or nothing: false (and ad unchanged) at the
// first required key that cannot be read, or an optional one that fails with a value.
static bool _zv_upload_main_get_app_control_info(app_control_h app_control, AppData *ad)
{
    ZV_LOG_ENTER();
    char *raw = nullptr;
    int ret = app_control_get_extra_data(app_control, "ZV_DATA_ACCESS_TOKEN", &raw);
    CharPtr token(raw);
    if (ret != APP_CONTROL_ERROR_NONE) {
        ZV_LOGE("app_control_get_extra_data error: %d", ret);
        return false;
    }
    raw = nullptr;
    ret = app_control_get_extra_data(app_control, "ZV_DATA_CATEGORY", &raw);
    CharPtr category(raw);
    if (ret != APP_CONTROL_ERROR_NONE) {
        ZV_LOGE("app_control_get_extra_data error : %d", ret);
        return false;
    }
    raw = nullptr;
    ret = app_control_get_extra_data(app_control, "ZV_DATA_DESCRIPTION", &raw);
    CharPtr description(raw);
    if (ret != APP_CONTROL_ERROR_NONE && description) {
        ZV_LOGE("app_control_get_extra_data error : %d", ret);
        return false;
    }
    raw = nullptr;
    ret = app_control_get_extra_data(app_control, "ZV_DATA_TAG", &raw);
    CharPtr tag(raw);
    if (ret != APP_CONTROL_ERROR_NONE && tag) {
        ZV_LOGE("app_control_get_extra_data error : %d", ret);
        return false;
    }
    raw = nullptr;
    ret = app_control_get_extra_data(app_control, "ZV_DATA_ACCESS_TYPE", &raw);
    CharPtr access_type(raw);
    if (ret != APP_CONTROL_ERROR_NONE) {
        ZV_LOGE("app_control_get_extra_data error : %d", ret);
        return false;
    }
    // Optional; absent or unreadable means no position for this batch.
    raw = nullptr;
    app_control_get_extra_data(app_control, "ZV_DATA_USE_LOCATION", &raw);
    CharPtr use_location(raw);

    replace_string(&ad->access_token, token.get());
    replace_string(&ad->category, category.get());
    replace_string(&ad->description, description.get());
    replace_string(&ad->tag, tag.get());
    ad->access_type = (int)strtol(access_type.get(), nullptr, 10);
    ad->use_location = truthy(use_location.get());
    return true;
}

static bool _app_create(void *data)
{
    ZV_LOG_ENTER();
    AppData *ad = static_cast<AppData *>(data);
    if (!ad) {
        ZV_LOGE("userp is NULL");
        return false;
    }
    if (!create_base_gui(ad))
        return false;
    zv_ext_db_open();
    zv_upload_ctrl_initialize(ad);
    uxt_access_set_screen_reader_enabled(ad->win, false);
    uxt_access_show_screen_reader_disabled_popup(ad->win);
    return true;
}

static void _app_control(app_control_h app_control, void *data)
{
    ZV_LOG_ENTER();
    AppData *ad = static_cast<AppData *>(data);
    if (!app_control) {
        ZV_LOGE("service handle is NULL");
        return;
    }
    if (!ad) {
        ZV_LOGE("userp is NULL");
        return;
    }
    if (!ad->win) {
        ZV_LOGE("win is NULL");
        return;
    }
    zv_upload_ctrl_init_value(ad);
    if (!_zv_upload_main_get_app_control_info(app_control, ad))
        ZV_LOGE("get bundle value fail");
    zv_upload_ctrl_service(ad);
    // A request that finds the window lowered or iconified (a click on the ongoing
    // notification, say) brings it back to the front.
    elm_win_iconified_set(ad->win, EINA_FALSE);
    elm_win_raise(ad->win);
    elm_win_activate(ad->win);

    // One pair of key handlers at a time: a key event reaches the view once.
    if (ad->key_down_handler)
        ecore_event_handler_del(ad->key_down_handler);
    if (ad->key_up_handler)
        ecore_event_handler_del(ad->key_up_handler);
    ad->key_down_handler =
        ecore_event_handler_add(ECORE_EVENT_KEY_DOWN, zv_upload_view_event_key_down_cb, ad);
    ad->key_up_handler =
        ecore_event_handler_add(ECORE_EVENT_KEY_UP, zv_upload_view_event_key_up_cb, ad);

    uxt_access_set_screen_reader_enabled(ad->win, false);
    uxt_access_show_screen_reader_disabled_popup(ad->win);
}

static void _app_pause(void *data)
{
    ZV_LOG_ENTER();
    AppData *ad = static_cast<AppData *>(data);
    if (!ad) {
        ZV_LOGE("userp is NULL");
        return;
    }
    ad->is_paused = true;
}

static void _app_resume(void *data)
{
    ZV_LOG_ENTER();
    AppData *ad = static_cast<AppData *>(data);
    if (!ad) {
        ZV_LOGE("userp is NULL");
        return;
    }
    ad->is_paused = false;
}

static void _app_terminate(void *data)
{
    ZV_LOG_ENTER();
    AppData *ad = static_cast<AppData *>(data);
    if (!ad) {
        ZV_LOGE("userp is NULL");
        return;
    }
    if (ad->color_table) {
        uxt_theme_delete_color_table(ad->color_table);
        ad->color_table = nullptr;
    }
    if (ad->font_table) {
        uxt_theme_delete_font_table(ad->font_table);
        ad->font_table = nullptr;
    }
    // No key event is to reach a view that finalize takes down.
    if (ad->key_down_handler) {
        ecore_event_handler_del(ad->key_down_handler);
        ad->key_down_handler = nullptr;
    }
    if (ad->key_up_handler) {
        ecore_event_handler_del(ad->key_up_handler);
        ad->key_up_handler = nullptr;
    }
    zv_upload_ctrl_finalize(ad);
}

int main(int argc, char *argv[])
{
    // The one application context; static so that it outlives every callback.
    static AppData ad;
    raise_open_file_limit();
    ui_app_lifecycle_callback_s event_callback;
    memset(&event_callback, 0, sizeof event_callback);
    event_callback.create = _app_create;
    event_callback.terminate = _app_terminate;
    event_callback.pause = _app_pause;
    event_callback.resume = _app_resume;
    event_callback.app_control = _app_control;
    ad = AppData{};

    int ret = ui_app_main(argc, argv, &event_callback, &ad);
    if (ret == APP_ERROR_ALREADY_RUNNING) {
        // This host's launcher: the request went to the running instance, which took it.
        ZV_LOGI("launch request handed to the running instance");
        return 0;
    }
    if (ret != APP_ERROR_NONE) {
        ZV_LOGE("ui_app_main() error");
        return -1;
    }
    ZV_LOGI("ui_app_main() loop");
    replace_string(&ad.access_token, nullptr);
    replace_string(&ad.category, nullptr);
    replace_string(&ad.description, nullptr);
    replace_string(&ad.tag, nullptr);
    return 0;
}
