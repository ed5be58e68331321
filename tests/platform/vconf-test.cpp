// Platform keys: the key files, their reading rules, atomic writes, watches that see changes
// made by another process, and the zv-vconf tool.
#include "vconf.h"

#include <dirent.h>
#include <gtest/gtest.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>

#include <algorithm>
#include <string>
#include <vector>

#include "zv-test-util.h"

using namespace zv_test;

namespace {

struct Seen {
    std::vector<std::string> names;
    std::vector<int> types;
    std::vector<std::string> texts;
    int last_int = 0;
};

void record_cb(keynode_t *node, void *user_data)
{
    auto *seen = static_cast<Seen *>(user_data);
    seen->names.push_back(vconf_keynode_get_name(node));
    seen->types.push_back(vconf_keynode_get_type(node));
    seen->texts.push_back(vconf_keynode_get_str(node));
    seen->last_int = vconf_keynode_get_int(node);
}

void other_cb(keynode_t *, void *user_data)
{
    ++*static_cast<int *>(user_data);
}

std::vector<std::string> dir_entries(const std::string &path)
{
    std::vector<std::string> names;
    DIR *d = opendir(path.c_str());
    if (!d)
        return names;
    while (struct dirent *e = readdir(d))
        if (e->d_name[0] != '.' || (strcmp(e->d_name, ".") && strcmp(e->d_name, "..")))
            names.push_back(e->d_name);
    closedir(d);
    return names;
}

} // namespace

TEST(Vconf, ValuesRoundTripThroughKeyFiles)
{
    TempDir tmp;
    ASSERT_EQ(vconf_set_int(VCONFKEY_NETWORK_STATUS, 2), VCONF_OK);
    ASSERT_EQ(vconf_set_str(VCONFKEY_NETWORK_PROXY, "proxy:3128"), VCONF_OK);
    EXPECT_EQ(read_file(tmp.file("run/vconf/memory/dnet/status")), "2\n");
    int v = 0;
    EXPECT_EQ(vconf_get_int(VCONFKEY_NETWORK_STATUS, &v), VCONF_OK);
    EXPECT_EQ(v, 2);
    char *s = vconf_get_str(VCONFKEY_NETWORK_PROXY);
    EXPECT_STREQ(s, "proxy:3128");
    free(s);
    // Only the key files are left behind, no temporary files.
    EXPECT_EQ(dir_entries(tmp.file("run/vconf/memory/dnet")).size(), 2u);
    // An empty string is a value too, and a value may end with a newline of its own.
    ASSERT_EQ(vconf_set_str("db/empty", ""), VCONF_OK);
    s = vconf_get_str("db/empty");
    EXPECT_STREQ(s, "");
    free(s);
    ASSERT_EQ(vconf_set_str("db/nl", "a\n"), VCONF_OK);
    s = vconf_get_str("db/nl");
    EXPECT_STREQ(s, "a\n");
    free(s);
}

TEST(Vconf, ReadingRules)
{
    TempDir tmp;
    ASSERT_EQ(vconf_set_str("k/seed", "x"), VCONF_OK);
    const struct {
        const char *content;
        bool int_ok;
        int int_value;
        const char *text;
    } cases[] = {
        {"5\n", true, 5, "5"},   // one trailing newline is ignored
        {"-7", true, -7, "-7"},  // no newline at all
        {"12\n\n", false, 0, "12\n"},
        {"abc", false, 0, "abc"},
        {"3x", false, 0, "3x"},
        {"", false, 0, ""},
        {"99999999999", false, 0, "99999999999"},
    };
    for (const auto &c : cases) {
        write_file(tmp.file("run/vconf/k/v"), c.content);
        int v = 0;
        EXPECT_EQ(vconf_get_int("k/v", &v) == VCONF_OK, c.int_ok) << c.content;
        if (c.int_ok) {
            EXPECT_EQ(v, c.int_value);
        }
        char *s = vconf_get_str("k/v");
        EXPECT_STREQ(s, c.text);
        free(s);
    }
    int v = 0;
    EXPECT_EQ(vconf_get_int("k/missing", &v), VCONF_ERROR);
    EXPECT_EQ(vconf_get_str("k/missing"), nullptr);
    for (const char *bad : {"", "/abs", "a/../b", "a//b", ".hidden", "a/.b"}) {
        EXPECT_EQ(vconf_set_int(bad, 1), VCONF_ERROR) << bad;
        EXPECT_EQ(zv_vconf_key_valid(bad), 0) << bad;
    }
}

