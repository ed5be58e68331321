// The process-wide application context and the small popups and helpers of the adapter layer.
#include "zv-ext-util.h"

#include <stdio.h>
#include <string.h>

#include <memory>

#include "zv-log.h"

namespace
{

AppData *stored_appdata = nullptr;

struct FileCloser {
    void operator()(FILE *f) const { fclose(f); }
};
using FilePtr = std::unique_ptr<FILE, FileCloser>;

struct ItcFree {
    void operator()(Elm_Genlist_Item_Class *itc) const { elm_genlist_item_class_free(itc); }
};
using ItcPtr = std::unique_ptr<Elm_Genlist_Item_Class, ItcFree>;

} // namespace

void zv_ext_util_set_appdata(AppData *ad)
{
    ZV_LOG_ENTER();
    if (!ad) {
        ZV_LOGE("handle is NULL");
        return;
    }
    if (!stored_appdata)
        stored_appdata = ad;
}

AppData *zv_ext_util_get_appdata(void)
{
    return stored_appdata;
}

Evas_Object *zv_ext_util_create_popup(Evas_Object *parent, const char *text, double timeout,
                                      Evas_Smart_Cb timeout_cb, void *data)
{
    ZV_LOG_ENTER();
    if (!parent) {
        ZV_LOGE("parent is NULL");
        return nullptr;
    }
    if (!data) {
        ZV_LOGE("handle is NULL");
        return nullptr;
    }
    Evas_Object *popup = elm_popup_add(parent);
    elm_object_style_set(popup, "default");
    elm_popup_align_set(popup, ELM_NOTIFY_ALIGN_FILL, 1.0);
    evas_object_size_hint_weight_set(popup, EVAS_HINT_EXPAND, EVAS_HINT_EXPAND);
    elm_object_text_set(popup, text);
    elm_popup_timeout_set(popup, timeout);
    evas_object_smart_callback_add(popup, "timeout", timeout_cb, data);
    evas_object_show(popup);
    return popup;
}

void zv_ext_util_destroy_popup(Evas_Object *popup)
{
    ZV_LOG_ENTER();
    if (!popup) {
        ZV_LOGE("handle is NULL");
        return;
    }
    evas_object_del(popup);
}

// Row of the processing popup: the text.
static char *_zv_ext_util_txt_get(void *data, Evas_Object *obj, const char *part)
{
    (void)obj;
    if (!data) {
        ZV_LOGE("handle is NULL");
        return nullptr;
    }
    if (!part) {
        ZV_LOGE("part is NULL");
        return nullptr;
    }
    if (!strcmp(part, "elm.text.main.left"))
        return strdup(static_cast<const char *>(data));
    return nullptr;
}

// Row of the processing popup: a pulsing progress bar.
static Evas_Object *_zv_ext_util_content_get(void *data, Evas_Object *obj, const char *part)
{
    if (!data) {
        ZV_LOGE("handle is NULL");
        return nullptr;
    }
    if (!part) {
        ZV_LOGE("part is NULL");
        return nullptr;
    }
    if (strcmp(part, "elm.icon.1"))
        return nullptr;
    Evas_Object *layout = elm_layout_add(obj);
    elm_layout_theme_set(layout, "layout", "list/B/type.4", "default");
    Evas_Object *progress = elm_progressbar_add(layout);
    elm_object_style_set(progress, "process_small");
    evas_object_size_hint_align_set(progress, EVAS_HINT_FILL, 0.5);
    elm_progressbar_pulse_set(progress, EINA_TRUE);
    elm_progressbar_pulse(progress, EINA_TRUE);
    evas_object_show(progress);
    elm_object_part_content_set(layout, "elm.swallow.content", progress);
    return layout;
}

