// Pieces the benchmarks share: clocks and CPU, the child server, engine requests against
// zuvo-devserver, and the report lines.
#pragma once

#include <fcntl.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <condition_variable>
#include <mutex>
#include <string>
#include <vector>

#include "zv-plugin-curl.h"
#include "zv-test-server.h"

namespace zv_bench
{

using Clock = std::chrono::steady_clock;

inline double seconds_since(Clock::time_point t)
{
    return std::chrono::duration<double>(Clock::now() - t).count();
}

inline double cpu_seconds(const rusage &ru)
{
    return ru.ru_utime.tv_sec + ru.ru_utime.tv_usec / 1e6 + ru.ru_stime.tv_sec +
           ru.ru_stime.tv_usec / 1e6;
}

inline double self_cpu()
{
    rusage ru;
    getrusage(RUSAGE_SELF, &ru);
    return cpu_seconds(ru);
}

inline long rss_kib()
{
    FILE *f = fopen("/proc/self/status", "r");
    if (!f)
        return -1;
    char line[256];
    long kib = -1;
    while (fgets(line, sizeof line, f)) {
        if (strncmp(line, "VmRSS:", 6) == 0) {
            kib = atol(line + 6);
            break;
        }
    }
    fclose(f);
    return kib;
}

// The child server: its port is the last number on its first line of output.
using zv_test::spawn_server;

// ---- engine requests ----

struct Waiter {
    std::mutex m;
    std::condition_variable cv;
    bool done = false;
    long http_code = -2;
    std::string header;
    std::atomic<int> reads{0};

    void reset()
    {
        std::lock_guard<std::mutex> lock(m);
        done = false;
        http_code = -2;
        header.clear();
        reads = 0;
    }
    bool wait(double timeout_s)
    {
        std::unique_lock<std::mutex> lock(m);
        return cv.wait_for(lock, std::chrono::duration<double>(timeout_s), [this] { return done; });
    }
};

inline void on_answer(int, TransferResponse *resp, void *user_data)
{
    Waiter *w = static_cast<Waiter *>(user_data);
    std::lock_guard<std::mutex> lock(w->m);
    w->done = true;
    w->http_code = resp->http_code;
    if (resp->header_data)
        w->header = resp->header_data;
    w->cv.notify_all();
}

inline void on_progress(int, void *user_data, int64_t, int64_t)
{
    static_cast<Waiter *>(user_data)->reads++;
}

inline TransferItem *new_item(Waiter *w, int method, const std::string &url)
{
    TransferItem *item = nullptr;
    zv_curl_new(&item);
    zv_curl_set_callback_func(item, on_answer);
    zv_curl_set_progress_cb_func(item, on_progress);
    zv_curl_set_user_data(item, w);
    zv_curl_set_method(item, method);
    zv_curl_set_url(item, url.c_str());
    zv_curl_set_connect_timeout(item, 30000);
    return item;
}

inline TransferItem *new_upload(Waiter *w, const std::string &url, const std::string &path,
                                int64_t size)
{
    TransferItem *item = new_item(w, ZV_CURL_HTTP_METHOD_PUT, url);
    std::string range =
        "Content-Range: bytes 0-" + std::to_string(size - 1) + "/" + std::to_string(size);
    std::string length = "Content-Length: " + std::to_string(size);
    zv_curl_set_header(item, "Content-Type: video/mp4");
    zv_curl_set_header(item, range.c_str());
    zv_curl_set_header(item, "Expect:");
    zv_curl_set_header(item, length.c_str());
    zv_curl_set_file_info(item, path.c_str(), size, 0);
    return item;
}

struct Target {
    std::string base; // http://127.0.0.1:PORT
    bool devserver = false;
    std::string token = "bench-token";
    std::string api_key = "bench-key";

