// Upload list view: one row per job of AppData's job_list with thumbnail, title, display
// name, progress bar and badge button, the no-uploads placeholder, the edit mode that removes
// jobs, the more menu and the hardware keys. The view owns no job data and reaches the
// controller only through the operations held in AppData.
// Thread safety: main loop only.
#pragma once

#include <Ecore.h>
#include <Elementary.h>

#include "zv-upload-main.h"

// Builds the list view (the list, or the placeholder when there is no job) and pushes its
// naviframe item once. Always 0.
int zv_upload_view_init(AppData *ad);
// Drops the view's navigation state (pops down to the list item, leaves edit mode). The
// list layout stays until the next zv_upload_view_init replaces it.
void zv_upload_view_destroy(AppData *ad);
// Switches the job's row, and its edit-mode row while edit mode is on, to the completed look.
void zv_upload_list_complete_item(UploadItem *job_item);
// Redraws the job's badge from its status: the upload picture while it is paused, the
// cancel picture otherwise.
void zv_upload_view_update_badge_button(UploadItem *job_item);

// Hardware keys, data: the AppData. The back key leaves edit mode, or else closes the menu
// and calls the exit operation; the more key toggles the menu outside edit mode.
void zv_upload_view_back_cb(void *data, Evas_Object *obj, void *event_info);
void zv_upload_view_morekey_cb(void *data, Evas_Object *obj, void *event_info);
// Raw key events, only logged; both return ECORE_CALLBACK_DONE.
Eina_Bool zv_upload_view_event_key_down_cb(void *data, int type, void *event);
Eina_Bool zv_upload_view_event_key_up_cb(void *data, int type, void *event);
