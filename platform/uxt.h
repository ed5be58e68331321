// UI extension: changeable colour and font tables, colour codes on objects, the
// application's button factory and the screen-reader switch.
#pragma once

#include <Evas.h>
#include <stdbool.h>

#ifdef __cplusplus
extern "C" {
#endif

typedef struct uxt_theme_color_table_s *uxt_theme_color_table_h;
typedef struct uxt_theme_font_table_s *uxt_theme_font_table_h;

typedef enum {
    UXT_ERROR_NONE = 0,
    UXT_ERROR_INVALID_PARAMETER = -22,
    UXT_ERROR_NO_DATA = -61,
} uxt_error_e;

int uxt_theme_set_changeable_ui_enabled(bool enabled);
// Loads the table file; NULL when it is missing or cannot be read.
uxt_theme_color_table_h uxt_theme_add_color_table(const char *file_path);
int uxt_theme_set_color_table(uxt_theme_color_table_h table);
int uxt_theme_delete_color_table(uxt_theme_color_table_h table);
uxt_theme_font_table_h uxt_theme_add_font_table(const char *file_path);
int uxt_theme_set_font_table(uxt_theme_font_table_h table);
int uxt_theme_delete_font_table(uxt_theme_font_table_h table);
// Sets the colour of a colour code ("AO005") of the current table on the object.
int uxt_theme_object_set_color(Evas_Object *obj, const char *color_code);
// Looks a colour code up in the current table.
int uxt_theme_get_color(const char *color_code, int *r, int *g, int *b, int *a);

Evas_Object *uxt_button_add(Evas_Object *parent);

int uxt_access_set_screen_reader_enabled(Evas_Object *win, bool enabled);
int uxt_access_show_screen_reader_disabled_popup(Evas_Object *win);

#ifdef __cplusplus
}
#endif
