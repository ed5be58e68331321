// Plugin utilities: media types, file names and sizes, and the answer extractors.
#include <gtest/gtest.h>

#include <glib.h>
#include <time.h>
#include <unistd.h>

#include <optional>
#include <string>

#include "zv-plugin-util.h"
#include "zv-test-util.h"

namespace
{

using Extractor = char *(*)(char *);

// Runs an extractor on a writable copy of text; nullopt for NULL.
std::optional<std::string> extract(Extractor fn, const char *text)
{
    gchar *copy = g_strdup(text);
    gchar *value = fn(copy);
    std::optional<std::string> out;
    if (value)
        out = value;
    g_free(value);
    g_free(copy);
    return out;
}

TEST(PluginUtil, MediaTypeFromTheLastExtension)
{
    struct Case {
        const char *path;
        const char *type; // NULL: unknown
    };
    const Case cases[] = {
        {"/media/DCIM/Clip.MP4", "video/mp4"},
        {"/media/a.JPEG", "image/jpeg"},
        {"a.jpg", "image/jpeg"},
        {"x.png", "image/png"},
        {"x.BMP", "image/bmp"},
        {"x.gif", "image/gif"},
        {"x.tiff", "image/tiff"},
        {"x.wmv", "video/x-ms-wmv"},
        {"x.mp3", "audio/mp3"},
        {"x.3GP", "video/3gp"},
        {"x.avi", "video/x-msvideo"},
        {"x.doc", "application/msword"},
        {"x.pdf", "application/pdf"},
        {"/media/clip.tar.zip", "application/zip"}, // only the last dot counts
        {"x.txt", "text/plain"},
        {"/media/clip", NULL},
        {"/media/clip.mov", NULL},
        {"x.tif", NULL},
        {"x.jpe", NULL},
        {"x.mkv", NULL},
        {"x.mp4 ", NULL}, // exact match only
        {"/dir.old/clip", NULL},
        {"/dir.mp4/clip", NULL},
        {NULL, NULL},
    };
    for (const Case &c : cases) {
        const char *type = zv_plugin_util_get_file_mime(c.path);
        if (c.type)
            EXPECT_STREQ(type, c.type) << c.path;
        else
            EXPECT_EQ(type, nullptr) << (c.path ? c.path : "NULL");
    }
    // A path longer than the working buffer is cut: its extension past 4095 is lost.
    std::string long_path = std::string(4095, 'a') + ".mp4";
    EXPECT_EQ(zv_plugin_util_get_file_mime(long_path.c_str()), nullptr);
    std::string fits = std::string(4090, 'a') + ".mp4";
    EXPECT_STREQ(zv_plugin_util_get_file_mime(fits.c_str()), "video/mp4");
}

TEST(PluginUtil, FileNameIsTheLastComponent)
{
    const std::pair<const char *, const char *> cases[] = {
        {"/a/b/c.mp4", "c.mp4"}, {"c.mp4", "c.mp4"}, {"/a/b/", ""}, {"/", ""}};
    for (auto [path, name] : cases) {
        gchar *got = zv_plugin_util_get_file_name(path);
        EXPECT_STREQ(got, name) << path;
        g_free(got);
    }
    EXPECT_EQ(zv_plugin_util_get_file_name(NULL), nullptr);
}

TEST(PluginUtil, FileSize)
{
    zv_test::TempDir tmp;
    ASSERT_TRUE(zv_test::write_file(tmp.file("empty"), ""));
    ASSERT_TRUE(zv_test::write_file(tmp.file("ten"), "0123456789"));
    ASSERT_TRUE(zv_test::write_file(tmp.file("video"), ""));
    ASSERT_EQ(truncate(tmp.file("video").c_str(), 5000000000LL), 0); // sparse, past 4 GiB
    EXPECT_EQ(zv_plugin_util_get_file_size(tmp.file("empty").c_str()), 0);
    EXPECT_EQ(zv_plugin_util_get_file_size(tmp.file("ten").c_str()), 10);
    EXPECT_EQ(zv_plugin_util_get_file_size(tmp.file("video").c_str()), 5000000000LL);
    EXPECT_EQ(zv_plugin_util_get_file_size(tmp.file("missing").c_str()), -1);
    EXPECT_EQ(zv_plugin_util_get_file_size(NULL), -1);
}

TEST(PluginUtil, IdIsTheCurrentSecond)
{
    time_t before = time(NULL);
    int id = zv_plugin_util_generate_id();
    time_t after = time(NULL);
    EXPECT_GE(id, static_cast<int>(before));
    EXPECT_LE(id, static_cast<int>(after));
}

struct ExtractCase {
    const char *what;
    Extractor fn;
    const char *text;
    const char *value; // NULL: no value
};

TEST(PluginUtil, ExtractorsCutTheirValueOutOfTheAnswer)
{
    using namespace std::string_literals;
    const auto loc = zv_plugin_util_get_location_value;
    const auto etag = zv_plugin_util_get_video_id_value;
    const auto range = zv_plugin_util_get_range_value;
    const auto token = zv_plugin_util_get_token_value;
    const ExtractCase cases[] = {
        {"location", loc, "HTTP/1.1 201 Created\r\nLocation: http://up.example/up?id=9&x=1\r\n\r\n",
         "http://up.example/up?id=9&x=1"},
        {"location, two spaces keep one", loc, "HTTP/1.1 201 Created\r\nLocation:  http://u/\r\n",
         " http://u/"},
        {"location, tab dropped", loc, "Location:\thttp://u/\r\n", "http://u/"},
        {"location at the end of the text", loc, "HTTP/1.1 201\r\nLocation: http://u/",
         "http://u/"},
        {"Content-Location comes first", loc,
         "HTTP/1.1 201\r\nContent-Location: /a\r\nLocation: /b\r\n", "/a"},
        {"location without value", loc, "HTTP/1.1 201\r\nLocation:\r\n\r\n", NULL},
        {"lower-case location", loc, "HTTP/1.1 201\r\nlocation: http://u/\r\n", NULL},
        {"no location", loc, "HTTP/1.1 201 Created\r\n\r\n", NULL},
        {"etag keeps space and quotes", etag, "HTTP/1.1 200 OK\r\nETag: \"v-123\"\r\n\r\n",
         " \"v-123\""},
        {"lower-case etag", etag, "HTTP/1.1 200 OK\r\netag: \"v\"\r\n\r\n", NULL},
        {"range", range, "HTTP/1.1 308 Resume Incomplete\r\nRange: bytes=0-1023\r\n\r\n", "1023"},
        {"range at the end", range, "HTTP/1.1 308\r\nRange: bytes=0-99", "99"},
        {"range without dash", range, "HTTP/1.1 308\r\nRange: bytes=1023", NULL},
        {"range without upper bound", range, "HTTP/1.1 308\r\nRange: bytes=0-", NULL},
        {"dash found on a later line", range, "Range: bytes=5\r\nX-A: b-c\r\n", "A: b-c"},
        {"lower-case range", range, "HTTP/1.1 308\r\nrange: bytes=0-10\r\n", NULL},
        {"token", token, "{\n  \"access_token\": \"ya29.AbC\",\n  \"expires_in\": 3600\n}",
         "ya29.AbC"},
        {"any key in front", token, "{\"token_type\": \"Bearer\", \"access_token\": \"t\"}",
         "Bearer"},
        {"compact JSON", token, "{\"access_token\":\"t\"}", NULL},
        {"error with invalid_grant", token, "{\"error\": \"invalid_grant\"}", NULL},
        {"other error", token, "{\"error\": \"invalid_client\"}", NULL},
        {"no colon, space, quote", token, "Auth=abc", NULL},
        {"value runs to the end", token, "{\"a\": \"open", "open"},
        {"only quotes after", token, "{\"a\": \"\"\"", NULL},
        {"escaped quote ends the value", token, "{\"a\": \"x\\\"y\"}", "x\\"},
    };
    for (const ExtractCase &c : cases) {
        std::optional<std::string> got = extract(c.fn, c.text);
        if (c.value) {
            EXPECT_EQ(got, std::optional<std::string>(c.value)) << c.what;
        } else {
            EXPECT_EQ(got, std::nullopt) << c.what;
        }
    }
    for (Extractor fn : {loc, etag, range, token})
        EXPECT_EQ(fn(NULL), nullptr);
}

TEST(PluginUtil, ExtractorsCutTheTextInPlace)
{
    char text[] = "HTTP/1.1 201\r\nLocation: http://u/\r\nX: y\r\n";
    gchar *value = zv_plugin_util_get_location_value(text);
    EXPECT_STREQ(value, "http://u/");
    g_free(value);
    // The header name lost its colon and the value its line end.
    EXPECT_STREQ(text, "HTTP/1.1 201\r\nLocation");
    EXPECT_STREQ(text + strlen("HTTP/1.1 201\r\nLocation:"), " http://u/");
}

} // namespace
