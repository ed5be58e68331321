// Tests of the network state monitor on real key files and inotify watches: the keys are
// changed by another process, and the callbacks are awaited on the main loop.
#include "zv-ext-network.h"

#include <gtest/gtest.h>
#include <stdlib.h>
#include <unistd.h>
#include <vconf.h>

#include <memory>
#include <string>
#include <vector>

#include "zv-test-util.h"

namespace
{

using zv_test::wait_for;

zv_test::LogFile g_log;

struct Calls {
    std::vector<int> onoff;
    std::vector<int> status;
    std::vector<std::pair<std::string, std::string>> config;
};

Calls g_calls;
int g_context; // the user data handed to the watchers

void onoff_cb(int state, void *userp)
{
    EXPECT_EQ(userp, &g_context);
    g_calls.onoff.push_back(state);
}

void status_cb(int type, void *userp)
{
    EXPECT_EQ(userp, &g_context);
    g_calls.status.push_back(type);
}

void config_cb(char *ip, char *proxy, void *userp)
{
    EXPECT_EQ(userp, &g_context);
    g_calls.config.emplace_back(ip ? ip : "(null)", proxy ? proxy : "(null)");
    free(ip);
    free(proxy);
}

// Writes an int key the way another process does: zv-vconf when it is built, else a shell
// that replaces the key file atomically.
void set_key_from_other_process(const std::string &key, int value)
{
    std::string vconf = zv_test::bin_path("zv-vconf");
    std::string text = std::to_string(value);
    int rc;
    if (access(vconf.c_str(), X_OK) == 0) {
        rc = zv_test::run_program({vconf, "set", "-t", "int", key, text});
    } else {
        std::string file = std::string(getenv("ZV_RUNTIME_DIR")) + "/vconf/" + key;
        rc = zv_test::run_program({"/bin/sh", "-c",
                                   "mkdir -p \"$(dirname \"$1\")\" && printf '%s\\n' \"$2\" > "
                                   "\"$1.tmp\" && mv \"$1.tmp\" \"$1\"",
                                   "sh", file, text});
    }
    ASSERT_EQ(rc, 0) << key << "=" << value;
}

// One key folder and one registration for the whole program: watches last for the process.
class NetworkTest : public ::testing::Test
{
  protected:
    static void SetUpTestSuite()
    {
        dir_ = new zv_test::TempDir();
        ASSERT_EQ(vconf_set_int(VCONFKEY_NETWORK_STATUS, 0), VCONF_OK);
        ASSERT_EQ(vconf_set_int(VCONFKEY_NETWORK_CONFIGURATION_CHANGE_IND, 0), VCONF_OK);
        ASSERT_EQ(zv_ext_network_register(&g_context, onoff_cb, status_cb, config_cb), 1);
    }
    static void TearDownTestSuite()
    {
        zv_ext_network_deregister();
        delete dir_;
    }
    void SetUp() override
    {
        // Let any notification of an earlier test arrive before counting.
        wait_for([] { return false; }, 50);
        g_calls = Calls{};
        g_log.mark();
    }

    static zv_test::TempDir *dir_;
};

zv_test::TempDir *NetworkTest::dir_ = nullptr;

TEST_F(NetworkTest, StatusChangeReachesCallbackWithMappedKind)
{
    struct Case {
        int value;
        int type;
        const char *log; // nullptr: no value log at all
    };
    const Case cases[] = {
        {2, ZV_NETWORK_TYPE_WIFI, "NETWORK_WIFI"},
        {1, ZV_NETWORK_TYPE_CELLULAR, "NETWORK_CELLULAR"},
        {0, ZV_NETWORK_TYPE_NONE, nullptr},
        {3, ZV_NETWORK_TYPE_NONE, "NETWORK_UNKNOWN"},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.value);
        g_calls.status.clear();
        g_log.mark();
        set_key_from_other_process(VCONFKEY_NETWORK_STATUS, c.value);
        ASSERT_TRUE(wait_for([] { return !g_calls.status.empty(); }, 1000));
        EXPECT_EQ(g_calls.status.back(), c.type);
        std::string log = g_log.since_mark();
        if (c.log) {
            EXPECT_NE(log.find(c.log), std::string::npos) << log;
        } else {
            EXPECT_EQ(log.find("NETWORK_"), std::string::npos) << log;
        }
    }
    EXPECT_TRUE(g_calls.onoff.empty());
    EXPECT_TRUE(g_calls.config.empty());
}

