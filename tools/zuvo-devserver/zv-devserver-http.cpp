// The development server's HTTP front: libmicrohttpd listeners, the life of one request
// (headers, body, answer, end), the fault effects that act on the wire, and the request log.
#include "zv-devserver.h"

#include <arpa/inet.h>
#include <fcntl.h>
#include <microhttpd.h>
#include <netinet/in.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <cstring>
#include <ctime>

namespace zv_devserver {

namespace {

// Bodies smaller than this are copied into the request log.
constexpr size_t kLogBodyLimit = 64 * 1024;
// Per-connection memory of libmicrohttpd: its read buffer is about half of it, which sets how
// much of a body one read hands over.
constexpr size_t kConnectionMemory = 2 * 1024 * 1024;

void *request_line_cb(void *cls, const char *uri, MHD_Connection *)
{
    auto *listener = static_cast<std::pair<Server *, bool> *>(cls);
    return listener->first->on_request_line(uri, listener->second);
}

MHD_Result access_cb(void *cls, MHD_Connection *conn, const char *, const char *method, const char *version,
                     const char *data, size_t *size, void **con_cls)
{
    auto *listener = static_cast<std::pair<Server *, bool> *>(cls);
    int r = listener->first->on_access(conn, static_cast<Exchange *>(*con_cls), method, version, data, size);
    return r ? MHD_YES : MHD_NO;
}

void completed_cb(void *cls, MHD_Connection *, void **con_cls, MHD_RequestTerminationCode toe)
{
    auto *listener = static_cast<std::pair<Server *, bool> *>(cls);
    listener->first->on_completed(static_cast<Exchange *>(*con_cls), static_cast<int>(toe));
    *con_cls = nullptr;
}

MHD_Result collect_header(void *cls, MHD_ValueKind, const char *key, const char *value)
{
    static_cast<std::vector<Header> *>(cls)->push_back({key ? key : "", value ? value : ""});
    return MHD_YES;
}

const std::string *find_header(const Exchange &ex, const char *name)
{
    for (const auto &h : ex.headers)
        if (iequals(h.name, name))
            return &h.value;
    return nullptr;
}

std::string remote_text(const sockaddr *sa, bool *loopback)
{
    char buf[INET6_ADDRSTRLEN] = "";
    *loopback = false;
    if (!sa)
        return "";
    if (sa->sa_family == AF_INET) {
        auto *in = reinterpret_cast<const sockaddr_in *>(sa);
        inet_ntop(AF_INET, &in->sin_addr, buf, sizeof buf);
        *loopback = (ntohl(in->sin_addr.s_addr) >> 24) == 127;
        return std::string(buf) + ":" + std::to_string(ntohs(in->sin_port));
    }
    if (sa->sa_family == AF_INET6) {
        auto *in6 = reinterpret_cast<const sockaddr_in6 *>(sa);
        inet_ntop(AF_INET6, &in6->sin6_addr, buf, sizeof buf);
        *loopback = IN6_IS_ADDR_LOOPBACK(&in6->sin6_addr);
        return "[" + std::string(buf) + "]:" + std::to_string(ntohs(in6->sin6_port));
    }
    return "";
}

const char *reason_phrase(int status)
{
    switch (status) {
    case 200: return "OK";
    case 201: return "Created";
    case 308: return "Permanent Redirect";
    case 400: return "Bad Request";
    case 401: return "Unauthorized";
    case 403: return "Forbidden";
    case 404: return "Not Found";
    case 405: return "Method Not Allowed";
    case 409: return "Conflict";
    case 413: return "Payload Too Large";
    case 416: return "Range Not Satisfiable";
    case 500: return "Internal Server Error";
    case 503: return "Service Unavailable";
    default: return "Status";
    }
}

int connection_fd(MHD_Connection *conn)
{
    const MHD_ConnectionInfo *info = MHD_get_connection_info(conn, MHD_CONNECTION_INFO_CONNECTION_FD);
    return info ? info->connect_fd : -1;
}

double wall_seconds()
{
    timespec ts;
    clock_gettime(CLOCK_REALTIME, &ts);
    return static_cast<double>(ts.tv_sec) + static_cast<double>(ts.tv_nsec) / 1e9;
}

MHD_Daemon *start_daemon(int port, bool tls, const Config &config, void *listener, int *bound, std::string *error)
{
    sockaddr_in addr{};
    addr.sin_family = AF_INET;
    addr.sin_port = htons(static_cast<uint16_t>(port));
    addr.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    unsigned flags = MHD_USE_INTERNAL_POLLING_THREAD | MHD_USE_THREAD_PER_CONNECTION | MHD_USE_POLL | MHD_USE_ITC;
    if (tls)
        flags |= MHD_USE_TLS;
    MHD_OptionItem tls_options[] = {
        {MHD_OPTION_HTTPS_MEM_KEY, 0, const_cast<char *>(config.tls_key_pem.c_str())},
        {MHD_OPTION_HTTPS_MEM_CERT, 0, const_cast<char *>(config.tls_cert_pem.c_str())},
        {MHD_OPTION_END, 0, nullptr},
    };
    MHD_OptionItem no_options[] = {{MHD_OPTION_END, 0, nullptr}};
    MHD_Daemon *d = MHD_start_daemon(
        flags, 0, nullptr, nullptr, access_cb, listener, MHD_OPTION_SOCK_ADDR, &addr, MHD_OPTION_URI_LOG_CALLBACK,
        request_line_cb, listener, MHD_OPTION_NOTIFY_COMPLETED, completed_cb, listener,
        MHD_OPTION_CONNECTION_MEMORY_LIMIT, kConnectionMemory, MHD_OPTION_LISTENING_ADDRESS_REUSE,
        static_cast<unsigned>(port != 0), MHD_OPTION_ARRAY, tls ? tls_options : no_options, MHD_OPTION_END);
    if (!d) {
        *error = std::string("cannot listen on 127.0.0.1:") + std::to_string(port) + (tls ? " (https)" : "");
        return nullptr;
    }
    const MHD_DaemonInfo *info = MHD_get_daemon_info(d, MHD_DAEMON_INFO_BIND_PORT);
    *bound = info ? info->port : port;
    return d;
}

bool make_dirs(const std::string &path)
{
    std::string cur;
    size_t pos = 0;
    while (pos != std::string::npos) {
        pos = path.find('/', pos + 1);
        cur = path.substr(0, pos);
        if (cur.empty())
            continue;
        if (mkdir(cur.c_str(), 0755) != 0 && errno != EEXIST)
            return false;
    }
    struct stat st;
    return stat(path.c_str(), &st) == 0 && S_ISDIR(st.st_mode);
}

} // namespace

double now_seconds()
{
    return std::chrono::duration<double>(std::chrono::steady_clock::now().time_since_epoch()).count();
}

Exchange::~Exchange()
{
    if (fd >= 0)
        close(fd);
}

Server::Server(Config config) : config_(std::move(config)) {}

Server::~Server()
{
    stop();
}

bool Server::start(std::string *error)
{
    if (!make_dirs(config_.storage)) {
        *error = "cannot create the storage folder " + config_.storage + ": " + strerror(errno);
        return false;
    }
    if (char *abs = realpath(config_.storage.c_str(), nullptr)) {
        config_.storage = abs;
        free(abs);
    }
    for (const auto &f : config_.faults) {
        std::string why;
        if (faults_.add(f, &why) < 0) {
            *error = why;
            return false;
        }
    }
    if (!config_.log_path.empty()) {
        log_ = fopen(config_.log_path.c_str(), "ae");
        if (!log_) {
            *error = "cannot open the log " + config_.log_path + ": " + strerror(errno);
            return false;
        }
    }
    if (config_.tls_port && !MHD_is_feature_supported(MHD_FEATURE_TLS)) {
        *error = "this libmicrohttpd has no TLS support";
        return false;
    }
    int bound = 0;
    daemon_ = start_daemon(config_.port, false, config_, &plain_pair_, &bound, error);
    if (!daemon_)
        return false;
    port_ = bound;
    if (config_.tls_port) {
        tls_daemon_ = start_daemon(*config_.tls_port, true, config_, &secure_pair_, &bound, error);
        tls_port_ = bound;
        if (!tls_daemon_) {
            MHD_stop_daemon(daemon_);
            daemon_ = nullptr;
            return false;
        }
    }
    return true;
}

void Server::stop()
{
    {
        std::lock_guard<std::mutex> lock(stop_mutex_);
        stopping_ = true;
    }
    stop_cv_.notify_all();
    if (tls_daemon_)
        MHD_stop_daemon(tls_daemon_);
    if (daemon_)
        MHD_stop_daemon(daemon_);
    tls_daemon_ = daemon_ = nullptr;
    std::lock_guard<std::mutex> lock(log_mutex_);
    if (log_)
        fclose(log_);
    log_ = nullptr;
}

bool Server::pause_for(double seconds)
{
    std::unique_lock<std::mutex> lock(stop_mutex_);
    return !stop_cv_.wait_for(lock, std::chrono::duration<double>(seconds), [this] { return stopping_; });
}

Exchange *Server::on_request_line(const char *uri, bool tls)
{
    auto *ex = new Exchange;
    ex->seq = next_seq_++;
    ex->tls = tls;
    ex->target = uri ? uri : "";
    size_t q = ex->target.find('?');
    ex->path = ex->target.substr(0, q);
    if (q != std::string::npos)
        ex->query = ex->target.substr(q + 1);
    return ex;
}

int Server::on_access(MHD_Connection *conn, Exchange *ex, const char *method, const char *version,
                      const char *data, size_t *size)
{
    if (!ex)
        return 0;
    if (!ex->started) {
        ex->started = true;
        ex->method = method ? method : "";
        ex->version = version ? version : "";
        begin(conn, ex);
        if (ex->faults.cut_at == 0) {
            ex->outcome = "cut";
            return 0;
        }
        bool body_expected = ex->chunked || (ex->has_length && ex->content_length > 0);
        if (!body_expected)
            ex->body_done = true;
        if (ex->answer && (!body_expected || ex->expect_continue))
            return respond(conn, ex, *ex->answer);
        return 1;
    }
    if (*size > 0) {
        bool ok = consume(conn, ex, data, *size);
        *size = 0;
        return ok ? 1 : 0;
    }
    ex->body_done = true;
    return respond(conn, ex, ex->answer ? *ex->answer : route_finish(ex));
}

void Server::on_completed(Exchange *ex, int toe)
{
    if (!ex)
        return;
    if (!ex->logged) {
        if (ex->outcome.empty()) {
            switch (toe) {
            case MHD_REQUEST_TERMINATED_COMPLETED_OK: ex->outcome = "answered"; break;
            case MHD_REQUEST_TERMINATED_TIMEOUT_REACHED: ex->outcome = "timeout"; break;
            case MHD_REQUEST_TERMINATED_DAEMON_SHUTDOWN: ex->outcome = "shutdown"; break;
            case MHD_REQUEST_TERMINATED_READ_ERROR:
            case MHD_REQUEST_TERMINATED_CLIENT_ABORT: ex->outcome = "client-closed"; break;
            default: ex->outcome = "error"; break;
            }
        }
        write_log(ex);
    }
    route_end(ex);
    delete ex;
}

void Server::begin(MHD_Connection *conn, Exchange *ex)
{
    MHD_get_connection_values(conn, MHD_HEADER_KIND, collect_header, &ex->headers);
    const MHD_ConnectionInfo *info = MHD_get_connection_info(conn, MHD_CONNECTION_INFO_CLIENT_ADDRESS);
    ex->remote = remote_text(info ? info->client_addr : nullptr, &ex->loopback);
    const std::string *host = find_header(*ex, "Host");
    ex->host = host && !host->empty() ? *host : "127.0.0.1:" + std::to_string(ex->tls ? tls_port_ : port_);
    ex->scheme_host = std::string(ex->tls ? "https://" : "http://") + ex->host;
    if (const std::string *expect = find_header(*ex, "Expect"))
        ex->expect_continue = iequals(*expect, "100-continue");
    if (const std::string *te = find_header(*ex, "Transfer-Encoding"))
        ex->chunked = te->find("chunked") != std::string::npos;
    if (const std::string *cl = find_header(*ex, "Content-Length")) {
        char *end = nullptr;
        unsigned long long v = strtoull(cl->c_str(), &end, 10);
        if (end != cl->c_str() && *end == '\0') {
            ex->has_length = true;
            ex->content_length = v;
        }
    }
    classify(ex);
    ex->faults = faults_.take(ex->kind);
    if (log_)
        ex->digest = std::make_unique<Sha256>();
    ex->body_start = now_seconds();
    if (ex->faults.rate > 0) {
        // A small receive buffer keeps the client's sending in step with the paced reads.
        int fd = connection_fd(conn);
        int buf = static_cast<int>(std::min(std::max(ex->faults.rate / 4, 4096.0), 262144.0));
        if (fd >= 0)
            setsockopt(fd, SOL_SOCKET, SO_RCVBUF, &buf, sizeof buf);
    }
    if (ex->faults.status) {
        Answer a;
        a.status = ex->faults.status;
        a.headers.push_back({"Content-Type", "text/plain; charset=utf-8"});
        a.body = ex->faults.has_status_body ? ex->faults.status_body
                                            : "injected fault: status " + std::to_string(a.status) + "\n";
        ex->answer = a;
        ex->sink = Sink::Discard;
        return;
    }
    route_begin(ex);
}

bool Server::consume(MHD_Connection *, Exchange *ex, const char *data, size_t size)
{
    bool cut = false;
    if (ex->faults.cut_at >= 0 && ex->received + size > static_cast<uint64_t>(ex->faults.cut_at)) {
        size = static_cast<size_t>(static_cast<uint64_t>(ex->faults.cut_at) - ex->received);
        cut = true;
    }
    if (ex->digest)
        ex->digest->update(data, size);
    if (ex->log_body_whole) {
        if (ex->log_body.size() + size < kLogBodyLimit) {
            ex->log_body.append(data, size);
        } else {
            ex->log_body_whole = false;
            ex->log_body.clear();
        }
    }
    ex->received += size;
    if (!route_consume(ex, data, size))
        return false;
    if (cut) {
        ex->outcome = "cut";
        return false;
    }
    if (ex->faults.rate > 0) {
        double wait = ex->body_start + static_cast<double>(ex->received) / ex->faults.rate - now_seconds();
        if (wait > 0 && !pause_for(wait)) {
            ex->outcome = "shutdown";
            return false;
        }
    }
    return true;
}

int Server::respond(MHD_Connection *conn, Exchange *ex, Answer answer)
{
    if (ex->faults.no_location) {
        std::vector<Header> kept;
        for (auto &h : answer.headers)
            if (!iequals(h.name, "Location"))
                kept.push_back(h);
        answer.headers = kept;
    }
    ex->status = answer.status;
    ex->outcome = "answered";
    write_log(ex);
    if (ex->faults.stall > 0 && !pause_for(ex->faults.stall))
        return 0;
    if (ex->faults.big_header > 0) {
        // libmicrohttpd builds the header block in its connection memory, which cannot hold
        // megabytes: the padded answer is written to the socket here (plain http only).
        if (!ex->tls)
            send_raw(conn, answer, ex->faults.big_header);
        return 0;
    }
    MHD_Response *resp =
        MHD_create_response_from_buffer(answer.body.size(), const_cast<char *>(answer.body.data()), MHD_RESPMEM_MUST_COPY);
    if (!resp)
        return 0;
    for (const auto &h : answer.headers)
        MHD_add_response_header(resp, h.name.c_str(), h.value.c_str());
    MHD_Result r = MHD_queue_response(conn, static_cast<unsigned>(answer.status), resp);
    MHD_destroy_response(resp);
    return r == MHD_YES;
}

bool Server::send_raw(MHD_Connection *conn, const Answer &answer, int64_t header_bytes)
{
    int fd = connection_fd(conn);
    if (fd < 0)
        return false;
    std::string out = "HTTP/1.1 " + std::to_string(answer.status) + " " + reason_phrase(answer.status) + "\r\n";
    for (const auto &h : answer.headers)
        out += h.name + ": " + h.value + "\r\n";
    out += "Content-Length: " + std::to_string(answer.body.size()) + "\r\nConnection: close\r\n";
    const std::string filler(1000, 'z');
    char name[64];
    for (int i = 0; static_cast<int64_t>(out.size()) + 2 < header_bytes; i++) {
        snprintf(name, sizeof name, "X-Zv-Padding-%07d: ", i);
        out += name + filler + "\r\n";
    }
    out += "\r\n" + answer.body;
    size_t off = 0;
    double deadline = now_seconds() + 60;
    while (off < out.size() && now_seconds() < deadline) {
        {
            std::lock_guard<std::mutex> lock(stop_mutex_);
            if (stopping_)
                return false;
        }
        pollfd pfd{fd, POLLOUT, 0};
        if (poll(&pfd, 1, 200) <= 0)
            continue;
        ssize_t n = send(fd, out.data() + off, out.size() - off, MSG_NOSIGNAL);
        if (n < 0 && (errno == EAGAIN || errno == EINTR))
            continue;
        if (n <= 0)
            return false;
        off += static_cast<size_t>(n);
    }
    return off == out.size();
}

void Server::write_log(Exchange *ex)
{
    ex->logged = true;
    if (!log_)
        return;
    char time_text[64];
    snprintf(time_text, sizeof time_text, "%.3f", wall_seconds());
    std::string line = "{\"seq\":" + std::to_string(ex->seq) + ",\"time\":" + time_text +
                       ",\"scheme\":" + (ex->tls ? "\"https\"" : "\"http\"") + ",\"remote\":" + json_quote(ex->remote) +
                       ",\"method\":" + json_quote(ex->method) + ",\"target\":" + json_quote(ex->target) +
                       ",\"path\":" + json_quote(ex->path) + ",\"query\":" + json_quote(ex->query) +
                       ",\"version\":" + json_quote(ex->version) + ",\"kind\":" + json_quote(kind_name(ex->kind)) +
                       ",\"headers\":[";
    for (size_t i = 0; i < ex->headers.size(); i++) {
        if (i)
            line += ",";
        line += "[" + json_quote(ex->headers[i].name) + "," + json_quote(ex->headers[i].value) + "]";
    }
    line += "],\"body_length\":" + std::to_string(ex->received);
    if (ex->digest)
        line += ",\"body_sha256\":\"" + ex->digest->hex() + "\"";
    if (ex->log_body_whole) {
        if (is_valid_utf8(ex->log_body))
            line += ",\"body\":" + json_quote(ex->log_body);
        line += ",\"body_base64\":\"" + base64_encode(ex->log_body) + "\"";
    }
    bool complete = ex->has_length ? ex->received == ex->content_length : ex->body_done;
    line += std::string(",\"complete\":") + (complete ? "true" : "false") + ",\"status\":" + std::to_string(ex->status) +
            ",\"outcome\":" + json_quote(ex->outcome) + ",\"faults\":[";
    for (size_t i = 0; i < ex->faults.fired.size(); i++)
        line += (i ? "," : "") + json_quote(ex->faults.fired[i]);
    line += "]";
    if (!ex->upload_id.empty())
        line += ",\"upload_id\":" + json_quote(ex->upload_id);
    line += "}\n";
    std::lock_guard<std::mutex> lock(log_mutex_);
    if (log_) {
        fwrite(line.data(), 1, line.size(), log_);
        fflush(log_);
    }
}

} // namespace zv_devserver
