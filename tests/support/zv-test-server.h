// zuvo-devserver for the tests (and the benchmarks' server launcher): starting it, its request
// log, its admin endpoints, and one HTTP client to speak to it. Needs no gtest.
#pragma once

#include <sys/types.h>

#include <optional>
#include <string>
#include <vector>

#include "zv-test-util.h"

namespace zv_test {

using Headers = std::vector<std::pair<std::string, std::string>>;

// One HTTP exchange (no proxy, 60 s at most); a POST, a PUT or a request with a body sends
// body with its Content-Length. Response headers as received.
struct Reply {
    long status = 0;
    std::string headers, body;
    // The value of the first header line "name: value" (exact case), "" when absent.
    std::string header(const std::string &name) const;
};
Reply http(const std::string &method, const std::string &url,
           const std::vector<std::string> &headers = {}, const std::string &body = "");

// One line of the server's request log.
struct Logged {
    explicit Logged(const std::string &line);
    std::string line;
    Headers headers;
    std::string kind, upload_id;
    long long seq, status, body_length;

    std::string get(const std::string &key) const; // a member of the line, "" when absent
    std::string body() const; // decoded from body_base64
    std::optional<std::string> header(const std::string &name) const;
    // The first byte of the Content-Range, -1 for none or "bytes */*".
    long long range_start() const;
};

// An upload as the server holds it.
struct Upload {
    std::string id, url, path;
    long long total = -1, held = -1;
    bool complete = false;
};

// Starts argv with its standard output on a pipe and reads the port from the end of its first
// line, and with tls_port the second port from its second line (at most 20 s); the pid or -1.
pid_t spawn_server(const std::vector<std::string> &argv, int *port, int *tls_port = nullptr);

// zuvo-devserver on 127.0.0.1 with its storage and request log in dir; stopped at destruction.
class DevServer {
public:
    DevServer() = default;
    DevServer(const DevServer &) = delete;
    DevServer &operator=(const DevServer &) = delete;
    ~DevServer() { stop(); }
    // Arguments as the program takes them; "--tls-port" among them also reads the https port.
    bool start(const std::string &dir, const std::vector<std::string> &args = {});
    // SIGTERM, then its exit status (-1 when it did not exit normally or never ran).
    int stop();

    int port() const { return port_; }
    std::string host() const { return "127.0.0.1:" + std::to_string(port_); }
    std::string tls_host() const { return "127.0.0.1:" + std::to_string(tls_port_); }
    std::string url(const std::string &path) const { return "http://" + host() + path; }
    // ZV_UPLOAD_HOST, ZV_DATA_HOST, ZV_ACCOUNT_HOST and ZV_TOKEN_HOST naming this server.
    Env env() const
    {
        return {{"ZV_UPLOAD_HOST", host()}, {"ZV_DATA_HOST", host()}, {"ZV_ACCOUNT_HOST", host()},
                {"ZV_TOKEN_HOST", host()}};
    }
    std::string log_path() const { return dir_ + "/requests.log"; }
    std::string stored(const std::string &upload_id) const
    {
        return read_file(dir_ + "/store/" + upload_id + ".data");
    }

    std::vector<Logged> requests() const;
    std::vector<Logged> requests_of(const std::string &upload_id) const;

    bool add_fault(const std::string &query) const
    {
        return http("POST", url("/_admin/fault?" + query)).status == 201;
    }
    bool clear_faults() const { return http("DELETE", url("/_admin/faults")).status == 200; }
    // How many requests the rules with this action acted on.
    long long fired(const std::string &action) const;
    Upload upload_of_url(const std::string &url) const;

private:
    std::string dir_;
    pid_t pid_ = -1;
    int port_ = 0, tls_port_ = 0;
};

} // namespace zv_test
