// Host notification service: each posted notification is the key file
// $ZV_RUNTIME_DIR/notifications/TAG.ini, replaced atomically; status messages are appended to
// notifications/status-messages.log. Posted notifications are also shown on the desktop's
// notification service (org.freedesktop.Notifications, through Eldbus) when the session bus
// has one; its ids are kept in notifications/desktop/TAG so that another process can replace
// or close what this one showed. A notification with a launch application carries the
// desktop's default action: invoking it (a click) sends that application a launch request,
// as a tap in the phone's tray does.
// A tray file that cannot be written (no descriptor left, a full disk) is written again on a
// timer of the main loop until it lands.
#include "notification.h"
#include "zv-platform-util.h"

#include <Ecore.h>
#include <Eldbus.h>
#include <app.h>
#include <errno.h>
#include <fcntl.h>
#include <glib.h>
#include <glib/gstdio.h>
#include <stdarg.h>
#include <stdlib.h>
#include <string.h>
#include <unistd.h>

#include <map>
#include <memory>
#include <optional>
#include <string>
#include <thread>

#include "zv-log.h"

namespace
{

const char kGroup[] = "notification";
const char kStatusLog[] = "status-messages.log";
const char kBusName[] = "org.freedesktop.Notifications";
const char kBusPath[] = "/org/freedesktop/Notifications";
const char kDefaultAction[] = "default";

struct GFreeDeleter {
    void operator()(void *p) const { g_free(p); }
};
using GCharPtr = std::unique_ptr<gchar, GFreeDeleter>;

struct KeyFileDeleter {
    void operator()(GKeyFile *kf) const { g_key_file_free(kf); }
};
using KeyFilePtr = std::unique_ptr<GKeyFile, KeyFileDeleter>;

// The tray folder; empty when there is no usable runtime folder.
std::string tray_dir()
{
    GCharPtr runtime(zv_platform_runtime_dir());
    return runtime ? std::string(runtime.get()) + "/notifications" : std::string();
}

// The tray folder, made (0700) when missing; empty when it cannot be made.
std::string ensure_tray_dir()
{
    std::string dir = tray_dir();
    if (dir.empty())
        return dir;
    if (g_mkdir_with_parents(dir.c_str(), 0700) != 0) {
        ZV_LOGE("notification tray %s: %s", dir.c_str(), g_strerror(errno));
        return {};
    }
    return dir;
}

// The tray file of tag; empty when there is no tray folder.
std::string tray_file(const std::string &tag)
{
    std::string dir = tray_dir();
    return dir.empty() ? dir : dir + "/" + tag + ".ini";
}

bool valid_tag(const char *tag)
{
    return tag && *tag && !strchr(tag, '/') && strcmp(tag, ".") != 0 && strcmp(tag, "..") != 0;
}

} // namespace

struct _notification {
    notification_type_e type = NOTIFICATION_TYPE_NOTI;
    std::string title;
    std::string content;
    std::string event_count;
    std::optional<double> progress;
    int display_applist = NOTIFICATION_DISPLAY_APP_ALL;
    std::string tag;
    std::optional<std::string> launch_app_id;
    int property = 0;
    std::optional<gint64> time;
};