    // An address to PUT a file to: made by the metadata POST on the devserver.
    std::string upload_url()
    {
        if (!devserver)
            return base + "/upload/bench";
        Waiter w;
        std::string url = base + "/resumable/feeds/api/users/default/uploads";
        TransferItem *item = new_item(&w, ZV_CURL_HTTP_METHOD_POST, url);
        const char *doc = "<?xml version=\"1.0\"?>\r\n<entry xmlns=\"http://www.w3.org/2005/Atom\" "
                          "xmlns:media=\"http://search.yahoo.com/mrss/\"><media:group>"
                          "<media:title type=\"plain\">bench</media:title>"
                          "<media:category>People</media:category></media:group></entry>";
        std::string auth = "Authorization: Bearer " + token;
        std::string key = "X-ZvData-Key: key=" + api_key;
        zv_curl_set_header(item, "Content-Type: application/atom+xml; charset=UTF-8");
        zv_curl_set_header(item, "ZvData-Version: 2");
        zv_curl_set_header(item, auth.c_str());
        zv_curl_set_header(item, key.c_str());
        zv_curl_set_header(item, "Slug: bench.mp4");
        zv_curl_set_body(item, doc, static_cast<int>(strlen(doc)));
        zv_curl_send_request(item);
        w.wait(30);
        zv_curl_delete(&item);
        size_t at = w.header.find("Location: ");
        if (at == std::string::npos)
            return "";
        return w.header.substr(at + 10, w.header.find('\r', at) - at - 10);
    }
};

struct RunResult {
    double wall = 0, cpu = 0;
    bool ok = false;
};

inline RunResult engine_upload(Target &target, const std::string &path, int64_t size,
                               long *peak_rss_growth)
{
    RunResult r;
    std::string url = target.upload_url();
    if (url.empty())
        return r;
    Waiter w;
    TransferItem *item = new_upload(&w, url, path, size);
    long base_rss = rss_kib(), peak = base_rss;
    double cpu0 = self_cpu();
    auto t0 = Clock::now();
    zv_curl_send_request(item);
    while (!w.wait(0.05))
        peak = std::max(peak, rss_kib());
    r.wall = seconds_since(t0);
    r.cpu = self_cpu() - cpu0;
    r.ok = w.http_code == 200 || w.http_code == 201;
    if (peak_rss_growth)
        *peak_rss_growth = std::max(*peak_rss_growth, peak - base_rss);
    zv_curl_delete(&item);
    return r;
}

// `curl -T` of the file to a fresh upload address of the target, as a child process.
inline RunResult curl_upload(Target &target, const std::string &path)
{
    RunResult r;
    std::string url = target.upload_url();
    if (url.empty())
        return r;
    auto t0 = Clock::now();
    pid_t pid = fork();
    if (pid == 0) {
        int null_fd = open("/dev/null", O_WRONLY);
        dup2(null_fd, STDOUT_FILENO);
        // --fail: an error answer is a failed round, never a fast one.
        execlp("curl", "curl", "-sS", "--fail", "-o", "/dev/null", "-T", path.c_str(), url.c_str(),
               (char *)nullptr);
        _exit(127);
    }
    int status = 0;
    rusage ru{};
    wait4(pid, &status, 0, &ru);
    r.wall = seconds_since(t0);
    r.cpu = cpu_seconds(ru);
    r.ok = WIFEXITED(status) && WEXITSTATUS(status) == 0;
    return r;
}

inline double median(std::vector<double> v)
{
    std::sort(v.begin(), v.end());
    return v.empty() ? 0 : v[v.size() / 2];
}

// Figures that missed their target in this run, and whether a miss only prints (--no-fail).
inline int g_misses = 0;
inline bool g_no_fail = false;

inline void report(const char *name, const std::string &figure, const char *target, bool pass)
{
    printf("%-34s %-44s target %-14s %s\n", name, figure.c_str(), target, pass ? "PASS" : "MISS");
    if (!pass)
        ++g_misses;
}

// The program's exit status: 1 when a figure missed its target (or a run failed) unless
// --no-fail was given.
inline int finish(bool all_met)
{
    all_met = all_met && g_misses == 0;
    printf("%s\n", all_met ? "all figures met" : "some figures missed");
    return all_met || g_no_fail ? 0 : 1;
}

inline std::string fmt(const char *f, double a, double b = 0, double c = 0)
{
    char buf[160];
    snprintf(buf, sizeof buf, f, a, b, c);
    return buf;
}

} // namespace zv_bench
