// Helpers of the end-to-end tests: child processes, the development server with its admin
// endpoints and request log, and the programs of the build that record jobs and set keys.
#pragma once

#include <Ecore.h>

#include <errno.h>

#include <ctype.h>
#include <curl/curl.h>
#include <signal.h>
#include <stdlib.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <fstream>
#include <random>
#include <sstream>
#include <map>
#include <string>
#include <utility>
#include <vector>

#include "zv-test-util.h"

namespace zv_e2e
{

using Env = std::vector<std::pair<std::string, std::string>>;

// The exit statuses of the children that the toolkit's main loop reaped (it reaps every
// child of the process while it iterates), by pid, so that no exit status is lost.
inline std::map<pid_t, int> &reaped_by_loop()
{
    static std::map<pid_t, int> statuses;
    static Ecore_Event_Handler *handler = ecore_event_handler_add(
        ECORE_EXE_EVENT_DEL,
        [](void *, int, void *event) -> Eina_Bool {
            auto *del = static_cast<Ecore_Exe_Event_Del *>(event);
            statuses[del->pid] = del->signalled ? (del->exit_signal & 0x7f)
                                                : ((del->exit_code & 0xff) << 8);
            return ECORE_CALLBACK_PASS_ON;
        },
        nullptr);
    (void)handler;
    return statuses;
}

// A child process whose standard output and error go to a file, under an open-file limit (soft
// and hard) when nofile is above 0; killed at destruction when it still runs.
class Child
{
  public:
    Child() = default;
    Child(const Child &) = delete;
    Child &operator=(const Child &) = delete;
    ~Child()
    {
        if (running()) {
            kill(pid_, SIGKILL);
            waitpid(pid_, nullptr, 0);
        }
    }

    bool start(const std::vector<std::string> &argv, const std::string &out_path,
               const Env &env = {}, rlim_t nofile = 0)
    {
        reaped_by_loop();
        killed_ = false;
        pid_ = fork();
        if (pid_ < 0)
            return false;
        if (pid_ == 0) {
            FILE *out = fopen(out_path.c_str(), "a");
            if (out) {
                dup2(fileno(out), 1);
                dup2(fileno(out), 2);
            }
            for (const auto &kv : env)
                setenv(kv.first.c_str(), kv.second.c_str(), 1);
            rlimit limit = {nofile, nofile};
            if (nofile > 0 && setrlimit(RLIMIT_NOFILE, &limit) != 0)
                _exit(126);
            std::vector<char *> args;
            for (const auto &a : argv)
                args.push_back(const_cast<char *>(a.c_str()));
            args.push_back(nullptr);
            execv(args[0], args.data());
            _exit(127);
        }
        exited_ = false;
        return true;
    }

    pid_t pid() const { return pid_; }
    bool running()
    {
        if (pid_ <= 0 || exited_)
            return false;
        int status = 0;
        pid_t got = waitpid(pid_, &status, WNOHANG);
        if (got == pid_) {
            exited_ = true;
            status_ = status;
            return false;
        }
        // The toolkit's main loop reaped it: its status comes with the loop's event.
        if (got < 0 && errno == ECHILD) {
            auto it = reaped_by_loop().find(pid_);
            if (it == reaped_by_loop().end())
                return true; // the event is still on its way
            exited_ = true;
            status_ = it->second;
            return false;
        }
        return true;
    }
    void signal(int sig)
    {
        if (running()) {
            kill(pid_, sig);
            killed_ = killed_ || sig == SIGKILL;
        }
    }
    // Exited with status 0, or was killed by this side with SIGKILL.
    bool ended_well() const
    {
        return exited_ && ((WIFEXITED(status_) && WEXITSTATUS(status_) == 0) ||
                           (killed_ && WIFSIGNALED(status_) && WTERMSIG(status_) == SIGKILL));
    }
    int raw_status() const { return status_; }
    // Waits for the exit; true when it exited within timeout_ms. *status: the raw status.
    bool wait_exit(int timeout_ms, int *status = nullptr)
    {
        bool done = zv_test::wait_for([this] { return !running(); }, timeout_ms);
        if (done && status)
            *status = status_;
        return done;
    }

