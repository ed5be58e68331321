// zuvo-client: the companion client of the upload service. Records video files as READY rows
// of the shared upload history (and in the media database, for the list's thumbnails), lists
// and removes rows, and sends the service the launch request that starts a batch.
#include <app.h>
#include <dlog.h>
#include <errno.h>
#include <fcntl.h>
#include <glib.h>
#include <limits.h>
#include <media_content.h>
#include <stdarg.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "zv-ext-db.h"

namespace
{

constexpr const char *kProgram = "zuvo-client";
constexpr const char *kDefaultDbPath = "/opt/usr/apps/zuvo-client/data/db/.zuvo-history.db";
constexpr const char *kServiceAppId = "zuvo-upload-svc";
constexpr int kExitFailure = 1;
constexpr int kExitUsage = 2;
constexpr off_t kMaxLogSize = 1024 * 1024;

const char kUsage[] =
    "Usage: zuvo-client COMMAND [ARGS]\n"
    "Records videos in the upload history and starts the upload service.\n"
    "\n"
    "Commands:\n"
    "  add FILE... [--title T] [--user U]\n"
    "      record each file as a READY upload; prints one line \"ID<TAB>PATH\" per file.\n"
    "      The title defaults to the file name without its extension. Empty files are\n"
    "      refused; nothing is recorded unless every file can be read.\n"
    "  launch --token-file FILE --category C [--description D] [--tag T]\n"
    "         [--privacy public|unlisted|private] [--location]\n"
    "      send the service the launch request that uploads every READY file\n"
    "      (privacy defaults to public; --location adds the device position).\n"
    "      The user's access token is read from FILE ('-': standard input), else from\n"
    "      the environment variable ZV_ACCESS_TOKEN; --token T still works but shows the\n"
    "      token to every user of the machine (ps).\n"
    "  list\n"
    "      print the history: id, title, status, percent, size, file.\n"
    "  remove ID\n"
    "      delete the history rows with that id.\n"
    "\n"
    "Options take their value as the next argument or after '=' (--title=T); '--' ends\n"
    "the options of add. Exit status: 0 done, 1 failed, 2 wrong call or unreadable file.\n"
    "Environment: ZV_ACCESS_TOKEN (the token of launch), ZV_HISTORY_DB (the history\n"
    "file), ZV_MEDIA_DB, ZV_RUNTIME_DIR, and\n"
    "ZV_DLOG_FILE: where the platform log goes (default: zuvo-client.log in the runtime\n"
    "folder, emptied once it passes 1 MiB).\n";

struct GFree {
    void operator()(void *p) const { g_free(p); }
};
using GCharPtr = std::unique_ptr<gchar, GFree>;

// One line on standard error naming what is wrong; returns the exit status to use.
int complain(int status, const char *fmt, ...) G_GNUC_PRINTF(2, 3);
int complain(int status, const char *fmt, ...)
{
    fprintf(stderr, "%s: ", kProgram);
    va_list ap;
    va_start(ap, fmt);
    vfprintf(stderr, fmt, ap);
    va_end(ap);
    fputc('\n', stderr);
    return status;
}

// The arguments of one command: its options by name and the rest in order.
struct Args {
    std::map<std::string, std::string> values;
    std::set<std::string> flags;
    std::vector<std::string> positional;
};

// Splits argv[first..] into valued options, flags and positional arguments; false with
// *error set on an unknown, repeated or value-less option.
bool parse_args(int argc, char **argv, int first, const std::set<std::string> &valued,
                const std::set<std::string> &flag_names, Args *out, std::string *error)
{
    bool options_done = false;
    for (int i = first; i < argc; ++i) {
        std::string arg = argv[i];
        if (options_done || arg.size() < 2 || arg[0] != '-') {
            out->positional.push_back(arg);
            continue;
        }
        if (arg == "--") {
            options_done = true;
            continue;
        }
        std::string name = arg;
        std::string value;
        bool has_value = false;
        size_t eq = arg.find('=');
        if (arg.compare(0, 2, "--") == 0 && eq != std::string::npos) {
            name = arg.substr(0, eq);
            value = arg.substr(eq + 1);
            has_value = true;
        }
        if (out->values.count(name) || out->flags.count(name)) {
            *error = "option " + name + " given twice";
            return false;
        }
        if (valued.count(name)) {
            if (!has_value) {
                if (i + 1 >= argc) {
                    *error = "option " + name + " needs a value";
                    return false;
                }
                value = argv[++i];
            }
            out->values[name] = value;
        } else if (flag_names.count(name) && !has_value) {
            out->flags.insert(name);
        } else {
            *error = "unknown option " + arg;
            return false;
        }
    }
    return true;
}

const char *status_name(int status)
{
    switch (status) {
    case ZV_UPLOAD_STATUS_READY:
        return "READY";
    case ZV_UPLOAD_STATUS_WAITING:
        return "WAITING";
    case ZV_UPLOAD_STATUS_PAUSED:
        return "PAUSED";
    case ZV_UPLOAD_STATUS_UPLOADING:
        return "UPLOADING";
    case ZV_UPLOAD_STATUS_COMPLETED:
        return "COMPLETED";
    default:
        return nullptr;
    }
}

std::string history_db_path()
{
    const char *env = getenv("ZV_HISTORY_DB");
    return (env && *env) ? env : kDefaultDbPath;
}

// The store's connection for the life of a command.
class Store
{
  public:
    Store() : open_(zv_ext_db_open() == 1) {}
    ~Store() { zv_ext_db_close(); }
    Store(const Store &) = delete;
    Store &operator=(const Store &) = delete;
    bool open() const { return open_; }

