// The service client: the requests of the video service (metadata upload, data upload, status
// query) and of its account service (login, token refresh), built as transfers of the transfer
// engine, and the dispatch of their answers to the caller.
//
// Threads: every function here runs on the main loop. The response and progress callbacks of
// a handle run on the engine's worker thread while the engine holds its lock: they must not
// call back into the client or the engine, nor touch user-interface objects.
#pragma once

#include "zv-plugin-curl.h"

// Kind of the request last issued on a handle; also tells what `value` of an answer holds.
typedef enum {
    ZV_RESP_TYPE_LOGIN = 1,        // value: token of the login answer's body
    ZV_RESP_TYPE_META_UPLOAD = 2,  // value: the upload address ("Location:")
    ZV_RESP_TYPE_DATA_UPLOAD = 3,  // value: the video id ("ETag:")
    ZV_RESP_TYPE_UPLOAD_QUERY = 4, // value: last byte index the server holds, as text
    ZV_RESP_TYPE_GET_TOKEN = 5,    // value: the new access token
} ServiceRespType;

// Results of the client's functions and of the response callback.
typedef enum {
    ZV_ERROR_NONE = 0,
    ZV_ERROR_HTTP = -999,                // answer with a status other than 200, 201, 308
    ZV_ERROR_REQUEST_FAIL = -998,        // failed transfer, or request not built or queued
    ZV_ERROR_INVALID_HANDLE = -997,
    ZV_ERROR_INVALID_ID = -996,
    ZV_ERROR_INVALID_PWD = -995,
    ZV_ERROR_INVALID_TOKEN = -994,
    ZV_ERROR_INVALID_TITLE = -993,
    ZV_ERROR_INVALID_DESCRIPTION = -992,
    ZV_ERROR_INVALID_CATEGORY = -991,
    ZV_ERROR_INVALID_KEYWORD = -990,
    ZV_ERROR_INVALID_PRIVACY = -989,     // reserved: no operation returns it
    ZV_ERROR_INVALID_FILE_PATH = -988,
    ZV_ERROR_INVALID_OFFSET = -987,
    ZV_ERROR_INVALID_REGION = -986,
    ZV_ERROR_INVALID_LOCATION = -985,
    ZV_ERROR_INVALID_GPS = -984,         // reserved: no operation returns it
    ZV_ERROR_INVALID_URL = -983,
    ZV_ERROR_KEY_STORAGE = -982,
} ServiceError;

struct ServiceRequest;
struct ServiceResponse;

// Receives the answer of a request: result 0 or a ServiceError, and the answer record, which
// (with its value) is released when the callback returns. Runs on the worker thread.
typedef void (*ServiceRespCb)(int result, ServiceResponse *resp_data, void *user_data);
// Receives the upload progress of a data upload in percent of the whole file. Worker thread.
typedef void (*ServiceProgressCb)(ServiceRequest *handle, int percent, void *user_data);

// The handle of one request. Owns every text field and its transfer. Made by
// zv_request_new (zero-filled), released by zv_request_free; fields are set by the setters.
struct ServiceRequest {
    TransferItem *transfer;
    int resp_type;
    ServiceRespCb resp_cb;
    ServiceProgressCb progress_cb;
    void *user_data;
    char *user_id;
    char *user_pwd;
    char *token;
    char *title;
    char *description;
    char *category;
    char *keyword;
    char *file_path;
    char *location;
    int privacy; // 0 public, 1 unlisted, 2 private
    double latitude; // 0.0 with longitude 0.0: no position known
    double longitude;
    char *upload_url;
    // 64-bit, as the transfer's: videos pass 2 GiB.
    int64_t file_offset; // index of the next byte of the file to send
    int64_t file_size;   // -1 when the file cannot be read
    char *region;
    char *refresh_token;
};

// One answer, handed to resp_cb. `value` is NULL unless the result is 0 and the answer held
// the value its response type expects.
struct ServiceResponse {
    ServiceRequest *handle;
    int http_code; // 0 when no answer arrived
    int resp_type;
    char *value;
};

