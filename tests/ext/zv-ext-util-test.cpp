// The stored application context, the file-size and id helpers and the three popups.
#include "zv-ext-util.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include "zv-test-util.h"
#include "zv-upload-main.h"

// The first context stored stays; sizes pass 4 GiB; the id is the time.
TEST(ExtUtil, FirstContextStaysFileSizesAndTheIdIsTheTime)
{
    static AppData first, second;
    zv_ext_util_set_appdata(nullptr);
    EXPECT_EQ(zv_ext_util_get_appdata(), nullptr);
    zv_ext_util_set_appdata(&first);
    zv_ext_util_set_appdata(&second);
    EXPECT_EQ(zv_ext_util_get_appdata(), &first);

    zv_test::TempDir tmp;
    const std::string video = tmp.file("video");
    ASSERT_TRUE(zv_test::write_file(video, ""));
    ASSERT_EQ(truncate(video.c_str(), 5000000000LL), 0); // sparse
    EXPECT_EQ(zv_ext_util_get_file_size(video.c_str()), 5000000000LL);
    EXPECT_EQ(zv_ext_util_get_file_size(tmp.file("missing").c_str()), -1);
    EXPECT_EQ(zv_ext_util_get_file_size(nullptr), -1);
    time_t before = time(nullptr), id = zv_ext_util_generate_id();
    EXPECT_TRUE(id >= before && id <= time(nullptr));
}

// Each popup refuses a missing parent or user data. The message popup and the processing
// popup with a timeout call back and go once it passes; the processing popup without one
// stays. The account popup numbers its rows past null entries and hands the chosen account to
// its callback.
TEST(ExtUtilPopup, PopupsTimeOutAndAccountsAreChosen)
{
    Evas_Object *win = elm_win_add(nullptr, "zv-ext-util-test", ELM_WIN_BASIC);
    evas_object_show(win);
    int calls = 0;
    auto count_cb = [](void *data, Evas_Object *, void *) { ++*static_cast<int *>(data); };
    auto account_popup = [](Evas_Object *p, const char *t, double, Evas_Smart_Cb cb, void *d) {
        return zv_ext_util_create_account_select_popup(p, t, nullptr, cb, d);
    };
    for (auto create : {zv_ext_util_create_popup, zv_ext_util_create_list_popup, +account_popup}) {
        EXPECT_EQ(create(nullptr, "t", 1.0, count_cb, &calls), nullptr);
        EXPECT_EQ(create(win, "t", 1.0, count_cb, nullptr), nullptr);
    }
    zv_ext_util_destroy_popup(nullptr);

    Evas_Object *message = zv_ext_util_create_popup(win, "Saved", 0.05, count_cb, &calls);
    EXPECT_STREQ(elm_object_text_get(message), "Saved");
    Evas_Object *kept = zv_ext_util_create_list_popup(win, "Working", 0.0, count_cb, &calls);
    Evas_Object *timed = zv_ext_util_create_list_popup(win, "Working", 0.05, count_cb, &calls);
    EXPECT_TRUE(zv_test::wait_for([&] { return calls == 2; }));
    EXPECT_TRUE(evas_object_visible_get(kept) && !evas_object_visible_get(timed));

    account_info a = {}, b = {};
    a.display_name = const_cast<char *>("alice@example.com");
    b.display_name = const_cast<char *>("bob@example.com");
    GList *accounts = g_list_append(g_list_append(g_list_append(nullptr, &a), nullptr), &b);
    static account_info *chosen = nullptr;
    auto select_cb = [](void *data, Evas_Object *, void *) { chosen = (account_info *)data; };
    Evas_Object *popup =
        zv_ext_util_create_account_select_popup(win, "Accounts", accounts, select_cb, &chosen);
    EXPECT_STREQ(elm_object_part_text_get(popup, "title,text"), "Accounts");
    EXPECT_EQ(a.position, 0);
    EXPECT_EQ(b.position, 2);
    EXPECT_EQ(b.user_data, &chosen);
    Evas_Object *genlist = elm_object_content_get(popup);
    ASSERT_EQ(elm_genlist_items_count(genlist), 2u);
    elm_genlist_item_selected_set(elm_genlist_last_item_get(genlist), EINA_TRUE);
    EXPECT_EQ(chosen, &b);
    for (Evas_Object *p : {message, kept, timed, popup})
        zv_ext_util_destroy_popup(p);
    g_list_free(accounts);
    evas_object_del(win);
}