  private:
    bool open_;
};

// The rows of a load, oldest first; their strings live as long as the list that holds them.
class Rows
{
  public:
    Rows() = default;
    ~Rows()
    {
        if (list_)
            zv_ext_db_free_item_list(list_);
    }
    Rows(const Rows &) = delete;
    Rows &operator=(const Rows &) = delete;

    // False when the history cannot be read.
    bool load()
    {
        if (!zv_ext_db_load_full_item_list(&list_))
            return false;
        for (GList *l = list_; l; l = l->next)
            if (l->data)
                items_.push_back(static_cast<const DbItem *>(l->data));
        return true;
    }
    const std::vector<const DbItem *> &items() const { return items_; }

  private:
    GList *list_ = nullptr;
    std::vector<const DbItem *> items_;
};

// Serialises the choice of new ids between companion processes: the lock file beside the
// history is held from reading the largest id until the new rows are in.
class IdLock
{
  public:
    explicit IdLock(const std::string &db_path)
    {
        std::string path = db_path + ".client-lock";
        fd_ = ::open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600);
        if (fd_ >= 0 && flock(fd_, LOCK_EX) != 0) {
            ::close(fd_);
            fd_ = -1;
        }
    }
    ~IdLock()
    {
        if (fd_ >= 0)
            ::close(fd_);
    }
    IdLock(const IdLock &) = delete;
    IdLock &operator=(const IdLock &) = delete;
    bool held() const { return fd_ >= 0; }

  private:
    int fd_ = -1;
};

struct NewFile {
    std::string path; // absolute
    std::string name; // file name
    int64_t size = 0; // 64-bit, as the history's column: videos pass 2 GiB
    int historyid = 0;
};

// Checks one file named on the command line; on success fills *file, else returns the exit
// status after its line on standard error.
int check_file(const std::string &arg, NewFile *file)
{
    struct stat st;
    if (stat(arg.c_str(), &st) != 0)
        return complain(kExitUsage, "cannot read '%s': %s", arg.c_str(), strerror(errno));
    if (S_ISDIR(st.st_mode))
        return complain(kExitUsage, "'%s' is a directory, not a video file", arg.c_str());
    if (!S_ISREG(st.st_mode))
        return complain(kExitUsage, "'%s' is not a regular file", arg.c_str());
    int fd = ::open(arg.c_str(), O_RDONLY | O_CLOEXEC);
    if (fd < 0)
        return complain(kExitUsage, "cannot read '%s': %s", arg.c_str(), strerror(errno));
    ::close(fd);
    if (st.st_size == 0)
        return complain(kExitUsage, "'%s' is empty: there is nothing to upload", arg.c_str());
    GCharPtr absolute(g_canonicalize_filename(arg.c_str(), nullptr));
    GCharPtr base(g_path_get_basename(absolute.get()));
    file->path = absolute.get();
    file->name = base.get();
    file->size = static_cast<int64_t>(st.st_size);
    return 0;
}

std::string title_from_name(const std::string &name)
{
    size_t dot = name.rfind('.');
    return (dot == std::string::npos || dot == 0) ? name : name.substr(0, dot);
}

// More files than this show a progress line while their thumbnails are made, on a terminal.
constexpr size_t kProgressFrom = 50;

void show_progress(int done, int total, void *)
{
    fprintf(stderr, "\rthumbnails: %d of %d", done, total);
    if (done == total)
        fputc('\n', stderr);
}

