// Tests of the host media content database: which filter conditions are understood, lookups
// by bound values, and thumbnails made from a real video file.
#include "media_content.h"

#include <glib.h>
#include <gtest/gtest.h>
#include <stdio.h>
#include <stdlib.h>

#include <string>

#include "zv-test-util.h"

namespace
{

// The paths that condition finds, each followed by a space; "refused" when the condition
// is not understood.
std::string matching_paths(const char *condition)
{
    filter_h filter = nullptr;
    media_filter_create(&filter);
    std::string paths;
    auto add_path = [](media_info_h media, void *data) {
        char *path = nullptr;
        media_info_get_file_path(media, &path);
        *static_cast<std::string *>(data) += std::string(path) + " ";
        free(path);
        return true;
    };
    int rc = media_filter_set_condition(filter, condition, MEDIA_CONTENT_COLLATE_DEFAULT);
    if (rc == MEDIA_CONTENT_ERROR_INVALID_PARAMETER)
        paths = "refused";
    else if (rc != MEDIA_CONTENT_ERROR_NONE ||
             media_info_foreach_media_from_db(filter, add_path, &paths) != MEDIA_CONTENT_ERROR_NONE)
        paths = "failed";
    media_filter_destroy(filter);
    return paths;
}

TEST(MediaContentTest, ConditionsAreReadIntoTermsOrRefused)
{
    zv_test::TempDir dir;
    ASSERT_EQ(media_content_connect(), MEDIA_CONTENT_ERROR_NONE);
    ASSERT_EQ(media_content_register_file("/m/a.mp4", MEDIA_CONTENT_TYPE_VIDEO, nullptr, "A"),
              MEDIA_CONTENT_ERROR_NONE);
    ASSERT_EQ(media_content_register_file("/m/b.jpg", MEDIA_CONTENT_TYPE_IMAGE, nullptr, "B"),
              MEDIA_CONTENT_ERROR_NONE);
    ASSERT_EQ(media_content_register_file("/m/c.mp4", MEDIA_CONTENT_TYPE_VIDEO, nullptr, "A"),
              MEDIA_CONTENT_ERROR_NONE);
    const char *cases[][2] = {
        {"MEDIA_TYPE = 1", "/m/a.mp4 /m/c.mp4 "},
        {"media_type=0", "/m/b.jpg "},
        {"MEDIA_TYPE = 1 AND MEDIA_DISPLAY_NAME = 'A' and MEDIA_PATH=\"/m/c.mp4\"", "/m/c.mp4 "},
        {"MEDIA_PATH= \"/m/a.mp4\" or 1=1\"", ""},
        {"MEDIA_TYPE > 1", "refused"},
        {"MEDIA_TYPE = 1 or MEDIA_TYPE = 0", "refused"},
        {"MEDIA_SIZE = 1", "refused"},
        {"MEDIA_PATH = \"/m/a.mp4", "refused"},
    };
    for (const auto &c : cases)
        EXPECT_EQ(matching_paths(c[0]), c[1]) << c[0];

    EXPECT_EQ(media_content_disconnect(), MEDIA_CONTENT_ERROR_NONE);
    EXPECT_EQ(media_content_disconnect(), MEDIA_CONTENT_ERROR_DB_FAILED);
    EXPECT_EQ(media_info_foreach_media_from_db(
                  nullptr, [](media_info_h, void *) { return true; }, nullptr),
              MEDIA_CONTENT_ERROR_INVALID_OPERATION);
}

TEST(MediaContentTest, ThumbnailIsMadeFromAVideoFrame)
{
    zv_test::TempDir dir;
    gchar *gst = g_find_program_in_path("gst-launch-1.0");
    if (!gst)
        GTEST_SKIP() << "gst-launch-1.0 is not installed";
    // A name that a pipeline description could not hold.
    const std::string video = dir.file("my \"clip\" ! 1.avi");
    int rc = zv_test::run_program({gst, "-q", "videotestsrc", "num-buffers=3", "!",
                                   "video/x-raw,width=64,height=48", "!", "jpegenc", "!", "avimux",
                                   "!", "filesink", "location=" + dir.file("clip.avi")});
    g_free(gst);
    ASSERT_EQ(rc, 0);
    ASSERT_EQ(rename(dir.file("clip.avi").c_str(), video.c_str()), 0);
    char *thumb = media_content_create_thumbnail(video.c_str());
    ASSERT_NE(thumb, nullptr);
    std::string path = thumb;
    free(thumb);
    EXPECT_EQ(path.rfind(dir.file("thumbs/"), 0), 0u) << path;
    EXPECT_EQ(zv_test::read_file(path).substr(0, 4), "\x89PNG");

    ASSERT_TRUE(zv_test::write_file(dir.file("notes.mp4"), "not a video"));
    EXPECT_EQ(media_content_create_thumbnail(dir.file("notes.mp4").c_str()), nullptr);
    EXPECT_EQ(media_content_create_thumbnail(dir.file("missing.mp4").c_str()), nullptr);
}

} // namespace
