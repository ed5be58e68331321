// Host UI extension: changeable colour and font tables read from the application's XML table
// files and pushed to Edje as colour and text classes, colour codes applied to objects, the
// application's button factory and the screen-reader switch (Elementary's access mode).
//
// Theme: with ZV_THEME=dark a colour table is read from the dark/ folder beside the file
// asked for (tables/dark/NAME for tables/NAME), when there is one.
// Screen reader: the settings key db/setting/accessibility/tts (int, 1 on) is the host's
// screen reader; switching it off for the application clears the key, and the notice that
// says so is shown only when the key was on.
//
// Table files:
//   <ChangeableColorTable> <Color code="AO005" r="0" g="122" b="255" a="255"/> ...
//   <ChangeableFontTable>  <Font class="T01" family="Sans" style="Regular" size="28"/> ...
// Thread safety: main loop only.
#include "uxt.h"

#include <Edje.h>
#include <Elementary.h>
#include <libxml/parser.h>
#include <libxml/tree.h>
#include <stdlib.h>
#include <string.h>
#include <unistd.h>

#include <map>
#include <memory>
#include <string>

#include "app_i18n.h"
#include "vconf.h"
#include "zv-log.h"

struct uxt_theme_color_table_s {
    struct Rgba {
        int r, g, b, a;
    };
    std::map<std::string, Rgba> colors;
};

struct uxt_theme_font_table_s {
    struct Font {
        std::string family;
        std::string style;
        int size;
    };
    std::map<std::string, Font> fonts;
};

namespace {

struct UxtState {
    bool changeable = false;
    uxt_theme_color_table_h color_table = nullptr;
    uxt_theme_font_table_h font_table = nullptr;
    bool screen_reader = false;
    // The host's screen reader was on when the application switched it off, and the popup
    // that says so has not been shown yet.
    bool reader_notice_due = false;
};

constexpr const char kScreenReaderKey[] = "db/setting/accessibility/tts";

UxtState &uxt_state()
{
    static UxtState st;
    return st;
}

struct XmlDocDeleter {
    void operator()(xmlDoc *doc) const { xmlFreeDoc(doc); }
};
using XmlDocPtr = std::unique_ptr<xmlDoc, XmlDocDeleter>;

std::string attr(xmlNode *node, const char *name)
{
    xmlChar *value = xmlGetProp(node, reinterpret_cast<const xmlChar *>(name));
    std::string s = value ? reinterpret_cast<const char *>(value) : "";
    xmlFree(value);
    return s;
}

bool int_attr(xmlNode *node, const char *name, int lo, int hi, int *out)
{
    std::string s = attr(node, name);
    if (s.empty())
        return false;
    char *end = nullptr;
    long v = strtol(s.c_str(), &end, 10);
    if (*end != '\0' || v < lo || v > hi)
        return false;
    *out = (int)v;
    return true;
}

bool is_element(xmlNode *node, const char *name)
{
    return node->type == XML_ELEMENT_NODE &&
           xmlStrcmp(node->name, reinterpret_cast<const xmlChar *>(name)) == 0;
}

// The document's root when it is the expected element; logs and answers null otherwise.
XmlDocPtr load_table(const char *file_path, const char *root_name, xmlNode **root)
{
    if (!file_path) {
        ZV_LOGE("no table file");
        return nullptr;
    }
    XmlDocPtr doc(xmlReadFile(file_path, nullptr, XML_PARSE_NONET | XML_PARSE_NOERROR |
                                                      XML_PARSE_NOWARNING));
    if (!doc) {
        ZV_LOGE("cannot read table %s", file_path);
        return nullptr;
    }
    *root = xmlDocGetRootElement(doc.get());
    if (!*root || !is_element(*root, root_name)) {
        ZV_LOGE("%s is not a %s", file_path, root_name);
        return nullptr;
    }
    return doc;
}

void push_colors(uxt_theme_color_table_h table)
{
    for (const auto &kv : table->colors) {
        const auto &c = kv.second;
        edje_color_class_set(kv.first.c_str(), c.r, c.g, c.b, c.a, c.r, c.g, c.b, c.a, c.r, c.g,
                             c.b, c.a);
    }
}

void push_fonts(uxt_theme_font_table_h table)
{
    for (const auto &kv : table->fonts) {
        std::string font = kv.second.family;
        if (!kv.second.style.empty())
            font += ":style=" + kv.second.style;
        edje_text_class_set(kv.first.c_str(), font.c_str(), kv.second.size);
    }
}

} // namespace

int uxt_theme_set_changeable_ui_enabled(bool enabled)
{
    UxtState &st = uxt_state();
    st.changeable = enabled;
    if (enabled && st.color_table)
        push_colors(st.color_table);
    if (enabled && st.font_table)
        push_fonts(st.font_table);
    return UXT_ERROR_NONE;
}

