// HTTP transfer engine: transfer items and the worker thread that runs them on one libcurl
// multi handle. See zv-plugin-curl.h for which thread calls what.
//
// How the two threads share the multi handle: libcurl allows a multi handle on one thread
// at a time (curl_multi_wakeup excepted). The worker holds the engine lock while it
// performs, reads the finished requests and reports them, and releases it only to wait in
// curl_multi_poll. A main-loop operation (EngineLock) takes the lock, and while the worker
// polls it wakes it with curl_multi_wakeup and waits until the worker has left the poll; the
// worker then waits, lock released, until no operation is pending, and performs at once
// with whatever changed. So every libcurl call on the multi handle or an attached easy
// handle is made with the lock held, and the worker never polls while an operation waits.
//
// Open files: a running transfer holds a connection and, while it sends, its upload file.
// When the open-file limit cannot hold every transfer at once, the engine caps how many run
// (and the multi handle's connections) and keeps the rest waiting, in the order they were
// sent, until a running one ends. A transfer's file is closed as soon as it stops running or
// is paused, and a finished transfer gives back its easy handle at once.
#include "zv-plugin-curl.h"

#include <dirent.h>
#include <errno.h>
#include <glib.h>
#include <limits.h>
#include <pthread.h>
#include <stdint.h>
#include <string.h>
#include <strings.h>
#include <sys/resource.h>

#include <algorithm>
#include <chrono>
#include <condition_variable>
#include <deque>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "zv-log.h"

namespace
{

// The longest the idle worker waits before it looks at the multi handle again.
constexpr int kMaxWaitMs = 5000;
// The controller stores a history row for every progress report, and there is one report per
// read of the upload file: 512 KiB reads make 2,048 reports per GiB, which the history
// stores with room to spare. Larger reads cost throughput (the buffer no longer stays in the
// processor's cache on its way to the socket) and memory (one buffer per running upload).
constexpr long kUploadBufferSize = 512L * 1024;
// The longest request body text written to the verbose log.
constexpr size_t kMaxLoggedBody = 1024;
// Descriptors of the open-file limit kept for the rest of the process when the engine caps its
// transfers: the history and its journal, tray and key files, launch connections, the
// toolkit's files. A quarter of what is free at start, within these bounds.
constexpr long kMinReserveFds = 16;
constexpr long kMaxReserveFds = 64;

enum EngineFlag {
    kAttached = 1 << 0, // the easy handle is in the multi handle
    kPaused = 1 << 1,   // paused by zv_curl_pause_request
    kOrphan = 1 << 2,   // released on the worker; freed by the worker at its next safe point
    kOverflow = 1 << 3, // the answer passed ZV_CURL_MAX_RESPONSE_SIZE; its request was aborted
    kWaiting = 1 << 4,  // sent, waiting in the engine until the cap lets it run
    kFinished = 1 << 5, // its request completed; the easy handle is released
};

struct EngineState {
    std::mutex lock; // the engine lock; lives as long as the process
    std::condition_variable changed;
    CURLM *multi = nullptr;
    bool worker_running = false; // from a successful start until the worker left its loop
    bool stopping = false;
    bool in_poll = false; // the worker waits in curl_multi_poll without the lock
    int waiters = 0;      // main-loop operations waiting for the worker to leave the poll
    std::vector<TransferItem *> attached;
    std::vector<TransferItem *> orphans;
    size_t max_attached = 0;            // the cap on running transfers; 0: none
    std::deque<TransferItem *> waiting; // sent while the cap was reached, oldest first
};

EngineState g_engine;
thread_local bool t_on_worker = false;

// The engine lock, taken so that the worker is not inside curl_multi_poll. On the worker
// thread (inside a callback) the lock is already held and nothing is taken.
class EngineLock
{
  public:
    EngineLock()
    {
        if (t_on_worker)
            return;
        lock_ = std::unique_lock<std::mutex>(g_engine.lock);
        if (!g_engine.worker_running)
            return;
        ++g_engine.waiters;
        while (g_engine.in_poll) {
            curl_multi_wakeup(g_engine.multi);
            g_engine.changed.wait(lock_);
        }
        --g_engine.waiters;
    }
    ~EngineLock()
    {
        if (!lock_.owns_lock())
            return;
        lock_.unlock();
        g_engine.changed.notify_all();
    }
    EngineLock(const EngineLock &) = delete;
    EngineLock &operator=(const EngineLock &) = delete;

