// Tests of the system notifications on real tray files: what each call leaves in the tray,
// a notification found again by its tag from another process, unreadable tray files, the
// status message log and the zv-noti listing.
#include "zv-ext-noti.h"

#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <regex>

#include "zv-test-util.h"

static zv_test::LogFile g_log;

// Created here, the ongoing notification shows its count, its bar and its launch target;
// created again by another process it replaces this one, is found by its tag and updated
// (a negative progress keeps the bar where it was), listed by zv-noti and removed; an update
// while none is posted, or over a tray file that cannot be read, creates it. The completion
// notification replaces the ongoing one, opens nothing and stays in the tray when its handle
// is released; status messages are appended one a line.
TEST(NotiTest, OngoingThenCompletion)
{
    zv_test::TempDir dir;
    const std::string ongoing = dir.file("run/notifications/zuvo_ongoing_noti.ini");
    // The posted notification's tray file, its time (when above 0) shown as "set".
    auto tray = [&](const std::string &tag) {
        const std::string text =
            zv_test::read_file(dir.file("run/notifications/zuvo_" + tag + "_noti.ini"));
        return std::regex_replace(text, std::regex("\ntime=[1-9][0-9]*\n"), "\ntime=set\n");
    };
    const std::string head = "[notification]\ntype=ongoing\ntitle=Uploading\ncontent=";
    const std::string tail = "tag=zuvo_ongoing_noti\nlaunch_app_id=zuvo-upload-svc\n"
                             "disable_app_launch=false\n";
    ASSERT_EQ(zuvo_ext_noti_ongoing_noti_create("Uploading", "clip.mp4", 0, 0, -1), 1);
    EXPECT_EQ(tray("ongoing"), head + "clip.mp4\nevent_count=\ndisplay_applist=11\n" + tail);
    EXPECT_FALSE(zuvo_ext_noti_ongoing_noti_create(nullptr, "x", 0, 0, 0.0));
    EXPECT_FALSE(zuvo_ext_noti_ongoing_noti_create("x", nullptr, 0, 0, 0.0));

    pid_t pid = fork();
    ASSERT_GE(pid, 0);
    if (pid == 0)
        _exit(zuvo_ext_noti_ongoing_noti_create("Uploading", "first.mp4", 0, 1, 0.1) ? 0 : 1);
    int status = 0;
    ASSERT_EQ(waitpid(pid, &status, 0), pid);
    ASSERT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0);
    g_log.mark();
    zuvo_ext_noti_ongoing_noti_update("Uploading", "second.mp4", 0, 1, 0.6);
    std::string out, noti = zv_test::bin_path("zv-noti");
    ASSERT_EQ(zv_test::run_program({noti, "list"}, "", &out), 0);
    EXPECT_EQ(out, "[zuvo_ongoing_noti]" + head.substr(head.find('\n')) +
                       "second.mp4\nevent_count=\nprogress=0.6\ndisplay_applist=1\n" + tail);
    EXPECT_EQ(zv_test::wrong_calls(noti, {"", "show", "list x"}), "");

    zuvo_ext_noti_ongoing_noti_destroy();
    EXPECT_EQ(tray("ongoing"), "");
    zuvo_ext_noti_ongoing_noti_destroy();
    EXPECT_TRUE(g_log.logged("Zuvo Noti Ongoing Tag is not existed. ==="));
    zuvo_ext_noti_ongoing_noti_update("Uploading", "a.mp4", 0, 2, 0.25);
    EXPECT_TRUE(g_log.logged("ongoing_noti_h is NULL. So, create it."));
    zuvo_ext_noti_ongoing_noti_update("Uploading", "b.mp4", 1, 2, -1.0);
    EXPECT_EQ(tray("ongoing"),
              head + "b.mp4\nevent_count=[1/2]\nprogress=0.25\ndisplay_applist=1\n" + tail);

    double progress = 0.5;
    for (const char *text :
         {"not a key file at all [[[\n", "[notification]\ntype=ongoing\ndisplay_applist=lots\n",
          "[other]\ntype=noti\n"}) {
        ASSERT_TRUE(zv_test::write_file(ongoing, text));
        g_log.mark();
        progress += 0.1; // an update that changes nothing is not written again
        zuvo_ext_noti_ongoing_noti_update("Uploading", "c.mp4", 0, 1, progress);
        EXPECT_TRUE(g_log.logged("is not a notification")) << text;
        EXPECT_TRUE(g_log.logged("ongoing_noti_h is NULL. So, create it.")) << text;
        EXPECT_NE(tray("ongoing").find("content=c.mp4\n"), std::string::npos) << text;
    }

    ASSERT_EQ(zuvo_ext_noti_complete_noti_create("Uploaded", "2 files"), 1);
    EXPECT_EQ(tray("ongoing"), "");
    zuvo_ext_noti_complete_noti_destroy();
    EXPECT_EQ(tray("complete"), "[notification]\ntype=noti\ntitle=Uploaded\ncontent=2 files\n"
                                "event_count=\ndisplay_applist=11\ntag=zuvo_complete_noti\n"
                                "disable_app_launch=true\ntime=set\n");
    zuvo_ext_noti_complete_noti_destroy();
    EXPECT_TRUE(g_log.logged("noti handle is NULL"));
    zuvo_ext_noti_message_post("first");
    zuvo_ext_noti_message_post("second\nline");
    EXPECT_EQ(zv_test::read_file(dir.file("run/notifications/status-messages.log")),
              "first\nsecond line\n");
}
