// An HTTP/1.1 server on 127.0.0.1 for the plugin's tests, one thread per connection. It keeps
// every request (head and up to 1 MiB of body) and answers what its responder returns for it.
// A CONNECT is taken as a proxy tunnel whose request follows on the same connection. While
// gated it reads a request's head but waits with its body.
#pragma once

#include <gtest/gtest.h>
#include <stdlib.h>
#include <sys/socket.h>
#include <unistd.h>

#include <atomic>
#include <condition_variable>
#include <functional>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "zv-test-util.h"

namespace zv_plugin_test
{

const std::string kReset = "<reset>"; // answer: close the connection with a TCP reset
const std::string kHang = "<hang>";   // answer: say nothing until the server is destroyed

inline std::string http_answer(const std::string &status, const std::string &headers = "",
                               const std::string &body = "")
{
    return "HTTP/1.1 " + status + "\r\n" + headers +
           "Content-Length: " + std::to_string(body.size()) + "\r\n\r\n" + body;
}

class LoopbackServer
{
  public:
    using Responder = std::function<std::string(const std::string &request)>;

    explicit LoopbackServer(Responder responder) : responder_(std::move(responder))
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
    // Gives every request the same answer.
    explicit LoopbackServer(const std::string &answer)
        : LoopbackServer([answer](const std::string &) { return answer; })
    {
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

    int port() const { return port_; }
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
            std::string answer = responder_(request);
            if (answer == kReset) {
                linger lg{1, 0};
                setsockopt(fd, SOL_SOCKET, SO_LINGER, &lg, sizeof lg);
                break;
            }
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
            if (request.find(" HTTP/1.0\r\n") < request.find("\r\n\r\n"))
                break; // a client of HTTP/1.0 reads the answer until the connection closes
        }
        close(fd);
    }

    void record(const std::string &raw)
    {
        std::lock_guard<std::mutex> lock(m_);
        requests_.push_back(raw);
    }

    Responder responder_;
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

} // namespace zv_plugin_test
