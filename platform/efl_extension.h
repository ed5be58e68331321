// EFL extension: hardware back and more keys on an object. On a desktop keyboard Escape is
// the back key and Menu or F2 the more key.
#pragma once

#include <Evas.h>

#ifdef __cplusplus
extern "C" {
#endif

typedef enum {
    EEXT_CALLBACK_BACK = 0,
    EEXT_CALLBACK_MORE = 1,
    EEXT_CALLBACK_LAST,
} Eext_Callback_Type;

#define EEXT_KEY_BACK "XF86Back"
#define EEXT_KEY_MORE "XF86Menu"

typedef void (*Eext_Event_Cb)(void *data, Evas_Object *obj, void *event_info);

void eext_object_event_callback_add(Evas_Object *obj, Eext_Callback_Type type, Eext_Event_Cb func,
                                    void *data);
void *eext_object_event_callback_del(Evas_Object *obj, Eext_Callback_Type type,
                                     Eext_Event_Cb func);
// Maps a desktop key name to the platform's hardware key name ("Escape" -> "XF86Back",
// "Menu"/"F2" -> "XF86Menu"); other names are returned unchanged.
const char *eext_key_name_map(const char *keyname);

#ifdef __cplusplus
}
#endif
