// Tests of the host notification service: what a desktop notification service on the session
// bus is sent and what its clicks launch, and tray files written while no descriptor is left.
#include "notification.h"

#include <Eldbus.h>
#include <glib.h>
#include <gtest/gtest.h>
#include <string.h>
#include <sys/resource.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "app.h"
#include "zv-test-util.h"

namespace
{

using zv_test::wait_for;

notification_h make(const char *tag, notification_type_e type = NOTIFICATION_TYPE_ONGOING,
                    const char *content = "a.mp4")
{
    notification_h noti = notification_create(type);
    notification_set_text(noti, NOTIFICATION_TEXT_TYPE_TITLE, "Uploading", nullptr,
                          NOTIFICATION_VARIABLE_TYPE_NONE);
    notification_set_text(noti, NOTIFICATION_TEXT_TYPE_CONTENT, content, nullptr,
                          NOTIFICATION_VARIABLE_TYPE_NONE);
    notification_set_tag(noti, tag);
    return noti;
}

// A stand-in desktop notification service: "replaces_id|summary|body|actions|value" per Notify
// (actions comma separated, value the progress hint or -1), "close ID" per CloseNotification.
std::vector<std::string> g_calls;

Eldbus_Message *on_notify(const Eldbus_Service_Interface *, const Eldbus_Message *msg)
{
    static uint32_t next_id = 41;
    const char *app, *icon, *summary, *body, *text, *key;
    uint32_t replaces = 0;
    int32_t timeout = 0, value = -1;
    Eldbus_Message_Iter *actions, *hints, *entry, *variant;
    if (!eldbus_message_arguments_get(msg, "susssasa{sv}i", &app, &replaces, &icon, &summary, &body,
                                      &actions, &hints, &timeout))
        return eldbus_message_error_new(msg, "org.freedesktop.DBus.Error.InvalidArgs", "args");
    std::string call = std::to_string(replaces) + "|" + summary + "|" + body + "|";
    for (const char *sep = ""; eldbus_message_iter_get_and_next(actions, 's', &text); sep = ",")
        call += sep + std::string(text);
    while (eldbus_message_iter_get_and_next(hints, 'e', &entry))
        if (eldbus_message_iter_arguments_get(entry, "sv", &key, &variant) &&
            !strcmp(key, "value") && !eldbus_message_iter_arguments_get(variant, "i", &value))
            value = -2;
    g_calls.push_back(call + "|" + std::to_string(value));
    Eldbus_Message *reply = eldbus_message_method_return_new(msg);
    eldbus_message_arguments_append(reply, "u", replaces ? replaces : next_id++);
    return reply;
}

Eldbus_Message *on_close(const Eldbus_Service_Interface *, const Eldbus_Message *msg)
{
    uint32_t id = 0;
    if (eldbus_message_arguments_get(msg, "u", &id))
        g_calls.push_back("close " + std::to_string(id));
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
const Eldbus_Signal kSignals[] = {
    {"ActionInvoked", ELDBUS_ARGS({"u", "id"}, {"s", "action_key"}), 0},
    {nullptr, nullptr, 0},
};
const Eldbus_Service_Interface_Desc kInterface = {
    "org.freedesktop.Notifications", kMethods, kSignals, nullptr, nullptr, nullptr};

// Updates made before the service has answered are sent once it has, as replacements of the id
// it gave; a delete closes that id. The ongoing notification carries the default action and its
// progress as the "value" hint; a click on it sends its application, here running, a launch
// request. The completion notification launches nothing and has no action. The test program
// runs on a session bus of its own (see the tests' build file), where the stand-in owns the
// service's name.
TEST(DesktopNotification, ShownReplacedClickedAndClosed)
{
    zv_test::TempDir dir;
    eldbus_init();
    Eldbus_Connection *conn =
        eldbus_private_address_connection_get(getenv("DBUS_SESSION_BUS_ADDRESS"));
    ASSERT_NE(conn, nullptr);
    Eldbus_Service_Interface *iface =
        eldbus_service_interface_register(conn, "/org/freedesktop/Notifications", &kInterface);
    bool owned = false;
    eldbus_name_request(
        conn, "org.freedesktop.Notifications", ELDBUS_NAME_REQUEST_FLAG_DO_NOT_QUEUE,
        [](void *owned, const Eldbus_Message *msg, Eldbus_Pending *) {
            unsigned reply = 0;
            *static_cast<bool *>(owned) = !eldbus_message_error_get(msg, nullptr, nullptr) &&
                                          eldbus_message_arguments_get(msg, "u", &reply) &&
                                          reply == ELDBUS_NAME_REQUEST_REPLY_PRIMARY_OWNER;
        },
        &owned);
    ASSERT_TRUE(wait_for([&] { return owned; }, 10000));
    // The application the ongoing notification launches, running as the instance.
    std::string probe_log = dir.file("probe.log");
    auto log_is = [&](const std::string &lines) { return zv_test::read_file(probe_log) == lines; };
    const std::string started = "create\napp_control\nresume\n";
    zv_test::Child app;
    ASSERT_TRUE(app.start({zv_test::bin_path("zv-app-probe")}, "", {{"ZV_PROBE_LOG", probe_log}}));
    ASSERT_TRUE(wait_for([&] { return log_is(started); }, 20000));

    notification_h ongoing = make("click_ongoing");
    app_control_h launch = nullptr;
    app_control_create(&launch);
    app_control_set_app_id(launch, "zuvo-upload-svc");
    notification_set_launch_option(ongoing, NOTIFICATION_LAUNCH_OPTION_APP_CONTROL, launch);
    app_control_destroy(launch);
    notification_set_progress(ongoing, 0.37);
    notification_h done = make("click_complete", NOTIFICATION_TYPE_NOTI, "done");
    notification_set_property(done, NOTIFICATION_PROP_DISABLE_APP_LAUNCH);
    ASSERT_EQ(notification_post(ongoing), NOTIFICATION_ERROR_NONE);
    ASSERT_EQ(notification_post(done), NOTIFICATION_ERROR_NONE);
    for (const char *content : {"b.mp4", "c.mp4"}) {
        notification_set_text(ongoing, NOTIFICATION_TEXT_TYPE_CONTENT, content, nullptr,
                              NOTIFICATION_VARIABLE_TYPE_NONE);
        ASSERT_EQ(notification_update(ongoing), NOTIFICATION_ERROR_NONE);
    }
    ASSERT_TRUE(wait_for(
        [] { return !g_calls.empty() && g_calls.back() == "41|Uploading|c.mp4|default,Open|37"; }));
    EXPECT_EQ(g_calls[0], "0|Uploading|a.mp4|default,Open|37");
    EXPECT_EQ(g_calls[1], "0|Uploading|done||-1");
    for (size_t i = 2; i < g_calls.size(); i++)
        EXPECT_EQ(g_calls[i].substr(0, 3), "41|") << g_calls[i];

    // A click on each: only the ongoing one launches.
    auto id_file = [&](const std::string &tag) {
        return dir.file("run/notifications/desktop/" + tag);
    };
    for (const char *tag : {"click_complete", "click_ongoing"}) {
        ASSERT_TRUE(wait_for([&] { return access(id_file(tag).c_str(), F_OK) == 0; }));
        uint32_t id = g_ascii_strtoull(zv_test::read_file(id_file(tag)).c_str(), nullptr, 10);
        eldbus_service_signal_emit(iface, 0, id, "default");
    }
    EXPECT_TRUE(wait_for([&] { return log_is(started + "app_control\n"); }, 10000));
    EXPECT_FALSE(wait_for([&] { return !log_is(started + "app_control\n"); }, 500));

    ASSERT_EQ(notification_delete(ongoing), NOTIFICATION_ERROR_NONE);
    ASSERT_TRUE(wait_for([] { return g_calls.back() == "close 41"; }));
    EXPECT_NE(access(id_file("click_ongoing").c_str(), F_OK), 0);
    notification_delete(done);
    for (notification_h n : {ongoing, done})
        notification_free(n);
    eldbus_connection_unref(conn);
}

// A tray file that cannot be written while no descriptor is left is written once they are
// back; until then its tag is found as posted, and a delete takes it back for good.
TEST(TrayFile, UnwrittenNotificationLandsLaterUnlessDeleted)
{
    zv_test::TempDir dir;
    auto posted = [&](const std::string &tag) {
        return access(dir.file("run/notifications/" + tag + ".ini").c_str(), F_OK) == 0;
    };
    notification_h late = make("late"), gone = make("gone");
    rlimit saved, none;
    ASSERT_EQ(getrlimit(RLIMIT_NOFILE, &saved), 0);
    none = {0, saved.rlim_max};
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
