// Benchmark of the whole upload service, the real processes on loopback:
//   1. a large upload through the service in the foreground (every progress report stored)
//      next to the engine alone and to `curl -T` uploading the same file in the same run;
//   2. a video past 2 GiB (2 GiB + 64 MiB) through the service next to curl for the same
//      file, and the service's peak memory, which must not grow with the file's size;
//   3. many jobs at once: time, the service's peak memory, byte-identical copies;
//   4. a batch of the history's size (5,000 jobs of 64 KiB) with the service alone under an
//      open-file limit of 1,024, soft and hard: time, peak memory, byte-identical copies;
//   5. start-up with a long history (thumbnails included) to the first drawn job list.
// Prints each figure with its target; the exit status is 1 when one misses, unless --no-fail.
//
//   zv-service-bench [--bin DIR] [--size-mib N] [--jobs N] [--job-mib N] [--rows N]
//                    [--limit-jobs N] [--nofile N] [--no-fail]
//
// DIR holds zuvo-upload-svc, zuvo-client, zuvo-devserver, zv-vconf and zv-keystore (default:
// this program's folder). Every run gets a fresh world of its own (ZV_* environment) in a
// temporary folder, removed at the end.
#include <glob.h>
#include <signal.h>
#include <sqlite3.h>
#include <sys/stat.h>

#include <fstream>
#include <functional>
#include <map>
#include <random>
#include <sstream>
#include <thread>

#include "media_content.h"
#include "zv-ext-db.h"
#include "zv-bench-util.h"

