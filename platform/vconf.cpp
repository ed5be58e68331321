// Host platform keys: key K is the file <runtime dir>/vconf/K holding its value as text (one
// trailing newline ignored), replaced atomically by writers. Watches follow the key's folder
// with inotify on the main loop, so a change made by any process (also by rename) reaches the
// callback within one main-loop turn.
//
// Thread safety: getters and setters from any thread (no shared state); watches are
// registered, removed and delivered on the main loop only.
#include "vconf.h"
#include "zv-platform-util.h"

#include <Ecore.h>
#include <errno.h>
#include <fcntl.h>
#include <glib.h>
#include <limits.h>
#include <stdlib.h>
#include <string.h>
#include <sys/inotify.h>
#include <sys/stat.h>
#include <unistd.h>

#include <map>
#include <memory>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "app.h"
#include "zv-log.h"

struct _keynode_t {
    std::string name;
    int type = VCONF_TYPE_NONE;
    int int_value = 0;
    std::string text;
};

namespace {

constexpr size_t kMaxValueSize = 64 * 1024;

struct GFreeDeleter {
    void operator()(void *p) const { g_free(p); }
};
using GCharPtr = std::unique_ptr<char, GFreeDeleter>;

// A key is a relative path of plain names: no empty, "." or ".." parts and no part that
// starts with '.' (the temporary files of writers do).
bool valid_key(const char *key)
{
    if (!key || !*key || strlen(key) > 255)
        return false;
    char **parts = g_strsplit(key, "/", -1);
    bool ok = true;
    for (char **p = parts; *p; p++)
        if (!**p || **p == '.')
            ok = false;
    g_strfreev(parts);
    return ok;
}

std::string vconf_dir()
{
    GCharPtr runtime(zv_platform_runtime_dir());
    return runtime ? std::string(runtime.get()) + "/vconf" : std::string();
}

std::string key_path(const char *key)
{
    std::string dir = vconf_dir();
    return dir.empty() ? dir : dir + "/" + key;
}

bool read_value(const std::string &path, std::string *value)
{
    int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
    if (fd < 0)
        return false;
    std::string data;
    char buf[4096];
    ssize_t n;
    while ((n = read(fd, buf, sizeof buf)) > 0) {
        data.append(buf, (size_t)n);
        if (data.size() > kMaxValueSize) {
            n = -1;
            break;
        }
    }
    close(fd);
    if (n < 0)
        return false;
    if (!data.empty() && data.back() == '\n')
        data.pop_back();
    *value = std::move(data);
    return true;
}

// Decimal text to int: an optional sign and digits only, within the int range.
bool parse_int(const std::string &text, int *value)
{
    if (text.empty())
        return false;
    size_t i = (text[0] == '-' || text[0] == '+') ? 1 : 0;
    if (i == text.size())
        return false;
    for (size_t j = i; j < text.size(); j++)
        if (text[j] < '0' || text[j] > '9')
            return false;
    errno = 0;
    long v = strtol(text.c_str(), nullptr, 10);
    if (errno == ERANGE || v < INT_MIN || v > INT_MAX)
        return false;
    *value = (int)v;
    return true;
}

int write_value(const char *key, const std::string &text)
{
    if (!valid_key(key))
        return VCONF_ERROR;
    std::string path = key_path(key);
    if (path.empty())
        return VCONF_ERROR;
    GCharPtr dir(g_path_get_dirname(path.c_str()));
    if (g_mkdir_with_parents(dir.get(), 0700) != 0) {
        ZV_LOGE("cannot make %s: %s", dir.get(), strerror(errno));
        return VCONF_ERROR;
    }
    if (!zv_platform_replace_file(path, text + "\n", false)) {
        ZV_LOGE("cannot write %s: %s", path.c_str(), strerror(errno));
        return VCONF_ERROR;
    }
    return VCONF_OK;
}

// ---- watches ----

struct Watch {
    int id;
    std::string key;
    std::string dir;  // folder of the key's file
    std::string name; // file name in that folder
    vconf_callback_fn cb;
    void *user_data;
};

struct WatchState {
    int fd = -1;
    Ecore_Fd_Handler *handler = nullptr;
    std::map<int, std::string> dir_of_wd;
    std::map<std::string, int> wd_of_dir;
    std::vector<Watch> watches;
    int next_id = 1;
};

WatchState &watch_state()
{
    static WatchState st;
    return st;
}

bool node_for(const Watch &w, _keynode_t *node)
{
    if (!read_value(w.dir + "/" + w.name, &node->text))
        return false;
    node->name = w.key;
    node->type = parse_int(node->text, &node->int_value) ? VCONF_TYPE_INT : VCONF_TYPE_STRING;
    return true;
}

// Calls the callbacks of every watch on a changed file; a callback may add or remove watches.
void notify_changed(const std::set<std::pair<std::string, std::string>> &changed, bool all)
{
    WatchState &st = watch_state();
    std::vector<int> ids;
    for (const Watch &w : st.watches)
        if (all || changed.count({w.dir, w.name}))
            ids.push_back(w.id);
    for (int id : ids) {
        Watch found;
        bool present = false;
        for (const Watch &w : st.watches)
            if (w.id == id) {
                found = w;
                present = true;
            }
        if (!present)
            continue;
        _keynode_t node;
        if (!node_for(found, &node))
            continue;
        found.cb(&node, found.user_data);
    }
}

Eina_Bool inotify_readable_cb(void *, Ecore_Fd_Handler *)
{
    WatchState &st = watch_state();
    std::set<std::pair<std::string, std::string>> changed;
    bool overflow = false;
    alignas(struct inotify_event) char buf[8192];
    for (;;) {
        ssize_t n = read(st.fd, buf, sizeof buf);
        if (n < 0 && errno == EINTR)
            continue;
        if (n <= 0)
            break;
        for (char *p = buf; p < buf + n;) {
            auto *ev = reinterpret_cast<struct inotify_event *>(p);
            p += sizeof *ev + ev->len;
            if (ev->mask & IN_Q_OVERFLOW) {
                overflow = true;
                continue;
            }
            auto it = st.dir_of_wd.find(ev->wd);
            if (it == st.dir_of_wd.end())
                continue;
            if (ev->mask & IN_IGNORED) {
                ZV_LOGE("key folder %s went away: its watches are lost", it->second.c_str());
                st.wd_of_dir.erase(it->second);
                st.dir_of_wd.erase(it);
                continue;
            }
            if (ev->len > 0 && ev->name[0] != '.')
                changed.insert({it->second, ev->name});
        }
    }
    if (overflow || !changed.empty())
        notify_changed(changed, overflow);
    return ECORE_CALLBACK_RENEW;
}

bool ensure_inotify()
{
    WatchState &st = watch_state();
    if (st.fd >= 0)
        return true;
    ecore_init();
    st.fd = inotify_init1(IN_NONBLOCK | IN_CLOEXEC);
    if (st.fd < 0) {
        ZV_LOGE("inotify_init1 failed: %s", strerror(errno));
        return false;
    }
    st.handler = ecore_main_fd_handler_add(st.fd, ECORE_FD_READ, inotify_readable_cb, nullptr,
                                           nullptr, nullptr);
    if (!st.handler) {
        ZV_LOGE("cannot watch the inotify descriptor");
        close(st.fd);
        st.fd = -1;
        return false;
    }
    return true;
}

bool watch_dir(const std::string &dir)
{
    WatchState &st = watch_state();
    if (st.wd_of_dir.count(dir))
        return true;
    int wd = inotify_add_watch(st.fd, dir.c_str(), IN_CLOSE_WRITE | IN_MOVED_TO | IN_ONLYDIR);
    if (wd < 0) {
        ZV_LOGE("cannot watch %s: %s", dir.c_str(), strerror(errno));
        return false;
    }
    st.wd_of_dir[dir] = wd;
    st.dir_of_wd[wd] = dir;
    return true;
}

void unwatch_dir_if_unused(const std::string &dir)
{
    WatchState &st = watch_state();
    for (const Watch &w : st.watches)
        if (w.dir == dir)
            return;
    auto it = st.wd_of_dir.find(dir);
    if (it == st.wd_of_dir.end())
        return;
    inotify_rm_watch(st.fd, it->second);
    st.dir_of_wd.erase(it->second);
    st.wd_of_dir.erase(it);
}

} // namespace

