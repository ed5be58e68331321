// Tests of zuvo-devserver: the built program is started on a free port with its storage and
// request log in a temporary folder, and spoken to with libcurl. What the service's requests
// meet (resumable uploads, status queries, cuts, oversized answers, the request log, account
// and category answers) is checked where the client and the service talk to it; here: its
// command line, its checks of token and key, counting without storing, and faults set by
// an admin request.
#include <curl/curl.h>
#include <glib.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstring>
#include <string>
#include <vector>

#include "zv-test-util.h"

namespace {

struct Reply {
    CURLcode code = CURLE_OK;
    long status = 0;
    std::string headers;
    std::string body;
};

size_t collect(char *data, size_t size, size_t n, void *out)
{
    static_cast<std::string *>(out)->append(data, size * n);
    return size * n;
}

struct Upload {
    const std::string *data;
    size_t off;
};

size_t feed(char *buf, size_t size, size_t n, void *p)
{
    auto *u = static_cast<Upload *>(p);
    size_t len = std::min(size * n, u->data->size() - u->off);
    memcpy(buf, u->data->data() + u->off, len);
    u->off += len;
    return len;
}

// One request; a PUT sends body as its upload, another method with a body posts it.
Reply request(const std::string &method, const std::string &url, const std::vector<std::string> &headers = {},
              const std::string &body = "")
{
    Reply r;
    CURL *c = curl_easy_init();
    curl_slist *list = curl_slist_append(nullptr, "Expect:");
    for (const auto &h : headers)
        list = curl_slist_append(list, h.c_str());
    Upload up{&body, 0};
    curl_easy_setopt(c, CURLOPT_URL, url.c_str());
    curl_easy_setopt(c, CURLOPT_HTTPHEADER, list);
    curl_easy_setopt(c, CURLOPT_TIMEOUT, 60L);
    curl_easy_setopt(c, CURLOPT_WRITEFUNCTION, collect);
    curl_easy_setopt(c, CURLOPT_WRITEDATA, &r.body);
    curl_easy_setopt(c, CURLOPT_HEADERFUNCTION, collect);
    curl_easy_setopt(c, CURLOPT_HEADERDATA, &r.headers);
    if (method == "PUT") {
        curl_easy_setopt(c, CURLOPT_UPLOAD, 1L);
        curl_easy_setopt(c, CURLOPT_READFUNCTION, feed);
        curl_easy_setopt(c, CURLOPT_READDATA, &up);
        curl_easy_setopt(c, CURLOPT_INFILESIZE_LARGE, static_cast<curl_off_t>(body.size()));
    } else if (!body.empty() || method == "POST") {
        curl_easy_setopt(c, CURLOPT_POSTFIELDS, body.c_str());
        curl_easy_setopt(c, CURLOPT_POSTFIELDSIZE, static_cast<long>(body.size()));
        curl_easy_setopt(c, CURLOPT_CUSTOMREQUEST, method.c_str());
    } else if (method != "GET") {
        curl_easy_setopt(c, CURLOPT_CUSTOMREQUEST, method.c_str());
    }
    r.code = curl_easy_perform(c);
    curl_easy_getinfo(c, CURLINFO_RESPONSE_CODE, &r.status);
    curl_slist_free_all(list);
    curl_easy_cleanup(c);
    return r;
}

// The value of the first header line "name: value" (exact case), or "" when absent.
std::string header(const Reply &r, const std::string &name)
{
    size_t at = r.headers.find("\r\n" + name + ": ");
    if (at == std::string::npos)
        return "";
    at += name.size() + 4;
    return r.headers.substr(at, r.headers.find("\r\n", at) - at);
}

std::string pattern(size_t n)
{
    std::string s(n, '\0');
    for (size_t i = 0; i < n; i++)
        s[i] = static_cast<char>((i * 131 + i / 977) & 0xFF);
    return s;
}

// A running zuvo-devserver, stopped with SIGTERM when the test ends.
class DevServerTest : public ::testing::Test {
protected:
    void start(std::vector<std::string> extra = {})
    {
        std::vector<std::string> argv = {zv_test::bin_path("zuvo-devserver"), "--port", "0", "--storage",
                                         dir_.file("store"), "--log", log_path()};
        argv.insert(argv.end(), extra.begin(), extra.end());
        int out[2];
        ASSERT_EQ(pipe(out), 0);
        pid_ = fork();
        ASSERT_GE(pid_, 0);
        if (pid_ == 0) {
            dup2(out[1], 1);
            close(out[0]);
            close(out[1]);
            std::vector<char *> args;
            for (auto &a : argv)
                args.push_back(const_cast<char *>(a.c_str()));
            args.push_back(nullptr);
            execv(args[0], args.data());
            _exit(127);
        }
        close(out[1]);
        std::string line;
        char ch;
        while (read(out[0], &ch, 1) == 1 && ch != '\n')
            line += ch;
        close(out[0]);
        ASSERT_EQ(line.rfind("port ", 0), 0u) << line;
        port_ = std::stoi(line.substr(5));
        base_ = "http://127.0.0.1:" + std::to_string(port_);
    }