namespace
{

using namespace zv_bench;

constexpr int kCompleted = 4;
constexpr int kUploading = 3;

std::string g_bin;

std::string program(const char *name) { return g_bin + "/" + name; }

// Runs argv to its end with `input` on its standard input; its exit status (-1: not run).
int run(const std::vector<std::string> &argv, const std::string &input = "",
        std::string *output = nullptr)
{
    int in[2], out[2];
    if (pipe(in) != 0 || pipe(out) != 0)
        return -1;
    pid_t pid = fork();
    if (pid == 0) {
        dup2(in[0], STDIN_FILENO);
        dup2(out[1], STDOUT_FILENO);
        int null_fd = open("/dev/null", O_WRONLY);
        dup2(null_fd, STDERR_FILENO);
        close(in[1]);
        close(out[0]);
        std::vector<char *> args;
        for (const std::string &a : argv)
            args.push_back(const_cast<char *>(a.c_str()));
        args.push_back(nullptr);
        execv(args[0], args.data());
        _exit(127);
    }
    close(in[0]);
    close(out[1]);
    if (!input.empty() && write(in[1], input.data(), input.size()) < 0)
        perror("write");
    close(in[1]);
    std::string text;
    char buf[4096];
    ssize_t n;
    while ((n = read(out[0], buf, sizeof buf)) > 0)
        text.append(buf, static_cast<size_t>(n));
    close(out[0]);
    int status = 0;
    waitpid(pid, &status, 0);
    if (output)
        *output = text;
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

std::string read_file(const std::string &path)
{
    std::ifstream in(path, std::ios::binary);
    std::ostringstream s;
    s << in.rdbuf();
    return s.str();
}

// Writes `bytes` of a pattern that differs with the seed.
bool make_file(const std::string &path, long long bytes, unsigned seed)
{
    FILE *f = fopen(path.c_str(), "wb");
    if (!f)
        return false;
    std::vector<char> block(static_cast<size_t>(std::min<long long>(bytes, 4 << 20)));
    std::mt19937 gen(seed);
    for (char &c : block)
        c = static_cast<char>(gen());
    for (long long left = bytes; left > 0; left -= static_cast<long long>(block.size())) {
        block[0] = static_cast<char>(left); // no two blocks alike
        fwrite(block.data(), 1, std::min<long long>(left, block.size()), f);
    }
    return fclose(f) == 0;
}

// A private world for one service run: folders, environment, keys and a server.
struct World {
    std::string dir;
    std::string storage;
    Target target;
    pid_t server = -1;
    pid_t service = -1;

    bool open(const std::string &root, const std::string &name, bool keep_data)
    {
        dir = root + "/" + name;
        storage = dir + "/server";
        if (mkdir(dir.c_str(), 0700) != 0)
            return false;
        setenv("ZV_RUNTIME_DIR", (dir + "/run").c_str(), 1);
        setenv("ZV_HISTORY_DB", (dir + "/history.db").c_str(), 1);
        setenv("ZV_KEY_STORAGE_DIR", (dir + "/keys").c_str(), 1);
        setenv("ZV_MEDIA_DB", (dir + "/media.db").c_str(), 1);
        setenv("ZV_DLOG_FILE", (dir + "/service.log").c_str(), 1);
        setenv("ZV_NETWORK", "keys", 1);
        setenv("ELM_ENGINE", "buffer", 1);
        unsetenv("ZV_LOCATION");
        std::vector<std::string> argv = {program("zuvo-devserver"), "--port", "0", "--storage",
                                         storage, "--token", target.token, "--api-key",
                                         target.api_key, "--log", dir + "/requests.log"};
        if (!keep_data)
            argv.push_back("--discard-data");
        int port = 0;
        server = spawn_server(argv, &port);
        if (server <= 0 || port <= 0)
            return false;
        target.devserver = true;
        target.base = "http://127.0.0.1:" + std::to_string(port);
        std::string host = "127.0.0.1:" + std::to_string(port);
        for (const char *var : {"ZV_UPLOAD_HOST", "ZV_DATA_HOST", "ZV_ACCOUNT_HOST", "ZV_TOKEN_HOST"})
            setenv(var, host.c_str(), 1);
        const std::string vconf = program("zv-vconf");
        return run({vconf, "set", "-t", "int", "memory/dnet/status", "2"}) == 0 &&
               run({vconf, "set", "-t", "int", "memory/dnet/network_config", "1"}) == 0 &&
               run({vconf, "set", "-t", "string", "memory/dnet/ip", "127.0.0.1"}) == 0 &&
               run({vconf, "set", "-t", "string", "memory/dnet/proxy", ""}) == 0 &&
               run({program("zv-keystore"), "set", "zuvo.tizen.api.key"}, target.api_key) == 0;
    }

    bool record(const std::vector<std::string> &files)
    {
        std::vector<std::string> argv = {program("zuvo-client"), "add"};
        argv.insert(argv.end(), files.begin(), files.end());
        return run(argv) == 0;
    }

    // The batch's launch request through the companion: to the running service.
    bool launch()
    {
        setenv("ZV_ACCESS_TOKEN", target.token.c_str(), 1);
        bool ok = run({program("zuvo-client"), "launch", "--category", "People"}) == 0;
        unsetenv("ZV_ACCESS_TOKEN");
        return ok;
    }

    // The service with a batch's launch request (or none), its output dropped; under an
    // open-file limit (soft and hard, as prlimit sets it) when nofile is above 0.
    void start_service(bool with_batch, rlim_t nofile = 0)
    {
        std::vector<std::string> argv = {program("zuvo-upload-svc")};
        if (with_batch)
            argv.insert(argv.end(), {"--extra", "ZV_DATA_ACCESS_TOKEN=" + target.token, "--extra",
                                     "ZV_DATA_CATEGORY=People", "--extra", "ZV_DATA_ACCESS_TYPE=0"});
        service = fork();
        if (service == 0) {
            int null_fd = ::open("/dev/null", O_RDWR);
            dup2(null_fd, STDIN_FILENO);
            dup2(null_fd, STDOUT_FILENO);
            dup2(null_fd, STDERR_FILENO);
            rlimit limit = {nofile, nofile};
            if (nofile > 0 && setrlimit(RLIMIT_NOFILE, &limit) != 0)
                _exit(126);
            std::vector<char *> args;
            for (const std::string &a : argv)
                args.push_back(const_cast<char *>(a.c_str()));
            args.push_back(nullptr);
            execv(args[0], args.data());
            _exit(127);
        }
    }

    // The service without a batch, once it listens and has drawn its first frames: as when
    // the companion hands a batch to the running instance. False when it never listened.
    bool start_idle_service()
    {
        start_service(false);
        std::string socket = dir + "/run/zuvo-upload-svc.sock";
        auto t0 = Clock::now();
        while (access(socket.c_str(), F_OK) != 0 && seconds_since(t0) < 30)
            std::this_thread::sleep_for(std::chrono::milliseconds(20));
        std::this_thread::sleep_for(std::chrono::seconds(1)); // its first frames drawn
        return access(socket.c_str(), F_OK) == 0;
    }

    // The service's peak resident memory so far, in KiB.
    long service_peak_kib() const
    {
        std::ifstream in("/proc/" + std::to_string(service) + "/status");
        std::string line;
        while (std::getline(in, line))
            if (line.rfind("VmHWM:", 0) == 0)
                return atol(line.c_str() + 6);
        return -1;
    }

    // CPU seconds (user and system) the service has used so far.
    double service_cpu() const
    {
        std::string stat = read_file("/proc/" + std::to_string(service) + "/stat");
        size_t at = stat.rfind(')');
        if (at == std::string::npos)
            return -1;
        std::istringstream in(stat.substr(at + 2));
        std::string field;
        double ticks = 0;
        for (int i = 3; i <= 15 && in >> field; ++i)
            if (i == 14 || i == 15)
                ticks += atof(field.c_str());
        return ticks / sysconf(_SC_CLK_TCK);
    }

    void close()
    {
        for (pid_t *pid : {&service, &server}) {
            if (*pid <= 0)
                continue;
            kill(*pid, SIGTERM);
            for (int i = 0; i < 100 && waitpid(*pid, nullptr, WNOHANG) == 0; ++i)
                std::this_thread::sleep_for(std::chrono::milliseconds(100));
            if (kill(*pid, 0) == 0) {
                kill(*pid, SIGKILL);
                waitpid(*pid, nullptr, 0);
            }
            *pid = -1;
        }
    }
    ~World() { close(); }
};

// Rows of the history by status, read the way the companion reads them.
std::map<int, int> status_counts()
{
    std::map<int, int> counts;
    sqlite3 *db = nullptr;
    if (sqlite3_open_v2(getenv("ZV_HISTORY_DB"), &db, SQLITE_OPEN_READONLY, nullptr) == SQLITE_OK) {
        sqlite3_busy_timeout(db, 1000);
        sqlite3_stmt *stmt = nullptr;
        if (sqlite3_prepare_v2(db, "select status, count(*) from history group by status", -1,
                               &stmt, nullptr) == SQLITE_OK) {
            while (sqlite3_step(stmt) == SQLITE_ROW)
                counts[sqlite3_column_int(stmt, 0)] = sqlite3_column_int(stmt, 1);
        }
        sqlite3_finalize(stmt);
    }
    sqlite3_close(db);
    return counts;
}

// Polls the history until every one of `rows` is COMPLETED; the seconds from the first
// UPLOADING row (or from `t0` when none was seen) to then, negative on time-out.
double wait_all_completed(int rows, double timeout_s, Clock::time_point t0,
                          const World &world, long *peak_kib = nullptr)
{
    Clock::time_point started = t0;
    bool seen_uploading = false;
    auto deadline = Clock::now() + std::chrono::duration<double>(timeout_s);
    while (Clock::now() < deadline) {
        std::map<int, int> counts = status_counts();
        if (!seen_uploading && counts[kUploading] > 0) {
            seen_uploading = true;
            started = Clock::now();
        }
        if (peak_kib)
            *peak_kib = std::max(*peak_kib, world.service_peak_kib());
        if (counts[kCompleted] == rows)
            return seconds_since(started);
        // Polling slowly: the machine's cores are the service's and the server's.
        std::this_thread::sleep_for(std::chrono::milliseconds(50));
    }
    return -1;
}

// Seconds from the answer to the last metadata upload to the answer to the last data upload,
// from the server's request log: the same clock for the engine and for the service.
double last_upload_seconds(const World &world)
{
    std::istringstream in(read_file(world.dir + "/requests.log"));
    std::string line;
    double meta = -1, data = -1;
    while (std::getline(in, line)) {
        size_t at = line.find("\"time\":");
        if (at == std::string::npos)
            continue;
        double t = atof(line.c_str() + at + 7);
        if (line.find("\"kind\":\"meta\"") != std::string::npos)
            meta = t;
        else if (line.find("\"kind\":\"data\"") != std::string::npos)
            data = t;
    }
    return meta > 0 && data > meta ? data - meta : -1;
}

bool bench_large_upload(const std::string &root, int size_mib)
{
    std::string path = root + "/large.bin";
    const long long size = static_cast<long long>(size_mib) << 20;
    if (!make_file(path, size, 1)) {
        fprintf(stderr, "cannot write %s\n", path.c_str());
        return false;
    }
    // Three rounds, each the engine, the service and `curl -T` on the same server, in an order
    // that turns with the round; the figures are the medians of the rounds' ratios.
    const int rounds = 3;
    std::vector<double> to_engine, to_curl, engine_s, service_s, curl_s;
    for (int round = 0; round < rounds; ++round) {
        World world;
        if (!world.open(root, "large-" + std::to_string(round), false)) {
            fprintf(stderr, "the world of round %d did not open\n", round);
            return false;
        }
        double service_cpu = 0;
        auto engine = [&] {
            RunResult r = engine_upload(world.target, path, static_cast<int>(size), nullptr);
            return r.ok ? last_upload_seconds(world) : -1.0;
        };
        auto curl = [&] {
            RunResult r = curl_upload(world.target, path);
            return r.ok ? last_upload_seconds(world) : -1.0;
        };
        // The service is up before the file is recorded, as when the companion hands a
        // batch to the running instance: its start-up is measured on its own below.
        auto service = [&] {
            world.start_idle_service();
            if (!world.record({path}) || !world.launch())
                return -1.0;
            bool done = wait_all_completed(1, 600, Clock::now(), world) >= 0;
            service_cpu = world.service_cpu();
            pid_t server = world.server;
            world.server = -1; // the server stays for the others' turns
            world.close();
            world.server = server;
            return done ? last_upload_seconds(world) : -1.0;
        };
        double e = -1, s = -1, c = -1;
        for (int turn = 0; turn < 3; ++turn) {
            switch ((round + turn) % 3) {
            case 0: e = engine(); break;
            case 1: s = service(); break;
            default: c = curl(); break;
            }
        }
        if (e <= 0 || s <= 0 || c <= 0) {
            fprintf(stderr, "round %d failed (engine %.2f s, service %.2f s, curl %.2f s)\n",
                    round, e, s, c);
            return false;
        }
        printf("  round %d: engine %.2f s, service %.2f s (service process CPU %.2f s), "
               "curl -T %.2f s\n",
               round, e, s, service_cpu, c);
        engine_s.push_back(e);
        service_s.push_back(s);
        curl_s.push_back(c);
        to_engine.push_back(s / e);
        to_curl.push_back(s / c);
    }
    unlink(path.c_str());
    double mib = static_cast<double>(size_mib);
    double ratio = median(to_engine);
    bool pass = ratio <= 1.05;
    report("service upload vs engine alone",
           fmt("%.0f MiB/s vs %.0f MiB/s: %.2fx the time", mib / median(service_s),
               mib / median(engine_s), ratio),
           "<= 1.05x", pass);
    double against_curl = median(to_curl);
    bool curl_pass = against_curl <= 1.1;
    report("service upload vs curl -T",
           fmt("%.0f MiB/s vs %.0f MiB/s: %.2fx the time", mib / median(service_s),
               mib / median(curl_s), against_curl),
           "<= 1.10x", curl_pass);
    return pass && curl_pass;
}

// One running service uploads a video of 64 MiB, then one of 2 GiB + 64 MiB; curl sends the
// large one to the same server. The service's time is the server's, from the metadata
// answer to the data answer; its peak memory after the large video must stay where the
// small one left it.
bool bench_video_past_2gib(const std::string &root)
{
    const long long small_size = 64LL << 20, size = (2048LL + 64) << 20;
    std::string small = root + "/video-64m.mp4", large = root + "/video-2g64m.mp4";
    if (!make_file(small, small_size, 2) || !make_file(large, size, 3)) {
        fprintf(stderr, "cannot write the videos in %s\n", root.c_str());
        return false;
    }
    World world;
    if (!world.open(root, "past-2gib", false) || !world.start_idle_service())
        return false;
    long peak_small = 0, peak_large = 0;
    auto upload = [&](const std::string &file, int completed, long *peak) {
        return world.record({file}) && world.launch() &&
               wait_all_completed(completed, 900, Clock::now(), world, peak) >= 0;
    };
    bool ok = upload(small, 1, &peak_small) && upload(large, 2, &peak_large);
    double service_s = ok ? last_upload_seconds(world) : -1;
    pid_t server = world.server;
    world.server = -1; // the server stays for curl's turn
    world.close();
    world.server = server;
    RunResult c = curl_upload(world.target, large);
    unlink(small.c_str());
    unlink(large.c_str());
    if (service_s <= 0 || !c.ok) {
        fprintf(stderr, "the upload past 2 GiB failed (service %.2f s, curl %d)\n", service_s,
                c.ok);
        return false;
    }
    const double mib = static_cast<double>(size >> 20), ratio = service_s / c.wall;
    bool time_pass = ratio <= 1.25;
    report("upload past 2 GiB vs curl",
           fmt("%.0f MiB: service %.2f s, curl %.2f s", mib, service_s, c.wall) +
               fmt(": %.2fx", ratio),
           "<= 1.25x", time_pass);
    const double growth = (peak_large - peak_small) / 1024.0;
    bool rss_pass = growth < 4.0;
    report("service peak memory past 2 GiB",
           fmt("%.1f MiB after 64 MiB, %.1f MiB after %.0f MiB", peak_small / 1024.0,
               peak_large / 1024.0, mib),
           "growth < 4 MiB", rss_pass);
    return time_pass && rss_pass;
}

// How many of the files the server holds byte for byte: the metadata document of each stored
// copy names the title "job-N" of files[N - 1].
int identical_copies(const World &world, const std::vector<std::string> &files)
{
    std::map<std::string, std::string> data_of_title;
    glob_t found{};
    if (glob((world.storage + "/*.atom.xml").c_str(), 0, nullptr, &found) == 0) {
        for (size_t i = 0; i < found.gl_pathc; ++i) {
            std::string meta_path = found.gl_pathv[i];
            std::string meta = read_file(meta_path);
            size_t at = meta.find(">job-");
            if (at == std::string::npos)
                continue;
            std::string title = meta.substr(at + 1, meta.find('<', at) - at - 1);
            data_of_title[title] =
                meta_path.substr(0, meta_path.size() - strlen(".atom.xml")) + ".data";
        }
    }
    globfree(&found);
    int identical = 0;
    for (size_t i = 0; i < files.size(); ++i) {
        auto it = data_of_title.find("job-" + std::to_string(i + 1));
        if (it != data_of_title.end() && read_file(it->second) == read_file(files[i]))
            ++identical;
    }
    return identical;
}

bool bench_many_jobs(const std::string &root, int jobs, int job_mib)
{
    World world;
    if (!world.open(root, "many", true))
        return false;
    std::vector<std::string> files;
    for (int i = 0; i < jobs; ++i) {
        files.push_back(world.dir + "/job-" + std::to_string(i + 1) + ".mp4");
        if (!make_file(files.back(), static_cast<long long>(job_mib) << 20, 100 + i))
            return false;
    }
    if (!world.record(files))
        return false;
    long peak = 0;
    auto t0 = Clock::now();
    world.start_service(true);
    double waited = wait_all_completed(jobs, 600, t0, world, &peak);
    double total = seconds_since(t0);
    peak = std::max(peak, world.service_peak_kib());
    world.close();
    int identical = identical_copies(world, files);
    bool pass = waited >= 0 && identical == jobs;
    report("many jobs at once",
           fmt("%.0f x %.0f MiB in %.2f s", jobs, job_mib, total) +
               fmt(", peak %.0f MiB, %.0f byte-identical", peak / 1024.0, identical),
           "all identical", pass);
    return pass;
}

// One history row written straight into the history.
struct BenchRow {
    std::string title;
    std::string file;
    int64_t size;
    int percent;
    int status;
};

// Writes rows 1..count, row(i) giving each, into the history in one transaction (the store
// makes the database as the service expects it first).
bool insert_rows(int count, const std::function<BenchRow(int)> &row)
{
    if (!zv_ext_db_open())
        return false;
    zv_ext_db_close();
    sqlite3 *db = nullptr;
    if (sqlite3_open(getenv("ZV_HISTORY_DB"), &db) != SQLITE_OK)
        return false;
    sqlite3_exec(db, "begin", nullptr, nullptr, nullptr);
    sqlite3_stmt *stmt = nullptr;
    sqlite3_prepare_v2(db,
                       "insert into history (historyid, title, filename, filesize, url, percent, "
                       "status, userid, date) values (?, ?, ?, ?, '', ?, ?, 'bench', ?)",
                       -1, &stmt, nullptr);
    bool ok = stmt != nullptr;
    for (int i = 1; ok && i <= count; ++i) {
        BenchRow r = row(i);
        sqlite3_bind_int(stmt, 1, i);
        sqlite3_bind_text(stmt, 2, r.title.c_str(), -1, SQLITE_TRANSIENT);
        sqlite3_bind_text(stmt, 3, r.file.c_str(), -1, SQLITE_TRANSIENT);
        sqlite3_bind_int64(stmt, 4, r.size);
        sqlite3_bind_int(stmt, 5, r.percent);
        sqlite3_bind_int(stmt, 6, r.status);
        sqlite3_bind_double(stmt, 7, 1.7e9 + i);
        ok = sqlite3_step(stmt) == SQLITE_DONE;
        sqlite3_reset(stmt);
    }
    sqlite3_finalize(stmt);
    ok = sqlite3_exec(db, "commit", nullptr, nullptr, nullptr) == SQLITE_OK && ok;
    sqlite3_close(db);
    return ok;
}

// Records the files as READY rows titled "job-N" straight into the history (the companion
// would make a thumbnail of each, minutes for thousands of files).
bool record_rows(const std::vector<std::string> &files)
{
    return insert_rows(static_cast<int>(files.size()), [&files](int i) {
        struct stat st;
        const std::string &file = files[i - 1];
        int64_t size = stat(file.c_str(), &st) == 0 ? st.st_size : 0;
        return BenchRow{"job-" + std::to_string(i), file, size, 0, 0};
    });
}

// A batch of the history's size on a normal machine's open-file limit: the service alone
// starts under it (soft and hard, so that it cannot raise the soft one), the server without.
bool bench_file_limit(const std::string &root, int jobs, int nofile)
{
    World world;
    if (!world.open(root, "limit", true))
        return false;
    std::vector<std::string> files;
    for (int i = 0; i < jobs; ++i) {
        files.push_back(world.dir + "/job-" + std::to_string(i + 1) + ".mp4");
        if (!make_file(files.back(), 64 << 10, 100 + i))
            return false;
    }
    if (!record_rows(files))
        return false;
    long peak = 0;
    auto t0 = Clock::now();
    world.start_service(true, static_cast<rlim_t>(nofile));
    double waited = wait_all_completed(jobs, 900, t0, world, &peak);
    double total = seconds_since(t0);
    peak = std::max(peak, world.service_peak_kib());
    world.close();
    int identical = identical_copies(world, files);
    bool pass = waited >= 0 && identical == jobs && peak < 256 * 1024;
    report(fmt("%.0f jobs, %.0f open files", jobs, nofile).c_str(),
           waited < 0 ? fmt("%.0f of %.0f completed in %.0f s", status_counts()[kCompleted], jobs,
                            total)
                      : fmt("last done %.2f s after the start, peak %.0f MiB", total,
                            peak / 1024.0) +
                            fmt(", %.0f byte-identical", identical),
           "< 256 MiB, all", pass);
    return pass;
}

bool bench_startup(const std::string &root, int rows)
{
    World world;
    if (!world.open(root, "startup", false))
        return false;
    // One real thumbnail from a short video, linked under a name of its own for every row.
    std::string video = world.dir + "/clip.mkv";
    std::string gst = "gst-launch-1.0 -q videotestsrc num-buffers=5 ! "
                      "video/x-raw,format=I420,width=320,height=240 ! matroskamux ! "
                      "filesink location='" + video + "' >/dev/null 2>&1";
    char *thumb = system(gst.c_str()) == 0 ? media_content_create_thumbnail(video.c_str()) : nullptr;
    if (!thumb)
        printf("  (no thumbnail could be made: the rows have none)\n");

    std::string files_dir = world.dir + "/videos";
    mkdir(files_dir.c_str(), 0700);
    // The rows go in at once, each with its (empty) file and a thumbnail of its own.
    media_content_connect();
    bool ok = insert_rows(rows, [&](int i) {
        std::string file = files_dir + "/VID_" + std::to_string(i) + ".mp4";
        if (FILE *f = fopen(file.c_str(), "wb"))
            fclose(f);
        std::string title = "Video " + std::to_string(i);
        std::string own_thumb;
        if (thumb) {
            own_thumb = files_dir + "/thumb-" + std::to_string(i) + ".png";
            if (link(thumb, own_thumb.c_str()) != 0)
                own_thumb = thumb;
        }
        media_content_register_file(file.c_str(), MEDIA_CONTENT_TYPE_VIDEO,
                                    thumb ? own_thumb.c_str() : nullptr, title.c_str());
        return BenchRow{title, file, 1048576, 100, 4};
    });
    media_content_disconnect();
    free(thumb);
    if (!ok)
        return false;

    // From the start of the process to the log line of the first frame that shows the list.
    std::vector<double> times;
    std::string log = world.dir + "/service.log";
    for (int round = 0; round < 3; ++round) {
        unlink(log.c_str());
        auto t0 = Clock::now();
        world.start_service(false);
        double t = -1;
        while (seconds_since(t0) < 60) {
            if (read_file(log).find("job list drawn: ") != std::string::npos) {
                t = seconds_since(t0);
                break;
            }
            std::this_thread::sleep_for(std::chrono::milliseconds(2));
        }
        pid_t server = world.server;
        world.server = -1; // the same server for every round
        world.close();
        world.server = server;
        if (t < 0) {
            fprintf(stderr, "the list was not drawn (round %d)\n", round);
            return false;
        }
        times.push_back(t);
    }
    double m = median(times);
    bool pass = m < 1.0;
    report("start-up to the drawn list",
           fmt("%.0f rows: median %.3f s (", rows, m) + fmt("%.3f, %.3f, %.3f s)", times[0], times[1], times[2]),
           "< 1 s", pass);
    return pass;
}

} // namespace

int main(int argc, char **argv)
{
    int size_mib = 1024, jobs = 50, job_mib = 20, rows = 5000, limit_jobs = 5000, nofile = 1024;
    char self[4096];
    ssize_t n = readlink("/proc/self/exe", self, sizeof self - 1);
    self[n > 0 ? n : 0] = '\0';
    g_bin = std::string(self).substr(0, std::string(self).rfind('/'));
    for (int i = 1; i < argc; ++i) {
        std::string a = argv[i];
        if (a == "--bin" && i + 1 < argc)
            g_bin = argv[++i];
        else if (a == "--size-mib" && i + 1 < argc)
            size_mib = atoi(argv[++i]);
        else if (a == "--jobs" && i + 1 < argc)
            jobs = atoi(argv[++i]);
        else if (a == "--job-mib" && i + 1 < argc)
            job_mib = atoi(argv[++i]);
        else if (a == "--rows" && i + 1 < argc)
            rows = atoi(argv[++i]);
        else if (a == "--limit-jobs" && i + 1 < argc)
            limit_jobs = atoi(argv[++i]);
        else if (a == "--nofile" && i + 1 < argc)
            nofile = atoi(argv[++i]);
        else if (a == "--no-fail")
            g_no_fail = true;
        else {
            fprintf(stderr, "zv-service-bench: unknown argument %s\n", argv[i]);
            return 2;
        }
    }
    for (const char *var : {"http_proxy", "https_proxy", "HTTP_PROXY", "ALL_PROXY", "all_proxy"})
        unsetenv(var);
    signal(SIGPIPE, SIG_IGN);
    setvbuf(stdout, nullptr, _IOLBF, 0);
    char tmpl[] = "/tmp/zv-service-bench-XXXXXX";
    if (!mkdtemp(tmpl)) {
        perror("mkdtemp");
        return 1;
    }
    std::string root = tmpl;
    printf("programs from %s; %d MiB upload, %d jobs of %d MiB, %d jobs of 64 KiB under %d open "
           "files, %d rows\n",
           g_bin.c_str(), size_mib, jobs, job_mib, limit_jobs, nofile, rows);

    // This process's own log (the engine's) is not the figure; the services log to their worlds.
    setenv("ZV_DLOG_FILE", "/dev/null", 1);
    zv_curl_init_service();
    bool all = bench_large_upload(root, size_mib);
    all &= bench_video_past_2gib(root);
    zv_curl_finalize_service();
    all &= bench_many_jobs(root, jobs, job_mib);
    all &= bench_file_limit(root, limit_jobs, nofile);
    all &= bench_startup(root, rows);

    if (getenv("ZV_BENCH_KEEP")) {
        printf("kept %s\n", root.c_str());
    } else {
        std::string rm = "rm -rf '" + root + "'";
        if (system(rm.c_str()) != 0)
            fprintf(stderr, "could not remove %s\n", root.c_str());
    }
    return finish(all);
}
