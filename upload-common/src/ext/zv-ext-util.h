// Small building blocks of the adapter layer: the process-wide application context, a timed
// message popup, a processing popup with a busy indicator, an account-choice popup, a file
// size probe and an id generator. Thread safety: main loop only; the context is stored once
// before any reader runs.
#pragma once

#include <Elementary.h>
#include <glib.h>
#include <stdint.h>
#include <time.h>

struct AppData;

// One account as the companion client describes it. The account popup reads display_name
// and writes position and user_data; the other fields are the caller's.
struct account_info {
    int account_id;
    char *display_name;
    char *user_id;
    int position;
    void *user_data;
};

// Stores the context the first time it is given a non-null one; later calls keep it.
void zv_ext_util_set_appdata(AppData *ad);
// The stored context, or NULL before it was set.
AppData *zv_ext_util_get_appdata(void);

// A bottom-aligned popup showing text; after timeout seconds it emits "timeout", which calls
// timeout_cb with data. NULL when parent or data is NULL.
Evas_Object *zv_ext_util_create_popup(Evas_Object *parent, const char *text, double timeout,
                                      Evas_Smart_Cb timeout_cb, void *data);
void zv_ext_util_destroy_popup(Evas_Object *popup);
// A popup with one row: text and a pulsing progress bar. A timeout of 0.0 keeps it up until
// it is deleted (no "timeout" callback). NULL when parent or data is NULL.
Evas_Object *zv_ext_util_create_list_popup(Evas_Object *parent, const char *text, double timeout,
                                           Evas_Smart_Cb timeout_cb, void *data);
// A popup listing the account_info records of account_list (null entries skipped); a tap
// calls select_cb with the record as data. The records must outlive the popup.
Evas_Object *zv_ext_util_create_account_select_popup(Evas_Object *parent, const char *title,
                                                     GList *account_list, Evas_Smart_Cb select_cb,
                                                     void *data);

// Size of the file in bytes, or -1 when it cannot be opened or sought. 64-bit: videos pass
// 2 GiB.
int64_t zv_ext_util_get_file_size(const char *path);
// The current local calendar time as an id; two ids of the same second are equal.
time_t zv_ext_util_generate_id(void);
// True when a translated format holds exactly one conversion and it takes an int ("%d",
// "%i", with flags and width): only then may a count be printed with it.
bool zv_ext_util_is_count_format(const char *fmt);