  private:
    std::unique_lock<std::mutex> lock_;
};

struct GFreeDeleter {
    void operator()(void *p) const { g_free(p); }
};
template <typename T> using GPtr = std::unique_ptr<T, GFreeDeleter>;

struct SlistDeleter {
    void operator()(curl_slist *list) const { curl_slist_free_all(list); }
};
using SlistPtr = std::unique_ptr<curl_slist, SlistDeleter>;

struct EasyDeleter {
    void operator()(CURL *curl) const { curl_easy_cleanup(curl); }
};
using EasyPtr = std::unique_ptr<CURL, EasyDeleter>;

void replace_text(char **field, const char *value)
{
    g_free(*field);
    *field = g_strdup(value);
}

void free_chunk(gpointer data)
{
    TransferChunk *memb = static_cast<TransferChunk *>(data);
    g_free(memb->buf);
    g_free(memb);
}

void clear_answer(TransferItem *item)
{
    g_list_free_full(item->header_data_list, free_chunk);
    item->header_data_list = NULL;
    item->header_data_len = 0;
    g_list_free_full(item->write_data_list, free_chunk);
    item->write_data_list = NULL;
    item->write_data_len = 0;
}

void close_stream(TransferItem *item)
{
    if (item->file_stream) {
        fclose(item->file_stream);
        item->file_stream = NULL;
    }
}

bool cap_reached()
{
    return g_engine.max_attached > 0 && g_engine.attached.size() >= g_engine.max_attached;
}

// With the lock held, not inside curl_multi_perform: the item's handle goes into the multi
// handle.
CURLMcode attach(TransferItem *item)
{
    CURLMcode mc = curl_multi_add_handle(g_engine.multi, item->curl);
    if (mc != CURLM_OK)
        return mc;
    item->engine_flags = (item->engine_flags & ~kWaiting) | kAttached;
    g_engine.attached.push_back(item);
    return CURLM_OK;
}

// With the lock held, not inside curl_multi_perform: waiting requests run, oldest first, while
// the cap leaves room. A paused one waits on.
void start_waiting()
{
    if (!g_engine.multi || g_engine.stopping)
        return;
    auto &queue = g_engine.waiting;
    for (auto it = queue.begin(); it != queue.end() && !cap_reached();) {
        TransferItem *item = *it;
        if (item->engine_flags & kPaused) {
            ++it;
            continue;
        }
        it = queue.erase(it);
        CURLMcode mc = attach(item);
        if (mc != CURLM_OK) {
            // As for a send that libcurl refuses: no answer will come.
            ZV_LOGE("curl_multi_add_handle Error:: %s", curl_multi_strerror(mc));
            item->engine_flags &= ~(kWaiting | kPaused);
        }
    }
}

// With the lock held, not inside curl_multi_perform: takes the item's request out of the
// multi handle (a waiting one out of the queue), closes its file and releases the header list
// it used; a waiting request takes the freed place. The easy handle stays in the item.
void detach(TransferItem *item)
{
    close_stream(item);
    if (!(item->engine_flags & (kAttached | kWaiting)))
        return;
    if ((item->engine_flags & kAttached) && g_engine.multi)
        curl_multi_remove_handle(g_engine.multi, item->curl);
    curl_easy_setopt(item->curl, CURLOPT_HTTPHEADER, NULL);
    curl_slist_free_all(item->engine_headers);
    item->engine_headers = NULL;
    auto &list = g_engine.attached;
    list.erase(std::remove(list.begin(), list.end(), item), list.end());
    auto &queue = g_engine.waiting;
    queue.erase(std::remove(queue.begin(), queue.end(), item), queue.end());
    item->engine_flags &= ~(kAttached | kWaiting | kPaused);
    start_waiting();
}

// With the lock held, not inside curl_multi_perform: the record and its handle go back to
// the allocator. Nothing in the engine refers to the item afterwards.
void destroy_record(TransferItem *item)
{
    detach(item);
    if (item->curl)
        curl_easy_cleanup(item->curl);
    g_free(item);
}

void reclaim_orphans()
{
    std::vector<TransferItem *> orphans;
    orphans.swap(g_engine.orphans);
    for (TransferItem *item : orphans)
        destroy_record(item);
}

void _zv_curl_item_free(TransferItem *item)
{
    item->callback_func = NULL;
    item->progress_cb_func = NULL;
    item->user_data = NULL;
    g_free(item->url);
    item->url = NULL;
    g_free(item->body);
    item->body = NULL;
    g_free(item->user_agent);
    item->user_agent = NULL;
    g_free(item->file_path);
    item->file_path = NULL;
    g_free(item->ip);
    item->ip = NULL;
    g_free(item->proxy);
    item->proxy = NULL;
    g_list_free_full(item->header_list, g_free);
    item->header_list = NULL;
    clear_answer(item);
    close_stream(item);
}

// Empties the item and returns it to the allocator once nothing can refer to it: at once on
// the main loop (its transfer is detached first), or, inside a callback on the worker, at the
// worker's next safe point, after the perform or report that is under way.
void release_item(TransferItem *item)
{
    EngineLock lock;
    _zv_curl_item_free(item);
    if (t_on_worker) {
        if (!(item->engine_flags & kOrphan)) {
            item->engine_flags |= kOrphan;
            g_engine.orphans.push_back(item);
        }
        return;
    }
    destroy_record(item);
}

bool refused_on_worker()
{
    if (!t_on_worker)
        return false;
    ZV_LOGE("not allowed from a callback on the transfer worker");
    return true;
}

bool header_is_secret(const std::string &name)
{
    static const char *const kSecret[] = {"authorization", "proxy-authorization", "x-zvdata-key"};
    for (const char *secret : kSecret) {
        if (strcasecmp(name.c_str(), secret) == 0)
            return true;
    }
    return false;
}

// Logs a header block line by line, with the values of credential headers masked.
void log_header_block(const char *dir, const char *data, size_t size)
{
    std::string block(data, size);
    size_t start = 0;
    while (start < block.size()) {
        size_t end = block.find('\n', start);
        if (end == std::string::npos)
            end = block.size();
        std::string line = block.substr(start, end - start);
        start = end + 1;
        if (!line.empty() && line.back() == '\r')
            line.pop_back();
        if (line.empty())
            continue;
        size_t colon = line.find(':');
        if (colon != std::string::npos && header_is_secret(line.substr(0, colon)))
            line = line.substr(0, colon + 1) + " ****";
        ZV_LOGD("%s %s", dir, line.c_str());
    }
}

// Masks the values of the credential fields of a form body ("a=1&Passwd=x" -> "a=1&Passwd=****").
std::string mask_form(const char *data, size_t size)
{
    static const char *const kSecret[] = {"Passwd", "password", "client_secret", "refresh_token"};
    std::string body(data, std::min(size, kMaxLoggedBody));
    std::string out;
    size_t start = 0;
    while (start <= body.size()) {
        size_t end = body.find('&', start);
        if (end == std::string::npos)
            end = body.size();
        std::string field = body.substr(start, end - start);
        size_t eq = field.find('=');
        if (eq != std::string::npos) {
            std::string key = field.substr(0, eq);
            for (const char *secret : kSecret) {
                if (key == secret) {
                    field = key + "=****";
                    break;
                }
            }
        }
        if (start > 0)
            out += '&';
        out += field;
        start = end + 1;
    }
    return out;
}

// libcurl's verbose output, into the log. userp carries the request's method. Request
// bodies are logged for POST only (a PUT body is file data), answer bodies never.
int debug_cb(CURL *, curl_infotype type, char *data, size_t size, void *userp)
{
    int method = static_cast<int>(reinterpret_cast<intptr_t>(userp));
    switch (type) {
    case CURLINFO_TEXT: {
        std::string text(data, size);
        while (!text.empty() && (text.back() == '\n' || text.back() == '\r'))
            text.pop_back();
        ZV_LOGD("* %s", text.c_str());
        break;
    }
    case CURLINFO_HEADER_OUT:
        log_header_block(">", data, size);
        break;
    case CURLINFO_HEADER_IN:
        log_header_block("<", data, size);
        break;
    case CURLINFO_DATA_OUT:
        if (method == ZV_CURL_HTTP_METHOD_POST)
            ZV_LOGD("> %s", mask_form(data, size).c_str());
        break;
    default:
        break;
    }
    return 0;
}

bool uses_proxy(const char *proxy)
{
    return proxy && proxy[0] != '\0' && strncmp(proxy, "0.0.0.0", 7) != 0;
}

bool has_header(GList *lines, const char *name)
{
    size_t len = strlen(name);
    for (GList *l = lines; l; l = l->next) {
        const char *line = static_cast<const char *>(l->data);
        if (line && g_ascii_strncasecmp(line, name, len) == 0 && line[len] == ':')
            return true;
    }
    return false;
}

// The worker's wait: the library's time-out, whole seconds capped at 5, none (negative)
// meaning 5 s. libcurl shortens it further when it has an earlier time-out of its own.
int wait_ms_for(long lib_timeout_ms)
{
    if (lib_timeout_ms < 0)
        return kMaxWaitMs;
    if (lib_timeout_ms / 1000 > kMaxWaitMs / 1000)
        return kMaxWaitMs;
    return static_cast<int>(lib_timeout_ms);
}

size_t collect_chunk(char *ptr, size_t size, size_t nmemb, TransferItem *item, bool header)
{
    size_t n = size * nmemb;
    ZV_LOGI("%zu", n);
    if (!item) {
        ZV_LOGE("user data is NULL");
        return 0;
    }
    if (n == 0)
        return 0;
    int &total = header ? item->header_data_len : item->write_data_len;
    // The joined buffer holds the bytes and a NUL; an answer that would not fit is aborted
    // here, and its completion is reported as a request that got no answer.
    if (static_cast<size_t>(total) + n + 1 > ZV_CURL_MAX_RESPONSE_SIZE) {
        ZV_LOGE("answer %s passes %d bytes: request aborted", header ? "header" : "body",
                ZV_CURL_MAX_RESPONSE_SIZE);
        item->engine_flags |= kOverflow;
        return 0;
    }
    TransferChunk *memb = g_try_new0(TransferChunk, 1);
    if (!memb) {
        ZV_LOGE("memb is NULL");
        return 0;
    }
    memb->buf = static_cast<char *>(g_try_malloc(n));
    if (!memb->buf) {
        ZV_LOGE("buf is NULL");
        g_free(memb);
        return 0;
    }
    memcpy(memb->buf, ptr, n);
    memb->size = static_cast<int>(n);
    GList **list = header ? &item->header_data_list : &item->write_data_list;
    *list = g_list_append(*list, memb);
    total += memb->size;
    return n;
}

size_t _zv_curl_header_cb(char *ptr, size_t size, size_t nmemb, void *userp)
{
    return collect_chunk(ptr, size, nmemb, static_cast<TransferItem *>(userp), true);
}

size_t _zv_curl_write_cb(char *ptr, size_t size, size_t nmemb, void *userp)
{
    return collect_chunk(ptr, size, nmemb, static_cast<TransferItem *>(userp), false);
}

size_t _zv_curl_read_cb(char *ptr, size_t size, size_t nmemb, void *userp)
{
    TransferItem *item = static_cast<TransferItem *>(userp);
    if (!item) {
        ZV_LOGE("user data is NULL");
        return 0;
    }
    if (!item->file_stream) {
        // No file (a request without body, or an item emptied by its owner) ends the body
        // here, as a file that cannot be opened does.
        if (!item->file_path)
            return 0;
        item->file_stream = fopen(item->file_path, "rb");
        if (!item->file_stream) {
            ZV_LOGE("cannot open %s: %s", item->file_path, strerror(errno));
            return CURL_READFUNC_ABORT;
        }
    }
    if (fseeko(item->file_stream, static_cast<off_t>(item->file_offset), SEEK_SET) != 0)
        ZV_LOGE("fseek fail");
    // Never past the size the request announced (libcurl reads until a read gives 0): a file
    // that grew meanwhile sends no byte beyond its Content-Length.
    size_t want = size * nmemb;
    if (item->file_offset >= item->file_size)
        want = 0;
    else if (want > static_cast<size_t>(item->file_size - item->file_offset))
        want = static_cast<size_t>(item->file_size - item->file_offset);
    size_t n = want ? fread(ptr, 1, want, item->file_stream) : 0;
    item->file_offset += static_cast<int64_t>(n);
    if (item->progress_cb_func) {
        int percent = 100;
        if (item->file_size > 0)
            percent =
                static_cast<int>(static_cast<double>(item->file_offset) / item->file_size * 100.0);
        // The callback may release the item (on the worker that is deferred); it is not
        // read after this call.
        item->progress_cb_func(percent, item->user_data, item->file_size, item->file_offset);
    }
    return n;
}

void _zv_curl_list_to_buffer(GList *list, char *dest)
{
    if (!list) {
        ZV_LOGE("list is NULL");
        return;
    }
    size_t at = 0;
    for (GList *l = list; l; l = l->next) {
        const TransferChunk *memb = static_cast<const TransferChunk *>(l->data);
        if (!memb)
            continue;
        memcpy(dest + at, memb->buf, memb->size);
        at += memb->size;
    }
}

char *join_chunks(GList *list, int len)
{
    if (len <= 0)
        return NULL;
    char *buf = static_cast<char *>(g_try_malloc(static_cast<size_t>(len) + 1));
    if (!buf)
        return NULL;
    _zv_curl_list_to_buffer(list, buf);
    buf[len] = '\0';
    return buf;
}

// On the worker, lock held: hands the completed request's answer to its item's callback.
// A request that libcurl ended with an error is reported with the status the library holds
// and whatever arrived, like any other. The exception is an answer whose header block never
// ended (aborted at a size limit, ours or the library's, or cut inside the headers): it is
// reported as one that got no answer, http_code 0 and no data, so that a truncated answer
// behind a success status line is never taken for a success.
void _zv_curl_item_send_resp(CURL *curl, CURLcode result)
{
    if (!curl) {
        ZV_LOGE("curl is NULL");
        return;
    }
    GPtr<TransferResponse> resp_data(g_try_new0(TransferResponse, 1));
    g_assert(resp_data);

    char *priv = NULL;
    curl_easy_getinfo(curl, CURLINFO_PRIVATE, &priv);
    TransferItem *item = reinterpret_cast<TransferItem *>(priv);
    if (!item) {
        ZV_LOGI("curl item is NULL");
        return;
    }

    long http_code = 0;
    if (curl_easy_getinfo(curl, CURLINFO_RESPONSE_CODE, &http_code) != CURLE_OK)
        http_code = -1;
    GPtr<char> header_data;
    GPtr<char> write_data;
    if (!(item->engine_flags & kOverflow)) {
        header_data.reset(join_chunks(item->header_data_list, item->header_data_len));
        write_data.reset(join_chunks(item->write_data_list, item->write_data_len));
    }
    if (result != CURLE_OK) {
        const char *h = header_data.get();
        size_t hlen = h ? strlen(h) : 0;
        bool headers_ended = hlen >= 4 && memcmp(h + hlen - 4, "\r\n\r\n", 4) == 0;
        ZV_LOGE("transfer failed: %s (HTTP %ld)", curl_easy_strerror(result), http_code);
        if (!headers_ended) {
            http_code = 0;
            header_data.reset();
            write_data.reset();
        }
    }
    resp_data->http_code = http_code;
    resp_data->header_data = header_data.get();
    resp_data->write_data = write_data.get();

    if (item->callback_func)
        item->callback_func(ZV_CURL_ERROR_NONE, resp_data.get(), item->user_data);
}

// On the worker, lock held: one perform step, then every finished request is reported and
// detached.
void perform_and_report()
{
    int still_running = 0;
    CURLMcode mc = curl_multi_perform(g_engine.multi, &still_running);
    if (mc != CURLM_OK) {
        ZV_LOGE("Muti-perform Error:: %s", curl_multi_strerror(mc));
        return;
    }
    int msgs_left = -1;
    CURLMsg *msg;
    while ((msg = curl_multi_info_read(g_engine.multi, &msgs_left))) {
        if (msg->msg != CURLMSG_DONE) {
            ZV_LOGI("Curl Partial Message Received=%d ", msg->msg);
            continue;
        }
        ZV_LOGI("Curl Transaction Completed For One Message...");
        ZV_LOGI("Curl transaction over : %d", msgs_left);
        CURL *easy = msg->easy_handle;
        _zv_curl_item_send_resp(easy, msg->data.result);

        char *priv = NULL;
        curl_easy_getinfo(easy, CURLINFO_PRIVATE, &priv);
        TransferItem *item = reinterpret_cast<TransferItem *>(priv);
        if (item && item->curl == easy && (item->engine_flags & kAttached)) {
            // The request is over: its connection goes back to the multi handle's cache, its
            // file is closed, and its easy handle and answer go at once, so that finished
            // items hold no descriptor and little memory.
            detach(item);
            curl_easy_cleanup(item->curl);
            item->curl = NULL;
            item->engine_flags |= kFinished;
            clear_answer(item);
        } else {
            curl_multi_remove_handle(g_engine.multi, easy);
        }
    }
}

// The poll wait while requests run. Paused requests make no progress of their own, so when
// every attached request is paused the worker waits the full 5 s (or until woken).
int next_wait_ms()
{
    long lib_timeout = -1;
    curl_multi_timeout(g_engine.multi, &lib_timeout);
    bool all_paused = !g_engine.attached.empty();
    for (TransferItem *item : g_engine.attached) {
        if (!(item->engine_flags & kPaused)) {
            all_paused = false;
            break;
        }
    }
    return all_paused ? kMaxWaitMs : wait_ms_for(lib_timeout);
}

void *_zv_curl_thread_loop(void *)
{
    ZV_LOG_ENTER();
    t_on_worker = true;
    std::unique_lock<std::mutex> lock(g_engine.lock);
    while (g_engine.multi && !g_engine.stopping) {
        perform_and_report();
        reclaim_orphans();
        if (g_engine.waiters > 0) {
            // A main-loop operation waits for the lock; perform again once it is done.
            g_engine.changed.wait(lock, [] { return g_engine.waiters == 0; });
            continue;
        }
        if (g_engine.stopping)
            break;
        int wait_ms = next_wait_ms();
        CURLM *multi = g_engine.multi;
        g_engine.in_poll = true;
        lock.unlock();
        CURLMcode mc = curl_multi_poll(multi, NULL, 0, wait_ms, NULL);
        lock.lock();
        g_engine.in_poll = false;
        g_engine.changed.notify_all();
        if (mc != CURLM_OK) {
            // Never a busy loop: a failing wait is retried after a pause of its own.
            ZV_LOGE("select error");
            g_engine.changed.wait_for(lock, std::chrono::milliseconds(100));
        }
    }

    ZV_LOGI("ERR: curl_multi_init is NULL");
    while (!g_engine.waiting.empty())
        detach(g_engine.waiting.back());
    while (!g_engine.attached.empty())
        detach(g_engine.attached.back());
    reclaim_orphans();
    if (g_engine.multi) {
        curl_multi_cleanup(g_engine.multi);
        g_engine.multi = nullptr;
    }
    g_engine.worker_running = false;
    g_engine.changed.notify_all();
    return NULL;
}

// The checks shared by cancel, pause and resume, then the engine lock for them: a request
// that completes gives up its easy handle on the worker, so whether the item was sent is
// read with the lock held.
int lock_sent_item(TransferItem *item, std::unique_ptr<EngineLock> *lock)
{
    if (!item) {
        ZV_LOGE("handle is NULL");
        return ZV_CURL_ERROR_INVALID_HANDLE;
    }
    if (!item->url) {
        ZV_LOGE("url is NULL");
        return ZV_CURL_ERROR_INVALID_PARAMETER;
    }
    if (refused_on_worker())
        return ZV_CURL_ERROR_OPERATION_FAILED;
    lock->reset(new EngineLock);
    if (!item->curl && !(item->engine_flags & kFinished)) {
        ZV_LOGE("curl is NULL");
        return ZV_CURL_ERROR_INVALID_PARAMETER;
    }
    return ZV_CURL_ERROR_NONE;
}

int set_pause(TransferItem *item, bool pause)
{
    std::unique_ptr<EngineLock> lock;
    int ret = lock_sent_item(item, &lock);
    if (ret != ZV_CURL_ERROR_NONE)
        return ret;
    // A request that is no longer attached or waiting has nothing left to pause; a waiting one
    // that is paused keeps its place without running.
    if (item->engine_flags & kAttached)
        curl_easy_pause(item->curl, pause ? CURLPAUSE_ALL : CURLPAUSE_CONT);
    if (item->engine_flags & (kAttached | kWaiting)) {
        if (pause) {
            item->engine_flags |= kPaused;
            // The next read opens the file again at the offset it has reached.
            close_stream(item);
        } else {
            item->engine_flags &= ~kPaused;
            start_waiting();
        }
    }
    return ZV_CURL_ERROR_NONE;
}

// Builds the request's easy handle (not attached yet) from the item, with the lock held.
CURL *build_easy_handle(TransferItem *item, SlistPtr *headers)
{
    EasyPtr curl(curl_easy_init());
    if (!curl)
        return NULL;
    CURL *c = curl.get();

    auto append = [headers](const char *line) {
        curl_slist *next = curl_slist_append(headers->get(), line);
        if (!next)
            return false;
        headers->release();
        headers->reset(next);
        return true;
    };
    for (GList *l = item->header_list; l; l = l->next) {
        if (!append(static_cast<char *>(l->data)))
            return NULL;
    }
    // The data PUT is framed by its Content-Length line alone. libcurl is not told the body's
    // size, so that it reads the file until a read gives 0 bytes (that last read reports
    // progress too); the empty lines keep it from sending the body chunked and from an
    // expect-continue round. A caller that gave no length gets the file's rest.
    if (item->method == ZV_CURL_HTTP_METHOD_PUT) {
        for (const char *name : {"Transfer-Encoding", "Expect"}) {
            std::string empty = std::string(name) + ":";
            if (!has_header(item->header_list, name) && !append(empty.c_str()))
                return NULL;
        }
        if (!has_header(item->header_list, "Content-Length")) {
            long long length = 0;
            if (item->file_path && item->file_size > item->file_offset)
                length = static_cast<long long>(item->file_size) - item->file_offset;
            if (!append(("Content-Length: " + std::to_string(length)).c_str()))
                return NULL;
        }
    }

    switch (item->method) {
    case ZV_CURL_HTTP_METHOD_POST:
        curl_easy_setopt(c, CURLOPT_POST, 1L);
        break;
    case ZV_CURL_HTTP_METHOD_PUT:
        // CURLOPT_UPLOAD is what the deprecated CURLOPT_PUT stands for: a PUT over HTTP.
        curl_easy_setopt(c, CURLOPT_UPLOAD, 1L);
        break;
    default:
        ZV_LOGI("ZV_CURL_HTTP_METHOD_GET");
        break;
    }
    curl_easy_setopt(c, CURLOPT_URL, item->url);
    curl_easy_setopt(c, CURLOPT_VERBOSE, 1L);
    curl_easy_setopt(c, CURLOPT_SSL_VERIFYPEER, 0L);
    curl_easy_setopt(c, CURLOPT_HTTPPROXYTUNNEL, 1L);
    curl_easy_setopt(c, CURLOPT_PRIVATE, item);
    curl_easy_setopt(c, CURLOPT_ACCEPT_ENCODING, "gzip,deflate");
    if (*headers)
        curl_easy_setopt(c, CURLOPT_HTTPHEADER, headers->get());
    if (uses_proxy(item->proxy))
        curl_easy_setopt(c, CURLOPT_PROXY, item->proxy);
    if (item->connect_timeout > 0)
        curl_easy_setopt(c, CURLOPT_CONNECTTIMEOUT_MS, static_cast<long>(item->connect_timeout));
    if (item->timeout > 0)
        curl_easy_setopt(c, CURLOPT_TIMEOUT_MS, static_cast<long>(item->timeout));
    if (item->user_agent)
        curl_easy_setopt(c, CURLOPT_USERAGENT, item->user_agent);
    if (item->body_len > 0 && item->body) {
        // libcurl keeps its own copy, so emptying the item cannot pull the body away from a
        // request in flight. zv_curl_set_body keeps body_len within the text.
        curl_easy_setopt(c, CURLOPT_POSTFIELDSIZE, static_cast<long>(item->body_len));
        curl_easy_setopt(c, CURLOPT_COPYPOSTFIELDS, item->body);
    } else if (item->method == ZV_CURL_HTTP_METHOD_POST) {
        // No body option, only its length, 0: libcurl then frames the POST with
        // "Content-Length: 0" rather than as a chunked upload from the read callback.
        curl_easy_setopt(c, CURLOPT_POSTFIELDSIZE, 0L);
    }
    curl_easy_setopt(c, CURLOPT_WRITEFUNCTION, _zv_curl_write_cb);
    curl_easy_setopt(c, CURLOPT_WRITEDATA, item);
    curl_easy_setopt(c, CURLOPT_HEADERFUNCTION, _zv_curl_header_cb);
    curl_easy_setopt(c, CURLOPT_HEADERDATA, item);
    curl_easy_setopt(c, CURLOPT_READFUNCTION, _zv_curl_read_cb);
    curl_easy_setopt(c, CURLOPT_READDATA, item);

    curl_easy_setopt(c, CURLOPT_DEBUGFUNCTION, debug_cb);
    curl_easy_setopt(c, CURLOPT_DEBUGDATA,
                     reinterpret_cast<void *>(static_cast<intptr_t>(item->method)));
    if (item->method == ZV_CURL_HTTP_METHOD_PUT) {
        curl_easy_setopt(c, CURLOPT_UPLOAD_BUFFERSIZE, kUploadBufferSize);
        // A PUT without a file (the status query) has no body to read at all.
        if (!item->file_path)
            curl_easy_setopt(c, CURLOPT_INFILESIZE_LARGE, static_cast<curl_off_t>(0));
    }
    return curl.release();
}

// The descriptors the process holds now; -1 when it cannot tell.
long open_descriptors()
{
    DIR *dir = opendir("/proc/self/fd");
    if (!dir)
        return -1;
    long n = 0;
    while (const dirent *entry = readdir(dir)) {
        if (entry->d_name[0] != '.')
            ++n;
    }
    closedir(dir);
    return n - 1; // the listing's own
}

// How many transfers may run at once under the open-file limit; 0 when the limit is none.
// A running transfer holds up to two descriptors (its connection and its file, or the
// resolver's pair and then the connection); the reserve stays for the rest of the process.
size_t transfer_cap()
{
    struct rlimit rl;
    if (getrlimit(RLIMIT_NOFILE, &rl) != 0 || rl.rlim_cur == RLIM_INFINITY)
        return 0;
    long limit = static_cast<long>(std::min<rlim_t>(rl.rlim_cur, LONG_MAX));
    long in_use = open_descriptors();
    long spare = limit - (in_use < 0 ? kMaxReserveFds : in_use);
    long reserve = std::clamp(spare / 4, kMinReserveFds, kMaxReserveFds);
    long cap = std::max(1L, (spare - reserve) / 2);
    ZV_LOGI("open-file limit %ld, %ld in use: at most %ld transfers at once", limit, in_use, cap);
    return static_cast<size_t>(cap);
}

} // namespace