namespace
{

std::string to_key_file(const _notification &n)
{
    KeyFilePtr kf(g_key_file_new());
    GKeyFile *k = kf.get();
    g_key_file_set_string(k, kGroup, "type",
                          n.type == NOTIFICATION_TYPE_ONGOING ? "ongoing" : "noti");
    g_key_file_set_string(k, kGroup, "title", n.title.c_str());
    g_key_file_set_string(k, kGroup, "content", n.content.c_str());
    g_key_file_set_string(k, kGroup, "event_count", n.event_count.c_str());
    if (n.progress) {
        char text[G_ASCII_DTOSTR_BUF_SIZE];
        g_key_file_set_value(k, kGroup, "progress",
                             g_ascii_formatd(text, sizeof text, "%.6g", *n.progress));
    }
    g_key_file_set_integer(k, kGroup, "display_applist", n.display_applist);
    g_key_file_set_string(k, kGroup, "tag", n.tag.c_str());
    if (n.launch_app_id)
        g_key_file_set_string(k, kGroup, "launch_app_id", n.launch_app_id->c_str());
    g_key_file_set_boolean(k, kGroup, "disable_app_launch",
                           (n.property & NOTIFICATION_PROP_DISABLE_APP_LAUNCH) != 0);
    if (n.time)
        g_key_file_set_int64(k, kGroup, "time", *n.time);
    gsize len = 0;
    GCharPtr data(g_key_file_to_data(k, &len, nullptr));
    return std::string(data.get(), len);
}

std::optional<std::string> read_string(GKeyFile *kf, const char *key, GError **error)
{
    if (!g_key_file_has_key(kf, kGroup, key, nullptr))
        return std::nullopt;
    GCharPtr value(g_key_file_get_string(kf, kGroup, key, error));
    if (!value)
        return std::nullopt;
    return std::string(value.get());
}

// Reads a tray file into n; false (with *why) when it is not a notification.
bool from_key_file(const std::string &path, _notification *n, std::string *why)
{
    KeyFilePtr kf(g_key_file_new());
    GKeyFile *k = kf.get();
    GError *error = nullptr;
    auto fail = [&](const std::string &what) {
        *why = error ? what + ": " + error->message : what;
        g_clear_error(&error);
        return false;
    };
    if (!g_key_file_load_from_file(k, path.c_str(), G_KEY_FILE_NONE, &error))
        return fail("not a key file");
    if (!g_key_file_has_group(k, kGroup))
        return fail("no [notification] group");

    auto type = read_string(k, "type", &error);
    if (type == std::string("ongoing"))
        n->type = NOTIFICATION_TYPE_ONGOING;
    else if (type == std::string("noti"))
        n->type = NOTIFICATION_TYPE_NOTI;
    else
        return fail("no valid type");

    n->title = read_string(k, "title", &error).value_or("");
    n->content = read_string(k, "content", &error).value_or("");
    n->event_count = read_string(k, "event_count", &error).value_or("");
    n->tag = read_string(k, "tag", &error).value_or("");
    n->launch_app_id = read_string(k, "launch_app_id", &error);
    if (error)
        return fail("bad text");

    if (g_key_file_has_key(k, kGroup, "progress", nullptr)) {
        double progress = g_key_file_get_double(k, kGroup, "progress", &error);
        if (error)
            return fail("bad progress");
        n->progress = progress;
    }
    if (g_key_file_has_key(k, kGroup, "display_applist", nullptr)) {
        n->display_applist = g_key_file_get_integer(k, kGroup, "display_applist", &error);
        if (error)
            return fail("bad display_applist");
    }
    if (g_key_file_has_key(k, kGroup, "disable_app_launch", nullptr)) {
        gboolean disabled = g_key_file_get_boolean(k, kGroup, "disable_app_launch", &error);
        if (error)
            return fail("bad disable_app_launch");
        n->property = disabled ? NOTIFICATION_PROP_DISABLE_APP_LAUNCH : 0;
    }
    if (g_key_file_has_key(k, kGroup, "time", nullptr)) {
        gint64 t = g_key_file_get_int64(k, kGroup, "time", &error);
        if (error)
            return fail("bad time");
        n->time = t;
    }
    return true;
}

// Writes the tray file of n; false (errno set) when it could not.
bool store_tray_file(const _notification &n)
{
    std::string dir = ensure_tray_dir();
    if (dir.empty())
        return false;
    // The tray is volatile, like the runtime folder: no flush to the disk for every update of
    // an ongoing notification.
    return zv_platform_replace_file(dir + "/" + n.tag + ".ini", to_key_file(n), false);
}

// Shows posted notifications on the desktop's notification service, best effort: without a
// session bus, or without the service on it, nothing is shown and nothing is reported.
// Replies arrive on the main loop; a change made while the first Notify of a tag is still
// unanswered is sent once its id is known.
class DesktopNotifier
{
  public:
    void show(const _notification &n)
    {
        if (!connect())
            return;
        Entry &e = entries_[n.tag];
        e.latest = n;
        e.closed = false;
        if (e.pending) {
            e.dirty = true;
            return;
        }
        if (e.id == 0)
            e.id = read_id(n.tag);
        send_notify(n.tag, e);
    }

