// zv-keystore: writes and reads key storage entries from the command line.
//   zv-keystore set NAME     stores standard input (one trailing newline dropped)
//   zv-keystore get NAME     prints the value
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <unistd.h>

#include <string>

#include "key_storage.h"

namespace {

const char *g_prog = "zv-keystore";
constexpr size_t kMaxInput = 64 * 1024;

[[noreturn]] void usage_error(const std::string &what)
{
    fprintf(stderr, "%s: %s (see --help)\n", g_prog, what.c_str());
    exit(2);
}

void print_help()
{
    printf("Usage: %s set NAME    (the value is read from standard input)\n"
           "       %s get NAME\n"
           "Writes or reads a key storage entry (the file $ZV_KEY_STORAGE_DIR/NAME, folder mode\n"
           "0700, file mode 0600). A value read from standard input loses one trailing newline.\n"
           "Exit status: 0 done, 1 the entry could not be read or written, 2 wrong call.\n",
           g_prog, g_prog);
}

const char *error_text(int rc)
{
    switch (rc) {
    case KEY_STORAGE_ERROR_NO_DATA: return "no such entry";
    case KEY_STORAGE_ERROR_PERMISSION_DENIED:
        return "refused: the file or folder is open to others";
    case KEY_STORAGE_ERROR_INVALID_PARAMETER: return "invalid name";
    default: return "input/output error";
    }
}

int cmd_set(const char *name)
{
    std::string value;
    char buf[4096];
    ssize_t n;
    while ((n = read(STDIN_FILENO, buf, sizeof buf)) > 0) {
        value.append(buf, (size_t)n);
        if (value.size() > kMaxInput) {
            fprintf(stderr, "%s: value longer than %zu bytes\n", g_prog, kMaxInput);
            return 1;
        }
    }
    if (n < 0) {
        fprintf(stderr, "%s: cannot read standard input\n", g_prog);
        return 1;
    }
    if (!value.empty() && value.back() == '\n')
        value.pop_back();
    if (value.find('\0') != std::string::npos) {
        fprintf(stderr, "%s: the value holds a NUL byte\n", g_prog);
        return 1;
    }
    int rc = key_storage_set(name, value.c_str());
    if (rc != KEY_STORAGE_ERROR_NONE) {
        fprintf(stderr, "%s: cannot store %s: %s\n", g_prog, name, error_text(rc));
        return rc == KEY_STORAGE_ERROR_INVALID_PARAMETER ? 2 : 1;
    }
    return 0;
}

int cmd_get(const char *name)
{
    char *value = nullptr;
    int rc = key_storage_get(name, &value);
    if (rc != KEY_STORAGE_ERROR_NONE) {
        fprintf(stderr, "%s: cannot read %s: %s\n", g_prog, name, error_text(rc));
        return rc == KEY_STORAGE_ERROR_INVALID_PARAMETER ? 2 : 1;
    }
    printf("%s\n", value);
    free(value);
    return 0;
}

} // namespace

int main(int argc, char **argv)
{
    for (int i = 1; i < argc; i++) {
        if (strcmp(argv[i], "--help") == 0 || strcmp(argv[i], "-h") == 0) {
            print_help();
            return 0;
        }
    }
    if (argc < 2)
        usage_error("missing command (set or get)");
    bool set = strcmp(argv[1], "set") == 0;
    if (!set && strcmp(argv[1], "get") != 0)
        usage_error(std::string("unknown command '") + argv[1] + "'");
    if (argc != 3)
        usage_error(std::string(argv[1]) + " needs exactly one NAME");
    return set ? cmd_set(argv[2]) : cmd_get(argv[2]);
}
