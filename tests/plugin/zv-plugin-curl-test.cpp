// Transfer engine against loopback servers: what goes on the wire, how answers come back,
// pause / resume / cancel, failures, and stopping with requests in flight.
#include <gtest/gtest.h>

#include <fcntl.h>
#include <stdlib.h>
#include <string.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
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

using zv_test::wait_for;
constexpr int kWaitMs = 20000;

zv_test::LogFile g_log; // the engine logs into a file of the test's own

std::string http_answer(const std::string &status, const std::string &headers = "",
                        const std::string &body = "")
{
    return "HTTP/1.1 " + status + "\r\n" + headers +
           "Content-Length: " + std::to_string(body.size()) + "\r\n\r\n" + body;
}

// An HTTP/1.1 server on 127.0.0.1, one thread per connection, that keeps every request (head
// and body) and gives each the same answer ("" never answers). A CONNECT opens a proxy tunnel
// whose request follows on the same connection. One made not accepting leaves its connections
// in the backlog, where a client can send no more than the socket buffers take, until
// accept() is called.
class LoopbackServer
{
  public:
    explicit LoopbackServer(std::string answer, bool accepting = true) : answer_(std::move(answer))
    {
        EXPECT_GE(listen_fd_ = zv_test::listen_loopback(&port_, 16), 0);
        if (accepting)
            accept();
    }
    void accept()
    {
        acceptor_ = std::thread([this] {
            for (int fd; (fd = accept4(listen_fd_, nullptr, nullptr, SOCK_CLOEXEC)) >= 0;) {
                std::lock_guard<std::mutex> lock(m_);
                fds_.push_back(fd);
                if (stop_)
                    break;
                workers_.emplace_back([this, fd] { serve(fd); });
            }
        });
    }
    ~LoopbackServer()
    {
        {
            std::lock_guard<std::mutex> lock(m_);
            stop_ = true;
            for (int fd : fds_)
                shutdown(fd, SHUT_RDWR);
        }
        shutdown(listen_fd_, SHUT_RDWR); // ends the blocked accept
        if (acceptor_.joinable())
            acceptor_.join();
        for (std::thread &t : workers_)
            t.join();
        for (int fd : fds_)
            close(fd);
        close(listen_fd_);
    }

    std::string host() const { return "127.0.0.1:" + std::to_string(port_); }
    std::string url(const std::string &path = "/") const { return "http://" + host() + path; }
    std::vector<std::string> requests()
    {
        std::lock_guard<std::mutex> lock(m_);
        return requests_;
    }

  private:
    void serve(int fd)
    {
        std::string buf;
        auto more = [&] {
            char tmp[65536];
            ssize_t n = recv(fd, tmp, sizeof tmp, 0);
            buf.append(tmp, static_cast<size_t>(std::max<ssize_t>(n, 0)));
            return n > 0;
        };
        for (size_t end;;) {
            while ((end = buf.find("\r\n\r\n")) == std::string::npos)
                if (!more())
                    return;
            std::string request = buf.substr(0, end + 4);
            buf.erase(0, end + 4);
            const bool tunnel = request.rfind("CONNECT ", 0) == 0;
            const std::string answer = tunnel ? "HTTP/1.1 200 OK\r\n\r\n" : answer_;
            size_t at = request.find("\r\nContent-Length: ");
            size_t length = at == std::string::npos ? 0 : atoll(request.c_str() + at + 18);
            while (buf.size() < length && more()) {
            }
            request += buf.substr(0, length); // all of the body that came
            buf.erase(0, length);
            {
                std::lock_guard<std::mutex> lock(m_);
                requests_.push_back(request);
            }
            send(fd, answer.data(), answer.size(), MSG_NOSIGNAL);
        }
    }

    const std::string answer_;
    int listen_fd_ = -1, port_ = 0;
    std::thread acceptor_;
    std::mutex m_;
    bool stop_ = false;
    std::vector<int> fds_;
    std::vector<std::thread> workers_;
    std::vector<std::string> requests_;
};

// An item record with what came back for it, deleted through the engine when the test ends.
// The worker fills the fields before it counts the call (or the read); the test reads them
// once it has seen the count.
struct Item {
    TransferItem *p = nullptr;
    std::atomic<int> calls{0};
    std::atomic<size_t> reads{0};
    long http_code = -2;
    std::optional<std::string> header, body;
    std::vector<std::pair<int, int64_t>> progress; // percent, file_offset

