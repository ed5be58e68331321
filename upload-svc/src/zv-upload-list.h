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
    int filesize;
    int percent;
    char *url;
    int offset;
    int status;
    double date;
    AppData *ad;
};
