// Transfer engine benchmark against a loopback server: upload throughput and CPU per GiB
// next to `curl -T`, the worker's CPU while its only transfer is paused, the delay from
// queueing on an idle engine to the first byte at the server, and resident memory during a
// large upload and over many requests. Prints each figure with its target.
//
//   zv-engine-bench [--size-mib N] [--rounds N] [--requests N] [--devserver PATH] [--load]
//                   [--no-fail]
//   zv-engine-bench --sink          (the sink server: prints its port, reads and discards)
//
// The server is zuvo-devserver when --devserver names it (an upload address is made for each
// upload with the metadata POST), else the sink of this program, run as a child process so
// that its CPU is not counted as the engine's. --load runs the uploads beside a busy machine:
// one process that keeps a core busy and one that keeps writing and removing small files,
// as a phone's other applications would. The exit status is 1 when a figure misses its
// target, unless --no-fail.
#include <arpa/inet.h>
#include <fcntl.h>
#include <netinet/in.h>
#include <poll.h>
#include <signal.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <condition_variable>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "zv-bench-util.h"
#include "zv-plugin-curl.h"

namespace
{

using namespace zv_bench;

// ---- the sink server (child process) ----

void sink_connection(int fd)
{
    std::vector<char> buf(1 << 20);
    std::string head;
    for (;;) {
        head.clear();
        size_t end;
        std::string rest;
        while ((end = head.find("\r\n\r\n")) == std::string::npos) {
            ssize_t n = recv(fd, buf.data(), 4096, 0);
            if (n <= 0) {
                close(fd);
                return;
            }
            head.append(buf.data(), static_cast<size_t>(n));
        }
        rest = head.substr(end + 4);
        head.resize(end + 4);
        std::string lower(head);
        for (char &c : lower)
            c = static_cast<char>(tolower(static_cast<unsigned char>(c)));
        long long left = 0;
        size_t at = lower.find("\r\ncontent-length:");
        if (at != std::string::npos)
            left = atoll(lower.c_str() + at + 17);
        if (lower.find("\r\nexpect: 100-continue") != std::string::npos)
            send(fd, "HTTP/1.1 100 Continue\r\n\r\n", 25, MSG_NOSIGNAL);
        left -= static_cast<long long>(rest.size());
        while (left > 0) {
            ssize_t n = recv(fd, buf.data(), std::min<long long>(left, buf.size()), 0);
            if (n <= 0) {
                close(fd);
                return;
            }
            left -= n;
        }
        const char *answer = "HTTP/1.1 201 Created\r\nETag: \"bench\"\r\nContent-Length: 0\r\n\r\n";
        send(fd, answer, strlen(answer), MSG_NOSIGNAL);
    }
}

int run_sink()
{
    int fd = socket(AF_INET, SOCK_STREAM, 0);
    sockaddr_in addr{};
    addr.sin_family = AF_INET;
    addr.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    socklen_t len = sizeof addr;
    if (bind(fd, reinterpret_cast<sockaddr *>(&addr), len) != 0 || listen(fd, 64) != 0 ||
        getsockname(fd, reinterpret_cast<sockaddr *>(&addr), &len) != 0)
        return 1;
    printf("%d\n", ntohs(addr.sin_port));
    fflush(stdout);
    // Ends when its parent goes away, whatever happens to the parent.
    for (;;) {
        if (getppid() == 1)
            return 0;
        pollfd pfd{fd, POLLIN, 0};
        if (poll(&pfd, 1, 1000) <= 0)
            continue;
        int conn = accept(fd, nullptr, nullptr);
        if (conn >= 0)
            std::thread(sink_connection, conn).detach();
    }
}

// A listener of this process that notes when the first byte of a connection arrives.
class FirstByteProbe
{
  public:
    FirstByteProbe()
    {
        fd_ = socket(AF_INET, SOCK_STREAM, 0);
        sockaddr_in addr{};
        addr.sin_family = AF_INET;
        addr.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
        socklen_t len = sizeof addr;
        bind(fd_, reinterpret_cast<sockaddr *>(&addr), len);
        listen(fd_, 8);
        getsockname(fd_, reinterpret_cast<sockaddr *>(&addr), &len);
        port_ = ntohs(addr.sin_port);
    }
    ~FirstByteProbe() { close(fd_); }
    std::string url() const { return "http://127.0.0.1:" + std::to_string(port_) + "/probe"; }

