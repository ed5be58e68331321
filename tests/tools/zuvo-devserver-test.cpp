// Tests of zuvo-devserver's command line, its refusals of a wrong key and of a misplaced range,
// and faults set by an admin request. What the service's requests meet there (tokens,
// resumable uploads, status queries, throttled and cut bodies, the request log) is checked
// where the client and the service talk to it.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "zv-test-server.h"

namespace
{

using zv_test::http;
using zv_test::Reply;

// Wrong calls exit with status 2. A wrong API key is refused; the token the token endpoint
// hands out is accepted beside the one given; a data upload whose range does not start at the
// bytes held is refused. (The service's tests lean on these refusals to see a wrong key or a
// resent byte.) A fault rule in JSON form acts on its nth request from now; a rule that lacks a
// value is refused with what it lacks; the rules are cleared. (Rules in query form, their
// counts and their actions: the client's and the service's fault tests.) The server ends with
// status 0 at SIGTERM.
TEST(DevServerTest, WrongCallsKeysRangesAndFaultsSetByAdminRequest)
{
    zv_test::TempDir dir(false);
    const std::string bin = zv_test::bin_path("zuvo-devserver");
    const std::string storage = "--storage " + dir.path() + " ";
    // No storage, an unknown option, a port out of range, a missing value, https without a key,
    // a stray argument, an unknown fault action.
    EXPECT_EQ(
        zv_test::wrong_calls(bin, {"", storage + "--bogus", storage + "--port 70000",
                                   storage + "--port", storage + "--tls-cert x.pem",
                                   storage + "extra", storage + "--fault kind=data,action=fly"}),
        "");

    zv_test::DevServer server;
    ASSERT_TRUE(server.start(dir.path(), {"--token", "T1", "--api-key", "K1"}));
    auto meta = [&](const std::string &token = "T1", const std::string &key = "K1") {
        return http("POST", server.url("/resumable/feeds/api/users/default/uploads"),
                    {"Content-Type: application/atom+xml; charset=UTF-8", "ZvData-Version: 2",
                     "Authorization: Bearer " + token, "X-ZvData-Key: key=" + key,
                     "Slug: clip.mp4"},
                    "<?xml version=\"1.0\"?>\r\n<entry/>");
    };
    auto put = [](const std::string &url, const std::string &range, size_t bytes) {
        return http("PUT", url, {"Content-Range: " + range}, std::string(bytes, 'v')).status;
    };
    EXPECT_EQ(meta("T1", "wrong").status, 403);
    EXPECT_EQ(meta("zv-dev-access-token").status, 201);
    std::string url = meta().header("Location");
    EXPECT_EQ(put(url, "bytes 0-2999/5000", 3000), 308);
    EXPECT_EQ(put(url, "bytes 2000-4999/5000", 3000), 416);
    EXPECT_EQ(put(url, "bytes 3000-4999/5000", 2000), 201);

    ASSERT_EQ(http("POST", server.url("/_admin/fault"), {"Content-Type: application/json"},
                   "{\"kind\": \"meta\", \"action\": \"nolocation\", \"nth\": 2}")
                  .status,
              201);
    Reply one = meta(), two = meta();
    EXPECT_NE(one.header("Location"), "");
    EXPECT_EQ(two.status, 201);
    EXPECT_EQ(two.header("Location"), "");
    Reply bad = http("POST", server.url("/_admin/fault?kind=data&action=cut"));
    EXPECT_EQ(bad.status, 400);
    EXPECT_NE(bad.body.find("bytes"), std::string::npos);
    EXPECT_TRUE(server.clear_faults());
    EXPECT_EQ(http("GET", server.url("/_admin/faults")).body, "[]\n");
    EXPECT_EQ(server.stop(), 0);
}

} // namespace
