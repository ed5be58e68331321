// EFL extension: back and more key presses, fed as key-down events of the main loop, reach
// the newest visible registration of that key; deleted objects drop out.
#include "efl_extension.h"

#include <Ecore_Input.h>
#include <Elementary.h>
#include <gtest/gtest.h>
#include <stdlib.h>
#include <string.h>

#include <string>
#include <vector>

#include "zv-test-util.h"

using namespace zv_test;

namespace {

std::vector<std::string> g_calls;

void back_cb(void *data, Evas_Object *, void *)
{
    g_calls.push_back(std::string("back:") + (const char *)data);
}
void more_cb(void *data, Evas_Object *, void *)
{
    g_calls.push_back(std::string("more:") + (const char *)data);
}

// Feeds one key press as the windowing system would, and lets the main loop deliver it.
void press(const char *keyname)
{
    auto *ev = static_cast<Ecore_Event_Key *>(calloc(1, sizeof(Ecore_Event_Key)));
    ev->keyname = keyname;
    ev->key = keyname;
    ev->string = "";
    ev->timestamp = (unsigned int)(ecore_time_get() * 1000);
    ecore_event_add(ECORE_EVENT_KEY_DOWN, ev, [](void *, void *e) { free(e); }, nullptr);
    size_t before = g_calls.size();
    wait_for([&] { return g_calls.size() > before; }, 500);
}

class EextTest : public ::testing::Test {
protected:
    void SetUp() override
    {
        g_calls.clear();
        win_ = elm_win_add(nullptr, "eext-test", ELM_WIN_BASIC);
        navi_ = elm_naviframe_add(win_);
        evas_object_show(navi_);
        evas_object_show(win_);
    }
    void TearDown() override { evas_object_del(win_); }

    Evas_Object *win_ = nullptr;
    Evas_Object *navi_ = nullptr;
};

} // namespace

TEST(EextKeys, DesktopKeysMapToHardwareKeys)
{
    EXPECT_STREQ(eext_key_name_map("Escape"), EEXT_KEY_BACK);
    EXPECT_STREQ(eext_key_name_map("Menu"), EEXT_KEY_MORE);
    EXPECT_STREQ(eext_key_name_map("F2"), EEXT_KEY_MORE);
    EXPECT_STREQ(eext_key_name_map("XF86Back"), EEXT_KEY_BACK);
    EXPECT_STREQ(eext_key_name_map("Return"), "Return");
}

TEST_F(EextTest, NewestVisibleRegistrationGetsTheKey)
{
    eext_object_event_callback_add(navi_, EEXT_CALLBACK_BACK, back_cb, (void *)"navi");
    eext_object_event_callback_add(navi_, EEXT_CALLBACK_MORE, more_cb, (void *)"navi");
    press("Escape");
    press("Menu");
    press("F2");
    press("Return"); // not a hardware key: nothing
    EXPECT_EQ(g_calls, (std::vector<std::string>{"back:navi", "more:navi", "more:navi"}));

    // A popup registered later takes both keys while it is shown.
    Evas_Object *popup = elm_ctxpopup_add(win_);
    eext_object_event_callback_add(popup, EEXT_CALLBACK_BACK, back_cb, (void *)"popup");
    eext_object_event_callback_add(popup, EEXT_CALLBACK_MORE, more_cb, (void *)"popup");
    evas_object_show(popup);
    g_calls.clear();
    press("Escape");
    press("XF86Menu");
    EXPECT_EQ(g_calls, (std::vector<std::string>{"back:popup", "more:popup"}));

    // Hidden, it lets the naviframe have them; deleted, it is forgotten.
    evas_object_hide(popup);
    g_calls.clear();
    press("Escape");
    evas_object_show(popup);
    evas_object_del(popup);
    press("Escape");
    EXPECT_EQ(g_calls, (std::vector<std::string>{"back:navi", "back:navi"}));
}

TEST_F(EextTest, DeletedCallbackIsNotCalledAndGivesItsDataBack)
{
    static const char *data = "navi";
    eext_object_event_callback_add(navi_, EEXT_CALLBACK_BACK, back_cb, (void *)data);
    EXPECT_EQ(eext_object_event_callback_del(navi_, EEXT_CALLBACK_BACK, back_cb), data);
    EXPECT_EQ(eext_object_event_callback_del(navi_, EEXT_CALLBACK_BACK, back_cb), nullptr);
    press("Escape");
    EXPECT_TRUE(g_calls.empty());
}
