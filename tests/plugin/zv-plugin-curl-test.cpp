// Transfer engine against loopback servers: what goes on the wire, how answers come back,
// pause / resume / cancel, failures, and stopping with requests in flight.
#include <gtest/gtest.h>

#include <fcntl.h>
#include <stdlib.h>
#include <string.h>
#include <sys/socket.h>
#include <unistd.h>

#include <atomic>
#include <condition_variable>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "zv-plugin-curl.h"
#include "zv-test-util.h"

namespace
{

const std::string kHang = "<hang>";   // answer: say nothing until the server is destroyed

std::string http_answer(const std::string &status, const std::string &headers = "",
                               const std::string &body = "")
{
    return "HTTP/1.1 " + status + "\r\n" + headers +
           "Content-Length: " + std::to_string(body.size()) + "\r\n\r\n" + body;
}

// An HTTP/1.1 server on 127.0.0.1 for the engine's tests, one thread per connection. It keeps
// every request (head and up to 1 MiB of body) and gives each the same answer. A CONNECT is
// taken as a proxy tunnel whose request follows on the same connection. While gated it reads a
// request's head but waits with its body.
class LoopbackServer
{
  public:
    explicit LoopbackServer(std::string answer) : answer_(std::move(answer))
    {
        if ((listen_fd_ = zv_test::listen_loopback(&port_, 16)) < 0)
            ADD_FAILURE() << "no loopback socket";
        acceptor_ = std::thread([this] {
            int fd;
            while ((fd = accept4(listen_fd_, nullptr, nullptr, SOCK_CLOEXEC)) >= 0) {
                std::lock_guard<std::mutex> lock(m_);
                if (stop_) {
                    close(fd);
                    break;
                }
                ++connections;
                conn_fds_.push_back(fd);
                workers_.emplace_back([this, fd] { serve(fd); });
            }
        });
    }
    ~LoopbackServer()
    {
        {
            std::lock_guard<std::mutex> lock(m_);
            stop_ = true;
            for (int fd : conn_fds_)
                shutdown(fd, SHUT_RDWR);
        }
        shutdown(listen_fd_, SHUT_RDWR); // ends the blocked accept
        cv_.notify_all();
        acceptor_.join();
        for (std::thread &t : workers_)
            t.join();
        close(listen_fd_);
    }

    std::string host() const { return "127.0.0.1:" + std::to_string(port_); }
    std::string url(const std::string &path = "/") const { return "http://" + host() + path; }
    void set_gated(bool gated)
    {
        std::lock_guard<std::mutex> lock(m_);
        gated_ = gated;
        cv_.notify_all();
    }
    std::vector<std::string> requests()
    {
        std::lock_guard<std::mutex> lock(m_);
        return requests_;
    }
    size_t request_count() { return requests().size(); }

    std::atomic<long long> body_bytes{0};
    std::atomic<int> connections{0};
    std::atomic<int> closed_by_peer{0};

  private:
    bool more(int fd, std::string &buf)
    {
        char tmp[65536];
        ssize_t n = recv(fd, tmp, sizeof tmp, 0);
        closed_by_peer += n == 0;
        if (n > 0)
            buf.append(tmp, static_cast<size_t>(n));
        return n > 0;
    }

    void serve(int fd)
    {
        const size_t kKeep = 1 << 20;
        std::string buf;
        for (;;) {
            size_t end;
            while ((end = buf.find("\r\n\r\n")) == std::string::npos && more(fd, buf)) {
            }
            if (end == std::string::npos)
                break;
            std::string request = buf.substr(0, end + 4);
            buf.erase(0, end + 4);
            if (request.rfind("CONNECT ", 0) == 0) {
                record(request);
                send(fd, "HTTP/1.1 200 OK\r\n\r\n", 19, MSG_NOSIGNAL);
                continue;
            }
            {
                std::unique_lock<std::mutex> lock(m_);
                cv_.wait(lock, [this] { return !gated_ || stop_; });
            }
            size_t at = request.find("\r\nContent-Length: ");
            long long left = at == std::string::npos ? 0 : atoll(request.c_str() + at + 18);
            size_t head_size = request.size();
            while (left > 0 && (!buf.empty() || more(fd, buf))) {
                size_t take = static_cast<size_t>(std::min<long long>(left, buf.size()));
                size_t kept = request.size() - head_size;
                request.append(buf, 0, std::min(take, kKeep - std::min(kept, kKeep)));
                buf.erase(0, take);
                left -= static_cast<long long>(take);
                body_bytes += static_cast<long long>(take);
            }
            record(request);
            const std::string &answer = answer_;
            if (answer == kHang) {
                std::unique_lock<std::mutex> lock(m_);
                cv_.wait(lock, [this] { return stop_; });
                break;
            }
            for (size_t sent = 0; sent < answer.size();) {
                ssize_t n = send(fd, answer.data() + sent, answer.size() - sent, MSG_NOSIGNAL);
                if (n <= 0)
                    break;
                sent += static_cast<size_t>(n);
            }
        }
        close(fd);
    }

