// The application context shared by the shell, the controller and the list view.
#pragma once

#include <Ecore.h>
#include <Elementary.h>
#include <glib.h>
#include <uxt.h>

#include "zv-upload-list.h"

struct AppData {
    Evas_Object *win;
    Evas_Object *layout;
    Evas_Object *navi;
    Evas_Object *bg;
    Evas_Object *conform;
    uxt_theme_color_table_h color_table;
    uxt_theme_font_table_h font_table;
    Evas_Object *pNoContent;
    Evas_Object *pGenlist;
    Evas_Object *pEditGenlist;
    Evas_Object *pListLayout;
    Evas_Object *pEditLayout;
    Evas_Object *pCtxPopup;
    Ecore_Event_Handler *key_down_handler;
    Ecore_Event_Handler *key_up_handler;

    // The controller's operations; the view reaches the controller only through these.
    void (*meta_data_upload)(AppData *ad, UploadItem *job_item);
    void (*data_upload)(AppData *ad, UploadItem *job_item);
    void (*pause_upload)(AppData *ad, UploadItem *job_item);
    void (*resume_upload)(AppData *ad, UploadItem *job_item);
    void (*delete_item)(UploadItem *job_item, bool delete_from_db);
    void (*exit)(AppData *ad);

    GList *job_list; // of UploadItem, newest first
    bool is_paused;
    char *access_token;
    char *category;
    char *description;
    char *tag;
    int access_type;
    bool use_location;
    int completed_count;
    int total_count;
};