namespace {

// The dark table of file_path (its folder's dark/ with the same name) when ZV_THEME=dark and
// it exists; else file_path itself.
std::string themed_path(const char *file_path)
{
    const char *theme = getenv("ZV_THEME");
    if (!theme || strcmp(theme, "dark") != 0)
        return file_path;
    std::string path(file_path);
    size_t slash = path.rfind('/');
    std::string dark = slash == std::string::npos
                           ? "dark/" + path
                           : path.substr(0, slash + 1) + "dark" + path.substr(slash);
    if (access(dark.c_str(), R_OK) != 0) {
        ZV_LOGW("ZV_THEME=dark but no %s: the light colour table stays", dark.c_str());
        return file_path;
    }
    return dark;
}

} // namespace

uxt_theme_color_table_h uxt_theme_add_color_table(const char *file_path)
{
    std::string themed = file_path ? themed_path(file_path) : std::string();
    file_path = file_path ? themed.c_str() : nullptr;
    xmlNode *root = nullptr;
    XmlDocPtr doc = load_table(file_path, "ChangeableColorTable", &root);
    if (!doc)
        return nullptr;
    auto table = std::make_unique<uxt_theme_color_table_s>();
    for (xmlNode *n = root->children; n; n = n->next) {
        if (!is_element(n, "Color"))
            continue;
        std::string code = attr(n, "code");
        uxt_theme_color_table_s::Rgba c{};
        if (code.empty() || !int_attr(n, "r", 0, 255, &c.r) || !int_attr(n, "g", 0, 255, &c.g) ||
            !int_attr(n, "b", 0, 255, &c.b) || !int_attr(n, "a", 0, 255, &c.a)) {
            ZV_LOGE("%s line %d: a Color needs code and r, g, b, a of 0..255; skipped",
                    file_path, (int)xmlGetLineNo(n));
            continue;
        }
        table->colors[code] = c;
    }
    return table.release();
}

int uxt_theme_set_color_table(uxt_theme_color_table_h table)
{
    if (!table)
        return UXT_ERROR_INVALID_PARAMETER;
    UxtState &st = uxt_state();
    st.color_table = table;
    if (st.changeable)
        push_colors(table);
    return UXT_ERROR_NONE;
}

int uxt_theme_delete_color_table(uxt_theme_color_table_h table)
{
    if (!table)
        return UXT_ERROR_INVALID_PARAMETER;
    UxtState &st = uxt_state();
    if (st.color_table == table) {
        st.color_table = nullptr;
        if (st.changeable)
            for (const auto &kv : table->colors)
                edje_color_class_del(kv.first.c_str());
    }
    delete table;
    return UXT_ERROR_NONE;
}

uxt_theme_font_table_h uxt_theme_add_font_table(const char *file_path)
{
    xmlNode *root = nullptr;
    XmlDocPtr doc = load_table(file_path, "ChangeableFontTable", &root);
    if (!doc)
        return nullptr;
    auto table = std::make_unique<uxt_theme_font_table_s>();
    for (xmlNode *n = root->children; n; n = n->next) {
        if (!is_element(n, "Font"))
            continue;
        std::string klass = attr(n, "class");
        uxt_theme_font_table_s::Font f{attr(n, "family"), attr(n, "style"), 0};
        if (klass.empty() || f.family.empty() || !int_attr(n, "size", 1, 1000, &f.size)) {
            ZV_LOGE("%s line %d: a Font needs class, family and a size of 1..1000; skipped",
                    file_path, (int)xmlGetLineNo(n));
            continue;
        }
        table->fonts[klass] = f;
    }
    return table.release();
}

int uxt_theme_set_font_table(uxt_theme_font_table_h table)
{
    if (!table)
        return UXT_ERROR_INVALID_PARAMETER;
    UxtState &st = uxt_state();
    st.font_table = table;
    if (st.changeable)
        push_fonts(table);
    return UXT_ERROR_NONE;
}

int uxt_theme_delete_font_table(uxt_theme_font_table_h table)
{
    if (!table)
        return UXT_ERROR_INVALID_PARAMETER;
    UxtState &st = uxt_state();
    if (st.font_table == table) {
        st.font_table = nullptr;
        if (st.changeable)
            for (const auto &kv : table->fonts)
                edje_text_class_del(kv.first.c_str());
    }
    delete table;
    return UXT_ERROR_NONE;
}