    // Waits for one connection and its first byte; answers it so the request completes.
    Clock::time_point serve_one()
    {
        int conn = accept(fd_, nullptr, nullptr);
        char c;
        recv(conn, &c, 1, 0);
        Clock::time_point at = Clock::now();
        char buf[4096];
        pollfd pfd{conn, POLLIN, 0};
        while (poll(&pfd, 1, 100) > 0 && recv(conn, buf, sizeof buf, MSG_DONTWAIT) > 0) {
        }
        const char *answer = "HTTP/1.1 200 OK\r\nContent-Length: 0\r\nConnection: close\r\n\r\n";
        send(conn, answer, strlen(answer), MSG_NOSIGNAL);
        close(conn);
        return at;
    }

  private:
    int fd_ = -1;
    int port_ = 0;
};

// The load of --load, as child processes that end with this program: a core kept busy, and
// small files written, flushed and removed without pause in the folder given.
std::vector<pid_t> start_load(const std::string &dir)
{
    std::vector<pid_t> pids;
    for (int kind = 0; kind < 2; ++kind) {
        pid_t pid = fork();
        if (pid == 0) {
            prctl(PR_SET_PDEATHSIG, SIGKILL);
            volatile unsigned long spin = 0;
            std::vector<char> block(64 * 1024, 'x');
            for (unsigned long i = 0;; ++i) {
                if (kind == 0) {
                    for (int k = 0; k < 1000000; ++k)
                        spin = spin + k;
                    continue;
                }
                std::string file = dir + "/load-" + std::to_string(i % 64);
                int fd = open(file.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0600);
                if (fd >= 0) {
                    if (write(fd, block.data(), block.size()) < 0)
                        _exit(1);
                    fdatasync(fd);
                    close(fd);
                }
                if (i % 64 == 63)
                    for (int k = 0; k < 64; ++k)
                        unlink((dir + "/load-" + std::to_string(k)).c_str());
            }
            _exit(0);
        }
        if (pid > 0)
            pids.push_back(pid);
    }
    return pids;
}

} // namespace

