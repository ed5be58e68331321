// The service's process entry: the launch extras read into the batch settings, the window
// stack built at create and taken down at terminate, one pair of key handlers per launch, the
// screen-reader notice. The real program as a running instance is the end-to-end tests'
// (tests/e2e).
#include <Ecore.h>
#include <Ecore_Input.h>
#include <Elementary.h>
#include <app.h>
#include <efl_extension.h>
#include <gtest/gtest.h>
#include <stdlib.h>
#include <string.h>
#include <vconf.h>

#include <array>
#include <sstream>
#include <string>
#include <vector>

#include "zv-test-util.h"
#include "zv-upload-view.h"

// The entry's own functions are file-local: the test compiles the file in.
#define main zv_upload_main_entry
#include "../../upload-svc/src/zv-upload-main.cpp"
#undef main

using namespace zv_test;

namespace
{

// Every log line of this process goes to one file.
LogFile process_log;

// A launch request with these values (null: absent) of token, category, description, tag,
// access type and location.
app_control_h make_request(const std::array<const char *, 6> &values)
{
    static const char *const keys[] = {"ZV_DATA_ACCESS_TOKEN", "ZV_DATA_CATEGORY",
                                       "ZV_DATA_DESCRIPTION",  "ZV_DATA_TAG",
                                       "ZV_DATA_ACCESS_TYPE",  "ZV_DATA_USE_LOCATION"};
    app_control_h h = nullptr;
    app_control_create(&h);
    for (size_t i = 0; i < values.size(); i++)
        if (values[i])
            app_control_add_extra_data(h, keys[i], values[i]);
    return h;
}

// The batch settings as "token category description tag access_type use_location".
std::string batch(const AppData &ad)
{
    std::ostringstream out;
    for (const char *s : {ad.access_token, ad.category, ad.description, ad.tag})
        out << (s ? s : "-") << " ";
    out << ad.access_type << " " << ad.use_location;
    return out.str();
}

} // namespace

// All or nothing: a request that lacks a required extra logs why and keeps the batch. The
// callbacks refuse what is null.
TEST(UploadMainExtras, ReadingRulesAndNullArguments)
{
    const char *missing = "app_control_get_extra_data error : -126";
    const struct {
        std::array<const char *, 6> extras;
        const char *failure; // logged when the request is refused
        const char *batch;
    } cases[] = {
        {{"tok", "Music", "d", "a,b", "2"}, nullptr, "tok Music d a,b 2 0"},
        {{"t2", "People", nullptr, nullptr, "1"}, nullptr, "t2 People - - 1 0"},
        {{"t3", "Pets", nullptr, nullptr, "x"}, nullptr, "t3 Pets - - 0 0"}, // not a number
        // no access type, no token, no category: the batch stays
        {{"t4", "Cars"}, missing, "t3 Pets - - 0 0"},
        {{nullptr, "Cars", nullptr, nullptr, "1"},
         "app_control_get_extra_data error: -126",
         "t3 Pets - - 0 0"},
        {{"t5", nullptr, nullptr, nullptr, "1"}, missing, "t3 Pets - - 0 0"},
        // the location on, and "0" is off
        {{"t6", "Pets", nullptr, nullptr, "0", "true"}, nullptr, "t6 Pets - - 0 1"},
        {{"t7", "Pets", nullptr, nullptr, "0", "0"}, nullptr, "t7 Pets - - 0 0"},
    };
    AppData ad{};
    for (const auto &c : cases) {
        app_control_h h = make_request(c.extras);
        process_log.mark();
        EXPECT_EQ(_zv_upload_main_get_app_control_info(h, &ad), !c.failure) << c.batch;
        app_control_destroy(h);
        EXPECT_TRUE(!c.failure || process_log.logged(c.failure)) << process_log.since_mark();
        EXPECT_EQ(batch(ad), c.batch);
    }
    free(ad.access_token);
    free(ad.category);

    ad = AppData{};
    process_log.mark();
    EXPECT_FALSE(_app_create(nullptr));
    EXPECT_TRUE(process_log.logged("userp is NULL"));
    _app_control(nullptr, &ad);
    EXPECT_TRUE(process_log.logged("service handle is NULL"));
    app_control_h h = make_request({});
    _app_control(h, &ad);
    app_control_destroy(h);
    EXPECT_TRUE(process_log.logged("win is NULL"));
    _zv_upload_win_rot_changed_cb(nullptr, nullptr, nullptr);
    EXPECT_TRUE(process_log.logged("obj is NULL"));
    _app_pause(&ad);
    EXPECT_TRUE(ad.is_paused);
    _app_resume(&ad);
    EXPECT_FALSE(ad.is_paused);
}

