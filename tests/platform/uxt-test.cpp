// UI extension: the application's colour and font tables, colour codes on objects, and
// tables that are missing or broken.
#include "uxt.h"

#include <Edje.h>
#include <Elementary.h>
#include <gtest/gtest.h>

#include <filesystem>
#include <set>
#include <string>
#include <vector>

#include "app_i18n.h"
#include "vconf.h"
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

// ZV_THEME=dark loads the dark table in place of the light one: it has every code of the
// light table, with dark surfaces and light texts; and every colour and text class the
// themes use is one of the tables', so that the whole window follows them.
TEST(UxtTables, DarkTableReplacesTheLightOneEverywhere)
{
    const std::string light_path = table_path("zuvo-upload-svc_ChangeableColorInfo.xml");
    uxt_theme_color_table_h light = uxt_theme_add_color_table(light_path.c_str());
    setenv("ZV_THEME", "dark", 1);
    uxt_theme_color_table_h dark = uxt_theme_add_color_table(light_path.c_str());
    unsetenv("ZV_THEME");
    ASSERT_NE(light, nullptr);
    ASSERT_NE(dark, nullptr);

    auto luma = [](uxt_theme_color_table_h table, const std::string &code) {
        uxt_theme_set_color_table(table);
        int r = 0, g = 0, b = 0, a = 0;
        if (uxt_theme_get_color(code.c_str(), &r, &g, &b, &a) != UXT_ERROR_NONE)
            return -1;
        return (r * 299 + g * 587 + b * 114) / 1000;
    };
    std::set<std::string> codes;
    std::string text = read_file(light_path);
    for (size_t at = text.find("code=\""); at != std::string::npos;
         at = text.find("code=\"", at + 1))
        codes.insert(text.substr(at + 6, 5));
    ASSERT_GE(codes.size(), 20u);
    for (const auto &code : codes)
        EXPECT_GE(luma(dark, code), 0) << code << " missing from the dark table";
    for (const char *surface : {"AO001", "AO002", "AO018"})
        EXPECT_LT(luma(dark, surface), luma(light, surface) - 100) << surface;
    for (const char *text_code : {"AO010", "AO011"})
        EXPECT_GT(luma(dark, text_code), luma(light, text_code) + 100) << text_code;

    // The theme sources name no colour class outside the colour table (as a part's colour
    // class or as a text style's "cc:") and no text class outside the font table.
    std::set<std::string> fonts;
    text = read_file(table_path("zuvo-upload-svc_ChangeableFontInfo.xml"));
    for (size_t at = text.find("class=\""); at != std::string::npos;
         at = text.find("class=\"", at + 1))
        fonts.insert(text.substr(at + 7, 4));
    for (const auto &entry :
         std::filesystem::recursive_directory_iterator(source_path("res/edje"))) {
        if (entry.path().extension() != ".edc")
            continue;
        std::string edc = read_file(entry.path().string());
        for (const char *mark : {"color_class: \"", "cc:", "text_class: \"", "text_class="}) {
            const std::set<std::string> &known = mark[0] == 't' ? fonts : codes;
            for (size_t at = edc.find(mark); at != std::string::npos; at = edc.find(mark, at + 1)) {
                size_t from = at + strlen(mark);
                std::string name = edc.substr(from, edc.find_first_of("\" ", from) - from);
                EXPECT_TRUE(known.count(name)) << entry.path() << " uses the class " << name;
            }
        }
    }
    uxt_theme_delete_color_table(light);
    uxt_theme_delete_color_table(dark);
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
    EXPECT_EQ(uxt_access_set_screen_reader_enabled(nullptr, false), UXT_ERROR_INVALID_PARAMETER);

    // The notice that the screen reader is off shows once, and only when the host's screen
    // reader (its settings key) was on.
    TempDir tmp;
    auto popups = [win] {
        std::vector<Evas_Object *> found;
        for (Evas_Object *o = evas_object_bottom_get(evas_object_evas_get(win)); o;
             o = evas_object_above_get(o))
            if (elm_object_widget_check(o) && !strcmp(elm_object_widget_type_get(o), "Elm_Popup"))
                found.push_back(o);
        return found;
    };
    for (int host_reader : {0, 1}) {
        ASSERT_EQ(vconf_set_int("db/setting/accessibility/tts", host_reader), 0);
        for (int launch = 0; launch < 2; launch++) {
            EXPECT_EQ(uxt_access_set_screen_reader_enabled(win, false), UXT_ERROR_NONE);
            EXPECT_FALSE(elm_config_access_get());
            EXPECT_EQ(uxt_access_show_screen_reader_disabled_popup(win), UXT_ERROR_NONE);
        }
        EXPECT_EQ(popups().size(), (size_t)host_reader) << "host reader " << host_reader;
    }
    int host_reader = -1;
    EXPECT_EQ(vconf_get_int("db/setting/accessibility/tts", &host_reader), 0);
    EXPECT_EQ(host_reader, 0);
    ASSERT_EQ(popups().size(), 1u);
    Evas_Object *popup = popups()[0];
    ASSERT_NE(popup, nullptr);
    EXPECT_STREQ(elm_object_text_get(popup), i18n_get_text("IDS_ST_POP_SCREEN_READER_TURNED_OFF"));
    EXPECT_STRNE(elm_object_text_get(popup), "IDS_ST_POP_SCREEN_READER_TURNED_OFF");
    evas_object_del(win);
}