int main(int argc, char **argv)
{
    int size_mib = 1024, rounds = 5, requests = 10000;
    std::string devserver;
    bool load = false;
    for (int i = 1; i < argc; ++i) {
        std::string a = argv[i];
        if (a == "--sink")
            return run_sink();
        if (a == "--size-mib" && i + 1 < argc)
            size_mib = atoi(argv[++i]);
        else if (a == "--rounds" && i + 1 < argc)
            rounds = atoi(argv[++i]);
        else if (a == "--requests" && i + 1 < argc)
            requests = atoi(argv[++i]);
        else if (a == "--devserver" && i + 1 < argc)
            devserver = argv[++i];
        else if (a == "--load")
            load = true;
        else if (a == "--no-fail")
            g_no_fail = true;
        else {
            fprintf(stderr, "zv-engine-bench: unknown argument %s\n", argv[i]);
            return 2;
        }
    }
    // The engine logs every request; the figures are about the transfers.
    setenv("ZV_DLOG_FILE", getenv("ZV_BENCH_LOG") ? getenv("ZV_BENCH_LOG") : "/dev/null", 1);
    for (const char *var : {"http_proxy", "https_proxy", "HTTP_PROXY", "ALL_PROXY", "all_proxy"})
        unsetenv(var);
    signal(SIGPIPE, SIG_IGN);

    char tmpl[] = "/tmp/zv-engine-bench-XXXXXX";
    if (!mkdtemp(tmpl)) {
        perror("mkdtemp");
        return 1;
    }
    std::string dir = tmpl;
    std::string path = dir + "/upload.bin";
    const long long size = static_cast<long long>(size_mib) * 1024 * 1024;
    {
        FILE *f = fopen(path.c_str(), "wb");
        std::vector<char> block(8 << 20);
        for (size_t i = 0; i < block.size(); ++i)
            block[i] = static_cast<char>(i * 131 + (i >> 13));
        for (long long left = size; f && left > 0; left -= static_cast<long long>(block.size()))
            fwrite(block.data(), 1, std::min<long long>(left, block.size()), f);
        // On the disk before the first round: else the kernel writes the file back half a
        // minute later, in the middle of whichever upload runs then, and that round's figure
        // is the disk's.
        if (!f || fflush(f) != 0 || fsync(fileno(f)) != 0 || fclose(f) != 0) {
            perror("writing the upload file");
            return 1;
        }
    }

    Target target;
    int port = 0;
    pid_t server;
    // The devserver reads every byte through its HTTP stack but stores none: on a virtual
    // machine that hands freed memory back to its host, 1 GiB stored and removed per upload
    // costs a varying number of host page faults on the next one, which made one round of
    // five (engine's or curl's alike) up to four times slower than the others.
    if (!devserver.empty()) {
        target.devserver = true;
        server = spawn_server({devserver, "--port", "0", "--storage", dir + "/storage",
                               "--discard-data", "--token", target.token, "--api-key",
                               target.api_key},
                              &port);
    } else {
        char self[4096];
        ssize_t n = readlink("/proc/self/exe", self, sizeof self - 1);
        self[n > 0 ? n : 0] = '\0';
        server = spawn_server({self, "--sink"}, &port);
    }
    if (server <= 0 || port <= 0) {
        fprintf(stderr, "zv-engine-bench: the server did not start\n");
        return 1;
    }
    target.base = "http://127.0.0.1:" + std::to_string(port);
    printf("server: %s on port %d; file %d MiB; %d rounds%s\n",
           target.devserver ? "zuvo-devserver" : "sink", port, size_mib, rounds,
           load ? "; under load (a busy core, small files written)" : "");
    std::vector<pid_t> load_pids;
    if (load)
        load_pids = start_load(dir);

    zv_curl_init_service();
    int failures = 0;

    // 1, 2: throughput and CPU of one upload, engine and curl alternately.
    std::vector<double> engine_rate, curl_rate, engine_cpu, curl_cpu, rate_ratio, cpu_ratio;
    long rss_growth = 0;
    double gib = size / (1024.0 * 1024 * 1024);
    for (int i = 0; i < rounds; ++i) {
        // Alternate who goes first, in case one upload slows the next.
        RunResult e, c;
        if (i % 2 == 0) {
            e = engine_upload(target, path, static_cast<int>(size), &rss_growth);
            c = curl_upload(target, path);
        } else {
            c = curl_upload(target, path);
            e = engine_upload(target, path, static_cast<int>(size), &rss_growth);
        }
        if (!e.ok || !c.ok) {
            fprintf(stderr, "round %d failed (engine %d, curl %d)\n", i, e.ok, c.ok);
            ++failures;
            continue;
        }
        rate_ratio.push_back(c.wall / e.wall);
        cpu_ratio.push_back(e.cpu / std::max(c.cpu, 1e-6));
        engine_rate.push_back(size / e.wall / (1 << 20));
        curl_rate.push_back(size / c.wall / (1 << 20));
        engine_cpu.push_back(e.cpu / gib);
        curl_cpu.push_back(c.cpu / gib);
        printf("  round %d: engine %.0f MiB/s %.2f s CPU, curl %.0f MiB/s %.2f s CPU: %.2fx\n",
               i, engine_rate.back(), e.cpu, curl_rate.back(), c.cpu, rate_ratio.back());
    }
    for (pid_t pid : load_pids) {
        kill(pid, SIGTERM);
        waitpid(pid, nullptr, 0);
    }
    bool all_pass = failures == 0;
    if (!engine_rate.empty()) {
        // Each figure is the median of the rounds' own ratios (a round's two uploads share
        // the machine's conditions), beside the medians of the plain numbers.
        double ratio = median(rate_ratio);
        bool pass = ratio >= 0.95;
        all_pass &= pass;
        report("upload throughput (median)",
               fmt("engine %.0f MiB/s, curl %.0f MiB/s: %.2fx", median(engine_rate),
                   median(curl_rate), ratio),
               ">= 0.95x", pass);
        double lowest = *std::min_element(rate_ratio.begin(), rate_ratio.end());
        pass = lowest >= 0.8;
        all_pass &= pass;
        report("upload throughput (lowest round)",
               fmt("%.2fx (highest %.2fx)", lowest,
                   *std::max_element(rate_ratio.begin(), rate_ratio.end())),
               ">= 0.80x", pass);
        double cpu = median(cpu_ratio);
        pass = cpu <= 1.0;
        all_pass &= pass;
        report("CPU user+sys per GiB (median)",
               fmt("engine %.2f s, curl %.2f s: %.2fx", median(engine_cpu), median(curl_cpu), cpu),
               "<= 1.00x", pass);
        bool rss_pass = rss_growth < 32 * 1024;
        all_pass &= rss_pass;
        report("resident memory during upload",
               fmt("grew %.1f MiB at most, for a %.0f MiB file", rss_growth / 1024.0, size_mib),
               "< 32 MiB", rss_pass);
    }

    // 3: the worker's CPU while its only transfer is paused for 5 s.
    {
        std::string url = target.upload_url();
        Waiter w;
        TransferItem *item = new_upload(&w, url, path, static_cast<int>(size));
        zv_curl_send_request(item);
        while (w.reads == 0)
            std::this_thread::sleep_for(std::chrono::milliseconds(1));
        zv_curl_pause_request(item);
        int reads = w.reads;
        double cpu0 = self_cpu();
        std::this_thread::sleep_for(std::chrono::seconds(5));
        double percent = (self_cpu() - cpu0) / 5.0 * 100.0;
        bool held = w.reads == reads;
        zv_curl_cancel_request(item);
        zv_curl_delete(&item);
        bool pass = percent < 1.0 && held;
        all_pass &= pass;
        report("worker CPU, only transfer paused",
               fmt("%.3f %% of a core over 5 s", percent) + (held ? "" : " (it moved!)"), "< 1 %",
               pass);
    }

    // 4: from send on an idle engine to the first byte at the server.
    {
        FirstByteProbe probe;
        std::vector<double> delays;
        for (int i = 0; i < 10; ++i) {
            std::this_thread::sleep_for(std::chrono::milliseconds(300)); // the worker is idle
            Waiter w;
            TransferItem *item = new_item(&w, ZV_CURL_HTTP_METHOD_GET, probe.url());
            Clock::time_point arrived;
            std::thread server_side([&] { arrived = probe.serve_one(); });
            auto t0 = Clock::now();
            zv_curl_send_request(item);
            server_side.join();
            delays.push_back(std::chrono::duration<double, std::milli>(arrived - t0).count());
            w.wait(10);
            zv_curl_delete(&item);
        }
        double worst = *std::max_element(delays.begin(), delays.end());
        bool pass = worst < 50;
        all_pass &= pass;
        report("send to first byte, idle engine",
               fmt("median %.2f ms, max %.2f ms over 10", median(delays), worst), "< 50 ms", pass);
    }

    // 5: memory over many small requests, each on a fresh item released after its answer.
    if (requests >= 1000) {
        long at_first = 0, at_end = 0;
        Waiter w;
        for (int i = 0; i < requests; ++i) {
            w.reset();
            TransferItem *item = new_item(&w, ZV_CURL_HTTP_METHOD_POST, target.base + "/small");
            zv_curl_set_header(item, "Content-Type: application/x-www-form-urlencoded");
            zv_curl_set_body(item, "a=1&b=2", 7);
            zv_curl_send_request(item);
            w.wait(30);
            zv_curl_delete(&item);
            if (i == requests / 10 - 1)
                at_first = rss_kib();
        }
        at_end = rss_kib();
        double growth = (at_end - at_first) / 1024.0;
        bool pass = growth < 2.0;
        all_pass &= pass;
        report("resident memory over requests",
               fmt("%.2f MiB growth from request %.0f to %.0f", growth, requests / 10.0, requests),
               "< 2 MiB", pass);
    }

    zv_curl_finalize_service();
    kill(server, SIGTERM);
    waitpid(server, nullptr, 0);
    unlink(path.c_str());
    std::string rm = "rm -rf '" + dir + "'";
    if (system(rm.c_str()) != 0)
        fprintf(stderr, "could not remove %s\n", dir.c_str());
    return finish(all_pass);
}
