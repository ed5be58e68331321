// Host EFL extension: the hardware back and more keys. A key press is delivered to the most
// recently registered object for that key that is still alive and visible, so that a popup
// or menu registered on itself gets the key before the naviframe beneath it.
// Key presses come from the main loop's key-down events: Escape (or XF86Back) is the back
// key, Menu or F2 (or XF86Menu) the more key.
// Thread safety: main loop only.
#include "efl_extension.h"

#include <Ecore.h>
#include <Ecore_Input.h>
#include <string.h>

#include <algorithm>
#include <cstdint>
#include <vector>

#include "zv-log.h"

namespace {

struct Registration {
    Evas_Object *obj;
    Eext_Callback_Type type;
    Eext_Event_Cb func;
    void *data;
    uint64_t seq;
};

struct ExtState {
    std::vector<Registration> regs;
    uint64_t next_seq = 1;
    Ecore_Event_Handler *key_handler = nullptr;
};

ExtState &ext_state()
{
    static ExtState st;
    return st;
}

bool has_registration(Evas_Object *obj)
{
    const auto &regs = ext_state().regs;
    return std::any_of(regs.begin(), regs.end(),
                       [obj](const Registration &r) { return r.obj == obj; });
}

void obj_del_cb(void *, Evas *, Evas_Object *obj, void *)
{
    auto &regs = ext_state().regs;
    regs.erase(std::remove_if(regs.begin(), regs.end(),
                              [obj](const Registration &r) { return r.obj == obj; }),
               regs.end());
}

// Delivers a back or more key to the newest visible registration of that key.
bool dispatch(Eext_Callback_Type type)
{
    const Registration *best = nullptr;
    for (const Registration &r : ext_state().regs)
        if (r.type == type && evas_object_visible_get(r.obj) && (!best || r.seq > best->seq))
            best = &r;
    if (!best)
        return false;
    // A copy: the callback may delete the object and with it the registration.
    Registration target = *best;
    target.func(target.data, target.obj, nullptr);
    return true;
}

Eina_Bool key_down_cb(void *, int, void *event)
{
    auto *ev = static_cast<Ecore_Event_Key *>(event);
    if (!ev || !ev->keyname)
        return ECORE_CALLBACK_PASS_ON;
    const char *name = eext_key_name_map(ev->keyname);
    if (strcmp(name, EEXT_KEY_BACK) == 0)
        dispatch(EEXT_CALLBACK_BACK);
    else if (strcmp(name, EEXT_KEY_MORE) == 0)
        dispatch(EEXT_CALLBACK_MORE);
    // Other handlers (the application's own key watchers) still see the event.
    return ECORE_CALLBACK_PASS_ON;
}

void ensure_key_handler()
{
    ExtState &st = ext_state();
    if (st.key_handler)
        return;
    ecore_event_init();
    st.key_handler = ecore_event_handler_add(ECORE_EVENT_KEY_DOWN, key_down_cb, nullptr);
    if (!st.key_handler)
        ZV_LOGE("cannot watch key events: back and more keys will not work");
}

} // namespace

void eext_object_event_callback_add(Evas_Object *obj, Eext_Callback_Type type, Eext_Event_Cb func,
                                    void *data)
{
    if (!obj || !func || (type != EEXT_CALLBACK_BACK && type != EEXT_CALLBACK_MORE)) {
        ZV_LOGE("invalid parameter");
        return;
    }
    ExtState &st = ext_state();
    ensure_key_handler();
    for (Registration &r : st.regs) {
        if (r.obj == obj && r.type == type && r.func == func) {
            r.data = data;
            return;
        }
    }
    if (!has_registration(obj))
        evas_object_event_callback_add(obj, EVAS_CALLBACK_DEL, obj_del_cb, nullptr);
    st.regs.push_back(Registration{obj, type, func, data, st.next_seq++});
}

void *eext_object_event_callback_del(Evas_Object *obj, Eext_Callback_Type type,
                                     Eext_Event_Cb func)
{
    if (!obj || !func)
        return nullptr;
    auto &regs = ext_state().regs;
    auto it = std::find_if(regs.begin(), regs.end(), [&](const Registration &r) {
        return r.obj == obj && r.type == type && r.func == func;
    });
    if (it == regs.end())
        return nullptr;
    void *data = it->data;
    regs.erase(it);
    if (!has_registration(obj))
        evas_object_event_callback_del(obj, EVAS_CALLBACK_DEL, obj_del_cb);
    return data;
}

const char *eext_key_name_map(const char *keyname)
{
    if (!keyname)
        return keyname;
    if (strcmp(keyname, "Escape") == 0)
        return EEXT_KEY_BACK;
    if (strcmp(keyname, "Menu") == 0 || strcmp(keyname, "F2") == 0)
        return EEXT_KEY_MORE;
    return keyname;
}
