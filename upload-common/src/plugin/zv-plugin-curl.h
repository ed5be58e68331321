// HTTP transfer engine: transfer items (one HTTP request each, with the answer it collects)
// and the one worker thread that runs them on a libcurl multi handle.
//
// Threads:
// - The main loop calls zv_curl_init_service, zv_curl_finalize_service, zv_curl_send_request,
//   zv_curl_cancel_request, zv_curl_pause_request, zv_curl_resume_request, and the item
//   functions (zv_curl_new, zv_curl_free, zv_curl_delete and the setters).
// - The worker thread runs the multi loop, the libcurl callbacks and the completion report,
//   and so every item's response callback and progress callback. It calls them while it
//   holds the engine lock.
// - The engine lock guards the multi handle, every attached easy handle and the engine's
//   bookkeeping. The worker releases it while it waits in curl_multi_poll; send, cancel,
//   pause, resume, stop, zv_curl_free and zv_curl_delete wake the worker and take the lock
//   while it does not poll, so libcurl never sees the multi handle on two threads at once.
// - The lock is not recursive. A response or progress callback may call zv_curl_free,
//   zv_curl_new and zv_curl_delete (the engine knows it already holds the lock there), but
//   not send, cancel, pause, resume or stop: those refuse on the worker thread with
//   ZV_CURL_ERROR_OPERATION_FAILED and log why.
//
// Open files: every sent request belongs to the one multi handle. When the process's open-file
// limit cannot hold every transfer, at most as many run at once as it can hold (the multi
// handle's connections are capped likewise); the others wait inside the engine, in the order
// they were sent, and start as running ones end. An upload holds its file only while its
// transfer runs unpaused, and a completed request releases its easy handle, its file and its
// collected answer as soon as its response callback has returned.
//
// Ownership: the item record is the caller's. zv_curl_free empties it (the record stays
// valid); zv_curl_delete cancels its transfer, empties it and returns the record and its
// easy handle to the allocator; zv_curl_new on a pointer that holds an item does the same
// with the old item before it makes the new one.
#pragma once

#include <curl/curl.h>
#include <glib.h>
#include <stdint.h>
#include <stdio.h>

typedef enum {
    ZV_CURL_HTTP_METHOD_GET = 0,
    ZV_CURL_HTTP_METHOD_POST = 1,
    ZV_CURL_HTTP_METHOD_PUT = 2,
} ZvCurlHttpMethod;

// Result of every engine operation that has one. 1 and 2 are not used.
typedef enum {
    ZV_CURL_ERROR_NONE = 0,
    ZV_CURL_ERROR_INVALID_HANDLE = 3,
    ZV_CURL_ERROR_INVALID_PARAMETER = 4,
    ZV_CURL_ERROR_OPERATION_FAILED = 5,
} ZvCurlError;

// A joined header block or body handed to a response callback holds at most this many
// bytes, its terminating NUL included. A longer answer aborts its request.
#define ZV_CURL_MAX_RESPONSE_SIZE (5 * 1024 * 1024)

// One piece of an answer, as one libcurl header or write callback delivered it.
struct TransferChunk {
    int size;
    char *buf; // exactly size bytes, no terminator
};

// The answer of one completed request. Owned by the engine and released as soon as the
// response callback returns: copy what you keep.
struct TransferResponse {
    // 0 when no complete answer arrived (no connection, time-out, reset, an answer cut short
    // or past ZV_CURL_MAX_RESPONSE_SIZE; both texts are NULL then), -1 when the library
    // cannot tell.
    long http_code;
    char *header_data; // the raw header block with its CR LF line ends, or NULL
    char *write_data;  // the body followed by a NUL, or NULL
};

// Called once per completed request, on the worker thread, with the engine lock held.
// result is always ZV_CURL_ERROR_NONE: a request that failed shows it in http_code.
typedef void (*ZvCurlResponseCb)(int result, TransferResponse *resp_data, void *user_data);
// Called after every read of the upload file, on the worker thread, with the engine lock
// held. percent = file_offset / file_size * 100, truncated; 100 when file_size is 0.
// Sizes and offsets are 64-bit here and below: videos pass 2 GiB.
typedef void (*ZvCurlProgressCb)(int percent, void *user_data, int64_t file_size,
                                 int64_t file_offset);

