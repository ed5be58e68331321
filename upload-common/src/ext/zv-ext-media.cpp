// Media library lookup: finds a video by its path in the platform's media content database
// and hands out copies of its thumbnail path and display name.
#include "zv-ext-media.h"

#include <media_content.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>

#include "zv-log.h"

namespace
{

const size_t kConditionSize = 2048;

} // namespace

static bool _zv_ext_media_iterate_cb(media_info_h media, void *user_data)
{
    if (!media)
        return false;
    media_info_h *slot = static_cast<media_info_h *>(user_data);
    media_info_clone(slot, media);

    char *thumb_path = nullptr;
    char *display_name = nullptr;
    media_info_get_thumbnail_path(media, &thumb_path);
    media_info_get_display_name(media, &display_name);
    ZV_LOGI("Thumb path : %s", thumb_path ? thumb_path : "(null)");
    ZV_LOGI("display name : %s", display_name ? display_name : "(null)");
    free(thumb_path);
    free(display_name);
    return false;
}

int zv_ext_media_init(void)
{
    ZV_LOG_ENTER();
    int ret = media_content_connect();
    if (ret != MEDIA_CONTENT_ERROR_NONE) {
        ZV_LOGE("connect fail:%d", ret);
        return 0;
    }
    return 1;
}

int zv_ext_media_deinit(void)
{
    ZV_LOG_ENTER();
    int ret = media_content_disconnect();
    if (ret != MEDIA_CONTENT_ERROR_NONE) {
        ZV_LOGE("disconnect fail:%d", ret);
        return 0;
    }
    return 1;
}

int zv_ext_media_get_thumb_info(const char *file_path, char **thumb_path, char **display_name)
{
    ZV_LOG_ENTER();
    if (!file_path || !thumb_path || !display_name) {
        ZV_LOGE("data is NULL");
        return 0;
    }
    char condition[kConditionSize];
    memset(condition, 0, sizeof condition);
    media_info_h item = nullptr;
    char *found_thumb = nullptr;
    char *found_name = nullptr;

    filter_h filter = nullptr;
    int ret = media_filter_create(&filter);
    if (ret != MEDIA_CONTENT_ERROR_NONE) {
        ZV_LOGE("media_filter_create fail:%d", ret);
        return 0;
    }

    snprintf(condition, sizeof condition, "MEDIA_TYPE = %d and %s= \"%s\"",
             MEDIA_CONTENT_TYPE_VIDEO, MEDIA_PATH, file_path);
    ret = media_filter_set_condition(filter, condition, MEDIA_CONTENT_COLLATE_DEFAULT);
    if (ret != MEDIA_CONTENT_ERROR_NONE) {
        ZV_LOGE("media_filter_set_condition fail:%d", ret);
        media_filter_destroy(filter);
        return 0;
    }

    ret = media_info_foreach_media_from_db(filter, _zv_ext_media_iterate_cb, &item);
    if (ret != MEDIA_CONTENT_ERROR_NONE) {
        ZV_LOGE("media_info_foreach_media_from_db fail:%d", ret);
        media_filter_destroy(filter);
        return 0;
    }

    if (item) {
        media_info_get_thumbnail_path(item, &found_thumb);
        media_info_get_display_name(item, &found_name);
        media_info_destroy(item);
    }

    ret = media_filter_destroy(filter);
    if (ret != MEDIA_CONTENT_ERROR_NONE) {
        ZV_LOGE("media_filter_destroy fail:%d", ret);
        free(found_thumb);
        free(found_name);
        return 0;
    }

    if (found_thumb) {
        *thumb_path = strdup(found_thumb);
        free(found_thumb);
    }
    if (found_name) {
        *display_name = strdup(found_name);
        free(found_name);
    }
    return 1;
}
