// Application framework: the launch message codec, app controls, paths, the command line, and
// the running instance across processes (zv-app-probe).
#include "app.h"

#include <fcntl.h>
#include <glib.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <stdlib.h>
#include <string.h>
#include <sys/file.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>

#include <algorithm>
#include <sstream>
#include <string>
#include <utility>
#include <vector>

#include "zv-test-util.h"

using namespace zv_test;

namespace
{

using Extras = std::vector<std::pair<std::string, std::string>>;
using Lines = std::vector<std::string>;

app_control_h make_request(const Extras &extras)
{
    app_control_h h = nullptr;
    app_control_create(&h);
    for (const auto &kv : extras)
        app_control_add_extra_data(h, kv.first.c_str(), kv.second.c_str());
    return h;
}

Extras extras_of(app_control_h h)
{
    Extras out;
    auto collect = [](app_control_h h, const char *key, void *out) {
        char *value = nullptr;
        app_control_get_extra_data(h, key, &value);
        static_cast<Extras *>(out)->emplace_back(key, value ? value : "");
        free(value);
        return true;
    };
    app_control_foreach_extra_data(h, collect, &out);
    return out;
}

std::string message(const Extras &extras)
{
    app_control_h h = make_request(extras);
    size_t size = 0;
    unsigned char *data = zv_app_launch_message_encode(h, &size);
    std::string out(reinterpret_cast<char *>(data), size);
    g_free(data);
    app_control_destroy(h);
    return out;
}

std::string u32(uint32_t v)
{
    return std::string{(char)v, (char)(v >> 8), (char)(v >> 16), (char)(v >> 24)};
}

int parse(const std::string &bytes, app_control_h *out)
{
    return zv_app_launch_message_parse(reinterpret_cast<const unsigned char *>(bytes.data()),
                                       bytes.size(), out);
}

int mode_of(const std::string &path)
{
    struct stat sb;
    return stat(path.c_str(), &sb) == 0 ? (int)(sb.st_mode & 0777) : -1;
}

// A Unix stream socket bound to path (server) or connected to it; -1 on failure.
int unix_socket(const std::string &path, bool server)
{
    int fd = socket(AF_UNIX, SOCK_STREAM, 0);
    sockaddr_un addr = {};
    addr.sun_family = AF_UNIX;
    strncpy(addr.sun_path, path.c_str(), sizeof addr.sun_path - 1);
    if ((server ? bind : connect)(fd, (sockaddr *)&addr, sizeof addr) == 0)
        return fd;
    close(fd);
    return -1;
}

Lines lines_of(const std::string &path)
{
    Lines lines;
    std::istringstream in(read_file(path));
    for (std::string line; std::getline(in, line);)
        lines.push_back(line);
    return lines;
}

long count_of(const std::string &path, const std::string &line)
{
    Lines lines = lines_of(path);
    return std::count(lines.begin(), lines.end(), line);
}

} // namespace

TEST(LaunchMessage, RoundTripKeepsExtrasAndOrder)
{
    for (const Extras &extras :
         {Extras{}, Extras{{"ZV_DATA_ACCESS_TOKEN", "ya29.token"}, {"ZV_DATA_CATEGORY", "Music"}},
          Extras{{"empty", ""}, {"eq", "a=b=c"}, {"utf8", "vidéo ✓"}}}) {
        app_control_h parsed = nullptr;
        ASSERT_EQ(parse(message(extras), &parsed), APP_CONTROL_ERROR_NONE);
        EXPECT_EQ(extras_of(parsed), extras);
        app_control_destroy(parsed);
    }
}

