// Upload controller: job intake, the two-phase upload of each job, pause and resume,
// network changes, the pipes from the transfer worker to the main loop, and the batch
// notifications. Threads: see zv-upload-ctrl.h.
#include "zv-upload-ctrl.h"

#include <assert.h>
#include <errno.h>
#include <fcntl.h>
#include <libintl.h>
#include <locale.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <mutex>
#include <string>
#include <unordered_map>

#include "app_i18n.h"
#include "zv-ext-db.h"
#include "zv-ext-location.h"
#include "zv-ext-media.h"
#include "zv-ext-network.h"
#include "zv-ext-noti.h"
#include "zv-ext-util.h"
#include "zv-log.h"
#include "zv-upload-list.h"
#include "zv-upload-view.h"

namespace
{

enum PipeKind { PIPE_UPLOAD, PIPE_PROGRESS, PIPE_CHANGE, PIPE_COMPLETE, PIPE_COUNT };

struct CtrlPipe {
    Ecore_Pipe *pipe = nullptr;
    // ecore_pipe_write frames a message with two writes, and the change pipe has writers on
    // both threads; the lock also keeps a write from meeting the pipe's deletion.
    std::mutex write_lock;
};

// One job as both threads see it. The worker never touches an UploadItem: its callbacks
// find the job here by its request and change it here, under g_ctrl.lock, and the main loop
// copies these values into the UploadItem (sync_job) before it acts on a pipe message.
//
// status is the job's one true status. Every change of it, on either thread, is made under
// the lock by a transition that first looks at what it is now, so that no interleaving of
// the two threads undoes another: a COMPLETED job stays COMPLETED, a PAUSED job is only
// restarted by the main loop's resume, and an answer of a request that the job no longer
// holds changes nothing.
struct JobState {
    int historyid = 0;
    const ServiceRequest *handle = nullptr; // the job's current request
    int status = 0;
    int percent = 0;
    int64_t offset = 0;    // 64-bit, as the job's: videos pass 2 GiB
    int64_t filesize = -1; // of the job's file when its status query was made; -1: unknown
    bool has_url = false;
    std::string url;
    std::string title;
    // The request of handle is queued and its answer has not been reported: a launch
    // request leaves the job to it.
    bool in_flight = false;
    // The answer of handle asks for the data upload (upload pipe), which has not started:
    // the upload handler starts it once, and only for this request.
    bool upload_due = false;
    // The data upload was answered with success and the main loop has not counted it yet:
    // the complete handler counts it, exactly once. Until then the main loop sees the job
    // UPLOADING, so that no other handler stores or counts it as completed first.
    bool completion_due = false;
};

struct CtrlState {
    CtrlPipe pipes[PIPE_COUNT];
    std::mutex lock; // guards jobs; held briefly, never across a call into the client
    std::unordered_map<const UploadItem *, JobState> jobs;
    // The job of each current request, for the worker's lookups (one per progress report).
    std::unordered_map<const ServiceRequest *, JobState *> by_request;
    std::unordered_map<UploadItem *, Ecore_Idler *> idlers; // main loop only
};

CtrlState g_ctrl;

// A pipe can hold this many bytes of unread messages before the worker blocks on it.
constexpr int kPipeBufferBytes = 1 << 20;

const char *text(const char *msgid)
{
    return dcgettext(ZV_TEXT_DOMAIN, msgid, LC_MESSAGES);
}

void post_message(PipeKind kind, int historyid)
{
    PipeMessage msg = {historyid, 0};
    CtrlPipe &p = g_ctrl.pipes[kind];
    std::lock_guard<std::mutex> guard(p.write_lock);
    if (!p.pipe) {
        ZV_LOGE("pipe %d is closed, message of %d dropped", (int)kind, historyid);
        return;
    }
    if (!ecore_pipe_write(p.pipe, &msg, sizeof msg))
        ZV_LOGE("ecore_pipe_write fail : %d", historyid);
}

void open_pipe(PipeKind kind, Ecore_Pipe_Cb handler, AppData *ad)
{
    CtrlPipe &p = g_ctrl.pipes[kind];
    std::lock_guard<std::mutex> guard(p.write_lock);
    if (p.pipe)
        ecore_pipe_del(p.pipe);
    p.pipe = ecore_pipe_add(handler, ad);
    if (!p.pipe) {
        ZV_LOGE("ecore_pipe_add fail : %d", (int)kind);
        return;
    }
    // Best effort: a larger buffer keeps a burst of progress reports from stalling the
    // worker while the main loop is busy.
    int fd = ecore_pipe_write_fd(p.pipe);
    if (fd >= 0)
        fcntl(fd, F_SETPIPE_SZ, kPipeBufferBytes);
}

void close_pipe(PipeKind kind)
{
    CtrlPipe &p = g_ctrl.pipes[kind];
    std::lock_guard<std::mutex> guard(p.write_lock);
    if (p.pipe) {
        ecore_pipe_del(p.pipe);
        p.pipe = nullptr;
    }
}

// Worker: the state of the job whose current request is handle. g_ctrl.lock must be held.
JobState *state_of_request(const ServiceRequest *handle)
{
    auto it = g_ctrl.by_request.find(handle);
    return it == g_ctrl.by_request.end() ? nullptr : it->second;
}

// Main loop: the job's state, made from the job when it has none yet. g_ctrl.lock held.
JobState &state_of(const UploadItem *job_item)
{
    auto it = g_ctrl.jobs.find(job_item);
    if (it != g_ctrl.jobs.end())
        return it->second;
    JobState v;
    v.historyid = job_item->historyid;
    v.status = job_item->status;
    v.percent = job_item->percent;
    v.offset = job_item->offset;
    v.has_url = job_item->url != nullptr;
    if (job_item->url)
        v.url = job_item->url;
    if (job_item->title)
        v.title = job_item->title;
    return g_ctrl.jobs.emplace(job_item, std::move(v)).first->second;
}

// Main loop: copies the job's state into the job.
void sync_job(UploadItem *job_item)
{
    std::string url;
    bool has_url = false;
    {
        std::lock_guard<std::mutex> guard(g_ctrl.lock);
        auto it = g_ctrl.jobs.find(job_item);
        if (it == g_ctrl.jobs.end())
            return;
        const JobState &v = it->second;
        job_item->status = v.completion_due ? ZV_UPLOAD_STATUS_UPLOADING : v.status;
        job_item->percent = v.percent;
        job_item->offset = v.offset;
        has_url = v.has_url;
        if (has_url)
            url = v.url;
    }
    if (has_url && (!job_item->url || url != job_item->url)) {
        g_free(job_item->url);
        job_item->url = g_strdup(url.c_str());
    }
}

// Main loop: the job becomes PAUSED unless it has completed meanwhile (its completion
// recorded by the worker wins). True when it is PAUSED now.
bool pause_state(UploadItem *job_item)
{
    {
        std::lock_guard<std::mutex> guard(g_ctrl.lock);
        JobState &v = state_of(job_item);
        if (v.status == ZV_UPLOAD_STATUS_COMPLETED)
            return false;
        v.status = ZV_UPLOAD_STATUS_PAUSED;
    }
    job_item->status = ZV_UPLOAD_STATUS_PAUSED;
    return true;
}

// Main loop: marks the job's request as queued, before it is: its answer can come before
// the call that queues it returns.
void mark_in_flight(UploadItem *job_item, bool in_flight)
{
    std::lock_guard<std::mutex> guard(g_ctrl.lock);
    JobState &v = state_of(job_item);
    if (v.handle == job_item->handle)
        v.in_flight = in_flight;
}

// The size of the file now, -1 when it cannot be read.
int64_t file_size_of(const char *path)
{
    struct stat st;
    if (!path || stat(path, &st) != 0)
        return -1;
    return static_cast<int64_t>(st.st_size);
}

// Main loop: gives the job a fresh request and releases the former one; from here on the
// worker's answers for the former request find no job, and what they had asked for (a data
// upload, a completion still to count) is dropped with them. Null when the job completed
// meanwhile: it keeps its request, and there is nothing left to send.
ServiceRequest *renew_request(UploadItem *job_item)
{
    ServiceRequest *former = job_item->handle;
    ServiceRequest *fresh = zv_request_new();
    {
        std::lock_guard<std::mutex> guard(g_ctrl.lock);
        JobState &v = state_of(job_item);
        if (v.status == ZV_UPLOAD_STATUS_COMPLETED) {
            zv_request_free(fresh);
            return nullptr;
        }
        g_ctrl.by_request.erase(v.handle);
        g_ctrl.by_request[fresh] = &v;
        v.handle = fresh;
        v.in_flight = false;
        v.upload_due = false;
    }
    job_item->handle = fresh;
    if (former)
        zv_request_free(former);
    return fresh;
}

// Main loop: forgets the job's state and releases its request.
void release_request(UploadItem *job_item)
{
    {
        std::lock_guard<std::mutex> guard(g_ctrl.lock);
        auto it = g_ctrl.jobs.find(job_item);
        if (it != g_ctrl.jobs.end()) {
            g_ctrl.by_request.erase(it->second.handle);
            g_ctrl.jobs.erase(it);
        }
    }
    if (job_item->handle) {
        zv_request_free(job_item->handle);
        job_item->handle = nullptr;
    }
}

// Main loop: whether a launch request must leave the job alone, because a request of it is
// in flight or its answer waits in a pipe. Every such request ends in an answer or a
// failure that sets the job's next status, so a job left alone is never stuck; starting it
// again would cancel its transfer or send its metadata a second time.
bool job_is_busy(const UploadItem *job_item)
{
    std::lock_guard<std::mutex> guard(g_ctrl.lock);
    auto it = g_ctrl.jobs.find(job_item);
    if (it == g_ctrl.jobs.end())
        return false;
    const JobState &v = it->second;
    return v.in_flight || v.upload_due || v.completion_due;
}

void cancel_start_idler(UploadItem *job_item)
{
    auto it = g_ctrl.idlers.find(job_item);
    if (it == g_ctrl.idlers.end())
        return;
    ecore_idler_del(it->second);
    g_ctrl.idlers.erase(it);
}

void free_job_record(UploadItem *job_item)
{
    g_free(job_item->userid);
    g_free(job_item->title);
    g_free(job_item->filename);
    g_free(job_item->thumb_path);
    g_free(job_item->display_name);
    g_free(job_item->url);
    g_free(job_item);
}

// The job stops where it is: PAUSED (unless it completed meanwhile), stored, and its badge
// and the notification follow.
void pause_job(UploadItem *job_item)
{
    pause_state(job_item);
    zv_upload_list_store_item(job_item);
    post_message(PIPE_CHANGE, job_item->historyid);
}

// The failure tail of a step of a metadata or data upload (its message already logged).
void fail_job(UploadItem *job_item)
{
    mark_in_flight(job_item, false);
    int ret = zv_request_upload_cancel(job_item->handle);
    if (ret != ZV_ERROR_NONE)
        ZV_LOGE("zv_request_upload_cancel fail: %d", ret);
    pause_job(job_item);
}

// Whether the job's file can be sent: present, readable and not empty, whatever its size.
// Logs why not.
bool file_is_sendable(const UploadItem *job_item)
{
    const char *path = job_item->filename;
    if (!path) {
        ZV_LOGE("file name of %d is NULL", job_item->historyid);
        return false;
    }
    struct stat st;
    if (stat(path, &st) != 0) {
        ZV_LOGE("file of %d is missing: %s (%s)", job_item->historyid, path, strerror(errno));
        return false;
    }
    if (!S_ISREG(st.st_mode)) {
        ZV_LOGE("file of %d is not a regular file: %s", job_item->historyid, path);
        return false;
    }
    int fd = open(path, O_RDONLY | O_CLOEXEC);
    if (fd < 0) {
        ZV_LOGE("file of %d is unreadable: %s (%s)", job_item->historyid, path, strerror(errno));
        return false;
    }
    close(fd);
    if (st.st_size == 0) {
        ZV_LOGE("file of %d is empty, nothing to upload: %s", job_item->historyid, path);
        return false;
    }
    return true;
}

// Reads the server's byte count of a status query answer into *offset: the last byte index
// it holds, 0 when the answer names none (nothing held). A value that is no byte index of
// the file is refused (false, *offset unchanged): not a decimal number, negative, too large
// for 64 bits, or at or past file_size when that is known (-1: unknown).
bool parse_offset(const char *value, int64_t file_size, int64_t *offset)
{
    if (!value) {
        *offset = 0;
        return true;
    }
    if (!g_ascii_isdigit(value[0])) // also a sign
        return false;
    char *end = nullptr;
    errno = 0;
    guint64 n = g_ascii_strtoull(value, &end, 10);
    while (*end == ' ' || *end == '\t')
        end++;
    if (*end != '\0' || errno == ERANGE || n > static_cast<guint64>(INT64_MAX))
        return false;
    if (file_size >= 0 && static_cast<int64_t>(n) >= file_size)
        return false;
    *offset = static_cast<int64_t>(n);
    return true;
}

// Worker, g_ctrl.lock held: takes a status query answer that passed into the job's view.
// True when the data upload may go on behind the server's byte count; otherwise logs why,
// and the job is to pause without sending anything.
bool take_status_answer(JobState *v, const char *value)
{
    if (parse_offset(value, v->filesize, &v->offset))
        return true;
    ZV_LOGE("Range of %d names no byte of its file (%lld bytes): \"%s\"; paused, nothing sent",
            v->historyid, (long long)v->filesize, value);
    return false;
}

char *plural_title(int completed)
{
    const char *fmt = i18n_get_text(text("IDS_MF_BODY_PD_FILES"));
    if (!fmt || !zv_ext_util_is_count_format(fmt))
        return g_strdup_printf("%d", completed);
    return g_strdup_printf(fmt, completed);
}

int uploading_rows()
{
    int n = zv_ext_db_get_uploading_count();
    return n < 0 ? 0 : n;
}

// Reads a pipe message; logs and answers false for a null buffer or context.
bool read_message(void *data, void *buf, unsigned int nbyte, int *historyid)
{
    if (!buf || nbyte < sizeof(PipeMessage)) {
        ZV_LOGE("buf is NULL");
        return false;
    }
    if (!data) {
        ZV_LOGE("handle is NULL");
        return false;
    }
    PipeMessage msg;
    memcpy(&msg, buf, sizeof msg);
    *historyid = msg.historyid;
    return true;
}

void set_bar_value(Elm_Object_Item *item, double value)
{
    if (!item)
        return;
    Evas_Object *bar = elm_object_item_part_content_get(item, "elm.icon");
    if (bar)
        elm_progressbar_value_set(bar, value);
}

// Runs once for a job that a launch request starts.
Eina_Bool start_job_cb(void *data)
{
    UploadItem *job_item = static_cast<UploadItem *>(data);
    g_ctrl.idlers.erase(job_item);
    AppData *ad = job_item->ad;
    if (!ad)
        return ECORE_CALLBACK_CANCEL;
    if (job_item->status == ZV_UPLOAD_STATUS_WAITING)
        ad->meta_data_upload(ad, job_item);
    else if (job_item->status == ZV_UPLOAD_STATUS_UPLOADING)
        ad->resume_upload(ad, job_item);
    return ECORE_CALLBACK_CANCEL;
}

void pause_running_jobs(AppData *ad)
{
    int index = 0;
    for (GList *l = ad->job_list; l; l = l->next, index++) {
        UploadItem *job_item = static_cast<UploadItem *>(l->data);
        if (!job_item) {
            ZV_LOGI("Skip NULL item : %d", index);
            continue;
        }
        sync_job(job_item);
        if (job_item->status == ZV_UPLOAD_STATUS_UPLOADING)
            ad->pause_upload(ad, job_item);
    }
}

// Checks the arguments of a job operation for its caller func: a null AppData logs
// "handle is NULL", a null job null_job_message.
bool job_call_valid(const AppData *ad, const UploadItem *job_item, const char *null_job_message,
                    const char *func)
{
    if (!ad) {
        ZV_LOGE_AS(func, "handle is NULL");
        return false;
    }
    if (!job_item) {
        ZV_LOGE_AS(func, "%s", null_job_message);
        return false;
    }
    return true;
}

// The set-up every request of a job starts with, for its caller func: a fresh request (null
// when the job completed meanwhile, see renew_request) whose answers reach the response
// callback, with progress the progress callback too, with ad. A failing step is logged with
// its message; with ret its result is left there and the request returned, without ret the
// job fails (fail_job) and the result is null.
ServiceRequest *begin_request(AppData *ad, UploadItem *job_item, bool progress, const char *func,
                              int *ret = nullptr)
{
    ServiceRequest *handle = renew_request(job_item);
    if (!handle)
        return nullptr;
    int step;
    if ((step = zv_set_callback_func(handle, _zv_upload_ctrl_resp_cb)) != ZV_ERROR_NONE)
        ZV_LOGE_AS(func, "zv_set_callback_func fail: %d", step);
    else if (progress && (step = zv_set_progress_callback_func(
                              handle, _zv_upload_ctrl_progress_cb)) != ZV_ERROR_NONE)
        ZV_LOGE_AS(func, "zv_set_progress_callback_func fail: %d", step);
    else if ((step = zv_set_user_data(handle, ad)) != ZV_ERROR_NONE)
        ZV_LOGE_AS(func, "zv_set_user_data fail: %d", step);
    if (ret) {
        *ret = step;
    } else if (step != ZV_ERROR_NONE) {
        fail_job(job_item);
        return nullptr;
    }
    return handle;
}

} // namespace

