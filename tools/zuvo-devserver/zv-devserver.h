// The development server: configuration, the record of one request as it passes through, the
// resumable uploads it holds, and the server that ties them to libmicrohttpd.
//
// Threads: libmicrohttpd runs one thread per connection; every callback of a request runs on
// its connection's thread. Shared state (uploads, fault rules, the request log, counters) is
// guarded by its own mutex; an upload's bytes are written under the upload's mutex.
#pragma once

#include <atomic>
#include <condition_variable>
#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "zv-devserver-faults.h"
#include "zv-devserver-text.h"

struct MHD_Connection;
struct MHD_Daemon;

namespace zv_devserver {

struct Config {
    int port = 0;
    std::string storage;
    std::vector<std::string> tokens;              // accepted bearer tokens; empty: any
    std::optional<std::string> api_key;           // accepted API key; none: any
    std::optional<std::string> user, password;    // accepted login; none: any
    std::optional<std::string> client_id, client_secret;
    std::vector<std::string> refresh_tokens;      // accepted refresh tokens; empty: any
    std::string issued_token = "zv-dev-access-token";
    std::string log_path;
    bool discard_data = false;                    // count data bytes without storing them
    std::vector<Fields> faults;
    std::optional<int> tls_port;
    std::string tls_cert_pem, tls_key_pem;
};

struct Header {
    std::string name, value;
};

struct Answer {
    int status = 500;
    std::vector<Header> headers;
    std::string body;
};

// One resumable upload. Its data file holds exactly `held` bytes (nothing with --discard-data).
struct Upload {
    std::string id, url, data_path, meta_path, slug;
    std::mutex mutex;
    int64_t total = -1;       // from the first accepted Content-Range, -1 while unknown
    uint64_t held = 0;
    bool complete = false;
    uint64_t generation = 0;  // raised by each accepted data PUT and each status query
};

enum class Sink { Memory, Discard, Upload };

// One request from its request line to its end.
struct Exchange {
    ~Exchange();

    uint64_t seq = 0;
    bool tls = false;
    std::string scheme_host;     // "http://host:port" as the client addressed us
    std::string host;            // host[:port]
    std::string remote;
    bool loopback = true;
    std::string method, target, path, query, version;
    std::vector<Header> headers;
    Kind kind = Kind::Other;
    FaultEffects faults;
    bool started = false;
    bool expect_continue = false;
    bool has_length = false;
    uint64_t content_length = 0;
    bool chunked = false;
    bool body_done = false;      // the access handler saw the end of the body

    // Body accounting.
    uint64_t received = 0;
    std::unique_ptr<Sha256> digest;
    std::string log_body;        // the first bytes of the body, for the log
    bool log_body_whole = true;
    Sink sink = Sink::Memory;
    std::string body;            // Memory sink
    bool body_too_large = false;
    double body_start = 0;       // monotonic seconds when the body began

    // Data PUT into an upload.
    std::shared_ptr<Upload> upload;
    std::string upload_id;
    uint64_t generation = 0;
    int fd = -1;
    bool whole_body = false;     // PUT without Content-Range: the body is the whole file
    uint64_t expected = 0;       // bytes the range announces
    uint64_t written = 0;
    bool overflow = false;

    std::optional<Answer> answer; // decided before the body was read
    int status = 0;
    std::string outcome;
    bool logged = false;
};

class Server {
public:
    explicit Server(Config config);
    ~Server();
    Server(const Server &) = delete;
    Server &operator=(const Server &) = delete;

    // Binds 127.0.0.1 and starts serving; false with *error when it cannot.
    bool start(std::string *error);
    // Wakes stalled and throttled requests and stops every listener; idempotent.
    void stop();
    int port() const { return port_; }
    int tls_port() const { return tls_port_; }

    // libmicrohttpd entry points (public for the C callbacks).
    Exchange *on_request_line(const char *uri, bool tls);
    int on_access(MHD_Connection *conn, Exchange *ex, const char *method, const char *version,
                  const char *data, size_t *size);
    void on_completed(Exchange *ex, int toe);

private:
    // zv-devserver-http.cpp: request lifecycle, faults, log.
    void begin(MHD_Connection *conn, Exchange *ex);
    bool consume(MHD_Connection *conn, Exchange *ex, const char *data, size_t size);
    int respond(MHD_Connection *conn, Exchange *ex, Answer answer);
    bool send_raw(MHD_Connection *conn, const Answer &answer, int64_t header_bytes);
    bool pause_for(double seconds);
    void write_log(Exchange *ex);

    // zv-devserver-routes.cpp: what the service answers.
    void classify(Exchange *ex);
    void route_begin(Exchange *ex);
    bool route_consume(Exchange *ex, const char *data, size_t size);
    Answer route_finish(Exchange *ex);
    void route_end(Exchange *ex);
    Answer finish_meta(Exchange *ex);
    void begin_data(Exchange *ex);
    Answer finish_data(Exchange *ex);
    Answer finish_status(Exchange *ex);
    Answer finish_login(Exchange *ex);
    Answer finish_token(Exchange *ex);
    Answer finish_admin(Exchange *ex);
    std::shared_ptr<Upload> find_upload(const std::string &id);
    std::string upload_json(Upload &upload);

    Config config_;
    // What the listeners' callbacks receive: the server and whether the listener is https.
    std::pair<Server *, bool> plain_pair_{this, false};
    std::pair<Server *, bool> secure_pair_{this, true};
    FaultTable faults_;
    MHD_Daemon *daemon_ = nullptr;
    MHD_Daemon *tls_daemon_ = nullptr;
    std::atomic<int> port_{0};
    std::atomic<int> tls_port_{0};

    std::mutex stop_mutex_;
    std::condition_variable stop_cv_;
    bool stopping_ = false;

    std::atomic<uint64_t> next_seq_{1};
    std::mutex log_mutex_;
    FILE *log_ = nullptr;

    std::mutex uploads_mutex_;
    std::map<std::string, std::shared_ptr<Upload>> uploads_;
    std::vector<std::string> upload_order_;
};

// Monotonic seconds.
double now_seconds();

} // namespace zv_devserver
