// Tests of the system notifications on real tray files: what each call leaves in the tray,
// a notification found again by its tag from another process, unreadable tray files, the
// status message log and the zv-noti listing.
#include "zv-ext-noti.h"

#include <glib.h>
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <map>
#include <string.h>
#include <string>

#include "zv-test-util.h"

namespace
{

zv_test::LogFile g_log;

const char kOngoing[] = "zuvo_ongoing_noti";
const char kComplete[] = "zuvo_complete_noti";

class NotiTest : public ::testing::Test
{
  protected:
    void SetUp() override { g_log.mark(); }
    void TearDown() override { zuvo_ext_noti_complete_noti_destroy(); }

    std::string tray_file(const std::string &tag) const
    {
        return dir_.file("run/notifications/" + tag + ".ini");
    }
    // The keys of a posted notification in name order, "name=value;" each (time only said
    // to be set); empty when it is not posted.
    std::string tray(const std::string &tag) const
    {
        std::map<std::string, std::string> keys;
        GKeyFile *kf = g_key_file_new();
        gchar **names = nullptr;
        if (g_key_file_load_from_file(kf, tray_file(tag).c_str(), G_KEY_FILE_NONE, nullptr))
            names = g_key_file_get_keys(kf, "notification", nullptr, nullptr);
        for (gchar **name = names; name && *name; name++) {
            gchar *value = g_key_file_get_value(kf, "notification", *name, nullptr);
            keys[*name] =
                !strcmp(*name, "time") && g_ascii_strtoll(value, nullptr, 10) > 0 ? "set" : value;
            g_free(value);
        }
        g_strfreev(names);
        g_key_file_free(kf);
        std::string out;
        for (const auto &kv : keys)
            out += kv.first + "=" + kv.second + ";";
        return out;
    }

    zv_test::TempDir dir_;
};

TEST_F(NotiTest, OngoingCreateWritesCountProgressAndLaunchTarget)
{
    const char *cases[][5] = {
        // current, total, progress, event count, progress key
        {"1", "3", "0", "[1/3]", "progress=0;"},
        {"1", "1", "0.5", "", "progress=0.5;"},
        {"0", "0", "-1", "", ""},
    };
    for (const auto &c : cases) {
        ASSERT_EQ(zuvo_ext_noti_ongoing_noti_create("Uploading", "clip.mp4", atoi(c[0]), atoi(c[1]),
                                                    g_ascii_strtod(c[2], nullptr)),
                  1);
        EXPECT_EQ(tray(kOngoing), std::string("content=clip.mp4;disable_app_launch=false;"
                                              "display_applist=11;event_count=") +
                                      c[3] + ";launch_app_id=zuvo-upload-svc;" + c[4] +
                                      "tag=zuvo_ongoing_noti;title=Uploading;type=ongoing;");
    }
    EXPECT_FALSE(zuvo_ext_noti_ongoing_noti_create(nullptr, "x", 0, 0, 0.0));
    EXPECT_FALSE(zuvo_ext_noti_ongoing_noti_create("x", nullptr, 0, 0, 0.0));
}

// Posted by another process, the ongoing notification is updated, listed by zv-noti and
// removed here; an update while none is posted creates it, and a negative progress keeps
// the bar where it was.
TEST_F(NotiTest, OngoingOfAnotherProcessIsUpdatedListedAndRemoved)
{
    const std::string noti = zv_test::bin_path("zv-noti");
    std::string out;
    EXPECT_EQ(zv_test::run_program({noti, "list"}, "", &out), 0);
    EXPECT_EQ(out, "");
    EXPECT_EQ(zv_test::run_program({noti}), 2);
    EXPECT_EQ(zv_test::run_program({noti, "show"}), 2);
    EXPECT_EQ(zv_test::run_program({noti, "list", "extra"}), 2);
    EXPECT_EQ(zv_test::run_program({noti, "--help"}, "", &out), 0);
    EXPECT_NE(out.find("zv-noti list"), std::string::npos);

    pid_t pid = fork();
    ASSERT_GE(pid, 0);
    if (pid == 0)
        _exit(zuvo_ext_noti_ongoing_noti_create("Uploading", "first.mp4", 0, 1, 0.1) ? 0 : 1);
    int status = 0;
    ASSERT_EQ(waitpid(pid, &status, 0), pid);
    ASSERT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0);
    zuvo_ext_noti_ongoing_noti_update("Uploading", "second.mp4", 0, 1, 0.6);
    EXPECT_FALSE(g_log.logged("So, create it."));
    ASSERT_EQ(zv_test::run_program({noti, "list"}, "", &out), 0);
    EXPECT_NE(out.find(std::string("[") + kOngoing + "]"), std::string::npos) << out;
    EXPECT_NE(out.find("content=second.mp4"), std::string::npos) << out;