// Starts the transfer engine once per process; true when it runs (started now or before).
bool zv_init_service();
// Stops the engine and drops the network info; does nothing before a start.
void zv_finalize_service();
// Stores copies of the current IP address and proxy (either may be NULL); the uploads and the
// status query hand them to their transfers.
void zv_set_netwrok_info(const char *ip, const char *proxy);

// A new zero-filled handle; never NULL.
ServiceRequest *zv_request_new();
// Cancels the handle's transfer in the engine, releases it and every text, then the handle.
// No callback of the handle runs after it returns.
int zv_request_free(ServiceRequest *zv_handle);

int zv_set_callback_func(ServiceRequest *zv_handle, ServiceRespCb resp_cb);
int zv_set_progress_callback_func(ServiceRequest *zv_handle, ServiceProgressCb progress_cb);
int zv_set_user_data(ServiceRequest *zv_handle, void *user_data);

// Text setters store a copy (an earlier copy is released); a NULL text is refused with the
// setter's code and leaves the field as it was.
int zv_set_attr_user_id(ServiceRequest *zv_handle, const char *user_id);
int zv_set_attr_user_pwd(ServiceRequest *zv_handle, const char *user_pwd);
int zv_set_attr_token(ServiceRequest *zv_handle, const char *token);
int zv_set_attr_upload_url(ServiceRequest *zv_handle, const char *url);
int zv_set_attr_title(ServiceRequest *zv_handle, const char *title);
int zv_set_attr_description(ServiceRequest *zv_handle, const char *description);
int zv_set_attr_category(ServiceRequest *zv_handle, const char *category);
int zv_set_attr_keyword(ServiceRequest *zv_handle, const char *keyword);
int zv_set_attr_privacy(ServiceRequest *zv_handle, int privacy);
// Also sets file_size to the file's size (-1 when it cannot be opened; still 0 returned).
int zv_set_attr_file_path(ServiceRequest *zv_handle, const char *file_path);
// `offset` is the last byte index the server holds (status query), or 0 for a fresh start:
// 0 stores 0, n > 0 stores n + 1; negative, and INT64_MAX (whose n + 1 overflows), are
// refused with -987. The file path may come later, so the file's size is checked by
// zv_request_data_upload.
int zv_set_attr_file_offset(ServiceRequest *zv_handle, int64_t offset);
int zv_set_attr_region(ServiceRequest *zv_handle, const char *region);
int zv_set_attr_location(ServiceRequest *zv_handle, const char *location);
int zv_set_attr_gps(ServiceRequest *zv_handle, double latitude, double longitude);
int zv_set_attr_refresh_token(ServiceRequest *zv_handle, const char *refresh_token);

// Request operations: 0 when the transfer is queued (exactly one resp_cb follows unless it is
// cancelled), or a ServiceError; nothing is queued then and the handle's attributes are kept.
// zv_request_data_upload refuses a file offset past the file's size with -987.
int zv_request_login(ServiceRequest *zv_handle);
int zv_request_get_token(ServiceRequest *zv_handle);
int zv_request_meta_upload(ServiceRequest *zv_handle);
int zv_request_data_upload(ServiceRequest *zv_handle);
int zv_request_upload_query(ServiceRequest *zv_handle);

// Act at once on the handle's transfer in the engine; -998 when there is none or the engine
// refuses.
int zv_request_upload_pause(ServiceRequest *zv_handle);
int zv_request_upload_resume(ServiceRequest *zv_handle);
int zv_request_upload_cancel(ServiceRequest *zv_handle);

// The transfers' callbacks (the handle is their user data). Worker thread, engine lock held.
void _zv_request_curl_resp_cb(int result, TransferResponse *resp_data, void *user_data);
void _zv_request_curl_progress_cb(int percent, void *user_data, int64_t file_size,
                                  int64_t file_offset);
