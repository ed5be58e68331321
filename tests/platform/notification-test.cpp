// Tests of the host notification service: tray files written while no descriptor is left.
#include "notification.h"

#include <gtest/gtest.h>
#include <sys/resource.h>
#include <unistd.h>

#include <string>

#include "zv-test-util.h"

namespace
{

using zv_test::wait_for;

notification_h make(const char *tag)
{
    notification_h noti = notification_create(NOTIFICATION_TYPE_ONGOING);
    notification_set_text(noti, NOTIFICATION_TEXT_TYPE_TITLE, "Uploading", nullptr,
                          NOTIFICATION_VARIABLE_TYPE_NONE);
    notification_set_tag(noti, tag);
    return noti;
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