    void close(const std::string &tag)
    {
        auto it = entries_.find(tag);
        if (it != entries_.end() && it->second.pending) {
            it->second.closed = true;
            return;
        }
        uint32_t id = it != entries_.end() && it->second.id ? it->second.id : read_id(tag);
        if (it != entries_.end())
            entries_.erase(it);
        g_unlink(id_file(tag).c_str());
        if (id != 0 && connect())
            eldbus_proxy_call(proxy_, "CloseNotification", nullptr, nullptr, -1, "u", id);
    }

  private:
    struct Entry {
        uint32_t id = 0;
        bool pending = false;
        bool dirty = false;
        bool closed = false;
        _notification latest;
    };
    struct Pending {
        DesktopNotifier *self;
        std::string tag;
    };

    bool tried_ = false;
    Eldbus_Connection *conn_ = nullptr;
    Eldbus_Proxy *proxy_ = nullptr;
    std::map<std::string, Entry> entries_;

    bool connect()
    {
        if (tried_)
            return proxy_ != nullptr;
        tried_ = true;
        const char *address = getenv("DBUS_SESSION_BUS_ADDRESS");
        if (!address || !*address || !bus_socket_may_exist(address))
            return false;
        eldbus_init();
        conn_ = eldbus_address_connection_get(address);
        if (!conn_) {
            eldbus_shutdown();
            return false;
        }
        Eldbus_Object *obj = eldbus_object_get(conn_, kBusName, kBusPath);
        proxy_ = obj ? eldbus_proxy_get(obj, kBusName) : nullptr;
        if (proxy_)
            eldbus_proxy_signal_handler_add(proxy_, "ActionInvoked", on_action_invoked, this);
        return proxy_ != nullptr;
    }

    // A tap opens the notification's application, unless the notification says otherwise.
    static bool launches(const _notification &n)
    {
        return n.launch_app_id && !(n.property & NOTIFICATION_PROP_DISABLE_APP_LAUNCH);
    }

    // The desktop's click on one of our notifications: its application gets a launch request.
    // The request waits for the running instance to take it, and that instance may be this
    // very process; so it is sent from a thread of its own while this main loop goes on.
    static void on_action_invoked(void *data, const Eldbus_Message *msg)
    {
        auto *self = static_cast<DesktopNotifier *>(data);
        uint32_t id = 0;
        const char *action = nullptr;
        if (!eldbus_message_arguments_get(msg, "us", &id, &action) || !action ||
            strcmp(action, kDefaultAction) != 0)
            return;
        for (const auto &kv : self->entries_) {
            const Entry &e = kv.second;
            if (e.id != id || e.closed || !launches(e.latest))
                continue;
            ZV_LOGI("notification %s clicked: launching %s", kv.first.c_str(),
                    e.latest.launch_app_id->c_str());
            app_control_h request = nullptr;
            if (app_control_create(&request) != APP_CONTROL_ERROR_NONE)
                return;
            app_control_set_app_id(request, e.latest.launch_app_id->c_str());
            std::thread([request] {
                int rc = app_control_send_launch_request(request, nullptr, nullptr);
                if (rc != APP_CONTROL_ERROR_NONE)
                    ZV_LOGE("launch from the notification failed: %d", rc);
                app_control_destroy(request);
            }).detach();
            return;
        }
    }

    // False when the address names a socket file that is not there (a bus that has gone):
    // connecting would only print the library's complaint.
    static bool bus_socket_may_exist(const char *address)
    {
        static const char prefix[] = "unix:path=";
        if (strncmp(address, prefix, sizeof prefix - 1) != 0)
            return true;
        std::string path(address + sizeof prefix - 1);
        path = path.substr(0, path.find_first_of(",;"));
        return g_file_test(path.c_str(), G_FILE_TEST_EXISTS);
    }