    void TearDown() override
    {
        if (pid_ <= 0)
            return;
        kill(pid_, SIGTERM);
        int status = 0;
        ASSERT_EQ(waitpid(pid_, &status, 0), pid_);
        EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << status;
    }

    std::string log_path() const { return dir_.file("requests.jsonl"); }

    std::vector<std::string> log_lines() const
    {
        std::vector<std::string> lines;
        std::string text = zv_test::read_file(log_path()), line;
        for (char c : text) {
            if (c == '\n') {
                lines.push_back(line);
                line.clear();
            } else {
                line += c;
            }
        }
        return lines;
    }

    // The log line of the first request whose members include every given fragment.
    std::string find_log(const std::vector<std::string> &fragments) const
    {
        for (const auto &l : log_lines()) {
            bool all = true;
            for (const auto &f : fragments)
                all = all && l.find(f) != std::string::npos;
            if (all)
                return l;
        }
        return "";
    }

    Reply meta(const std::string &token = "T1")
    {
        return request("POST", base_ + "/resumable/feeds/api/users/default/uploads",
                       {"Content-Type: application/atom+xml; charset=UTF-8", "ZvData-Version: 2",
                        "Authorization: Bearer " + token, "X-ZvData-Key: key=K1", "Slug: clip.mp4"},
                       "<?xml version=\"1.0\"?>\r\n<entry/>");
    }

    std::string new_upload()
    {
        Reply r = meta();
        EXPECT_EQ(r.status, 201);
        return header(r, "Location");
    }

    Reply put(const std::string &url, const std::string &range, const std::string &body)
    {
        return request("PUT", url, {"Content-Range: " + range}, body);
    }

    Reply query(const std::string &url) { return put(url, "bytes */*", ""); }

    Reply admin_fault(const std::string &query) { return request("POST", base_ + "/_admin/fault?" + query); }