    Item() { zv_curl_new(&p); }
    Item(int method, const std::string &url) : Item()
    {
        zv_curl_set_callback_func(p, [](int, TransferResponse *resp, void *self) {
            Item *o = static_cast<Item *>(self);
            o->http_code = resp->http_code;
            if (resp->header_data)
                o->header = resp->header_data;
            if (resp->write_data)
                o->body = resp->write_data;
            ++o->calls;
        });
        zv_curl_set_progress_cb_func(p, [](int percent, void *self, int64_t, int64_t offset) {
            static_cast<Item *>(self)->progress.emplace_back(percent, offset);
            ++static_cast<Item *>(self)->reads;
        });
        zv_curl_set_user_data(p, this);
        zv_curl_set_method(p, method);
        zv_curl_set_url(p, url.c_str());
    }
    // A PUT of `path` from `offset`, framed as a data upload is.
    Item(const std::string &url, const std::string &path, int64_t size, int64_t offset)
        : Item(ZV_CURL_HTTP_METHOD_PUT, url)
    {
        zv_curl_set_header(p, ("Content-Length: " + std::to_string(size - offset)).c_str());
        EXPECT_EQ(zv_curl_set_file_info(p, path.c_str(), size, offset), 0);
    }
    ~Item() { zv_curl_delete(&p); }

    // Sends the request and waits for its answer.
    bool exchange()
    {
        return zv_curl_send_request(p) == 0 && wait_for([this] { return calls > 0; }, kWaitMs);
    }
};

std::string pattern(size_t size)
{
    std::string data(size, '\0');
    for (size_t i = 0; i < size; ++i)
        data[i] = static_cast<char>('a' + (i * 7 + i / 251) % 26);
    return data;
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

    zv_test::TempDir tmp_;
};

