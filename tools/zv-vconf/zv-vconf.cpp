// zv-vconf: reads and writes platform keys from the command line.
//   zv-vconf get KEY                          prints the value
//   zv-vconf set -t int|string KEY VALUE      writes it (atomically)
#include <errno.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>

#include <string>

#include "vconf.h"

namespace {

const char *g_prog = "zv-vconf";

[[noreturn]] void usage_error(const std::string &what)
{
    fprintf(stderr, "%s: %s (see --help)\n", g_prog, what.c_str());
    exit(2);
}

void print_help()
{
    printf("Usage: %s get KEY\n"
           "       %s set -t int|string KEY VALUE\n"
           "Reads or writes a platform key (the file $ZV_RUNTIME_DIR/vconf/KEY).\n"
           "Exit status: 0 done, 1 the key could not be read or written, 2 wrong call.\n",
           g_prog, g_prog);
}

bool parse_int(const char *text, int *value)
{
    char *end = nullptr;
    errno = 0;
    long v = strtol(text, &end, 10);
    if (!*text || *end || errno == ERANGE || v < -2147483648L || v > 2147483647L)
        return false;
    *value = (int)v;
    return true;
}

int cmd_get(int argc, char **argv)
{
    if (argc != 3)
        usage_error("get needs exactly one KEY");
    if (!zv_vconf_key_valid(argv[2]))
        usage_error(std::string("invalid key '") + argv[2] + "'");
    char *value = vconf_get_str(argv[2]);
    if (!value) {
        fprintf(stderr, "%s: cannot read key %s\n", g_prog, argv[2]);
        return 1;
    }
    printf("%s\n", value);
    free(value);
    return 0;
}

int cmd_set(int argc, char **argv)
{
    if (argc != 6 || strcmp(argv[2], "-t") != 0)
        usage_error("set needs -t int|string KEY VALUE");
    const char *type = argv[3], *key = argv[4], *value = argv[5];
    if (!zv_vconf_key_valid(key))
        usage_error(std::string("invalid key '") + key + "'");
    int rc;
    if (strcmp(type, "int") == 0) {
        int n;
        if (!parse_int(value, &n))
            usage_error(std::string("'") + value + "' is not an int");
        rc = vconf_set_int(key, n);
    } else if (strcmp(type, "string") == 0) {
        rc = vconf_set_str(key, value);
    } else {
        usage_error(std::string("unknown type '") + type + "', use int or string");
    }
    if (rc != VCONF_OK) {
        fprintf(stderr, "%s: cannot write key %s\n", g_prog, key);
        return 1;
    }
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
        usage_error("missing command (get or set)");
    if (strcmp(argv[1], "get") == 0)
        return cmd_get(argc, argv);
    if (strcmp(argv[1], "set") == 0)
        return cmd_set(argc, argv);
    usage_error(std::string("unknown command '") + argv[1] + "'");
}
