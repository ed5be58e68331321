// Tests of the companion client program, run from the build against a fresh history, media
// database and runtime folder; its launch requests go to the probe application running as
// the instance (or, with none running, start the service itself).
#include <app.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <string.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <string>
#include <vector>

#include "../upload-svc/zv-upload-test-util.h"
#include "zv-ext-media.h"

namespace
{

class ZuvoClientTest : public ::testing::Test
{
  protected:
    void TearDown() override { zv_ext_db_close(); }

    // Runs the client in the temporary folder; its standard error goes to a file read into *err.
    int client(const std::vector<std::string> &args, std::string *out = nullptr,
               std::string *err = nullptr, const std::string &input = "")
    {
        std::string err_file = tmp_.file("stderr");
        std::vector<std::string> argv = {
            "/bin/sh", "-c", "cd '" + tmp_.path() + "' && exec \"$0\" \"$@\" 2>'" + err_file + "'",
            zv_test::bin_path("zuvo-client")};
        argv.insert(argv.end(), args.begin(), args.end());
        int status = zv_test::run_program(argv, input, out);
        if (err)
            *err = zv_test::read_file(err_file);
        return status;
    }

    // The list, each run of blanks made one (no blanks in the test's values).
    std::string listed()
    {
        std::string out, squeezed;
        EXPECT_EQ(client({"list"}, &out), 0);
        for (char c : out)
            if (c != ' ' || squeezed.empty() || squeezed.back() != ' ')
                squeezed += c;
        return squeezed;
    }