int zv_curl_init_service(void)
{
    ZV_LOG_ENTER();
    std::unique_lock<std::mutex> lock(g_engine.lock);
    if (g_engine.worker_running) {
        ZV_LOGI("engine already running");
        return ZV_CURL_ERROR_NONE;
    }
    g_engine.multi = curl_multi_init();
    if (!g_engine.multi) {
        ZV_LOGE("ERR: curl_multi_init fail");
        return ZV_CURL_ERROR_OPERATION_FAILED;
    }
    g_engine.max_attached = transfer_cap();
    if (g_engine.max_attached > 0)
        curl_multi_setopt(g_engine.multi, CURLMOPT_MAX_TOTAL_CONNECTIONS,
                          static_cast<long>(g_engine.max_attached));
    // A start that fails after this point leaves nothing behind.
    auto fail = [&] {
        curl_multi_cleanup(g_engine.multi);
        g_engine.multi = nullptr;
        return ZV_CURL_ERROR_OPERATION_FAILED;
    };

    pthread_attr_t attr;
    if (pthread_attr_init(&attr) != 0) {
        ZV_LOGE("pthread_attr_init fail");
        return fail();
    }
    if (pthread_attr_setdetachstate(&attr, PTHREAD_CREATE_DETACHED) != 0) {
        ZV_LOGE("pthread_attr_setdetachstate fail");
        pthread_attr_destroy(&attr);
        return fail();
    }
    g_engine.stopping = false;
    g_engine.worker_running = true;
    pthread_t thread;
    if (pthread_create(&thread, &attr, _zv_curl_thread_loop, NULL) != 0) {
        ZV_LOGE("pthread_create fail");
        g_engine.worker_running = false;
        pthread_attr_destroy(&attr);
        return fail();
    }
    if (pthread_attr_destroy(&attr) != 0) {
        // The caller takes the engine as not started, so the worker must not outlive this.
        ZV_LOGE("Cannot destroy the attribute object");
        lock.unlock();
        zv_curl_finalize_service();
        return ZV_CURL_ERROR_OPERATION_FAILED;
    }
    return ZV_CURL_ERROR_NONE;
}

