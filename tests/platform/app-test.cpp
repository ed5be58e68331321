// Application framework: the launch message codec, app controls, paths, and the running
// instance across processes (zv-app-probe and the service itself).
#include "app.h"

#include <fcntl.h>
#include <glib.h>
#include <gtest/gtest.h>
#include <stdlib.h>
#include <string.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>

#include <sys/file.h>

#include <algorithm>
#include <string>
#include <utility>
#include <vector>

#include "../app/zv-app-test-util.h"

using namespace zv_test;

namespace {

using Extras = std::vector<std::pair<std::string, std::string>>;

app_control_h make_request(const Extras &extras)
{
    app_control_h h = nullptr;
    app_control_create(&h);
    for (const auto &kv : extras)
        app_control_add_extra_data(h, kv.first.c_str(), kv.second.c_str());
    return h;
}

bool collect_cb(app_control_h h, const char *key, void *user_data)
{
    char *value = nullptr;
    app_control_get_extra_data(h, key, &value);
    static_cast<Extras *>(user_data)->emplace_back(key, value ? value : "");
    free(value);
    return true;
}

Extras extras_of(app_control_h h)
{
    Extras out;
    app_control_foreach_extra_data(h, collect_cb, &out);
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
    std::string s;
    for (int i = 0; i < 4; i++)
        s.push_back((char)(v >> (8 * i)));
    return s;
}

int parse(const std::string &bytes, app_control_h *out)
{
    return zv_app_launch_message_parse(reinterpret_cast<const unsigned char *>(bytes.data()),
                                       bytes.size(), out);
}

} // namespace

TEST(LaunchMessage, RoundTripKeepsExtrasAndOrder)
{
    const Extras cases[] = {
        {},
        {{"ZV_DATA_ACCESS_TOKEN", "ya29.token"}, {"ZV_DATA_CATEGORY", "Music"}},
        {{"empty", ""}, {"eq", "a=b=c"}, {"utf8", "vidéo ✓"}},
    };
    for (const Extras &extras : cases) {
        app_control_h parsed = nullptr;
        ASSERT_EQ(parse(message(extras), &parsed), APP_CONTROL_ERROR_NONE);
        EXPECT_EQ(extras_of(parsed), extras);
        app_control_destroy(parsed);
    }
}

TEST(LaunchMessage, MalformedMessagesAreRefused)
{
    const std::string one = message({{"k", "v"}});
    const std::string payload_one = one.substr(ZV_APP_LAUNCH_HEADER_SIZE);
    auto framed = [](const std::string &payload) { return "ZVL1" + u32(payload.size()) + payload; };
    const struct {
        const char *what;
        std::string bytes;
    } cases[] = {
        {"empty", ""},
        {"header cut short", one.substr(0, 6)},
        {"bad magic", "ZVL2" + one.substr(4)},
        {"length larger than the data", one.substr(0, one.size() - 1)},
        {"trailing bytes", framed(payload_one + "x")},
        {"count beyond the extras", framed(u32(2) + payload_one.substr(4))},
        {"too many extras", framed(u32(ZV_APP_LAUNCH_MAX_EXTRAS + 1))},
        {"key length beyond the end", framed(u32(1) + u32(1000) + "k")},
        {"empty key", framed(u32(1) + u32(0) + u32(1) + "v")},
        {"NUL in a key", framed(u32(1) + u32(2) + std::string("k\0", 2) + u32(0))},
        {"value not UTF-8", framed(u32(1) + u32(1) + "k" + u32(1) + "\xff")},
    };
    for (const auto &c : cases) {
        app_control_h parsed = reinterpret_cast<app_control_h>(1);
        EXPECT_EQ(parse(c.bytes, &parsed), APP_CONTROL_ERROR_INVALID_DATA_TYPE) << c.what;
        EXPECT_EQ(parsed, nullptr) << c.what;
    }
}