    void record(const std::string &raw)
    {
        std::lock_guard<std::mutex> lock(m_);
        requests_.push_back(raw);
    }

    const std::string answer_;
    int listen_fd_ = -1;
    int port_ = 0;
    std::thread acceptor_;
    std::mutex m_;
    std::condition_variable cv_;
    bool stop_ = false;
    bool gated_ = false;
    std::vector<int> conn_fds_;
    std::vector<std::thread> workers_;
    std::vector<std::string> requests_;
};

using zv_test::wait_for;
constexpr int kWaitMs = 20000;

zv_test::LogFile g_log; // the engine logs into a file of the test's own

// What came back for one item, copied on the worker. Once an answer is seen (through the
// lock), the worker writes nothing more and the fields are read directly.
struct Outcome {
    std::mutex m;
    int calls = 0;
    int result = -1;
    long http_code = -2;
    std::optional<std::string> header, body;
    std::vector<std::pair<int, int64_t>> progress; // percent, file_offset

    int call_count()
    {
        std::lock_guard<std::mutex> lock(m);
        return calls;
    }
    size_t progress_count()
    {
        std::lock_guard<std::mutex> lock(m);
        return progress.size();
    }
    bool wait_answer()
    {
        return wait_for([this] { return call_count() > 0; }, kWaitMs);
    }
};

void on_response(int result, TransferResponse *resp, void *user_data)
{
    Outcome *o = static_cast<Outcome *>(user_data);
    std::lock_guard<std::mutex> lock(o->m);
    ++o->calls;
    o->result = result;
    o->http_code = resp->http_code;
    if (resp->header_data)
        o->header = resp->header_data;
    if (resp->write_data)
        o->body = resp->write_data;
}

void on_progress(int percent, void *user_data, int64_t, int64_t file_offset)
{
    Outcome *o = static_cast<Outcome *>(user_data);
    std::lock_guard<std::mutex> lock(o->m);
    o->progress.emplace_back(percent, file_offset);
}

// An item record with what came back for it, deleted through the engine when the test ends.
struct Item : Outcome {
    TransferItem *p = nullptr;
    Item() { zv_curl_new(&p); }
    Item(int method, const std::string &url) : Item()
    {
        zv_curl_set_callback_func(p, on_response);
        zv_curl_set_progress_cb_func(p, on_progress);
        zv_curl_set_user_data(p, static_cast<Outcome *>(this));
        zv_curl_set_method(p, method);
        zv_curl_set_url(p, url.c_str());
        zv_curl_set_timeout(p, 60000);
        zv_curl_set_connect_timeout(p, 30000);
    }
    // A PUT of `path` from `offset`, framed as a data upload is.
    Item(const std::string &url, const std::string &path, int64_t size, int64_t offset)
        : Item(ZV_CURL_HTTP_METHOD_PUT, url)
    {
        zv_curl_set_header(p, ("Content-Length: " + std::to_string(size - offset)).c_str());
        EXPECT_EQ(zv_curl_set_file_info(p, path.c_str(), size, offset), 0);
    }
    ~Item() { zv_curl_delete(&p); }
    TransferItem *operator->() { return p; }
};

std::string pattern(size_t size)
{
    std::string data(size, '\0');
    for (size_t i = 0; i < size; ++i)
        data[i] = static_cast<char>('a' + (i * 7 + i / 251) % 26);
    return data;
}

bool once(const std::string &text, const std::string &needle)
{
    size_t at = text.find(needle);
    return at != std::string::npos && at == text.rfind(needle);
}

class EngineTest : public ::testing::Test
{
  protected:
    void SetUp() override
    {
        for (const char *var : {"http_proxy", "HTTP_PROXY", "ALL_PROXY", "all_proxy"})
            unsetenv(var);
        ASSERT_EQ(zv_curl_init_service(), ZV_CURL_ERROR_NONE);
    }
    void TearDown() override { zv_curl_finalize_service(); }

