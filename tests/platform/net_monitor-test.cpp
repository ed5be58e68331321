// Tests of the host network monitor: the keys it writes at start, and how it follows route
// changes (in a network namespace of its own, where the test may change the routes; the
// sandbox of the service's e2e tests uses the keys alone).
#include "net_monitor.h"

#include <Ecore.h>
#include <gtest/gtest.h>
#include <sched.h>
#include <stdlib.h>
#include <sys/wait.h>
#include <unistd.h>
#include <vconf.h>

#include <string>

#include "zv-test-util.h"

namespace
{

// The four keys: "status config ip proxy".
std::string keys()
{
    int status = -1, config = -1;
    vconf_get_int(VCONFKEY_NETWORK_STATUS, &status);
    vconf_get_int(VCONFKEY_NETWORK_CONFIGURATION_CHANGE_IND, &config);
    char *ip = vconf_get_str(VCONFKEY_NETWORK_IP), *proxy = vconf_get_str(VCONFKEY_NETWORK_PROXY);
    std::string out = std::to_string(status) + " " + std::to_string(config) + " " +
                      (ip ? ip : "-") + " " + (proxy ? proxy : "-");
    free(ip);
    free(proxy);
    return out;
}

// In a child with a network namespace of its own (as root, or inside a user namespace of its
// own where the machine allows one): the step that failed, 0, or kSkip.
const int kSkip = 77;

int follow_routes_in_own_namespace()
{
    ecore_fork_reset();
    if (unshare(CLONE_NEWNET) != 0 && unshare(CLONE_NEWUSER | CLONE_NEWNET) != 0)
        return kSkip;
    setenv("http_proxy", "http://proxy.test:3128", 1);
    if (net_monitor_start() != 0 || net_monitor_start() != 0)
        return 1;
    if (keys() != "0 0  http://proxy.test:3128")
        return 2;
    if (system("ip link set lo up && ip route add default dev lo") != 0)
        return kSkip;
    if (!zv_test::wait_for([] { return keys() == "2 1 127.0.0.1 http://proxy.test:3128"; }, 10000))
        return 3;
    if (system("ip route del default dev lo") != 0)
        return kSkip;
    if (!zv_test::wait_for([] { return keys().rfind("0 0 ", 0) == 0; }, 10000))
        return 4;
    net_monitor_stop();
    return 0;
}

// Started twice the monitor runs once; its keys follow the default route and the proxy of
// the environment. (With ZV_NETWORK=keys it stays off: the e2e tests write the keys.)
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
