// Tests of the network state monitor on real key files and inotify watches: the keys are
// changed by another process, and the callbacks are awaited on the main loop.
#include "zv-ext-network.h"

#include <gtest/gtest.h>
#include <stdlib.h>
#include <unistd.h>
#include <vconf.h>

#include <tuple>

#include "zv-test-util.h"

namespace
{

zv_test::LogFile g_log;
int g_context;       // the user data handed to the watchers
std::string g_calls; // the callbacks' calls in order, one a line

void record(const std::string &call, void *userp)
{
    EXPECT_EQ(userp, &g_context);
    g_calls += call + "\n";
}
auto onoff_cb = [](int state, void *userp) { record("onoff " + std::to_string(state), userp); };
auto status_cb = [](int type, void *userp) { record("status " + std::to_string(type), userp); };
auto config_cb = [](char *ip, char *proxy, void *userp) {
    record(std::string("config ") + (ip ? ip : "-") + " " + (proxy ? proxy : "-"), userp);
    free(ip);
    free(proxy);
};

// Sets an int key from another process and waits until a watcher has logged line (it logs
// before it calls back) and the calls are as long as the expected ones: the calls made.
std::string set_key(const char *key, int value, const char *line, const std::string &calls = "")
{
    g_calls.clear();
    g_log.mark();
    const std::string tool = zv_test::bin_path("zv-vconf");
    EXPECT_EQ(zv_test::run_program({tool, "set", "-t", "int", key, std::to_string(value)}), 0);
    auto called = [&] { return g_log.logged(line) && g_calls.size() >= calls.size(); };
    EXPECT_TRUE(zv_test::wait_for(called)) << key << "=" << value;
    return g_calls;
}

// Key changes reach the callbacks until deregistration; a registration made again works.
// The status check and the getters read the keys.
TEST(NetworkTest, KeysReachTheCallbacksAndTheGetters)
{
    zv_test::TempDir dir;
    ASSERT_EQ(vconf_set_str(VCONFKEY_NETWORK_IP, "10.1.2.3"), VCONF_OK);
    ASSERT_EQ(vconf_set_str(VCONFKEY_NETWORK_PROXY, "http://proxy.test:3128"), VCONF_OK);
    EXPECT_EQ(zv_ext_network_register(nullptr, onoff_cb, status_cb, config_cb), 0);
    ASSERT_EQ(zv_ext_network_register(&g_context, onoff_cb, status_cb, config_cb), 1);

    const std::string config = "config 10.1.2.3 http://proxy.test:3128\n";
    const char *status = VCONFKEY_NETWORK_STATUS,
               *onoff = VCONFKEY_NETWORK_CONFIGURATION_CHANGE_IND;
    // Key, value, the watcher's line, what the callback is handed, what the check answers.
    for (auto [key, value, line, handed, usable] :
         {std::tuple{status, 2, "NETWORK_WIFI", 1, 1},
          {status, 1, "NETWORK_CELLULAR", 2, 1},
          {status, 0, "_zv_ext_network_network_status_cb", 0, 0},
          {status, 3, "NETWORK_UNKNOWN", 0, 0},
          {onoff, 1, "VCONFKEY_NETWORK_ON", 1, 0},
          {onoff, 0, "VCONFKEY_NETWORK_CLOSE", 0, 0},
          {onoff, 5, "NETWORK_UNKNOWN", 0, 0}}) {
        // The on/off key is also the configuration key: its watchers both call back.
        const std::string calls = (key == status ? "status " : "onoff ") + std::to_string(handed) +
                                  "\n" + (key == status ? "" : config);
        EXPECT_EQ(set_key(key, value, line, calls), calls) << line;
        EXPECT_EQ(zv_ext_network_check(), usable) << line;
    }

    EXPECT_EQ(zv_ext_network_deregister(), 1);
    EXPECT_EQ(set_key(status, 2, "NETWORK_WIFI"), "");
    ASSERT_EQ(zv_ext_network_register(&g_context, onoff_cb, status_cb, config_cb), 1);
    EXPECT_EQ(set_key(status, 1, "NETWORK_CELLULAR", "status 2\n"), "status 2\n");

    char *ip = zv_ext_network_get_ip();
    EXPECT_STREQ(ip, "10.1.2.3");
    free(ip);
    ASSERT_TRUE(zv_test::write_file(dir.file("run/vconf/" VCONFKEY_NETWORK_STATUS), "wifi\n"));
    EXPECT_EQ(zv_ext_network_check(), 0);
    unlink(dir.file("run/vconf/" VCONFKEY_NETWORK_PROXY).c_str());
    EXPECT_EQ(zv_ext_network_get_proxy(), nullptr);
}

} // namespace