// A step of an upload: on a non-zero result, log the step's message and run the failure
// tail of the job in scope.
#define ZV_CTRL_STEP(call, message)                                                                \
    do {                                                                                           \
        int step_ret = (call);                                                                     \
        if (step_ret != ZV_ERROR_NONE) {                                                           \
            ZV_LOGE(message, step_ret);                                                            \
            fail_job(job_item);                                                                    \
            return;                                                                                \
        }                                                                                          \
    } while (0)

static bool _zv_upload_ctrl_service_init(void)
{
    if (!zv_init_service()) {
        ZV_LOGE("zv_init_service is fail");
        return false;
    }
    char *ip = zv_ext_network_get_ip();
    char *proxy = zv_ext_network_get_proxy();
    zv_set_netwrok_info(ip, proxy);
    g_free(ip);
    g_free(proxy);
    return true;
}

static void _zv_upload_ctrl_service_deinit(void)
{
    zv_finalize_service();
}

// ---- Finders ----

// The first job of the list that `matches`, skipping the empty entries.
template <typename Match> static UploadItem *find_job(AppData *ad, Match matches)
{
    if (!ad) {
        ZV_LOGE("userp is NULL");
        return nullptr;
    }
    if (!ad->job_list) {
        ZV_LOGE("list is NULL");
        return nullptr;
    }
    int index = 0;
    for (GList *l = ad->job_list; l; l = l->next, index++) {
        UploadItem *job_item = static_cast<UploadItem *>(l->data);
        if (!job_item) {
            ZV_LOGI("Skip NULL item : %d", index);
            continue;
        }
        if (matches(job_item))
            return job_item;
    }
    return nullptr;
}