TEST(LaunchMessage, EncodeRefusesOversizedRequests)
{
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

    // Adding a present key replaces its value in place.
    app_control_add_extra_data(h, "b", "two");
    EXPECT_EQ(extras_of(h), (Extras{{"a", "1"}, {"b", "two"}, {"c", "3"}}));

    int calls = 0;
    app_control_foreach_extra_data(
        h, [](app_control_h, const char *, void *n) { return ++*static_cast<int *>(n) < 2; },
        &calls);
    EXPECT_EQ(calls, 2);

    EXPECT_EQ(app_control_add_extra_data(h, "", "x"), APP_CONTROL_ERROR_INVALID_PARAMETER);
    app_control_destroy(h);
}

TEST(AppPaths, ResourcePathFollowsEnvironmentOrBuildTree)
{
    const char *env = getenv("ZV_RES_DIR");
    std::string saved = env ? env : "";
    char *cwd_raw = g_get_current_dir();
    std::string cwd = cwd_raw;
    g_free(cwd_raw);
    const struct {
        const char *env;
        std::string expected;
    } cases[] = {
        {"/opt/zuvo/res", "/opt/zuvo/res/"},
        {"/opt/zuvo/res/", "/opt/zuvo/res/"},
        {"rel/res", cwd + "/rel/res/"},
        // Tests run from the build tree's bin folder.
        {nullptr, ZV_BUILD_RES_DIR},
    };
    for (const auto &c : cases) {
        if (c.env)
            setenv("ZV_RES_DIR", c.env, 1);
        else
            unsetenv("ZV_RES_DIR");
        char *res = app_get_resource_path();
        char *shared = app_get_shared_resource_path();
        EXPECT_STREQ(res, c.expected.c_str());
        EXPECT_STREQ(shared, c.expected.c_str());
        free(res);
        free(shared);
    }
    if (env)
        setenv("ZV_RES_DIR", saved.c_str(), 1);
}

TEST(AppPaths, RuntimeDirIsPrivate)
{
    TempDir tmp;
    char *dir = zv_platform_runtime_dir();
    ASSERT_NE(dir, nullptr);
    EXPECT_EQ(std::string(dir), tmp.file("run"));
    g_free(dir);

    chmod(tmp.file("run").c_str(), 0755);
    dir = zv_platform_runtime_dir();
    struct stat sb;
    ASSERT_EQ(stat(tmp.file("run").c_str(), &sb), 0);
    EXPECT_EQ(sb.st_mode & 0777, 0700u);
    g_free(dir);

    write_file(tmp.file("file"), "x");
    setenv("ZV_RUNTIME_DIR", tmp.file("file").c_str(), 1);
    EXPECT_EQ(zv_platform_runtime_dir(), nullptr);
}

TEST(AppCommandLine, WrongCallsAnswerOneLineAndStatus2)
{
    TempDir tmp;
    const std::vector<std::vector<std::string>> wrong = {
        {"--extra"}, {"--extra", "novalue"}, {"--extra", "=value"}, {"--bogus"}, {"extra"}};
    for (const auto &args : wrong) {
        std::string cmd = bin_path("zv-app-probe");
        for (const auto &a : args)
            cmd += " '" + a + "'";
        std::string out;
        EXPECT_EQ(run_program({"/bin/sh", "-c", cmd + " 2>&1"}, "", &out), 2) << cmd;
        EXPECT_EQ(std::count(out.begin(), out.end(), '\n'), 1) << out;
    }
    std::string out;
    EXPECT_EQ(run_program({bin_path("zv-app-probe"), "--help"}, "", &out), 0);
    EXPECT_NE(out.find("--extra KEY=VALUE"), std::string::npos);
}

class AppInstanceTest : public ::testing::Test {
protected:
    void SetUp() override { setenv("ZV_PROBE_LOG", log_.c_str(), 1); }
    void TearDown() override
    {
        if (pid_ > 0) {
            kill(pid_, SIGKILL);
            waitpid(pid_, nullptr, 0);
        }
        unsetenv("ZV_PROBE_LOG");
    }

    // Starts the probe as the instance and waits until it runs its loop.
    void start_instance(const std::vector<std::string> &args)
    {
        std::vector<std::string> argv = {bin_path("zv-app-probe")};
        argv.insert(argv.end(), args.begin(), args.end());
        pid_ = spawn_program(argv);
        ASSERT_GT(pid_, 0);
        ASSERT_TRUE(wait_for([&] { return has_line(log_, "resume"); }, 20000));
    }