    static std::string id_file(const std::string &tag)
    {
        std::string dir = tray_dir();
        return dir.empty() ? dir : dir + "/desktop/" + tag;
    }

    static uint32_t read_id(const std::string &tag)
    {
        gchar *data = nullptr;
        if (!g_file_get_contents(id_file(tag).c_str(), &data, nullptr, nullptr))
            return 0;
        GCharPtr text(data);
        return (uint32_t)g_ascii_strtoull(text.get(), nullptr, 10);
    }

    static void write_id(const std::string &tag, uint32_t id)
    {
        std::string dir = tray_dir();
        if (dir.empty() || g_mkdir_with_parents((dir += "/desktop").c_str(), 0700) != 0)
            return;
        std::string text = std::to_string(id) + "\n";
        g_file_set_contents(id_file(tag).c_str(), text.data(), (gssize)text.size(), nullptr);
    }

    void send_notify(const std::string &tag, Entry &e)
    {
        const _notification &n = e.latest;
        Eldbus_Message *msg = eldbus_proxy_method_call_new(proxy_, "Notify");
        if (!msg)
            return;
        Eldbus_Message_Iter *iter = eldbus_message_iter_get(msg);
        std::string body = n.content;
        if (!n.event_count.empty())
            body += body.empty() ? n.event_count : " " + n.event_count;
        bool ongoing = n.type == NOTIFICATION_TYPE_ONGOING;
        eldbus_message_iter_arguments_append(iter, "susss", "zuvo-upload-svc", e.id, "",
                                             n.title.c_str(), body.c_str());
        Eldbus_Message_Iter *actions = eldbus_message_iter_container_new(iter, 'a', "s");
        if (launches(n)) {
            eldbus_message_iter_basic_append(actions, 's', kDefaultAction);
            eldbus_message_iter_basic_append(actions, 's', "Open");
        }
        eldbus_message_iter_container_close(iter, actions);
        Eldbus_Message_Iter *hints = eldbus_message_iter_container_new(iter, 'a', "{sv}");
        if (n.progress)
            append_int_hint(hints, "value", (int)(*n.progress * 100.0 + 0.5));
        if (ongoing)
            append_bool_hint(hints, "resident", true);
        eldbus_message_iter_container_close(iter, hints);
        eldbus_message_iter_basic_append(iter, 'i', ongoing ? 0 : -1);

        e.pending = true;
        e.dirty = false;
        eldbus_proxy_send(proxy_, msg, on_notify_reply, new Pending{this, tag}, -1);
    }

    static void append_int_hint(Eldbus_Message_Iter *hints, const char *name, int value)
    {
        Eldbus_Message_Iter *entry = nullptr, *variant = nullptr;
        if (!eldbus_message_iter_arguments_append(hints, "{sv}", &entry))
            return;
        eldbus_message_iter_basic_append(entry, 's', name);
        variant = eldbus_message_iter_container_new(entry, 'v', "i");
        eldbus_message_iter_basic_append(variant, 'i', value);
        eldbus_message_iter_container_close(entry, variant);
        eldbus_message_iter_container_close(hints, entry);
    }

    static void append_bool_hint(Eldbus_Message_Iter *hints, const char *name, bool value)
    {
        Eldbus_Message_Iter *entry = nullptr, *variant = nullptr;
        if (!eldbus_message_iter_arguments_append(hints, "{sv}", &entry))
            return;
        eldbus_message_iter_basic_append(entry, 's', name);
        variant = eldbus_message_iter_container_new(entry, 'v', "b");
        eldbus_message_iter_basic_append(variant, 'b', value ? EINA_TRUE : EINA_FALSE);
        eldbus_message_iter_container_close(entry, variant);
        eldbus_message_iter_container_close(hints, entry);
    }

