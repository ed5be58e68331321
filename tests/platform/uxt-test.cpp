// UI extension: the application's colour and font tables, colour codes on objects, the dark
// table, and tables that are missing or broken. (The screen-reader notice: the application
// entry's test, which turns the reader off at create and at each launch.)
#include "uxt.h"

#include <Edje.h>
#include <Elementary.h>
#include <gtest/gtest.h>

#include <filesystem>
#include <set>
#include <string>
#include <vector>

#include "zv-test-util.h"

using namespace zv_test;

namespace
{

const std::string kColors =
    std::string(ZV_BUILD_RES_DIR) + "tables/zuvo-upload-svc_ChangeableColorInfo.xml";
const std::string kFonts =
    std::string(ZV_BUILD_RES_DIR) + "tables/zuvo-upload-svc_ChangeableFontInfo.xml";

// The names of len characters that follow each mark in a file.
std::set<std::string> names_after(const std::string &path, const std::string &mark, size_t len)
{
    std::set<std::string> names;
    std::string text = read_file(path);
    for (size_t at = text.find(mark); at != std::string::npos; at = text.find(mark, at + 1))
        names.insert(text.substr(at + mark.size(), len));
    return names;
}

// The brightness of a colour of the table, -1 when the table has no such code.
int luma(uxt_theme_color_table_h table, const std::string &code)
{
    int r = 0, g = 0, b = 0, a = 0;
    if (uxt_theme_set_color_table(table) != UXT_ERROR_NONE ||
        uxt_theme_get_color(code.c_str(), &r, &g, &b, &a) != UXT_ERROR_NONE)
        return -1;
    return (r * 299 + g * 587 + b * 114) / 1000;
}

} // namespace

TEST(UxtTables, ApplicationAndDarkTablesReachEdjeObjectsAndThemes)
{
    uxt_theme_set_changeable_ui_enabled(true);
    uxt_theme_color_table_h colors = uxt_theme_add_color_table(kColors.c_str());
    uxt_theme_font_table_h fonts = uxt_theme_add_font_table(kFonts.c_str());
    ASSERT_NE(colors, nullptr);
    ASSERT_NE(fonts, nullptr);
    int r, g, b, a, er, eg, eb, ea, x;
    ASSERT_EQ(uxt_theme_set_color_table(colors), UXT_ERROR_NONE);
    ASSERT_EQ(uxt_theme_set_font_table(fonts), UXT_ERROR_NONE);
    EXPECT_EQ(uxt_theme_get_color("ZZ999", &r, &g, &b, &a), UXT_ERROR_NO_DATA);
    ASSERT_EQ(uxt_theme_get_color("AO005", &r, &g, &b, &a), UXT_ERROR_NONE);
    EXPECT_EQ(a, 255);
    ASSERT_TRUE(edje_color_class_get("AO005", &er, &eg, &eb, &ea, &x, &x, &x, &x, &x, &x, &x, &x));
    EXPECT_EQ(std::vector<int>({er, eg, eb}), std::vector<int>({r, g, b}));

    // An image is tinted with the (opaque) colour.
    Evas_Object *win = elm_win_add(nullptr, "uxt-test", ELM_WIN_BASIC);
    Evas_Object *image = elm_image_add(win);
    ASSERT_EQ(uxt_theme_object_set_color(image, "AO006"), UXT_ERROR_NONE);
    uxt_theme_get_color("AO006", &r, &g, &b, &a);
    evas_object_color_get(image, &er, &eg, &eb, &ea);
    EXPECT_EQ(std::vector<int>({er, eg, eb, ea}), std::vector<int>({r, g, b, 255}));
    EXPECT_EQ(uxt_theme_object_set_color(image, "ZZ999"), UXT_ERROR_NO_DATA);
    evas_object_del(win);

    // ZV_THEME=dark loads the dark table in place of the light one: it has every code of the
    // light table, with dark surfaces and light texts.
    setenv("ZV_THEME", "dark", 1);
    uxt_theme_color_table_h dark = uxt_theme_add_color_table(kColors.c_str());
    unsetenv("ZV_THEME");
    const std::set<std::string> codes = names_after(kColors, "code=\"", 5);
    ASSERT_GE(codes.size(), 20u);
    for (const auto &code : codes)
        EXPECT_GE(luma(dark, code), 0) << code << " missing from the dark table";
    for (const char *surface : {"AO001", "AO002", "AO018"})
        EXPECT_LT(luma(dark, surface), luma(colors, surface) - 100) << surface;
    for (const char *text : {"AO010", "AO011"})
        EXPECT_GT(luma(dark, text), luma(colors, text) + 100) << text;
    EXPECT_EQ(uxt_theme_delete_color_table(dark), UXT_ERROR_NONE);
    EXPECT_EQ(uxt_theme_delete_color_table(colors), UXT_ERROR_NONE);
    EXPECT_EQ(uxt_theme_delete_font_table(fonts), UXT_ERROR_NONE);
    EXPECT_EQ(uxt_theme_get_color("AO005", &r, &g, &b, &a), UXT_ERROR_NO_DATA);

    // (A missing table: the application entry's test.)
    TempDir tmp;
    write_file(tmp.file("broken.xml"), "<ChangeableColorTable><Color code=");
    write_file(tmp.file("wrong-root.xml"), "<Something/>");
    for (std::string path : {tmp.file("broken.xml"), tmp.file("wrong-root.xml")}) {
        EXPECT_EQ(uxt_theme_add_color_table(path.c_str()), nullptr) << path;
        EXPECT_EQ(uxt_theme_add_font_table(path.c_str()), nullptr) << path;
    }
    EXPECT_EQ(uxt_theme_add_color_table(nullptr), nullptr);

    // The theme sources name no colour class outside the colour table (as a part's colour
    // class or as a text style's "cc:") and no text class outside the font table, so that the
    // whole window follows the tables.
    const std::set<std::string> font_classes = names_after(kFonts, "class=\"", 4);
    for (const auto &entry :
         std::filesystem::recursive_directory_iterator(source_path("res/edje"))) {
        if (entry.path().extension() != ".edc")
            continue;
        std::string edc = read_file(entry.path().string());
        for (std::string mark : {"color_class: \"", "cc:", "text_class: \"", "text_class="}) {
            for (size_t at = edc.find(mark); at != std::string::npos; at = edc.find(mark, at + 1)) {
                size_t from = at + mark.size();
                std::string name = edc.substr(from, edc.find_first_of("\" ", from) - from);
                EXPECT_TRUE((mark[0] == 't' ? font_classes : codes).count(name))
                    << entry.path() << " uses " << name;
            }
        }
    }
}