    zv_test::TempDir tmp_;
};

// Wrong calls exit with 2 and one line and record nothing: the rows recorded next are the
// first. Rows are recorded with their user, size (a sparse file past 4 GiB) and title, listed
// with their status and progress, registered in the media database as videos under their file
// name, and removed once.
TEST_F(ZuvoClientTest, WrongCallsRecordNothingThenAddListRemove)
{
    ASSERT_TRUE(zv_test::write_file(tmp_.file("good.mp4"), "video"));
    ASSERT_EQ(mkdir(tmp_.file("folder").c_str(), 0700), 0);
    ASSERT_EQ(mkfifo(tmp_.file("fifo").c_str(), 0600), 0);
    ASSERT_TRUE(zv_test::write_file(tmp_.file("empty.mp4"), ""));
    const std::vector<std::vector<std::string>> calls = {
        {},
        {"frob"},
        {"add"},
        {"add", "good.mp4", "--title"},
        {"add", "--bogus", "good.mp4"},
        {"add", "good.mp4", "missing.mp4"},
        {"add", "good.mp4", "folder"},
        {"add", "good.mp4", "fifo"},
        {"add", "good.mp4", "empty.mp4"},
        {"add", "--title", "a", "--title", "b", "good.mp4"},
        {"list", "extra"},
        {"remove"},
        {"remove", "12x"},
        {"remove", "7"},
        {"launch", "--category", "c"},
        {"launch", "--token", "t", "--category", "c", "--privacy", "secret"},
        {"launch", "--token", "t", "--category", "c", "stray"},
        {"launch", "--token-file", "missing", "--category", "c"},
        {"launch", "--token-file", "good.mp4", "--token", "t", "--category", "c"},
    };
    for (const auto &call : calls) {
        SCOPED_TRACE(::testing::PrintToString(call));
        std::string out, err;
        EXPECT_EQ(client(call, &out, &err), 2);
        EXPECT_EQ(out, "");
        EXPECT_EQ(err.rfind("zuvo-client: ", 0), 0u) << err;
        EXPECT_EQ(std::count(err.begin(), err.end(), '\n'), 1) << err;
    }
    EXPECT_EQ(client({"add", "--help"}), 0);

    ASSERT_TRUE(zv_test::write_file(tmp_.file("clip.one.mp4"), std::string(10, 'v')));
    ASSERT_TRUE(zv_test::write_file(tmp_.file("b.mov"), "abc"));
    ASSERT_EQ(truncate(tmp_.file("b.mov").c_str(), 5000000000LL), 0);
    std::string out;
    ASSERT_EQ(client({"add", "clip.one.mp4", "b.mov", "--user", "me"}, &out), 0);
    EXPECT_EQ(out, "1\t" + tmp_.file("clip.one.mp4") + "\n2\t" + tmp_.file("b.mov") + "\n");
    ASSERT_EQ(client({"add", "--title=Take", "b.mov"}, &out), 0);
    EXPECT_EQ(out, "3\t" + tmp_.file("b.mov") + "\n");

    ASSERT_EQ(zv_ext_db_open(), 1);
    auto stored = zv_upload_test::stored_rows();
    EXPECT_EQ(stored[1].userid, "me");
    EXPECT_EQ(stored[1].url, "");
    EXPECT_LT(stored[1].date, stored[2].date);
    // A row the service has taken further.
    ASSERT_TRUE(
        zv_upload_test::add_row(4, ZV_UPLOAD_STATUS_UPLOADING, 2e9, "/v/d.mp4", "D", nullptr, 40));
    zv_ext_db_close();

    const std::string head = "ID TITLE STATUS PERCENT SIZE FILE\n",
                      one = "1 clip.one READY 0% 10 " + tmp_.file("clip.one.mp4") + "\n",
                      two = "2 b READY 0% 5000000000 " + tmp_.file("b.mov") + "\n",
                      three = "3 Take READY 0% 5000000000 " + tmp_.file("b.mov") + "\n",
                      four = "4 D UPLOADING 40% 10 /v/d.mp4\n";
    EXPECT_EQ(listed(), head + one + two + three + four);

    ASSERT_EQ(zv_ext_media_init(), 1);
    char *thumb = nullptr, *name = nullptr;
    EXPECT_EQ(zv_ext_media_get_thumb_info(tmp_.file("b.mov").c_str(), &thumb, &name), 1);
    EXPECT_STREQ(name, "b.mov");
    free(thumb);
    free(name);
    zv_ext_media_deinit();

    EXPECT_EQ(client({"remove", "1"}), 0);
    EXPECT_EQ(client({"remove", "1"}), 2);
    EXPECT_EQ(listed(), head + two + three + four);
}

// The batch extras of the command line reach the running instance (zv-app-probe, which logs
// them in their order); the token from the command line (which warns in one line), a file,
// standard input or the environment.
TEST_F(ZuvoClientTest, LaunchSendsTheBatchExtras)
{
    const std::string base = " ZV_DATA_CATEGORY=c ZV_DATA_ACCESS_TYPE=0";
    const struct {
        std::vector<std::string> args;
        std::string expected, input = "", env_token = "";
    } cases[] = {
        {{"--token-file", "token", "--category", "c"}, "ZV_DATA_ACCESS_TOKEN=from-file" + base},
        {{"--token-file=-", "--category", "c"}, "ZV_DATA_ACCESS_TOKEN=piped" + base, "piped\n"},
        {{"--category", "c"}, "ZV_DATA_ACCESS_TOKEN=from-env" + base, "", "from-env"},
        {{"--category=Music", "--token", "t2", "--description", "two words", "--tag", "a,b",
          "--privacy", "private", "--location"},
         "ZV_DATA_ACCESS_TOKEN=t2 ZV_DATA_CATEGORY=Music ZV_DATA_DESCRIPTION=two words "
         "ZV_DATA_TAG=a,b ZV_DATA_ACCESS_TYPE=2 ZV_DATA_USE_LOCATION=1"},
    };
    ASSERT_TRUE(zv_test::write_file(tmp_.file("token"), "from-file\n"));
    const std::string log = tmp_.file("probe.log");
    auto logged = [&](const std::string &line) {
        return zv_test::read_file(log).find(line + "\n") != std::string::npos;
    };
    zv_test::Child instance;
    ASSERT_TRUE(instance.start({zv_test::bin_path("zv-app-probe")}, "", {{"ZV_PROBE_LOG", log}}));
    ASSERT_TRUE(zv_test::wait_for([&] { return logged("resume"); }, 20000));
    for (const auto &c : cases) {
        SCOPED_TRACE(c.expected);
        std::vector<std::string> args = {"launch"};
        args.insert(args.end(), c.args.begin(), c.args.end());
        std::string err;
        if (!c.env_token.empty())
            setenv("ZV_ACCESS_TOKEN", c.env_token.c_str(), 1);
        EXPECT_EQ(client(args, nullptr, &err, c.input), 0) << err;
        unsetenv("ZV_ACCESS_TOKEN");
        EXPECT_TRUE(zv_test::wait_for([&] { return logged("app_control " + c.expected); }))
            << zv_test::read_file(log);
        if (std::find(c.args.begin(), c.args.end(), "--token") != c.args.end()) {
            EXPECT_EQ(err.rfind("zuvo-client: warning: --token", 0), 0u) << err;
            EXPECT_EQ(std::count(err.begin(), err.end(), '\n'), 1) << err;
        } else {
            EXPECT_EQ(err, "");
        }
    }
}

// The command line of every process is public (ps): the token the companion reads from its
// standard input does not show on the command line of the service it starts.
TEST_F(ZuvoClientTest, TokenStaysOffTheCommandLineOfTheServiceItStarts)
{
    auto cmdline = [](pid_t pid) {
        return zv_test::read_file("/proc/" + std::to_string(pid) + "/cmdline");
    };
    int in = -1;
    pid_t companion = zv_test::spawn_piped(
        {zv_test::bin_path("zuvo-client"), "launch", "--category", "c", "--token-file=-"}, &in,
        nullptr);
    ASSERT_GT(companion, 0);
    ASSERT_EQ(write(in, "secret-piped\n", 13), 13);
    close(in);
    int status = 0;
    ASSERT_EQ(waitpid(companion, &status, 0), companion);
    ASSERT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0);

    // The service it started listens on its socket; the peer's credentials name it.
    int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    sockaddr_un addr = {AF_UNIX, {}};
    strncpy(addr.sun_path, tmp_.file("run/zuvo-upload-svc.sock").c_str(), sizeof addr.sun_path - 1);
    ASSERT_TRUE(zv_test::wait_for(
        [&] { return connect(fd, (struct sockaddr *)&addr, sizeof addr) == 0; }, 30000));
    ucred cred = {};
    socklen_t len = sizeof cred;
    ASSERT_EQ(getsockopt(fd, SOL_SOCKET, SO_PEERCRED, &cred, &len), 0);
    std::string service_cmdline = cmdline(cred.pid);
    EXPECT_NE(service_cmdline.find("zuvo-upload-svc"), std::string::npos);
    EXPECT_EQ(service_cmdline.find("secret"), std::string::npos) << service_cmdline;
    // SIGTERM ends it even with this connection still open and silent.
    ASSERT_EQ(kill(cred.pid, SIGTERM), 0);
    EXPECT_TRUE(zv_test::wait_for([&] { return cmdline(cred.pid).empty(); }, 30000));
    close(fd);
}

} // namespace