    static void on_notify_reply(void *data, const Eldbus_Message *msg, Eldbus_Pending *)
    {
        std::unique_ptr<Pending> p(static_cast<Pending *>(data));
        auto it = p->self->entries_.find(p->tag);
        if (it == p->self->entries_.end())
            return;
        Entry &e = it->second;
        e.pending = false;
        uint32_t id = 0;
        const char *err_name = nullptr, *err_text = nullptr;
        if (!eldbus_message_error_get(msg, &err_name, &err_text) &&
            eldbus_message_arguments_get(msg, "u", &id) && id != 0) {
            e.id = id;
            write_id(p->tag, id);
        }
        if (e.closed)
            p->self->close(p->tag);
        else if (e.dirty)
            p->self->send_notify(p->tag, e);
    }
};

DesktopNotifier &desktop()
{
    static DesktopNotifier notifier;
    return notifier;
}

// The notifications whose tray file could not be written, by tag, as last posted or updated:
// written again every half second until they land, so that the tray does not stay behind.
// A later write or a delete of the tag takes their place; loading the tag answers them.
class TrayBacklog
{
  public:
    void keep(const _notification &n)
    {
        latest_[n.tag] = n;
        if (!timer_)
            timer_ = ecore_timer_add(kRetrySeconds, retry_cb, this);
    }
    bool drop(const std::string &tag) { return latest_.erase(tag) > 0; }
    const _notification *find(const std::string &tag) const
    {
        auto it = latest_.find(tag);
        return it == latest_.end() ? nullptr : &it->second;
    }

  private:
    static constexpr double kRetrySeconds = 0.5;

    static Eina_Bool retry_cb(void *data)
    {
        auto *self = static_cast<TrayBacklog *>(data);
        for (auto it = self->latest_.begin(); it != self->latest_.end();) {
            if (!store_tray_file(it->second)) {
                ++it;
                continue;
            }
            ZV_LOGI("notification %s written on a later try", it->first.c_str());
            desktop().show(it->second);
            it = self->latest_.erase(it);
        }
        if (!self->latest_.empty())
            return ECORE_CALLBACK_RENEW;
        self->timer_ = nullptr;
        return ECORE_CALLBACK_CANCEL;
    }

    std::map<std::string, _notification> latest_;
    Ecore_Timer *timer_ = nullptr;
};

TrayBacklog &backlog()
{
    static TrayBacklog pending;
    return pending;
}

// Writes the tray file of n and shows it on the desktop; one that cannot be written now is
// logged and kept for a later try.
int write_tray_file(const _notification &n)
{
    if (!store_tray_file(n)) {
        ZV_LOGE("notification %s: %s; written again later", n.tag.c_str(), strerror(errno));
        backlog().keep(n);
        return NOTIFICATION_ERROR_IO_ERROR;
    }
    backlog().drop(n.tag);
    desktop().show(n);
    return NOTIFICATION_ERROR_NONE;
}

} // namespace

notification_h notification_create(notification_type_e type)
{
    if (type != NOTIFICATION_TYPE_NOTI && type != NOTIFICATION_TYPE_ONGOING)
        return nullptr;
    notification_h noti = new (std::nothrow) _notification;
    if (noti)
        noti->type = type;
    return noti;
}

notification_h notification_load_by_tag(const char *tag)
{
    if (!valid_tag(tag))
        return nullptr;
    if (const _notification *unwritten = backlog().find(tag))
        return new (std::nothrow) _notification(*unwritten);
    std::string path = tray_file(tag);
    if (path.empty() || !g_file_test(path.c_str(), G_FILE_TEST_EXISTS))
        return nullptr;
    std::unique_ptr<_notification> noti(new (std::nothrow) _notification);
    if (!noti)
        return nullptr;
    std::string why;
    if (!from_key_file(path, noti.get(), &why)) {
        ZV_LOGW("tray file %s is not a notification (%s): taken as absent", path.c_str(),
                why.c_str());
        return nullptr;
    }
    noti->tag = tag;
    return noti.release();
}

int notification_free(notification_h noti)
{
    if (!noti)
        return NOTIFICATION_ERROR_INVALID_PARAMETER;
    delete noti;
    return NOTIFICATION_ERROR_NONE;
}

