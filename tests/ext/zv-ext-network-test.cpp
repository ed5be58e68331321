// Tests of the network state monitor on real key files and inotify watches: the keys are
// changed by another process, and the callbacks are awaited on the main loop.
#include "zv-ext-network.h"

#include <gtest/gtest.h>
#include <stdlib.h>
#include <unistd.h>
#include <vconf.h>

#include <memory>
#include <string>

#include "zv-test-util.h"

namespace
{

using zv_test::wait_for;

zv_test::LogFile g_log;
int g_context;       // the user data handed to the watchers
std::string g_calls; // the callbacks' calls in order, one a line

void onoff_cb(int state, void *userp)
{
    EXPECT_EQ(userp, &g_context);
    g_calls += "onoff " + std::to_string(state) + "\n";
}

void status_cb(int type, void *userp)
{
    EXPECT_EQ(userp, &g_context);
    g_calls += "status " + std::to_string(type) + "\n";
}

void config_cb(char *ip, char *proxy, void *userp)
{
    EXPECT_EQ(userp, &g_context);
    g_calls += std::string("config ") + (ip ? ip : "-") + " " + (proxy ? proxy : "-") + "\n";
    free(ip);
    free(proxy);
}

// Sets an int key from another process and waits until a watcher has logged line (it logs
// before it calls back) and the calls are as long as the expected ones: the calls made.
std::string set_key(const char *key, int value, const char *line, const std::string &calls = "")
{
    g_calls.clear();
    g_log.mark();
    EXPECT_EQ(zv_test::run_program(
                  {zv_test::bin_path("zv-vconf"), "set", "-t", "int", key, std::to_string(value)}),
              0);
    EXPECT_TRUE(wait_for([&] { return g_log.logged(line) && g_calls.size() >= calls.size(); }))
        << key << "=" << value;
    return g_calls;
}

// Watches last for the process: one registration, deregistered and made again.
TEST(NetworkTest, KeyChangesReachTheCallbacksUntilDeregistration)
{
    zv_test::TempDir dir;
    ASSERT_EQ(vconf_set_int(VCONFKEY_NETWORK_STATUS, 0), VCONF_OK);
    ASSERT_EQ(vconf_set_int(VCONFKEY_NETWORK_CONFIGURATION_CHANGE_IND, 0), VCONF_OK);
    ASSERT_EQ(vconf_set_str(VCONFKEY_NETWORK_IP, "10.1.2.3"), VCONF_OK);
    ASSERT_EQ(vconf_set_str(VCONFKEY_NETWORK_PROXY, "http://proxy.test:3128"), VCONF_OK);
    EXPECT_EQ(zv_ext_network_register(nullptr, onoff_cb, status_cb, config_cb), 0);
    EXPECT_TRUE(g_log.logged("userp is NULL"));
    ASSERT_EQ(zv_ext_network_register(&g_context, onoff_cb, status_cb, config_cb), 1);

    const std::string config = "config 10.1.2.3 http://proxy.test:3128\n";
    auto status = [](int type) { return "status " + std::to_string(type) + "\n"; };
    struct Case {
        const char *key;
        int value;
        const char *log; // the watcher's line
        std::string calls;
    };
    const Case cases[] = {
        {VCONFKEY_NETWORK_STATUS, 2, "NETWORK_WIFI", status(ZV_NETWORK_TYPE_WIFI)},
        {VCONFKEY_NETWORK_STATUS, 1, "NETWORK_CELLULAR", status(ZV_NETWORK_TYPE_CELLULAR)},
        {VCONFKEY_NETWORK_STATUS, 0, "_zv_ext_network_network_status_cb",
         status(ZV_NETWORK_TYPE_NONE)},
        {VCONFKEY_NETWORK_STATUS, 3, "NETWORK_UNKNOWN", status(ZV_NETWORK_TYPE_NONE)},
        {VCONFKEY_NETWORK_CONFIGURATION_CHANGE_IND, 1, "VCONFKEY_NETWORK_ON", "onoff 1\n" + config},
        {VCONFKEY_NETWORK_CONFIGURATION_CHANGE_IND, 0, "VCONFKEY_NETWORK_CLOSE",
         "onoff 0\n" + config},
        {VCONFKEY_NETWORK_CONFIGURATION_CHANGE_IND, 5, "NETWORK_UNKNOWN", "onoff 0\n" + config},
    };
    for (const Case &c : cases)
        EXPECT_EQ(set_key(c.key, c.value, c.log, c.calls), c.calls) << c.log;

    EXPECT_EQ(zv_ext_network_deregister(), 1);
    EXPECT_EQ(set_key(VCONFKEY_NETWORK_STATUS, 2, "NETWORK_WIFI"), "");
    ASSERT_EQ(zv_ext_network_register(&g_context, onoff_cb, status_cb, config_cb), 1);
    EXPECT_EQ(set_key(VCONFKEY_NETWORK_STATUS, 1, "NETWORK_CELLULAR", status(1)),
              status(ZV_NETWORK_TYPE_CELLULAR));
    zv_ext_network_deregister();
}

TEST(NetworkTest, CheckAndGettersReadTheKeys)
{
    zv_test::TempDir dir;
    ASSERT_EQ(vconf_set_str(VCONFKEY_NETWORK_IP, "192.168.7.9"), VCONF_OK);
    const std::string status_file = dir.file("run/vconf/" VCONFKEY_NETWORK_STATUS);
    struct Case {
        const char *text; // nullptr: no key file
        int usable;
    };
    const Case cases[] = {{"1\n", 1}, {"2\n", 1},    {"0\n", 0},
                          {"9\n", 0}, {"wifi\n", 0}, {nullptr, 0}};
    for (const Case &c : cases) {
        SCOPED_TRACE(c.text ? c.text : "missing");
        if (c.text)
            ASSERT_TRUE(zv_test::write_file(status_file, c.text));
        else
            unlink(status_file.c_str());
        EXPECT_EQ(zv_ext_network_check(), c.usable);
    }
    std::unique_ptr<char, decltype(&free)> ip(zv_ext_network_get_ip(), free);
    EXPECT_STREQ(ip.get(), "192.168.7.9");
    unlink(dir.file("run/vconf/" VCONFKEY_NETWORK_PROXY).c_str());
    EXPECT_EQ(zv_ext_network_get_proxy(), nullptr);
}

} // namespace
