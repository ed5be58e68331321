#include "zv-platform-util.h"

#include <errno.h>
#include <fcntl.h>
#include <glib.h>
#include <limits.h>
#include <stdlib.h>
#include <unistd.h>

#include <memory>

namespace {

struct GFreeDeleter {
    void operator()(void *p) const { g_free(p); }
};
using GCharPtr = std::unique_ptr<char, GFreeDeleter>;

std::string canonical(const std::string &path)
{
    char buf[PATH_MAX];
    return realpath(path.c_str(), buf) ? std::string(buf) : path;
}

} // namespace

bool zv_platform_replace_file(const std::string &path, const std::string &data, bool durable)
{
    size_t slash = path.rfind('/');
    std::string dir = slash == std::string::npos ? std::string(".") : path.substr(0, slash);
    std::string name = slash == std::string::npos ? path : path.substr(slash + 1);
    std::string tmpl = dir + "/." + name + ".XXXXXX";
    int fd = mkostemp(&tmpl[0], O_CLOEXEC); // mode 0600
    if (fd < 0)
        return false;
    const char *p = data.data();
    size_t left = data.size();
    bool ok = true;
    while (left > 0) {
        ssize_t n = write(fd, p, left);
        if (n < 0 && errno == EINTR)
            continue;
        if (n <= 0) {
            ok = false;
            break;
        }
        p += n;
        left -= static_cast<size_t>(n);
    }
    if (ok && durable)
        ok = fsync(fd) == 0;
    ok = close(fd) == 0 && ok;
    if (!ok || rename(tmpl.c_str(), path.c_str()) != 0) {
        int saved = errno;
        unlink(tmpl.c_str());
        errno = saved;
        return false;
    }
    return true;
}

std::string zv_platform_exe_dir()
{
    char buf[PATH_MAX];
    ssize_t n = readlink("/proc/self/exe", buf, sizeof buf - 1);
    if (n <= 0)
        return std::string();
    buf[n] = '\0';
    GCharPtr dir(g_path_get_dirname(buf));
    return dir.get();
}

std::string zv_platform_absolute(const std::string &path)
{
    if (g_path_is_absolute(path.c_str()))
        return path;
    GCharPtr cwd(g_get_current_dir());
    GCharPtr joined(g_build_filename(cwd.get(), path.c_str(), nullptr));
    return joined.get();
}

std::string zv_platform_with_slash(std::string path)
{
    if (path.empty() || path.back() != '/')
        path += '/';
    return path;
}

std::string zv_platform_resource_dir()
{
    const char *env = getenv("ZV_RES_DIR");
    if (env && *env)
        return zv_platform_with_slash(zv_platform_absolute(env));
    std::string dir = zv_platform_exe_dir();
    if (!dir.empty() && canonical(dir) == canonical(ZV_BUILD_BIN_DIR))
        return zv_platform_with_slash(ZV_BUILD_RES_DIR);
    if (!dir.empty()) {
        std::string beside = canonical(dir + "/" + ZV_BIN_TO_RES_DIR);
        if (g_file_test(beside.c_str(), G_FILE_TEST_IS_DIR))
            return zv_platform_with_slash(beside);
    }
    return zv_platform_with_slash(ZV_INSTALL_RES_DIR);
}
