// Host application framework: the UI application loop with its lifecycle callbacks, app
// controls with string extras, the single running instance behind a Unix stream socket,
// launch requests from other programs, and the resource paths.
//
// Thread safety: everything runs on the main loop, except app_control_* on handles that the
// calling thread owns, zv_platform_runtime_dir and the launch message codec.
#include "app.h"

#include <Ecore.h>
#include <Elementary.h>
#include <errno.h>
#include <fcntl.h>
#include <glib.h>
#include <poll.h>
#include <signal.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/file.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <time.h>
#include <unistd.h>

#include <chrono>
#include <list>
#include <memory>
#include <new>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "app_i18n.h"
#include "zv-log.h"
#include "zv-platform-util.h"

struct app_control_s {
    std::string app_id;
    std::vector<std::pair<std::string, std::string>> extras;
};

namespace {

constexpr const char kAppId[] = "zuvo-upload-svc";
constexpr const char kSocketName[] = "zuvo-upload-svc.sock";
constexpr const char kLockName[] = "zuvo-upload-svc.lock";
// The first launch request of a service started by spawn_service, hex-encoded.
constexpr const char kLaunchRequestEnv[] = "ZV_LAUNCH_REQUEST";
// How long a later process keeps trying to reach (or become) the instance, and how long it
// waits for the instance to take its request.
constexpr int kElectionTimeoutMs = 5000;
constexpr int kReplyTimeoutMs = 5000;
// An accepted connection that has not delivered a whole message by then is dropped.
constexpr double kConnectionTimeoutS = 5.0;
constexpr size_t kMaxConnections = 8;
constexpr char kReplyTaken = 'A';
constexpr char kReplyRefused = 'R';

struct GFreeDeleter {
    void operator()(void *p) const { g_free(p); }
};
using GCharPtr = std::unique_ptr<char, GFreeDeleter>;
using GBytePtr = std::unique_ptr<unsigned char, GFreeDeleter>;

// Closes a descriptor at scope end unless released.
class Fd {
public:
    explicit Fd(int fd = -1) : fd_(fd) {}
    ~Fd() { reset(); }
    Fd(const Fd &) = delete;
    Fd &operator=(const Fd &) = delete;
    int get() const { return fd_; }
    int release()
    {
        int fd = fd_;
        fd_ = -1;
        return fd;
    }
    void reset(int fd = -1)
    {
        if (fd_ >= 0)
            close(fd_);
        fd_ = fd;
    }

private:
    int fd_;
};

// ---- little-endian codec helpers ----

void put_u32(std::string &out, uint32_t v)
{
    for (int i = 0; i < 4; i++)
        out.push_back((char)((v >> (8 * i)) & 0xff));
}

bool get_u32(const unsigned char *&p, const unsigned char *end, uint32_t *v)
{
    if (end - p < 4)
        return false;
    *v = (uint32_t)p[0] | (uint32_t)p[1] << 8 | (uint32_t)p[2] << 16 | (uint32_t)p[3] << 24;
    p += 4;
    return true;
}

bool valid_text(const char *s, size_t len)
{
    return memchr(s, '\0', len) == nullptr && g_utf8_validate(s, (gssize)len, nullptr);
}

// ---- paths ----

// Makes every missing folder of path with mode 0700.
bool make_dirs(const std::string &path)
{
    if (g_mkdir_with_parents(path.c_str(), 0700) != 0) {
        ZV_LOGE("cannot make folder %s: %s", path.c_str(), strerror(errno));
        return false;
    }
    return true;
}

// ---- the instance ----

struct Connection {
    int fd = -1;
    Ecore_Fd_Handler *handler = nullptr;
    Ecore_Timer *timer = nullptr;
    std::string data;
};

struct Window {
    Evas_Object *obj = nullptr;
};

struct AppState {
    ui_app_lifecycle_callback_s callbacks{};
    void *user_data = nullptr;
    bool running = false;
    bool paused = false;
    // An end asked for before the loop runs (elm_exit would be lost then).
    bool quit_requested = false;