    // Sends a prepared item and waits for its answer.
    void exchange(Item &o)
    {
        ASSERT_EQ(zv_curl_send_request(o.p), 0);
        ASSERT_TRUE(o.wait_answer());
    }

    zv_test::TempDir tmp_;
};

TEST(EngineItem, SettersRefuseBadValuesAndChangeNothing)
{
    Item item;
    zv_curl_set_url(item.p, "http://first/");
    zv_curl_set_body(item.p, "abc", 3);
    zv_curl_set_timeout(item.p, 7);
    zv_curl_set_file_info(item.p, "/f", 10, 2);
    const std::pair<const char *, std::function<int(TransferItem *)>> refused[] = {
        {"NULL url", [](TransferItem *i) { return zv_curl_set_url(i, nullptr); }},
        {"negative body len", [](TransferItem *i) { return zv_curl_set_body(i, "x", -1); }},
        {"body len past the text", [](TransferItem *i) { return zv_curl_set_body(i, "x", 2); }},
        {"len without body", [](TransferItem *i) { return zv_curl_set_body(i, nullptr, 1); }},
        {"negative timeout", [](TransferItem *i) { return zv_curl_set_timeout(i, -1); }},
        {"negative connect", [](TransferItem *i) { return zv_curl_set_connect_timeout(i, -1); }},
        {"NULL header", [](TransferItem *i) { return zv_curl_set_header(i, nullptr); }},
        {"NULL path", [](TransferItem *i) { return zv_curl_set_file_info(i, nullptr, -1, -1); }},
        {"negative size", [](TransferItem *i) { return zv_curl_set_file_info(i, "/g", -1, 0); }},
        {"negative offset", [](TransferItem *i) { return zv_curl_set_file_info(i, "/g", 1, -1); }},
    };
    for (const auto &[what, call] : refused) {
        EXPECT_EQ(call(item.p), ZV_CURL_ERROR_INVALID_PARAMETER) << what;
        EXPECT_EQ(call(nullptr), ZV_CURL_ERROR_INVALID_HANDLE) << what;
    }
    EXPECT_STREQ(item->url, "http://first/");
    EXPECT_STREQ(item->body, "abc");
    EXPECT_EQ(item->timeout, 7);
    EXPECT_STREQ(item->file_path, "/f");
    EXPECT_EQ(item->file_size, 10);
    EXPECT_EQ(item->file_offset, 2);
    EXPECT_EQ(item->header_list, nullptr);

    // Edge values are accepted; headers keep their order.
    EXPECT_EQ(zv_curl_set_body(item.p, nullptr, 0), 0);
    EXPECT_EQ(zv_curl_set_timeout(item.p, 0), 0);
    EXPECT_EQ(zv_curl_set_file_info(item.p, "/g", 0, 0), 0);
    std::vector<std::string> lines;
    for (const char *line : {"A: 1", "B: 2", "C:"})
        zv_curl_set_header(item.p, line);
    for (GList *l = item->header_list; l; l = l->next)
        lines.push_back(static_cast<char *>(l->data));
    EXPECT_EQ(lines, (std::vector<std::string>{"A: 1", "B: 2", "C:"}));

    // Emptying twice, then replacing the emptied record, is harmless.
    zv_curl_free(item.p);
    zv_curl_free(item.p);
    EXPECT_EQ(item->url, nullptr);
    EXPECT_EQ(item->header_list, nullptr);
    EXPECT_EQ(zv_curl_new(&item.p), 0);
    EXPECT_NE(item.p, nullptr);
    EXPECT_EQ(zv_curl_new(nullptr), ZV_CURL_ERROR_INVALID_HANDLE);

    // Cancel, pause and resume need an item that was sent; send needs a URL.
    Item never_sent, no_url;
    zv_curl_set_url(never_sent.p, "http://127.0.0.1:1/");
    for (auto op : {zv_curl_cancel_request, zv_curl_pause_request, zv_curl_resume_request}) {
        EXPECT_EQ(op(nullptr), ZV_CURL_ERROR_INVALID_HANDLE);
        EXPECT_EQ(op(no_url.p), ZV_CURL_ERROR_INVALID_PARAMETER);
        EXPECT_EQ(op(never_sent.p), ZV_CURL_ERROR_INVALID_PARAMETER);
    }
    EXPECT_EQ(zv_curl_send_request(nullptr), ZV_CURL_ERROR_INVALID_HANDLE);
    EXPECT_EQ(zv_curl_send_request(no_url.p), ZV_CURL_ERROR_INVALID_PARAMETER);
}

// Header lists, bodies and answers of the client's requests are checked on the development
// server by the client tests; here the methods the client never asks for.
TEST_F(EngineTest, AnyOtherMethodIsAGetAndAnAnswerWithoutBodyHasNone)
{
    // A POST without body sends an empty one. An answer without body is NULL beside its whole
    // header block.
    const std::pair<int, const char *> methods[] = {{ZV_CURL_HTTP_METHOD_GET, "GET"},
                                                    {5, "GET"},
                                                    {-1, "GET"},
                                                    {ZV_CURL_HTTP_METHOD_POST, "POST"}};
    LoopbackServer empty(http_answer("200 OK"));
    for (auto [method, name] : methods) {
        Item o(method, empty.url());
        exchange(o);
        std::string raw = empty.requests().back();
        EXPECT_EQ(raw.rfind(std::string(name) + " / HTTP/1.1\r\n", 0), 0u) << raw;
        EXPECT_EQ(raw.find("Transfer-Encoding"), std::string::npos) << raw;
        EXPECT_EQ(o.http_code, 200);
        EXPECT_FALSE(o.body.has_value());
        EXPECT_EQ(*o.header, "HTTP/1.1 200 OK\r\nContent-Length: 0\r\n\r\n");
    }
}

// The file is written from the offset on (sparse before it); bytes it grew by after its size
// was taken are never sent. The percent is that of the file's offset after each read.
TEST_F(EngineTest, PutStreamsTheFileFromItsOffsetFramedByContentLength)
{
    LoopbackServer server(http_answer("201 Created", "ETag: \"v1\"\r\n"));
    struct Case {
        int64_t size, offset, grown;
        int first_percent; // -1: left to the read sizes
    };
    const Case cases[] = {
        {1000, 400, 0, 100}, // one read takes all 600 bytes
        {3 * 1024 * 1024 + 17, 0, 0, -1},
        {0, 0, 0, 100}, // an empty file is done, and never divides by zero
        {600, 100, 5000, 100},
        {5LL << 30, (5LL << 30) - (1 << 20), 0, 99}, // offsets past the 32-bit limits
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.size);
        const std::string path = tmp_.file("clip.mp4"), data = pattern(c.size - c.offset + c.grown);
        int fd = open(path.c_str(), O_CREAT | O_TRUNC | O_WRONLY, 0600);
        ASSERT_GE(fd, 0);
        ASSERT_EQ(pwrite(fd, data.data(), data.size(), c.offset),
                  static_cast<ssize_t>(data.size()));
        close(fd);
        Item o(server.url("/up?id=7"), path, c.size, c.offset);
        exchange(o);

        std::string raw = server.requests().back();
        size_t head_end = raw.find("\r\n\r\n") + 4;
        std::string head = raw.substr(0, head_end);
        EXPECT_EQ(head.rfind("PUT /up?id=7 HTTP/1.1\r\n", 0), 0u) << head;
        EXPECT_TRUE(once(head, "Content-Length: " + std::to_string(c.size - c.offset) + "\r\n"))
            << head;
        EXPECT_TRUE(once(head, "Content-Length:")) << head;
        EXPECT_EQ(head.find("Expect"), std::string::npos) << head;
        EXPECT_EQ(head.find("Transfer-Encoding"), std::string::npos) << head;
        EXPECT_EQ(raw.substr(head_end),
                  data.substr(0, std::min<int64_t>(c.size - c.offset, 1 << 20)));

        EXPECT_EQ(o.http_code, 201);
        ASSERT_FALSE(o.progress.empty());
        if (c.first_percent >= 0) {
            EXPECT_EQ(o.progress.front().first, c.first_percent);
        }
        for (size_t i = 1; i < o.progress.size(); ++i)
            EXPECT_LE(o.progress[i - 1], o.progress[i]);
        EXPECT_EQ(o.progress.back(), std::make_pair(100, c.size));
        if (c.size == 1000) { // the final read gets none
            EXPECT_EQ(o.progress, (decltype(o.progress){{100, 1000}, {100, 1000}}));
        }
    }
}

