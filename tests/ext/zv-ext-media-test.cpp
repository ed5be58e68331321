// Tests of the media library lookup on a real SQLite media database made through the host's
// registration call.
#include "zv-ext-media.h"

#include <gtest/gtest.h>
#include <media_content.h>
#include <stdlib.h>
#include <string.h>

#include "zv-test-util.h"

namespace
{

// "RESULT THUMB NAME" of a lookup of path, "-" for what is not handed out.
std::string lookup(const std::string &path)
{
    char *thumb = nullptr, *name = nullptr;
    int rc = zv_ext_media_get_thumb_info(path.c_str(), &thumb, &name);
    std::string found =
        std::to_string(rc) + " " + (thumb ? thumb : "-") + " " + (name ? name : "-");
    free(thumb);
    free(name);
    return found;
}

// A video is found by its exact path; registering it again replaces its row. Quotes in a
// path neither break the condition nor match other files; a path too long for the
// condition fails and hands out nothing.
TEST(MediaTest, VideoIsFoundByItsExactPathOnly)
{
    zv_test::TempDir dir;
    ASSERT_EQ(zv_ext_media_init(), 1);
    EXPECT_EQ(lookup("/v/a.mp4"), "1 - -"); // no database yet
    ASSERT_TRUE(zv_test::write_file(dir.file("media.db"), ""));
    EXPECT_EQ(lookup("/v/a.mp4"), "1 - -");

    const std::string too_long = "/v/" + std::string(3000, 'p') + ".mp4";
    const char *cases[][4] = {
        // path; thumbnail and name registered for it first ("-": nothing registered; a .jpg is
        // a photo, anything else a video); "RESULT THUMB NAME" of its lookup
        {"/v/a.mp4", "/t/a.png", "a.mp4", "1 /t/a2.png renamed.mp4"},
        {"/v/a.mp4", "/t/a2.png", "renamed.mp4", "1 /t/a2.png renamed.mp4"},
        {"/v/photo.jpg", "/t/p.png", "photo.jpg", "1 - -"},
        {"/v/bare.mp4", nullptr, nullptr, "1 - -"},
        {"/v/A.MP4", "-", "-", "1 - -"},
        {"/v/a\"b.mp4", "/t/quote.png", "a\"b.mp4", "1 /t/quote.png a\"b.mp4"},
        {"/v/it's.mp4", "/t/apos.png", "it's.mp4", "1 /t/apos.png it's.mp4"},
        {"/v/a", "/t/plain.png", "a", "1 /t/plain.png a"},
        {"/v/x.mp4\"; DROP TABLE media; --", "-", "-", "1 - -"}, // not "/v/x.mp4"
        {"/v/x.mp4", "/t/x.png", "x.mp4", "1 /t/x.png x.mp4"},
        {too_long.c_str(), "/t/long.png", "long.mp4", "0 - -"},
    };
    for (const auto &c : cases) {
        auto type = strstr(c[0], ".jpg") ? MEDIA_CONTENT_TYPE_IMAGE : MEDIA_CONTENT_TYPE_VIDEO;
        if (c[1] && !strcmp(c[1], "-"))
            continue;
        EXPECT_EQ(media_content_register_file(c[0], type, c[1], c[2]), MEDIA_CONTENT_ERROR_NONE)
            << c[0];
    }
    for (const auto &c : cases)
        EXPECT_EQ(lookup(c[0]), c[3]) << c[0];
    EXPECT_EQ(zv_ext_media_deinit(), 1);
}

} // namespace