    std::string socket_path;
    int listen_fd = -1;
    int lock_fd = -1;
    dev_t socket_dev = 0;
    ino_t socket_ino = 0;
    Ecore_Fd_Handler *listen_handler = nullptr;
    std::list<std::unique_ptr<Connection>> connections;
    Ecore_Event_Handler *signal_handler = nullptr;
    Evas_Object *window = nullptr;
};

AppState &state()
{
    static AppState st;
    return st;
}

bool check_peer_uid(int fd, const char *who)
{
    struct ucred cred;
    socklen_t len = sizeof cred;
    if (getsockopt(fd, SOL_SOCKET, SO_PEERCRED, &cred, &len) != 0) {
        ZV_LOGE("SO_PEERCRED on the %s failed: %s", who, strerror(errno));
        return false;
    }
    if (cred.uid != getuid()) {
        ZV_LOGE("the %s runs as uid %d, not as this user (%d): refused", who, (int)cred.uid,
                (int)getuid());
        return false;
    }
    return true;
}

bool fill_address(const std::string &path, struct sockaddr_un *addr)
{
    memset(addr, 0, sizeof *addr);
    addr->sun_family = AF_UNIX;
    if (path.size() >= sizeof addr->sun_path) {
        ZV_LOGE("socket path too long: %s", path.c_str());
        return false;
    }
    memcpy(addr->sun_path, path.c_str(), path.size());
    return true;
}

// Connects to the instance socket; the descriptor, or -1 with errno set.
int connect_instance(const std::string &path)
{
    struct sockaddr_un addr;
    if (!fill_address(path, &addr)) {
        errno = ENAMETOOLONG;
        return -1;
    }
    Fd fd(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    if (fd.get() < 0)
        return -1;
    if (connect(fd.get(), (struct sockaddr *)&addr, sizeof addr) != 0)
        return -1;
    return fd.release();
}

bool write_all(int fd, const unsigned char *data, size_t size)
{
    while (size > 0) {
        ssize_t n = send(fd, data, size, MSG_NOSIGNAL);
        if (n < 0 && errno == EINTR)
            continue;
        if (n <= 0)
            return false;
        data += n;
        size -= (size_t)n;
    }
    return true;
}

// Sends one launch message over a connected instance socket and waits for the answer.
bool hand_over(int fd, app_control_h app_control)
{
    if (!check_peer_uid(fd, "running instance"))
        return false;
    size_t size = 0;
    std::unique_ptr<unsigned char, GFreeDeleter> msg(
        zv_app_launch_message_encode(app_control, &size));
    if (!msg) {
        ZV_LOGE("launch request too large to hand over");
        return false;
    }
    struct timeval tv = {kReplyTimeoutMs / 1000, 0};
    setsockopt(fd, SOL_SOCKET, SO_SNDTIMEO, &tv, sizeof tv);
    if (!write_all(fd, msg.get(), size)) {
        ZV_LOGE("cannot send the launch request: %s", strerror(errno));
        return false;
    }
    struct pollfd pfd = {fd, POLLIN, 0};
    int r;
    do {
        r = poll(&pfd, 1, kReplyTimeoutMs);
    } while (r < 0 && errno == EINTR);
    char reply = 0;
    if (r <= 0 || recv(fd, &reply, 1, 0) != 1) {
        ZV_LOGE("the running instance did not answer the launch request");
        return false;
    }
    if (reply != kReplyTaken) {
        ZV_LOGE("the running instance refused the launch request");
        return false;
    }
    return true;
}

enum class Election { kInstance, kHandedOver, kFailed };

// Binds and listens on the socket path; the caller holds the instance lock.
bool listen_instance(AppState &st)
{
    struct sockaddr_un addr;
    if (!fill_address(st.socket_path, &addr))
        return false;
    struct stat sb;
    if (lstat(st.socket_path.c_str(), &sb) == 0) {
        ZV_LOGI("removing stale socket %s", st.socket_path.c_str());
        if (unlink(st.socket_path.c_str()) != 0) {
            ZV_LOGE("cannot remove stale socket %s: %s", st.socket_path.c_str(), strerror(errno));
            return false;
        }
    }
    Fd fd(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    if (fd.get() < 0) {
        ZV_LOGE("socket failed: %s", strerror(errno));
        return false;
    }
    mode_t old_mask = umask(0177);
    int rc = bind(fd.get(), (struct sockaddr *)&addr, sizeof addr);
    umask(old_mask);
    if (rc != 0 || chmod(st.socket_path.c_str(), 0600) != 0 || listen(fd.get(), 16) != 0) {
        ZV_LOGE("cannot listen on %s: %s", st.socket_path.c_str(), strerror(errno));
        unlink(st.socket_path.c_str());
        return false;
    }
    if (stat(st.socket_path.c_str(), &sb) == 0) {
        st.socket_dev = sb.st_dev;
        st.socket_ino = sb.st_ino;
    }
    st.listen_fd = fd.release();
    return true;
}

// Becomes the running instance (socket listening, lock held), or hands first_request to the
// running one. The lock keeps two starting processes from both replacing a stale socket.
Election elect(AppState &st, app_control_h first_request)
{
    GCharPtr dir(zv_platform_runtime_dir());
    if (!dir)
        return Election::kFailed;
    st.socket_path = std::string(dir.get()) + "/" + kSocketName;
    std::string lock_path = std::string(dir.get()) + "/" + kLockName;
    Fd lock(open(lock_path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600));
    if (lock.get() < 0) {
        ZV_LOGE("cannot open %s: %s", lock_path.c_str(), strerror(errno));
        return Election::kFailed;
    }

    auto deadline =
        std::chrono::steady_clock::now() + std::chrono::milliseconds(kElectionTimeoutMs);
    for (;;) {
        Fd conn(connect_instance(st.socket_path));
        if (conn.get() >= 0) {
            if (!hand_over(conn.get(), first_request))
                return Election::kFailed;
            ZV_LOGI("launch request handed to the running instance");
            return Election::kHandedOver;
        }
        if (flock(lock.get(), LOCK_EX | LOCK_NB) == 0) {
            if (!listen_instance(st))
                return Election::kFailed;
            st.lock_fd = lock.release();
            return Election::kInstance;
        }
        if (std::chrono::steady_clock::now() >= deadline) {
            ZV_LOGE("another process holds %s but does not answer on %s", lock_path.c_str(),
                    st.socket_path.c_str());
            return Election::kFailed;
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
    }
}

void stop_listening(AppState &st)
{
    if (st.listen_handler) {
        ecore_main_fd_handler_del(st.listen_handler);
        st.listen_handler = nullptr;
    }
    if (st.listen_fd >= 0) {
        close(st.listen_fd);
        st.listen_fd = -1;
        // Remove the socket only while it is still ours: a successor may have replaced it.
        struct stat sb;
        if (stat(st.socket_path.c_str(), &sb) == 0 && sb.st_dev == st.socket_dev &&
            sb.st_ino == st.socket_ino)
            unlink(st.socket_path.c_str());
    }
}

void release_instance(AppState &st)
{
    stop_listening(st);
    if (st.lock_fd >= 0) {
        close(st.lock_fd);
        st.lock_fd = -1;
    }
}

void close_connection(Connection *conn)
{
    AppState &st = state();
    if (conn->handler)
        ecore_main_fd_handler_del(conn->handler);
    if (conn->timer)
        ecore_timer_del(conn->timer);
    close(conn->fd);
    st.connections.remove_if(
        [conn](const std::unique_ptr<Connection> &c) { return c.get() == conn; });
}

void deliver(app_control_h app_control)
{
    AppState &st = state();
    if (st.callbacks.app_control)
        st.callbacks.app_control(app_control, st.user_data);
}

// Reads what the peer sent; once a whole message is in, answers it and delivers it.
Eina_Bool connection_readable_cb(void *data, Ecore_Fd_Handler *)
{
    auto *conn = static_cast<Connection *>(data);
    char buf[4096];
    for (;;) {
        ssize_t n = recv(conn->fd, buf, sizeof buf, 0);
        if (n < 0 && errno == EINTR)
            continue;
        if (n < 0 && (errno == EAGAIN || errno == EWOULDBLOCK))
            return ECORE_CALLBACK_RENEW;
        if (n <= 0) {
            ZV_LOGE("launch connection closed after %zu bytes, before a whole message",
                    conn->data.size());
            close_connection(conn);
            return ECORE_CALLBACK_RENEW;
        }
        conn->data.append(buf, (size_t)n);
        if (conn->data.size() >= ZV_APP_LAUNCH_HEADER_SIZE)
            break;
    }

    const auto *bytes = reinterpret_cast<const unsigned char *>(conn->data.data());
    const unsigned char *p = bytes + 4;
    uint32_t payload = 0;
    get_u32(p, bytes + conn->data.size(), &payload);
    if (memcmp(bytes, ZV_APP_LAUNCH_MAGIC, 4) != 0 ||
        payload > ZV_APP_LAUNCH_MAX_MESSAGE - ZV_APP_LAUNCH_HEADER_SIZE ||
        conn->data.size() > ZV_APP_LAUNCH_HEADER_SIZE + (size_t)payload) {
        ZV_LOGE("malformed launch message ignored (bad header or length)");
        send(conn->fd, &kReplyRefused, 1, MSG_NOSIGNAL | MSG_DONTWAIT);
        close_connection(conn);
        return ECORE_CALLBACK_RENEW;
    }
    if (conn->data.size() < ZV_APP_LAUNCH_HEADER_SIZE + (size_t)payload)
        return ECORE_CALLBACK_RENEW;

    app_control_h request = nullptr;
    int rc = zv_app_launch_message_parse(bytes, conn->data.size(), &request);
    if (rc != APP_CONTROL_ERROR_NONE) {
        ZV_LOGE("malformed launch message ignored (%zu bytes)", conn->data.size());
        send(conn->fd, &kReplyRefused, 1, MSG_NOSIGNAL | MSG_DONTWAIT);
        close_connection(conn);
        return ECORE_CALLBACK_RENEW;
    }
    send(conn->fd, &kReplyTaken, 1, MSG_NOSIGNAL | MSG_DONTWAIT);
    close_connection(conn);
    ZV_LOGI("launch request taken from a later process");
    deliver(request);
    app_control_destroy(request);
    return ECORE_CALLBACK_RENEW;
}

Eina_Bool connection_timeout_cb(void *data)
{
    auto *conn = static_cast<Connection *>(data);
    ZV_LOGE("launch connection timed out after %zu bytes", conn->data.size());
    conn->timer = nullptr;
    close_connection(conn);
    return ECORE_CALLBACK_CANCEL;
}

Eina_Bool listen_readable_cb(void *, Ecore_Fd_Handler *)
{
    AppState &st = state();
    for (;;) {
        int fd = accept4(st.listen_fd, nullptr, nullptr, SOCK_NONBLOCK | SOCK_CLOEXEC);
        if (fd < 0) {
            if (errno == EINTR)
                continue;
            if (errno != EAGAIN && errno != EWOULDBLOCK)
                ZV_LOGE("accept failed: %s", strerror(errno));
            return ECORE_CALLBACK_RENEW;
        }
        if (!check_peer_uid(fd, "launching process")) {
            close(fd);
            continue;
        }
        if (st.connections.size() >= kMaxConnections) {
            ZV_LOGE("too many launch connections at once: one refused");
            close(fd);
            continue;
        }
        auto conn = std::make_unique<Connection>();
        conn->fd = fd;
        conn->handler = ecore_main_fd_handler_add(fd, ECORE_FD_READ, connection_readable_cb,
                                                  conn.get(), nullptr, nullptr);
        conn->timer = ecore_timer_add(kConnectionTimeoutS, connection_timeout_cb, conn.get());
        if (!conn->handler) {
            ZV_LOGE("cannot watch a launch connection");
            if (conn->timer)
                ecore_timer_del(conn->timer);
            close(fd);
            continue;
        }
        st.connections.push_back(std::move(conn));
    }
}

// ---- foreground and background ----

void set_paused(bool paused)
{
    AppState &st = state();
    if (!st.running || st.paused == paused)
        return;
    st.paused = paused;
    if (paused && st.callbacks.pause)
        st.callbacks.pause(st.user_data);
    else if (!paused && st.callbacks.resume)
        st.callbacks.resume(st.user_data);
}

void win_iconified_cb(void *, Evas_Object *, void *)
{
    ZV_LOGI("window iconified");
    set_paused(true);
}

void win_normal_cb(void *, Evas_Object *, void *)
{
    ZV_LOGI("window restored");
    set_paused(false);
}

void win_del_cb(void *, Evas *, Evas_Object *obj, void *)
{
    AppState &st = state();
    if (st.window == obj)
        st.window = nullptr;
}

// Follows the application's window (the one named after the app id) for pause and resume.
void hook_window()
{
    AppState &st = state();
    if (st.window)
        return;
    Eina_List *list = ecore_evas_ecore_evas_list_get();
    Eina_List *l;
    void *item;
    EINA_LIST_FOREACH(list, l, item)
    {
        auto *ee = static_cast<Ecore_Evas *>(item);
        const char *name = nullptr, *klass = nullptr;
        ecore_evas_name_class_get(ee, &name, &klass);
        auto *win = static_cast<Evas_Object *>(ecore_evas_data_get(ee, "elm_win"));
        if (win && name && strcmp(name, kAppId) == 0) {
            st.window = win;
            evas_object_smart_callback_add(win, "iconified", win_iconified_cb, nullptr);
            evas_object_smart_callback_add(win, "normal", win_normal_cb, nullptr);
            evas_object_event_callback_add(win, EVAS_CALLBACK_DEL, win_del_cb, nullptr);
            break;
        }
    }
    eina_list_free(list);
}

void unhook_window()
{
    AppState &st = state();
    if (!st.window)
        return;
    evas_object_smart_callback_del(st.window, "iconified", win_iconified_cb);
    evas_object_smart_callback_del(st.window, "normal", win_normal_cb);
    evas_object_event_callback_del(st.window, EVAS_CALLBACK_DEL, win_del_cb);
    st.window = nullptr;
}

volatile sig_atomic_t g_early_exit_signal = 0;

void early_exit_signal_handler(int sig)
{
    g_early_exit_signal = sig;
}

void request_quit()
{
    state().quit_requested = true;
    elm_exit();
}

Eina_Bool signal_exit_cb(void *, int, void *)
{
    ZV_LOGI("exit signal: ending the main loop");
    request_quit();
    return ECORE_CALLBACK_DONE;
}

// ---- command line ----

[[noreturn]] void usage_error(const std::string &prog, const std::string &what)
{
    fprintf(stderr, "%s: %s (see --help)\n", prog.c_str(), what.c_str());
    exit(2);
}

void print_help(const std::string &prog)
{
    printf("Usage: %s [--extra KEY=VALUE]...\n"
           "The ZuVo upload service. Each --extra is one string extra of the launch request,\n"
           "split at the first '='. While an instance runs, a later start hands its extras to\n"
           "it and exits.\n"
           "\n"
           "  --extra KEY=VALUE   add an extra to the launch request (repeatable)\n"
           "  --help              show this help\n",
           prog.c_str());
}

void add_extra_argument(const std::string &prog, app_control_h request, const char *arg)
{
    const char *eq = strchr(arg, '=');
    if (!eq || eq == arg)
        usage_error(prog, std::string("--extra needs KEY=VALUE, got '") + arg + "'");
    std::string key(arg, (size_t)(eq - arg));
    if (!valid_text(key.data(), key.size()) || !valid_text(eq + 1, strlen(eq + 1)))
        usage_error(prog, std::string("--extra is not UTF-8 text: '") + arg + "'");
    app_control_add_extra_data(request, key.c_str(), eq + 1);
}

// The launch request of the command line; exits on --help and on a wrong call.
app_control_h parse_arguments(int argc, char **argv)
{
    std::string prog = argc > 0 && argv[0] ? GCharPtr(g_path_get_basename(argv[0])).get() : kAppId;
    app_control_h request = nullptr;
    app_control_create(&request);
    app_control_set_app_id(request, kAppId);
    for (int i = 1; i < argc; i++) {
        const char *arg = argv[i];
        if (strcmp(arg, "--help") == 0 || strcmp(arg, "-h") == 0) {
            print_help(prog);
            exit(0);
        } else if (strcmp(arg, "--extra") == 0) {
            if (i + 1 >= argc)
                usage_error(prog, "--extra needs KEY=VALUE");
            add_extra_argument(prog, request, argv[++i]);
        } else if (strncmp(arg, "--extra=", 8) == 0) {
            add_extra_argument(prog, request, arg + 8);
        } else {
            usage_error(prog, std::string("unknown argument '") + arg + "'");
        }
    }
    // A request handed over by the program that started this one (see spawn_service).
    if (const char *handed = getenv(kLaunchRequestEnv)) {
        std::string bytes;
        size_t len = strlen(handed);
        for (size_t i = 0; i + 1 < len; i += 2)
            bytes += static_cast<char>(g_ascii_xdigit_value(handed[i]) * 16 +
                                       g_ascii_xdigit_value(handed[i + 1]));
        app_control_h passed = nullptr;
        if (len % 2 == 0 &&
            zv_app_launch_message_parse(reinterpret_cast<const unsigned char *>(bytes.data()),
                                        bytes.size(), &passed) == APP_CONTROL_ERROR_NONE) {
            for (const auto &kv : passed->extras)
                app_control_add_extra_data(request, kv.first.c_str(), kv.second.c_str());
            app_control_destroy(passed);
        } else {
            ZV_LOGE("the launch request handed over at start is malformed");
        }
        unsetenv(kLaunchRequestEnv);
    }
    return request;
}

// ---- starting the service from another program ----

std::string find_service_program()
{
    std::string beside = zv_platform_exe_dir() + "/" + kAppId;
    if (access(beside.c_str(), X_OK) == 0)
        return beside;
    GCharPtr found(g_find_program_in_path(kAppId));
    return found ? std::string(found.get()) : std::string();
}

bool is_pipe_or_socket(int fd)
{
    struct stat sb;
    return fstat(fd, &sb) == 0 && (S_ISFIFO(sb.st_mode) || S_ISSOCK(sb.st_mode));
}

// Starts the service detached from the caller (own session, no inherited pipes), its
// extras as --extra arguments. True once the program has been executed.
bool spawn_service(const std::string &program, app_control_h app_control)
{
    // The extras travel in the environment, which only the user can read (/proc/PID/environ
    // is private, the command line is not): the access token is among them.
    size_t size = 0;
    GBytePtr message(zv_app_launch_message_encode(app_control, &size));
    if (!message)
        return false;
    std::string request = std::string(kLaunchRequestEnv) + "=";
    static const char hex[] = "0123456789abcdef";
    for (size_t i = 0; i < size; i++) {
        request += hex[message.get()[i] >> 4];
        request += hex[message.get()[i] & 15];
    }
    std::vector<char *> envp;
    for (char **e = environ; *e; e++)
        if (strncmp(*e, kLaunchRequestEnv, strlen(kLaunchRequestEnv)) != 0)
            envp.push_back(*e);
    envp.push_back(&request[0]);
    envp.push_back(nullptr);
    std::string prog = program;
    char *argv[] = {&prog[0], nullptr};
    // A caller's output pipe must not be held open by the long-lived service; a terminal or
    // log file on standard error is kept for the service's log.
    bool keep_stderr = !is_pipe_or_socket(STDERR_FILENO);

    int status_pipe[2];
    if (pipe2(status_pipe, O_CLOEXEC) != 0)
        return false;
    pid_t child = fork();
    if (child < 0) {
        close(status_pipe[0]);
        close(status_pipe[1]);
        return false;
    }
    if (child == 0) {
        setsid();
        pid_t grandchild = fork();
        if (grandchild != 0)
            _exit(grandchild < 0 ? 1 : 0);
        int null_fd = open("/dev/null", O_RDWR);
        if (null_fd >= 0) {
            dup2(null_fd, STDIN_FILENO);
            dup2(null_fd, STDOUT_FILENO);
            if (!keep_stderr)
                dup2(null_fd, STDERR_FILENO);
            if (null_fd > STDERR_FILENO)
                close(null_fd);
        }
        // Nothing else of the caller's (sockets, pipes, databases) goes to the service.
        if (close_range(STDERR_FILENO + 1, ~0U, CLOSE_RANGE_CLOEXEC) != 0) {
            for (int fd = STDERR_FILENO + 1; fd < 1024; fd++)
                fcntl(fd, F_SETFD, FD_CLOEXEC);
        }
        execve(argv[0], argv, envp.data());
        int err = errno;
        if (write(status_pipe[1], &err, sizeof err) < 0) {
            // Nothing left to report to.
        }
        _exit(127);
    }
    close(status_pipe[1]);
    int wstatus = 0;
    while (waitpid(child, &wstatus, 0) < 0 && errno == EINTR) {
    }
    int err = 0;
    ssize_t n;
    do {
        n = read(status_pipe[0], &err, sizeof err);
    } while (n < 0 && errno == EINTR);
    close(status_pipe[0]);
    if (!WIFEXITED(wstatus) || WEXITSTATUS(wstatus) != 0) {
        ZV_LOGE("cannot start %s: fork failed", program.c_str());
        return false;
    }
    if (n == (ssize_t)sizeof err) {
        ZV_LOGE("cannot start %s: %s", program.c_str(), strerror(err));
        return false;
    }
    return true;
}

} // namespace

// ---- app control ----

int app_control_create(app_control_h *app_control)
{
    if (!app_control)
        return APP_CONTROL_ERROR_INVALID_PARAMETER;
    *app_control = new (std::nothrow) app_control_s();
    return *app_control ? APP_CONTROL_ERROR_NONE : APP_CONTROL_ERROR_OUT_OF_MEMORY;
}

int app_control_destroy(app_control_h app_control)
{
    if (!app_control)
        return APP_CONTROL_ERROR_INVALID_PARAMETER;
    delete app_control;
    return APP_CONTROL_ERROR_NONE;
}

int app_control_set_app_id(app_control_h app_control, const char *app_id)
{
    if (!app_control)
        return APP_CONTROL_ERROR_INVALID_PARAMETER;
    app_control->app_id = app_id ? app_id : "";
    return APP_CONTROL_ERROR_NONE;
}

int app_control_get_app_id(app_control_h app_control, char **app_id)
{
    if (!app_control || !app_id)
        return APP_CONTROL_ERROR_INVALID_PARAMETER;
    *app_id = app_control->app_id.empty() ? nullptr : strdup(app_control->app_id.c_str());
    return APP_CONTROL_ERROR_NONE;
}

int app_control_add_extra_data(app_control_h app_control, const char *key, const char *value)
{
    if (!app_control || !key || !*key || !value)
        return APP_CONTROL_ERROR_INVALID_PARAMETER;
    for (auto &kv : app_control->extras) {
        if (kv.first == key) {
            kv.second = value;
            return APP_CONTROL_ERROR_NONE;
        }
    }
    app_control->extras.emplace_back(key, value);
    return APP_CONTROL_ERROR_NONE;
}

int app_control_get_extra_data(app_control_h app_control, const char *key, char **value)
{
    if (!app_control || !key || !*key || !value)
        return APP_CONTROL_ERROR_INVALID_PARAMETER;
    *value = nullptr;
    for (const auto &kv : app_control->extras) {
        if (kv.first == key) {
            *value = strdup(kv.second.c_str());
            return *value ? APP_CONTROL_ERROR_NONE : APP_CONTROL_ERROR_OUT_OF_MEMORY;
        }
    }
    return APP_CONTROL_ERROR_KEY_NOT_FOUND;
}

int app_control_foreach_extra_data(app_control_h app_control, app_control_extra_data_cb cb,
                                   void *user_data)
{
    if (!app_control || !cb)
        return APP_CONTROL_ERROR_INVALID_PARAMETER;
    // A copy of the keys, so that the callback may change the extras.
    std::vector<std::string> keys;
    for (const auto &kv : app_control->extras)
        keys.push_back(kv.first);
    for (const auto &key : keys)
        if (!cb(app_control, key.c_str(), user_data))
            break;
    return APP_CONTROL_ERROR_NONE;
}

int app_control_send_launch_request(app_control_h app_control, void *reply_cb, void *user_data)
{
    (void)reply_cb;
    (void)user_data;
    if (!app_control)
        return APP_CONTROL_ERROR_INVALID_PARAMETER;
    if (!app_control->app_id.empty() && app_control->app_id != kAppId) {
        ZV_LOGE("no application with the id %s", app_control->app_id.c_str());
        return APP_CONTROL_ERROR_APP_NOT_FOUND;
    }
    for (const auto &kv : app_control->extras)
        if (kv.first.find('=') != std::string::npos)
            return APP_CONTROL_ERROR_INVALID_PARAMETER;

    GCharPtr dir(zv_platform_runtime_dir());
    if (!dir)
        return APP_CONTROL_ERROR_LAUNCH_REJECTED;
    std::string path = std::string(dir.get()) + "/" + kSocketName;
    Fd conn(connect_instance(path));
    if (conn.get() >= 0)
        return hand_over(conn.get(), app_control) ? APP_CONTROL_ERROR_NONE
                                                  : APP_CONTROL_ERROR_LAUNCH_REJECTED;

    // Nobody listens: start the service with the request as its first one. Should an
    // instance come up meanwhile, the new process hands the request over itself.
    std::string program = find_service_program();
    if (program.empty()) {
        ZV_LOGE("%s not found beside this program nor on PATH", kAppId);
        return APP_CONTROL_ERROR_APP_NOT_FOUND;
    }
    ZV_LOGI("starting %s", program.c_str());
    return spawn_service(program, app_control) ? APP_CONTROL_ERROR_NONE
                                               : APP_CONTROL_ERROR_LAUNCH_REJECTED;
}

// ---- launch message codec ----

unsigned char *zv_app_launch_message_encode(app_control_h app_control, size_t *size)
{
    if (!app_control || !size || app_control->extras.size() > ZV_APP_LAUNCH_MAX_EXTRAS)
        return nullptr;
    std::string payload;
    put_u32(payload, (uint32_t)app_control->extras.size());
    for (const auto &kv : app_control->extras) {
        if (payload.size() + 8 + kv.first.size() + kv.second.size() >
            ZV_APP_LAUNCH_MAX_MESSAGE - ZV_APP_LAUNCH_HEADER_SIZE)
            return nullptr;
        put_u32(payload, (uint32_t)kv.first.size());
        payload += kv.first;
        put_u32(payload, (uint32_t)kv.second.size());
        payload += kv.second;
    }
    std::string msg(ZV_APP_LAUNCH_MAGIC);
    put_u32(msg, (uint32_t)payload.size());
    msg += payload;
    auto *out = static_cast<unsigned char *>(g_malloc(msg.size()));
    memcpy(out, msg.data(), msg.size());
    *size = msg.size();
    return out;
}

int zv_app_launch_message_parse(const unsigned char *data, size_t size,
                                app_control_h *app_control)
{
    if (!app_control)
        return APP_CONTROL_ERROR_INVALID_PARAMETER;
    *app_control = nullptr;
    if (!data || size < ZV_APP_LAUNCH_HEADER_SIZE || size > ZV_APP_LAUNCH_MAX_MESSAGE ||
        memcmp(data, ZV_APP_LAUNCH_MAGIC, 4) != 0)
        return APP_CONTROL_ERROR_INVALID_DATA_TYPE;
    const unsigned char *p = data + 4;
    const unsigned char *end = data + size;
    uint32_t payload = 0, count = 0;
    get_u32(p, end, &payload);
    if (payload != size - ZV_APP_LAUNCH_HEADER_SIZE || !get_u32(p, end, &count) ||
        count > ZV_APP_LAUNCH_MAX_EXTRAS)
        return APP_CONTROL_ERROR_INVALID_DATA_TYPE;

    auto request = std::make_unique<app_control_s>();
    request->app_id = kAppId;
    for (uint32_t i = 0; i < count; i++) {
        uint32_t klen = 0, vlen = 0;
        if (!get_u32(p, end, &klen) || klen == 0 || (size_t)(end - p) < klen)
            return APP_CONTROL_ERROR_INVALID_DATA_TYPE;
        const char *key = reinterpret_cast<const char *>(p);
        p += klen;
        if (!get_u32(p, end, &vlen) || (size_t)(end - p) < vlen)
            return APP_CONTROL_ERROR_INVALID_DATA_TYPE;
        const char *value = reinterpret_cast<const char *>(p);
        p += vlen;
        if (!valid_text(key, klen) || !valid_text(value, vlen))
            return APP_CONTROL_ERROR_INVALID_DATA_TYPE;
        std::string k(key, klen), v(value, vlen);
        if (app_control_add_extra_data(request.get(), k.c_str(), v.c_str()) !=
            APP_CONTROL_ERROR_NONE)
            return APP_CONTROL_ERROR_INVALID_DATA_TYPE;
    }
    if (p != end)
        return APP_CONTROL_ERROR_INVALID_DATA_TYPE;
    *app_control = request.release();
    return APP_CONTROL_ERROR_NONE;
}

// ---- the application loop ----

int ui_app_main(int argc, char **argv, ui_app_lifecycle_callback_s *callback, void *user_data)
{
    if (!callback)
        return APP_ERROR_INVALID_PARAMETER;
    AppState &st = state();
    if (st.running)
        return APP_ERROR_ALREADY_RUNNING;

    std::unique_ptr<app_control_s> first(parse_arguments(argc, argv));
    // An exit signal that comes before the main loop watches for it (ecore takes the signals
    // over in elm_init) is remembered, so that the instance still ends in order. A process
    // that hands its request over takes such a signal as it would have come.
    struct sigaction early = {}, old_term = {}, old_int = {};
    early.sa_handler = early_exit_signal_handler;
    sigemptyset(&early.sa_mask);
    g_early_exit_signal = 0;
    sigaction(SIGTERM, &early, &old_term);
    sigaction(SIGINT, &early, &old_int);
    Election elected = elect(st, first.get());
    if (elected != Election::kInstance) {
        sigaction(SIGTERM, &old_term, nullptr);
        sigaction(SIGINT, &old_int, nullptr);
        if (g_early_exit_signal)
            raise(g_early_exit_signal);
        return elected == Election::kHandedOver ? APP_ERROR_ALREADY_RUNNING
                                                : APP_ERROR_INVALID_CONTEXT;
    }

    elm_init(argc, argv);
    i18n_bind_text_domain();
    st.quit_requested = false;
    st.callbacks = *callback;
    st.user_data = user_data;
    st.listen_handler = ecore_main_fd_handler_add(st.listen_fd, ECORE_FD_READ, listen_readable_cb,
                                                  nullptr, nullptr, nullptr);
    st.signal_handler = ecore_event_handler_add(ECORE_EVENT_SIGNAL_EXIT, signal_exit_cb, nullptr);
    if (g_early_exit_signal) {
        ZV_LOGI("exit signal %d before the main loop: the application ends after create",
                (int)g_early_exit_signal);
        request_quit();
    }

    int result = APP_ERROR_NONE;
    if (st.callbacks.create && !st.callbacks.create(user_data)) {
        ZV_LOGE("create callback failed: the application ends");
        result = APP_ERROR_INVALID_CONTEXT;
    } else {
        st.running = true;
        st.paused = false;
        hook_window();
        deliver(first.get());
        first.reset();
        if (st.callbacks.resume)
            st.callbacks.resume(user_data);
        if (!st.quit_requested)
            elm_run();
        // Later launches wait for the next instance from here on.
        stop_listening(st);
        if (st.callbacks.terminate)
            st.callbacks.terminate(user_data);
        unhook_window();
        st.running = false;
    }

    while (!st.connections.empty())
        close_connection(st.connections.front().get());
    if (st.signal_handler) {
        ecore_event_handler_del(st.signal_handler);
        st.signal_handler = nullptr;
    }
    release_instance(st);
    elm_shutdown();
    return result;
}

void ui_app_exit(void)
{
    request_quit();
}

// ---- paths and ids ----

char *zv_platform_runtime_dir(void)
{
    std::string dir;
    const char *env = getenv("ZV_RUNTIME_DIR");
    const char *xdg = getenv("XDG_RUNTIME_DIR");
    if (env && *env)
        dir = zv_platform_absolute(env);
    else if (xdg && *xdg)
        dir = std::string(xdg) + "/zuvo";
    else
        dir = "/tmp/zuvo-" + std::to_string((unsigned)getuid());
    if (!make_dirs(dir))
        return nullptr;
    struct stat sb;
    if (lstat(dir.c_str(), &sb) != 0 || !S_ISDIR(sb.st_mode) || sb.st_uid != getuid()) {
        ZV_LOGE("runtime folder %s is not a folder of this user: refused", dir.c_str());
        return nullptr;
    }
    if ((sb.st_mode & 0777) != 0700 && chmod(dir.c_str(), 0700) != 0) {
        ZV_LOGE("cannot make %s private: %s", dir.c_str(), strerror(errno));
        return nullptr;
    }
    return g_strdup(dir.c_str());
}

char *app_get_resource_path(void)
{
    return strdup(zv_platform_resource_dir().c_str());
}

char *app_get_shared_resource_path(void)
{
    return strdup(zv_platform_resource_dir().c_str());
}

char *app_get_data_path(void)
{
    GCharPtr dir(g_build_filename(g_get_user_data_dir(), kAppId, nullptr));
    if (!make_dirs(dir.get()))
        return nullptr;
    return strdup(zv_platform_with_slash(dir.get()).c_str());
}

int app_get_id(char **id)
{
    if (!id)
        return APP_ERROR_INVALID_PARAMETER;
    *id = strdup(kAppId);
    return *id ? APP_ERROR_NONE : APP_ERROR_OUT_OF_MEMORY;
}

Evas_Object *app_get_preinitialized_window(const char *)
{
    return nullptr;
}

Evas_Object *app_get_preinitialized_background(void)
{
    return nullptr;
}

Evas_Object *app_get_preinitialized_conformant(void)
{
    return nullptr;
}
