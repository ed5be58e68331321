// System notifications: the ongoing and completion notifications of the upload service and
// its status message, over the platform's notification service. Both notifications are found
// by their tags; the module's handles only record what this process made.
#include "zv-ext-noti.h"

#include <app.h>
#include <glib.h>
#include <notification.h>

#include <string>

#include "zv-log.h"

namespace
{

const char kOngoingTag[] = "zuvo_ongoing_noti";
const char kCompleteTag[] = "zuvo_complete_noti";
const char kAppId[] = "zuvo-upload-svc";
const int kDisplayOnCreate = NOTIFICATION_DISPLAY_APP_NOTIFICATION_TRAY |
                             NOTIFICATION_DISPLAY_APP_TICKER | NOTIFICATION_DISPLAY_APP_INDICATOR;

struct NotiState {
    notification_h ongoing = nullptr;
    notification_h complete = nullptr;
};

NotiState g_noti;

void set_text_logged(notification_h noti, notification_text_type_e type, const char *text)
{
    int ret = notification_set_text(noti, type, text, nullptr, NOTIFICATION_VARIABLE_TYPE_NONE);
    if (ret != NOTIFICATION_ERROR_NONE)
        ZV_LOGE("Fail to notification_set_text : %d", ret);
}

// Title, content, count text and (when progress is not negative) progress, as create and
// update both set them.
void set_ongoing_texts(notification_h noti, const char *title_text, const char *sub_txt,
                       int current, int total, double progress)
{
    set_text_logged(noti, NOTIFICATION_TEXT_TYPE_TITLE, title_text);
    set_text_logged(noti, NOTIFICATION_TEXT_TYPE_CONTENT, sub_txt);
    gchar *count = total > 1 ? g_strdup_printf("[%d/%d]", current, total) : g_strdup("");
    set_text_logged(noti, NOTIFICATION_TEXT_TYPE_EVENT_COUNT, count);
    g_free(count);
    if (progress >= 0.0) {
        int ret = notification_set_progress(noti, progress);
        if (ret != NOTIFICATION_ERROR_NONE)
            ZV_LOGE("Fail to notification_set_progress : %d", ret);
    }
}

void set_display_applist_logged(notification_h noti, int applist)
{
    int ret = notification_set_display_applist(noti, applist);
    if (ret != NOTIFICATION_ERROR_NONE)
        ZV_LOGE("Fail to notification_set_display_applist : %d", ret);
}

void set_tag_logged(notification_h noti, const char *tag)
{
    int ret = notification_set_tag(noti, tag);
    if (ret != NOTIFICATION_ERROR_NONE)
        ZV_LOGE("Fail to notification_set_tag : %d", ret);
}

// What the ongoing notification shows now, as this process last posted it. A progress
// report of a one-job batch asks for an update per read of the file; one that would show the
// same texts, count and bar is not written to the tray again.
struct OngoingShown {
    bool valid = false;
    std::string title;
    std::string sub;
    int current = 0;
    int total = 0;
    double progress = 0;

    bool same(const char *t, const char *s, int c, int n, double p) const
    {
        return valid && title == t && sub == s && current == c && total == n && progress == p;
    }
    void set(const char *t, const char *s, int c, int n, double p)
    {
        *this = {true, t, s, c, n, p};
    }
};
OngoingShown g_shown;

} // namespace

int zuvo_ext_noti_ongoing_noti_create(const char *title_text, const char *sub_txt, int current,
                                      int total, double progress)
{
    ZV_LOG_ENTER();
    if (!title_text) {
        ZV_LOGE("title_text is NULL");
        return 0;
    }
    if (!sub_txt) {
        ZV_LOGE("sub_txt is NULL");
        return 0;
    }
    zuvo_ext_noti_ongoing_noti_destroy();

    notification_h noti = notification_create(NOTIFICATION_TYPE_ONGOING);
    if (!noti) {
        ZV_LOGE("Fail to ui_notification_create");
        return 0;
    }
    set_ongoing_texts(noti, title_text, sub_txt, current, total, progress);
    set_display_applist_logged(noti, kDisplayOnCreate);
    set_tag_logged(noti, kOngoingTag);

    // The handle is not posted yet, so ongoing destroy (which works by tag) cannot reach it:
    // a failed create releases it here.
    app_control_h app_control = nullptr;
    int ret = app_control_create(&app_control);
    if (ret != APP_CONTROL_ERROR_NONE) {
        zuvo_ext_noti_ongoing_noti_destroy();
        ZV_LOGE("app_control_create is fail : %d", ret);
        notification_free(noti);
        return 0;
    }
    ret = app_control_set_app_id(app_control, kAppId);
    if (ret != APP_CONTROL_ERROR_NONE) {
        app_control_destroy(app_control);
        ZV_LOGE("app_control_set_app_id error : %d", ret);
        zuvo_ext_noti_ongoing_noti_destroy();
        notification_free(noti);
        return 0;
    }
    ret = notification_set_launch_option(noti, NOTIFICATION_LAUNCH_OPTION_APP_CONTROL, app_control);
    if (ret != NOTIFICATION_ERROR_NONE) {
        app_control_destroy(app_control);
        ZV_LOGE("notification_set_launch_option error : %d", ret);
        zuvo_ext_noti_ongoing_noti_destroy();
        notification_free(noti);
        return 0;
    }
    app_control_destroy(app_control);

    ret = notification_post(noti);
    if (ret != NOTIFICATION_ERROR_NONE) {
        ZV_LOGE("Fail to notification_insert : %d", ret);
        zuvo_ext_noti_ongoing_noti_destroy();
        notification_free(noti);
        return 0;
    }
    if (g_noti.ongoing)
        notification_free(g_noti.ongoing);
    g_noti.ongoing = noti;
    g_shown.set(title_text, sub_txt, current, total, progress);
    return 1;
}

