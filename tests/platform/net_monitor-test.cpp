// Tests of the host network monitor: the keys it writes at start, and how it follows route
// changes (in a network namespace of its own, where the test may change the routes).
#include "net_monitor.h"

#include <Ecore.h>
#include <gtest/gtest.h>
#include <sched.h>
#include <stdlib.h>
#include <sys/wait.h>
#include <unistd.h>
#include <vconf.h>

#include <memory>
#include <string>

#include "zv-test-util.h"

namespace
{

TEST(NetMonitorTest, ModeFollowsZvNetwork)
{
    zv_test::TempDir dir;
    EXPECT_FALSE(net_monitor_wanted());
    setenv("ZV_NETWORK", "host", 1);
    EXPECT_TRUE(net_monitor_wanted());
    unsetenv("ZV_NETWORK");
    EXPECT_TRUE(net_monitor_wanted());
}

TEST(NetMonitorTest, StartWritesTheHostNetworkIntoTheKeys)
{
    zv_test::TempDir dir;
    setenv("ZV_NETWORK", "host", 1);
    setenv("http_proxy", "http://proxy.test:3128", 1);
    ASSERT_EQ(net_monitor_start(), 0);
    EXPECT_EQ(net_monitor_start(), 0);

    int status = -1, config = -1;
    ASSERT_EQ(vconf_get_int(VCONFKEY_NETWORK_STATUS, &status), VCONF_OK);
    ASSERT_EQ(vconf_get_int(VCONFKEY_NETWORK_CONFIGURATION_CHANGE_IND, &config), VCONF_OK);
    EXPECT_TRUE(status == VCONFKEY_NETWORK_OFF || status == VCONFKEY_NETWORK_WIFI) << status;
    EXPECT_EQ(config, status == VCONFKEY_NETWORK_WIFI ? 1 : 0);
    std::unique_ptr<char, decltype(&free)> proxy(vconf_get_str(VCONFKEY_NETWORK_PROXY), free);
    ASSERT_TRUE(proxy);
    EXPECT_STREQ(proxy.get(), "http://proxy.test:3128");
    std::unique_ptr<char, decltype(&free)> ip(vconf_get_str(VCONFKEY_NETWORK_IP), free);
    ASSERT_TRUE(ip);
    if (status == VCONFKEY_NETWORK_OFF) {
        EXPECT_STREQ(ip.get(), "");
    }

    net_monitor_stop();
    unsetenv("http_proxy");
    setenv("ZV_NETWORK", "keys", 1);
}

// Runs in a child process with a fresh network namespace; its exit status tells the parent
// what happened (kSkip: no namespace or no "ip" here).
const int kSkip = 77;

int follow_routes_in_own_namespace()
{
    ecore_fork_reset();
    // As root a network namespace of its own; otherwise inside a user namespace of its own,
    // where the machine allows one.
    if (unshare(CLONE_NEWNET) != 0 && unshare(CLONE_NEWUSER | CLONE_NEWNET) != 0)
        return kSkip;
    unsetenv("http_proxy");
    setenv("ZV_NETWORK", "host", 1);
    auto status_is = [](int want) {
        int status = -1;
        return vconf_get_int(VCONFKEY_NETWORK_STATUS, &status) == VCONF_OK && status == want;
    };
    if (net_monitor_start() != 0)
        return 1;
    if (!status_is(VCONFKEY_NETWORK_OFF))
        return 2;
    if (system("ip link set lo up && ip route add default dev lo") != 0)
        return kSkip;
    if (!zv_test::wait_for([&] { return status_is(VCONFKEY_NETWORK_WIFI); }, 10000))
        return 3;
    int config = 0;
    char *ip = vconf_get_str(VCONFKEY_NETWORK_IP);
    bool ip_ok = ip && std::string(ip) == "127.0.0.1";
    free(ip);
    if (!ip_ok || vconf_get_int(VCONFKEY_NETWORK_CONFIGURATION_CHANGE_IND, &config) != VCONF_OK ||
        config != 1)
        return 4;
    if (system("ip route del default dev lo") != 0)
        return kSkip;
    if (!zv_test::wait_for([&] { return status_is(VCONFKEY_NETWORK_OFF); }, 10000))
        return 5;
    net_monitor_stop();
    return 0;
}

TEST(NetMonitorTest, FollowsRouteChanges)
{
    zv_test::TempDir dir;
    pid_t pid = fork();
    ASSERT_GE(pid, 0);
    if (pid == 0)
        _exit(follow_routes_in_own_namespace());
    int status = 0;
    ASSERT_EQ(waitpid(pid, &status, 0), pid);
    ASSERT_TRUE(WIFEXITED(status));
    if (WEXITSTATUS(status) == kSkip)
        GTEST_SKIP() << "no network namespace of its own here";
    EXPECT_EQ(WEXITSTATUS(status), 0) << "failed at step " << WEXITSTATUS(status);
}

} // namespace
