// Platform keys: the key files, their reading rules, atomic writes, a watch on a file
// rewritten in place, and the zv-vconf tool.
#include "vconf.h"

#include <gtest/gtest.h>
#include <stdlib.h>

#include <algorithm>
#include <filesystem>
#include <string>

#include "zv-test-util.h"

using namespace zv_test;

namespace
{

// The value read as an int ("-" when it is none) and as a string ("-" when missing).
std::string read_key(const char *key)
{
    int v = 0;
    std::string out = vconf_get_int(key, &v) == VCONF_OK ? std::to_string(v) : "-";
    char *s = vconf_get_str(key);
    out += std::string(" ") + (s ? s : "-");
    free(s);
    return out;
}

// Each event of a watch: "name type int text".
void record_cb(keynode_t *node, void *user_data)
{
    *static_cast<std::string *>(user_data) += std::string(vconf_keynode_get_name(node)) + " " +
                                              std::to_string(vconf_keynode_get_type(node)) + " " +
                                              std::to_string(vconf_keynode_get_int(node)) + " " +
                                              vconf_keynode_get_str(node) + "\n";
}

} // namespace

TEST(Vconf, KeyFilesReadingRulesWatchAndTool)
{
    TempDir tmp;
    ASSERT_EQ(vconf_set_int(VCONFKEY_NETWORK_STATUS, 2), VCONF_OK);
    ASSERT_EQ(vconf_set_str(VCONFKEY_NETWORK_PROXY, "proxy:3128"), VCONF_OK);
    EXPECT_EQ(read_file(tmp.file("run/vconf/memory/dnet/status")), "2\n");
    EXPECT_EQ(read_key(VCONFKEY_NETWORK_STATUS), "2 2");
    EXPECT_EQ(read_key(VCONFKEY_NETWORK_PROXY), "- proxy:3128");
    // Only the key files are left behind, no temporary files.
    auto files = std::filesystem::directory_iterator(tmp.file("run/vconf/memory/dnet"));
    EXPECT_EQ(std::distance(files, {}), 2);
    // An empty string is a value too, and a value may end with a newline of its own.
    ASSERT_EQ(vconf_set_str("db/empty", ""), VCONF_OK);
    EXPECT_EQ(read_key("db/empty"), "- ");
    ASSERT_EQ(vconf_set_str("db/nl", "a\n"), VCONF_OK);
    EXPECT_EQ(read_key("db/nl"), "- a\n");
    EXPECT_EQ(read_key("k/missing"), "- -");

    const char *cases[][2] = {
        {"5\n", "5 5"},  // one trailing newline is ignored
        {"-7", "-7 -7"}, // no newline at all
        {"12\n\n", "- 12\n"},
        {"", "- "}, // an empty file, not even a newline
        {"99999999999", "- 99999999999"},
    };
    for (const auto &c : cases) {
        ASSERT_TRUE(write_file(tmp.file("run/vconf/db/nl"), c[0]));
        EXPECT_EQ(read_key("db/nl"), c[1]) << c[0];
    }
    for (const char *bad : {"", "/abs", "a/../b", "a//b", ".hidden", "a/.b"})
        EXPECT_EQ(vconf_set_int(bad, 1), VCONF_ERROR) << bad;

    // A plain rewrite in place is seen by a watch, and a string node answers no int; a
    // watch is ignored once. (Changes by this process and by the tool reaching the watches
    // until they are ignored: the network tests of the service's keys and its e2e tests.)
    std::string seen;
    ASSERT_EQ(vconf_notify_key_changed(VCONFKEY_NETWORK_STATUS, record_cb, &seen), VCONF_OK);
    write_file(tmp.file("run/vconf/memory/dnet/status"), "off\n");
    const std::string off = "memory/dnet/status " + std::to_string(VCONF_TYPE_STRING) + " " +
                            std::to_string(VCONF_ERROR) + " off\n";
    EXPECT_TRUE(wait_for([&] { return seen == off; })) << seen;
    EXPECT_EQ(vconf_ignore_key_changed(VCONFKEY_NETWORK_STATUS, record_cb), VCONF_OK);
    EXPECT_EQ(vconf_ignore_key_changed(VCONFKEY_NETWORK_STATUS, record_cb), VCONF_ERROR);

    // The tool (its set is the end-to-end tests' way to the keys).
    std::string tool = bin_path("zv-vconf");
    std::string out;
    ASSERT_EQ(run_program({tool, "set", "-t", "string", "memory/dnet/ip", "a b=c"}), 0);
    ASSERT_EQ(run_program({tool, "get", "memory/dnet/ip"}, "", &out), 0);
    EXPECT_EQ(out, "a b=c\n");
    EXPECT_EQ(run_program({tool, "get", "memory/dnet/none"}), 1);
    EXPECT_EQ(wrong_calls(tool, {"", "get", "get a b", "set -t int k x", "set -t float k 1",
                                 "set k 1", "set -t int ../k 1", "del k"}),
              "");
}