int vconf_get_int(const char *in_key, int *intval)
{
    if (!intval || !valid_key(in_key))
        return VCONF_ERROR;
    std::string text;
    std::string path = key_path(in_key);
    if (path.empty() || !read_value(path, &text) || !parse_int(text, intval))
        return VCONF_ERROR;
    return VCONF_OK;
}

char *vconf_get_str(const char *in_key)
{
    if (!valid_key(in_key))
        return nullptr;
    std::string text;
    std::string path = key_path(in_key);
    if (path.empty() || !read_value(path, &text))
        return nullptr;
    return strdup(text.c_str());
}

int vconf_set_int(const char *in_key, const int intval)
{
    return write_value(in_key, std::to_string(intval));
}

int vconf_set_str(const char *in_key, const char *strval)
{
    if (!strval)
        return VCONF_ERROR;
    return write_value(in_key, strval);
}

int vconf_notify_key_changed(const char *in_key, vconf_callback_fn cb, void *user_data)
{
    if (!cb || !valid_key(in_key)) {
        ZV_LOGE("invalid key or callback");
        return VCONF_ERROR;
    }
    std::string path = key_path(in_key);
    if (path.empty() || !ensure_inotify())
        return VCONF_ERROR;
    GCharPtr dir(g_path_get_dirname(path.c_str()));
    GCharPtr name(g_path_get_basename(path.c_str()));
    // The folder is made so that a key written later is seen.
    if (g_mkdir_with_parents(dir.get(), 0700) != 0 || !watch_dir(dir.get())) {
        ZV_LOGE("cannot watch key %s", in_key);
        return VCONF_ERROR;
    }
    WatchState &st = watch_state();
    for (Watch &w : st.watches) {
        if (w.key == in_key && w.cb == cb) {
            // The key may live in another folder since the first registration (the runtime
            // folder moved): the watch follows it.
            std::string old_dir = w.dir;
            w.dir = dir.get();
            w.name = name.get();
            w.user_data = user_data;
            if (old_dir != w.dir)
                unwatch_dir_if_unused(old_dir);
            return VCONF_OK;
        }
    }
    st.watches.push_back(Watch{st.next_id++, in_key, dir.get(), name.get(), cb, user_data});
    return VCONF_OK;
}

int vconf_ignore_key_changed(const char *in_key, vconf_callback_fn cb)
{
    if (!cb || !in_key)
        return VCONF_ERROR;
    WatchState &st = watch_state();
    for (auto it = st.watches.begin(); it != st.watches.end(); ++it) {
        if (it->key == in_key && it->cb == cb) {
            std::string dir = it->dir;
            st.watches.erase(it);
            unwatch_dir_if_unused(dir);
            return VCONF_OK;
        }
    }
    return VCONF_ERROR;
}

const char *vconf_keynode_get_name(keynode_t *keynode)
{
    return keynode ? keynode->name.c_str() : nullptr;
}

int vconf_keynode_get_type(keynode_t *keynode)
{
    return keynode ? keynode->type : VCONF_TYPE_NONE;
}

int vconf_keynode_get_int(keynode_t *keynode)
{
    if (!keynode || keynode->type != VCONF_TYPE_INT)
        return VCONF_ERROR;
    return keynode->int_value;
}

char *vconf_keynode_get_str(keynode_t *keynode)
{
    return keynode ? const_cast<char *>(keynode->text.c_str()) : nullptr;
}

int zv_vconf_key_valid(const char *key)
{
    return valid_key(key) ? 1 : 0;
}
