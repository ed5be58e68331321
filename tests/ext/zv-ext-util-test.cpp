// The stored application context, the three popups and the file-size and id helpers.
#include "zv-ext-util.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include "zv-test-util.h"
#include "zv-upload-main.h"

namespace
{

TEST(ExtUtil, FirstContextStaysFileSizesAndTheIdIsTheTime)
{
    static AppData first, second;
    zv_ext_util_set_appdata(nullptr);
    EXPECT_EQ(zv_ext_util_get_appdata(), nullptr);
    zv_ext_util_set_appdata(&first);
    zv_ext_util_set_appdata(&second);
    EXPECT_EQ(zv_ext_util_get_appdata(), &first);

    zv_test::TempDir tmp;
    const std::string five = tmp.file("five"), video = tmp.file("video");
    ASSERT_TRUE(zv_test::write_file(five, "12345") && zv_test::write_file(video, ""));
    EXPECT_EQ(zv_ext_util_get_file_size(video.c_str()), 0);
    ASSERT_EQ(truncate(video.c_str(), 5000000000LL), 0); // sparse, past 4 GiB
    EXPECT_EQ(zv_ext_util_get_file_size(five.c_str()), 5);
    EXPECT_EQ(zv_ext_util_get_file_size(video.c_str()), 5000000000LL);
    EXPECT_EQ(zv_ext_util_get_file_size(tmp.file("missing").c_str()), -1);
    EXPECT_EQ(zv_ext_util_get_file_size(nullptr), -1);

    time_t before = time(nullptr), id = zv_ext_util_generate_id();
    EXPECT_TRUE(id >= before && id <= time(nullptr));
}

void count_cb(void *data, Evas_Object *, void *)
{
    ++*static_cast<int *>(data);
}

// The message popup and the processing popup with a timeout call back once it passes; the
// processing popup without one stays, its one row a "1line" item. The account popup numbers
// its rows past null entries and hands the chosen account to its callback.
TEST(ExtUtilPopup, PopupsTimeOutAndAccountsAreChosen)
{
    Evas_Object *win = elm_win_add(nullptr, "zv-ext-util-test", ELM_WIN_BASIC);
    evas_object_resize(win, 360, 640);
    evas_object_show(win);
    int calls = 0;
    for (auto create : {zv_ext_util_create_popup, zv_ext_util_create_list_popup}) {
        EXPECT_EQ(create(nullptr, "t", 1.0, count_cb, &calls), nullptr);
        EXPECT_EQ(create(win, "t", 1.0, count_cb, nullptr), nullptr);
    }
    EXPECT_EQ(zv_ext_util_create_account_select_popup(nullptr, "t", nullptr, count_cb, &calls),
              nullptr);
    EXPECT_EQ(zv_ext_util_create_account_select_popup(win, "t", nullptr, count_cb, nullptr),
              nullptr);
    zv_ext_util_destroy_popup(nullptr);

    Evas_Object *message = zv_ext_util_create_popup(win, "Saved", 0.05, count_cb, &calls);
    ASSERT_NE(message, nullptr);
    EXPECT_STREQ(elm_object_text_get(message), "Saved");
    EXPECT_TRUE(zv_test::wait_for([&] { return calls == 1; }));
    Evas_Object *kept = zv_ext_util_create_list_popup(win, "Working", 0.0, count_cb, &calls);
    Evas_Object *timed = zv_ext_util_create_list_popup(win, "Working", 0.05, count_cb, &calls);
    ASSERT_TRUE(kept && timed);
    EXPECT_EQ(elm_popup_timeout_get(kept), 0.0);
    EXPECT_TRUE(zv_test::wait_for([&] { return calls == 2; }));
    Eina_List *children = elm_box_children_get(elm_object_content_get(kept));
    ASSERT_EQ(eina_list_count(children), 1u);
    auto *genlist = static_cast<Evas_Object *>(eina_list_data_get(children));
    eina_list_free(children);
    Elm_Object_Item *row = elm_genlist_first_item_get(genlist);
    EXPECT_STREQ(elm_genlist_item_item_class_get(row)->item_style, "1line");
    EXPECT_EQ(calls, 2);

    char name_a[] = "alice@example.com", name_b[] = "bob@example.com";
    account_info a = {}, b = {};
    a.display_name = name_a;
    b.display_name = name_b;
    GList *accounts = g_list_append(g_list_append(g_list_append(nullptr, &a), nullptr), &b);
    account_info *chosen = nullptr;
    auto select_cb = [](void *data, Evas_Object *, void *) {
        auto *account = static_cast<account_info *>(data);
        *static_cast<account_info **>(account->user_data) = account;
    };
    Evas_Object *popup =
        zv_ext_util_create_account_select_popup(win, "Accounts", accounts, select_cb, &chosen);
    ASSERT_NE(popup, nullptr);
    EXPECT_STREQ(elm_object_part_text_get(popup, "title,text"), "Accounts");
    EXPECT_TRUE(a.position == 0 && b.position == 2 && b.user_data == &chosen);
    genlist = elm_object_content_get(popup);
    ASSERT_EQ(elm_genlist_items_count(genlist), 2u);
    elm_genlist_item_selected_set(elm_genlist_last_item_get(genlist), EINA_TRUE);
    EXPECT_EQ(chosen, &b);
    for (Evas_Object *p : {message, kept, timed, popup})
        zv_ext_util_destroy_popup(p);
    g_list_free(accounts);
    evas_object_del(win);
}

} // namespace
