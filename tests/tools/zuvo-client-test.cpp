// Tests of the companion client program, run from the build against a fresh history, media
// database and runtime folder; its launch requests go to a listener standing in for the
// running service.
#include <app.h>
#include <gtest/gtest.h>
#include <media_content.h>
#include <poll.h>
#include <signal.h>
#include <string.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <future>
#include <map>
#include <sstream>
#include <string>
#include <vector>

#include "../upload-svc/zv-upload-test-util.h"

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

    // The list's rows by id, each split into its columns (no blanks in the test's values).
    std::map<std::string, std::vector<std::string>> listed()
    {
        std::string out;
        EXPECT_EQ(client({"list"}, &out), 0);
        std::map<std::string, std::vector<std::string>> rows;
        std::istringstream lines(out);
        std::string line;
        std::getline(lines, line);
        EXPECT_EQ(line.rfind("ID  ", 0), 0u) << line;
        while (std::getline(lines, line)) {
            std::istringstream cols(line);
            std::vector<std::string> row;
            for (std::string col; cols >> col;)
                row.push_back(col);
            rows[row.at(0)] = row;
        }
        return rows;
    }

    // The address of the service's socket in the runtime folder.
    sockaddr_un service_address()
    {
        std::string path = tmp_.file("run") + "/zuvo-upload-svc.sock";
        sockaddr_un addr = {};
        addr.sun_family = AF_UNIX;
        memcpy(addr.sun_path, path.c_str(), std::min(path.size() + 1, sizeof addr.sun_path));
        return addr;
    }

    zv_test::TempDir tmp_;
};

TEST_F(ZuvoClientTest, AddListRemoveRoundTrip)
{
    ASSERT_TRUE(zv_test::write_file(tmp_.file("clip.one.mp4"), std::string(10, 'v')));
    ASSERT_TRUE(zv_test::write_file(tmp_.file("b.mov"), "abc"));
    ASSERT_EQ(truncate(tmp_.file("b.mov").c_str(), 5000000000LL), 0); // sparse, past 4 GiB
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
    DbItem progress{};
    progress.historyid = 2;
    progress.percent = 40;
    progress.status = ZV_UPLOAD_STATUS_UPLOADING;
    ASSERT_EQ(zv_ext_db_update_item(&progress), 1);
    zv_ext_db_close();

    auto rows = listed();
    ASSERT_EQ(rows.size(), 3u);
    EXPECT_EQ(rows["1"], (std::vector<std::string>{"1", "clip.one", "READY", "0%", "10",
                                                   tmp_.file("clip.one.mp4")}));
    EXPECT_EQ(rows["2"], (std::vector<std::string>{"2", "b", "UPLOADING", "40%", "5000000000",
                                                   tmp_.file("b.mov")}));
    EXPECT_EQ(rows["3"][1], "Take");

    // Registered in the media database under its file name.
    ASSERT_EQ(media_content_connect(), MEDIA_CONTENT_ERROR_NONE);
    filter_h filter = nullptr;
    ASSERT_EQ(media_filter_create(&filter), MEDIA_CONTENT_ERROR_NONE);
    std::string cond = "MEDIA_TYPE = 1 and MEDIA_PATH= \"" + tmp_.file("b.mov") + "\"";
    ASSERT_EQ(media_filter_set_condition(filter, cond.c_str(), MEDIA_CONTENT_COLLATE_DEFAULT),
              MEDIA_CONTENT_ERROR_NONE);
    std::string name;
    media_info_foreach_media_from_db(
        filter,
        [](media_info_h media, void *data) {
            char *n = nullptr;
            media_info_get_display_name(media, &n);
            *static_cast<std::string *>(data) = n ? n : "";
            free(n);
            return false;
        },
        &name);
    media_filter_destroy(filter);
    media_content_disconnect();
    EXPECT_EQ(name, "b.mov");

    EXPECT_EQ(client({"remove", "1"}), 0);
    EXPECT_EQ(client({"remove", "1"}), 2);
    rows = listed();
    EXPECT_EQ(rows.size(), 2u);
    EXPECT_EQ(rows.count("1"), 0u);
}

