#include "zv-test-util.h"

#include <arpa/inet.h>
#include <netinet/in.h>
#include <sys/socket.h>

#include <Ecore.h>
#include <fcntl.h>
#include <stdlib.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <fstream>
#include <sstream>
#include <thread>

namespace zv_test {

namespace {

void remove_tree(const std::string &path)
{
    std::string cmd = "rm -rf '" + path + "'";
    if (system(cmd.c_str()) != 0) {
        // Nothing to do: a folder left behind in /tmp is harmless.
    }
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
    if (path_ != "/tmp")
        remove_tree(path_);
}

bool wait_for(const std::function<bool()> &pred, int timeout_ms)
{
    auto deadline = std::chrono::steady_clock::now() + std::chrono::milliseconds(timeout_ms);
    while (!pred()) {
        if (std::chrono::steady_clock::now() >= deadline)
            return pred();
        ecore_main_loop_iterate();
        std::this_thread::sleep_for(std::chrono::milliseconds(2));
    }
    return true;
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

int run_program(const std::vector<std::string> &argv, const std::string &input, std::string *out)
{
    int in_pipe[2], out_pipe[2];
    if (pipe(in_pipe) != 0 || pipe(out_pipe) != 0)
        return -1;
    pid_t pid = fork();
    if (pid < 0)
        return -1;
    if (pid == 0) {
        dup2(in_pipe[0], 0);
        dup2(out_pipe[1], 1);
        close(in_pipe[0]);
        close(in_pipe[1]);
        close(out_pipe[0]);
        close(out_pipe[1]);
        std::vector<char *> args;
        for (const auto &a : argv)
            args.push_back(const_cast<char *>(a.c_str()));
        args.push_back(nullptr);
        execv(args[0], args.data());
        _exit(127);
    }
    close(in_pipe[0]);
    close(out_pipe[1]);
    if (!input.empty() && write(in_pipe[1], input.data(), input.size()) < 0) {
        // The program may not read its input; its status tells.
    }
    close(in_pipe[1]);
    std::string collected;
    char buf[4096];
    ssize_t n;
    while ((n = read(out_pipe[0], buf, sizeof buf)) > 0)
        collected.append(buf, (size_t)n);
    close(out_pipe[0]);
    int status = 0;
    if (waitpid(pid, &status, 0) < 0)
        return -1;
    if (out)
        *out = collected;
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
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
        listen(fd, backlog) != 0 || getsockname(fd, reinterpret_cast<sockaddr *>(&addr), &len) != 0) {
        if (fd >= 0)
            close(fd);
        return -1;
    }
    *port = ntohs(addr.sin_port);
    return fd;
}

} // namespace zv_test
