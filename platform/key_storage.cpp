// Host key storage: entry NAME is the file $ZV_KEY_STORAGE_DIR/NAME holding the value (one
// trailing newline ignored). Entries are private to their owner: a file or folder that
// group or others can reach is refused, and the reason logged.
// Thread safety: any thread (no shared state).
#include "key_storage.h"
#include "zv-platform-util.h"

#include <errno.h>
#include <fcntl.h>
#include <glib.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <memory>
#include <string>

#include "zv-log.h"

namespace {

constexpr size_t kMaxValueSize = 64 * 1024;

std::string storage_dir()
{
    const char *env = getenv("ZV_KEY_STORAGE_DIR");
    if (env && *env) {
        if (g_path_is_absolute(env))
            return env;
        std::unique_ptr<char, decltype(&g_free)> cwd(g_get_current_dir(), g_free);
        return std::string(cwd.get()) + "/" + env;
    }
    return std::string(g_get_user_data_dir()) + "/zuvo/keys";
}

bool valid_name(const char *name)
{
    return name && *name && strchr(name, '/') == nullptr && strcmp(name, ".") != 0 &&
           strcmp(name, "..") != 0 && strlen(name) <= 255;
}

// Refuses a folder or file that is not this user's or that group or others may use.
bool private_enough(const struct stat &sb, const char *what, const std::string &path)
{
    if (sb.st_uid != getuid()) {
        ZV_LOGE("key storage %s %s belongs to uid %d, not to this user: refused", what,
                path.c_str(), (int)sb.st_uid);
        return false;
    }
    if (sb.st_mode & (S_IRWXG | S_IRWXO)) {
        ZV_LOGE("key storage %s %s is open to group or others (mode %03o): refused", what,
                path.c_str(), (unsigned)(sb.st_mode & 0777));
        return false;
    }
    return true;
}

} // namespace

int key_storage_get(const char *name, char **value)
{
    if (!value || !valid_name(name))
        return KEY_STORAGE_ERROR_INVALID_PARAMETER;
    *value = nullptr;
    std::string dir = storage_dir();
    std::string path = dir + "/" + name;

    struct stat sb;
    if (stat(dir.c_str(), &sb) != 0)
        return errno == ENOENT ? KEY_STORAGE_ERROR_NO_DATA : KEY_STORAGE_ERROR_IO;
    if (!private_enough(sb, "folder", dir))
        return KEY_STORAGE_ERROR_PERMISSION_DENIED;

    int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW);
    if (fd < 0) {
        if (errno == ENOENT)
            return KEY_STORAGE_ERROR_NO_DATA;
        ZV_LOGE("cannot open key storage entry %s: %s", path.c_str(), strerror(errno));
        return errno == ELOOP ? KEY_STORAGE_ERROR_PERMISSION_DENIED : KEY_STORAGE_ERROR_IO;
    }
    std::unique_ptr<int, void (*)(int *)> guard(&fd, [](int *p) { close(*p); });
    if (fstat(fd, &sb) != 0 || !S_ISREG(sb.st_mode)) {
        ZV_LOGE("key storage entry %s is not a regular file", path.c_str());
        return KEY_STORAGE_ERROR_IO;
    }
    if (!private_enough(sb, "file", path))
        return KEY_STORAGE_ERROR_PERMISSION_DENIED;
    if ((size_t)sb.st_size > kMaxValueSize) {
        ZV_LOGE("key storage entry %s is too large", path.c_str());
        return KEY_STORAGE_ERROR_IO;
    }

    std::string data;
    char buf[4096];
    ssize_t n;
    while ((n = read(fd, buf, sizeof buf)) > 0 && data.size() <= kMaxValueSize)
        data.append(buf, (size_t)n);
    if (n < 0 || data.size() > kMaxValueSize)
        return KEY_STORAGE_ERROR_IO;
    if (!data.empty() && data.back() == '\n')
        data.pop_back();
    if (memchr(data.data(), '\0', data.size())) {
        ZV_LOGE("key storage entry %s holds a NUL byte", path.c_str());
        return KEY_STORAGE_ERROR_IO;
    }
    *value = strdup(data.c_str());
    return *value ? KEY_STORAGE_ERROR_NONE : KEY_STORAGE_ERROR_IO;
}

int key_storage_set(const char *name, const char *value)
{
    if (!value || !valid_name(name))
        return KEY_STORAGE_ERROR_INVALID_PARAMETER;
    std::string dir = storage_dir();
    if (g_mkdir_with_parents(dir.c_str(), 0700) != 0 || chmod(dir.c_str(), 0700) != 0) {
        ZV_LOGE("cannot make key storage folder %s: %s", dir.c_str(), strerror(errno));
        return KEY_STORAGE_ERROR_IO;
    }
    std::string path = dir + "/" + name;
    // The newline keeps a value that ends in one intact through the read.
    if (!zv_platform_replace_file(path, std::string(value) + "\n", true)) {
        ZV_LOGE("cannot write key storage entry %s: %s", path.c_str(), strerror(errno));
        return KEY_STORAGE_ERROR_IO;
    }
    return KEY_STORAGE_ERROR_NONE;
}