    int launch(const std::vector<std::string> &args)
    {
        std::vector<std::string> argv = {bin_path("zv-app-probe")};
        argv.insert(argv.end(), args.begin(), args.end());
        return run_program(argv);
    }

    int stop_instance()
    {
        kill(pid_, SIGTERM);
        int rc = wait_program(pid_);
        pid_ = -1;
        return rc;
    }

    TempDir tmp_;
    std::string log_ = tmp_.file("probe.log");
    std::string socket_ = tmp_.file("run/zuvo-upload-svc.sock");
    pid_t pid_ = -1;
};

TEST_F(AppInstanceTest, LaterLaunchesReachTheInstanceWhichEndsOnSigterm)
{
    start_instance({"--extra", "A=1", "--extra=B=x=y"});
    EXPECT_EQ(read_lines(log_),
              (std::vector<std::string>{"create", "app_control A=1 B=x=y", "resume"}));
    struct stat sb;
    ASSERT_EQ(stat(socket_.c_str(), &sb), 0);
    EXPECT_EQ(sb.st_mode & 0777, 0600u);
    ASSERT_EQ(stat(tmp_.file("run").c_str(), &sb), 0);
    EXPECT_EQ(sb.st_mode & 0777, 0700u);

    // A second process hands its extras over and exits 0.
    EXPECT_EQ(launch({"--extra", "C="}), 0);
    EXPECT_TRUE(wait_for([&] { return has_line(log_, "app_control C="); }));
    EXPECT_TRUE(has_line(log_, "exit " + std::to_string(APP_ERROR_ALREADY_RUNNING)));

    // A malformed message is answered with a refusal, and the instance goes on serving.
    int fd = socket(AF_UNIX, SOCK_STREAM, 0);
    struct sockaddr_un addr = {};
    addr.sun_family = AF_UNIX;
    strncpy(addr.sun_path, socket_.c_str(), sizeof addr.sun_path - 1);
    ASSERT_EQ(connect(fd, (struct sockaddr *)&addr, sizeof addr), 0);
    std::string junk = "ZVL1" + u32(0x7fffffff);
    ASSERT_EQ(write(fd, junk.data(), junk.size()), (ssize_t)junk.size());
    char reply = 0;
    EXPECT_EQ(read(fd, &reply, 1), 1);
    EXPECT_EQ(reply, 'R');
    close(fd);

    // Another program's launch request goes the same way.
    app_control_h h = make_request({{"D", "4"}});
    app_control_set_app_id(h, "zuvo-upload-svc");
    EXPECT_EQ(app_control_send_launch_request(h, nullptr, nullptr), APP_CONTROL_ERROR_NONE);
    app_control_set_app_id(h, "other-app");
    EXPECT_EQ(app_control_send_launch_request(h, nullptr, nullptr),
              APP_CONTROL_ERROR_APP_NOT_FOUND);
    app_control_destroy(h);
    EXPECT_TRUE(wait_for([&] { return has_line(log_, "app_control D=4"); }));

    EXPECT_EQ(stop_instance(), 0) << read_file(log_);
    auto lines = read_lines(log_);
    ASSERT_GE(lines.size(), 2u);
    EXPECT_EQ(lines[lines.size() - 2], "terminate");
    EXPECT_EQ(lines.back(), "exit 0");
    EXPECT_NE(access(socket_.c_str(), F_OK), 0);
}

TEST_F(AppInstanceTest, StaleSocketIsReplaced)
{
    mkdir(tmp_.file("run").c_str(), 0700);
    int fd = socket(AF_UNIX, SOCK_STREAM, 0);
    struct sockaddr_un addr = {};
    addr.sun_family = AF_UNIX;
    strncpy(addr.sun_path, socket_.c_str(), sizeof addr.sun_path - 1);
    ASSERT_EQ(bind(fd, (struct sockaddr *)&addr, sizeof addr), 0);
    close(fd); // the file stays, nobody listens

    start_instance({"--extra", "first=1"});
    EXPECT_EQ(launch({"--extra", "PROBE_EXIT=1"}), 0);
    EXPECT_EQ(wait_program(pid_), 0);
    pid_ = -1;
    EXPECT_TRUE(has_line(log_, "app_control first=1"));
    EXPECT_TRUE(has_line(log_, "app_control PROBE_EXIT=1"));
    EXPECT_TRUE(has_line(log_, "terminate"));
}

