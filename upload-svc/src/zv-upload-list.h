// The upload job: one video of the job list, with the row's fields and what the controller
// and the list view need while the service runs. Records are made, shown and destroyed on
// the main loop; see zv-upload-ctrl.h for what the transfer worker may touch.
#pragma once

#include <Elementary.h>
#include <glib.h>

#include "zv-ext-db.h"

struct ServiceRequest;
struct AppData;

struct UploadItem {
    int historyid;
    Elm_Object_Item *gen_item;
    Elm_Object_Item *edit_gen_item;
    Evas_Object *check;
    bool checked;
    char *thumb_path;
    char *display_name;
    Evas_Object *badge_layout;
    Evas_Object *badge;
    ServiceRequest *handle;
    char *userid;
    char *title;
    char *filename;
    int64_t filesize; // 64-bit, as the history's column: videos pass 2 GiB
    int percent;
    char *url;
    int64_t offset; // the last byte index the server holds (status query); 0: from the start
    int status;
    double date;
    AppData *ad;
};

// Job loaders (main loop; a null ad logs "resp data is NULL"). Each row becomes a job
// prepended to ad->job_list, so the newest job stands first; a READY row is stored as
// WAITING first. The full load takes every row (completed ones included), the ready load
// only the rows recorded since.
void zv_upload_list_load_full_item(AppData *ad);
void zv_upload_list_load_ready_item(AppData *ad);
// Shutdown write-back: every WAITING row becomes READY, every UPLOADING row PAUSED.
void zv_upload_list_reset_full_item(AppData *ad);
// Stores the job: writes its percent, status and url into its history row. A store that
// fails is kept and tried again (at the next store that succeeds, by a timer, and by
// zv_upload_list_store_pending) until the row holds the job's real state; false when it
// failed this time.
bool zv_upload_list_store_item(const UploadItem *job_item);
// Stores every job whose last store failed, as it is now (jobs gone from ad's list are
// forgotten). Main loop.
void zv_upload_list_store_pending(AppData *ad);
// Drops the jobs waiting for a store and the retry timer (shutdown).
void zv_upload_list_forget_pending(void);