// Registers the files in the media database, each with a thumbnail of one of its frames
// (none when the host cannot make one); the thumbnails are made side by side. A failure is
// reported and changes nothing else.
void register_media(const std::vector<NewFile> &files)
{
    std::vector<const char *> paths, names;
    for (const NewFile &file : files) {
        paths.push_back(file.path.c_str());
        names.push_back(file.name.c_str());
    }
    std::vector<char *> thumbs(files.size(), nullptr);
    bool progress = files.size() > kProgressFrom && isatty(STDERR_FILENO);
    media_content_create_thumbnails(paths.data(), thumbs.data(), (int)files.size(),
                                    progress ? show_progress : nullptr, nullptr);
    int rc = media_content_register_files(paths.data(), MEDIA_CONTENT_TYPE_VIDEO, thumbs.data(),
                                          names.data(), (int)files.size());
    for (char *thumb : thumbs)
        free(thumb);
    if (rc != MEDIA_CONTENT_ERROR_NONE)
        complain(0, "warning: the files are recorded but not in the media database (error %d)", rc);
}

int cmd_add(int argc, char **argv)
{
    Args args;
    std::string error;
    if (!parse_args(argc, argv, 2, {"--title", "--user"}, {}, &args, &error))
        return complain(kExitUsage, "add: %s", error.c_str());
    if (args.positional.empty())
        return complain(kExitUsage, "add: no file given");

    // Every file is checked before any is recorded.
    std::vector<NewFile> files(args.positional.size());
    for (size_t i = 0; i < files.size(); ++i)
        if (int rc = check_file(args.positional[i], &files[i]))
            return rc;

    Store store;
    if (!store.open())
        return complain(kExitFailure, "cannot open the history database %s",
                        history_db_path().c_str());
    IdLock lock(history_db_path());
    if (!lock.held())
        return complain(kExitFailure, "cannot lock the history database %s: %s",
                        history_db_path().c_str(), strerror(errno));

    int next_id = 1;
    {
        Rows rows;
        if (!rows.load())
            return complain(kExitFailure, "cannot read the history database %s",
                            history_db_path().c_str());
        for (const DbItem *row : rows.items())
            next_id = std::max(next_id, row->historyid + 1);
    }

    const char *title_arg = args.values.count("--title") ? args.values["--title"].c_str() : nullptr;
    const char *user = args.values.count("--user") ? args.values["--user"].c_str() : nullptr;
    double date = (double)g_get_real_time() / G_USEC_PER_SEC;
    for (NewFile &file : files) {
        std::string title = title_arg ? title_arg : title_from_name(file.name);
        DbItem item{};
        item.historyid = next_id++;
        item.title = const_cast<char *>(title.c_str());
        item.filename = const_cast<char *>(file.path.c_str());
        item.filesize = file.size;
        item.userid = const_cast<char *>(user);
        item.status = ZV_UPLOAD_STATUS_READY;
        item.date = date;
        // Files of one call keep their order in the history.
        date += 1e-3;
        if (!zv_ext_db_insert_item(&item))
            return complain(kExitFailure, "cannot record '%s'", file.path.c_str());
        file.historyid = item.historyid;
    }

    // An insert that lost its step (the service held the file too long) still answers
    // true: look for the rows themselves.
    Rows rows;
    if (!rows.load())
        return complain(kExitFailure, "cannot read the history database back");
    for (const NewFile &file : files) {
        bool found =
            std::any_of(rows.items().begin(), rows.items().end(), [&file](const DbItem *r) {
                return r->historyid == file.historyid && r->filename && file.path == r->filename;
            });
        if (!found)
            return complain(kExitFailure, "'%s' was not recorded (the history database is busy)",
                            file.path.c_str());
    }

    register_media(files);
    for (const NewFile &file : files)
        printf("%d\t%s\n", file.historyid, file.path.c_str());
    return 0;
}