TEST_F(AppInstanceTest, WindowIconifiedPausesAndRestoredResumes)
{
    start_instance({});
    auto count = [&](const std::string &what) {
        auto lines = read_lines(log_);
        return std::count(lines.begin(), lines.end(), what);
    };
    EXPECT_EQ(launch({"--extra", "PROBE_ICONIFY=1"}), 0);
    ASSERT_TRUE(wait_for([&] { return count("pause") == 1; }));
    EXPECT_EQ(launch({"--extra", "PROBE_RESTORE=1"}), 0);
    ASSERT_TRUE(wait_for([&] { return count("resume") == 2; }));
    // A launch while in the foreground changes nothing.
    EXPECT_EQ(launch({"--extra", "PROBE_RESTORE=2"}), 0);
    ASSERT_TRUE(wait_for([&] { return has_line(log_, "app_control PROBE_RESTORE=2"); }));
    EXPECT_EQ(stop_instance(), 0);
    EXPECT_EQ(count("pause"), 1);
    EXPECT_EQ(count("resume"), 2);
}

TEST_F(AppInstanceTest, ExitAskedByTheFirstRequestEndsInOrder)
{
    pid_ = spawn_program({bin_path("zv-app-probe"), "--extra", "PROBE_EXIT=1"});
    EXPECT_EQ(wait_program(pid_), 0);
    pid_ = -1;
    EXPECT_EQ(read_lines(log_), (std::vector<std::string>{"create", "app_control PROBE_EXIT=1",
                                                          "resume", "terminate", "exit 0"}));
}

TEST_F(AppInstanceTest, FailedCreateEndsBeforeAnyLaunchRequest)
{
    setenv("ZV_PROBE_FAIL_CREATE", "1", 1);
    pid_ = spawn_program({bin_path("zv-app-probe"), "--extra", "A=1"});
    unsetenv("ZV_PROBE_FAIL_CREATE");
    EXPECT_EQ(wait_program(pid_), 1);
    pid_ = -1;
    EXPECT_EQ(
        read_lines(log_),
        (std::vector<std::string>{"create", "exit " + std::to_string(APP_ERROR_INVALID_CONTEXT)}));
}

TEST_F(AppInstanceTest, LaunchRequestStartsTheServiceWhenNoneRuns)
{
    app_control_h h = make_request({{"ZV_DATA_ACCESS_TOKEN", "t"}});
    app_control_set_app_id(h, "zuvo-upload-svc");
    ASSERT_EQ(app_control_send_launch_request(h, nullptr, nullptr), APP_CONTROL_ERROR_NONE);
    app_control_destroy(h);

    // The service started beside this program now owns the socket; end it through its pid.
    int fd = -1;
    ASSERT_TRUE(wait_for([&] {
        fd = socket(AF_UNIX, SOCK_STREAM, 0);
        struct sockaddr_un addr = {};
        addr.sun_family = AF_UNIX;
        strncpy(addr.sun_path, socket_.c_str(), sizeof addr.sun_path - 1);
        if (connect(fd, (struct sockaddr *)&addr, sizeof addr) == 0)
            return true;
        close(fd);
        return false;
    }, 20000));
    struct ucred cred;
    socklen_t len = sizeof cred;
    ASSERT_EQ(getsockopt(fd, SOL_SOCKET, SO_PEERCRED, &cred, &len), 0);
    close(fd);
    ASSERT_GT(cred.pid, 0);
    kill(cred.pid, SIGTERM);
    EXPECT_TRUE(wait_for([&] { return access(socket_.c_str(), F_OK) != 0; }, 20000));
    // The instance lock is free once the service has run terminate and left.
    int lock = open(tmp_.file("run/zuvo-upload-svc.lock").c_str(), O_RDWR);
    ASSERT_GE(lock, 0);
    EXPECT_TRUE(wait_for([&] { return flock(lock, LOCK_EX | LOCK_NB) == 0; }, 20000));
    close(lock);
}