UploadItem *_zv_upload_ctrl_find_item_by_id(AppData *ad, int historyid)
{
    return find_job(ad, [historyid](const UploadItem *job) { return job->historyid == historyid; });
}

UploadItem *_zv_upload_ctrl_find_item(AppData *ad, ServiceRequest *handle)
{
    if (!handle) {
        ZV_LOGE("handle is NULL");
        return nullptr;
    }
    return find_job(ad, [handle](const UploadItem *job) { return job->handle == handle; });
}

// ---- Lifetime ----

void zv_upload_ctrl_initialize(AppData *ad)
{
    ZV_LOG_ENTER();
    if (!ad) {
        ZV_LOGE("handle is NULL");
        return;
    }
    ad->meta_data_upload = _zv_upload_ctrl_meta_data_upload;
    ad->data_upload = _zv_upload_ctrl_data_upload;
    ad->pause_upload = _zv_upload_ctrl_pause_upload;
    ad->resume_upload = _zv_upload_ctrl_resume_upload;
    ad->delete_item = _zv_upload_ctrl_delete_item;
    ad->exit = _zv_upload_ctrl_exit;

    open_pipe(PIPE_UPLOAD, _zv_upload_ctrl_pipe_upload_cb, ad);
    open_pipe(PIPE_PROGRESS, _zv_upload_ctrl_pipe_update_progress_cb, ad);
    open_pipe(PIPE_CHANGE, _zv_upload_ctrl_pipe_change_cb, ad);
    open_pipe(PIPE_COMPLETE, _zv_upload_ctrl_pipe_complete_cb, ad);

    if (!zv_ext_network_register(ad, _zv_upload_ctrl_net_status_cb, _zv_upload_ctrl_net_type_cb,
                                 _zv_upload_ctrl_net_conf_change_cb))
        ZV_LOGE("zv_ext_network_register fail");

    if (!_zv_upload_ctrl_service_init())
        ZV_LOGE("_zuvo_ctrl_service_init fail");

    zv_ext_media_init();
    zv_upload_list_load_full_item(ad);
    zv_ext_util_set_appdata(ad);
}

