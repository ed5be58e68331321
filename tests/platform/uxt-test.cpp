// UI extension: the application's colour and font tables, colour codes on objects, and
// tables that are missing or broken.
#include "uxt.h"

#include <Edje.h>
#include <Elementary.h>
#include <gtest/gtest.h>

#include <string>

#include "zv-test-util.h"

using namespace zv_test;

namespace {

// The tables as the build lays them out under its resource folder.
std::string table_path(const char *name)
{
    return std::string(ZV_BUILD_RES_DIR) + "tables/" + name;
}

} // namespace

TEST(UxtTables, ApplicationTablesLoadWithTheListColours)
{
    uxt_theme_set_changeable_ui_enabled(true);
    uxt_theme_color_table_h colors =
        uxt_theme_add_color_table(table_path("zuvo-upload-svc_ChangeableColorInfo.xml").c_str());
    uxt_theme_font_table_h fonts =
        uxt_theme_add_font_table(table_path("zuvo-upload-svc_ChangeableFontInfo.xml").c_str());
    ASSERT_NE(colors, nullptr);
    ASSERT_NE(fonts, nullptr);
    int r, g, b, a;
    EXPECT_EQ(uxt_theme_get_color("AO005", &r, &g, &b, &a), UXT_ERROR_NO_DATA); // not current yet
    ASSERT_EQ(uxt_theme_set_color_table(colors), UXT_ERROR_NONE);
    ASSERT_EQ(uxt_theme_set_font_table(fonts), UXT_ERROR_NONE);
    for (const char *code : {"AO005", "AO006"}) {
        ASSERT_EQ(uxt_theme_get_color(code, &r, &g, &b, &a), UXT_ERROR_NONE) << code;
        EXPECT_EQ(a, 255);
    }
    // The colours reach Edje as colour classes.
    int er, eg, eb, ea, unused;
    ASSERT_TRUE(edje_color_class_get("AO005", &er, &eg, &eb, &ea, &unused, &unused, &unused,
                                     &unused, &unused, &unused, &unused, &unused));
    uxt_theme_get_color("AO005", &r, &g, &b, &a);
    EXPECT_EQ(er, r);
    EXPECT_EQ(eb, b);
    EXPECT_EQ(uxt_theme_get_color("ZZ999", &r, &g, &b, &a), UXT_ERROR_NO_DATA);

    // An image is tinted with the colour; a layout gets it as its colour class.
    Evas_Object *win = elm_win_add(nullptr, "uxt-test", ELM_WIN_BASIC);
    Evas_Object *image = elm_image_add(win);
    ASSERT_EQ(uxt_theme_object_set_color(image, "AO006"), UXT_ERROR_NONE);
    int ir, ig, ib, ia;
    evas_object_color_get(image, &ir, &ig, &ib, &ia);
    uxt_theme_get_color("AO006", &r, &g, &b, &a);
    EXPECT_EQ(ir, r * a / 255);
    EXPECT_EQ(ia, a);
    Evas_Object *layout = elm_layout_add(win);
    ASSERT_EQ(uxt_theme_object_set_color(layout, "AO005"), UXT_ERROR_NONE);
    EXPECT_TRUE(edje_object_color_class_get(elm_layout_edje_get(layout), "AO005", &er, &eg, &eb,
                                            &ea, &unused, &unused, &unused, &unused, &unused,
                                            &unused, &unused, &unused));
    uxt_theme_get_color("AO005", &r, &g, &b, &a);
    EXPECT_EQ(er, r);
    EXPECT_EQ(uxt_theme_object_set_color(image, "ZZ999"), UXT_ERROR_NO_DATA);
    evas_object_del(win);

    EXPECT_EQ(uxt_theme_delete_color_table(colors), UXT_ERROR_NONE);
    EXPECT_EQ(uxt_theme_delete_font_table(fonts), UXT_ERROR_NONE);
    EXPECT_EQ(uxt_theme_get_color("AO005", &r, &g, &b, &a), UXT_ERROR_NO_DATA);
}

TEST(UxtTables, MissingOrBrokenTablesGiveNull)
{
    TempDir tmp;
    write_file(tmp.file("broken.xml"), "<ChangeableColorTable><Color code=");
    write_file(tmp.file("wrong-root.xml"), "<Something/>");
    for (std::string path :
         {tmp.file("absent.xml"), tmp.file("broken.xml"), tmp.file("wrong-root.xml")}) {
        EXPECT_EQ(uxt_theme_add_color_table(path.c_str()), nullptr) << path;
        EXPECT_EQ(uxt_theme_add_font_table(path.c_str()), nullptr) << path;
    }
    EXPECT_EQ(uxt_theme_add_color_table(nullptr), nullptr);
}

TEST(UxtWidgets, ButtonAndScreenReader)
{
    Evas_Object *win = elm_win_add(nullptr, "uxt-test", ELM_WIN_BASIC);
    Evas_Object *button = uxt_button_add(win);
    ASSERT_NE(button, nullptr);
    EXPECT_STREQ(elm_object_widget_type_get(button), "Elm_Button");
    EXPECT_EQ(uxt_access_set_screen_reader_enabled(win, false), UXT_ERROR_NONE);
    EXPECT_FALSE(elm_config_access_get());
    EXPECT_EQ(uxt_access_show_screen_reader_disabled_popup(win), UXT_ERROR_NONE);
    EXPECT_EQ(uxt_access_set_screen_reader_enabled(nullptr, false), UXT_ERROR_INVALID_PARAMETER);
    evas_object_del(win);
}