// Create builds the window stack, terminate takes it down; missing colour and font tables
// are logged and create goes on. The screen reader is off while the application runs; the
// notice that says so shows once, and only when the host's screen reader (its settings key)
// was on.
TEST(UploadMainApp, CreateBuildsTheWindowStackAndTerminateTakesItDown)
{
    TempDir tmp;
    ASSERT_EQ(vconf_set_int("db/setting/accessibility/tts", 1), 0);
    AppData ad{};
    ASSERT_TRUE(_app_create(&ad));
    ASSERT_NE(ad.win, nullptr);
    EXPECT_STREQ(elm_win_title_get(ad.win), "zuvo-upload-svc");
    EXPECT_EQ(elm_object_content_get(ad.conform), ad.layout);
    EXPECT_EQ(elm_object_part_content_get(ad.layout, "elm.swallow.content"), ad.navi);
    EXPECT_NE(ad.bg, nullptr);
    EXPECT_EQ(elm_object_part_content_get(ad.layout, "elm.swallow.bg"), ad.bg);
    EXPECT_NE(ad.color_table, nullptr);
    EXPECT_NE(ad.font_table, nullptr);
    EXPECT_NE(ad.exit, nullptr); // the controller started
    // The naviframe carries the view's more callback, once.
    for (void *data : {(void *)&ad, (void *)nullptr})
        EXPECT_EQ(
            eext_object_event_callback_del(ad.navi, EEXT_CALLBACK_MORE, zv_upload_view_morekey_cb),
            data);

    // Two launch requests leave one pair of key handlers: a key event reaches the view once,
    // and with the current pair gone it reaches the view no more. The window, iconified
    // meanwhile, comes back with a launch request.
    elm_win_iconified_set(ad.win, EINA_TRUE);
    for (int i = 0; i < 2; i++) {
        app_control_h h = make_request({"t", "Music", nullptr, nullptr, "1"});
        _app_control(h, &ad);
        app_control_destroy(h);
    }
    EXPECT_FALSE(elm_win_iconified_get(ad.win));
    EXPECT_FALSE(elm_config_access_get());
    ASSERT_EQ(widgets(ad.win, "Elm_Popup").size(), 1u);
    EXPECT_STREQ(elm_object_text_get(widgets(ad.win, "Elm_Popup")[0]),
                 "The screen reader has been turned off while you use ZuVo uploads.");
    ASSERT_NE(ad.key_down_handler, nullptr);
    auto press = [] {
        auto *ev = static_cast<Ecore_Event_Key *>(calloc(1, sizeof(Ecore_Event_Key)));
        ev->keyname = ev->key = "Return";
        ev->string = "";
        process_log.mark();
        ecore_event_add(
            ECORE_EVENT_KEY_DOWN, ev, [](void *, void *e) { free(e); }, nullptr);
        return wait_for([] { return process_log.logged("zv_upload_view_event_key_down_cb"); },
                        2000);
    };
    EXPECT_TRUE(press());
    ecore_event_handler_del(ad.key_down_handler);
    ad.key_down_handler = nullptr;
    EXPECT_FALSE(press());

    _app_terminate(&ad);
    EXPECT_EQ(ad.win, nullptr);
    EXPECT_EQ(ad.color_table, nullptr);
    EXPECT_EQ(ad.font_table, nullptr);
    EXPECT_EQ(ad.key_up_handler, nullptr);
    free(ad.access_token);
    free(ad.category);

    const std::string saved = getenv("ZV_RES_DIR") ? getenv("ZV_RES_DIR") : ZV_BUILD_RES_DIR;
    setenv("ZV_RES_DIR", tmp.path().c_str(), 1);
    ad = AppData{};
    process_log.mark();
    EXPECT_TRUE(_app_create(&ad));
    setenv("ZV_RES_DIR", saved.c_str(), 1);
    EXPECT_TRUE(process_log.logged("[ERR] color table create fail"));
    EXPECT_TRUE(process_log.logged("[ERR] font table create fail"));
    EXPECT_EQ(ad.color_table, nullptr);
    EXPECT_TRUE(widgets(ad.win, "Elm_Popup").empty());
    _app_terminate(&ad);
}
