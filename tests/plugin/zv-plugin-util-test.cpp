// Plugin utilities: media types, file names and sizes, ids, and the answer extractors.
#include <gtest/gtest.h>

#include <glib.h>
#include <time.h>

#include <string>

#include "zv-plugin-util.h"

namespace
{

// A text to compare and print, NULL as "NULL".
auto text = [](const char *s) { return std::string(s ? s : "NULL"); };

// The size past 4 GiB and that of a missing file go through the data upload (client tests).
TEST(PluginUtil, MediaTypeFileNameSizeIdAndTheValuesCutOutOfAnswers)
{
    // A path longer than the working buffer is cut: its extension past 4095 is lost.
    const std::string cut = std::string(4095, 'a') + ".mp4", fits = std::string(4090, 'a') + ".mp4";
    // clang-format off
    const std::pair<const char *, const char *> types[] = { // NULL type: unknown
        {"/media/DCIM/Clip.MP4", "video/mp4"}, {"/media/a.JPEG", "image/jpeg"},
        {"/media/clip.tar.zip", "application/zip"}, // only the last dot counts
        {"/media/clip", NULL}, {"/media/clip.mov", NULL}, {"x.tif", NULL}, {"x.jpe", NULL},
        {"x.mkv", NULL}, {"x.mp4 ", NULL}, {"/dir.old/clip", NULL}, {"/dir.mp4/clip", NULL},
        {NULL, NULL}, {cut.c_str(), NULL}, {fits.c_str(), "video/mp4"},
    };
    // clang-format on
    for (auto [path, type] : types)
        EXPECT_EQ(text(zv_plugin_util_get_file_mime(path)), text(type)) << text(path);

    const std::pair<const char *, const char *> names[] = {
        {"/a/b/c.mp4", "c.mp4"}, {"c.mp4", "c.mp4"}, {"/a/b/", ""}, {"/", ""}, {NULL, NULL}};
    for (auto [path, name] : names) {
        gchar *got = zv_plugin_util_get_file_name(path);
        EXPECT_EQ(text(got), text(name)) << text(path);
        g_free(got);
    }
    EXPECT_EQ(zv_plugin_util_get_file_size(NULL), -1);
    int64_t before = time(NULL), id = zv_plugin_util_generate_id(), after = time(NULL);
    EXPECT_GE(id, before); // the current second
    EXPECT_LE(id, after);

    // The extractors of the server's answers.
    const auto loc = zv_plugin_util_get_location_value, etag = zv_plugin_util_get_video_id_value,
               range = zv_plugin_util_get_range_value, token = zv_plugin_util_get_token_value;
    // clang-format off
    const struct {
        const char *what;
        char *(*fn)(char *);
        const char *text, *value; // NULL: no value
    } cases[] = {
        {"two spaces keep one", loc, "HTTP/1.1 201\r\nLocation:  http://u/", " http://u/"},
        {"tab dropped", loc, "Location:\thttp://u/\r\n", "http://u/"},
        {"Content-Location comes first", loc, "Content-Location: /a\r\nLocation: /b\r\n", "/a"},
        {"location without value", loc, "HTTP/1.1 201\r\nLocation:\r\n\r\n", NULL},
        {"lower-case location", loc, "HTTP/1.1 201\r\nlocation: http://u/\r\n", NULL},
        {"lower-case etag", etag, "HTTP/1.1 200\r\netag: \"v\"\r\n\r\n", NULL},
        {"range at the end", range, "HTTP/1.1 308\r\nRange: bytes=0-99", "99"},
        {"range without dash", range, "HTTP/1.1 308\r\nRange: bytes=1023", NULL},
        {"range without upper bound", range, "HTTP/1.1 308\r\nRange: bytes=0-", NULL},
        {"dash found on a later line", range, "Range: bytes=5\r\nX-A: b-c\r\n", "A: b-c"},
        {"lower-case range", range, "HTTP/1.1 308\r\nrange: bytes=0-10\r\n", NULL},
        {"any key in front", token, "{\"type\": \"Bearer\", \"access_token\": \"t\"}", "Bearer"},
        {"compact JSON", token, "{\"access_token\":\"t\"}", NULL},
        {"error with invalid_grant", token, "{\"error\": \"invalid_grant\"}", NULL},
        {"other error", token, "{\"error\": \"invalid_client\"}", NULL},
        {"value runs to the end", token, "{\"a\": \"open", "open"},
        {"only quotes after", token, "{\"a\": \"\"\"", NULL},
        {"escaped quote ends the value", token, "{\"a\": \"x\\\"y\"}", "x\\"},
    };
    // clang-format on
    for (const auto &c : cases) {
        gchar *copy = g_strdup(c.text), *value = c.fn(copy);
        EXPECT_EQ(text(value), text(c.value)) << c.what;
        g_free(value);
        g_free(copy);
    }
    for (auto fn : {loc, etag, range, token})
        EXPECT_EQ(fn(NULL), nullptr);
}

} // namespace
