// Upload history store: the SQLite database shared with the companion client.
// One process-wide connection; every operation runs on the caller's thread (the main loop
// in the service, the command line in the companion). Booleans are int 1 or 0.
#pragma once

#include <glib.h>

// The status column of a history row, shared with the companion client.
typedef enum {
    ZV_UPLOAD_STATUS_READY = 0,
    ZV_UPLOAD_STATUS_WAITING = 1,
    ZV_UPLOAD_STATUS_PAUSED = 2,
    ZV_UPLOAD_STATUS_UPLOADING = 3,
    ZV_UPLOAD_STATUS_COMPLETED = 4,
} UploadStatus;

// One history row as the store reads and updates it. Strings are owned copies; NULL
// columns stay NULL.
struct DbItem {
    int historyid;
    char *userid;
    char *title;
    char *filename;
    int filesize;
    int percent;
    char *url;
    int status;
    double date;
};

int zv_ext_db_open(void);
void zv_ext_db_close(void);
int zv_ext_db_insert_item(DbItem *item);
int zv_ext_db_delete_item(int historyid);
int zv_ext_db_update_item(DbItem *item);
int zv_ext_db_load_full_item_list(GList **list);
int zv_ext_db_load_ready_item_list(GList **list);
int zv_ext_db_free_item_list(GList *list);
int zv_ext_db_get_active_count(void);
int zv_ext_db_get_completed_count(void);
int zv_ext_db_get_full_count(void);
int zv_ext_db_get_uploading_count(void);
