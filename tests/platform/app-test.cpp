// Application framework: the launch message codec, app controls, paths, the command line, and
// the running instance across processes (zv-app-probe).
#include "app.h"

#include <fcntl.h>
#include <glib.h>
#include <gtest/gtest.h>
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

using Lines = std::vector<std::string>;

std::string u32(uint32_t v)
{
    return std::string{(char)v, (char)(v >> 8), (char)(v >> 16), (char)(v >> 24)};
}

int mode_of(const std::string &path)
{
    struct stat sb;
    return stat(path.c_str(), &sb) == 0 ? (int)(sb.st_mode & 0777) : -1;
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

// The codec's round trip runs across processes in the instance test and the companion's
// launch test; here, what it must refuse.
TEST(LaunchMessage, BadMessagesAreRefused)
{
    app_control_h h = nullptr;
    app_control_create(&h);
    app_control_add_extra_data(h, "k", "v");
    size_t size = 0;
    unsigned char *data = zv_app_launch_message_encode(h, &size);
    const std::string one(reinterpret_cast<char *>(data), size);
    const std::string payload_one = one.substr(ZV_APP_LAUNCH_HEADER_SIZE);
    g_free(data);
    auto framed = [](const std::string &payload) { return "ZVL1" + u32(payload.size()) + payload; };
    const std::string cases[] = {
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
        EXPECT_EQ(zv_app_launch_message_parse(reinterpret_cast<const unsigned char *>(bytes.data()),
                                              bytes.size(), &parsed),
                  APP_CONTROL_ERROR_INVALID_DATA_TYPE);
        EXPECT_EQ(parsed, nullptr);
    }

    app_control_add_extra_data(h, "big", std::string(ZV_APP_LAUNCH_MAX_MESSAGE, 'x').c_str());
    EXPECT_EQ(zv_app_launch_message_encode(h, &size), nullptr);
    app_control_destroy(h);
}

// Run from the build tree without ZV_RES_DIR (as the demo runs it), the resources are the
// build tree's; a runtime folder that is a file is refused (the instance test sees it made
// private).
TEST(AppPaths, ResourcePathAndRuntimeDir)
{
    const std::string saved = getenv("ZV_RES_DIR") ? getenv("ZV_RES_DIR") : "";
    unsetenv("ZV_RES_DIR");
    char *res = app_get_resource_path(), *shared = app_get_shared_resource_path();
    if (!saved.empty())
        setenv("ZV_RES_DIR", saved.c_str(), 1);
    EXPECT_STREQ(res, ZV_BUILD_RES_DIR);
    EXPECT_STREQ(shared, ZV_BUILD_RES_DIR);
    free(res);
    free(shared);
    TempDir tmp;
    write_file(tmp.file("file"), "x");
    setenv("ZV_RUNTIME_DIR", tmp.file("file").c_str(), 1);
    EXPECT_EQ(zv_platform_runtime_dir(), nullptr);
}

// The instance makes its open runtime folder private and takes later launches (a stale
// socket and a later launch of the service itself: the e2e tests' restarts); a malformed
// message is refused; iconified is pause, restored is resume, a launch in the foreground
// changes nothing; a request to exit ends it in order, leaving neither socket nor lock. A key
// given twice keeps its place with the later value. (SIGTERM ending the service in order: the
// e2e tests, whose every service ends that way.) Before that, wrong command lines answer one
// line and status 2, before any instance is looked for; a failed create ends the application
// before any launch request, with a failure status. The probe writes one line per lifecycle
// callback to $ZV_PROBE_LOG.
TEST(AppInstanceTest, WrongCallsFailedCreateAndLaterLaunchesReachingTheInstance)
{
    TempDir tmp;
    const std::string probe = bin_path("zv-app-probe"), probe_log = tmp.file("probe.log");
    const std::string sock = tmp.file("run/zuvo-upload-svc.sock");
    setenv("ZV_PROBE_LOG", probe_log.c_str(), 1);
    EXPECT_EQ(
        wrong_calls(probe, {"--extra", "--extra novalue", "--extra =value", "--bogus", "extra"}),
        "");

    Child failed;
    ASSERT_TRUE(failed.start({probe, "--extra", "A=1"}, "", {{"ZV_PROBE_FAIL_CREATE", "1"}}));
    ASSERT_TRUE(failed.wait_exit(20000));
    EXPECT_EQ(failed.exit_status(), 1);
    EXPECT_EQ(lines_of(probe_log),
              (Lines{"create", "exit " + std::to_string(APP_ERROR_INVALID_CONTEXT)}));
    unlink(probe_log.c_str());

    mkdir(tmp.file("run").c_str(), 0755);
    Child instance;
    ASSERT_TRUE(instance.start({probe, "--extra", "A=1", "--extra=B=x=y", "--extra", "A="}));
    ASSERT_TRUE(wait_for([&] { return count_of(probe_log, "resume") > 0; }, 20000));
    EXPECT_EQ(mode_of(sock), 0600);
    EXPECT_EQ(mode_of(tmp.file("run")), 0700);

    // The launchers log to a file of their own.
    const std::string launchers = tmp.file("launchers.log");
    setenv("ZV_PROBE_LOG", launchers.c_str(), 1);
    EXPECT_EQ(run_program({probe, "--extra", "C=vidéo ✓", "--extra", "E=5"}), 0);
    EXPECT_TRUE(wait_for([&] { return count_of(probe_log, "app_control C=vidéo ✓ E=5") == 1; }));

    // A malformed message is answered with a refusal.
    int fd = socket(AF_UNIX, SOCK_STREAM, 0);
    sockaddr_un addr = {};
    addr.sun_family = AF_UNIX;
    strncpy(addr.sun_path, sock.c_str(), sizeof addr.sun_path - 1);
    ASSERT_EQ(connect(fd, (sockaddr *)&addr, sizeof addr), 0);
    std::string junk = "ZVL1" + u32(0x7fffffff);
    ASSERT_EQ(write(fd, junk.data(), junk.size()), (ssize_t)junk.size());
    char reply = 0;
    EXPECT_EQ(read(fd, &reply, 1), 1);
    EXPECT_EQ(reply, 'R');
    close(fd);

    EXPECT_EQ(run_program({probe, "--extra", "PROBE_ICONIFY=1"}), 0);
    ASSERT_TRUE(wait_for([&] { return count_of(probe_log, "pause") == 1; }));
    EXPECT_EQ(run_program({probe, "--extra", "PROBE_RESTORE=1"}), 0);
    ASSERT_TRUE(wait_for([&] { return count_of(probe_log, "resume") == 2; }));
    EXPECT_EQ(run_program({probe, "--extra", "PROBE_RESTORE=2"}), 0);
    ASSERT_TRUE(wait_for([&] { return count_of(probe_log, "app_control PROBE_RESTORE=2") == 1; }));

    EXPECT_EQ(run_program({probe, "--extra", "PROBE_EXIT=1"}), 0);
    ASSERT_TRUE(instance.wait_exit(20000));
    EXPECT_EQ(instance.exit_status(), 0);
    EXPECT_EQ(
        lines_of(probe_log),
        (Lines{"create", "app_control A= B=x=y", "resume", "app_control C=vidéo ✓ E=5",
               "app_control PROBE_ICONIFY=1", "pause", "app_control PROBE_RESTORE=1", "resume",
               "app_control PROBE_RESTORE=2", "app_control PROBE_EXIT=1", "terminate", "exit 0"}));
    EXPECT_EQ(lines_of(launchers), Lines(5, "exit " + std::to_string(APP_ERROR_ALREADY_RUNNING)));
    EXPECT_NE(access(sock.c_str(), F_OK), 0);
    int lock = open(tmp.file("run/zuvo-upload-svc.lock").c_str(), O_RDWR); // free again
    ASSERT_GE(lock, 0);
    EXPECT_EQ(flock(lock, LOCK_EX | LOCK_NB), 0);
    close(lock);
}