Evas_Object *zv_ext_util_create_list_popup(Evas_Object *parent, const char *text, double timeout,
                                           Evas_Smart_Cb timeout_cb, void *data)
{
    ZV_LOG_ENTER();
    if (!parent) {
        ZV_LOGE("parent is NULL");
        return nullptr;
    }
    if (!data) {
        ZV_LOGE("handle is NULL");
        return nullptr;
    }
    Evas_Object *popup = elm_popup_add(parent);
    elm_popup_align_set(popup, ELM_NOTIFY_ALIGN_FILL, 1.0);
    elm_object_style_set(popup, "default");
    evas_object_size_hint_weight_set(popup, EVAS_HINT_EXPAND, EVAS_HINT_EXPAND);

    Evas_Object *genlist = elm_genlist_add(popup);
    evas_object_size_hint_weight_set(genlist, EVAS_HINT_EXPAND, EVAS_HINT_EXPAND);
    evas_object_size_hint_align_set(genlist, EVAS_HINT_FILL, EVAS_HINT_FILL);
    {
        ItcPtr itc(elm_genlist_item_class_new());
        itc->item_style = "1line";
        itc->func.text_get = _zv_ext_util_txt_get;
        itc->func.content_get = _zv_ext_util_content_get;
        elm_genlist_item_append(genlist, itc.get(), text, nullptr, ELM_GENLIST_ITEM_NONE, nullptr,
                                nullptr);
    }
    evas_object_show(genlist);

    Evas_Object *box = elm_box_add(popup);
    evas_object_size_hint_min_set(box, -1,
                                  (int)(120 * elm_config_scale_get() / elm_app_base_scale_get()));
    evas_object_size_hint_weight_set(box, EVAS_HINT_EXPAND, EVAS_HINT_EXPAND);
    evas_object_size_hint_align_set(box, EVAS_HINT_FILL, EVAS_HINT_FILL);
    elm_box_pack_end(box, genlist);
    elm_object_content_set(popup, box);

    if (timeout != 0.0) {
        evas_object_smart_callback_add(popup, "timeout", timeout_cb, data);
        elm_popup_timeout_set(popup, timeout);
    }
    evas_object_show(popup);
    return popup;
}

// Row of the account popup: the account's display name.
static char *_zv_ext_util_text_get(void *data, Evas_Object *obj, const char *part)
{
    (void)obj;
    if (!data) {
        ZV_LOGE("data is NULL");
        return nullptr;
    }
    auto *account = static_cast<account_info *>(data);
    if (part && !strcmp(part, "elm.text.main.left") && account->display_name)
        return strdup(account->display_name);
    return nullptr;
}

Evas_Object *zv_ext_util_create_account_select_popup(Evas_Object *parent, const char *title,
                                                     GList *account_list, Evas_Smart_Cb select_cb,
                                                     void *data)
{
    ZV_LOG_ENTER();
    if (!parent) {
        ZV_LOGE("parent is NULL");
        return nullptr;
    }
    if (!data) {
        ZV_LOGE("userp is NULL");
        return nullptr;
    }
    Evas_Object *popup = elm_popup_add(parent);
    elm_popup_align_set(popup, ELM_NOTIFY_ALIGN_FILL, 1.0);
    elm_object_style_set(popup, "theme_bg");
    elm_object_part_text_set(popup, "title,text", title);
    evas_object_size_hint_weight_set(popup, EVAS_HINT_EXPAND, EVAS_HINT_EXPAND);

    ItcPtr itc(elm_genlist_item_class_new());
    itc->item_style = "1line";
    itc->func.text_get = _zv_ext_util_text_get;

    Evas_Object *genlist = elm_genlist_add(popup);
    evas_object_size_hint_weight_set(genlist, EVAS_HINT_EXPAND, EVAS_HINT_EXPAND);
    evas_object_size_hint_align_set(genlist, EVAS_HINT_FILL, EVAS_HINT_FILL);
    elm_genlist_homogeneous_set(genlist, EINA_TRUE);
    elm_genlist_mode_set(genlist, ELM_LIST_COMPRESS);

    int position = 0;
    for (GList *l = account_list; l; l = l->next, position++) {
        auto *account = static_cast<account_info *>(l->data);
        if (!account) {
            ZV_LOGE("No account_info item");
            continue;
        }
        account->position = position;
        account->user_data = data;
        elm_genlist_item_append(genlist, itc.get(), account, nullptr, ELM_GENLIST_ITEM_NONE,
                                select_cb, account);
    }
    itc.reset();
    evas_object_show(genlist);
    elm_object_content_set(popup, genlist);
    evas_object_show(popup);
    return popup;
}

int64_t zv_ext_util_get_file_size(const char *path)
{
    ZV_LOG_ENTER();
    if (!path) {
        ZV_LOGE("path name is NULL");
        return -1;
    }
    FilePtr file(fopen(path, "rb"));
    if (!file) {
        ZV_LOGE("Unable to open file");
        return -1;
    }
    if (fseeko(file.get(), 0, SEEK_END) != 0)
        return -1;
    off_t size = ftello(file.get());
    if (size == -1)
        ZV_LOGE("ERROR: ftell in zuvo \n");
    return static_cast<int64_t>(size);
}

time_t zv_ext_util_generate_id(void)
{
    ZV_LOG_ENTER();
    time_t now = time(nullptr);
    struct tm local;
    localtime_r(&now, &local);
    return mktime(&local);
}

bool zv_ext_util_is_count_format(const char *fmt)
{
    if (!fmt)
        return false;
    int conversions = 0;
    for (const char *p = fmt; *p; p++) {
        if (*p != '%')
            continue;
        p++;
        if (*p == '%')
            continue;
        while (*p && strchr("0123456789-+ #$", *p))
            p++;
        if (*p != 'd' && *p != 'i')
            return false;
        conversions++;
    }
    return conversions == 1;
}