void zv_upload_ctrl_init_value(AppData *ad)
{
    ZV_LOG_ENTER();
    if (!ad) {
        ZV_LOGE("handle is NULL");
        return;
    }
    ad->is_paused = false;
    if (ad->completed_count < 1)
        ad->completed_count = 0;
    ad->total_count = uploading_rows() + ad->completed_count;
}

bool zv_upload_ctrl_service(AppData *ad)
{
    ZV_LOG_ENTER();
    if (!ad) {
        ZV_LOGE("handle is NULL");
        return false;
    }
    zv_upload_view_destroy(ad);
    zv_upload_list_load_ready_item(ad);
    zv_upload_view_init(ad);
    // Rows whose store failed earlier get their jobs' real state before anything counts them.
    zv_upload_list_store_pending(ad);

    if (zv_ext_network_check()) {
        int index = 0;
        for (GList *l = ad->job_list; l; l = l->next, index++) {
            UploadItem *job_item = static_cast<UploadItem *>(l->data);
            if (!job_item) {
                ZV_LOGI("Skip NULL item : %d", index);
                continue;
            }
            job_item->ad = ad;
            sync_job(job_item);
            if (job_item->status != ZV_UPLOAD_STATUS_WAITING &&
                job_item->status != ZV_UPLOAD_STATUS_UPLOADING)
                continue;
            if (job_is_busy(job_item) || g_ctrl.idlers.count(job_item))
                continue;
            Ecore_Idler *idler = ecore_idler_add(start_job_cb, job_item);
            if (idler)
                g_ctrl.idlers[job_item] = idler;
        }
    }
    zv_upload_ctrl_post_notification(ad, nullptr);
    return true;
}

