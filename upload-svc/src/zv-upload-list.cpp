// Job intake and write-back: history rows become UploadItem records of the job list, and at
// shutdown the rows of unfinished jobs are set back so that the next start picks them up.
#include "zv-upload-list.h"

#include <assert.h>

#include <set>
#include <vector>

#include "zv-ext-db.h"
#include "zv-ext-media.h"
#include "zv-ext-util.h"
#include "zv-log.h"
#include "zv-upload-main.h"

namespace
{

// Jobs whose last store failed (history locked past the busy handler, disk full), by
// historyid: they are stored again at the next store that succeeds, at the next launch
// request, and by a timer, until the history holds their real status. Main loop only.
std::set<int> g_unsaved;
Ecore_Timer *g_retry_timer = nullptr;
constexpr double kRetrySeconds = 1.0;

bool write_row(const UploadItem *job_item)
{
    DbItem db_item = {};
    db_item.historyid = job_item->historyid;
    db_item.percent = job_item->percent;
    db_item.status = job_item->status;
    db_item.url = g_strdup(job_item->url);
    bool stored = zv_ext_db_update_item(&db_item) == 1;
    g_free(db_item.url);
    return stored;
}

UploadItem *job_of(AppData *ad, int historyid)
{
    for (GList *l = ad ? ad->job_list : nullptr; l; l = l->next) {
        UploadItem *job_item = static_cast<UploadItem *>(l->data);
        if (job_item && job_item->historyid == historyid)
            return job_item;
    }
    return nullptr;
}

Eina_Bool retry_cb(void *)
{
    g_retry_timer = nullptr;
    zv_upload_list_store_pending(zv_ext_util_get_appdata());
    return ECORE_CALLBACK_CANCEL;
}

void remember_unsaved(int historyid)
{
    g_unsaved.insert(historyid);
    if (!g_retry_timer)
        g_retry_timer = ecore_timer_add(kRetrySeconds, retry_cb, nullptr);
}

// A new job from a history row, with the thumbnail and display name of its file. A READY
// row is stored as WAITING first.
UploadItem *make_job(DbItem *row)
{
    bool unsaved = false;
    if (row->status == ZV_UPLOAD_STATUS_READY) {
        row->status = ZV_UPLOAD_STATUS_WAITING;
        unsaved = zv_ext_db_update_item(row) != 1;
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
    // A row left READY would be taken again by the next launch request; the job is stored
    // again until the row says WAITING.
    if (unsaved)
        remember_unsaved(job_item->historyid);
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
        // A history row is one job: a row already taken (its store as WAITING failed, so it
        // still reads READY) is not loaded a second time.
        if (job_of(ad, row->historyid)) {
            ZV_LOGI("row %d is already a job", row->historyid);
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

bool zv_upload_list_store_item(const UploadItem *job_item)
{
    if (!job_item) {
        ZV_LOGE("item is NULL");
        return false;
    }
    if (!write_row(job_item)) {
        remember_unsaved(job_item->historyid);
        return false;
    }
    g_unsaved.erase(job_item->historyid);
    if (!g_unsaved.empty())
        zv_upload_list_store_pending(zv_ext_util_get_appdata());
    return true;
}

void zv_upload_list_store_pending(AppData *ad)
{
    const std::vector<int> pending(g_unsaved.begin(), g_unsaved.end());
    g_unsaved.clear();
    for (int historyid : pending) {
        const UploadItem *job_item = job_of(ad, historyid);
        if (job_item && !write_row(job_item))
            g_unsaved.insert(historyid);
    }
    if (!g_unsaved.empty() && !g_retry_timer)
        g_retry_timer = ecore_timer_add(kRetrySeconds, retry_cb, nullptr);
}

void zv_upload_list_forget_pending(void)
{
    g_unsaved.clear();
    if (g_retry_timer) {
        ecore_timer_del(g_retry_timer);
        g_retry_timer = nullptr;
    }
}
