// Tests of the host media content database: which filter conditions are understood, lookups
// by bound values, and thumbnails made from a real video file.
#include "media_content.h"

#include <glib.h>
#include <gtest/gtest.h>
#include <stdlib.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "zv-test-util.h"

namespace
{

std::vector<std::string> matching_paths(const char *condition)
{
    std::vector<std::string> paths;
    filter_h filter = nullptr;
    EXPECT_EQ(media_filter_create(&filter), MEDIA_CONTENT_ERROR_NONE);
    EXPECT_EQ(media_filter_set_condition(filter, condition, MEDIA_CONTENT_COLLATE_DEFAULT),
              MEDIA_CONTENT_ERROR_NONE);
    EXPECT_EQ(media_info_foreach_media_from_db(
                  filter,
                  [](media_info_h media, void *data) {
                      char *path = nullptr;
                      media_info_get_file_path(media, &path);
                      static_cast<std::vector<std::string> *>(data)->push_back(path);
                      free(path);
                      return true;
                  },
                  &paths),
              MEDIA_CONTENT_ERROR_NONE);
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

    struct Case {
        const char *condition;
        std::vector<std::string> paths;
    };
    const std::vector<Case> understood = {
        {"MEDIA_TYPE = 1", {"/m/a.mp4", "/m/c.mp4"}},
        {"media_type=0", {"/m/b.jpg"}},
        {"MEDIA_TYPE = 1 AND MEDIA_DISPLAY_NAME = 'A' and MEDIA_PATH=\"/m/c.mp4\"", {"/m/c.mp4"}},
        {"MEDIA_PATH= \"/m/a.mp4\" or 1=1\"", {}},
        {"  MEDIA_TYPE = 2  ", {}},
    };
    for (const Case &c : understood) {
        SCOPED_TRACE(c.condition);
        EXPECT_EQ(matching_paths(c.condition), c.paths);
    }

    const char *refused[] = {
        "",
        "MEDIA_TYPE",
        "MEDIA_TYPE = ",
        "MEDIA_TYPE = 1 or MEDIA_TYPE = 0",
        "MEDIA_SIZE = 1",
        "MEDIA_PATH = \"/m/a.mp4",
        "MEDIA_TYPE = 1x",
        "MEDIA_TYPE = 1 and",
        "MEDIA_TYPE > 1",
    };
    filter_h filter = nullptr;
    ASSERT_EQ(media_filter_create(&filter), MEDIA_CONTENT_ERROR_NONE);
    for (const char *condition : refused)
        EXPECT_EQ(media_filter_set_condition(filter, condition, MEDIA_CONTENT_COLLATE_DEFAULT),
                  MEDIA_CONTENT_ERROR_INVALID_PARAMETER)
            << condition;
    media_filter_destroy(filter);

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
    const std::string plain = dir.file("clip.avi");
    int rc = zv_test::run_program({gst, "-q", "videotestsrc", "num-buffers=3", "!",
                                   "video/x-raw,width=64,height=48", "!", "jpegenc", "!", "avimux",
                                   "!", "filesink", "location=" + plain});
    g_free(gst);
    ASSERT_EQ(rc, 0);
    // A name that a pipeline description could not hold.
    const std::string odd = dir.file("my \"clip\" ! 1.avi");
    ASSERT_EQ(rename(plain.c_str(), odd.c_str()), 0);

    char *thumb = media_content_create_thumbnail(odd.c_str());
    ASSERT_NE(thumb, nullptr);
    std::string path = thumb;
    free(thumb);
    EXPECT_EQ(path.rfind(dir.file("thumbs/"), 0), 0u) << path;
    std::string png = zv_test::read_file(path);
    ASSERT_GT(png.size(), 8u);
    EXPECT_EQ(png.substr(1, 3), "PNG");

    ASSERT_TRUE(zv_test::write_file(dir.file("notes.mp4"), "not a video"));
    EXPECT_EQ(media_content_create_thumbnail(dir.file("notes.mp4").c_str()), nullptr);
    EXPECT_EQ(media_content_create_thumbnail(dir.file("missing.mp4").c_str()), nullptr);
}

} // namespace