TEST(LaunchMessage, MalformedOrOversizedMessagesAreRefused)
{
    const std::string one = message({{"k", "v"}});
    const std::string payload_one = one.substr(ZV_APP_LAUNCH_HEADER_SIZE);
    auto framed = [](const std::string &payload) { return "ZVL1" + u32(payload.size()) + payload; };
    const std::string cases[] = {
        "",                                                       // empty
        one.substr(0, 6),                                         // header cut short
        "ZVL2" + one.substr(4),                                   // bad magic
        one.substr(0, one.size() - 1),                            // length larger than the data
        framed(payload_one + "x"),                                // trailing bytes
        framed(u32(2) + payload_one.substr(4)),                   // count beyond the extras
        framed(u32(ZV_APP_LAUNCH_MAX_EXTRAS + 1)),                // too many extras
        framed(u32(1) + u32(1000) + "k"),                         // key length beyond the end
        framed(u32(1) + u32(0) + u32(1) + "v"),                   // empty key
        framed(u32(1) + u32(2) + std::string("k\0", 2) + u32(0)), // NUL in a key
        framed(u32(1) + u32(1) + "k" + u32(1) + "\xff"),          // value not UTF-8
    };
    for (const auto &bytes : cases) {
        SCOPED_TRACE(&bytes - cases);
        app_control_h parsed = reinterpret_cast<app_control_h>(1);
        EXPECT_EQ(parse(bytes, &parsed), APP_CONTROL_ERROR_INVALID_DATA_TYPE);
        EXPECT_EQ(parsed, nullptr);
    }
    app_control_h h = make_request({{"big", std::string(ZV_APP_LAUNCH_MAX_MESSAGE, 'x')}});
    size_t size = 0;
    EXPECT_EQ(zv_app_launch_message_encode(h, &size), nullptr);
    app_control_destroy(h);
}

TEST(AppControl, ExtraDataAccess)
{
    app_control_h h = make_request({{"a", "1"}, {"b", "2"}, {"c", "3"}});
    char *value = reinterpret_cast<char *>(1);
    EXPECT_EQ(app_control_get_extra_data(h, "missing", &value), APP_CONTROL_ERROR_KEY_NOT_FOUND);
    EXPECT_EQ(value, nullptr);
    app_control_add_extra_data(h, "b", "two"); // a present key is replaced in place
    EXPECT_EQ(extras_of(h), (Extras{{"a", "1"}, {"b", "two"}, {"c", "3"}}));
    int calls = 0; // the walk stops when the callback says so
    app_control_foreach_extra_data(
        h, [](app_control_h, const char *, void *n) { return ++*static_cast<int *>(n) < 2; },
        &calls);
    EXPECT_EQ(calls, 2);
    EXPECT_EQ(app_control_add_extra_data(h, "", "x"), APP_CONTROL_ERROR_INVALID_PARAMETER);
    app_control_destroy(h);
}

TEST(AppPaths, ResourcePathAndRuntimeDir)
{
    const std::string saved = getenv("ZV_RES_DIR") ? getenv("ZV_RES_DIR") : "";
    char *cwd = g_get_current_dir();
    const std::pair<const char *, std::string> cases[] = {
        {"/opt/zuvo/res", "/opt/zuvo/res/"},
        {"/opt/zuvo/res/", "/opt/zuvo/res/"},
        {"rel/res", std::string(cwd) + "/rel/res/"},
        {nullptr, ZV_BUILD_RES_DIR}, // tests run from the build tree's bin folder
    };
    g_free(cwd);
    for (const auto &c : cases) {
        c.first ? setenv("ZV_RES_DIR", c.first, 1) : unsetenv("ZV_RES_DIR");
        char *res = app_get_resource_path(), *shared = app_get_shared_resource_path();
        EXPECT_STREQ(res, c.second.c_str());
        EXPECT_STREQ(shared, c.second.c_str());
        free(res);
        free(shared);
    }
    saved.empty() ? unsetenv("ZV_RES_DIR") : setenv("ZV_RES_DIR", saved.c_str(), 1);

    // The runtime folder is made private, and made private again; a file there is refused.
    TempDir tmp;
    for (int i = 0; i < 2; i++) {
        char *dir = zv_platform_runtime_dir();
        EXPECT_EQ(std::string(dir ? dir : ""), tmp.file("run"));
        g_free(dir);
        EXPECT_EQ(mode_of(tmp.file("run")), 0700);
        chmod(tmp.file("run").c_str(), 0755);
    }
    write_file(tmp.file("file"), "x");
    setenv("ZV_RUNTIME_DIR", tmp.file("file").c_str(), 1);
    EXPECT_EQ(zv_platform_runtime_dir(), nullptr);
}