int uxt_theme_get_color(const char *color_code, int *r, int *g, int *b, int *a)
{
    if (!color_code || !r || !g || !b || !a)
        return UXT_ERROR_INVALID_PARAMETER;
    uxt_theme_color_table_h table = uxt_state().color_table;
    if (!table)
        return UXT_ERROR_NO_DATA;
    auto it = table->colors.find(color_code);
    if (it == table->colors.end())
        return UXT_ERROR_NO_DATA;
    *r = it->second.r;
    *g = it->second.g;
    *b = it->second.b;
    *a = it->second.a;
    return UXT_ERROR_NONE;
}

int uxt_theme_object_set_color(Evas_Object *obj, const char *color_code)
{
    if (!obj || !color_code)
        return UXT_ERROR_INVALID_PARAMETER;
    int r, g, b, a;
    int rc = uxt_theme_get_color(color_code, &r, &g, &b, &a);
    if (rc != UXT_ERROR_NONE) {
        ZV_LOGE("no colour %s in the current colour table", color_code);
        return rc;
    }
    // An Edje object (or a layout's Edje) gets the colour as its colour class of that name;
    // anything else is tinted (Evas colours are premultiplied).
    const char *type = evas_object_type_get(obj);
    const char *widget = elm_object_widget_check(obj) ? elm_object_widget_type_get(obj) : nullptr;
    Evas_Object *edje = nullptr;
    if (type && strcmp(type, "edje") == 0)
        edje = obj;
    else if (widget && strcmp(widget, "Elm_Layout") == 0)
        edje = elm_layout_edje_get(obj);
    if (edje) {
        edje_object_color_class_set(edje, color_code, r, g, b, a, r, g, b, a, r, g, b, a);
        return UXT_ERROR_NONE;
    }
    evas_object_color_set(obj, r * a / 255, g * a / 255, b * a / 255, a);
    return UXT_ERROR_NONE;
}

Evas_Object *uxt_button_add(Evas_Object *parent)
{
    if (!parent)
        return nullptr;
    return elm_button_add(parent);
}

int uxt_access_set_screen_reader_enabled(Evas_Object *win, bool enabled)
{
    if (!win)
        return UXT_ERROR_INVALID_PARAMETER;
    UxtState &st = uxt_state();
    int host_reader = 0;
    if (vconf_get_int(kScreenReaderKey, &host_reader) != 0)
        host_reader = 0;
    if (!enabled && host_reader != 0) {
        st.reader_notice_due = true;
        if (vconf_set_int(kScreenReaderKey, 0) != 0)
            ZV_LOGE("cannot clear %s", kScreenReaderKey);
    } else if (enabled && host_reader == 0 && vconf_set_int(kScreenReaderKey, 1) != 0) {
        ZV_LOGE("cannot set %s", kScreenReaderKey);
    }
    st.screen_reader = enabled;
    elm_config_access_set(enabled ? EINA_TRUE : EINA_FALSE);
    ZV_LOGI("screen reader %s (the host's was %s)", enabled ? "on" : "off",
            host_reader ? "on" : "off");
    return UXT_ERROR_NONE;
}

namespace {

void reader_popup_close_cb(void *data, Evas_Object *, void *)
{
    evas_object_del(static_cast<Evas_Object *>(data));
}

} // namespace

int uxt_access_show_screen_reader_disabled_popup(Evas_Object *win)
{
    if (!win)
        return UXT_ERROR_INVALID_PARAMETER;
    UxtState &st = uxt_state();
    // Only a screen reader that was really on is worth a notice; otherwise it would cover the
    // list at every launch.
    if (!st.reader_notice_due || st.screen_reader) {
        ZV_LOGI("screen reader notice not needed");
        return UXT_ERROR_NONE;
    }
    st.reader_notice_due = false;
    Evas_Object *popup = elm_popup_add(win);
    if (!popup)
        return UXT_ERROR_INVALID_PARAMETER;
    elm_popup_align_set(popup, ELM_NOTIFY_ALIGN_FILL, 1.0);
    elm_object_style_set(popup, "default");
    evas_object_size_hint_weight_set(popup, EVAS_HINT_EXPAND, EVAS_HINT_EXPAND);
    elm_object_part_text_set(popup, "title,text", i18n_get_text("IDS_ST_HEADER_SCREEN_READER"));
    elm_object_text_set(popup, i18n_get_text("IDS_ST_POP_SCREEN_READER_TURNED_OFF"));
    Evas_Object *ok = elm_button_add(popup);
    elm_object_style_set(ok, "popup");
    elm_object_text_set(ok, i18n_get_text("IDS_COM_SK_OK"));
    evas_object_smart_callback_add(ok, "clicked", reader_popup_close_cb, popup);
    elm_object_part_content_set(popup, "button1", ok);
    evas_object_smart_callback_add(popup, "block,clicked", reader_popup_close_cb, popup);
    evas_object_show(popup);
    ZV_LOGI("screen reader notice shown");
    return UXT_ERROR_NONE;
}
