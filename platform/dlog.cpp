// Host implementation of the platform log.
#include "dlog.h"

#include <fcntl.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <unistd.h>

#include <mutex>
#include <string>

namespace {

struct LogState {
    std::once_flag once;
    int fd = STDERR_FILENO;
};

LogState &log_state()
{
    static LogState state;
    return state;
}

int log_fd()
{
    LogState &st = log_state();
    std::call_once(st.once, [&st] {
        const char *path = getenv("ZV_DLOG_FILE");
        if (path && *path) {
            int fd = open(path, O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600);
            if (fd >= 0)
                st.fd = fd;
        }
    });
    return st.fd;
}

char priority_letter(log_priority prio)
{
    switch (prio) {
    case DLOG_VERBOSE: return 'V';
    case DLOG_DEBUG: return 'D';
    case DLOG_INFO: return 'I';
    case DLOG_WARN: return 'W';
    case DLOG_ERROR: return 'E';
    case DLOG_FATAL: return 'F';
    default: return 'I';
    }
}

} // namespace

int dlog_vprint(log_priority prio, const char *tag, const char *fmt, va_list ap)
{
    if (!tag || !fmt)
        return DLOG_ERROR_INVALID_PARAMETER;
    if (prio == DLOG_SILENT)
        return 0;

    std::string line;
    char head[160];
    int n = snprintf(head, sizeof head, "%c/%s(%d): ", priority_letter(prio), tag, (int)getpid());
    if (n > 0)
        line.append(head, (size_t)n < sizeof head ? (size_t)n : sizeof head - 1);

    va_list copy;
    va_copy(copy, ap);
    char small[512];
    int len = vsnprintf(small, sizeof small, fmt, copy);
    va_end(copy);
    if (len < 0)
        return DLOG_ERROR_INVALID_PARAMETER;
    if ((size_t)len < sizeof small) {
        line.append(small, (size_t)len);
    } else {
        std::string big((size_t)len + 1, '\0');
        vsnprintf(&big[0], big.size(), fmt, ap);
        big.resize((size_t)len);
        line += big;
    }
    // One message is one line: embedded newlines would split it for readers.
    for (char &c : line)
        if (c == '\n')
            c = ' ';
    line += '\n';

    ssize_t w = write(log_fd(), line.data(), line.size());
    return w < 0 ? DLOG_ERROR_NOT_PERMITTED : (int)w;
}

int dlog_print(log_priority prio, const char *tag, const char *fmt, ...)
{
    va_list ap;
    va_start(ap, fmt);
    int r = dlog_vprint(prio, tag, fmt, ap);
    va_end(ap);
    return r;
}
