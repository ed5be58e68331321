// Helpers shared by the tests: a fresh temporary folder with the host environment pointed
// into it, waiting on the main loop for a condition, running programs of the build.
#pragma once

#include <functional>
#include <string>
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

// Runs the main loop (ecore iterations) until pred() holds or timeout_ms passes.
bool wait_for(const std::function<bool()> &pred, int timeout_ms = 5000);

// Path of a program built into the build tree's bin folder.
std::string bin_path(const std::string &program);
// Path below the source tree.
std::string source_path(const std::string &rel);

// Runs argv (argv[0] a path), feeding input to its standard input; returns its exit
// status (or -1) and collects standard output into *out when given.
int run_program(const std::vector<std::string> &argv, const std::string &input = "",
                std::string *out = nullptr);

// A listening TCP socket on 127.0.0.1 with a port of the system's choosing; -1 on failure.
// *port receives the port.
int listen_loopback(int *port, int backlog = 8);

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
    bool logged(const std::string &text) const { return since_mark().find(text) != std::string::npos; }

private:
    std::string path_;
    size_t mark_ = 0;
    bool owned_ = false;
};

} // namespace zv_test