TEST_F(ZuvoClientTest, WrongCallsExitTwoAndRecordNothing)
{
    ASSERT_TRUE(zv_test::write_file(tmp_.file("good.mp4"), "video"));
    ASSERT_EQ(mkdir(tmp_.file("folder").c_str(), 0700), 0);
    ASSERT_EQ(mkfifo(tmp_.file("fifo").c_str(), 0600), 0);
    ASSERT_TRUE(zv_test::write_file(tmp_.file("empty.mp4"), ""));
    std::vector<std::vector<std::string>> calls = {
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
    if (geteuid() != 0) {
        ASSERT_TRUE(zv_test::write_file(tmp_.file("locked.mp4"), "x"));
        ASSERT_EQ(chmod(tmp_.file("locked.mp4").c_str(), 0), 0);
        calls.push_back({"add", "good.mp4", "locked.mp4"});
    }
    for (const auto &call : calls) {
        std::string joined;
        for (const auto &a : call)
            joined += a + " ";
        SCOPED_TRACE(joined);
        std::string out, err;
        EXPECT_EQ(client(call, &out, &err), 2);
        EXPECT_EQ(out, "");
        EXPECT_EQ(err.rfind("zuvo-client: ", 0), 0u) << err;
        EXPECT_EQ(std::count(err.begin(), err.end(), '\n'), 1) << err;
    }
    ASSERT_EQ(zv_ext_db_open(), 1);
    EXPECT_EQ(zv_ext_db_get_full_count(), 0);

    std::string out;
    EXPECT_EQ(client({"add", "--help"}, &out), 0);
    EXPECT_EQ(out.rfind("Usage: zuvo-client", 0), 0u);
}

// Accepts one launch message on the service's socket, answers that it was taken and returns
// its extras as "KEY=VALUE|..." in key order (empty when none came within the bound).
std::string serve_one_launch(int listen_fd)
{
    std::map<std::string, std::string> extras;
    struct pollfd pfd = {listen_fd, POLLIN, 0};
    int conn = poll(&pfd, 1, 30000) > 0 ? accept(listen_fd, nullptr, nullptr) : -1;
    if (conn < 0)
        return "";
    struct timeval tv = {10, 0};
    setsockopt(conn, SOL_SOCKET, SO_RCVTIMEO, &tv, sizeof tv);
    std::string msg;
    char buf[4096];
    size_t want = ZV_APP_LAUNCH_HEADER_SIZE;
    for (ssize_t n; msg.size() < want && (n = recv(conn, buf, sizeof buf, 0)) > 0;) {
        msg.append(buf, (size_t)n);
        if (msg.size() >= ZV_APP_LAUNCH_HEADER_SIZE)
            want = ZV_APP_LAUNCH_HEADER_SIZE +
                   ((size_t)(unsigned char)msg[4] | (size_t)(unsigned char)msg[5] << 8 |
                    (size_t)(unsigned char)msg[6] << 16 | (size_t)(unsigned char)msg[7] << 24);
    }
    app_control_h request = nullptr;
    if (zv_app_launch_message_parse(reinterpret_cast<const unsigned char *>(msg.data()), msg.size(),
                                    &request) == APP_CONTROL_ERROR_NONE) {
        app_control_foreach_extra_data(
            request,
            [](app_control_h ac, const char *key, void *data) {
                char *value = nullptr;
                app_control_get_extra_data(ac, key, &value);
                (*static_cast<std::map<std::string, std::string> *>(data))[key] =
                    value ? value : "";
                free(value);
                return true;
            },
            &extras);
        app_control_destroy(request);
    }
    char taken = 'A';
    bool answered = send(conn, &taken, 1, MSG_NOSIGNAL) == 1;
    close(conn);
    std::string joined;
    for (const auto &kv : extras)
        joined += (joined.empty() ? "" : "|") + kv.first + "=" + kv.second;
    return answered ? joined : "";
}

TEST_F(ZuvoClientTest, LaunchSendsTheBatchExtras)
{
    const std::string base = "ZV_DATA_ACCESS_TYPE=0|ZV_DATA_CATEGORY=c";
    const struct {
        std::vector<std::string> args;
        std::string expected, input = "", env_token = "";
    } cases[] = {
        {{"--token", "tok", "--category", "c"}, "ZV_DATA_ACCESS_TOKEN=tok|" + base},
        // The safe forms: a file, standard input, the environment.
        {{"--token-file", "token", "--category", "c"}, "ZV_DATA_ACCESS_TOKEN=from-file|" + base},
        {{"--token-file=-", "--category", "c"}, "ZV_DATA_ACCESS_TOKEN=piped|" + base, "piped\n"},
        {{"--category", "c"}, "ZV_DATA_ACCESS_TOKEN=from-env|" + base, "", "from-env"},
        {{"--category=Music", "--token", "t2", "--description", "two words", "--tag", "a,b",
          "--privacy", "private", "--location"},
         "ZV_DATA_ACCESS_TOKEN=t2|ZV_DATA_ACCESS_TYPE=2|ZV_DATA_CATEGORY=Music|"
         "ZV_DATA_DESCRIPTION=two words|ZV_DATA_TAG=a,b|ZV_DATA_USE_LOCATION=1"},
        {{"--token", "t", "--category", "c", "--privacy", "unlisted"},
         "ZV_DATA_ACCESS_TOKEN=t|ZV_DATA_ACCESS_TYPE=1|ZV_DATA_CATEGORY=c"},
    };
    ASSERT_TRUE(zv_test::write_file(tmp_.file("token"), "from-file\n"));
    ASSERT_EQ(mkdir(tmp_.file("run").c_str(), 0700), 0);
    int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    sockaddr_un addr = service_address();
    ASSERT_EQ(bind(fd, (struct sockaddr *)&addr, sizeof addr), 0);
    ASSERT_EQ(listen(fd, 4), 0);
    for (const auto &c : cases) {
        SCOPED_TRACE(c.expected);
        auto served = std::async(std::launch::async, serve_one_launch, fd);
        std::vector<std::string> args = {"launch"};
        args.insert(args.end(), c.args.begin(), c.args.end());
        std::string err;
        if (!c.env_token.empty())
            setenv("ZV_ACCESS_TOKEN", c.env_token.c_str(), 1);
        EXPECT_EQ(client(args, nullptr, &err, c.input), 0) << err;
        unsetenv("ZV_ACCESS_TOKEN");
        EXPECT_EQ(served.get(), c.expected);
        // Only the token on the command line warns, in one line.
        if (std::find(c.args.begin(), c.args.end(), "--token") != c.args.end()) {
            EXPECT_EQ(err.rfind("zuvo-client: warning: --token", 0), 0u) << err;
            EXPECT_EQ(std::count(err.begin(), err.end(), '\n'), 1) << err;
        } else {
            EXPECT_EQ(err, "");
        }
    }
    close(fd);
}

// The command line of every process is public (ps): with the token on standard input or in
// the environment, neither the companion nor the service it starts shows it there.
TEST_F(ZuvoClientTest, TokenStaysOffTheCommandLinesOfClientAndService)
{
    auto cmdline = [](pid_t pid) {
        return zv_test::read_file("/proc/" + std::to_string(pid) + "/cmdline");
    };
    for (bool from_stdin : {true, false}) {
        SCOPED_TRACE(from_stdin ? "--token-file -" : "ZV_ACCESS_TOKEN");
        const std::string token = from_stdin ? "secret-piped-1" : "secret-env-2";
        std::vector<std::string> argv = {zv_test::bin_path("zuvo-client"), "launch", "--category",
                                         "c"};
        if (from_stdin)
            argv.push_back("--token-file=-");
        else
            setenv("ZV_ACCESS_TOKEN", token.c_str(), 1);
        int in = -1;
        pid_t companion = zv_test::spawn_piped(argv, &in, nullptr);
        unsetenv("ZV_ACCESS_TOKEN");
        ASSERT_GT(companion, 0);
        // With the token still to come on its standard input, the companion is running.
        if (from_stdin) {
            EXPECT_TRUE(zv_test::wait_for(
                [&] { return cmdline(companion).find("launch") != std::string::npos; }));
            EXPECT_EQ(cmdline(companion).find("secret"), std::string::npos);
        }
        ASSERT_EQ(write(in, (token + "\n").data(), token.size() + 1), (ssize_t)token.size() + 1);
        close(in);
        int status = 0;
        ASSERT_EQ(waitpid(companion, &status, 0), companion);
        ASSERT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0);

        // The service it started listens on its socket; the peer's credentials name it.
        int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
        sockaddr_un addr = service_address();
        ASSERT_TRUE(zv_test::wait_for(
            [&] { return connect(fd, (struct sockaddr *)&addr, sizeof addr) == 0; }, 30000));
        struct ucred cred = {};
        socklen_t len = sizeof cred;
        ASSERT_EQ(getsockopt(fd, SOL_SOCKET, SO_PEERCRED, &cred, &len), 0);
        close(fd);
        std::string service_cmdline = cmdline(cred.pid);
        EXPECT_NE(service_cmdline.find("zuvo-upload-svc"), std::string::npos);
        EXPECT_EQ(service_cmdline.find("secret"), std::string::npos) << service_cmdline;
        ASSERT_EQ(kill(cred.pid, SIGTERM), 0);
        EXPECT_TRUE(zv_test::wait_for([&] { return cmdline(cred.pid).empty(); }, 30000));
    }
}

} // namespace