// The access token of launch, from --token-file (a file, or '-' for standard input), else
// --token (with a warning: the command line is public), else ZV_ACCESS_TOKEN; the line end a
// file or pipe carries is dropped. Returns 0, or the exit status after a line on stderr.
int read_token(Args &args, std::string *token)
{
    if (args.values.count("--token") && args.values.count("--token-file"))
        return complain(kExitUsage, "launch: give --token or --token-file, not both");
    if (args.values.count("--token-file")) {
        const std::string &path = args.values["--token-file"];
        FILE *f = path == "-" ? stdin : fopen(path.c_str(), "r");
        if (!f)
            return complain(kExitUsage, "launch: cannot read the token file '%s': %s", path.c_str(),
                            strerror(errno));
        char buf[4096];
        size_t n;
        while ((n = fread(buf, 1, sizeof buf, f)) > 0 && token->size() < 65536)
            token->append(buf, n);
        bool failed = ferror(f);
        if (f != stdin)
            fclose(f);
        if (failed)
            return complain(kExitUsage, "launch: cannot read the token file '%s'", path.c_str());
        while (!token->empty() && (token->back() == '\n' || token->back() == '\r'))
            token->pop_back();
        if (token->empty() || token->find_first_of("\r\n") != std::string::npos)
            return complain(kExitUsage, "launch: the token file '%s' must hold one line",
                            path.c_str());
        return 0;
    }
    if (args.values.count("--token")) {
        *token = args.values["--token"];
        if (!token->empty())
            complain(0, "warning: --token shows the token to every user of this machine; "
                        "use --token-file or ZV_ACCESS_TOKEN");
    } else if (const char *env = getenv("ZV_ACCESS_TOKEN")) {
        *token = env;
    }
    if (token->empty())
        return complain(kExitUsage, "launch: --token-file or ZV_ACCESS_TOKEN is required");
    return 0;
}

int cmd_launch(int argc, char **argv)
{
    Args args;
    std::string error;
    if (!parse_args(
            argc, argv, 2,
            {"--token", "--token-file", "--category", "--description", "--tag", "--privacy"},
            {"--location"}, &args, &error))
        return complain(kExitUsage, "launch: %s", error.c_str());
    if (!args.positional.empty())
        return complain(kExitUsage, "launch: unexpected argument '%s'", args.positional[0].c_str());
    if (!args.values.count("--category") || args.values["--category"].empty())
        return complain(kExitUsage, "launch: --category is required");

    static const std::map<std::string, const char *> kPrivacy = {
        {"public", "0"}, {"unlisted", "1"}, {"private", "2"}};
    const char *access_type = "0";
    if (args.values.count("--privacy")) {
        auto it = kPrivacy.find(args.values["--privacy"]);
        if (it == kPrivacy.end())
            return complain(kExitUsage, "launch: --privacy must be public, unlisted or private");
        access_type = it->second;
    }

    // Last of the checks, so that a wrong call does not read standard input first.
    std::string token;
    if (int rc = read_token(args, &token))
        return rc;

    std::vector<std::pair<const char *, std::string>> extras = {
        {"ZV_DATA_ACCESS_TOKEN", token},
        {"ZV_DATA_CATEGORY", args.values["--category"]},
    };
    if (args.values.count("--description"))
        extras.emplace_back("ZV_DATA_DESCRIPTION", args.values["--description"]);
    if (args.values.count("--tag"))
        extras.emplace_back("ZV_DATA_TAG", args.values["--tag"]);
    extras.emplace_back("ZV_DATA_ACCESS_TYPE", access_type);
    if (args.flags.count("--location"))
        extras.emplace_back("ZV_DATA_USE_LOCATION", "1");

    app_control_h request = nullptr;
    if (app_control_create(&request) != APP_CONTROL_ERROR_NONE)
        return complain(kExitFailure, "cannot make the launch request");
    int rc = app_control_set_app_id(request, kServiceAppId);
    for (const auto &extra : extras)
        if (rc == APP_CONTROL_ERROR_NONE)
            rc = app_control_add_extra_data(request, extra.first, extra.second.c_str());
    // A service started from here gets the token in its launch request, not from a copy in
    // its environment.
    unsetenv("ZV_ACCESS_TOKEN");
    if (rc == APP_CONTROL_ERROR_NONE)
        rc = app_control_send_launch_request(request, nullptr, nullptr);
    app_control_destroy(request);
    if (rc == APP_CONTROL_ERROR_APP_NOT_FOUND)
        return complain(kExitFailure, "%s is not installed beside %s nor on PATH", kServiceAppId,
                        kProgram);
    if (rc == APP_CONTROL_ERROR_LAUNCH_REJECTED)
        return complain(kExitFailure, "%s did not take the launch request", kServiceAppId);
    if (rc != APP_CONTROL_ERROR_NONE)
        return complain(kExitFailure, "the launch request to %s failed (error %d)", kServiceAppId,
                        rc);
    return 0;
}