    zuvo_ext_noti_ongoing_noti_destroy();
    EXPECT_EQ(tray(kOngoing), "");
    zuvo_ext_noti_ongoing_noti_destroy();
    EXPECT_TRUE(g_log.logged("\033[32m[TID:"));
    EXPECT_TRUE(g_log.logged("Zuvo Noti Ongoing Tag is not existed. ==="));

    zuvo_ext_noti_ongoing_noti_update("Uploading", "a.mp4", 0, 2, 0.25);
    EXPECT_TRUE(g_log.logged("ongoing_noti_h is NULL. So, create it."));
    zuvo_ext_noti_ongoing_noti_update("Uploading", "b.mp4", 1, 2, -1.0);
    EXPECT_EQ(tray(kOngoing), "content=b.mp4;disable_app_launch=false;display_applist=1;"
                              "event_count=[1/2];launch_app_id=zuvo-upload-svc;progress=0.25;"
                              "tag=zuvo_ongoing_noti;title=Uploading;type=ongoing;");
}

TEST_F(NotiTest, UnreadableTrayFileIsTakenAsAbsentAndLogged)
{
    ASSERT_TRUE(zuvo_ext_noti_ongoing_noti_create("Uploading", "a.mp4", 0, 1, 0.0));
    const char *broken[] = {"not a key file at all [[[\n",
                            "[notification]\ntype=ongoing\ndisplay_applist=lots\n",
                            "[other]\ntype=noti\n"};
    double progress = 0.5;
    for (const char *text : broken) {
        ASSERT_TRUE(zv_test::write_file(tray_file(kOngoing), text));
        g_log.mark();
        progress += 0.1; // an update that changes nothing is not written again
        zuvo_ext_noti_ongoing_noti_update("Uploading", "b.mp4", 0, 1, progress);
        EXPECT_TRUE(g_log.logged("is not a notification")) << text;
        EXPECT_TRUE(g_log.logged("ongoing_noti_h is NULL. So, create it.")) << text;
        EXPECT_NE(tray(kOngoing).find("content=b.mp4;"), std::string::npos) << text;
    }
}

// The completion notification replaces the ongoing one, opens nothing and stays in the tray
// when its handle is released; status messages are appended one a line.
TEST_F(NotiTest, CompletionReplacesOngoingOpensNothingAndStays)
{
    ASSERT_TRUE(zuvo_ext_noti_ongoing_noti_create("Uploading", "a.mp4", 1, 2, 0.5));
    ASSERT_EQ(zuvo_ext_noti_complete_noti_create("Uploaded", "2 files"), 1);
    EXPECT_EQ(tray(kOngoing), "");
    const std::string complete = "content=2 files;disable_app_launch=true;display_applist=11;"
                                 "event_count=;tag=zuvo_complete_noti;time=set;title=Uploaded;"
                                 "type=noti;";
    EXPECT_EQ(tray(kComplete), complete);
    zuvo_ext_noti_complete_noti_destroy();
    EXPECT_EQ(tray(kComplete), complete);
    zuvo_ext_noti_complete_noti_destroy();
    EXPECT_TRUE(g_log.logged("noti handle is NULL"));

    zuvo_ext_noti_message_post("first");
    zuvo_ext_noti_message_post("second\nline");
    EXPECT_EQ(zv_test::read_file(dir_.file("run/notifications/status-messages.log")),
              "first\nsecond line\n");
}

} // namespace
