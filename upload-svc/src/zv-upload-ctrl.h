// Upload controller: turns history rows into jobs, runs each job through its metadata and
// data uploads, pauses and resumes them, follows network changes and keeps the ongoing and
// completion notifications in line with the batch counters.
//
// Threads: everything here runs on the main loop except _zv_upload_ctrl_resp_cb and
// _zv_upload_ctrl_progress_cb, which the service client calls on the transfer worker while
// the engine holds its lock. Those two never touch an UploadItem nor walk job_list: they
// look the job up in the controller's own table of requests in flight, write the job's new
// status, upload address, offset and percent there under the controller's mutex, and post a
// PipeMessage. The pipe handlers, on the main loop, copy those values into the job before
// they act on it, so the main loop is the only writer of every UploadItem.
#pragma once

#include "zv-plugin-main.h"
#include "zv-upload-main.h"

// What every controller pipe carries: the job the event is about.
struct PipeMessage {
    int historyid;
    int reserved; // always 0
};
static_assert(sizeof(PipeMessage) == 8, "a pipe message is 8 bytes");

// Once, from the create callback: fills the six operations of ad, makes the pipes, registers
// the network callbacks, starts the service client and the media connection, loads every
// history row as a job and publishes ad.
void zv_upload_ctrl_initialize(AppData *ad);
// At the start of every launch request: clears is_paused and recounts total_count.
void zv_upload_ctrl_init_value(AppData *ad);
// After the launch request's extras are read: takes the new rows as jobs, rebuilds the list
// view, starts every job that waits or uploads (newest first, one idler each) when the
// network is usable, and brings the notifications in line. False only for a null ad.
bool zv_upload_ctrl_service(AppData *ad);
// Once, from the terminate callback: stops everything, writes WAITING rows back as READY
// and UPLOADING rows as PAUSED, releases the jobs and deletes the window.
void zv_upload_ctrl_finalize(AppData *ad);
// Brings the ongoing and completion notifications in line with completed_count and
// total_count; job_item (may be null) is the job whose event caused the call.
void zv_upload_ctrl_post_notification(AppData *ad, UploadItem *job_item);

// The operations of AppData (main loop).
void _zv_upload_ctrl_meta_data_upload(AppData *ad, UploadItem *job_item);
void _zv_upload_ctrl_data_upload(AppData *ad, UploadItem *job_item);
void _zv_upload_ctrl_pause_upload(AppData *ad, UploadItem *job_item);
void _zv_upload_ctrl_resume_upload(AppData *ad, UploadItem *job_item);
// Releases a job that is no longer in job_list: its request, its list items and its record;
// with delete_from_db also its history row.
void _zv_upload_ctrl_delete_item(UploadItem *job_item, bool delete_from_db);
void _zv_upload_ctrl_exit(AppData *ad);

// Finders: the first job of job_list with that id, or whose request is that handle (main
// loop only); null when none.
UploadItem *_zv_upload_ctrl_find_item_by_id(AppData *ad, int historyid);
UploadItem *_zv_upload_ctrl_find_item(AppData *ad, ServiceRequest *handle);

// The service client's callbacks for every request of the controller (worker thread).
void _zv_upload_ctrl_resp_cb(int result, ServiceResponse *resp_data, void *user_data);
void _zv_upload_ctrl_progress_cb(ServiceRequest *handle, int percent, void *user_data);

// Pipe handlers (main loop); data is the AppData, buf a PipeMessage.
void _zv_upload_ctrl_pipe_upload_cb(void *data, void *buf, unsigned int nbyte);
void _zv_upload_ctrl_pipe_update_progress_cb(void *data, void *buf, unsigned int nbyte);
void _zv_upload_ctrl_pipe_change_cb(void *data, void *buf, unsigned int nbyte);
void _zv_upload_ctrl_pipe_complete_cb(void *data, void *buf, unsigned int nbyte);

// Network monitor callbacks (main loop): every one pauses each UPLOADING job; the
// configuration callback first hands the new address and proxy to the service client and
// releases both strings.
void _zv_upload_ctrl_net_status_cb(int state, void *userp);
void _zv_upload_ctrl_net_type_cb(int type, void *userp);
void _zv_upload_ctrl_net_conf_change_cb(char *ip, char *proxy, void *userp);