void zv_curl_finalize_service(void)
{
    ZV_LOG_ENTER();
    if (refused_on_worker())
        return;
    std::unique_lock<std::mutex> lock(g_engine.lock);
    if (!g_engine.worker_running)
        return;
    // The worker detaches every request and cleans up the multi handle on its way out; the
    // lock outlives it, and the thread is detached, so stop waits for its last word instead.
    g_engine.stopping = true;
    curl_multi_wakeup(g_engine.multi);
    g_engine.changed.wait(lock, [] { return !g_engine.worker_running; });
    g_engine.stopping = false;
}

int zv_curl_send_request(TransferItem *item)
{
    ZV_LOG_ENTER();
    if (!item) {
        ZV_LOGE("handle is NULL");
        return ZV_CURL_ERROR_INVALID_HANDLE;
    }
    if (!item->url) {
        ZV_LOGE("url is NULL");
        return ZV_CURL_ERROR_INVALID_PARAMETER;
    }
    if (refused_on_worker())
        return ZV_CURL_ERROR_OPERATION_FAILED;

    // The worker gives up a completed request's easy handle and writes the file offset while
    // it reads: the item is looked at with the lock held.
    EngineLock lock;
    if (item->curl || item->engine_flags) {
        // The item was sent before: its old transfer leaves the engine, and the answer and
        // file position it left behind are dropped.
        detach(item);
        curl_easy_cleanup(item->curl);
        item->curl = NULL;
        item->engine_flags = 0;
        clear_answer(item);
        close_stream(item);
    }
    SlistPtr headers;
    EasyPtr curl(build_easy_handle(item, &headers));
    if (!curl) {
        ZV_LOGE("curl init fail");
        return ZV_CURL_ERROR_OPERATION_FAILED;
    }
    item->curl = curl.release();
    // Past the cap, or behind requests that already wait, the request waits its turn.
    bool waits = g_engine.worker_running && (cap_reached() || !g_engine.waiting.empty());
    CURLMcode mc = CURLM_BAD_HANDLE;
    if (g_engine.worker_running)
        mc = waits ? CURLM_OK : attach(item);
    if (mc != CURLM_OK) {
        // Not queued, so no answer will come: the caller is told, so that it does not wait
        // for one (an engine that failed to start refuses every request this way).
        ZV_LOGE("curl_multi_add_handle Error:: %s", curl_multi_strerror(mc));
        curl_easy_setopt(item->curl, CURLOPT_HTTPHEADER, NULL);
        return ZV_CURL_ERROR_OPERATION_FAILED;
    }
    item->engine_headers = headers.release();
    if (waits) {
        item->engine_flags = kWaiting;
        g_engine.waiting.push_back(item);
    }
    return ZV_CURL_ERROR_NONE;
}