void zuvo_ext_noti_ongoing_noti_update(const char *title_text, const char *sub_txt, int current,
                                       int total, double progress)
{
    if (!title_text) {
        ZV_LOGE("title_text is NULL");
        return;
    }
    if (!sub_txt) {
        ZV_LOGE("sub_txt is NULL");
        return;
    }
    if (g_shown.same(title_text, sub_txt, current, total, progress))
        return;
    notification_h noti = notification_load_by_tag(kOngoingTag);
    if (!noti) {
        ZV_LOGI("ongoing_noti_h is NULL. So, create it.");
        zuvo_ext_noti_ongoing_noti_create(title_text, sub_txt, current, total, progress);
        return;
    }
    set_ongoing_texts(noti, title_text, sub_txt, current, total, progress);
    set_tag_logged(noti, kOngoingTag);
    set_display_applist_logged(noti, NOTIFICATION_DISPLAY_APP_NOTIFICATION_TRAY);
    int ret = notification_update(noti);
    if (ret != NOTIFICATION_ERROR_NONE)
        ZV_LOGE("Fail to notification_update : %d", ret);
    else
        g_shown.set(title_text, sub_txt, current, total, progress);
    notification_free(noti);
}

void zuvo_ext_noti_ongoing_noti_destroy(void)
{
    ZV_LOG_ENTER();
    g_shown.valid = false;
    notification_h noti = notification_load_by_tag(kOngoingTag);
    if (!noti) {
        dlog_print(DLOG_WARN, ZV_LOG_TAG,
                   "%s: %s(%d) > " ZV_LOG_GREEN
                   "[TID:%d] Zuvo Noti Ongoing Tag is not existed. ===" ZV_LOG_RESET,
                   __FILE_NAME__, __func__, __LINE__, (int)gettid());
        return;
    }
    int ret = notification_delete(noti);
    if (ret != NOTIFICATION_ERROR_NONE) {
        ZV_LOGE("Fail to notification_delete : %d", ret);
        return;
    }
    ret = notification_free(noti);
    if (ret != NOTIFICATION_ERROR_NONE) {
        ZV_LOGE("Fail to notification_free : %d", ret);
        return;
    }
    if (g_noti.ongoing) {
        notification_free(g_noti.ongoing);
        g_noti.ongoing = nullptr;
    }
}

int zuvo_ext_noti_complete_noti_create(const char *title_text, const char *sub_txt)
{
    ZV_LOG_ENTER();
    if (!title_text) {
        ZV_LOGE("title_text is NULL");
        return 0;
    }
    if (!sub_txt) {
        ZV_LOGE("sub_txt is NULL");
        return 0;
    }
    zuvo_ext_noti_ongoing_noti_destroy();
    zuvo_ext_noti_complete_noti_destroy();

    g_noti.complete = notification_create(NOTIFICATION_TYPE_NOTI);
    if (!g_noti.complete) {
        ZV_LOGE("Fail to ui_notification_create");
        return 0;
    }
    notification_h noti = g_noti.complete;
    int ret = notification_set_property(noti, NOTIFICATION_PROP_DISABLE_APP_LAUNCH);
    if (ret != NOTIFICATION_ERROR_NONE)
        ZV_LOGE("Fail to notification_set_property : %d", ret);
    set_text_logged(noti, NOTIFICATION_TEXT_TYPE_TITLE, title_text);
    set_text_logged(noti, NOTIFICATION_TEXT_TYPE_CONTENT, sub_txt);
    ret = notification_set_time(noti, 0);
    if (ret != NOTIFICATION_ERROR_NONE)
        ZV_LOGE("Fail to notification_set_time : %d", ret);
    set_display_applist_logged(noti, kDisplayOnCreate);
    set_tag_logged(noti, kCompleteTag);

    ret = notification_post(noti);
    if (ret != NOTIFICATION_ERROR_NONE) {
        ZV_LOGE("Fail to notification_insert : %d", ret);
        return 0;
    }
    return 1;
}

void zuvo_ext_noti_complete_noti_destroy(void)
{
    ZV_LOG_ENTER();
    if (!g_noti.complete) {
        ZV_LOGE("noti handle is NULL");
        return;
    }
    int ret = notification_free(g_noti.complete);
    if (ret != NOTIFICATION_ERROR_NONE) {
        ZV_LOGE("Fail to notification_free : %d", ret);
        return;
    }
    g_noti.complete = nullptr;
}

void zuvo_ext_noti_message_post(const char *message)
{
    ZV_LOG_ENTER();
    int ret = notification_status_message_post(message);
    if (ret != NOTIFICATION_ERROR_NONE)
        ZV_LOGE("Fail to notification_status_message_post : %d", ret);
}
