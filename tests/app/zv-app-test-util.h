// Helpers of the notification test: a program started in the background, its exit, and the
// lines of a log file. New tests use zv_test::Child, whose exit status is never lost.
#pragma once

#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <sstream>
#include <string>
#include <vector>

#include "zv-test-util.h"

namespace zv_test
{

// Starts argv (argv[0] a path) with standard input closed; the child's pid or -1.
inline pid_t spawn_program(const std::vector<std::string> &argv)
{
    pid_t pid = fork();
    if (pid == 0) {
        close(STDIN_FILENO);
        exec_argv(argv);
    }
    return pid;
}

// Waits (spinning the main loop) for a child started by spawn_program; its exit status, or
// -1 when it did not exit normally or in time (it is then killed).
inline int wait_program(pid_t pid, int timeout_ms = 20000)
{
    int status = 0;
    auto ended = [&] {
        return waitpid(pid, &status, WNOHANG) == pid || reaped_status(pid, &status);
    };
    if (!wait_for(ended, timeout_ms)) {
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
    for (std::string line; std::getline(in, line);)
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

} // namespace zv_test