TEST(Vconf, WatchSeesChangesOfAnotherProcess)
{
    TempDir tmp;
    Seen seen;
    int other = 0;
    ASSERT_EQ(vconf_notify_key_changed(VCONFKEY_NETWORK_STATUS, record_cb, &seen), VCONF_OK);
    ASSERT_EQ(vconf_notify_key_changed(VCONFKEY_NETWORK_IP, other_cb, &other), VCONF_OK);

    ASSERT_EQ(run_program({bin_path("zv-vconf"), "set", "-t", "int", VCONFKEY_NETWORK_STATUS, "1"}),
              0);
    ASSERT_TRUE(wait_for([&] { return seen.names.size() == 1; }));
    EXPECT_EQ(seen.names[0], VCONFKEY_NETWORK_STATUS);
    EXPECT_EQ(seen.types[0], VCONF_TYPE_INT);
    EXPECT_EQ(seen.last_int, 1);

    // A plain rewrite in place is seen too, and a string node answers no int.
    write_file(tmp.file("run/vconf/memory/dnet/status"), "off\n");
    ASSERT_TRUE(wait_for([&] { return seen.names.size() == 2; }));
    EXPECT_EQ(seen.types[1], VCONF_TYPE_STRING);
    EXPECT_EQ(seen.texts[1], "off");
    EXPECT_EQ(seen.last_int, VCONF_ERROR);
    EXPECT_EQ(other, 0);

    // After ignore, changes no longer arrive; the other key's watch stays.
    ASSERT_EQ(vconf_ignore_key_changed(VCONFKEY_NETWORK_STATUS, record_cb), VCONF_OK);
    EXPECT_EQ(vconf_ignore_key_changed(VCONFKEY_NETWORK_STATUS, record_cb), VCONF_ERROR);
    ASSERT_EQ(vconf_set_int(VCONFKEY_NETWORK_STATUS, 2), VCONF_OK);
    ASSERT_EQ(
        run_program({bin_path("zv-vconf"), "set", "-t", "string", VCONFKEY_NETWORK_IP, "10.0.0.2"}),
        0);
    ASSERT_TRUE(wait_for([&] { return other == 1; }));
    EXPECT_EQ(seen.names.size(), 2u);
    vconf_ignore_key_changed(VCONFKEY_NETWORK_IP, other_cb);
}

TEST(VconfTool, GetSetAndWrongCalls)
{
    TempDir tmp;
    std::string tool = bin_path("zv-vconf");
    std::string out;
    ASSERT_EQ(run_program({tool, "set", "-t", "string", "memory/dnet/ip", "a b=c"}), 0);
    ASSERT_EQ(run_program({tool, "get", "memory/dnet/ip"}, "", &out), 0);
    EXPECT_EQ(out, "a b=c\n");
    EXPECT_EQ(run_program({tool, "get", "memory/dnet/none"}), 1);
    const std::vector<std::vector<std::string>> wrong = {
        {},
        {"get"},
        {"get", "a", "b"},
        {"set", "-t", "int", "k", "x"},
        {"set", "-t", "float", "k", "1"},
        {"set", "k", "1"},
        {"set", "-t", "int", "../k", "1"},
        {"del", "k"},
    };
    for (auto args : wrong) {
        std::string cmd = tool;
        for (const auto &a : args)
            cmd += " '" + a + "'";
        EXPECT_EQ(run_program({"/bin/sh", "-c", cmd + " 2>&1"}, "", &out), 2) << cmd;
        EXPECT_EQ(std::count(out.begin(), out.end(), '\n'), 1) << out;
    }
    EXPECT_EQ(run_program({tool, "--help"}, "", &out), 0);
}