void _zv_upload_ctrl_exit(AppData *ad)
{
    ZV_LOG_ENTER();
    if (!ad) {
        ZV_LOGE("handle is NULL");
        return;
    }
    zv_upload_view_destroy(ad);
    if (zv_ext_db_get_active_count() < 1) {
        elm_exit();
        return;
    }
    if (ad->win)
        elm_win_lower(ad->win);
    ad->is_paused = true;
}

void zv_upload_ctrl_finalize(AppData *ad)
{
    ZV_LOG_ENTER();
    if (!ad) {
        ZV_LOGE("handle is NULL");
        return;
    }
    for (int kind = 0; kind < PIPE_COUNT; kind++)
        close_pipe(static_cast<PipeKind>(kind));

    zuvo_ext_noti_ongoing_noti_destroy();
    zuvo_ext_noti_complete_noti_destroy();
    zv_upload_list_store_pending(ad);
    zv_upload_list_forget_pending();
    zv_upload_list_reset_full_item(ad);
    zv_ext_media_deinit();
    zv_upload_view_destroy(ad);

    // Every request goes while the engine still runs, so that no transfer outlives its job.
    for (auto &entry : g_ctrl.idlers)
        ecore_idler_del(entry.second);
    g_ctrl.idlers.clear();
    for (GList *l = ad->job_list; l; l = l->next) {
        if (l->data)
            release_request(static_cast<UploadItem *>(l->data));
    }

    _zv_upload_ctrl_service_deinit();
    zv_ext_db_close();
    if (ad->win) {
        evas_object_del(ad->win);
        ad->win = nullptr;
    }

    // The list items went with the window; only the records are left to release.
    for (GList *l = ad->job_list; l; l = l->next) {
        if (l->data)
            free_job_record(static_cast<UploadItem *>(l->data));
    }
    g_list_free(ad->job_list);
    ad->job_list = nullptr;
}

// ---- Upload sequence ----

void _zv_upload_ctrl_meta_data_upload(AppData *ad, UploadItem *job_item)
{
    ZV_LOG_ENTER();
    if (!job_call_valid(ad, job_item, "current item is NULL", __func__) ||
        !zv_ext_network_check())
        return;
    ServiceRequest *handle = begin_request(ad, job_item, false, __func__);
    if (!handle)
        return;
    ZV_CTRL_STEP(zv_set_attr_token(handle, ad->access_token), "zv_set_attr_token fail: %d");
    ZV_CTRL_STEP(zv_set_attr_title(handle, job_item->title), "zv_set_attr_title fail: %d");
    ZV_CTRL_STEP(zv_set_attr_category(handle, ad->category), "zv_set_attr_category fail: %d");
    ZV_CTRL_STEP(zv_set_attr_file_path(handle, job_item->filename),
                 "zv_set_attr_file_path fail: %d");
    if (!file_is_sendable(job_item)) {
        fail_job(job_item);
        return;
    }
    ZV_CTRL_STEP(zv_set_attr_privacy(handle, ad->access_type), "zv_set_attr_privacy fail: %d");
    if (ad->description)
        ZV_CTRL_STEP(zv_set_attr_description(handle, ad->description),
                     "zv_set_attr_description fail: %d");
    if (ad->tag)
        ZV_CTRL_STEP(zv_set_attr_keyword(handle, ad->tag), "zv_set_attr_keyword fail: %d");
    if (ad->use_location) {
        double latitude = 0.0;
        double longitude = 0.0;
        if (zv_ext_location_get_pos(&latitude, &longitude))
            ZV_CTRL_STEP(zv_set_attr_gps(handle, latitude, longitude), "zv_set_attr_gps fail: %d");
    }
    mark_in_flight(job_item, true);
    ZV_CTRL_STEP(zv_request_meta_upload(handle), "zv_request_meta_upload fail: %d");
}

void _zv_upload_ctrl_data_upload(AppData *ad, UploadItem *job_item)
{
    ZV_LOG_ENTER();
    if (!job_call_valid(ad, job_item, "current item is NULL", __func__))
        return;
    ServiceRequest *handle = begin_request(ad, job_item, true, __func__);
    if (!handle)
        return;
    ZV_CTRL_STEP(zv_set_attr_upload_url(handle, job_item->url), "zv_set_attr_upload_url fail: %d");
    ZV_CTRL_STEP(zv_set_attr_file_offset(handle, job_item->offset),
                 "zv_set_attr_file_offset fail: %d");
    ZV_CTRL_STEP(zv_set_attr_file_path(handle, job_item->filename),
                 "zv_set_attr_file_path fail: %d");
    if (!file_is_sendable(job_item)) {
        fail_job(job_item);
        return;
    }
    mark_in_flight(job_item, true);
    ZV_CTRL_STEP(zv_request_data_upload(handle), "zv_request_data_upload fail: %d");
}