int zv_curl_cancel_request(TransferItem *item)
{
    ZV_LOG_ENTER();
    std::unique_ptr<EngineLock> lock;
    int ret = lock_sent_item(item, &lock);
    if (ret != ZV_CURL_ERROR_NONE)
        return ret;
    detach(item);
    curl_easy_cleanup(item->curl);
    item->curl = NULL;
    item->engine_flags = 0;
    return ZV_CURL_ERROR_NONE;
}

int zv_curl_pause_request(TransferItem *item)
{
    ZV_LOG_ENTER();
    return set_pause(item, true);
}

int zv_curl_resume_request(TransferItem *item)
{
    ZV_LOG_ENTER();
    return set_pause(item, false);
}

int zv_curl_new(TransferItem **handle)
{
    ZV_LOG_ENTER();
    if (!handle) {
        ZV_LOGE("handle is NULL");
        return ZV_CURL_ERROR_INVALID_HANDLE;
    }
    if (*handle)
        release_item(*handle);
    TransferItem *item = g_try_new0(TransferItem, 1);
    g_assert(item);
    *handle = item;
    return ZV_CURL_ERROR_NONE;
}

void zv_curl_free(TransferItem *item)
{
    ZV_LOG_ENTER();
    if (!item) {
        ZV_LOGE("handle is NULL");
        return;
    }
    EngineLock lock;
    _zv_curl_item_free(item);
}

