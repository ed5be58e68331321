// The service's process entry: the launch extras read into the batch settings, the window
// stack built at create and taken down at terminate, one pair of key handlers per launch.
// The real program as a running instance is the end-to-end tests' (tests/e2e).
#include <Ecore.h>
#include <Ecore_Input.h>
#include <Elementary.h>
#include <app.h>
#include <efl_extension.h>
#include <gtest/gtest.h>
#include <stdlib.h>

#include <sstream>
#include <string>

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

app_control_h make_request(const std::vector<std::pair<const char *, const char *>> &extras)
{
    app_control_h h = nullptr;
    app_control_create(&h);
    for (const auto &kv : extras)
        app_control_add_extra_data(h, kv.first, kv.second);
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

// All or nothing: a request that lacks a required extra logs why and keeps the batch.
TEST(UploadMainExtras, ReadingRules)
{
    const char *tok = "ZV_DATA_ACCESS_TOKEN", *cat = "ZV_DATA_CATEGORY",
               *type = "ZV_DATA_ACCESS_TYPE";
    const char *missing = "app_control_get_extra_data error : -126";
    const struct {
        std::vector<std::pair<const char *, const char *>> extras;
        const char *failure; // logged when the request is refused
        const char *batch;
    } cases[] = {
        // every extra
        {{{tok, "tok"},
          {cat, "Music"},
          {"ZV_DATA_DESCRIPTION", "d"},
          {"ZV_DATA_TAG", "a,b"},
          {type, "2"}},
         nullptr,
         "tok Music d a,b 2 0"},
        // the optional ones absent
        {{{tok, "t2"}, {cat, "People"}, {type, "1"}}, nullptr, "t2 People - - 1 0"},
        // an access type that is not a number
        {{{tok, "t3"}, {cat, "Pets"}, {type, "x"}}, nullptr, "t3 Pets - - 0 0"},
        // no access type, no token, no category: the batch stays
        {{{tok, "t4"}, {cat, "Cars"}}, missing, "t3 Pets - - 0 0"},
        {{{cat, "Cars"}, {type, "1"}}, "app_control_get_extra_data error: -126", "t3 Pets - - 0 0"},
        {{{tok, "t5"}, {type, "1"}}, missing, "t3 Pets - - 0 0"},
        // the location on, and "0" is off
        {{{tok, "t6"}, {cat, "Pets"}, {type, "0"}, {"ZV_DATA_USE_LOCATION", "true"}},
         nullptr,
         "t6 Pets - - 0 1"},
        {{{tok, "t7"}, {cat, "Pets"}, {type, "0"}, {"ZV_DATA_USE_LOCATION", "0"}},
         nullptr,
         "t7 Pets - - 0 0"},
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
}

TEST(UploadMainApp, CreateBuildsTheWindowStackAndTerminateTakesItDown)
{
    TempDir tmp;
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
    // The naviframe carries the view's more callback.
    EXPECT_EQ(
        eext_object_event_callback_del(ad.navi, EEXT_CALLBACK_MORE, zv_upload_view_morekey_cb),
        &ad);

    // Two launch requests leave one pair of key handlers: a key event reaches the view once,
    // and with the current pair gone it reaches the view no more. The window, iconified
    // meanwhile, comes back with a launch request.
    elm_win_iconified_set(ad.win, EINA_TRUE);
    for (int i = 0; i < 2; i++) {
        app_control_h h = make_request({{"ZV_DATA_ACCESS_TOKEN", "t"},
                                        {"ZV_DATA_CATEGORY", "Music"},
                                        {"ZV_DATA_ACCESS_TYPE", "1"}});
        _app_control(h, &ad);
        app_control_destroy(h);
    }
    EXPECT_FALSE(elm_win_iconified_get(ad.win));
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
}

// Missing colour and font tables are logged and create goes on; callbacks refuse what is null.
TEST(UploadMainApp, MissingTablesAndNullArguments)
{
    TempDir tmp;
    std::string saved = getenv("ZV_RES_DIR") ? getenv("ZV_RES_DIR") : "";
    setenv("ZV_RES_DIR", tmp.path().c_str(), 1);
    AppData ad{};
    process_log.mark();
    EXPECT_TRUE(_app_create(&ad));
    saved.empty() ? unsetenv("ZV_RES_DIR") : setenv("ZV_RES_DIR", saved.c_str(), 1);
    EXPECT_TRUE(process_log.logged("[ERR] color table create fail"));
    EXPECT_TRUE(process_log.logged("[ERR] font table create fail"));
    EXPECT_EQ(ad.color_table, nullptr);
    _app_terminate(&ad);

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