TEST_F(EngineTest, ProxyIsUsedUnlessEmptyOrUnspecifiedAddress)
{
    LoopbackServer target(http_answer("200 OK", "", "direct"));
    LoopbackServer proxy(http_answer("200 OK", "", "tunnel"));
    const std::pair<std::string, bool> cases[] = {
        {proxy.host(), true}, {"0.0.0.0:8080", false}, {"", false}, {"NULL", false}};
    for (const auto &[proxy_text, via_proxy] : cases) {
        Item o(ZV_CURL_HTTP_METHOD_GET, target.url("/doc"));
        zv_curl_set_netwrok_info(o.p, "10.0.0.5",
                                 proxy_text == "NULL" ? nullptr : proxy_text.c_str());
        size_t through_proxy = proxy.request_count();
        exchange(o);
        EXPECT_EQ(*o.body, via_proxy ? "tunnel" : "direct") << proxy_text;
        if (via_proxy) { // tunnelled through a CONNECT to the target
            auto seen = proxy.requests();
            ASSERT_EQ(seen.size(), through_proxy + 2);
            EXPECT_EQ(seen[through_proxy].rfind("CONNECT " + target.host(), 0), 0u);
            EXPECT_EQ(seen[through_proxy + 1].rfind("GET /doc HTTP/1.1", 0), 0u);
        }
    }
    EXPECT_EQ(target.request_count(), 3u);
}