// One HTTP request. Made zero-filled by zv_curl_new; fill it with the setters only.
struct TransferItem {
    CURL *curl; // made by zv_curl_send_request; released when the request completes
    ZvCurlResponseCb callback_func;
    ZvCurlProgressCb progress_cb_func;
    void *user_data; // handed back to both callbacks; not owned
    int method;      // ZvCurlHttpMethod; any value but POST and PUT sends a GET
    char *url;
    char *body; // sent as the POST fields when body_len is above 0
    int body_len;        // at most the length of body
    GList *header_list;  // char* lines such as "Name: value"; "Name:" removes that header
    int timeout;         // whole request, ms; 0 keeps the library default
    int connect_timeout; // connection phase, ms; 0 keeps the library default
    char *user_agent;
    FILE *file_stream; // the upload file, opened by the first read, closed when the transfer stops
    char *file_path;   // the file whose bytes are the body of a PUT
    int64_t file_size; // 64-bit: videos pass 2 GiB
    int64_t file_offset;    // next byte of the file to send; advanced by every read
    GList *write_data_list; // TransferChunk*: the response body as it arrived
    int write_data_len;
    GList *header_data_list; // TransferChunk*: the response header lines as they arrived
    int header_data_len;
    char *ip;    // stored only
    char *proxy; // used unless empty or beginning with "0.0.0.0"

    // Engine bookkeeping, guarded by the engine lock. Not for callers.
    struct curl_slist *engine_headers; // the header list the attached easy handle uses
    int engine_flags;
};

// Engine lifetime (main loop). Init starts the worker thread: ZV_CURL_ERROR_NONE or
// ZV_CURL_ERROR_OPERATION_FAILED. Finalize detaches every request still queued, running or
// paused (none of them is answered), wakes the worker and returns once it has ended.
int zv_curl_init_service(void);
void zv_curl_finalize_service(void);

// Queues the item's request: 0 when queued (the answer comes through callback_func), 3 for a
// NULL item, 4 without URL, 5 when libcurl refuses to make a handle or the engine is not
// running (no answer will come then). An item that was sent before gets a fresh easy
// handle; an earlier transfer of it still in the engine is cancelled, and the answer it
// collected is dropped.
int zv_curl_send_request(TransferItem *item);
// Detaches the item's request from the engine: no answer will come for it. 0, 3 (NULL item)
// or 4 (no URL, or never sent). Returns 0 for a request that has already completed.
int zv_curl_cancel_request(TransferItem *item);
// Holds the request where it is (no byte moves either way, the connection stays open) or
// lets it go on. 0, 3 or 4 as for cancel.
int zv_curl_pause_request(TransferItem *item);
int zv_curl_resume_request(TransferItem *item);

// Item records. zv_curl_new empties and releases an item that *item already holds (its
// transfer is cancelled), then stores a new zero-filled record. Returns 0.
int zv_curl_new(TransferItem **item);
// Empties the item: clears both callbacks and user data, releases every owned text, the
// header lines, the collected answer and the file stream. The record stays valid (a second
// call is harmless) and keeps its easy handle; a transfer still in the engine keeps going
// but reaches nobody.
void zv_curl_free(TransferItem *item);
// Cancels the item's transfer, empties it, releases its easy handle and the record, and
// sets *item to NULL. NULL or a pointer to NULL does nothing. Use it to drop an item for good.
void zv_curl_delete(TransferItem **item);

// Setters for an item that has not been sent. 0, 3 for a NULL item, or 4 for a refused
// value (then nothing changes). Texts are copied.
int zv_curl_set_callback_func(TransferItem *item, ZvCurlResponseCb callback_func);
int zv_curl_set_progress_cb_func(TransferItem *item, ZvCurlProgressCb progress_cb_func);
int zv_curl_set_user_data(TransferItem *item, void *user_data);
int zv_curl_set_method(TransferItem *item, int method);
int zv_curl_set_url(TransferItem *item, const char *url);
// body may be NULL; len is the number of its bytes to send: negative, or longer than the
// text (0 for NULL), is refused with 4, so that nothing reads past the copy.
int zv_curl_set_body(TransferItem *item, const char *body, int len);
int zv_curl_set_timeout(TransferItem *item, int timeout_ms);
int zv_curl_set_connect_timeout(TransferItem *item, int timeout_ms);
int zv_curl_set_user_agent(TransferItem *item, const char *user_agent); // NULL clears
int zv_curl_set_header(TransferItem *item, const char *header);         // appended
// A negative size or offset is refused with 4.
int zv_curl_set_file_info(TransferItem *item, const char *file_path, int64_t size, int64_t offset);
int zv_curl_set_netwrok_info(TransferItem *item, const char *ip, const char *proxy);