    zv_test::TempDir dir_{false};
    pid_t pid_ = -1;
    int port_ = 0;
    std::string base_;
};

TEST(DevServerArgs, WrongCallsExitWithStatusTwo)
{
    zv_test::TempDir dir(false);
    const std::string bin = zv_test::bin_path("zuvo-devserver");
    const std::vector<std::vector<std::string>> calls = {
        {bin},                                                        // no --storage
        {bin, "--storage", dir.path(), "--bogus"},                    // unknown option
        {bin, "--storage", dir.path(), "--port", "70000"},            // port out of range
        {bin, "--storage", dir.path(), "--port"},                     // missing value
        {bin, "--storage", dir.path(), "--tls-cert", "x.pem"},        // https without a key
        {bin, "--storage", dir.path(), "extra"},                      // stray argument
        {bin, "--storage", dir.path(), "--fault", "kind=data,action=fly"}, // unknown fault action
    };
    for (const auto &argv : calls)
        EXPECT_EQ(zv_test::run_program(argv), 2) << argv.back();
    std::string help;
    EXPECT_EQ(zv_test::run_program({bin, "--help"}, "", &help), 0);
    EXPECT_NE(help.find("/_admin/fault"), std::string::npos);
    EXPECT_NE(help.find("body_sha256"), std::string::npos);
}

TEST_F(DevServerTest, MetadataUploadChecksTokenAndKeyAndNamesTheAddress)
{
    start({"--token", "T1", "--api-key", "K1"});
    Reply ok = meta();
    EXPECT_EQ(ok.status, 201);
    std::string url = header(ok, "Location");
    EXPECT_EQ(url.rfind(base_ + "/resumable/uploads/", 0), 0u) << ok.headers;
    EXPECT_EQ(meta("stranger").status, 401);
    EXPECT_EQ(request("POST", base_ + "/resumable/feeds/api/users/default/uploads",
                      {"Authorization: Bearer T1", "X-ZvData-Key: key=wrong"}, "<entry/>")
                  .status,
              403);
    // The token the token endpoint hands out is accepted as well.
    EXPECT_EQ(meta("zv-dev-access-token").status, 201);
}

TEST_F(DevServerTest, DiscardDataCountsBytesWithoutStoringThem)
{
    start({"--discard-data"});
    std::string url = new_upload();
    EXPECT_EQ(put(url, "bytes 0-2999/5000", pattern(3000)).status, 308);
    EXPECT_EQ(put(url, "bytes 2000-4999/5000", pattern(3000)).status, 416);
    EXPECT_EQ(put(url, "bytes 3000-4999/5000", pattern(2000)).status, 201);
    std::string id = url.substr(url.rfind('/') + 1);
    EXPECT_EQ(zv_test::read_file(dir_.file("store/" + id + ".data")), "");
    std::string listing = request("GET", base_ + "/_admin/uploads/" + id).body;
    EXPECT_NE(listing.find("\"total\":5000,\"held\":5000,\"complete\":true"), std::string::npos) << listing;
}

TEST_F(DevServerTest, FaultsByAdminRequest)
{
    start();
    // The second metadata upload from now is answered 500, the third has no Location.
    ASSERT_EQ(admin_fault("kind=meta&action=status&status=500&nth=2").status, 201);
    ASSERT_EQ(request("POST", base_ + "/_admin/fault", {"Content-Type: application/json"},
                      "{\"kind\": \"meta\", \"action\": \"nolocation\", \"nth\": 3}")
                  .status,
              201);
    Reply one = meta(), two = meta(), three = meta(), four = meta();
    EXPECT_EQ(one.status, 201);
    EXPECT_NE(header(one, "Location"), "");
    EXPECT_EQ(two.status, 500);
    EXPECT_EQ(three.status, 201);
    EXPECT_EQ(header(three, "Location"), "");
    EXPECT_NE(header(four, "Location"), "");

    // A throttled PUT still stores every byte.
    std::string url = header(four, "Location");
    const std::string data = pattern(40000);
    ASSERT_EQ(admin_fault("kind=data&action=throttle&rate=400000").status, 201);
    EXPECT_EQ(put(url, "bytes 0-39999/40000", data).status, 201);

    Reply bad = admin_fault("kind=data&action=cut");
    EXPECT_EQ(bad.status, 400);
    EXPECT_NE(bad.body.find("bytes"), std::string::npos);
    std::string rules = request("GET", base_ + "/_admin/faults").body;
    EXPECT_NE(rules.find("\"action\":\"status\",\"nth\":2,\"times\":1,\"status\":500,\"seen\":4,\"fired\":1"),
              std::string::npos)
        << rules;
    EXPECT_EQ(request("DELETE", base_ + "/_admin/faults").status, 200);
    EXPECT_EQ(request("GET", base_ + "/_admin/faults").body, "[]\n");
}

} // namespace
