// Job intake and write-back: history rows become UploadItem records of the job list, and at
// shutdown the rows of unfinished jobs are set back so that the next start picks them up.
#include "zv-upload-list.h"

#include <assert.h>

#include "zv-ext-db.h"
#include "zv-ext-media.h"
#include "zv-log.h"
#include "zv-upload-main.h"

namespace
{

// A new job from a history row, with the thumbnail and display name of its file. A READY
// row is stored as WAITING first.
UploadItem *make_job(DbItem *row)
{
    if (row->status == ZV_UPLOAD_STATUS_READY) {
        row->status = ZV_UPLOAD_STATUS_WAITING;
        zv_ext_db_update_item(row);
    }

    UploadItem *job_item = g_new0(UploadItem, 1);
    assert(job_item);
    job_item->historyid = row->historyid;
    job_item->userid = g_strdup(row->userid);
    job_item->title = g_strdup(row->title);
    job_item->filename = g_strdup(row->filename);
    job_item->url = g_strdup(row->url);
    job_item->filesize = row->filesize;
    job_item->percent = row->percent;
    job_item->status = row->status;
    job_item->date = row->date;
    if (job_item->filename)
        zv_ext_media_get_thumb_info(job_item->filename, &job_item->thumb_path,
                                    &job_item->display_name);
    return job_item;
}

void load_items(AppData *ad, int (*load)(GList **list))
{
    GList *rows = nullptr;
    load(&rows);
    int index = 0;
    for (GList *l = rows; l; l = l->next, index++) {
        DbItem *row = static_cast<DbItem *>(l->data);
        if (!row) {
            ZV_LOGE("item is null:%d", index);
            continue;
        }
        ad->job_list = g_list_prepend(ad->job_list, make_job(row));
    }
    if (rows)
        zv_ext_db_free_item_list(rows);
}

} // namespace

void zv_upload_list_load_full_item(AppData *ad)
{
    ZV_LOG_ENTER();
    if (!ad) {
        ZV_LOGE("resp data is NULL");
        return;
    }
    load_items(ad, zv_ext_db_load_full_item_list);
}

void zv_upload_list_load_ready_item(AppData *ad)
{
    ZV_LOG_ENTER();
    if (!ad) {
        ZV_LOGE("resp data is NULL");
        return;
    }
    load_items(ad, zv_ext_db_load_ready_item_list);
}

void zv_upload_list_reset_full_item(AppData *ad)
{
    ZV_LOG_ENTER();
    if (!ad) {
        ZV_LOGE("resp data is NULL");
        return;
    }
    GList *rows = nullptr;
    zv_ext_db_load_full_item_list(&rows);
    int index = 0;
    for (GList *l = rows; l; l = l->next, index++) {
        DbItem *row = static_cast<DbItem *>(l->data);
        if (!row) {
            ZV_LOGE("item is null:%d", index);
            continue;
        }
        if (row->status == ZV_UPLOAD_STATUS_WAITING)
            row->status = ZV_UPLOAD_STATUS_READY;
        else if (row->status == ZV_UPLOAD_STATUS_UPLOADING)
            row->status = ZV_UPLOAD_STATUS_PAUSED;
        else
            continue;
        zv_ext_db_update_item(row);
    }
    if (rows)
        zv_ext_db_free_item_list(rows);
}

void zv_upload_list_store_item(const UploadItem *job_item)
{
    if (!job_item) {
        ZV_LOGE("item is NULL");
        return;
    }
    DbItem db_item = {};
    db_item.historyid = job_item->historyid;
    db_item.percent = job_item->percent;
    db_item.status = job_item->status;
    db_item.url = g_strdup(job_item->url);
    zv_ext_db_update_item(&db_item);
    g_free(db_item.url);
}
