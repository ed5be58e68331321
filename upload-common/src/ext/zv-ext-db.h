// Upload history store: the SQLite database shared with the companion client.
// One process-wide connection; every operation runs on the caller's thread (the main loop
// in the service, the command line in the companion). Booleans are int 1 or 0.
// Thread safety: none of its own. In the service every call comes from the main loop only;
// the companion process shares the file through SQLite's locking and the busy handler,
// which lets each statement wait up to 1.5 s for the other process's lock.
// The file is ZV_HISTORY_DB, by default "/opt/usr/apps/zuvo-client/data/db/.zuvo-history.db".
#pragma once

#include <glib.h>
#include <stdint.h>

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
    int64_t filesize; // 64-bit, as the column: videos pass 2 GiB
    int percent;
    char *url;
    int status;
    double date;
};

// Opens the connection and prepares the schema (true at once when already open). A file
// that cannot be opened or is not a database leaves the store closed and answers false;
// a later call tries again. Every other operation fails while the store is closed.
int zv_ext_db_open(void);
void zv_ext_db_close(void);
// Drops every completed row when the table holds more than 5000 rows, then inserts the
// record's fields. True once the statement was prepared, whatever its step gave.
int zv_ext_db_insert_item(DbItem *item);
int zv_ext_db_delete_item(int historyid);
// Writes only percent, status and url (a NULL url clears it) of the rows with the item's
// historyid. True when the row was written; false also when the statement ran but failed
// (history locked past the busy handler, disk full), so that the row can be stored again.
int zv_ext_db_update_item(DbItem *item);
// Loads append fresh DbItem records to *list (start from NULL), oldest date first; the
// caller releases the list with zv_ext_db_free_item_list.
int zv_ext_db_load_full_item_list(GList **list);
int zv_ext_db_load_ready_item_list(GList **list);
int zv_ext_db_free_item_list(GList *list);
// Counts by status group: active 0-3, completed 4, full 0-4, uploading 1 and 3. -1 when the
// statement cannot be prepared (or the store is closed), 0 on the other failures.
int zv_ext_db_get_active_count(void);
int zv_ext_db_get_completed_count(void);
int zv_ext_db_get_full_count(void);
int zv_ext_db_get_uploading_count(void);
