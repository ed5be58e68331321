// Tests of the media library lookup on a real SQLite media database made through the host's
// registration call.
#include "zv-ext-media.h"

#include <gtest/gtest.h>
#include <media_content.h>
#include <stdlib.h>

#include <string>

#include "zv-test-util.h"

namespace
{

void add(const std::string &path, const char *thumb, const char *name,
         media_content_type_e type = MEDIA_CONTENT_TYPE_VIDEO)
{
    ASSERT_EQ(media_content_register_file(path.c_str(), type, thumb, name),
              MEDIA_CONTENT_ERROR_NONE);
}

// "THUMB NAME" of the video at path, "-" for what is not found.
std::string lookup(const std::string &path)
{
    char *thumb = nullptr, *name = nullptr;
    EXPECT_EQ(zv_ext_media_get_thumb_info(path.c_str(), &thumb, &name), 1) << path;
    std::string found = std::string(thumb ? thumb : "-") + " " + (name ? name : "-");
    free(thumb);
    free(name);
    return found;
}

TEST(MediaTest, VideoIsFoundByItsExactPathOnly)
{
    zv_test::TempDir dir;
    ASSERT_EQ(zv_ext_media_init(), 1);
    EXPECT_EQ(lookup("/v/a.mp4"), "- -"); // no database yet
    ASSERT_TRUE(zv_test::write_file(dir.file("media.db"), ""));
    EXPECT_EQ(lookup("/v/a.mp4"), "- -");

    add("/v/a.mp4", "/t/a.png", "a.mp4");
    add("/v/photo.jpg", "/t/p.png", "photo.jpg", MEDIA_CONTENT_TYPE_IMAGE);
    add("/v/bare.mp4", nullptr, nullptr);
    add("/v/a\"b.mp4", "/t/quote.png", "a\"b.mp4");
    add("/v/a", "/t/plain.png", "a");
    add("/v/x.mp4", "/t/x.png", "x.mp4");
    add("/v/it's.mp4", "/t/apos.png", "it's.mp4");
    const char *cases[][2] = {
        {"/v/a.mp4", "/t/a.png a.mp4"},
        {"/v/unknown.mp4", "- -"},
        {"/v/photo.jpg", "- -"}, // not a video
        {"/v/bare.mp4", "- -"},
        {"/v/A.MP4", "- -"},
        {"/v/a\"b.mp4", "/t/quote.png a\"b.mp4"},
        {"/v/it's.mp4", "/t/apos.png it's.mp4"},
        // Quotes neither break the condition nor match other files.
        {"/v/a\"", "- -"},
        {"/v/x.mp4\" or \"1\"=\"1", "- -"},
        {"/v/a\" and MEDIA_PATH= \"/v/x.mp4", "- -"},
        {"/v/zz\" and MEDIA_TYPE = 1 and MEDIA_PATH= \"/v/x.mp4", "- -"},
        {"\"", "- -"},
        {"/v/x.mp4\"; DROP TABLE media; --", "- -"},
        {"/v/x.mp4", "/t/x.png x.mp4"},
    };
    for (const auto &c : cases)
        EXPECT_EQ(lookup(c[0]), c[1]) << c[0];
    add("/v/a.mp4", "/t/a2.png", "renamed.mp4"); // registering again replaces the row
    EXPECT_EQ(lookup("/v/a.mp4"), "/t/a2.png renamed.mp4");

    // A path too long for the condition fails and hands out nothing.
    std::string path = "/v/" + std::string(3000, 'p') + ".mp4";
    add(path, "/t/long.png", "long.mp4");
    char *thumb = nullptr, *name = nullptr;
    EXPECT_EQ(zv_ext_media_get_thumb_info(path.c_str(), &thumb, &name), 0);
    EXPECT_EQ(thumb, nullptr);
    EXPECT_EQ(name, nullptr);
    EXPECT_EQ(zv_ext_media_deinit(), 1);
}

} // namespace
