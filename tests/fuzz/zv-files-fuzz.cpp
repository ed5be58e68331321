// The readers of files other processes write: a key storage entry and a notification tray
// file, with arbitrary content. A value read from an entry is its content less one
// trailing newline.
#include <glib.h>
#include <key_storage.h>
#include <notification.h>
#include <stdint.h>
#include <stdlib.h>

#include <string>

namespace
{

std::string g_key_path;
std::string g_tray_path;

void write_file(const std::string &path, const uint8_t *data, size_t size)
{
    if (!g_file_set_contents_full(path.c_str(), reinterpret_cast<const char *>(data), size,
                                  G_FILE_SET_CONTENTS_CONSISTENT, 0600, nullptr))
        abort();
}

} // namespace

extern "C" int LLVMFuzzerInitialize(int *, char ***)
{
    char tmpl[] = "/dev/shm/zv-files-fuzz-XXXXXX";
    if (!mkdtemp(tmpl))
        abort();
    std::string dir = tmpl;
    setenv("ZV_KEY_STORAGE_DIR", (dir + "/keys").c_str(), 1);
    setenv("ZV_RUNTIME_DIR", (dir + "/run").c_str(), 1);
    setenv("ZV_DLOG_FILE", "/dev/null", 1);
    g_mkdir_with_parents((dir + "/keys").c_str(), 0700);
    g_mkdir_with_parents((dir + "/run/notifications").c_str(), 0700);
    g_key_path = dir + "/keys/fuzz.entry";
    g_tray_path = dir + "/run/notifications/fuzz_tag.ini";
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size)
{
    write_file(g_key_path, data, size);
    char *value = nullptr;
    if (key_storage_get("fuzz.entry", &value) == KEY_STORAGE_ERROR_NONE) {
        std::string content(reinterpret_cast<const char *>(data), size);
        if (!content.empty() && content.back() == '\n')
            content.pop_back();
        if (!value || content != value)
            __builtin_trap(); // a value other than the entry's content
    }
    free(value);

    write_file(g_tray_path, data, size);
    if (notification_h noti = notification_load_by_tag("fuzz_tag")) {
        char *text = nullptr;
        notification_get_text(noti, NOTIFICATION_TEXT_TYPE_TITLE, &text);
        notification_free(noti);
    }
    return 0;
}