int notification_set_text(notification_h noti, notification_text_type_e type, const char *text,
                          const char *key, int args_type, ...)
{
    (void)key;
    if (!noti || args_type != NOTIFICATION_VARIABLE_TYPE_NONE)
        return NOTIFICATION_ERROR_INVALID_PARAMETER;
    std::string value = text ? text : "";
    switch (type) {
    case NOTIFICATION_TEXT_TYPE_TITLE:
        noti->title = value;
        break;
    case NOTIFICATION_TEXT_TYPE_CONTENT:
        noti->content = value;
        break;
    case NOTIFICATION_TEXT_TYPE_EVENT_COUNT:
        noti->event_count = value;
        break;
    default:
        return NOTIFICATION_ERROR_INVALID_PARAMETER;
    }
    return NOTIFICATION_ERROR_NONE;
}

int notification_get_text(notification_h noti, notification_text_type_e type, char **text)
{
    if (!noti || !text)
        return NOTIFICATION_ERROR_INVALID_PARAMETER;
    const std::string *value = nullptr;
    switch (type) {
    case NOTIFICATION_TEXT_TYPE_TITLE:
        value = &noti->title;
        break;
    case NOTIFICATION_TEXT_TYPE_CONTENT:
        value = &noti->content;
        break;
    case NOTIFICATION_TEXT_TYPE_EVENT_COUNT:
        value = &noti->event_count;
        break;
    default:
        return NOTIFICATION_ERROR_INVALID_PARAMETER;
    }
    *text = value->empty() ? nullptr : const_cast<char *>(value->c_str());
    return NOTIFICATION_ERROR_NONE;
}

int notification_set_progress(notification_h noti, double percentage)
{
    if (!noti)
        return NOTIFICATION_ERROR_INVALID_PARAMETER;
    noti->progress = percentage < 0.0 ? 0.0 : percentage > 1.0 ? 1.0 : percentage;
    return NOTIFICATION_ERROR_NONE;
}

int notification_get_progress(notification_h noti, double *percentage)
{
    if (!noti || !percentage)
        return NOTIFICATION_ERROR_INVALID_PARAMETER;
    *percentage = noti->progress.value_or(0.0);
    return NOTIFICATION_ERROR_NONE;
}

int notification_set_display_applist(notification_h noti, int applist)
{
    if (!noti || applist < 0 || applist > NOTIFICATION_DISPLAY_APP_ALL)
        return NOTIFICATION_ERROR_INVALID_PARAMETER;
    noti->display_applist = applist;
    return NOTIFICATION_ERROR_NONE;
}

int notification_get_display_applist(notification_h noti, int *applist)
{
    if (!noti || !applist)
        return NOTIFICATION_ERROR_INVALID_PARAMETER;
    *applist = noti->display_applist;
    return NOTIFICATION_ERROR_NONE;
}

int notification_set_tag(notification_h noti, const char *tag)
{
    if (!noti || !valid_tag(tag))
        return NOTIFICATION_ERROR_INVALID_PARAMETER;
    noti->tag = tag;
    return NOTIFICATION_ERROR_NONE;
}

int notification_get_tag(notification_h noti, const char **tag)
{
    if (!noti || !tag)
        return NOTIFICATION_ERROR_INVALID_PARAMETER;
    *tag = noti->tag.empty() ? nullptr : noti->tag.c_str();
    return NOTIFICATION_ERROR_NONE;
}

int notification_set_property(notification_h noti, int flags)
{
    if (!noti)
        return NOTIFICATION_ERROR_INVALID_PARAMETER;
    noti->property = flags;
    return NOTIFICATION_ERROR_NONE;
}

int notification_get_property(notification_h noti, int *flags)
{
    if (!noti || !flags)
        return NOTIFICATION_ERROR_INVALID_PARAMETER;
    *flags = noti->property;
    return NOTIFICATION_ERROR_NONE;
}

int notification_set_time(notification_h noti, time_t input_time)
{
    if (!noti || input_time < 0)
        return NOTIFICATION_ERROR_INVALID_PARAMETER;
    noti->time = input_time == 0 ? (gint64)::time(nullptr) : (gint64)input_time;
    return NOTIFICATION_ERROR_NONE;
}