// A request without a whole answer is reported once, as no answer: status 0, no data. (A
// refused or closed connection the client tests and the cut uploads end to end show.)
TEST_F(EngineTest, FailedRequestsCompleteWithStatusZeroAndNoData)
{
    LoopbackServer silent(kHang);
    std::string head = "HTTP/1.1 200 OK\r\n";
    while (head.size() < ZV_CURL_MAX_RESPONSE_SIZE + 4096)
        head += "X-Pad: " + std::string(1000, 'p') + "\r\n";
    LoopbackServer big_head(head + "Content-Length: 0\r\n\r\n");
    LoopbackServer big_body(http_answer("200 OK", "", std::string(ZV_CURL_MAX_RESPONSE_SIZE, 'b')));
    const std::pair<const char *, std::string> cases[] = {
        {"time-out", silent.url()},
        {"header block past the limit", big_head.url()},
        {"body past the limit (with its NUL)", big_body.url()},
    };
    for (const auto &[what, url] : cases) {
        Item o(ZV_CURL_HTTP_METHOD_POST, url);
        zv_curl_set_body(o.p, "q=1", 3);
        zv_curl_set_timeout(o.p, 1000);
        exchange(o);
        EXPECT_EQ(o.call_count(), 1) << what;
        EXPECT_EQ(o.result, ZV_CURL_ERROR_NONE) << what;
        EXPECT_EQ(o.http_code, 0) << what;
        EXPECT_FALSE(o.header.has_value()) << what;
        EXPECT_FALSE(o.body.has_value()) << what;
    }

    // One byte less fits.
    LoopbackServer fits(http_answer("200 OK", "", std::string(ZV_CURL_MAX_RESPONSE_SIZE - 1, 'b')));
    Item o(ZV_CURL_HTTP_METHOD_GET, fits.url());
    exchange(o);
    EXPECT_EQ(o.http_code, 200);
    EXPECT_EQ(o.body.value_or("").size(), ZV_CURL_MAX_RESPONSE_SIZE - 1u);
}

// From a response callback (worker thread, lock held) the calls that would deadlock are
// refused, and emptying or replacing the item is safe.
struct Reentry {
    std::atomic<int> send_result{-1}, cancel_result{-1};
    std::atomic<bool> done{false};
    TransferItem *item = nullptr;
};

TEST_F(EngineTest, ResponseCallbackMayReleaseItsItemButNotCallBackIn)
{
    LoopbackServer server(http_answer("200 OK", "", "x"));
    Reentry r;
    zv_curl_new(&r.item);
    zv_curl_set_callback_func(r.item, [](int, TransferResponse *, void *user_data) {
        Reentry *r = static_cast<Reentry *>(user_data);
        r->send_result = zv_curl_send_request(r->item);
        r->cancel_result = zv_curl_cancel_request(r->item);
        zv_curl_free(r->item);
        zv_curl_new(&r->item); // the old record is reclaimed after this report
        r->done = true;
    });
    zv_curl_set_user_data(r.item, &r);
    zv_curl_set_url(r.item, server.url().c_str());
    ASSERT_EQ(zv_curl_send_request(r.item), 0);
    ASSERT_TRUE(wait_for([&] { return r.done.load(); }, kWaitMs));
    EXPECT_EQ(r.send_result, ZV_CURL_ERROR_OPERATION_FAILED);
    EXPECT_EQ(r.cancel_result, ZV_CURL_ERROR_OPERATION_FAILED);
    EXPECT_EQ(r.item->url, nullptr);
    zv_curl_delete(&r.item);
    Item o(ZV_CURL_HTTP_METHOD_GET, server.url()); // the engine goes on
    exchange(o);
}

