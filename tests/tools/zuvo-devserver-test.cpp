// Tests of zuvo-devserver's command line, its checks of token and key, counting without
// storing, and faults set by an admin request. What the service's requests meet there
// (resumable uploads, status queries, cuts, the request log) is checked where the client and
// the service talk to it.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "zv-test-server.h"

namespace {

using zv_test::http;
using zv_test::Reply;

std::string pattern(size_t n)
{
    std::string s(n, '\0');
    for (size_t i = 0; i < n; i++)
        s[i] = static_cast<char>((i * 131 + i / 977) & 0xFF);
    return s;
}

// A running zuvo-devserver that ends with status 0 at SIGTERM.
class DevServerTest : public ::testing::Test {
protected:
    void start(const std::vector<std::string> &args = {})
    {
        ASSERT_TRUE(server_.start(dir_.path(), args));
    }
    void TearDown() override { EXPECT_EQ(server_.stop(), 0); }

    Reply meta(const std::string &token = "T1", const std::string &key = "K1")
    {
        return http("POST", server_.url("/resumable/feeds/api/users/default/uploads"),
                    {"Content-Type: application/atom+xml; charset=UTF-8", "ZvData-Version: 2",
                     "Authorization: Bearer " + token, "X-ZvData-Key: key=" + key,
                     "Slug: clip.mp4"},
                    "<?xml version=\"1.0\"?>\r\n<entry/>");
    }
    Reply put(const std::string &url, const std::string &range, const std::string &body)
    {
        return http("PUT", url, {"Content-Range: " + range}, body);
    }

    zv_test::TempDir dir_{false};
    zv_test::DevServer server_;
};

TEST(DevServerArgs, WrongCallsExitWithStatusTwo)
{
    zv_test::TempDir dir(false);
    const std::string bin = zv_test::bin_path("zuvo-devserver");
    const std::vector<std::vector<std::string>> calls = {
        {bin},                                                             // no --storage
        {bin, "--storage", dir.path(), "--bogus"},                         // unknown option
        {bin, "--storage", dir.path(), "--port", "70000"},                 // port out of range
        {bin, "--storage", dir.path(), "--port"},                          // missing value
        {bin, "--storage", dir.path(), "--tls-cert", "x.pem"},             // https without a key
        {bin, "--storage", dir.path(), "extra"},                           // stray argument
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
    EXPECT_EQ(ok.header("Location").rfind(server_.url("/resumable/uploads/"), 0), 0u) << ok.headers;
    EXPECT_EQ(meta("stranger").status, 401);
    EXPECT_EQ(meta("T1", "wrong").status, 403);
    // The token the token endpoint hands out is accepted as well.
    EXPECT_EQ(meta("zv-dev-access-token").status, 201);
}

TEST_F(DevServerTest, DiscardDataCountsBytesWithoutStoringThem)
{
    start({"--discard-data"});
    std::string url = meta().header("Location");
    EXPECT_EQ(put(url, "bytes 0-2999/5000", pattern(3000)).status, 308);
    EXPECT_EQ(put(url, "bytes 2000-4999/5000", pattern(3000)).status, 416);
    EXPECT_EQ(put(url, "bytes 3000-4999/5000", pattern(2000)).status, 201);
    std::string id = url.substr(url.rfind('/') + 1);
    EXPECT_EQ(server_.stored(id), "");
    std::string listing = http("GET", server_.url("/_admin/uploads/" + id)).body;
    EXPECT_NE(listing.find("\"total\":5000,\"held\":5000,\"complete\":true"), std::string::npos)
        << listing;
}

TEST_F(DevServerTest, FaultsByAdminRequest)
{
    start();
    // The second metadata upload from now is answered 500, the third has no Location.
    ASSERT_TRUE(server_.add_fault("kind=meta&action=status&status=500&nth=2"));
    ASSERT_EQ(http("POST", server_.url("/_admin/fault"), {"Content-Type: application/json"},
                   "{\"kind\": \"meta\", \"action\": \"nolocation\", \"nth\": 3}")
                  .status,
              201);
    Reply one = meta(), two = meta(), three = meta(), four = meta();
    EXPECT_EQ(one.status, 201);
    EXPECT_NE(one.header("Location"), "");
    EXPECT_EQ(two.status, 500);
    EXPECT_EQ(three.status, 201);
    EXPECT_EQ(three.header("Location"), "");
    EXPECT_NE(four.header("Location"), "");

    // A throttled PUT still stores every byte.
    std::string url = four.header("Location");
    ASSERT_TRUE(server_.add_fault("kind=data&action=throttle&rate=400000"));
    EXPECT_EQ(put(url, "bytes 0-39999/40000", pattern(40000)).status, 201);
    EXPECT_EQ(server_.stored(url.substr(url.rfind('/') + 1)), pattern(40000));

    Reply bad = http("POST", server_.url("/_admin/fault?kind=data&action=cut"));
    EXPECT_EQ(bad.status, 400);
    EXPECT_NE(bad.body.find("bytes"), std::string::npos);
    std::string rules = http("GET", server_.url("/_admin/faults")).body;
    EXPECT_NE(
        rules.find(
            "\"action\":\"status\",\"nth\":2,\"times\":1,\"status\":500,\"seen\":4,\"fired\":1"),
        std::string::npos)
        << rules;
    EXPECT_TRUE(server_.clear_faults());
    EXPECT_EQ(http("GET", server_.url("/_admin/faults")).body, "[]\n");
}

} // namespace