void _zv_upload_ctrl_resp_cb(int result, ServiceResponse *resp_data, void *user_data)
{
    ZV_LOG_ENTER();
    if (!resp_data) {
        ZV_LOGE("resp data is NULL");
        return;
    }
    if (!user_data) {
        ZV_LOGE("userp data is NULL");
        return;
    }
    int type = resp_data->resp_type;
    if (type != ZV_RESP_TYPE_DATA_UPLOAD && type != ZV_RESP_TYPE_META_UPLOAD &&
        type != ZV_RESP_TYPE_UPLOAD_QUERY) {
        ZV_LOGE("Unknown Resp type : %d - (zuvo_handle : %p)", type, (void *)resp_data->handle);
        return;
    }

    PipeKind kind = PIPE_CHANGE;
    int historyid = 0;
    bool found = false;
    std::string title;
    {
        std::lock_guard<std::mutex> guard(g_ctrl.lock);
        JobState *v = state_of_request(resp_data->handle);
        if (!v) {
            kind = PIPE_COUNT;
        } else {
            found = true;
            historyid = v->historyid;
            v->in_flight = false;
        }
        // Each answer moves the job only from the status its request was made in: a job
        // paused meanwhile stays PAUSED (its data upload is not started), and a COMPLETED
        // job stays COMPLETED.
        if (!v) {
        } else if (type == ZV_RESP_TYPE_DATA_UPLOAD) {
            if (v->status == ZV_UPLOAD_STATUS_COMPLETED) {
                kind = PIPE_COUNT;
            } else if (result == ZV_ERROR_NONE) {
                v->status = ZV_UPLOAD_STATUS_COMPLETED;
                v->completion_due = true;
                kind = PIPE_COMPLETE;
            } else {
                v->status = ZV_UPLOAD_STATUS_PAUSED;
                v->offset = 0;
            }
        } else if (type == ZV_RESP_TYPE_META_UPLOAD) {
            if (result == ZV_ERROR_NONE && resp_data->value) {
                v->url = resp_data->value;
                v->has_url = true;
                if (v->status == ZV_UPLOAD_STATUS_WAITING) {
                    v->status = ZV_UPLOAD_STATUS_UPLOADING;
                    v->upload_due = true;
                    kind = PIPE_UPLOAD;
                }
            } else {
                if (v->status != ZV_UPLOAD_STATUS_COMPLETED)
                    v->status = ZV_UPLOAD_STATUS_PAUSED;
                v->offset = 0;
                title = v->title;
            }
        } else {
            if (v->status != ZV_UPLOAD_STATUS_UPLOADING) {
                // Paused while the query was out: the answer changes nothing.
            } else if (result == ZV_ERROR_NONE && take_status_answer(v, resp_data->value)) {
                v->status = ZV_UPLOAD_STATUS_WAITING;
                v->upload_due = true;
                kind = PIPE_UPLOAD;
            } else {
                v->status = ZV_UPLOAD_STATUS_PAUSED;
            }
        }
    }

    if (!found) {
        ZV_LOGE("Not found item : %p", (void *)resp_data->handle);
        return;
    }
    if (type == ZV_RESP_TYPE_DATA_UPLOAD && result != ZV_ERROR_NONE)
        ZV_LOGI("HTTP RESULT : %ld", (long)resp_data->http_code);
    if (type == ZV_RESP_TYPE_META_UPLOAD && (result != ZV_ERROR_NONE || !resp_data->value))
        ZV_LOGE("META UPLOAD FAIL : %s", title.c_str());
    if (kind != PIPE_COUNT)
        post_message(kind, historyid);
}

void _zv_upload_ctrl_progress_cb(ServiceRequest *handle, int percent, void *user_data)
{
    if (!handle) {
        ZV_LOGE("handle is NULL");
        return;
    }
    if (!user_data) {
        ZV_LOGE("userp data is NULL");
        return;
    }
    PipeKind kind = PIPE_PROGRESS;
    int historyid = 0;
    {
        std::lock_guard<std::mutex> guard(g_ctrl.lock);
        JobState *v = state_of_request(handle);
        if (!v) {
            kind = PIPE_COUNT;
        } else {
            historyid = v->historyid;
            if (v->status == ZV_UPLOAD_STATUS_WAITING) {
                // The first report of a data upload restarted after a status query.
                v->status = ZV_UPLOAD_STATUS_UPLOADING;
                kind = PIPE_CHANGE;
            } else if (v->status != ZV_UPLOAD_STATUS_UPLOADING) {
                // A paused or completed job: a report still on its way moves nothing.
                return;
            }
            v->percent = percent < 0 ? 0 : (percent > 100 ? 100 : percent);
        }
    }
    if (kind == PIPE_COUNT) {
        ZV_LOGE("Not found item : %p", (void *)handle);
        return;
    }
    post_message(kind, historyid);
}

// The job a pipe message names, brought up to date with what the worker recorded; null
// (and a log line, with the id for the progress handler) when the message is bad or the job
// is gone.
static UploadItem *job_of_message(AppData *ad, void *buf, unsigned int nbyte, bool log_id)
{
    int historyid = 0;
    if (!read_message(ad, buf, nbyte, &historyid))
        return nullptr;
    UploadItem *job_item = _zv_upload_ctrl_find_item_by_id(ad, historyid);
    if (!job_item) {
        if (log_id)
            ZV_LOGE("%d , item is NULL", historyid);
        else
            ZV_LOGE("item is NULL");
        return nullptr;
    }
    sync_job(job_item);
    return job_item;
}

