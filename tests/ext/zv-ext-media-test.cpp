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

class MediaTest : public ::testing::Test
{
  protected:
    void SetUp() override { ASSERT_EQ(zv_ext_media_init(), 1); }
    void TearDown() override { EXPECT_EQ(zv_ext_media_deinit(), 1); }

    static void add(const std::string &path, const char *thumb, const char *name,
                    media_content_type_e type = MEDIA_CONTENT_TYPE_VIDEO)
    {
        ASSERT_EQ(media_content_register_file(path.c_str(), type, thumb, name),
                  MEDIA_CONTENT_ERROR_NONE);
    }

    struct Found {
        int ok = 0;
        std::string thumb = "(none)";
        std::string name = "(none)";
    };
    static Found lookup(const std::string &path)
    {
        char *thumb = nullptr, *name = nullptr;
        Found f;
        f.ok = zv_ext_media_get_thumb_info(path.c_str(), &thumb, &name);
        if (thumb)
            f.thumb = thumb;
        if (name)
            f.name = name;
        free(thumb);
        free(name);
        return f;
    }

    zv_test::TempDir dir_;
};

TEST_F(MediaTest, MissingOrEmptyDatabaseFindsNothing)
{
    Found f = lookup("/videos/a.mp4");
    EXPECT_EQ(f.ok, 1);
    EXPECT_EQ(f.thumb, "(none)");
    EXPECT_EQ(f.name, "(none)");

    ASSERT_TRUE(zv_test::write_file(dir_.file("media.db"), ""));
    f = lookup("/videos/a.mp4");
    EXPECT_EQ(f.ok, 1);
    EXPECT_EQ(f.thumb, "(none)");
}

TEST_F(MediaTest, RegisteredVideoGivesThumbnailAndName)
{
    add("/videos/a.mp4", "/thumbs/a.png", "a.mp4");
    add("/videos/photo.jpg", "/thumbs/p.png", "photo.jpg", MEDIA_CONTENT_TYPE_IMAGE);
    add("/videos/bare.mp4", nullptr, nullptr);

    struct Case {
        const char *path;
        const char *thumb;
        const char *name;
    };
    const Case cases[] = {
        {"/videos/a.mp4", "/thumbs/a.png", "a.mp4"}, {"/videos/unknown.mp4", "(none)", "(none)"},
        {"/videos/photo.jpg", "(none)", "(none)"}, // not a video
        {"/videos/bare.mp4", "(none)", "(none)"},    {"/videos/A.MP4", "(none)", "(none)"},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.path);
        Found f = lookup(c.path);
        EXPECT_EQ(f.ok, 1);
        EXPECT_EQ(f.thumb, c.thumb);
        EXPECT_EQ(f.name, c.name);
    }

    // Registering again replaces the row.
    add("/videos/a.mp4", "/thumbs/a2.png", "renamed.mp4");
    EXPECT_EQ(lookup("/videos/a.mp4").name, "renamed.mp4");
}

TEST_F(MediaTest, QuotesInPathsNeitherBreakTheQueryNorMatchOtherFiles)
{
    add("/v/a\"b.mp4", "/t/quote.png", "a\"b.mp4");
    add("/v/a", "/t/a.png", "a");
    add("/v/x.mp4", "/t/x.png", "x.mp4");
    add("/v/it's.mp4", "/t/apos.png", "it's.mp4");

    struct Case {
        const char *path;
        const char *name;
    };
    const Case cases[] = {
        {"/v/a\"b.mp4", "a\"b.mp4"},
        {"/v/it's.mp4", "it's.mp4"},
        {"/v/a\"", "(none)"},
        {"/v/x.mp4\" or \"1\"=\"1", "(none)"},
        {"/v/a\" and MEDIA_PATH= \"/v/x.mp4", "(none)"},
        {"/v/zz\" and MEDIA_TYPE = 1 and MEDIA_PATH= \"/v/x.mp4", "(none)"},
        {"\"", "(none)"},
        {"/v/x.mp4\"; DROP TABLE media; --", "(none)"},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.path);
        Found f = lookup(c.path);
        EXPECT_EQ(f.ok, 1);
        EXPECT_EQ(f.name, c.name);
    }
    EXPECT_EQ(lookup("/v/x.mp4").name, "x.mp4");
}

TEST_F(MediaTest, PathTooLongForTheConditionFails)
{
    std::string path = "/v/" + std::string(3000, 'p') + ".mp4";
    add(path, "/t/long.png", "long.mp4");
    char *thumb = nullptr, *name = nullptr;
    EXPECT_EQ(zv_ext_media_get_thumb_info(path.c_str(), &thumb, &name), 0);
    EXPECT_EQ(thumb, nullptr);
    EXPECT_EQ(name, nullptr);
}

} // namespace
