#include "zv-test-util.h"

#include <arpa/inet.h>
#include <netinet/in.h>
#include <sys/socket.h>

#include <Ecore.h>
#include <Elementary.h>
#include <errno.h>
#include <fcntl.h>
#include <signal.h>
#include <stdlib.h>
#include <string.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <map>
#include <sstream>

namespace zv_test {

namespace {

// The exit statuses of the children the main loop reaped, by pid.
std::map<pid_t, int> &reaped_by_loop()
{
    static std::map<pid_t, int> statuses;
    static Ecore_Event_Handler *handler = ecore_event_handler_add(
        ECORE_EXE_EVENT_DEL,
        [](void *, int, void *event) -> Eina_Bool {
            auto *del = static_cast<Ecore_Exe_Event_Del *>(event);
            statuses[del->pid] =
                del->signalled ? (del->exit_signal & 0x7f) : ((del->exit_code & 0xff) << 8);
            return ECORE_CALLBACK_PASS_ON;
        },
        nullptr);
    (void)handler;
    return statuses;
}

// Forks argv (argv[0] a path) with this process's environment and env over it, its standard
// input, output and error on fds (-1: inherited) and nofile, when above 0, as its open-file
// limit; the pid, or -1. Everything the child uses is made before the fork: a child of a
// process with other threads must not allocate before exec, since another thread may have held
// the allocator's lock at the fork.
pid_t launch(const std::vector<std::string> &argv, const Env &env, const int (&fds)[3],
             rlim_t nofile = 0)
{
    std::vector<std::string> vars;
    for (char **e = environ; *e; ++e) {
        const std::string name(*e, strcspn(*e, "="));
        if (std::none_of(env.begin(), env.end(), [&](const auto &kv) { return kv.first == name; }))
            vars.push_back(*e);
    }
    for (const auto &kv : env)
        vars.push_back(kv.first + "=" + kv.second);
    std::vector<char *> args, envp;
    for (const auto &a : argv)
        args.push_back(const_cast<char *>(a.c_str()));
    for (auto &v : vars)
        envp.push_back(v.data());
    args.push_back(nullptr);
    envp.push_back(nullptr);
    const rlimit limit = {nofile, nofile};
    pid_t pid = fork();
    if (pid == 0) {
        for (int i = 0; i < 3; i++)
            if (fds[i] >= 0)
                dup2(fds[i], i);
        if (nofile == 0 || setrlimit(RLIMIT_NOFILE, &limit) == 0)
            execve(args[0], args.data(), envp.data());
        _exit(127);
    }
    return pid;
}

} // namespace

TempDir::TempDir(bool set_env)
{
    char tmpl[] = "/tmp/zv-test-XXXXXX";
    const char *p = mkdtemp(tmpl);
    path_ = p ? p : "/tmp";
    if (!set_env)
        return;
    setenv("ZV_RUNTIME_DIR", file("run").c_str(), 1);
    setenv("ZV_HISTORY_DB", file("db/.zuvo-history.db").c_str(), 1);
    setenv("ZV_KEY_STORAGE_DIR", file("keys").c_str(), 1);
    setenv("ZV_MEDIA_DB", file("media.db").c_str(), 1);
    setenv("ZV_NETWORK", "keys", 1);
    unsetenv("ZV_LOCATION");
}

TempDir::~TempDir()
{
    std::error_code ignored; // a folder left behind in /tmp is harmless
    if (path_ != "/tmp")
        std::filesystem::remove_all(path_, ignored);
}

bool wait_for(const std::function<bool()> &pred, int timeout_ms, bool *quit_by_other)
{
    struct Wait {
        const std::function<bool()> *pred;
        double deadline;
        bool held, done;
    } w{&pred, ecore_time_get() + timeout_ms / 1000.0, pred(), false};
    reaped_by_loop(); // the exit of a child the loop reaps is kept
    if (quit_by_other)
        *quit_by_other = false;
    while (!w.held && ecore_time_get() < w.deadline) {
        Ecore_Timer *timer = ecore_timer_add(
            0.01,
            [](void *data) -> Eina_Bool {
                Wait *w = static_cast<Wait *>(data);
                w->held = (*w->pred)();
                if (!w->held && ecore_time_get() < w->deadline)
                    return ECORE_CALLBACK_RENEW;
                w->done = true;
                ecore_main_loop_quit();
                return ECORE_CALLBACK_CANCEL;
            },
            &w);
        ecore_main_loop_begin();
        if (w.done)
            break;
        // Something else (elm_exit) ended the loop: the caller hears of it, or the wait goes on.
        ecore_timer_del(timer);
        w.held = pred();
        if (quit_by_other) {
            *quit_by_other = true;
            break;
        }
    }
    return w.held;
}

std::vector<Evas_Object *> widgets(Evas_Object *win, const char *type)
{
    std::vector<Evas_Object *> found;
    for (Evas_Object *o = evas_object_bottom_get(evas_object_evas_get(win)); o;
         o = evas_object_above_get(o))
        if (elm_object_widget_check(o) && evas_object_visible_get(o) &&
            !strcmp(elm_object_widget_type_get(o), type))
            found.push_back(o);
    return found;
}

std::string bin_path(const std::string &program)
{
    const char *dir = getenv("ZV_BIN_DIR");
    return std::string(dir ? dir : ZV_BUILD_BIN_DIR) + "/" + program;
}

std::string source_path(const std::string &rel)
{
    const char *dir = getenv("ZV_SOURCE_DIR");
    return std::string(dir ? dir : ".") + "/" + rel;
}

pid_t spawn_piped(const std::vector<std::string> &argv, int *input, int *output)
{
    int in[2] = {-1, -1}, out[2] = {-1, -1};
    if ((input && pipe2(in, O_CLOEXEC) != 0) || (output && pipe2(out, O_CLOEXEC) != 0))
        return -1;
    pid_t pid = launch(argv, {}, {in[0], out[1], -1});
    close(in[0]);
    close(out[1]);
    if (input)
        *input = in[1];
    if (output)
        *output = out[0];
    return pid;
}

int run_program(const std::vector<std::string> &argv, const std::string &input, std::string *out)
{
    int to = -1, from = -1;
    pid_t pid = spawn_piped(argv, &to, &from);
    if (!input.empty() && write(to, input.data(), input.size()) < 0) {
        // The program may not read its input; its status tells.
    }
    close(to);
    std::string collected;
    char buf[4096];
    for (ssize_t n; (n = read(from, buf, sizeof buf)) > 0;)
        collected.append(buf, (size_t)n);
    close(from);
    int status = 0;
    if (pid < 0 || waitpid(pid, &status, 0) < 0)
        return -1;
    if (out)
        *out = collected;
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

std::string wrong_calls(const std::string &program, const std::vector<std::string> &calls)
{
    std::string failed = run_program({program, "--help"}) == 0 ? "" : "--help failed\n", out;
    for (const std::string &args : calls) {
        const std::string cmd = program + " " + args + " 2>&1 </dev/null";
        int status = run_program({"/bin/sh", "-c", cmd}, "", &out);
        if (status != 2 || std::count(out.begin(), out.end(), '\n') != 1)
            failed += "'" + args + "': status " + std::to_string(status) + ", " + out + "\n";
    }
    return failed;
}

Child::~Child()
{
    if (running()) {
        kill(pid_, SIGKILL);
        waitpid(pid_, nullptr, 0);
    }
}

bool Child::start(const std::vector<std::string> &argv, const std::string &out_path, const Env &env,
                  rlim_t nofile)
{
    reaped_by_loop();
    killed_ = false;
    int in = open("/dev/null", O_RDONLY | O_CLOEXEC), out = -1;
    if (!out_path.empty())
        out = open(out_path.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600);
    pid_ = launch(argv, env, {in, out, out}, nofile);
    close(in);
    if (out >= 0)
        close(out);
    exited_ = pid_ < 0;
    return pid_ > 0;
}

bool Child::running()
{
    if (pid_ <= 0 || exited_)
        return false;
    int status = 0;
    pid_t got = waitpid(pid_, &status, WNOHANG);
    if (got == 0 || (got < 0 && errno != ECHILD))
        return true;
    if (got < 0) {
        // Reaped by the main loop, which keeps its status: until its event is read, it runs.
        auto reaped = reaped_by_loop().find(pid_);
        if (reaped == reaped_by_loop().end())
            return true;
        status = reaped->second;
    }
    status_ = status;
    exited_ = true;
    return false;
}

void Child::signal(int sig)
{
    if (running()) {
        kill(pid_, sig);
        killed_ = killed_ || sig == SIGKILL;
    }
}

bool Child::wait_exit(int timeout_ms, int *status)
{
    bool done = wait_for([this] { return !running(); }, timeout_ms);
    if (done && status)
        *status = status_;
    return done;
}

bool Child::ended_well() const
{
    return exited_ && (exit_status() == 0 ||
                       (killed_ && WIFSIGNALED(status_) && WTERMSIG(status_) == SIGKILL));
}

int Child::exit_status() const
{
    return exited_ && WIFEXITED(status_) ? WEXITSTATUS(status_) : -1;
}

std::string read_file(const std::string &path)
{
    std::ifstream in(path, std::ios::binary);
    std::stringstream ss;
    ss << in.rdbuf();
    return ss.str();
}

bool write_file(const std::string &path, const std::string &data)
{
    std::ofstream out(path, std::ios::binary | std::ios::trunc);
    out << data;
    return (bool)out;
}

LogFile::LogFile()
{
    const char *env = getenv("ZV_DLOG_FILE");
    if (env && *env) {
        path_ = env;
        return;
    }
    char tmpl[] = "/tmp/zv-test-log-XXXXXX";
    int fd = mkstemp(tmpl);
    if (fd >= 0)
        close(fd);
    path_ = tmpl;
    owned_ = true;
    setenv("ZV_DLOG_FILE", path_.c_str(), 1);
}

LogFile::~LogFile()
{
    if (owned_)
        unlink(path_.c_str());
}

std::string LogFile::since_mark() const
{
    std::string all = read_file(path_);
    return all.size() > mark_ ? all.substr(mark_) : std::string();
}

int listen_loopback(int *port, int backlog)
{
    int fd = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
    sockaddr_in addr = {};
    addr.sin_family = AF_INET;
    addr.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    socklen_t len = sizeof addr;
    if (fd < 0 || bind(fd, reinterpret_cast<sockaddr *>(&addr), len) != 0 ||
        listen(fd, backlog) != 0 ||
        getsockname(fd, reinterpret_cast<sockaddr *>(&addr), &len) != 0) {
        if (fd >= 0)
            close(fd);
        return -1;
    }
    *port = ntohs(addr.sin_port);
    return fd;
}

} // namespace zv_test