void zv_curl_delete(TransferItem **item)
{
    ZV_LOG_ENTER();
    if (!item || !*item)
        return;
    release_item(*item);
    *item = NULL;
}

#define ZV_CURL_CHECK_ITEM(item)                                                                   \
    do {                                                                                           \
        ZV_LOG_ENTER();                                                                            \
        if (!(item)) {                                                                             \
            ZV_LOGE("handle is NULL");                                                             \
            return ZV_CURL_ERROR_INVALID_HANDLE;                                                   \
        }                                                                                          \
    } while (0)

int zv_curl_set_callback_func(TransferItem *item, ZvCurlResponseCb callback_func)
{
    ZV_CURL_CHECK_ITEM(item);
    item->callback_func = callback_func;
    return ZV_CURL_ERROR_NONE;
}

int zv_curl_set_progress_cb_func(TransferItem *item, ZvCurlProgressCb progress_cb_func)
{
    ZV_CURL_CHECK_ITEM(item);
    item->progress_cb_func = progress_cb_func;
    return ZV_CURL_ERROR_NONE;
}

int zv_curl_set_user_data(TransferItem *item, void *user_data)
{
    ZV_CURL_CHECK_ITEM(item);
    item->user_data = user_data;
    return ZV_CURL_ERROR_NONE;
}

