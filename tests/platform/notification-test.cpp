// Tests of the host notification service against a desktop notification service: a private
// session bus (dbus-daemon) with a stand-in org.freedesktop.Notifications in this process;
// and tray files written while no descriptor is left.
#include "notification.h"

#include <Eldbus.h>
#include <glib.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <stdlib.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "zv-test-util.h"

namespace
{

using zv_test::wait_for;

struct NotifyCall {
    uint32_t replaces_id;
    std::string summary;
    std::string body;
};

struct DesktopService {
    bool owned = false;
    uint32_t next_id = 41;
    std::vector<NotifyCall> notifies;
    std::vector<uint32_t> closed;
};

DesktopService g_service;

Eldbus_Message *on_notify(const Eldbus_Service_Interface *, const Eldbus_Message *msg)
{
    const char *app = nullptr, *icon = nullptr, *summary = nullptr, *body = nullptr;
    uint32_t replaces = 0;
    int32_t timeout = 0;
    Eldbus_Message_Iter *actions = nullptr, *hints = nullptr;
    if (!eldbus_message_arguments_get(msg, "susssasa{sv}i", &app, &replaces, &icon, &summary, &body,
                                      &actions, &hints, &timeout))
        return eldbus_message_error_new(msg, "org.freedesktop.DBus.Error.InvalidArgs", "args");
    g_service.notifies.push_back({replaces, summary, body});
    Eldbus_Message *reply = eldbus_message_method_return_new(msg);
    eldbus_message_arguments_append(reply, "u", replaces ? replaces : g_service.next_id++);
    return reply;
}

Eldbus_Message *on_close(const Eldbus_Service_Interface *, const Eldbus_Message *msg)
{
    uint32_t id = 0;
    if (eldbus_message_arguments_get(msg, "u", &id))
        g_service.closed.push_back(id);
    return eldbus_message_method_return_new(msg);
}

const Eldbus_Method kMethods[] = {
    {"Notify",
     ELDBUS_ARGS({"s", "app_name"}, {"u", "replaces_id"}, {"s", "app_icon"}, {"s", "summary"},
                 {"s", "body"}, {"as", "actions"}, {"a{sv}", "hints"}, {"i", "expire_timeout"}),
     ELDBUS_ARGS({"u", "id"}), on_notify, 0},
    {"CloseNotification", ELDBUS_ARGS({"u", "id"}), nullptr, on_close, 0},
    {nullptr, nullptr, nullptr, nullptr, 0},
};

const Eldbus_Service_Interface_Desc kInterface = {
    "org.freedesktop.Notifications", kMethods, nullptr, nullptr, nullptr, nullptr};

class DesktopNotificationTest : public ::testing::Test
{
  protected:
    static void SetUpTestSuite()
    {
        dir_ = new zv_test::TempDir();
        gchar *daemon = g_find_program_in_path("dbus-daemon");
        if (!daemon)
            return;
        std::string socket = dir_->file("bus");
        std::string address = "unix:path=" + socket;
        daemon_pid_ = fork();
        if (daemon_pid_ == 0) {
            execl(daemon, daemon, "--session", "--nofork", "--nopidfile",
                  ("--address=" + address).c_str(), (char *)nullptr);
            _exit(127);
        }
        g_free(daemon);
        if (daemon_pid_ < 0 || !wait_for([&] { return access(socket.c_str(), F_OK) == 0; }, 10000))
            return;
        setenv("DBUS_SESSION_BUS_ADDRESS", address.c_str(), 1);
        eldbus_init();
        conn_ = eldbus_private_address_connection_get(address.c_str());
        if (!conn_)
            return;
        eldbus_service_interface_register(conn_, "/org/freedesktop/Notifications", &kInterface);
        eldbus_name_request(
            conn_, "org.freedesktop.Notifications", ELDBUS_NAME_REQUEST_FLAG_DO_NOT_QUEUE,
            [](void *, const Eldbus_Message *msg, Eldbus_Pending *) {
                unsigned reply = 0;
                g_service.owned = !eldbus_message_error_get(msg, nullptr, nullptr) &&
                                  eldbus_message_arguments_get(msg, "u", &reply) &&
                                  reply == ELDBUS_NAME_REQUEST_REPLY_PRIMARY_OWNER;
            },
            nullptr);
        wait_for([] { return g_service.owned; }, 10000);
    }

    static void TearDownTestSuite()
    {
        if (conn_)
            eldbus_connection_unref(conn_);
        if (daemon_pid_ > 0) {
            kill(daemon_pid_, SIGTERM);
            waitpid(daemon_pid_, nullptr, 0);
        }
        unsetenv("DBUS_SESSION_BUS_ADDRESS");
        delete dir_;
    }

    void SetUp() override
    {
        if (!g_service.owned)
            GTEST_SKIP() << "no private session bus (dbus-daemon) here";
    }

