#include "zv-platform-util.h"

#include <errno.h>
#include <fcntl.h>
#include <unistd.h>

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