int zv_curl_set_method(TransferItem *item, int method)
{
    ZV_CURL_CHECK_ITEM(item);
    item->method = method;
    return ZV_CURL_ERROR_NONE;
}

int zv_curl_set_url(TransferItem *item, const char *url)
{
    ZV_CURL_CHECK_ITEM(item);
    if (!url) {
        ZV_LOGE("url is NULL");
        return ZV_CURL_ERROR_INVALID_PARAMETER;
    }
    replace_text(&item->url, url);
    return ZV_CURL_ERROR_NONE;
}

int zv_curl_set_body(TransferItem *item, const char *body, int len)
{
    ZV_CURL_CHECK_ITEM(item);
    if (len < 0) {
        ZV_LOGE("invalid body len");
        return ZV_CURL_ERROR_INVALID_PARAMETER;
    }
    if (static_cast<size_t>(len) > (body ? strlen(body) : 0)) {
        ZV_LOGE("invalid body len");
        return ZV_CURL_ERROR_INVALID_PARAMETER;
    }
    replace_text(&item->body, body);
    item->body_len = len;
    return ZV_CURL_ERROR_NONE;
}

int zv_curl_set_timeout(TransferItem *item, int timeout_ms)
{
    ZV_CURL_CHECK_ITEM(item);
    if (timeout_ms < 0) {
        ZV_LOGE("invalid time value");
        return ZV_CURL_ERROR_INVALID_PARAMETER;
    }
    item->timeout = timeout_ms;
    return ZV_CURL_ERROR_NONE;
}