  private:
    pid_t pid_ = -1;
    bool exited_ = true;
    bool killed_ = false;
    int status_ = 0;
};

// The first sanitizer report in a program's output, or "" when there is none.
inline std::string sanitizer_report(const std::string &output)
{
    for (const char *marker : {"ERROR: AddressSanitizer", "ERROR: LeakSanitizer",
                               "WARNING: ThreadSanitizer", "runtime error:"}) {
        size_t at = output.find(marker);
        if (at != std::string::npos)
            return output.substr(at, 4000);
    }
    return "";
}

inline size_t collect(char *data, size_t size, size_t n, void *userp)
{
    static_cast<std::string *>(userp)->append(data, size * n);
    return size * n;
}

// One HTTP request to 127.0.0.1; the body of the answer, and its status in *code.
inline std::string http(const std::string &method, const std::string &url, long *code = nullptr)
{
    std::string body;
    CURL *curl = curl_easy_init();
    if (!curl)
        return body;
    curl_easy_setopt(curl, CURLOPT_URL, url.c_str());
    curl_easy_setopt(curl, CURLOPT_CUSTOMREQUEST, method.c_str());
    curl_easy_setopt(curl, CURLOPT_WRITEFUNCTION, collect);
    curl_easy_setopt(curl, CURLOPT_WRITEDATA, &body);
    curl_easy_setopt(curl, CURLOPT_TIMEOUT, 10L);
    curl_easy_setopt(curl, CURLOPT_NOPROXY, "*");
    if (method == "POST")
        curl_easy_setopt(curl, CURLOPT_POSTFIELDS, "");
    long status = 0;
    if (curl_easy_perform(curl) == CURLE_OK)
        curl_easy_getinfo(curl, CURLINFO_RESPONSE_CODE, &status);
    curl_easy_cleanup(curl);
    if (code)
        *code = status;
    return body;
}

// The text after the first `key` in text, up to the next double quote; empty when absent.
inline std::string text_after(const std::string &text, const std::string &key)
{
    size_t at = text.find(key);
    if (at == std::string::npos)
        return std::string();
    at += key.size();
    size_t end = text.find('"', at);
    return text.substr(at, end == std::string::npos ? std::string::npos : end - at);
}

// The member `name` of a flat JSON object: a string, or a number (-1 when absent).
inline std::string json_string(const std::string &object, const std::string &name)
{
    return text_after(object, "\"" + name + "\":\"");
}
inline long long json_number(const std::string &object, const std::string &name)
{
    std::string key = "\"" + name + "\":";
    size_t at = object.find(key);
    if (at == std::string::npos)
        return -1;
    return atoll(object.c_str() + at + key.size());
}

// The flat objects of a JSON array.
inline std::vector<std::string> json_objects(const std::string &array)
{
    std::vector<std::string> list;
    size_t at = 0;
    while ((at = array.find('{', at)) != std::string::npos) {
        size_t end = array.find('}', at);
        if (end == std::string::npos)
            break;
        list.push_back(array.substr(at, end - at + 1));
        at = end + 1;
    }
    return list;
}

// An upload as the server holds it.
struct Upload {
    std::string id, url, path;
    long long total = -1, held = -1;
    bool complete = false;
};

// A line of the server's request log.
struct LoggedRequest {
    long long seq = 0;
    std::string kind, upload_id, outcome, content_range;
    int status = 0;
    long long body_length = 0;
    // First byte index of a data upload's Content-Range, -1 for none or "*/*".
    long long range_start() const
    {
        const std::string prefix = "bytes ";
        if (content_range.compare(0, prefix.size(), prefix) != 0 ||
            content_range.size() <= prefix.size() || !isdigit(content_range[prefix.size()]))
            return -1;
        return atoll(content_range.c_str() + prefix.size());
    }
};

class DevServer
{
  public:
    bool start(const std::string &dir, const std::vector<std::string> &args = {})
    {
        dir_ = dir;
        std::vector<std::string> argv = {zv_test::bin_path("zuvo-devserver"), "--storage",
                                         dir + "/store", "--log", log_path()};
        argv.insert(argv.end(), args.begin(), args.end());
        std::string out = dir + "/devserver.out";
        if (!child_.start(argv, out))
            return false;
        zv_test::wait_for(
            [&] { return zv_test::read_file(out).find("port ") != std::string::npos; }, 10000);
        std::string text = zv_test::read_file(out);
        size_t at = text.find("port ");
        port_ = at == std::string::npos ? 0 : atoi(text.c_str() + at + 5);
        return port_ > 0;
    }
    ~DevServer()
    {
        child_.signal(SIGTERM);
        if (!child_.wait_exit(5000))
            child_.signal(SIGKILL);
    }

    std::string host() const { return "127.0.0.1:" + std::to_string(port_); }
    // The service's endpoints, for the environment of the service.
    Env env() const
    {
        return {{"ZV_UPLOAD_HOST", host()},
                {"ZV_DATA_HOST", host()},
                {"ZV_ACCOUNT_HOST", host()},
                {"ZV_TOKEN_HOST", host()}};
    }
    std::string log_path() const { return dir_ + "/requests.log"; }

