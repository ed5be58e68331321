// Helpers of the application tests: programs started in the background, their exit, and
// the lines of a log file.
#pragma once

#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <sstream>
#include <string>
#include <vector>

#include "zv-test-util.h"

namespace zv_test {

// Starts argv (argv[0] a path) with the test's environment and standard input closed;
// the child's pid or -1.
inline pid_t spawn_program(const std::vector<std::string> &argv)
{
    pid_t pid = fork();
    if (pid != 0)
        return pid;
    std::vector<char *> args;
    for (const auto &a : argv)
        args.push_back(const_cast<char *>(a.c_str()));
    args.push_back(nullptr);
    close(STDIN_FILENO);
    execv(args[0], args.data());
    _exit(127);
}

// Waits (spinning the main loop) for a child started by spawn_program; its exit status, or
// -1 when it did not exit normally or in time (it is then killed).
inline int wait_program(pid_t pid, int timeout_ms = 20000)
{
    int status = 0;
    bool done = wait_for([&] { return waitpid(pid, &status, WNOHANG) == pid; }, timeout_ms);
    if (!done) {
        kill(pid, SIGKILL);
        waitpid(pid, &status, 0);
        return -1;
    }
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

inline std::vector<std::string> read_lines(const std::string &path)
{
    std::vector<std::string> lines;
    std::istringstream in(read_file(path));
    std::string line;
    while (std::getline(in, line))
        lines.push_back(line);
    return lines;
}

inline bool has_line(const std::string &path, const std::string &wanted)
{
    for (const auto &line : read_lines(path))
        if (line == wanted)
            return true;
    return false;
}

inline bool log_contains(const std::string &path, const std::string &text)
{
    return read_file(path).find(text) != std::string::npos;
}

} // namespace zv_test
