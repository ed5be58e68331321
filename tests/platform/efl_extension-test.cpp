// EFL extension: back and more key presses, fed as key-down events of the main loop, reach
// the newest visible registration of that key; hidden and deleted objects and deleted
// callbacks drop out.
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
    EXPECT_STREQ(eext_key_name_map("Escape"), EEXT_KEY_BACK);
    EXPECT_STREQ(eext_key_name_map("Menu"), EEXT_KEY_MORE);
    EXPECT_STREQ(eext_key_name_map("F2"), EEXT_KEY_MORE);
    EXPECT_STREQ(eext_key_name_map("XF86Back"), EEXT_KEY_BACK);
    EXPECT_STREQ(eext_key_name_map("Return"), "Return");

    Evas_Object *win = elm_win_add(nullptr, "eext-test", ELM_WIN_BASIC);
    Evas_Object *navi = elm_naviframe_add(win);
    evas_object_show(navi);
    evas_object_show(win);
    eext_object_event_callback_add(navi, EEXT_CALLBACK_BACK, record_cb, (void *)"back:navi");
    eext_object_event_callback_add(navi, EEXT_CALLBACK_MORE, record_cb, (void *)"more:navi");
    for (const char *key : {"Escape", "Menu", "F2", "Return"}) // Return: no hardware key
        press(key);
    EXPECT_EQ(g_calls, (std::vector<std::string>{"back:navi", "more:navi", "more:navi"}));

    // A popup registered later takes both keys while it is shown; hidden, it lets the
    // naviframe have them; deleted, it is forgotten.
    Evas_Object *popup = elm_ctxpopup_add(win);
    eext_object_event_callback_add(popup, EEXT_CALLBACK_BACK, record_cb, (void *)"back:popup");
    eext_object_event_callback_add(popup, EEXT_CALLBACK_MORE, record_cb, (void *)"more:popup");
    evas_object_show(popup);
    g_calls.clear();
    press("Escape");
    press("XF86Menu");
    evas_object_hide(popup);
    press("Escape");
    evas_object_show(popup);
    evas_object_del(popup);
    press("Escape");
    EXPECT_EQ(g_calls,
              (std::vector<std::string>{"back:popup", "more:popup", "back:navi", "back:navi"}));

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