// A gated server holds a large upload after its first read; these tests act on it then.
class RunningUploadTest : public EngineTest
{
  protected:
    static constexpr int kSize = 48 * 1024 * 1024;

    void SetUp() override
    {
        EngineTest::SetUp();
        std::string path = tmp_.file("big.mp4");
        ASSERT_TRUE(zv_test::write_file(path, pattern(kSize)));
        server_.set_gated(true);
        upload_ = std::make_unique<Item>(server_.url("/up"), path, kSize, 0);
        ASSERT_EQ(zv_curl_send_request(upload_->p), 0);
        ASSERT_TRUE(wait_for([this] { return upload_->progress_count() > 0; }, kWaitMs));
    }

    // Lets the worker run a whole other request: what the held upload would do, it has had
    // the chance to do by then.
    void run_another_request()
    {
        Item other(ZV_CURL_HTTP_METHOD_GET, side_.url());
        exchange(other);
        EXPECT_EQ(other.http_code, 200);
    }

    LoopbackServer server_{http_answer("201 Created")};
    LoopbackServer side_{http_answer("200 OK")};
    std::unique_ptr<Item> upload_;
};

TEST_F(RunningUploadTest, PauseHoldsTheRequestAndResumeFinishesItOnTheSameConnection)
{
    ASSERT_EQ(zv_curl_pause_request(upload_->p), 0);
    size_t reads = upload_->progress_count();
    server_.set_gated(false);
    run_another_request();
    EXPECT_EQ(upload_->progress_count(), reads);
    EXPECT_EQ(upload_->call_count(), 0);
    EXPECT_LT(server_.body_bytes, kSize);

    ASSERT_EQ(zv_curl_resume_request(upload_->p), 0);
    ASSERT_TRUE(upload_->wait_answer());
    EXPECT_EQ(upload_->http_code, 201);
    EXPECT_EQ(upload_->progress.back(), std::make_pair(100, static_cast<int64_t>(kSize)));
    EXPECT_EQ(server_.body_bytes, kSize);
    EXPECT_EQ(server_.connections, 1);
}

TEST_F(RunningUploadTest, CancelClosesTheConnectionAndNoAnswerFollows)
{
    ASSERT_EQ(zv_curl_cancel_request(upload_->p), 0);
    server_.set_gated(false);
    EXPECT_TRUE(wait_for([this] { return server_.closed_by_peer > 0; }, kWaitMs));
    run_another_request();
    EXPECT_EQ(upload_->call_count(), 0);
    EXPECT_LT(server_.body_bytes, kSize);
    EXPECT_EQ(zv_curl_cancel_request(upload_->p), ZV_CURL_ERROR_INVALID_PARAMETER);
}

TEST_F(RunningUploadTest, StopNeverHangsWithRequestsInFlight)
{
    LoopbackServer silent(kHang);
    Item hanging(ZV_CURL_HTTP_METHOD_GET, silent.url());
    ASSERT_EQ(zv_curl_send_request(hanging.p), 0);
    ASSERT_TRUE(wait_for([&] { return silent.request_count() > 0; }, kWaitMs));
    ASSERT_EQ(zv_curl_pause_request(upload_->p), 0);

    std::atomic<bool> stopped{false};
    std::thread stopper([&] {
        zv_curl_finalize_service();
        stopped = true;
    });
    if (!wait_for([&] { return stopped.load(); }, 60000)) {
        ADD_FAILURE() << "zv_curl_finalize_service did not return";
        _exit(1);
    }
    stopper.join();
    EXPECT_EQ(upload_->call_count(), 0);
    EXPECT_EQ(hanging.call_count(), 0);

    zv_curl_finalize_service(); // harmless twice; the engine starts again
    ASSERT_EQ(zv_curl_init_service(), ZV_CURL_ERROR_NONE);
    server_.set_gated(false);
    run_another_request();
}

} // namespace