int notification_get_time(notification_h noti, time_t *ret_time)
{
    if (!noti || !ret_time)
        return NOTIFICATION_ERROR_INVALID_PARAMETER;
    *ret_time = (time_t)noti->time.value_or(0);
    return NOTIFICATION_ERROR_NONE;
}

int notification_set_launch_option(notification_h noti, notification_launch_option_type type,
                                   void *option)
{
    if (!noti || !option || type != NOTIFICATION_LAUNCH_OPTION_APP_CONTROL)
        return NOTIFICATION_ERROR_INVALID_PARAMETER;
    char *app_id = nullptr;
    if (app_control_get_app_id(static_cast<app_control_h>(option), &app_id) !=
            APP_CONTROL_ERROR_NONE ||
        !app_id) {
        free(app_id);
        return NOTIFICATION_ERROR_INVALID_PARAMETER;
    }
    noti->launch_app_id = std::string(app_id);
    free(app_id);
    return NOTIFICATION_ERROR_NONE;
}

int notification_get_type(notification_h noti, notification_type_e *type)
{
    if (!noti || !type)
        return NOTIFICATION_ERROR_INVALID_PARAMETER;
    *type = noti->type;
    return NOTIFICATION_ERROR_NONE;
}

int notification_post(notification_h noti)
{
    if (!noti)
        return NOTIFICATION_ERROR_INVALID_PARAMETER;
    if (noti->tag.empty()) {
        static int serial = 0;
        noti->tag = "noti-" + std::to_string(getpid()) + "-" + std::to_string(++serial) + "-" +
                    std::to_string(g_get_real_time());
    }
    return write_tray_file(*noti);
}

int notification_update(notification_h noti)
{
    if (!noti || noti->tag.empty())
        return NOTIFICATION_ERROR_INVALID_PARAMETER;
    std::string path = tray_file(noti->tag);
    if (path.empty())
        return NOTIFICATION_ERROR_IO_ERROR;
    if (!g_file_test(path.c_str(), G_FILE_TEST_EXISTS) && !backlog().find(noti->tag))
        return NOTIFICATION_ERROR_NOT_EXIST_ID;
    return write_tray_file(*noti);
}

int notification_delete(notification_h noti)
{
    if (!noti || noti->tag.empty())
        return NOTIFICATION_ERROR_INVALID_PARAMETER;
    std::string path = tray_file(noti->tag);
    if (path.empty())
        return NOTIFICATION_ERROR_IO_ERROR;
    bool unwritten = backlog().drop(noti->tag);
    if (g_unlink(path.c_str()) != 0 && !(errno == ENOENT && unwritten)) {
        if (errno == ENOENT)
            return NOTIFICATION_ERROR_NOT_EXIST_ID;
        ZV_LOGE("notification %s: %s", noti->tag.c_str(), g_strerror(errno));
        return NOTIFICATION_ERROR_IO_ERROR;
    }
    desktop().close(noti->tag);
    return NOTIFICATION_ERROR_NONE;
}

int notification_status_message_post(const char *message)
{
    if (!message)
        return NOTIFICATION_ERROR_INVALID_PARAMETER;
    std::string dir = ensure_tray_dir();
    if (dir.empty())
        return NOTIFICATION_ERROR_IO_ERROR;
    std::string line(message);
    for (char &c : line)
        if (c == '\n' || c == '\r')
            c = ' ';
    line += '\n';
    int fd =
        open((dir + "/" + kStatusLog).c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600);
    if (fd < 0)
        return NOTIFICATION_ERROR_IO_ERROR;
    ssize_t written = write(fd, line.data(), line.size());
    close(fd);
    return written == (ssize_t)line.size() ? NOTIFICATION_ERROR_NONE : NOTIFICATION_ERROR_IO_ERROR;
}

char *notification_tray_dir(void)
{
    std::string dir = tray_dir();
    return dir.empty() ? nullptr : strdup(dir.c_str());
}
