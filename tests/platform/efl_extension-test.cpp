// EFL extension: back and more key presses, fed as key-down events of the main loop, reach
// the newest visible registration of that key. The view's tests press Escape, Menu and F2 on
// the list and its popups; here, what they do not reach: the other key names, a hidden
// registration, and a deleted callback.
#include "efl_extension.h"

#include <Ecore_Input.h>
#include <Elementary.h>
#include <gtest/gtest.h>
#include <stdlib.h>

#include <string>
#include <vector>

#include "zv-test-util.h"

namespace
{

std::vector<std::string> g_calls;

// Each registration's data names it, as "key:object".
void record_cb(void *data, Evas_Object *, void *)
{
    g_calls.push_back(static_cast<const char *>(data));
}

// Feeds one key press as the windowing system would, and lets the main loop deliver it.
void press(const char *keyname)
{
    auto *ev = static_cast<Ecore_Event_Key *>(calloc(1, sizeof(Ecore_Event_Key)));
    ev->keyname = ev->key = keyname;
    ev->string = "";
    ecore_event_add(
        ECORE_EVENT_KEY_DOWN, ev, [](void *, void *e) { free(e); }, nullptr);
    size_t before = g_calls.size();
    zv_test::wait_for([&] { return g_calls.size() > before; }, 500);
}

} // namespace

TEST(Eext, KeysReachTheNewestVisibleRegistration)
{
    Evas_Object *win = elm_win_add(nullptr, "eext-test", ELM_WIN_BASIC);
    Evas_Object *navi = elm_naviframe_add(win);
    evas_object_show(navi);
    evas_object_show(win);
    eext_object_event_callback_add(navi, EEXT_CALLBACK_BACK, record_cb, (void *)"back:navi");
    eext_object_event_callback_add(navi, EEXT_CALLBACK_MORE, record_cb, (void *)"more:navi");
    press("Return"); // no hardware key; the window settles meanwhile
    Evas_Object *popup = elm_ctxpopup_add(win);
    eext_object_event_callback_add(popup, EEXT_CALLBACK_BACK, record_cb, (void *)"back:popup");
    evas_object_show(popup);
    press("Escape");
    press("XF86Menu"); // the popup has no more key: the naviframe takes it
    evas_object_hide(popup);
    press("XF86Back");
    EXPECT_EQ(g_calls, (std::vector<std::string>{"back:popup", "more:navi", "back:navi"}));

    // A deleted callback gives its data back once and is called no more.
    EXPECT_STREQ(static_cast<const char *>(
                     eext_object_event_callback_del(navi, EEXT_CALLBACK_BACK, record_cb)),
                 "back:navi");
    EXPECT_EQ(eext_object_event_callback_del(navi, EEXT_CALLBACK_BACK, record_cb), nullptr);
    g_calls.clear();
    press("Escape");
    EXPECT_TRUE(g_calls.empty());
    evas_object_del(win);
}