    static zv_test::TempDir *dir_;
    static pid_t daemon_pid_;
    static Eldbus_Connection *conn_;
};

zv_test::TempDir *DesktopNotificationTest::dir_ = nullptr;
pid_t DesktopNotificationTest::daemon_pid_ = -1;
Eldbus_Connection *DesktopNotificationTest::conn_ = nullptr;

TEST_F(DesktopNotificationTest, PostedNotificationIsShownReplacedAndClosed)
{
    notification_h noti = notification_create(NOTIFICATION_TYPE_ONGOING);
    ASSERT_NE(noti, nullptr);
    notification_set_text(noti, NOTIFICATION_TEXT_TYPE_TITLE, "Uploading", nullptr,
                          NOTIFICATION_VARIABLE_TYPE_NONE);
    notification_set_text(noti, NOTIFICATION_TEXT_TYPE_CONTENT, "a.mp4", nullptr,
                          NOTIFICATION_VARIABLE_TYPE_NONE);
    notification_set_tag(noti, "desktop_test");
    ASSERT_EQ(notification_post(noti), NOTIFICATION_ERROR_NONE);

    // Updates made before the service has answered are sent once it has, as replacements.
    notification_set_text(noti, NOTIFICATION_TEXT_TYPE_CONTENT, "b.mp4", nullptr,
                          NOTIFICATION_VARIABLE_TYPE_NONE);
    ASSERT_EQ(notification_update(noti), NOTIFICATION_ERROR_NONE);
    notification_set_text(noti, NOTIFICATION_TEXT_TYPE_CONTENT, "c.mp4", nullptr,
                          NOTIFICATION_VARIABLE_TYPE_NONE);
    ASSERT_EQ(notification_update(noti), NOTIFICATION_ERROR_NONE);
    ASSERT_TRUE(wait_for(
        [] { return !g_service.notifies.empty() && g_service.notifies.back().body == "c.mp4"; }));
    const uint32_t id = 41;
    EXPECT_EQ(g_service.notifies.front().replaces_id, 0u);
    EXPECT_EQ(g_service.notifies.front().summary, "Uploading");
    for (size_t i = 1; i < g_service.notifies.size(); i++)
        EXPECT_EQ(g_service.notifies[i].replaces_id, id) << i;
    EXPECT_EQ(zv_test::read_file(dir_->file("run/notifications/desktop/desktop_test")), "41\n");

    ASSERT_EQ(notification_delete(noti), NOTIFICATION_ERROR_NONE);
    ASSERT_TRUE(wait_for([] { return !g_service.closed.empty(); }));
    EXPECT_EQ(g_service.closed.back(), id);
    EXPECT_NE(access(dir_->file("run/notifications/desktop/desktop_test").c_str(), F_OK), 0);
    notification_free(noti);
}

// A tray file that cannot be written while no descriptor is left is written once they are
// back; until then its tag is found as posted, and a delete takes it back for good.
TEST(TrayFile, UnwrittenNotificationLandsLaterUnlessDeleted)
{
    zv_test::TempDir dir;
    auto posted = [&](const char *tag) {
        return access(dir.file(std::string("run/notifications/") + tag + ".ini").c_str(), F_OK) ==
               0;
    };
    notification_h late = notification_create(NOTIFICATION_TYPE_ONGOING);
    notification_h gone = notification_create(NOTIFICATION_TYPE_ONGOING);
    notification_set_tag(late, "late");
    notification_set_tag(gone, "gone");
    notification_set_text(late, NOTIFICATION_TEXT_TYPE_TITLE, "Uploading", nullptr,
                          NOTIFICATION_VARIABLE_TYPE_NONE);
    rlimit saved;
    ASSERT_EQ(getrlimit(RLIMIT_NOFILE, &saved), 0);
    rlimit none = saved;
    none.rlim_cur = 0;
    ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &none), 0);
    int late_rc = notification_post(late), gone_rc = notification_post(gone);
    ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &saved), 0);
    EXPECT_EQ(late_rc, NOTIFICATION_ERROR_IO_ERROR);
    EXPECT_EQ(gone_rc, NOTIFICATION_ERROR_IO_ERROR);
    EXPECT_FALSE(posted("late"));

    notification_h found = notification_load_by_tag("gone");
    ASSERT_NE(found, nullptr);
    EXPECT_EQ(notification_delete(found), NOTIFICATION_ERROR_NONE);
    notification_free(found);
    ASSERT_TRUE(wait_for([&] { return posted("late"); }));
    EXPECT_FALSE(posted("gone")) << "the try that wrote the other one would have written it";
    notification_h loaded = notification_load_by_tag("late");
    char *title = nullptr;
    notification_get_text(loaded, NOTIFICATION_TEXT_TYPE_TITLE, &title);
    EXPECT_STREQ(title, "Uploading");
    for (notification_h n : {late, gone, loaded})
        notification_free(n);
}

} // namespace
