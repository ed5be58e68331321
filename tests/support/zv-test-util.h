// Helpers shared by the tests: a fresh temporary folder with the host environment pointed
// into it, waiting on the main loop for a condition, running programs of the build.
#pragma once

#include <Evas.h>
#include <sys/resource.h>
#include <sys/types.h>

#include <functional>
#include <string>
#include <utility>
#include <vector>

namespace zv_test {

// A temporary folder removed at destruction. With set_env, the host environment
// (ZV_RUNTIME_DIR, ZV_HISTORY_DB, ZV_KEY_STORAGE_DIR, ZV_MEDIA_DB) points into it,
// ZV_NETWORK is "keys" and ZV_LOCATION is unset. The log file is opened once per process,
// so ZV_DLOG_FILE is left to the test program.
class TempDir {
public:
    explicit TempDir(bool set_env = true);
    ~TempDir();
    TempDir(const TempDir &) = delete;
    TempDir &operator=(const TempDir &) = delete;

    const std::string &path() const { return path_; }
    std::string file(const std::string &name) const { return path_ + "/" + name; }

private:
    std::string path_;
};

// Runs the main loop as the application does (idlers and timers fire) until pred() holds or
// timeout_ms passes; true when pred() holds. When something else (elm_exit) ends the loop, the
// wait ends there if quit_by_other is given (and *quit_by_other tells), else it goes on.
bool wait_for(const std::function<bool()> &pred, int timeout_ms = 5000,
              bool *quit_by_other = nullptr);

// The visible widgets of this type (as "Elm_Popup") at the top of the window's canvas.
std::vector<Evas_Object *> widgets(Evas_Object *win, const char *type);

// Path of a program built into the build tree's bin folder.
std::string bin_path(const std::string &program);
// Path below the source tree.
std::string source_path(const std::string &rel);

using Env = std::vector<std::pair<std::string, std::string>>;

// Starts argv (argv[0] a path) with its standard input (*input: the write end) and output
// (*output: the read end) on pipes, or inherited where null; the pid, or -1.
pid_t spawn_piped(const std::vector<std::string> &argv, int *input, int *output);

// Runs argv (argv[0] a path), feeding input to its standard input; returns its exit
// status (or -1) and collects standard output into *out when given.
int run_program(const std::vector<std::string> &argv, const std::string &input = "",
                std::string *out = nullptr);

// Runs each call (the program's arguments, split at blanks) with its output and error
// together: "" when each exits with 2 having written one line, as a wrong call must, and
// --help exits with 0; else what went otherwise.
std::string wrong_calls(const std::string &program, const std::vector<std::string> &calls);

// A listening TCP socket on 127.0.0.1 with a port of the system's choosing; -1 on failure.
// *port receives the port.
int listen_loopback(int *port, int backlog = 8);

// A child process whose exit status is never lost, even when the toolkit's main loop reaps it
// (it reaps every child of the process while it iterates). Standard output and error go to
// out_path when given; nofile above 0 is its open-file limit (soft and hard). Killed at
// destruction when it still runs.
class Child {
public:
    Child() = default;
    Child(const Child &) = delete;
    Child &operator=(const Child &) = delete;
    ~Child();
    bool start(const std::vector<std::string> &argv, const std::string &out_path = "",
               const Env &env = {}, rlim_t nofile = 0);
    pid_t pid() const { return pid_; }
    bool running();
    void signal(int sig);
    // Waits (spinning the main loop) for the exit; true when it exited within timeout_ms.
    bool wait_exit(int timeout_ms, int *status = nullptr);
    // Exited with status 0, or was killed by this side with SIGKILL.
    bool ended_well() const;
    int raw_status() const { return status_; }
    // The exit status, or -1 when it has not exited normally.
    int exit_status() const;

private:
    pid_t pid_ = -1;
    bool exited_ = true, killed_ = false;
    int status_ = 0;
};

std::string read_file(const std::string &path);
bool write_file(const std::string &path, const std::string &data);

// The log lines of this process go to one file (unless the environment names one already),
// so that a test can look for what was written since its mark. Made before anything logs:
// the log opens its file at its first line.
class LogFile {
public:
    LogFile();
    ~LogFile();
    const std::string &path() const { return path_; }
    void mark() { mark_ = read_file(path_).size(); }
    std::string since_mark() const;
    bool logged(const std::string &text) const
    {
        return since_mark().find(text) != std::string::npos;
    }

private:
    std::string path_;
    size_t mark_ = 0;
    bool owned_ = false;
};

} // namespace zv_test
