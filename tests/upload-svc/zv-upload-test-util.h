// Helpers of the controller's tests: history rows by hand, the notification tray as the
// platform keeps it in files, and the network keys written with zv-vconf.
#pragma once

#include <glib.h>

#include <map>
#include <string>

#include "zv-ext-db.h"
#include "zv-test-util.h"
#include "zv-upload-main.h"

namespace zv_upload_test
{

// The process's one application context, zero-filled for each fixture: the controller
// publishes the first one it is given for the life of the process, as the application has
// one, so a fixture of its own would leave a freed one published to the next test.
inline AppData &process_appdata()
{
    static AppData ad;
    ad = AppData{};
    return ad;
}

// A row of 10 bytes of user@example.com.
inline bool add_row(int historyid, int status, double date, const char *filename,
                    const char *title = "Clip", const char *url = nullptr, int percent = 0)
{
    auto chars = [](const char *s) { return const_cast<char *>(s); };
    DbItem row = {historyid,    chars("user@example.com"),
                  chars(title), chars(filename),
                  10,           percent,
                  chars(url),   status,
                  date};
    return zv_ext_db_insert_item(&row) == 1;
}

// Every stored row by historyid.
struct StoredRow {
    int status = -1, percent = -1;
    int64_t filesize = -1;
    std::string url, userid;
    double date = 0;
};

inline std::map<int, StoredRow> stored_rows()
{
    std::map<int, StoredRow> rows;
    GList *list = nullptr;
    zv_ext_db_load_full_item_list(&list);
    for (GList *l = list; l; l = l->next) {
        const DbItem *r = static_cast<const DbItem *>(l->data);
        rows[r->historyid] = {
            r->status, r->percent, r->filesize, r->url ? r->url : "", r->userid ? r->userid : "",
            r->date};
    }
    if (list)
        zv_ext_db_free_item_list(list);
    return rows;
}

// A notification of the tray: its keys, empty when it is not posted.
inline std::map<std::string, std::string> notification(const std::string &tag)
{
    std::map<std::string, std::string> keys;
    std::string path = std::string(getenv("ZV_RUNTIME_DIR")) + "/notifications/" + tag + ".ini";
    g_autoptr(GKeyFile) file = g_key_file_new();
    if (!g_key_file_load_from_file(file, path.c_str(), G_KEY_FILE_NONE, nullptr))
        return keys;
    g_auto(GStrv) names = g_key_file_get_keys(file, "notification", nullptr, nullptr);
    for (gchar **k = names; k && *k; k++) {
        g_autofree gchar *value = g_key_file_get_string(file, "notification", *k, nullptr);
        keys[*k] = value ? value : "";
    }
    return keys;
}

inline bool set_key(const char *type, const std::string &key, const std::string &value)
{
    return zv_test::run_program({zv_test::bin_path("zv-vconf"), "set", "-t", type, key, value}) ==
           0;
}

// The network keys of a working Wi-Fi connection (or none).
inline bool set_network(bool up)
{
    return set_key("int", "memory/dnet/status", up ? "2" : "0") &&
           set_key("int", "memory/dnet/network_config", up ? "1" : "0") &&
           set_key("string", "memory/dnet/ip", "127.0.0.1") &&
           set_key("string", "memory/dnet/proxy", "");
}

} // namespace zv_upload_test