int zv_curl_set_connect_timeout(TransferItem *item, int timeout_ms)
{
    ZV_CURL_CHECK_ITEM(item);
    if (timeout_ms < 0) {
        ZV_LOGE("invalid time value");
        return ZV_CURL_ERROR_INVALID_PARAMETER;
    }
    item->connect_timeout = timeout_ms;
    return ZV_CURL_ERROR_NONE;
}

int zv_curl_set_user_agent(TransferItem *item, const char *user_agent)
{
    ZV_CURL_CHECK_ITEM(item);
    replace_text(&item->user_agent, user_agent);
    return ZV_CURL_ERROR_NONE;
}

int zv_curl_set_header(TransferItem *item, const char *header)
{
    ZV_CURL_CHECK_ITEM(item);
    if (!header) {
        ZV_LOGE("header is NULL");
        return ZV_CURL_ERROR_INVALID_PARAMETER;
    }
    item->header_list = g_list_append(item->header_list, g_strdup(header));
    return ZV_CURL_ERROR_NONE;
}

int zv_curl_set_file_info(TransferItem *item, const char *file_path, int64_t size, int64_t offset)
{
    ZV_CURL_CHECK_ITEM(item);
    if (!file_path) {
        ZV_LOGE("file_path is NULL");
        return ZV_CURL_ERROR_INVALID_PARAMETER;
    }
    if (size < 0 || offset < 0) {
        ZV_LOGE("invalid file size value");
        return ZV_CURL_ERROR_INVALID_PARAMETER;
    }
    replace_text(&item->file_path, file_path);
    item->file_size = size;
    item->file_offset = offset;
    return ZV_CURL_ERROR_NONE;
}

int zv_curl_set_netwrok_info(TransferItem *item, const char *ip, const char *proxy)
{
    ZV_CURL_CHECK_ITEM(item);
    replace_text(&item->ip, ip);
    replace_text(&item->proxy, proxy);
    return ZV_CURL_ERROR_NONE;
}