TEST(EngineItem, SettersRefuseBadValuesAndChangeNothing)
{
    Item item;
    zv_curl_set_url(item.p, "http://first/");
    zv_curl_set_body(item.p, "abc", 3);
    zv_curl_set_timeout(item.p, 7);
    zv_curl_set_file_info(item.p, "/f", 10, 2);
    TransferItem before;
    memcpy(&before, item.p, sizeof before);
    const std::pair<const char *, int (*)(TransferItem *)> refused[] = {
        {"NULL url", [](TransferItem *i) { return zv_curl_set_url(i, nullptr); }},
        {"negative body len", [](TransferItem *i) { return zv_curl_set_body(i, "x", -1); }},
        {"body len past the text", [](TransferItem *i) { return zv_curl_set_body(i, "x", 2); }},
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
    EXPECT_EQ(memcmp(&before, item.p, sizeof before), 0); // not a value, not a pointer
    // Edge values are accepted.
    EXPECT_EQ(zv_curl_set_body(item.p, nullptr, 0), 0);
    EXPECT_EQ(zv_curl_set_timeout(item.p, 0), 0);
    EXPECT_EQ(zv_curl_set_file_info(item.p, "/g", 0, 0), 0);

    // Emptying twice, then replacing the emptied record, is harmless.
    zv_curl_free(item.p);
    zv_curl_free(item.p);
    EXPECT_EQ(item.p->url, nullptr);
    EXPECT_EQ(zv_curl_new(&item.p), 0);
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
// server by the client tests; here the methods the client never asks for, what a response
// callback may do, and the proxy.
TEST_F(EngineTest, AnyOtherMethodIsAGetCallbacksCannotCallBackInAndAProxyIsUsedUnlessEmpty)
{
    // A POST without body sends an empty one. An answer without body is NULL beside its whole
    // header block.
    LoopbackServer target(http_answer("200 OK"));
    const std::string head = " / HTTP/1.1\r\nHost: " + target.host() +
                             "\r\nAccept: */*\r\nAccept-Encoding: gzip,deflate\r\n";
    for (auto [method, request] :
         {std::make_pair(int(ZV_CURL_HTTP_METHOD_GET), "GET" + head),
          {5, "GET" + head},
          {ZV_CURL_HTTP_METHOD_POST, "POST" + head +
                                         "Content-Length: 0\r\n"
                                         "Content-Type: application/x-www-form-urlencoded\r\n"}}) {
        Item o(method, target.url());
        ASSERT_TRUE(o.exchange());
        EXPECT_EQ(target.requests().back(), request + "\r\n");
        EXPECT_EQ(o.http_code, 200);
        EXPECT_FALSE(o.body.has_value());
        EXPECT_EQ(*o.header, "HTTP/1.1 200 OK\r\nContent-Length: 0\r\n\r\n");
    }

    // From a response callback (worker thread, lock held) the calls that would deadlock are
    // refused, and emptying or replacing the item is safe: the requests below show the engine
    // going on.
    static std::atomic<int> send_result{-1}, cancel_result{-1};
    Item released(ZV_CURL_HTTP_METHOD_GET, target.url());
    zv_curl_set_callback_func(released.p, [](int, TransferResponse *, void *self) {
        Item *o = static_cast<Item *>(self);
        send_result = zv_curl_send_request(o->p);
        cancel_result = zv_curl_cancel_request(o->p);
        zv_curl_free(o->p);
        zv_curl_new(&o->p); // the old record is reclaimed after this report
        ++o->calls;
    });
    ASSERT_TRUE(released.exchange());
    EXPECT_EQ(send_result, ZV_CURL_ERROR_OPERATION_FAILED);
    EXPECT_EQ(cancel_result, ZV_CURL_ERROR_OPERATION_FAILED);

    LoopbackServer proxy(http_answer("200 OK", "", "tunnel"));
    for (const std::string &via :
         {proxy.host(), std::string("0.0.0.0:8080"), std::string(), std::string("NULL")}) {
        Item o(ZV_CURL_HTTP_METHOD_GET, target.url("/doc"));
        zv_curl_set_netwrok_info(o.p, "10.0.0.5", via == "NULL" ? nullptr : via.c_str());
        size_t through_proxy = proxy.requests().size(), direct = target.requests().size();
        ASSERT_TRUE(o.exchange());
        if (via == proxy.host()) { // tunnelled through a CONNECT to the target
            auto seen = proxy.requests();
            ASSERT_EQ(seen.size(), through_proxy + 2);
            EXPECT_EQ(seen[through_proxy].rfind("CONNECT " + target.host(), 0), 0u);
            EXPECT_EQ(seen[through_proxy + 1].rfind("GET /doc HTTP/1.1", 0), 0u);
            EXPECT_EQ(*o.body, "tunnel");
        } else {
            EXPECT_EQ(target.requests().size(), direct + 1) << via;
        }
    }
}

// The file is written from the offset on (sparse before it); bytes it grew by after its size
// was taken are never sent. The percent is that of the file's offset after each read; the
// read that finds the end reports too.
TEST_F(EngineTest, PutStreamsTheFileFromItsOffsetFramedByContentLength)
{
    LoopbackServer server(http_answer("201 Created", "ETag: \"v1\"\r\n"));
    const struct {
        int64_t size, offset, grown;
        int first_percent;
        size_t reports; // 0: left to the read sizes
    } cases[] = {
        {600, 100, 5000, 100, 2}, // one read takes all 500 bytes
        {0, 0, 0, 100, 1},        // an empty file is done, and never divides by zero
        {5LL << 30, (5LL << 30) - (1 << 20), 0, 99, 0}, // offsets past the 32-bit limits
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.size);
        const std::string path = tmp_.file("clip.mp4"), data = pattern(c.size - c.offset + c.grown);
        int fd = open(path.c_str(), O_CREAT | O_TRUNC | O_WRONLY, 0600);
        ASSERT_EQ(pwrite(fd, data.data(), data.size(), c.offset),
                  static_cast<ssize_t>(data.size()));
        close(fd);
        Item o(server.url("/up?id=7"), path, c.size, c.offset);
        ASSERT_TRUE(o.exchange());

        EXPECT_EQ(server.requests().back(),
                  "PUT /up?id=7 HTTP/1.1\r\nHost: " + server.host() +
                      "\r\nAccept: */*\r\nAccept-Encoding: gzip,deflate\r\nContent-Length: " +
                      std::to_string(c.size - c.offset) + "\r\n\r\n" +
                      data.substr(0, c.size - c.offset));
        EXPECT_EQ(o.http_code, 201);
        ASSERT_FALSE(o.progress.empty());
        EXPECT_EQ(o.progress.front().first, c.first_percent);
        if (c.reports > 0) {
            EXPECT_EQ(o.progress.size(), c.reports);
        }
        EXPECT_TRUE(std::is_sorted(o.progress.begin(), o.progress.end()));
        EXPECT_EQ(o.progress.back(), std::make_pair(100, c.size));
    }
}

// A request without a whole answer is reported once, as no answer: status 0, no data. (A
// refused or closed connection the client tests and the cut uploads end to end show.)
TEST_F(EngineTest, FailedRequestsCompleteWithStatusZeroAndNoData)
{
    LoopbackServer silent("");
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
        ASSERT_TRUE(o.exchange());
        EXPECT_EQ(o.calls, 1) << what;
        EXPECT_EQ(o.http_code, 0) << what;
        EXPECT_FALSE(o.header.has_value()) << what;
        EXPECT_FALSE(o.body.has_value()) << what;
    }

    // One byte less fits.
    LoopbackServer fits(http_answer("200 OK", "", std::string(ZV_CURL_MAX_RESPONSE_SIZE - 1, 'b')));
    Item o(ZV_CURL_HTTP_METHOD_GET, fits.url());
    ASSERT_TRUE(o.exchange());
    EXPECT_EQ(o.http_code, 200);
    EXPECT_EQ(o.body.value_or("").size(), ZV_CURL_MAX_RESPONSE_SIZE - 1u);
}