TEST_F(NetworkTest, ConfigChangeReachesOnOffAndConfigurationCallbacks)
{
    ASSERT_EQ(vconf_set_str(VCONFKEY_NETWORK_IP, "10.1.2.3"), VCONF_OK);
    ASSERT_EQ(vconf_set_str(VCONFKEY_NETWORK_PROXY, "http://proxy.test:3128"), VCONF_OK);
    set_key_from_other_process(VCONFKEY_NETWORK_CONFIGURATION_CHANGE_IND, 1);
    ASSERT_TRUE(wait_for([] { return !g_calls.onoff.empty() && !g_calls.config.empty(); }, 1000));
    EXPECT_EQ(g_calls.onoff.back(), 1);
    EXPECT_EQ(g_calls.config.back().first, "10.1.2.3");
    EXPECT_EQ(g_calls.config.back().second, "http://proxy.test:3128");
    EXPECT_NE(g_log.since_mark().find("VCONFKEY_NETWORK_ON"), std::string::npos);

    // Closed, and a value this adapter does not know, both read as off.
    for (int value : {0, 5}) {
        g_calls = Calls{};
        set_key_from_other_process(VCONFKEY_NETWORK_CONFIGURATION_CHANGE_IND, value);
        ASSERT_TRUE(wait_for([] { return !g_calls.onoff.empty(); }, 1000)) << value;
        EXPECT_EQ(g_calls.onoff.back(), 0) << value;
    }
    EXPECT_TRUE(g_calls.status.empty());
}

TEST_F(NetworkTest, CheckAndGettersReadTheKeys)
{
    const std::string status_file = dir_->file("run/vconf/" VCONFKEY_NETWORK_STATUS);
    struct Case {
        const char *text; // nullptr: no key file
        int usable;
    };
    const Case cases[] = {
        {"1\n", 1}, {"2\n", 1}, {"0\n", 0}, {"9\n", 0}, {"wifi\n", 0}, {"", 0}, {nullptr, 0},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.text ? c.text : "missing");
        if (c.text)
            ASSERT_TRUE(zv_test::write_file(status_file, c.text));
        else
            unlink(status_file.c_str());
        EXPECT_EQ(zv_ext_network_check(), c.usable);
    }
    int value = 0;
    ASSERT_TRUE(zv_test::write_file(status_file, "2x\n"));
    EXPECT_NE(vconf_get_int(VCONFKEY_NETWORK_STATUS, &value), VCONF_OK);

    ASSERT_EQ(vconf_set_str(VCONFKEY_NETWORK_IP, "192.168.7.9"), VCONF_OK);
    std::unique_ptr<char, decltype(&free)> ip(zv_ext_network_get_ip(), free);
    ASSERT_TRUE(ip);
    EXPECT_STREQ(ip.get(), "192.168.7.9");
    unlink(dir_->file("run/vconf/" VCONFKEY_NETWORK_PROXY).c_str());
    EXPECT_EQ(zv_ext_network_get_proxy(), nullptr);
    wait_for([] { return false; }, 50);
}

TEST_F(NetworkTest, RegisterWithoutUserDataFails)
{
    EXPECT_EQ(zv_ext_network_register(nullptr, onoff_cb, status_cb, config_cb), 0);
    EXPECT_NE(g_log.since_mark().find("userp is NULL"), std::string::npos);
}

TEST_F(NetworkTest, AfterDeregistrationChangesLogButCallNothing)
{
    EXPECT_EQ(zv_ext_network_deregister(), 1);
    set_key_from_other_process(VCONFKEY_NETWORK_STATUS, 2);
    ASSERT_TRUE(wait_for(
        [] { return g_log.since_mark().find("NETWORK_WIFI") != std::string::npos; }, 1000));
    wait_for([] { return false; }, 50);
    EXPECT_TRUE(g_calls.status.empty());

    ASSERT_EQ(zv_ext_network_register(&g_context, onoff_cb, status_cb, config_cb), 1);
    set_key_from_other_process(VCONFKEY_NETWORK_STATUS, 1);
    ASSERT_TRUE(wait_for([] { return !g_calls.status.empty(); }, 1000));
    EXPECT_EQ(g_calls.status.back(), ZV_NETWORK_TYPE_CELLULAR);
}

} // namespace