TEST(AppCommandLine, WrongCallsAnswerOneLineAndStatus2)
{
    TempDir tmp;
    for (std::string args : {"--extra", "--extra novalue", "--extra =value", "--bogus", "extra"}) {
        std::string out;
        EXPECT_EQ(run_program({"/bin/sh", "-c", bin_path("zv-app-probe") + " " + args + " 2>&1"},
                              "", &out),
                  2)
            << args;
        EXPECT_EQ(std::count(out.begin(), out.end(), '\n'), 1) << out;
    }
    std::string out;
    EXPECT_EQ(run_program({bin_path("zv-app-probe"), "--help"}, "", &out), 0);
    EXPECT_NE(out.find("--extra KEY=VALUE"), std::string::npos);
}

// The probe writes one line per lifecycle callback to $ZV_PROBE_LOG.
class AppInstanceTest : public ::testing::Test
{
  protected:
    void SetUp() override { setenv("ZV_PROBE_LOG", log_.c_str(), 1); }
    void TearDown() override { unsetenv("ZV_PROBE_LOG"); }

    std::vector<std::string> probe(const std::vector<std::string> &args)
    {
        std::vector<std::string> argv = {bin_path("zv-app-probe")};
        argv.insert(argv.end(), args.begin(), args.end());
        return argv;
    }
    // Starts the probe as the instance and waits until it runs its loop.
    void start_instance(const std::vector<std::string> &args)
    {
        ASSERT_TRUE(instance_.start(probe(args)));
        ASSERT_TRUE(wait_for([&] { return count_of(log_, "resume") > 0; }, 20000));
    }
    int launch(const std::vector<std::string> &args) { return run_program(probe(args)); }
    int exit_status(Child &child) { return child.wait_exit(20000) ? child.exit_status() : -2; }

    TempDir tmp_;
    std::string log_ = tmp_.file("probe.log");
    std::string socket_ = tmp_.file("run/zuvo-upload-svc.sock");
    Child instance_;
};

// A stale socket (nobody listens) is replaced; later launches and another program's launch
// request reach the instance, a malformed message is refused, and SIGTERM ends it in order,
// leaving neither socket nor lock. (A launch request that starts the service when none runs:
// the companion's launch test.)
TEST_F(AppInstanceTest, LaterLaunchesReachTheInstanceWhichEndsOnSigterm)
{
    mkdir(tmp_.file("run").c_str(), 0700);
    int fd = unix_socket(socket_, true);
    ASSERT_GE(fd, 0);
    close(fd);

    start_instance({"--extra", "A=1", "--extra=B=x=y"});
    EXPECT_EQ(lines_of(log_), (Lines{"create", "app_control A=1 B=x=y", "resume"}));
    EXPECT_EQ(mode_of(socket_), 0600);
    EXPECT_EQ(mode_of(tmp_.file("run")), 0700);

    EXPECT_EQ(launch({"--extra", "C="}), 0);
    EXPECT_TRUE(wait_for([&] { return count_of(log_, "app_control C=") == 1; }));
    EXPECT_EQ(count_of(log_, "exit " + std::to_string(APP_ERROR_ALREADY_RUNNING)), 1);

    ASSERT_GE(fd = unix_socket(socket_, false), 0);
    std::string junk = "ZVL1" + u32(0x7fffffff);
    ASSERT_EQ(write(fd, junk.data(), junk.size()), (ssize_t)junk.size());
    char reply = 0;
    EXPECT_EQ(read(fd, &reply, 1), 1);
    EXPECT_EQ(reply, 'R');
    close(fd);

    app_control_h h = make_request({{"D", "4"}});
    app_control_set_app_id(h, "zuvo-upload-svc");
    EXPECT_EQ(app_control_send_launch_request(h, nullptr, nullptr), APP_CONTROL_ERROR_NONE);
    app_control_set_app_id(h, "other-app");
    EXPECT_EQ(app_control_send_launch_request(h, nullptr, nullptr),
              APP_CONTROL_ERROR_APP_NOT_FOUND);
    app_control_destroy(h);
    EXPECT_TRUE(wait_for([&] { return count_of(log_, "app_control D=4") == 1; }));

    instance_.signal(SIGTERM);
    EXPECT_EQ(exit_status(instance_), 0) << read_file(log_);
    Lines lines = lines_of(log_);
    ASSERT_GE(lines.size(), 2u);
    EXPECT_EQ(Lines(lines.end() - 2, lines.end()), (Lines{"terminate", "exit 0"}));
    EXPECT_NE(access(socket_.c_str(), F_OK), 0);
    int lock = open(tmp_.file("run/zuvo-upload-svc.lock").c_str(), O_RDWR); // free again
    ASSERT_GE(lock, 0);
    EXPECT_EQ(flock(lock, LOCK_EX | LOCK_NB), 0);
    close(lock);
}

