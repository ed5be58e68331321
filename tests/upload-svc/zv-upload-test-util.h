// Helpers of the controller's tests: running the main loop as the application does, history
// rows by hand, the notification tray as the platform keeps it in files, and platform keys.
#pragma once

#include <Ecore.h>
#include <glib.h>
#include <stdlib.h>
#include <unistd.h>

#include <functional>
#include <map>
#include <string>

#include "zv-ext-db.h"
#include "zv-test-util.h"

namespace zv_upload_test
{

// Runs the main loop as the application does until pred() holds or timeout_ms passes.
// *quit_by_other (when given) tells whether something else, such as elm_exit, ended the loop first.
// True when pred() holds. Unlike zv_test::wait_for (single iterations), it runs idlers, and timers
// added meanwhile.
inline bool run_until(const std::function<bool()> &pred, int timeout_ms = 5000,
                      bool *quit_by_other = nullptr)
{
    struct Ctx {
        const std::function<bool()> *pred;
        double deadline;
        bool quit_by_us;
    } ctx{&pred, ecore_time_get() + timeout_ms / 1000.0, false};
    if (quit_by_other)
        *quit_by_other = false;
    if (pred())
        return true;
    Ecore_Timer *timer = ecore_timer_add(
        0.01,
        [](void *data) -> Eina_Bool {
            Ctx *c = static_cast<Ctx *>(data);
            if (!(*c->pred)() && ecore_time_get() < c->deadline)
                return ECORE_CALLBACK_RENEW;
            c->quit_by_us = true;
            ecore_main_loop_quit();
            return ECORE_CALLBACK_CANCEL;
        },
        &ctx);
    ecore_main_loop_begin();
    if (!ctx.quit_by_us) {
        ecore_timer_del(timer);
        if (quit_by_other)
            *quit_by_other = true;
    }
    return pred();
}

inline bool add_row(int historyid, int status, double date, const char *filename,
                    const char *title = "Clip", const char *url = nullptr, int percent = 0)
{
    DbItem row = {};
    row.historyid = historyid;
    row.title = const_cast<char *>(title);
    row.filename = const_cast<char *>(filename);
    row.filesize = 10;
    row.percent = percent;
    row.url = const_cast<char *>(url);
    row.status = status;
    row.userid = const_cast<char *>("user@example.com");
    row.date = date;
    return zv_ext_db_insert_item(&row) == 1;
}

// Every stored row by historyid.
struct StoredRow {
    int status = -1;
    int percent = -1;
    int64_t filesize = -1;
    std::string url;
    bool has_url = false;
};

inline std::map<int, StoredRow> stored_rows()
{
    std::map<int, StoredRow> rows;
    GList *list = nullptr;
    zv_ext_db_load_full_item_list(&list);
    for (GList *l = list; l; l = l->next) {
        const DbItem *row = static_cast<const DbItem *>(l->data);
        StoredRow &r = rows[row->historyid];
        r.status = row->status;
        r.percent = row->percent;
        r.filesize = row->filesize;
        r.has_url = row->url != nullptr;
        r.url = row->url ? row->url : "";
    }
    if (list)
        zv_ext_db_free_item_list(list);
    return rows;
}

// A notification of the tray: its keys, empty when it is not posted.
inline std::map<std::string, std::string> notification(const std::string &runtime_dir,
                                                       const std::string &tag)
{
    std::map<std::string, std::string> keys;
    std::string path = runtime_dir + "/notifications/" + tag + ".ini";
    GKeyFile *file = g_key_file_new();
    if (g_key_file_load_from_file(file, path.c_str(), G_KEY_FILE_NONE, nullptr)) {
        gchar **names = g_key_file_get_keys(file, "notification", nullptr, nullptr);
        for (gchar **k = names; k && *k; k++) {
            gchar *value = g_key_file_get_string(file, "notification", *k, nullptr);
            keys[*k] = value ? value : "";
            g_free(value);
        }
        g_strfreev(names);
    }
    g_key_file_free(file);
    return keys;
}

// Writes a platform key as zv-vconf does (a file replaced at once).
inline bool set_key(const std::string &runtime_dir, const std::string &key,
                    const std::string &value)
{
    std::string path = runtime_dir + "/vconf/" + key;
    gchar *dir = g_path_get_dirname(path.c_str());
    g_mkdir_with_parents(dir, 0700);
    g_free(dir);
    std::string tmp = path + ".tmp";
    return zv_test::write_file(tmp, value + "\n") && rename(tmp.c_str(), path.c_str()) == 0;
}

} // namespace zv_upload_test