    bool add_fault(const std::string &query)
    {
        long code = 0;
        http("POST", "http://" + host() + "/_admin/fault?" + query, &code);
        return code == 201;
    }
    bool clear_faults()
    {
        long code = 0;
        http("DELETE", "http://" + host() + "/_admin/faults", &code);
        return code == 200 || code == 204;
    }

    // How many requests the rules with this action acted on.
    long long fired(const std::string &action) const
    {
        long long total = 0;
        for (const std::string &o :
             json_objects(http("GET", "http://" + host() + "/_admin/faults")))
            if (json_string(o, "action") == action)
                total += json_number(o, "fired");
        return total;
    }

    std::vector<Upload> uploads() const
    {
        std::vector<Upload> list;
        for (const std::string &o :
             json_objects(http("GET", "http://" + host() + "/_admin/uploads"))) {
            Upload u;
            u.id = json_string(o, "id");
            u.url = json_string(o, "url");
            u.path = json_string(o, "path");
            u.total = json_number(o, "total");
            u.held = json_number(o, "held");
            u.complete = o.find("\"complete\":true") != std::string::npos;
            list.push_back(u);
        }
        return list;
    }
    Upload upload_of_url(const std::string &url) const
    {
        for (const Upload &u : uploads())
            if (!url.empty() && u.url == url)
                return u;
        return Upload();
    }

    std::vector<LoggedRequest> requests() const
    {
        std::vector<LoggedRequest> list;
        std::istringstream in(zv_test::read_file(log_path()));
        std::string line;
        while (std::getline(in, line)) {
            LoggedRequest r;
            r.seq = json_number(line, "seq");
            r.kind = json_string(line, "kind");
            r.upload_id = json_string(line, "upload_id");
            r.outcome = json_string(line, "outcome");
            r.content_range = text_after(line, "[\"Content-Range\",\"");
            r.status = (int)json_number(line, "status");
            r.body_length = json_number(line, "body_length");
            list.push_back(r);
        }
        return list;
    }
    // The requests of one upload, in the order the server logged them.
    std::vector<LoggedRequest> requests_of(const std::string &upload_id) const
    {
        std::vector<LoggedRequest> list;
        for (const LoggedRequest &r : requests())
            if (r.upload_id == upload_id)
                list.push_back(r);
        return list;
    }

  private:
    Child child_;
    std::string dir_;
    int port_ = 0;
};

// A file of random bytes.
inline std::string make_video(const std::string &path, size_t bytes, unsigned seed)
{
    std::mt19937 gen(seed);
    std::string data(bytes, '\0');
    for (char &c : data)
        c = static_cast<char>(gen());
    zv_test::write_file(path, data);
    return data;
}

// Records the files with the companion client; their history ids in order, empty on failure.
inline std::vector<int> record(const std::vector<std::string> &files, const std::string &title)
{
    std::vector<std::string> argv = {zv_test::bin_path("zuvo-client"), "add"};
    // Under ThreadSanitizer the companion has suppressions of its own (its media libraries).
    if (const char *opts = getenv("ZV_COMPANION_TSAN_OPTIONS"))
        argv.insert(argv.begin(), {"/usr/bin/env", std::string("TSAN_OPTIONS=") + opts});
    argv.insert(argv.end(), files.begin(), files.end());
    argv.push_back("--title");
    argv.push_back(title);
    std::string out;
    std::vector<int> ids;
    if (zv_test::run_program(argv, "", &out) != 0)
        return ids;
    std::istringstream in(out);
    std::string line;
    while (std::getline(in, line))
        ids.push_back(atoi(line.c_str()));
    return ids;
}

inline bool set_int_key(const std::string &key, int value)
{
    return zv_test::run_program({zv_test::bin_path("zv-vconf"), "set", "-t", "int", key,
                                 std::to_string(value)}) == 0;
}

inline bool set_api_key(const std::string &value)
{
    return zv_test::run_program({zv_test::bin_path("zv-keystore"), "set", "zuvo.tizen.api.key"},
                                value) == 0;
}

// The network keys of a working Wi-Fi connection (or none).
inline bool set_network(bool up)
{
    return set_int_key("memory/dnet/status", up ? 2 : 0) &&
           set_int_key("memory/dnet/network_config", up ? 1 : 0) &&
           zv_test::run_program({zv_test::bin_path("zv-vconf"), "set", "-t", "string",
                                 "memory/dnet/ip", "127.0.0.1"}) == 0 &&
           zv_test::run_program({zv_test::bin_path("zv-vconf"), "set", "-t", "string",
                                 "memory/dnet/proxy", ""}) == 0;
}

} // namespace zv_e2e