// Iconified is pause, restored is resume, a launch in the foreground changes nothing; a later
// launch that asks the application to exit ends it in order.
TEST_F(AppInstanceTest, WindowIconifiedPausesRestoredResumesAndExitEnds)
{
    start_instance({});
    EXPECT_EQ(launch({"--extra", "PROBE_ICONIFY=1"}), 0);
    ASSERT_TRUE(wait_for([&] { return count_of(log_, "pause") == 1; }));
    EXPECT_EQ(launch({"--extra", "PROBE_RESTORE=1"}), 0);
    ASSERT_TRUE(wait_for([&] { return count_of(log_, "resume") == 2; }));
    EXPECT_EQ(launch({"--extra", "PROBE_RESTORE=2"}), 0);
    EXPECT_EQ(launch({"--extra", "PROBE_EXIT=1"}), 0);
    EXPECT_EQ(exit_status(instance_), 0);
    Lines lines = lines_of(log_); // without the launchers' own exit lines
    lines.erase(std::remove(lines.begin(), lines.end(),
                            "exit " + std::to_string(APP_ERROR_ALREADY_RUNNING)),
                lines.end());
    ASSERT_GE(lines.size(), 4u);
    EXPECT_EQ(
        Lines(lines.end() - 4, lines.end()),
        (Lines{"app_control PROBE_RESTORE=2", "app_control PROBE_EXIT=1", "terminate", "exit 0"}));
    EXPECT_EQ(count_of(log_, "pause"), 1);
    EXPECT_EQ(count_of(log_, "resume"), 2);
}

// The first request asking to exit ends the application in order; a failed create ends it
// before any launch request, with a failure status.
TEST_F(AppInstanceTest, FirstRequestExitAndFailedCreate)
{
    const struct {
        bool fail_create;
        int status;
        Lines lines;
    } cases[] = {
        {false, 0, {"create", "app_control PROBE_EXIT=1", "resume", "terminate", "exit 0"}},
        {true, 1, {"create", "exit " + std::to_string(APP_ERROR_INVALID_CONTEXT)}},
    };
    for (const auto &c : cases) {
        unlink(log_.c_str());
        Child child;
        ASSERT_TRUE(child.start(probe({"--extra", "PROBE_EXIT=1"}), "",
                                c.fail_create ? Env{{"ZV_PROBE_FAIL_CREATE", "1"}} : Env{}));
        EXPECT_EQ(exit_status(child), c.status);
        EXPECT_EQ(lines_of(log_), c.lines);
    }
}