// A server that does not accept yet holds a large upload after its first read; these tests
// act on it then.
class RunningUploadTest : public EngineTest
{
  protected:
    static constexpr int kSize = 48 * 1024 * 1024;

    void SetUp() override
    {
        EngineTest::SetUp();
        std::string path = tmp_.file("big.mp4");
        ASSERT_TRUE(zv_test::write_file(path, pattern(kSize)));
        upload_ = std::make_unique<Item>(server_.url("/up"), path, kSize, 0);
        ASSERT_EQ(zv_curl_send_request(upload_->p), 0);
        ASSERT_TRUE(wait_for([this] { return upload_->reads > 0; }, kWaitMs));
    }

    // Lets the worker run a whole other request: what the held upload would do, it has had
    // the chance to do by then.
    void run_another_request()
    {
        Item other(ZV_CURL_HTTP_METHOD_GET, side_.url());
        ASSERT_TRUE(other.exchange());
        EXPECT_EQ(other.http_code, 200);
    }

    LoopbackServer server_{http_answer("201 Created"), false};
    LoopbackServer side_{http_answer("200 OK")};
    std::unique_ptr<Item> upload_;
};

TEST_F(RunningUploadTest, PauseHoldsTheRequestAndResumeFinishesItOnTheSameConnection)
{
    ASSERT_EQ(zv_curl_pause_request(upload_->p), 0);
    size_t reads = upload_->reads;
    server_.accept();
    run_another_request();
    EXPECT_EQ(upload_->reads, reads);
    EXPECT_EQ(upload_->calls, 0);
    EXPECT_TRUE(server_.requests().empty()); // not all of the body came

    ASSERT_EQ(zv_curl_resume_request(upload_->p), 0);
    ASSERT_TRUE(wait_for([this] { return upload_->calls > 0; }, kWaitMs));
    EXPECT_EQ(upload_->http_code, 201);
    EXPECT_EQ(upload_->progress.back(), std::make_pair(100, static_cast<int64_t>(kSize)));
    ASSERT_EQ(server_.requests().size(), 1u); // a second connection would have left a piece
    EXPECT_TRUE(server_.requests()[0].compare(server_.requests()[0].find("\r\n\r\n") + 4,
                                              std::string::npos, pattern(kSize)) == 0);
}

TEST_F(RunningUploadTest, CancelClosesTheConnectionAndNoAnswerFollows)
{
    ASSERT_EQ(zv_curl_cancel_request(upload_->p), 0);
    server_.accept(); // the server keeps what came before the connection closed
    ASSERT_TRUE(wait_for([this] { return !server_.requests().empty(); }, kWaitMs));
    run_another_request();
    EXPECT_EQ(upload_->calls, 0);
    EXPECT_LT(server_.requests()[0].size(), static_cast<size_t>(kSize));
    EXPECT_EQ(zv_curl_cancel_request(upload_->p), ZV_CURL_ERROR_INVALID_PARAMETER);
}

TEST_F(RunningUploadTest, StopNeverHangsWithRequestsInFlight)
{
    LoopbackServer silent("");
    Item hanging(ZV_CURL_HTTP_METHOD_GET, silent.url());
    ASSERT_EQ(zv_curl_send_request(hanging.p), 0);
    ASSERT_TRUE(wait_for([&] { return !silent.requests().empty(); }, kWaitMs));
    ASSERT_EQ(zv_curl_pause_request(upload_->p), 0);

    zv_curl_finalize_service(); // a stop that hangs ends at the test's time limit
    EXPECT_EQ(upload_->calls, 0);
    EXPECT_EQ(hanging.calls, 0);

    zv_curl_finalize_service(); // harmless twice; the engine starts again
    ASSERT_EQ(zv_curl_init_service(), ZV_CURL_ERROR_NONE);
    server_.accept();
    run_another_request();
}

} // namespace
