// zv-noti: prints the notification tray, one block per posted notification (its tag, then
// its keys), blocks separated by an empty line, in the order of their tags.
#include <glib.h>
#include <notification.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>

#include <algorithm>
#include <memory>
#include <string>
#include <vector>

namespace
{

const char kUsage[] = "usage: zv-noti list\n"
                      "Prints every notification of the tray ($ZV_RUNTIME_DIR/notifications):\n"
                      "one block per notification, its tag first, then its keys.\n";
const char kGroup[] = "notification";
const char kSuffix[] = ".ini";

struct GFreeDeleter {
    void operator()(void *p) const { g_free(p); }
};
using GCharPtr = std::unique_ptr<gchar, GFreeDeleter>;

std::vector<std::string> posted_tags(const std::string &dir)
{
    std::vector<std::string> tags;
    GDir *d = g_dir_open(dir.c_str(), 0, nullptr);
    if (!d)
        return tags;
    while (const char *name = g_dir_read_name(d)) {
        size_t len = strlen(name);
        if (len > strlen(kSuffix) && g_str_has_suffix(name, kSuffix) && name[0] != '.')
            tags.emplace_back(name, len - strlen(kSuffix));
    }
    g_dir_close(d);
    std::sort(tags.begin(), tags.end());
    return tags;
}

// Prints one block; false (and a note on standard error) for a file that is not a
// notification.
bool print_block(const std::string &dir, const std::string &tag, bool first)
{
    std::string path = dir + "/" + tag + kSuffix;
    GKeyFile *kf = g_key_file_new();
    GError *error = nullptr;
    bool ok = g_key_file_load_from_file(kf, path.c_str(), G_KEY_FILE_NONE, &error) &&
              g_key_file_has_group(kf, kGroup);
    if (!ok) {
        fprintf(stderr, "zv-noti: %s: not a notification%s%s\n", path.c_str(), error ? ": " : "",
                error ? error->message : "");
        g_clear_error(&error);
        g_key_file_free(kf);
        return false;
    }
    printf("%s[%s]\n", first ? "" : "\n", tag.c_str());
    gsize n = 0;
    gchar **keys = g_key_file_get_keys(kf, kGroup, &n, nullptr);
    for (gsize i = 0; i < n; i++) {
        GCharPtr value(g_key_file_get_value(kf, kGroup, keys[i], nullptr));
        printf("%s=%s\n", keys[i], value ? value.get() : "");
    }
    g_strfreev(keys);
    g_key_file_free(kf);
    return true;
}

int list_tray()
{
    GCharPtr dir(notification_tray_dir());
    if (!dir) {
        fprintf(stderr, "zv-noti: no usable runtime folder (ZV_RUNTIME_DIR)\n");
        return 1;
    }
    bool first = true;
    for (const std::string &tag : posted_tags(dir.get()))
        if (print_block(dir.get(), tag, first))
            first = false;
    return 0;
}

} // namespace

int main(int argc, char **argv)
{
    if (argc == 2 && (strcmp(argv[1], "--help") == 0 || strcmp(argv[1], "-h") == 0)) {
        fputs(kUsage, stdout);
        return 0;
    }
    if (argc < 2) {
        fprintf(stderr, "zv-noti: missing command (try: zv-noti list)\n");
        return 2;
    }
    if (strcmp(argv[1], "list") != 0) {
        fprintf(stderr, "zv-noti: unknown command '%s' (try: zv-noti list)\n", argv[1]);
        return 2;
    }
    if (argc > 2) {
        fprintf(stderr, "zv-noti: 'list' takes no arguments, got '%s'\n", argv[2]);
        return 2;
    }
    return list_tray();
}