void _zv_upload_ctrl_pipe_upload_cb(void *data, void *buf, unsigned int nbyte)
{
    ZV_LOG_ENTER();
    AppData *ad = static_cast<AppData *>(data);
    UploadItem *job_item = job_of_message(ad, buf, nbyte, false);
    if (!job_item)
        return;
    bool due = false;
    int status = 0;
    {
        std::lock_guard<std::mutex> guard(g_ctrl.lock);
        JobState &v = state_of(job_item);
        due = v.upload_due;
        v.upload_due = false;
        status = v.status;
    }
    // One answer starts one data upload: a message whose upload has started already, or
    // whose request the job no longer holds, would cancel the running upload and send again
    // from an old offset.
    if (!due) {
        ZV_LOGI("no data upload is due for %d", job_item->historyid);
        return;
    }
    zv_upload_list_store_item(job_item);
    if (status != ZV_UPLOAD_STATUS_UPLOADING && status != ZV_UPLOAD_STATUS_WAITING) {
        // Paused between the answer and this message: the job keeps its address and waits
        // for the user.
        ZV_LOGI("%d is no longer uploading (%d), its data upload is not started",
                job_item->historyid, status);
        zv_upload_view_update_badge_button(job_item);
        return;
    }
    _zv_upload_ctrl_data_upload(ad, job_item);
}

void _zv_upload_ctrl_pipe_update_progress_cb(void *data, void *buf, unsigned int nbyte)
{
    AppData *ad = static_cast<AppData *>(data);
    UploadItem *job_item = job_of_message(ad, buf, nbyte, true);
    if (!job_item)
        return;
    if (ad->is_paused)
        return;
    // A report read after its job paused or completed draws nothing.
    if (job_item->status != ZV_UPLOAD_STATUS_UPLOADING)
        return;
    if (!job_item->gen_item) {
        ZV_LOGE("%d , item->gen_item is NULL", job_item->historyid);
        return;
    }
    zv_upload_list_store_item(job_item);
    double value = job_item->percent / 100.0;
    set_bar_value(job_item->gen_item, value);
    set_bar_value(job_item->edit_gen_item, value);
    if (ad->total_count == 1)
        zv_upload_ctrl_post_notification(ad, job_item);
}

void _zv_upload_ctrl_pipe_change_cb(void *data, void *buf, unsigned int nbyte)
{
    ZV_LOG_ENTER();
    AppData *ad = static_cast<AppData *>(data);
    UploadItem *job_item = job_of_message(ad, buf, nbyte, false);
    if (!job_item)
        return;
    ZV_LOGI("It maybe need to change badge button state.");
    zv_upload_view_update_badge_button(job_item);
    zv_upload_list_store_item(job_item);
    ZV_LOGI("It need to update notification");
    ad->total_count = ad->completed_count + uploading_rows();
    zv_upload_ctrl_post_notification(ad, job_item);
}

void _zv_upload_ctrl_pipe_complete_cb(void *data, void *buf, unsigned int nbyte)
{
    ZV_LOG_ENTER();
    AppData *ad = static_cast<AppData *>(data);
    UploadItem *job_item = job_of_message(ad, buf, nbyte, false);
    if (!job_item)
        return;
    bool due = false;
    {
        std::lock_guard<std::mutex> guard(g_ctrl.lock);
        JobState &v = state_of(job_item);
        due = v.completion_due;
        v.completion_due = false;
    }
    if (!due) {
        ZV_LOGI("completion of %d is counted already", job_item->historyid);
        return;
    }
    // Only now does the main loop see the job COMPLETED: until this count, every other
    // handler stored and counted it as uploading, so the batch's total stayed whole.
    sync_job(job_item);
    zv_upload_list_store_item(job_item);

    ZV_LOGI("Add current completed item count");
    ad->completed_count++;
    zv_upload_ctrl_post_notification(ad, job_item);

    if (!ad->is_paused) {
        // The last progress message may be read after this one (the pipes keep no order
        // between them): the bar ends where the upload did.
        double value = job_item->percent / 100.0;
        set_bar_value(job_item->gen_item, value);
        set_bar_value(job_item->edit_gen_item, value);
        zv_upload_list_complete_item(job_item);
        if (zv_ext_db_get_active_count() <= 0)
            ZV_LOGI("No more upload item");
        return;
    }
    if (zv_ext_db_get_active_count() <= 0) {
        ZV_LOGI("Not exist running job");
        elm_exit();
    }
}

// ---- Pause, resume, delete, network ----

void _zv_upload_ctrl_pause_upload(AppData *ad, UploadItem *job_item)
{
    ZV_LOG_ENTER();
    if (!job_call_valid(ad, job_item, "data is NULL", __func__))
        return;
    ZV_LOGI("%p, %d", (void *)job_item, job_item->historyid);
    sync_job(job_item);
    if (job_item->status == ZV_UPLOAD_STATUS_COMPLETED) {
        ZV_LOGI("Skip for complete item");
        return;
    }
    int ret = zv_request_upload_pause(job_item->handle);
    if (ret != ZV_ERROR_NONE) {
        ZV_LOGE("zv_request_upload_pause fail: %d", ret);
        return;
    }
    // The completion may have been recorded since the status was read: it wins.
    if (!pause_state(job_item)) {
        ZV_LOGI("Skip for complete item");
        return;
    }
    zv_upload_list_store_item(job_item);
    post_message(PIPE_CHANGE, job_item->historyid);
}