int cmd_list(int argc, char **argv)
{
    Args args;
    std::string error;
    if (!parse_args(argc, argv, 2, {}, {}, &args, &error))
        return complain(kExitUsage, "list: %s", error.c_str());
    if (!args.positional.empty())
        return complain(kExitUsage, "list: unexpected argument '%s'", args.positional[0].c_str());

    Store store;
    if (!store.open())
        return complain(kExitFailure, "cannot open the history database %s",
                        history_db_path().c_str());
    Rows rows;
    if (!rows.load())
        return complain(kExitFailure, "cannot read the history database %s",
                        history_db_path().c_str());

    std::vector<std::vector<std::string>> table = {
        {"ID", "TITLE", "STATUS", "PERCENT", "SIZE", "FILE"}};
    for (const DbItem *r : rows.items()) {
        const char *name = status_name(r->status);
        table.push_back({std::to_string(r->historyid), r->title ? r->title : "",
                         name ? name : std::to_string(r->status), std::to_string(r->percent) + "%",
                         std::to_string(r->filesize), r->filename ? r->filename : ""});
    }
    std::vector<size_t> width(table[0].size(), 0);
    for (const auto &line : table)
        for (size_t c = 0; c < line.size(); ++c)
            width[c] = std::max(width[c], line[c].size());
    for (const auto &line : table) {
        std::string out;
        for (size_t c = 0; c < line.size(); ++c) {
            out += line[c];
            if (c + 1 < line.size())
                out += std::string(width[c] - line[c].size() + 2, ' ');
        }
        printf("%s\n", out.c_str());
    }
    return 0;
}

int cmd_remove(int argc, char **argv)
{
    Args args;
    std::string error;
    if (!parse_args(argc, argv, 2, {}, {}, &args, &error))
        return complain(kExitUsage, "remove: %s", error.c_str());
    if (args.positional.size() != 1)
        return complain(kExitUsage, "remove: give exactly one ID");
    const std::string &text = args.positional[0];
    char *end = nullptr;
    errno = 0;
    long id = strtol(text.c_str(), &end, 10);
    if (text.empty() || *end || errno || id < INT_MIN || id > INT_MAX)
        return complain(kExitUsage, "remove: '%s' is not an id", text.c_str());

    Store store;
    if (!store.open())
        return complain(kExitFailure, "cannot open the history database %s",
                        history_db_path().c_str());
    {
        Rows rows;
        if (!rows.load())
            return complain(kExitFailure, "cannot read the history database %s",
                            history_db_path().c_str());
        if (std::none_of(rows.items().begin(), rows.items().end(),
                         [id](const DbItem *r) { return r->historyid == id; }))
            return complain(kExitUsage, "remove: no upload with id %ld", id);
    }
    if (!zv_ext_db_delete_item((int)id))
        return complain(kExitFailure, "cannot remove %ld (the history database is busy)", id);
    return 0;
}

// The platform log writes to standard error unless ZV_DLOG_FILE names a file. The client
// keeps standard error for its own one-line messages: unless the caller chose a file, the
// log goes to one in the runtime folder. The log opens its file at its first line, so the
// variable is dropped again at once and programs started from here (the service) keep
// their own default.
void route_platform_log()
{
    const char *env = getenv("ZV_DLOG_FILE");
    if (env && *env)
        return;
    GCharPtr dir(zv_platform_runtime_dir());
    if (!dir)
        return;
    std::string path = std::string(dir.get()) + "/zuvo-client.log";
    struct stat st;
    if (stat(path.c_str(), &st) == 0 && st.st_size > kMaxLogSize && truncate(path.c_str(), 0) != 0)
        return;
    setenv("ZV_DLOG_FILE", path.c_str(), 1);
    dlog_print(DLOG_INFO, "zuvo", "zuvo-client (%d) started", (int)getpid());
    unsetenv("ZV_DLOG_FILE");
}

} // namespace

int main(int argc, char **argv)
{
    for (int i = 1; i < argc; ++i) {
        if (strcmp(argv[i], "--") == 0)
            break;
        if (strcmp(argv[i], "--help") == 0 || strcmp(argv[i], "-h") == 0) {
            fputs(kUsage, stdout);
            return 0;
        }
    }
    if (argc < 2)
        return complain(kExitUsage, "no command given (try --help)");

    route_platform_log();
    const std::string command = argv[1];
    if (command == "add")
        return cmd_add(argc, argv);
    if (command == "launch")
        return cmd_launch(argc, argv);
    if (command == "list")
        return cmd_list(argc, argv);
    if (command == "remove")
        return cmd_remove(argc, argv);
    return complain(kExitUsage, "unknown command '%s' (try --help)", command.c_str());
}