void _zv_upload_ctrl_resume_upload(AppData *ad, UploadItem *job_item)
{
    ZV_LOG_ENTER();
    if (!job_call_valid(ad, job_item, "data is NULL", __func__))
        return;
    sync_job(job_item);
    if (job_item->status == ZV_UPLOAD_STATUS_COMPLETED) {
        ZV_LOGI("Skip for complete item");
        return;
    }

    // An empty or missing file has nothing to send: the job stays PAUSED, with no request.
    if (job_item->status == ZV_UPLOAD_STATUS_PAUSED && !file_is_sendable(job_item)) {
        post_message(PIPE_CHANGE, job_item->historyid);
        return;
    }

    int ret = ZV_ERROR_NONE;
    ServiceRequest *handle = begin_request(ad, job_item, false, __func__, &ret);
    if (!handle) {
        ZV_LOGI("Skip for complete item");
        return;
    }
    if (ret == ZV_ERROR_NONE) {
        ret = zv_set_attr_upload_url(handle, job_item->url);
        if (ret != ZV_ERROR_NONE)
            ZV_LOGE("zv_set_attr_upload_url fail: %d", ret);
    }
    if (ret == ZV_ERROR_NONE) {
        // UPLOADING before the query is queued, not after: an answer that comes at once (a
        // refused connection) then moves the job on from UPLOADING, and nothing here
        // overwrites it.
        // The query's answer is checked against the file as it is now.
        int64_t filesize = file_size_of(job_item->filename);
        {
            std::lock_guard<std::mutex> guard(g_ctrl.lock);
            JobState &v = state_of(job_item);
            v.status = ZV_UPLOAD_STATUS_UPLOADING;
            v.in_flight = true;
            v.filesize = filesize;
        }
        job_item->status = ZV_UPLOAD_STATUS_UPLOADING;
        ret = zv_request_upload_query(handle);
        if (ret != ZV_ERROR_NONE)
            ZV_LOGE("zv_request_upload_query fail: %d", ret);
    }

    if (ret != ZV_ERROR_NONE) {
        mark_in_flight(job_item, false);
        pause_state(job_item);
        int cancel_ret = zv_request_upload_cancel(handle);
        if (cancel_ret != ZV_ERROR_NONE)
            ZV_LOGE("zv_request_upload_cancel fail: %d", cancel_ret);
    }
    post_message(PIPE_CHANGE, job_item->historyid);
}

void _zv_upload_ctrl_delete_item(UploadItem *job_item, bool delete_from_db)
{
    ZV_LOGI("%p", (void *)job_item);
    if (!job_item) {
        ZV_LOGE("item is NULL");
        return;
    }
    if (delete_from_db)
        zv_ext_db_delete_item(job_item->historyid);
    cancel_start_idler(job_item);
    release_request(job_item);
    if (job_item->check) {
        evas_object_del(job_item->check);
        job_item->check = nullptr;
    }
    if (job_item->gen_item) {
        elm_object_item_del(job_item->gen_item);
        job_item->gen_item = nullptr;
    }
    if (job_item->edit_gen_item) {
        elm_object_item_del(job_item->edit_gen_item);
        job_item->edit_gen_item = nullptr;
    }
    free_job_record(job_item);
}

void _zv_upload_ctrl_net_status_cb(int state, void *userp)
{
    ZV_LOGI("state : %d", state);
    if (!userp) {
        ZV_LOGE("resp data is NULL");
        return;
    }
    pause_running_jobs(static_cast<AppData *>(userp));
}

void _zv_upload_ctrl_net_type_cb(int type, void *userp)
{
    ZV_LOGI("type : %d", type);
    if (!userp) {
        ZV_LOGE("resp data is NULL");
        return;
    }
    pause_running_jobs(static_cast<AppData *>(userp));
}

void _zv_upload_ctrl_net_conf_change_cb(char *ip, char *proxy, void *userp)
{
    ZV_LOG_ENTER();
    if (!userp) {
        ZV_LOGE("resp data is NULL");
        g_free(ip);
        g_free(proxy);
        return;
    }
    zv_set_netwrok_info(ip, proxy);
    g_free(ip);
    g_free(proxy);
    pause_running_jobs(static_cast<AppData *>(userp));
}

// ---- Notifications ----

void zv_upload_ctrl_post_notification(AppData *ad, UploadItem *job_item)
{
    ZV_LOG_ENTER();
    if (!ad) {
        ZV_LOGE("handle is NULL");
        return;
    }
    int completed = ad->completed_count;
    int total = ad->total_count;

    if (completed >= total) {
        ZV_LOGI("Uploading is completed. Notice.");
        const char *content = text("IDS_DM_SBODY_UPLOADED_ABB");
        bool names_job = total == 1 && job_item && job_item->status == ZV_UPLOAD_STATUS_COMPLETED;
        // A failed job beside one completed job is never named as uploaded: the batch then
        // takes the plural title with the completed count.
        bool plural = total > 1 || (total == 1 && job_item && !names_job);
        if (plural) {
            char *title = plural_title(completed);
            zuvo_ext_noti_complete_noti_create(title, content);
            g_free(title);
        } else if (names_job) {
            zuvo_ext_noti_complete_noti_create(job_item->title, content);
        }
        zuvo_ext_noti_ongoing_noti_destroy();
        ad->completed_count = 0;
        return;
    }

    const char *title = text("IDS_GALLERY_TMBODY_ZUVO_ABB");
    const char *content = text("IDS_DM_SBODY_UPLOADING_ING");
    if (total > 1) {
        zuvo_ext_noti_ongoing_noti_update(title, content, completed, total,
                                          (double)completed / (double)total);
    } else {
        double progress = job_item ? job_item->percent / 100.0 : 0.0;
        zuvo_ext_noti_ongoing_noti_update(title, content, completed, 1, progress);
    }
}
